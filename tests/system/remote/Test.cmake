set(TEST_DEPENDS adminhostd adminhostctl adminhost_lumio)
set(TEST_PARTS 2) # each test has a daemon and an SSH server
set(TEST_COST 25)
