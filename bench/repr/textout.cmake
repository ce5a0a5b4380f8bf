# Label text writer benchmarks (names through the `files` back-end).
vyr_add_bench(textout_bench ${CMAKE_CURRENT_LIST_DIR}/textout_bench.cc)
if(TARGET files_backend)
  add_dependencies(textout_bench files_backend)
endif()
