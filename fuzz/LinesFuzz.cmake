set(FUZZ_LIBS lumio)
