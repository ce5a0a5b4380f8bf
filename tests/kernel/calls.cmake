# Kernel label calls, against the scripted label service (listed before vyr,
# so that its tavrel_* functions come first).
vyr_add_gtest(kernel_calls_test ${CMAKE_CURRENT_LIST_DIR}/calls_test.cc LIBS vyr_kdouble)

# End to end through the real service stand-in, once per attribute
# namespace.  The user namespace runs for anyone; the trusted one lets a
# link carry a label of its own but needs root (its tests skip otherwise).
foreach(ns user trusted)
  set(t kernel_calls_e2e_${ns}_test)
  vyr_add_gtest(${t} ${CMAKE_CURRENT_LIST_DIR}/calls_e2e_test.cc)
  target_compile_definitions(${t} PRIVATE VYR_E2E_SUITE=KernelEndToEnd_${ns} VYR_E2E_NS="${ns}")
endforeach()
