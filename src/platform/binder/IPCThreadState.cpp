#include "platform/binder/IPCThreadState.h"

#include <unistd.h>

#include "platform/binder/ProcessState.h"

namespace android {

IPCThreadState::IPCThreadState() : mCallingPid(getpid()), mCallingUid(getuid()) {}

IPCThreadState* IPCThreadState::self() {
    thread_local IPCThreadState state;
    return &state;
}

int64_t IPCThreadState::setCallingIdentity(pid_t pid, uid_t uid) {
    // The token packs the previous identity, as the platform's does.
    const int64_t token = static_cast<int64_t>(static_cast<uint64_t>(mCallingUid) << 32 |
                                               static_cast<uint32_t>(mCallingPid));
    mCallingPid = pid;
    mCallingUid = uid;
    return token;
}

int64_t IPCThreadState::clearCallingIdentity() {
    return setCallingIdentity(getpid(), getuid());
}

void IPCThreadState::restoreCallingIdentity(int64_t token) {
    mCallingUid = static_cast<uid_t>(static_cast<uint64_t>(token) >> 32);
    mCallingPid = static_cast<pid_t>(static_cast<uint32_t>(token));
}

void IPCThreadState::joinThreadPool(bool /*isMain*/) {
    ProcessState::self()->joinThreadPool();
}

}  // namespace android
