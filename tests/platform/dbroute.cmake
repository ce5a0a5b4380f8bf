# Tests of libdbroute: the configuration reader and dbroute_init.
vyr_add_gtest(dbroute_test dbroute_conf_test.cc dbroute_init_test.cc
    LIBS dbroute dbroute_parse)
