set(TEST_LIBS host)
