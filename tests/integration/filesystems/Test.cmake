set(TEST_LIBS handler host)
set(TEST_ALONE SharedFileSystemTest.cpp)
