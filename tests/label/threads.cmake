# Label tests that run threads live in threads/, so that they carry the
# label `threads` and `scripts/test --tsan` runs them.
add_subdirectory(threads)
