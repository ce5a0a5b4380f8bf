# Label text readers.
target_sources(vyr PRIVATE ${CMAKE_CURRENT_LIST_DIR}/text_in.cc)
