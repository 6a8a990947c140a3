set(TEST_LIBS adminhostctl_client commands util)
