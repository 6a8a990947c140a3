set(TEST_DEPENDS adminhostd adminhost_lumio)
# They wait for a time limit of a minute.
set(TEST_LABELS soak)
