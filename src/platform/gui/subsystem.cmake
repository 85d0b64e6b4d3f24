# The window sink uses SDL2, and FFmpeg's filters for deinterlacing.
pkg_check_modules(SDL2 REQUIRED IMPORTED_TARGET sdl2)
pkg_check_modules(AVFILTER REQUIRED IMPORTED_TARGET libavfilter)
target_link_libraries(${target} PUBLIC PkgConfig::SDL2 PkgConfig::AVFILTER)
