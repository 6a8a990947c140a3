set(TEST_LIBS adminhostctl_desired commands)
set(TEST_ALONE DesiredFileTest.cpp PlanTest.cpp)
