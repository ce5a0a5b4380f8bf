# Allocation-failure sweeps over the exported calls no other test sweeps.
vyr_add_gtest(hardening_alloc_test ${CMAKE_CURRENT_LIST_DIR}/alloc_sweep_test.cc)
add_dependencies(hardening_alloc_test files_backend)
