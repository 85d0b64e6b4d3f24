# The receiver tests build one of their streams with tsgen, where it exists.
if(TARGET tsgen)
    add_dependencies(${TEST_TARGET} tsgen)
endif()
