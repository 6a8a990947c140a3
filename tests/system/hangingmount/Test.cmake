set(TEST_DEPENDS adminhostd adminhost_lumio)
# It waits for a request's own time limit of a minute.
set(TEST_LABELS soak)
