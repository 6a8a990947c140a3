set(TEST_DEPENDS adminhostd adminhostctl adminhost_lumio)
set(TEST_COST 11)
