# The extractor tests compare with libavcodec's own parsers on the same bytes.
target_link_libraries(${TEST_TARGET} PRIVATE PkgConfig::FFMPEG)
include(${CMAKE_CURRENT_LIST_DIR}/aac.cmake)
# Whole-chain tests feed transport streams through the system's TS parser module.
target_link_libraries(${TEST_TARGET} PRIVATE tavo_tsparser)
