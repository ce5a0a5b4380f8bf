# Tests of the files back-end plug-in: called directly through its entries,
# and loaded by libvyr from the configuration.
if(TARGET files_backend)
  vyr_add_gtest(files_backend_test files_backend_test.cc LIBS files_backend dbroute)
  vyr_add_gtest(files_lines_test files_lines_test.cc LIBS files_store)
  # Loads the plug-in by name, as applications do: only needs it built.
  vyr_add_gtest(files_switch_test files_switch_test.cc)
  add_dependencies(files_switch_test files_backend)
endif()
