# Tests of the classic label interface.
vyr_add_gtest(classic_value_test ${CMAKE_CURRENT_LIST_DIR}/mac_value_test.cc LIBS tavrel_aux)
# Text forms against the in-memory back-end of tests/support/memdb.
vyr_add_gtest(classic_text_test ${CMAKE_CURRENT_LIST_DIR}/mac_text_test.cc LIBS vyr_textmem)
# Kernel calls against the scripted label service (listed before vyr).
vyr_add_gtest(classic_kernel_test ${CMAKE_CURRENT_LIST_DIR}/mac_kernel_test.cc LIBS vyr_kdouble)
# End to end on the real service stand-in (the test sets its environment).
vyr_add_gtest(classic_e2e_test ${CMAKE_CURRENT_LIST_DIR}/mac_e2e_test.cc)
