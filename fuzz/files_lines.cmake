# The files back-end's line reader and writer.
vyr_add_fuzz(files_lines ${CMAKE_CURRENT_LIST_DIR}/files_lines.cc LIBS files_store)
