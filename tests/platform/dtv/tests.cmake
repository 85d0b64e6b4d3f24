# The demux tests share their stream builders with the TS receiver tests.
if(TARGET tsgen)
    add_dependencies(${TEST_TARGET} tsgen)
endif()
