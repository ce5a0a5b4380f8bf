# Session directories.
target_sources(vyr PRIVATE ${CMAKE_CURRENT_LIST_DIR}/session_dir.cc)
