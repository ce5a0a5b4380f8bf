# Whole-label text readers.
vyr_add_fuzz(text_readers ${CMAKE_CURRENT_LIST_DIR}/text_readers.cc)
