# Tests of the classic label interface.

# A fixed level and category back-end, "classicdb", written into the plug-in
# directory under the name the databases look for.
add_library(vyr_classicdb SHARED ${CMAKE_CURRENT_LIST_DIR}/plugin/classicdb.cc)
set_target_properties(vyr_classicdb PROPERTIES
  PREFIX ""
  OUTPUT_NAME libtavrel-mac-db-classicdb
  SUFFIX .so.2
  LIBRARY_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/lib)
target_include_directories(vyr_classicdb
  PUBLIC ${CMAKE_CURRENT_LIST_DIR}/plugin
  PRIVATE ${CMAKE_SOURCE_DIR}/include ${CMAKE_SOURCE_DIR}/src)

vyr_add_gtest(classic_value_test ${CMAKE_CURRENT_LIST_DIR}/mac_value_test.cc LIBS tavrel_aux)
vyr_add_gtest(classic_text_test ${CMAKE_CURRENT_LIST_DIR}/mac_text_test.cc
  ${CMAKE_CURRENT_LIST_DIR}/lsan_suppressions.cc LIBS vyr_classicdb)
vyr_add_gtest(classic_text_nodb_test ${CMAKE_CURRENT_LIST_DIR}/mac_text_nodb_test.cc)
vyr_add_gtest(classic_kernel_test ${CMAKE_CURRENT_LIST_DIR}/mac_kernel_test.cc LIBS vyr_kdouble)
# End to end on the real service stand-in (the test sets its environment).
vyr_add_gtest(classic_e2e_test ${CMAKE_CURRENT_LIST_DIR}/mac_e2e_test.cc)
