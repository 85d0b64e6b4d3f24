# The ring stress test once more under ThreadSanitizer, as its own program and
# CTest entry (label "tsan"), so that the data race check runs with every test run
# and alone with `ctest -L tsan`. Skipped in builds that already use a sanitizer.
if(NOT TAVO_ASAN AND NOT TAVO_TSAN)
    file(GLOB _tsan_lib_sources ${CMAKE_SOURCE_DIR}/src/common/*.cpp ${CMAKE_SOURCE_DIR}/src/platform/os/*.cpp)
    add_executable(tavo_common_tsan_tests
        ${CMAKE_CURRENT_SOURCE_DIR}/common/RingBufferStressTest.cpp ${_tsan_lib_sources})
    target_compile_options(tavo_common_tsan_tests PRIVATE -fsanitize=thread -fno-omit-frame-pointer -O1 -g)
    target_link_options(tavo_common_tsan_tests PRIVATE -fsanitize=thread)
    target_include_directories(tavo_common_tsan_tests PRIVATE ${CMAKE_SOURCE_DIR}/inc)
    target_link_libraries(tavo_common_tsan_tests PRIVATE android::utils android::cutils GTest::gtest_main Threads::Threads)
    add_test(NAME ring_stress_tsan COMMAND tavo_common_tsan_tests)
    set_tests_properties(ring_stress_tsan PROPERTIES
        LABELS "tsan;common"
        ENVIRONMENT "TSAN_OPTIONS=halt_on_error=1:second_deadlock_stack=1")
endif()
