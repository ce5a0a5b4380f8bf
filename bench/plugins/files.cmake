# The files back-end: cached lookups against the cost of a stat, a re-parse,
# and a durable write.
if(TARGET files_backend)
  vyr_add_bench(files_bench files_bench.cc LIBS files_backend files_store dbroute)
endif()
