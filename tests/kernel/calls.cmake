# Kernel label calls.

# The scripted service: a shared object defining the service library's three
# functions.  Given in LIBS, it comes before libvyr.so.2 on the link line and
# so ahead of the real service library in the lookup order.
add_library(vyr_kdouble SHARED ${CMAKE_CURRENT_LIST_DIR}/double/kdouble.cc)
target_include_directories(vyr_kdouble
  PUBLIC ${CMAKE_CURRENT_LIST_DIR}/double
  PRIVATE ${CMAKE_SOURCE_DIR}/include ${CMAKE_SOURCE_DIR}/src)

vyr_add_gtest(kernel_calls_test ${CMAKE_CURRENT_LIST_DIR}/calls_test.cc LIBS vyr_kdouble)

# End to end through the real service stand-in.  The probe reads a label in a
# second process.  The user namespace runs for anyone; the trusted one lets a
# link carry a label of its own but needs root (its tests skip otherwise).
add_executable(kernel_label_probe ${CMAKE_CURRENT_LIST_DIR}/label_probe.cc)
target_link_libraries(kernel_label_probe PRIVATE vyr)
# The service's settings are compiled in and put into the environment by the
# program itself before its first call, so the probe it starts inherits them.
foreach(ns user trusted)
  set(t kernel_calls_e2e_${ns}_test)
  vyr_add_gtest(${t} ${CMAKE_CURRENT_LIST_DIR}/calls_e2e_test.cc)
  add_dependencies(${t} kernel_label_probe)
  target_compile_definitions(${t} PRIVATE
    VYR_E2E_SUITE=KernelEndToEnd_${ns}
    VYR_E2E_NS="${ns}"
    VYR_E2E_STATE_DIR="${CMAKE_BINARY_DIR}/tmp/kernel-e2e-${ns}-state"
    VYR_E2E_PROBE="$<TARGET_FILE:kernel_label_probe>")
endforeach()
