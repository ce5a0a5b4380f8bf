# Name databases: entry records and line formats, the back-end switch and the
# three databases with their static-result and wide-character layers.
target_sources(vyr PRIVATE
  ${CMAKE_CURRENT_LIST_DIR}/lines.cc
  ${CMAKE_CURRENT_LIST_DIR}/switch.cc
  ${CMAKE_CURRENT_LIST_DIR}/databases.cc
  ${CMAKE_CURRENT_LIST_DIR}/static_layer.cc
  ${CMAKE_CURRENT_LIST_DIR}/wide.cc)
