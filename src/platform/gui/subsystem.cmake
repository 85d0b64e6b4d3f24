# The window sink uses SDL2, and FFmpeg's filters for deinterlacing, both opened at
# run time (SharedLibrary): only their headers are needed to build.
pkg_check_modules(SDL2 REQUIRED sdl2)
pkg_check_modules(AVFILTER REQUIRED libavfilter)
target_include_directories(${target} PUBLIC ${SDL2_INCLUDE_DIRS} ${AVFILTER_INCLUDE_DIRS})
target_compile_options(${target} PUBLIC ${SDL2_CFLAGS_OTHER})
