set(TEST_LIBS adminhostctl_client)
set(TEST_DEPENDS adminhostd adminhostctl adminhost_lumio)
