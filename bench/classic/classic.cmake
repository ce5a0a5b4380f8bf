# The classic value: decisions, flat form, numeric text.
vyr_add_bench(bench_classic_mac ${CMAKE_CURRENT_LIST_DIR}/classic_mac.cc)
