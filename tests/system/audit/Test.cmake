set(TEST_LIBS host)
set(TEST_DEPENDS adminhostd adminhostd-worker adminhostctl adminhost_lumio fixture_good)
set(TEST_COST 21)
