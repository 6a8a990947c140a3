set(TEST_LIBS settings)
set(TEST_LABELS soak)
