// Libraries opened at run time: a table is resolved once per process, and a missing
// library or function gives no table (so that its user fails with a clear error
// instead of calling through a null pointer).
#include <cstring>

#include <gtest/gtest.h>

#include "platform/os/SharedLibrary.h"

namespace android {
namespace {

// One table type per soname: loadOnce keeps one result per type.
template <int>
struct StrlenTable {
    decltype(&::strlen) strlen;
};

TEST(SharedLibraryTest, ResolvesOnceOrGivesNoTable) {
    const auto resolveStrlen = [](void* handle, auto& table) {
        return TAVO_RESOLVE(handle, table, strlen);
    };
    const auto* libc = SharedLibrary::loadOnce<StrlenTable<0>>("libc.so.6", resolveStrlen);
    ASSERT_NE(libc, nullptr);
    EXPECT_EQ(libc->strlen("ISDB-Tb"), 7u);
    EXPECT_EQ(SharedLibrary::loadOnce<StrlenTable<0>>("libc.so.6", resolveStrlen), libc);

    EXPECT_EQ(SharedLibrary::loadOnce<StrlenTable<1>>(
                  "libc.so.6",
                  [](void* handle, StrlenTable<1>& table) {
                      return SharedLibrary::resolve(handle, "no_such_function", &table.strlen);
                  }),
              nullptr);
    EXPECT_EQ(
        SharedLibrary::loadOnce<StrlenTable<2>>("libtavo-no-such-library.so.1", resolveStrlen),
        nullptr);
}

}  // namespace
}  // namespace android
