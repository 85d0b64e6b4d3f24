# The SDL window tests load SDL2's X11 back end, D-Bus and the X drivers, which keep
# a few hundred bytes until exit and unload the module that allocated part of them,
# so no suppression can name it. Leak checking is left to the other folders.
if(TAVO_ASAN)
    set(TEST_ENVIRONMENT "ASAN_OPTIONS=detect_leaks=0")
endif()
