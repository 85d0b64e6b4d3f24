# The media player plays files through libmpv's client API.
pkg_check_modules(MPV REQUIRED IMPORTED_TARGET mpv)
get_target_property(_media_type ${target} TYPE)
if(_media_type STREQUAL "INTERFACE_LIBRARY")
    target_link_libraries(${target} INTERFACE PkgConfig::MPV)
else()
    target_link_libraries(${target} PUBLIC PkgConfig::MPV)
endif()
