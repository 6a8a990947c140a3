list(APPEND TEST_LIBS codec)
