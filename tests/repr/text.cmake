# Label text writers and readers, on the in-memory back-end "textmem"
# (vyr_textmem, in tests/support/memdb) and end to end on the real `files` one.
set(_text_dir ${CMAKE_CURRENT_LIST_DIR})
vyr_add_gtest(repr_text_test ${_text_dir}/text_test.cc LIBS vyr_textmem)
if(TARGET files_backend)
  vyr_add_gtest(repr_text_files_test ${_text_dir}/text_test.cc LIBS files_backend vyr_lsan_suppressions)
  target_compile_definitions(repr_text_files_test PRIVATE TEXT_TEST_FILES)
endif()
