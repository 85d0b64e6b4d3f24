// Libraries opened at run time: a table is resolved once per process, and a missing
// library or function gives no table (so that its user fails with a clear error
// instead of calling through a null pointer).
#include <cstring>

#include <gtest/gtest.h>

#include "platform/os/SharedLibrary.h"

namespace android {
namespace {

struct LibcTable {
    decltype(&::strlen) strlen;
};
struct MissingFunctionTable {
    decltype(&::strlen) strlen;
};
struct MissingLibraryTable {
    decltype(&::strlen) strlen;
};

TEST(SharedLibraryTest, ResolvesOnceOrGivesNoTable) {
    const auto resolveLibc = [](void* handle, LibcTable& table) {
        return TAVO_RESOLVE(handle, table, strlen);
    };
    const LibcTable* libc = SharedLibrary::loadOnce<LibcTable>("libc.so.6", resolveLibc);
    ASSERT_NE(libc, nullptr);
    EXPECT_EQ(libc->strlen("ISDB-Tb"), 7u);
    EXPECT_EQ(SharedLibrary::loadOnce<LibcTable>("libc.so.6", resolveLibc), libc);

    EXPECT_EQ(SharedLibrary::loadOnce<MissingFunctionTable>(
                  "libc.so.6",
                  [](void* handle, MissingFunctionTable& table) {
                      return SharedLibrary::resolve(handle, "no_such_function", &table.strlen);
                  }),
              nullptr);
    EXPECT_EQ(
        SharedLibrary::loadOnce<MissingLibraryTable>("libtavo-no-such-library.so.1",
                                                     [](void* handle, MissingLibraryTable& table) {
                                                         return TAVO_RESOLVE(handle, table, strlen);
                                                     }),
        nullptr);
}

}  // namespace
}  // namespace android
