set(TEST_LIBS adminhostctl_room commands)
set(TEST_ENVIRONMENT "TZ=Europe/Berlin")
