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

}  // namespace TavoPlayer
