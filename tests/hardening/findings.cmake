# Regression tests of the findings of the hardening work.
vyr_add_gtest(hardening_findings_test ${CMAKE_CURRENT_LIST_DIR}/findings_test.cc)
