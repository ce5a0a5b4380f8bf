# Label text output: the format engine and the field writers.
target_sources(vyr PRIVATE
  ${CMAKE_CURRENT_LIST_DIR}/text_out_engine.cc
  ${CMAKE_CURRENT_LIST_DIR}/text_out_fields.cc)
