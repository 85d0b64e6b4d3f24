# The AAC reference tests demux, filter (aac_adtstoasc) and decode with FFmpeg's
# libavformat and libavcodec.
target_link_libraries(${TEST_TARGET} PRIVATE PkgConfig::FFMPEG)
# Whole transport streams for the reference tests come from tsgen.
if(TARGET tsgen)
    add_dependencies(${TEST_TARGET} tsgen)
endif()
