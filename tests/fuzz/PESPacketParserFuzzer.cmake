set(FUZZ_LIBRARIES tavo_tsparser)
