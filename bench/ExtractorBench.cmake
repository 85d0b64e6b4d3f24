# libavcodec's own parsers run beside the extractors on the same bytes.
target_link_libraries(${BENCH_TARGET} PRIVATE PkgConfig::FFMPEG)
