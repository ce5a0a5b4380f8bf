# Set-ID programs must ignore the platform libraries' environment overrides.
add_executable(hardening_env_probe ${CMAKE_CURRENT_LIST_DIR}/env_probe.cc)
target_include_directories(hardening_env_probe PRIVATE ${CMAKE_SOURCE_DIR}/src ${CMAKE_SOURCE_DIR}/include)
target_link_libraries(hardening_env_probe PRIVATE dbroute tavrel_base)
vyr_add_gtest(hardening_trust_test ${CMAKE_CURRENT_LIST_DIR}/trust_test.cc)
target_compile_definitions(hardening_trust_test PRIVATE VYR_ENV_PROBE="$<TARGET_FILE:hardening_env_probe>")
add_dependencies(hardening_trust_test hardening_env_probe)
