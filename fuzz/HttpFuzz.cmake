set(FUZZ_LIBS host)
