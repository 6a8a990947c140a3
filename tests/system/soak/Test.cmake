set(TEST_LABELS soak)
set(TEST_LIBS host)
set(TEST_DEPENDS adminhostd adminhost_lumio fixture_good)
