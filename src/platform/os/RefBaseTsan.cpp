// Makes libutils' strong reference counts visible to ThreadSanitizer.
//
// sp<T> copies travel between threads everywhere in the pipeline (a track flushed from
// the TS parser's thread while the controller stops it, a connection kept by proxies).
// The last RefBase::decStrong destroys the object, and the atomic decrement inside
// libutils orders every earlier holder's last use before that destructor. libutils is
// not instrumented, so the sanitizer sees no such order and reports the destructor as
// racing with the other threads' last uses.
//
// In ThreadSanitizer builds this definition takes the place of libutils' own (the
// executable's or our library's symbol comes first in the lookup order): it tells the
// sanitizer that each decrement releases and acquires the object, as the real atomic
// read-modify-write does, then calls libutils' decStrong. Other builds compile nothing.

#if defined(__SANITIZE_THREAD__)
#define TAVO_TSAN_BUILD 1
#elif defined(__has_feature)
#if __has_feature(thread_sanitizer)
#define TAVO_TSAN_BUILD 1
#endif
#endif

#ifdef TAVO_TSAN_BUILD

#include <dlfcn.h>
#include <utils/RefBase.h>

#include <cstdio>
#include <cstdlib>

extern "C" void __tsan_acquire(void* addr);
extern "C" void __tsan_release(void* addr);

namespace android {

void RefBase::decStrong(const void* id) const {
    using DecStrong = void (*)(const RefBase*, const void*);
    static const DecStrong next = [] {
        auto* fn =
            reinterpret_cast<DecStrong>(dlsym(RTLD_NEXT, "_ZNK7android7RefBase9decStrongEPKv"));
        if (fn == nullptr) {
            std::fprintf(stderr, "RefBase::decStrong: libutils' definition not found\n");
            std::abort();
        }
        return fn;
    }();
    void* const sync = const_cast<RefBase*>(this);
    __tsan_release(sync);
    __tsan_acquire(sync);
    next(this, id);
}

}  // namespace android

#endif
