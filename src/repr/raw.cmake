# Raw label forms.
target_sources(vyr PRIVATE ${CMAKE_CURRENT_LIST_DIR}/raw.cc)
