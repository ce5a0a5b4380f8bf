# Entry line parsers and stream readers of the name databases.
vyr_add_fuzz(namedb_parse ${CMAKE_CURRENT_LIST_DIR}/namedb_parse.cc)
