# Playback tests make their streams with tsgen.
if(TARGET tsgen)
    add_dependencies(${TEST_TARGET} tsgen)
endif()
