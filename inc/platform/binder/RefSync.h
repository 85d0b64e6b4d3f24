// Makes libutils' reference counting visible to ThreadSanitizer.
//
// libutils is not instrumented, so when a binder thread drops a reference and
// another thread then drops the last one and destroys the object, the sanitizer
// sees no order between the first thread's last use and the destructor. Binder
// threads publish their drops (published()) and an object about to be destroyed
// takes them in (onLastStrongRef calls observed()). Both do nothing in other builds.
#pragma once

#if defined(__SANITIZE_THREAD__)
#define TAVO_BINDER_TSAN 1
#elif defined(__has_feature)
#if __has_feature(thread_sanitizer)
#define TAVO_BINDER_TSAN 1
#endif
#endif

#ifdef TAVO_BINDER_TSAN
extern "C" void __tsan_acquire(void* addr);
extern "C" void __tsan_release(void* addr);
#endif

namespace android::refsync {

#ifdef TAVO_BINDER_TSAN
inline char gSyncPoint;
inline void published() {
    __tsan_release(&gSyncPoint);
}
inline void observed() {
    __tsan_acquire(&gSyncPoint);
}
#else
inline void published() {}
inline void observed() {}
#endif

}  // namespace android::refsync
