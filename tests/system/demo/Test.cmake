set(TEST_DEPENDS adminhostd adminhostctl adminhost_lumio)
