# Kernel label reads against a bare attribute read, and the raw round trip.
# It also sends the service's command itself, to separate its cost.
vyr_add_bench(kernel_calls_bench ${CMAKE_CURRENT_LIST_DIR}/calls_bench.cc LIBS tavrel_base)
