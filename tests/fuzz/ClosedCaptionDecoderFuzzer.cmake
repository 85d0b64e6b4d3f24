set(FUZZ_LIBRARIES tavo_decoder)
# An exact-size PES record, as the caption tests build it.
set(FUZZ_SOURCES ${CMAKE_SOURCE_DIR}/tests/support/CaptionBuilder.cpp)
