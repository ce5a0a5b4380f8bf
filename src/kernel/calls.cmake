# Kernel label calls.
target_sources(vyr PRIVATE ${CMAKE_CURRENT_LIST_DIR}/calls.cc)
