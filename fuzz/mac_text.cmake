# Readers of the classic value: its text form and its flat 24-byte form.
vyr_add_fuzz(mac_text ${CMAKE_CURRENT_LIST_DIR}/mac_text.cc LIBS tavrel_aux)
