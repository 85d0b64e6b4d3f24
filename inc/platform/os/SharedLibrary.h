// SharedLibrary: a system library opened at run time instead of linked, for the
// facilities a process may never use (the window and its deinterlacer, the media
// player). Linked, SDL2's, libavfilter's and libmpv's dependency trees (some 130
// libraries) would be loaded and relocated in every process of the system, the
// headless service and the viewer included, for tens of MiB of resident memory.
//
// A library is opened once per process and never closed: its threads and exit
// handlers may outlive any one user. Each user keeps a table of the functions it
// calls, resolved with resolve() and typed from the library's own header.
//
// Threads: open() and resolve() may be called from any thread.
#pragma once

namespace android {

class SharedLibrary {
public:
    // The handle of `soname` (e.g. "libSDL2-2.0.so.0"), opened now or earlier;
    // nullptr when it cannot be loaded (logged once per call).
    static void* open(const char* soname);

    // Sets `*function` to the library's `name`; false (logged) when it is missing.
    template <typename Function>
    static bool resolve(void* handle, const char* name, Function** function) {
        *function = reinterpret_cast<Function*>(symbol(handle, name));
        return *function != nullptr;
    }

    // The function table `Table` of `soname`, resolved once per process by
    // `resolveAll(handle, table)` (true when every member is set); nullptr when the
    // library or one of its functions is missing. One soname per table type.
    template <typename Table, typename ResolveAll>
    static const Table* loadOnce(const char* soname, ResolveAll resolveAll) {
        static const Table* const loaded = [&]() -> const Table* {
            static Table table;
            void* handle = open(soname);
            return handle != nullptr && resolveAll(handle, table) ? &table : nullptr;
        }();
        return loaded;
    }

private:
    static void* symbol(void* handle, const char* name);
};

// Sets the member of `table` named as the library's function `name` (see loadOnce).
#define TAVO_RESOLVE(handle, table, name) \
    ::android::SharedLibrary::resolve(handle, #name, &(table).name)

}  // namespace android
