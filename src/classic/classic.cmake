# The classic label interface: the mac_t value, its text form and the older
# kernel calls.
target_sources(vyr PRIVATE
  ${CMAKE_CURRENT_LIST_DIR}/mac_value.cc
  ${CMAKE_CURRENT_LIST_DIR}/mac_text.cc
  ${CMAKE_CURRENT_LIST_DIR}/mac_kernel.cc
)
