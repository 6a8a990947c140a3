set(TEST_LIBS handler host)
