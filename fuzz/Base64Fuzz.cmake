list(APPEND FUZZ_LIBS codec)
