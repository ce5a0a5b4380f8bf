# Tests of the platform stand-ins libtavrel-aux.so.2 and libtavrel-base.so.2,
# called directly; the base tests run unprivileged on the user.* attribute
# namespace.  libvyr's calls through the real stand-in are in tests/kernel.
if(TARGET tavrel_aux)
  vyr_add_gtest(tavrel_aux_test tavrel_aux_test.cc LIBS tavrel_aux)
endif()
if(TARGET tavrel_base)
  vyr_add_gtest(tavrel_base_test tavrel_base_test.cc LIBS tavrel_base tavrel_base_codec)
  target_include_directories(tavrel_base_test PRIVATE ${CMAKE_SOURCE_DIR}/src)
endif()
