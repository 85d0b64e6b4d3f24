#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <string>

#include "platform/os/Properties.h"
#include "platform/os/Trace.h"
#include "support/ScopedEnv.h"
#include "support/TraceCapture.h"
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

TEST_F(PropertiesTest, ValuesComeFromTheFileTrimmedAndLastOneWins) {
    write(
        "# comment\n\n tavoplayer.video.sink = null \nnot a property\n"
        "tavoplayer.video.sink=y4m:/tmp/out.y4m\noneseg.extSdCard.path=/mnt/sd\nk=" +
        std::string(200, 'v') + "\n");
    char value[kPropertyValueMax];
    EXPECT_EQ(16, property_get("tavoplayer.video.sink", value, "sdl"));
    EXPECT_STREQ("y4m:/tmp/out.y4m", value);
    EXPECT_EQ(7, property_get("oneseg.extSdCard.path", value, ""));
    EXPECT_STREQ("/mnt/sd", value);
    // A missing key gives the default, or nothing.
    EXPECT_EQ(3, property_get("x.y", value, "def"));
    EXPECT_STREQ("def", value);
    EXPECT_EQ(0, property_get("x.y", value, nullptr));
    EXPECT_STREQ("", value);
    // Long values are truncated to the buffer, not in the string form.
    EXPECT_EQ(kPropertyValueMax - 1, property_get("k", value, ""));
    EXPECT_EQ(std::string(kPropertyValueMax - 1, 'v'), value);
    EXPECT_EQ(std::string(200, 'v'), propertyGetString("k", ""));
}

TEST_F(PropertiesTest, EnvironmentOverridesTheFileAndAMissingFileGivesTheDefault) {
    write("tavoplayer.demux.source=file:/a.ts\n");
    EXPECT_EQ("file:/a.ts", propertyGetString("tavoplayer.demux.source", "stdin"));
    {
        test::ScopedEnv source("TAVOPLAYER_PROP_tavoplayer_demux_source", "udp://239.1.1.1:1234");
        EXPECT_EQ("udp://239.1.1.1:1234", propertyGetString("tavoplayer.demux.source", "stdin"));
    }
    setenv("TAVOPLAYER_PROPERTIES", "/nonexistent/dir/system.prop", 1);
    EXPECT_EQ("stdin", propertyGetString("tavoplayer.demux.source", "stdin"));
}

// ---------------------------------------------------------------------------------
// Trace: severities, source position, formatting, level filter.

TEST(TraceTest, MacrosRecordSeverityFileAndLine) {
    std::vector<TraceRecord> seen;
    TraceSink previous = setTraceSink([&](const TraceRecord& r) {
        seen.push_back({r.severity, r.file, r.line, r.text});
    });
    const int line = __LINE__ + 1;
    TAVO_LOGE("%s: Error starting player\n", "start");
    TAVO_LOGW("%s: w %d\n", "op", 2);
    TAVO_LOGI("%s: i\n", "op");
    TAVO_LOGD("%s: d\n", "op");
    setTraceSink(std::move(previous));
    ASSERT_EQ(4u, seen.size());
    EXPECT_EQ(0x80000800u, seen[0].severity);
    EXPECT_EQ(0x40000800u, seen[1].severity);
    EXPECT_EQ(0x20000800u, seen[2].severity);
    EXPECT_EQ(0x10000800u, seen[3].severity);
    EXPECT_EQ("start: Error starting player\n", seen[0].text);
    EXPECT_EQ("op: w 2\n", seen[1].text);
    EXPECT_EQ(line, seen[0].line);
    EXPECT_NE(std::string::npos, std::string(seen[0].file).find("PlatformOsTest.cpp"));
}

TEST(TraceTest, LongMessagesAreFormattedWhole) {
    test::TraceCapture capture;
    const std::string big(3000, 'x');
    TAVO_LOGI("%s: %s\n", "op", big.c_str());
    ASSERT_EQ(1u, capture.lines().size());
    EXPECT_EQ("op: " + big + "\n", capture.lines()[0].text);
}

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

TEST(TraceTest, StderrLineCarriesSeverityThreadAndSource) {
    // Redirect stderr into a file for the duration of one message.
    char name[] = "/tmp/tavo-traceXXXXXX";
    const int fd = mkstemp(name);
    ASSERT_GE(fd, 0);
    fflush(stderr);
    const int saved = dup(STDERR_FILENO);
    dup2(fd, STDERR_FILENO);
    pthread_setname_np(pthread_self(), "TraceTestThr");
    TAVO_LOGE("%s: boom %d\n", "configure", 7);
    fflush(stderr);
    dup2(saved, STDERR_FILENO);
    close(saved);
    std::ifstream in(name);
    std::string line;
    std::getline(in, line);
    close(fd);
    unlink(name);
    EXPECT_NE(std::string::npos, line.find(" E [TraceTestThr] PlatformOsTest.cpp:")) << line;
    EXPECT_NE(std::string::npos, line.find(" configure: boom 7")) << line;
    EXPECT_EQ(line.npos, line.find('\n'));
}

}  // namespace
}  // namespace TavoPlayer
