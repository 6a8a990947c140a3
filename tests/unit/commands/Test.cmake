set(TEST_LIBS commands)
