set(TEST_LIBS handler commands)
