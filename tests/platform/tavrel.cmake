# Tests of the platform stand-ins libtavrel-aux.so.2 and libtavrel-base.so.2.
# They call the stand-ins directly; the base tests run unprivileged on the
# user.* attribute namespace and a private state directory of their own.

if(TARGET tavrel_aux)
  vyr_add_gtest(tavrel_aux_test tavrel_aux_test.cc LIBS tavrel_aux)
endif()

if(TARGET tavrel_base)
  # Reads and sets one label from a process of its own.
  add_executable(tavrel_probe tavrel_probe.cc)
  target_include_directories(tavrel_probe PRIVATE ${CMAKE_SOURCE_DIR}/src)
  target_link_libraries(tavrel_probe PRIVATE tavrel_base tavrel_base_codec)

  vyr_add_gtest(tavrel_base_test tavrel_base_test.cc tavrel_codec_test.cc
    LIBS tavrel_base tavrel_base_codec)
  target_compile_definitions(tavrel_base_test PRIVATE TAVREL_PROBE="$<TARGET_FILE:tavrel_probe>")
  add_dependencies(tavrel_base_test tavrel_probe)
endif()

# Against libvyr itself (the real library, not a stand-in target).
if(TARGET tavrel_base AND TARGET vyr)
  get_target_property(_tavrel_vyr_type vyr TYPE)
  if(_tavrel_vyr_type STREQUAL "SHARED_LIBRARY")
    vyr_add_gtest(tavrel_interop_test tavrel_interop_test.cc LIBS tavrel_base_codec)
  endif()
endif()
