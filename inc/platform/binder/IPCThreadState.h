// IPCThreadState: the calling thread's view of binder: who is calling. While a
// binder thread runs an incoming transaction, the caller's pid and uid are those
// the kernel reported for the connection (SO_PEERCRED); outside a transaction they
// are this process's own.
#pragma once

#include <sys/types.h>

#include <cstdint>

namespace android {

class IPCThreadState {
public:
    static IPCThreadState* self();

    pid_t getCallingPid() const { return mCallingPid; }
    uid_t getCallingUid() const { return mCallingUid; }
    // Makes this process the caller until restoreCallingIdentity(token).
    int64_t clearCallingIdentity();
    void restoreCallingIdentity(int64_t token);
    int64_t setCallingIdentity(pid_t pid, uid_t uid);
    void joinThreadPool(bool isMain = true);
    // Nothing is buffered: every call is sent when made.
    void flushCommands() {}

private:
    IPCThreadState();
    pid_t mCallingPid;
    uid_t mCallingUid;
};

}  // namespace android
