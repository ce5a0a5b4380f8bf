# Name database lookups through the `files` back-end.
vyr_add_bench(namedb_bench ${CMAKE_CURRENT_LIST_DIR}/namedb_bench.cc)
if(TARGET files_backend)
  add_dependencies(namedb_bench files_backend)
endif()
