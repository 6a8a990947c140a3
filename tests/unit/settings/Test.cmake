set(TEST_LIBS handler)
set(TEST_ALONE StatementBatchTest.cpp)
