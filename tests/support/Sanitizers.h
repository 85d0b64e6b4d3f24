// What the sanitizer builds change about a test's world.
#pragma once

#include <gtest/gtest.h>

namespace TavoPlayer::test {

#if defined(__SANITIZE_THREAD__)
inline constexpr bool kThreadSanitizer = true;
#else
inline constexpr bool kThreadSanitizer = false;
#endif

}  // namespace TavoPlayer::test

// glibc runs a SIGEV_THREAD timer's notifications on a helper thread that ThreadSanitizer
// never sees created, and its runtime crashes there at the first expiry
// (google/sanitizers#1612): tests that let a controller's timer expire run in the other
// builds only.
#define SKIP_IF_TIMERS_UNSUPPORTED()           \
    if (!::TavoPlayer::test::kThreadSanitizer) \
        ;                                      \
    else                                       \
        GTEST_SKIP() << "SIGEV_THREAD timers under ThreadSanitizer"
