#include <gtest/gtest.h>
#include <stdlib.h>

#include <fstream>
#include <string>

#include "platform/os/Properties.h"
#include "platform/os/Trace.h"
#include "support/ScopedEnv.h"
#include "support/TsTestUtil.h"

namespace TavoPlayer {
namespace {

// ---------------------------------------------------------------------------------
// Properties: file plus environment override.

class PropertiesTest : public ::testing::Test {
protected:
    void write(const std::string& text) { std::ofstream(mFile.path()) << text; }
    test::TempFile mFile{{}, ".prop"};
    test::ScopedEnv mProperties{"TAVOPLAYER_PROPERTIES", mFile.path()};
};

TEST_F(PropertiesTest, ValuesComeFromTheFileTrimmedLastOneWinsAndAMissingFileGivesTheDefault) {
    write(
        "# comment\n\n tavoplayer.video.sink = null \nnot a property\n"
        "tavoplayer.video.sink=y4m:/tmp/out.y4m\nk=" +
        std::string(200, 'v') + "\n");
    char value[kPropertyValueMax];
    EXPECT_EQ(16, property_get("tavoplayer.video.sink", value, "sdl"));
    EXPECT_STREQ("y4m:/tmp/out.y4m", value);
    // A missing key gives the default, or nothing.
    EXPECT_EQ(3, property_get("x.y", value, "def"));
    EXPECT_STREQ("def", value);
    EXPECT_EQ(0, property_get("x.y", value, nullptr));
    EXPECT_STREQ("", value);
    // Long values are truncated to the buffer, not in the string form.
    EXPECT_EQ(kPropertyValueMax - 1, property_get("k", value, ""));
    EXPECT_EQ(std::string(kPropertyValueMax - 1, 'v'), value);
    EXPECT_EQ(std::string(200, 'v'), propertyGetString("k", ""));

    // Every test sets properties through the environment; a missing file is the default.
    setenv("TAVOPLAYER_PROPERTIES", "/nonexistent/dir/system.prop", 1);
    EXPECT_EQ("sdl", propertyGetString("tavoplayer.video.sink", "sdl"));
}

// ---------------------------------------------------------------------------------
// Trace: the level filter.

TEST(TraceTest, LevelFiltersWhatReachesStderr) {
    setTraceLevel(TRACE_WARNING);
    EXPECT_TRUE(OneSegPGL_TraceEnabled(TRACE_ERROR));
    EXPECT_TRUE(OneSegPGL_TraceEnabled(TRACE_WARNING));
    EXPECT_FALSE(OneSegPGL_TraceEnabled(TRACE_INFO));
    EXPECT_FALSE(OneSegPGL_TraceEnabled(TRACE_DEBUG));
    setTraceLevel(TRACE_DEBUG);
    EXPECT_TRUE(OneSegPGL_TraceEnabled(TRACE_DEBUG));
    setTraceLevel(TRACE_NONE);
    EXPECT_FALSE(OneSegPGL_TraceEnabled(TRACE_ERROR));
    setTraceLevel(TRACE_INFO);
}

}  // namespace
}  // namespace TavoPlayer
