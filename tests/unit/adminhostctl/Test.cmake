set(TEST_LIBS adminhostctl_client commands util)
set(TEST_ENVIRONMENT "TZ=Europe/Berlin")
