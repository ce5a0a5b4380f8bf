# Label core: records, role lists, field access, relations, decisions.
target_sources(vyr PRIVATE
  ${CMAKE_CURRENT_LIST_DIR}/records.cc
  ${CMAKE_CURRENT_LIST_DIR}/roles.cc
  ${CMAKE_CURRENT_LIST_DIR}/algebra.cc
  ${CMAKE_CURRENT_LIST_DIR}/relations.cc
  ${CMAKE_CURRENT_LIST_DIR}/permission.cc
)
