set(TEST_LIBS host)
set(TEST_DEPENDS adminhost_lumio)
set(TEST_DEFINITIONS PLUGIN="$<TARGET_FILE:adminhost_lumio>")
