set(TEST_LIBS handler commands)
set(TEST_ALONE ReadSettingsTest.cpp RefusedRequestsTest.cpp)
