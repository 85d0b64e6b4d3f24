# The FFmpeg reference test compares payloads by zlib's CRC-32, the one ffprobe prints.
find_package(ZLIB REQUIRED)
target_link_libraries(${TEST_TARGET} PRIVATE ZLIB::ZLIB)
