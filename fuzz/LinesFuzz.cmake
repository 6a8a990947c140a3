set(FUZZ_LIBS settings)
