# The tests run the tsgen program (TAVO_TSGEN_PATH) and also exercise its
# pieces directly through the tavo_tsgen library.
add_dependencies(${TEST_TARGET} tsgen)
target_link_libraries(${TEST_TARGET} PRIVATE tavo_tsgen)
