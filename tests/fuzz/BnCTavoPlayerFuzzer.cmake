set(FUZZ_LIBRARIES tavo_service)
