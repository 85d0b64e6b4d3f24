// The LLVMFuzzerInitialize of the fuzz targets that need nothing else set up: the
// parsers log every broken input, and a fuzzer wants speed, not text. A level set in
// the environment still wins, for debugging a reproducer. Include it in one file of a
// fuzz target only: it defines the function.
#pragma once

#include <cstdlib>

#include "platform/os/Trace.h"

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    setenv("TAVOPLAYER_LOG_LEVEL", "none", 0);
    OneSegPGL_InitializeDebug();
    return 0;
}
