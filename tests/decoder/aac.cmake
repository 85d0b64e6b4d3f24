# The AAC reference tests demux, filter (aac_adtstoasc) and decode with FFmpeg's
# libavformat and libavcodec.
target_link_libraries(${TEST_TARGET} PRIVATE PkgConfig::FFMPEG)
