# Label core benchmarks.
vyr_add_bench(label_bench ${CMAKE_CURRENT_LIST_DIR}/label_bench.cc)
