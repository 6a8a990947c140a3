set(TEST_LIBS adminhostctl_room commands util)
set(TEST_ENVIRONMENT "TZ=Europe/Berlin")
