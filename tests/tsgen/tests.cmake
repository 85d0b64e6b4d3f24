# The tests run the tsgen program (TAVO_TSGEN_PATH).
add_dependencies(${TEST_TARGET} tsgen)
