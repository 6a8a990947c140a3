set(TEST_LIBS adminhostctl_desired commands)
set(TEST_ENVIRONMENT "TZ=Europe/Berlin")
