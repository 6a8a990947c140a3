set(TEST_DEPENDS adminhostd adminhost_lumio)
