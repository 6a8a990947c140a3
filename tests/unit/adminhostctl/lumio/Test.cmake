set(TEST_LIBS adminhostctl_lumio)
