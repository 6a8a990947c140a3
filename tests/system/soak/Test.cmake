set(TEST_LABELS soak)
set(TEST_LIBS host)
set(TEST_DEPENDS adminhostd adminhost_lumio fixture_good)
set(TEST_TIMEOUT 900) # ADMINHOST_SOAK_SECONDS may be 300
