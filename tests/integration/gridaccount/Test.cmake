set(TEST_LIBS handler)
