set(FUZZ_LIBS host_messages)
