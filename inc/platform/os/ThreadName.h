// Names the calling thread where top -H, ps and debuggers see it. libutils names
// threads only on Android, so every thread of the system names itself when it starts
// (from its readyToRun). Linux keeps 15 characters; longer names are cut there, as
// the platform's own threads are ("CCWorkerThreadRenderer" shows "CCWorkerThreadR").
#pragma once

#include <sys/prctl.h>

namespace TavoPlayer {

inline void setCurrentThreadName(const char* name) {
    prctl(PR_SET_NAME, reinterpret_cast<unsigned long>(name), 0, 0, 0);
}

// Threads that a library starts inherit the name of the thread that starts them. This
// names the calling thread for them while it lives and gives the caller its own name
// back at the end.
class ScopedThreadName {
public:
    explicit ScopedThreadName(const char* name) {
        prctl(PR_GET_NAME, reinterpret_cast<unsigned long>(mCaller), 0, 0, 0);
        setCurrentThreadName(name);
    }
    ~ScopedThreadName() { setCurrentThreadName(mCaller); }
    ScopedThreadName(const ScopedThreadName&) = delete;
    ScopedThreadName& operator=(const ScopedThreadName&) = delete;

private:
    char mCaller[16] = {};
};

}  // namespace TavoPlayer
