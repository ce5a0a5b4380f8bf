# Raw label forms.
vyr_add_gtest(repr_raw_test ${CMAKE_CURRENT_LIST_DIR}/raw_test.cc)
