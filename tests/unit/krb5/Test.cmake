set(TEST_LIBS krb5)
set(TEST_DEPENDS krb5-list)
set(TEST_DEFINITIONS KRB5_LIST="$<TARGET_FILE:krb5-list>")
# Leaks of the library itself while it reads truncated keytabs.
set(TEST_VALGRIND_SUPPRESSIONS ${CMAKE_CURRENT_LIST_DIR}/valgrind.supp)
