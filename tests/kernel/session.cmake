# Session directories, on the real file system with the label service
# stand-in; labels go to the unprivileged attribute namespace.
vyr_add_gtest(session_test ${CMAKE_CURRENT_LIST_DIR}/session_test.cc
  ENV VYR_TAVREL_XATTR_NS=user)
