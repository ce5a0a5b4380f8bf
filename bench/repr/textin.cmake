# Label text reader benchmarks (through the `files` back-end).
vyr_add_bench(textin_bench ${CMAKE_CURRENT_LIST_DIR}/textin_bench.cc)
if(TARGET files_backend)
  add_dependencies(textin_bench files_backend)
endif()
