# Installs the build BUILD into a fresh PREFIX (cmake -P script, so that a
# leftover of an earlier run never stands in for what the build installs now).
file(REMOVE_RECURSE ${PREFIX})
execute_process(COMMAND ${CMAKE_COMMAND} --install ${BUILD} --prefix ${PREFIX}
  RESULT_VARIABLE rc OUTPUT_QUIET)
if(NOT rc EQUAL 0)
  message(FATAL_ERROR "cmake --install ${BUILD} --prefix ${PREFIX} failed: ${rc}")
endif()
foreach(file bin/vyr share/man/man1/vyr.1)
  if(NOT EXISTS ${PREFIX}/${file})
    message(FATAL_ERROR "the install did not put ${file} into ${PREFIX}")
  endif()
endforeach()
