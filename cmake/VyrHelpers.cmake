# Build helpers shared by every folder of the project.

# Adds every immediate subfolder of DIR that has a CMakeLists.txt.
function(vyr_add_subdirs dir)
  file(GLOB children LIST_DIRECTORIES true CONFIGURE_DEPENDS ${CMAKE_SOURCE_DIR}/${dir}/*)
  list(SORT children)
  foreach(child ${children})
    if(IS_DIRECTORY ${child} AND EXISTS ${child}/CMakeLists.txt)
      add_subdirectory(${child})
    endif()
  endforeach()
endfunction()

# Several people own pieces of one folder: each piece is a *.cmake file that
# the folder's CMakeLists.txt includes through this macro.
macro(vyr_include_parts)
  file(GLOB _vyr_parts CONFIGURE_DEPENDS ${CMAKE_CURRENT_SOURCE_DIR}/*.cmake)
  list(SORT _vyr_parts)
  foreach(_vyr_part ${_vyr_parts})
    include(${_vyr_part})
  endforeach()
endmacro()

# Turns every exports*.list below SRC_ROOT into the linker version script of
# TARGET. One anonymous version node: the names carry no symbol version, and
# everything not listed stays local.
function(vyr_export_list target src_root)
  file(GLOB_RECURSE lists CONFIGURE_DEPENDS ${src_root}/*/exports*.list)
  list(SORT lists)
  set(names "")
  foreach(list_file ${lists})
    set_property(DIRECTORY ${CMAKE_SOURCE_DIR} APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${list_file})
    file(STRINGS ${list_file} lines)
    foreach(line ${lines})
      string(REGEX REPLACE "#.*$" "" line "${line}")
      string(STRIP "${line}" line)
      if(line)
        list(APPEND names ${line})
      endif()
    endforeach()
  endforeach()
  list(SORT names)
  list(REMOVE_DUPLICATES names)
  set(script "{\n  global:\n")
  foreach(name ${names})
    string(APPEND script "    ${name};\n")
  endforeach()
  string(APPEND script "  local:\n    *;\n};\n")
  set(map ${CMAKE_BINARY_DIR}/${target}.map)
  file(CONFIGURE OUTPUT ${map} CONTENT "${script}" @ONLY)
  string(REPLACE ";" "\n" plain "${names}")
  file(CONFIGURE OUTPUT ${CMAKE_BINARY_DIR}/${target}.exports CONTENT "${plain}\n" @ONLY)
  target_link_options(${target} PRIVATE -Wl,--version-script=${map})
  set_property(TARGET ${target} APPEND PROPERTY LINK_DEPENDS ${map})
endfunction()

# vyr_add_gtest(NAME src... [LIBS lib...] [ENV VAR=value...])
# A GoogleTest program linked against libvyr; its tests are registered with
# CTest one by one and labelled with the folder they live in.
function(vyr_add_gtest name)
  cmake_parse_arguments(T "" "" "LIBS;ENV" ${ARGN})
  add_executable(${name} ${T_UNPARSED_ARGUMENTS})
  target_link_libraries(${name} PRIVATE ${T_LIBS} vyr vyr_testsupport GTest::gtest_main GTest::gmock)
  target_include_directories(${name} PRIVATE ${CMAKE_SOURCE_DIR}/src ${CMAKE_SOURCE_DIR}/tests)
  get_filename_component(folder ${CMAKE_CURRENT_SOURCE_DIR} NAME)
  set(env VYR_TEST_BUILD_DIR=${CMAKE_BINARY_DIR} VYR_TEST_SOURCE_DIR=${CMAKE_SOURCE_DIR} ${T_ENV})
  if(VYR_SANITIZE OR VYR_TSAN)
    # The sanitizer runtime intercepts dlopen and becomes its caller, so the
    # library's own RUNPATH is not searched for plug-ins there.
    list(APPEND env LD_LIBRARY_PATH=${CMAKE_BINARY_DIR}/lib)
  endif()
  # gtest_discover_tests flattens lists in test properties, so the environment
  # travels as a launcher instead: `env VAR=value... program`, used both to
  # list the tests and to run them.
  set_target_properties(${name} PROPERTIES CROSSCOMPILING_EMULATOR "env;${env}")
  gtest_discover_tests(${name}
    DISCOVERY_TIMEOUT 60
    PROPERTIES LABELS ${folder})
endfunction()

# vyr_add_bench(NAME src... [LIBS lib...])
function(vyr_add_bench name)
  cmake_parse_arguments(B "" "" "LIBS" ${ARGN})
  add_executable(${name} ${B_UNPARSED_ARGUMENTS})
  target_link_libraries(${name} PRIVATE ${B_LIBS} vyr benchmark::benchmark)
  target_include_directories(${name} PRIVATE ${CMAKE_SOURCE_DIR}/src ${CMAKE_SOURCE_DIR}/bench)
  set_target_properties(${name} PROPERTIES RUNTIME_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/bench)
endfunction()

# vyr_add_fuzz(NAME src... [LIBS lib...])
# A libFuzzer target; its seed corpus is fuzz/corpus/NAME/.
function(vyr_add_fuzz name)
  cmake_parse_arguments(F "" "" "LIBS" ${ARGN})
  add_executable(${name} ${F_UNPARSED_ARGUMENTS})
  target_link_libraries(${name} PRIVATE ${F_LIBS} vyr)
  target_include_directories(${name} PRIVATE ${CMAKE_SOURCE_DIR}/src ${CMAKE_SOURCE_DIR}/fuzz)
  target_link_options(${name} PRIVATE -fsanitize=fuzzer)
  set_target_properties(${name} PROPERTIES RUNTIME_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/fuzz)
endfunction()
