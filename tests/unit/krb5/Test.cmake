set(TEST_LIBS krb5)
set(TEST_DEPENDS krb5-list)
set(TEST_DEFINITIONS KRB5_LIST="$<TARGET_FILE:krb5-list>")
# What the library itself loses while it reads keytabs that are cut.
set(TEST_VALGRIND_SUPPRESSIONS ${CMAKE_CURRENT_LIST_DIR}/valgrind.supp)
