set(FUZZ_LIBS handler)
