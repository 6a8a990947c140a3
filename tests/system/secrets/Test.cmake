set(TEST_LIBS host)
set(TEST_DEPENDS adminhostd adminhostctl adminhost_lumio)
set(TEST_COST 13)
set(TEST_ALONE GridCheckTest.cpp Searches.cpp)
