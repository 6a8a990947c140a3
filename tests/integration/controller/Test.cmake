set(TEST_LIBS handler)
set(TEST_COST 31)
