set(TEST_LIBS lumio host)
