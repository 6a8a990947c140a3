set(TEST_LIBS handler)
set(TEST_TIMEOUT 900)
# A sanitizer that looks for leaks does not work in a traced process, and its own calls would be made to fail too.
set(TEST_LABELS traced)
set(TEST_COST 30)
