#include "platform/binder/PermissionCache.h"

#include <unistd.h>

#include "platform/binder/IPCThreadState.h"

namespace android {

bool PermissionCache::checkCallingPermission(const String16& permission) {
    return checkCallingPermission(permission, nullptr, nullptr);
}

bool PermissionCache::checkCallingPermission(const String16& permission, int32_t* outPid,
                                             int32_t* outUid) {
    const IPCThreadState* ipc = IPCThreadState::self();
    const pid_t pid = ipc->getCallingPid();
    const uid_t uid = ipc->getCallingUid();
    if (outPid != nullptr)
        *outPid = pid;
    if (outUid != nullptr)
        *outUid = static_cast<int32_t>(uid);
    return checkPermission(permission, pid, uid);
}

bool PermissionCache::checkPermission(const String16& /*permission*/, pid_t /*pid*/, uid_t uid) {
    return uid == 0 || uid == getuid();
}

}  // namespace android
