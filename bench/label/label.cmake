# Label core benchmarks.
vyr_add_bench(label_bench ${CMAKE_CURRENT_LIST_DIR}/label_bench.cc)
# The value builders are shared with the label tests.
target_include_directories(label_bench PRIVATE ${CMAKE_SOURCE_DIR}/tests)
