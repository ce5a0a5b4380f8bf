# Tests of the label text readers.
#
# The readers' tables run against two back-ends that serve the same names:
# the in-memory plug-in "textinmem" below and the real `files` back-end. A
# third program has no back-end at all. Each program configures its databases
# once, since a database keeps its back-end for the life of the process.

# In-memory back-end plug-in, loaded by libvyr under its file-name pattern.
# The test programs link it too, so they share its tables with libvyr's copy.
add_library(textin_memdb SHARED ${CMAKE_CURRENT_LIST_DIR}/textin_memdb.cc)
set_target_properties(textin_memdb PROPERTIES
  OUTPUT_NAME tavrel-mac-db-textinmem
  SOVERSION 2
  LIBRARY_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/lib)
target_include_directories(textin_memdb PRIVATE
  ${CMAKE_SOURCE_DIR}/include ${CMAKE_SOURCE_DIR}/src ${CMAKE_SOURCE_DIR}/tests)

set(_textin_support ${CMAKE_CURRENT_LIST_DIR}/textin_support.cc)

# The round trips need the text writers beside the readers.
set(_textin_roundtrip "")
if(EXISTS ${CMAKE_SOURCE_DIR}/src/repr/textout.cmake)
  set(_textin_roundtrip ${CMAKE_CURRENT_LIST_DIR}/textin_roundtrip_test.cc)
endif()

vyr_add_gtest(textin_mem_test
  ${CMAKE_CURRENT_LIST_DIR}/textin_readers_test.cc
  ${CMAKE_CURRENT_LIST_DIR}/textin_memdb_test.cc
  ${CMAKE_CURRENT_LIST_DIR}/textin_alloc_test.cc
  ${_textin_roundtrip}
  ${CMAKE_CURRENT_LIST_DIR}/textin_backend_mem.cc
  ${_textin_support}
  LIBS textin_memdb)

vyr_add_gtest(textin_nodb_test
  ${CMAKE_CURRENT_LIST_DIR}/textin_nodb_test.cc
  ${CMAKE_CURRENT_LIST_DIR}/textin_backend_none.cc
  ${_textin_support})

# The same tables and round trips through the real `files` back-end. The
# program links the plug-in so that libvyr's dlopen finds it loaded already,
# also under the sanitizers, whose dlopen wrapper hides libvyr's RUNPATH.
if(TARGET files_backend)
  vyr_add_gtest(textin_files_test
    ${CMAKE_CURRENT_LIST_DIR}/textin_readers_test.cc
    ${_textin_roundtrip}
    ${CMAKE_CURRENT_LIST_DIR}/textin_backend_files.cc
    ${_textin_support}
    LIBS files_backend)
endif()
