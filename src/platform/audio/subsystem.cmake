# The ALSA sink of the audio track.
pkg_check_modules(ALSA REQUIRED IMPORTED_TARGET alsa)
target_link_libraries(${target} PUBLIC PkgConfig::ALSA)
