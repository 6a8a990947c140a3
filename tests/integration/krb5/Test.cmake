set(TEST_LIBS krb5)
