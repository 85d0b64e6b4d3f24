# The demux tests share their stream builders with the TS receiver tests.
if(TARGET tsgen)
    add_dependencies(${TEST_TARGET} tsgen)
endif()

# The recording tests kill, or limit the file size of, a recording in a process of
# its own.
add_executable(tavo_recording_child ${CMAKE_CURRENT_LIST_DIR}/RecordingChild.cpp)
target_link_libraries(tavo_recording_child PRIVATE tavo_platform_dtv)
add_dependencies(${TEST_TARGET} tavo_recording_child)
target_compile_definitions(${TEST_TARGET} PRIVATE
    TAVO_RECORDING_CHILD_PATH="$<TARGET_FILE:tavo_recording_child>")
