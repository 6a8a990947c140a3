set(TEST_LIBS host)
set(TEST_DEPENDS adminhostd adminhostd-worker adminhost_lumio fixture_good)
# They wait for a time limit of a minute.
set(TEST_LABELS soak)
