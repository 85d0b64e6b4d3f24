# The media player plays files through libmpv's client API, opened at run time
# (SharedLibrary): only its header is needed to build.
pkg_check_modules(MPV REQUIRED mpv)
get_target_property(_media_type ${target} TYPE)
if(_media_type STREQUAL "INTERFACE_LIBRARY")
    target_include_directories(${target} INTERFACE ${MPV_INCLUDE_DIRS})
else()
    target_include_directories(${target} PUBLIC ${MPV_INCLUDE_DIRS})
endif()
