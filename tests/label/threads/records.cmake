# Use counts of label records changed from several threads at once.
vyr_add_gtest(label_threads_test ${CMAKE_CURRENT_LIST_DIR}/records_threads_test.cc)
