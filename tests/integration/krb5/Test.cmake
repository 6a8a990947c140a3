set(TEST_LIBS krb5)
set(TEST_COST 25)
