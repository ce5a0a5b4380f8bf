# Name database tests.
#
# Test back-end plug-ins, built into <build>/lib under the file names that
# libvyr looks for: "memtest" with every entry, "partial" without some. The
# test program links them, so libvyr's dlopen by bare name finds the object
# already loaded (also under sanitizers, whose dlopen ignores libvyr's own
# search path).
set(ND_TEST_DIR ${CMAKE_CURRENT_LIST_DIR})

function(nd_test_plugin backend)
  set(target nd_plugin_${backend})
  add_library(${target} SHARED ${ND_TEST_DIR}/plugins/memtest.cc)
  target_include_directories(${target} PRIVATE ${CMAKE_SOURCE_DIR}/include ${CMAKE_SOURCE_DIR}/src
    ${CMAKE_SOURCE_DIR}/tests)
  target_compile_definitions(${target} PRIVATE VYR_TEST_BACKEND=${backend} ${ARGN})
  set_target_properties(${target} PROPERTIES
    PREFIX "lib"
    OUTPUT_NAME tavrel-mac-db-${backend}
    SUFFIX ".so.2"
    NO_SONAME ON
    LIBRARY_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/lib)
  target_link_options(${target} PRIVATE -Wl,-soname,libtavrel-mac-db-${backend}.so.2)
endfunction()

nd_test_plugin(memtest)
nd_test_plugin(partial VYR_TEST_PARTIAL)

# Entry records and line formats: no plug-in involved.
vyr_add_gtest(namedb_lines_test ${ND_TEST_DIR}/lines_test.cc)

# Everything that goes through the switch, against its own configuration
# stand-in.
vyr_add_gtest(namedb_switch_test ${ND_TEST_DIR}/switch_test.cc
  LIBS nd_plugin_memtest nd_plugin_partial vyr_lsan_suppressions)
