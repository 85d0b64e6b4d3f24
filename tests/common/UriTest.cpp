#include "common/Uri.h"

#include <gtest/gtest.h>

#include <map>
#include <memory>
#include <string>

#include "support/TraceCapture.h"

namespace TavoPlayer {
namespace {

using Queries = std::map<std::string, std::string>;

struct UriCase {
    const char* text;
    // Empty when the parse must succeed; else the error line it must log.
    const char* failure;
    const char* scheme;
    const char* authority;
    const char* path;
    const char* fragment;
    Queries queries;
};

const UriCase kCases[] = {
    {"MTV://tuner/live?a=1;b=2;", "", "MTV", "tuner", "live", "", {{"a", "1"}, {"b", "2"}}},
    {"MTV:/x?a=1;", "", "MTV", "", "x", "", {{"a", "1"}}},
    // The scheme keeps its case; only the exact "FILE" keeps the '/' and loses
    // the last character.
    {"FILE:///sdcard/a.mp4", "", "FILE", "", "/sdcard/a.mp", "", {}},
    {"file:///sdcard/a.mp4", "", "file", "", "sdcard/a.mp4", "", {}},
    {"Mtv://h", "Failed to parse path.", nullptr, nullptr, nullptr, nullptr, {}},
    // Text after the last ';' is dropped without complaint.
    {"MTV://t/p?a=1;b=2", "", "MTV", "t", "p", "", {{"a", "1"}}},
    {"MTV://t/p?a=1;;", "Failed to parse queries.", nullptr, nullptr, nullptr, nullptr, {}},
    {"MTV://t/p?a;", "Failed to parse queries.", nullptr, nullptr, nullptr, nullptr, {}},
    // Leading spaces of a key go, trailing ones and tabs stay; values are raw.
    {"MTV://t/p? a =1;\tk=v;", "", "MTV", "t", "p", "", {{"a ", "1"}, {"\tk", "v"}}},
    {"MTV://t/p?a=1;a=2;", "", "MTV", "t", "p", "", {{"a", "1"}}},
    {"MTV://t/p?u=x=y&z%20;e=;", "", "MTV", "t", "p", "", {{"u", "x=y&z%20"}, {"e", ""}}},
    {"MTV://t/p?a=1;#frag", "", "MTV", "t", "p", "#frag", {{"a", "1"}}},
    {"MTV://t/p?a=1#frag;b=2;", "", "MTV", "t", "p", "#frag;b=2;", {}},
    {"MTV://t/p", "", "MTV", "t", "p", "", {}},
    {"MTV://t/p?", "", "MTV", "t", "p", "", {}},
    {"MTV://t?x=1;", "Failed to parse path.", nullptr, nullptr, nullptr, nullptr, {}},
    {"MTV:?a=1;", "Failed to parse path.", nullptr, nullptr, nullptr, nullptr, {}},
    {"MTV:", "Failed to parse path.", nullptr, nullptr, nullptr, nullptr, {}},
    {"no scheme here", "Failed to find scheme separator.", nullptr, nullptr, nullptr, nullptr, {}},
    // The first ':' splits the scheme even when a later one would read better.
    {"a:b://h/p", "Failed to parse path.", nullptr, nullptr, nullptr, nullptr, {}},
};

TEST(UriTest, ParsesTheTable) {
    for (const UriCase& c : kCases) {
        SCOPED_TRACE(c.text);
        test::TraceCapture trace;
        std::unique_ptr<Uri> uri(Uri::parse(c.text));
        if (*c.failure != '\0') {
            EXPECT_EQ(uri, nullptr);
            EXPECT_EQ(trace.count(TRACE_ERROR, c.failure), 1u) << trace.all();
            continue;
        }
        ASSERT_NE(uri, nullptr) << trace.all();
        EXPECT_EQ(uri->mUri, c.text);
        EXPECT_EQ(uri->mScheme, c.scheme);
        EXPECT_EQ(uri->mAuthority, c.authority);
        EXPECT_EQ(uri->mPath, c.path);
        EXPECT_EQ(uri->mFragment, c.fragment);
        EXPECT_EQ(uri->mQueries, c.queries);
        EXPECT_EQ(trace.count(TRACE_ERROR, ""), 0u) << trace.all();
    }
}

}  // namespace
}  // namespace TavoPlayer
