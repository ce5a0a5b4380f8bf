# Label text output tests.

# Both programs load their back-end from <build>/lib themselves before the
# name databases look for it: under the sanitizers, dlopen runs from the
# sanitizer runtime and no longer searches beside libvyr.so.2.

# "textoutmem": an in-memory level and category back-end with call counters,
# loaded by the name databases like any back-end; the tests reach its control
# functions through dlsym.
add_library(vyr_textoutmem SHARED ${CMAKE_CURRENT_LIST_DIR}/textout_memdb.cc)
set_target_properties(vyr_textoutmem PROPERTIES
  OUTPUT_NAME tavrel-mac-db-textoutmem
  SOVERSION 2)
target_include_directories(vyr_textoutmem PRIVATE
  ${CMAKE_SOURCE_DIR}/include ${CMAKE_SOURCE_DIR}/src ${CMAKE_SOURCE_DIR}/tests)

# Test translation (an interposed dcgettext) and database configuration.
add_library(vyr_textout_support STATIC ${CMAKE_CURRENT_LIST_DIR}/textout_support.cc)
target_include_directories(vyr_textout_support PUBLIC
  ${CMAKE_SOURCE_DIR}/include ${CMAKE_SOURCE_DIR}/src ${CMAKE_SOURCE_DIR}/tests)
target_link_libraries(vyr_textout_support PUBLIC GTest::gtest ${CMAKE_DL_LIBS})

vyr_add_gtest(textout_test
  ${CMAKE_CURRENT_LIST_DIR}/textout_fixture.cc
  ${CMAKE_CURRENT_LIST_DIR}/textout_engine_test.cc
  ${CMAKE_CURRENT_LIST_DIR}/textout_writers_test.cc
  ${CMAKE_CURRENT_LIST_DIR}/textout_alloc_test.cc
  LIBS vyr_textout_support ${CMAKE_DL_LIBS})
add_dependencies(textout_test vyr_textoutmem)

# Names from the real `files` back-end, which the name databases load beside
# libvyr.so.2; the program writes its database files itself.
vyr_add_gtest(textout_files_test ${CMAKE_CURRENT_LIST_DIR}/textout_files_test.cc
  LIBS vyr_textout_support)
if(TARGET files_backend)
  add_dependencies(textout_files_test files_backend)
endif()
