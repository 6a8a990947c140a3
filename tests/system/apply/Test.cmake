set(TEST_LIBS host util)
set(TEST_DEPENDS adminhostd adminhostctl adminhost_lumio)
set(TEST_TIMEOUT 600) # each test has a daemon
set(TEST_PARTS 3)
set(TEST_COST 25)
