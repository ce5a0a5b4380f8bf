# The name-database configuration reader.
vyr_add_fuzz(dbroute_conf ${CMAKE_CURRENT_LIST_DIR}/dbroute_conf.cc LIBS dbroute_parse)
