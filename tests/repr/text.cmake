# Label text writers and readers.

# The in-memory back-end "textmem" (vyr_textmem) lives in tests/support/memdb.
set(_text_dir ${CMAKE_CURRENT_LIST_DIR})
vyr_add_gtest(repr_text_test
  ${_text_dir}/text_out_test.cc
  ${_text_dir}/text_in_test.cc
  ${_text_dir}/text_alloc_test.cc
  ${_text_dir}/text_roundtrip_test.cc
  ${_text_dir}/text_support.cc
  LIBS vyr_textmem)

# Writers and readers end to end through the real `files` back-end.
if(TARGET files_backend)
  vyr_add_gtest(repr_text_files_test
    ${_text_dir}/text_roundtrip_test.cc
    ${_text_dir}/text_support.cc
    LIBS files_backend vyr_lsan_suppressions)
  target_compile_definitions(repr_text_files_test PRIVATE TEXT_TEST_FILES)
endif()
