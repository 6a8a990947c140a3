set(TEST_LIBS krb5)
# The listing program is run by the tests; a library that depends on it makes it be built first.
add_library(krb5_list_first INTERFACE)
add_dependencies(krb5_list_first krb5-list)
list(APPEND TEST_LIBS krb5_list_first)
set(TEST_DEFINITIONS KRB5_LIST="$<TARGET_FILE:krb5-list>")
