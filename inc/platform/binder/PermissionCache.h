// PermissionCache: whether a caller holds a permission. There is no permission
// database on Linux: a permission is held by root and by the uid this service runs
// as, which is who the platform grants android.permission.DUMP to in practice (the
// shell and system services).
#pragma once

#include <sys/types.h>

#include <utils/String16.h>

namespace android {

class PermissionCache {
public:
    static bool checkCallingPermission(const String16& permission);
    static bool checkCallingPermission(const String16& permission, int32_t* outPid,
                                       int32_t* outUid);
    static bool checkPermission(const String16& permission, pid_t pid, uid_t uid);
};

}  // namespace android
