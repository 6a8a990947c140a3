set(TEST_LIBS lumio)
