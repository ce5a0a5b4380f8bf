# Damaged stored labels, labels changing under their readers, a full disk.
vyr_add_gtest(hardening_faults_test ${CMAKE_CURRENT_LIST_DIR}/faults_test.cc)
add_dependencies(hardening_faults_test files_backend)
