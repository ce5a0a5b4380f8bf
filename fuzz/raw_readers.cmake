# Raw label readers.
vyr_add_fuzz(raw_readers ${CMAKE_CURRENT_LIST_DIR}/raw_readers.cc)
