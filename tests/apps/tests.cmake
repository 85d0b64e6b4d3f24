# The programs run as separate processes: the service host, the client, tsgen.
foreach(_app tavoplayerd tavoctl tavoplay tsgen)
    if(TARGET ${_app})
        add_dependencies(${TEST_TARGET} ${_app})
    endif()
endforeach()
