# The stored-form decoder of the label service stand-in.
if(TARGET tavrel_base_codec)
  vyr_add_fuzz(base_attr_decode ${CMAKE_CURRENT_LIST_DIR}/base_attr_decode.cc LIBS tavrel_base_codec)
endif()
