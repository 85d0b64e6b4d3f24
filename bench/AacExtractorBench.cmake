target_link_libraries(${BENCH_TARGET} PRIVATE PkgConfig::FFMPEG)
