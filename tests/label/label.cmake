# Label core tests.
vyr_add_gtest(label_core_test
  ${CMAKE_CURRENT_LIST_DIR}/records_test.cc
  ${CMAKE_CURRENT_LIST_DIR}/roles_test.cc
  ${CMAKE_CURRENT_LIST_DIR}/algebra_test.cc
  ${CMAKE_CURRENT_LIST_DIR}/relations_test.cc
  ${CMAKE_CURRENT_LIST_DIR}/permission_test.cc)
