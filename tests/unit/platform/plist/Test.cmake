set(TEST_ALONE XmlReaderTest.cpp)
