#include "platform/os/SharedLibrary.h"

#include <dlfcn.h>

#include "platform/os/Trace.h"

namespace android {

void* SharedLibrary::open(const char* soname) {
    // dlopen counts references: a library already open gives its handle again.
    // RTLD_LOCAL keeps its symbols out of the process's global scope.
    void* handle = dlopen(soname, RTLD_NOW | RTLD_LOCAL);
    if (handle == nullptr)
        TAVO_LOGE("%s: %s cannot be loaded: %s\n", __func__, soname, dlerror());
    return handle;
}

void* SharedLibrary::symbol(void* handle, const char* name) {
    void* address = handle != nullptr ? dlsym(handle, name) : nullptr;
    if (address == nullptr)
        TAVO_LOGE("%s: %s is missing from its library\n", __func__, name);
    return address;
}

}  // namespace android
