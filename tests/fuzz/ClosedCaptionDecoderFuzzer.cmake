set(FUZZ_LIBRARIES tavo_decoder)
