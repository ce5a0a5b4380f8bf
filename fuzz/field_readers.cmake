# Single-field and half-label text readers, and the classic kernel records'
# text readers, with names from a scratch files database.
vyr_add_fuzz(field_readers ${CMAKE_CURRENT_LIST_DIR}/field_readers.cc)
