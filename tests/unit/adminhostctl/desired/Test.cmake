set(TEST_LIBS adminhostctl_desired commands)
