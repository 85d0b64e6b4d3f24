# Android's libutils and libcutils as Debian packages them (android-libutils-dev,
# android-libcutils-dev): headers under /usr/include/android, libraries in the
# multiarch android/ folder, and no pkg-config file. This module turns them into
# the imported targets android::utils and android::cutils.
#
# Their headers are included as system headers so that their own warnings do not
# drown ours, and the library folder goes into the rpath because it is not on the
# dynamic loader's default path.

include(GNUInstallDirs)

set(_tavo_android_hints
    /usr/lib/${CMAKE_LIBRARY_ARCHITECTURE}/android
    /usr/${CMAKE_INSTALL_LIBDIR}/android
    /usr/lib/android)

find_path(ANDROID_INCLUDE_DIR utils/RefBase.h PATHS /usr/include/android NO_DEFAULT_PATH)
find_library(ANDROID_UTILS_LIBRARY NAMES utils PATHS ${_tavo_android_hints} NO_DEFAULT_PATH)
find_library(ANDROID_CUTILS_LIBRARY NAMES cutils PATHS ${_tavo_android_hints} NO_DEFAULT_PATH)
find_library(ANDROID_LOG_LIBRARY NAMES log PATHS ${_tavo_android_hints} NO_DEFAULT_PATH)

if(NOT ANDROID_INCLUDE_DIR OR NOT ANDROID_UTILS_LIBRARY OR NOT ANDROID_CUTILS_LIBRARY)
    message(FATAL_ERROR
        "Android libutils/libcutils not found (include: ${ANDROID_INCLUDE_DIR}, "
        "utils: ${ANDROID_UTILS_LIBRARY}, cutils: ${ANDROID_CUTILS_LIBRARY}). "
        "Run scripts/setup.sh to install android-libutils-dev and android-libcutils-dev.")
endif()

get_filename_component(ANDROID_LIBRARY_DIR ${ANDROID_UTILS_LIBRARY} DIRECTORY)

add_library(android::cutils UNKNOWN IMPORTED)
set_target_properties(android::cutils PROPERTIES
    IMPORTED_LOCATION ${ANDROID_CUTILS_LIBRARY}
    INTERFACE_SYSTEM_INCLUDE_DIRECTORIES ${ANDROID_INCLUDE_DIR}
    INTERFACE_INCLUDE_DIRECTORIES ${ANDROID_INCLUDE_DIR})

add_library(android::utils UNKNOWN IMPORTED)
set_target_properties(android::utils PROPERTIES
    IMPORTED_LOCATION ${ANDROID_UTILS_LIBRARY}
    INTERFACE_SYSTEM_INCLUDE_DIRECTORIES ${ANDROID_INCLUDE_DIR}
    INTERFACE_INCLUDE_DIRECTORIES ${ANDROID_INCLUDE_DIR})
set(_tavo_utils_deps android::cutils)
if(ANDROID_LOG_LIBRARY)
    list(APPEND _tavo_utils_deps ${ANDROID_LOG_LIBRARY})
endif()
set_property(TARGET android::utils PROPERTY INTERFACE_LINK_LIBRARIES ${_tavo_utils_deps})

# Everything that links these must find them at run time.
list(APPEND CMAKE_BUILD_RPATH ${ANDROID_LIBRARY_DIR})
list(APPEND CMAKE_INSTALL_RPATH ${ANDROID_LIBRARY_DIR})
