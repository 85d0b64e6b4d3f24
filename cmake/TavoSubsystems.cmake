# One static library per subsystem folder: tavo_<name> from src/<dir>/*.cpp.
# A folder with no sources yet becomes an interface library so the graph stays whole.
set(TAVO_SUBSYSTEM_TARGETS "" CACHE INTERNAL "")

function(tavo_add_subsystem name)
    cmake_parse_arguments(ARG "" "DIR" "DEPS" ${ARGN})
    file(GLOB _sources CONFIGURE_DEPENDS ${CMAKE_SOURCE_DIR}/src/${ARG_DIR}/*.cpp)
    set(target tavo_${name})
    if(_sources)
        add_library(${target} STATIC ${_sources})
        target_include_directories(${target} PUBLIC ${CMAKE_SOURCE_DIR}/inc)
        target_link_libraries(${target} PUBLIC ${ARG_DEPS})
        set(TAVO_SUBSYSTEM_TARGETS ${TAVO_SUBSYSTEM_TARGETS} ${target} CACHE INTERNAL "")
    else()
        add_library(${target} INTERFACE)
        target_include_directories(${target} INTERFACE ${CMAKE_SOURCE_DIR}/inc)
        target_link_libraries(${target} INTERFACE ${ARG_DEPS})
    endif()
    # Optional per-subsystem additions (extra packages), kept beside the sources.
    if(EXISTS ${CMAKE_SOURCE_DIR}/src/${ARG_DIR}/subsystem.cmake)
        include(${CMAKE_SOURCE_DIR}/src/${ARG_DIR}/subsystem.cmake)
    endif()
endfunction()
