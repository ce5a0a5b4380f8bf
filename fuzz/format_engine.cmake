# The label format engine.
vyr_add_fuzz(format_engine ${CMAKE_CURRENT_LIST_DIR}/format_engine.cc)
