# Tests of libdbroute: the configuration reader and dbroute_init.
vyr_add_gtest(dbroute_test dbroute_test.cc LIBS dbroute dbroute_parse)
