set(TEST_LIBS lumio commands)
