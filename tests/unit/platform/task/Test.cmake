set(TEST_ALONE TaskGroupTest.cpp)
