# The receiver tests build their streams with the demux tests' helpers, and with
# tsgen where it exists.
target_sources(${TEST_TARGET} PRIVATE ${CMAKE_SOURCE_DIR}/tests/platform/dtv/DemuxTestUtil.cpp)
if(TARGET tsgen)
    add_dependencies(${TEST_TARGET} tsgen)
endif()
