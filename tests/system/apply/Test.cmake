set(TEST_LIBS host util)
set(TEST_DEPENDS adminhostd adminhostctl adminhost_lumio)
