#include "platform/dtv/DemuxSourceConfig.h"

#include <gtest/gtest.h>

namespace TavoPlayer {
namespace {

// Every field that applies to the source's kind, on one line.
std::string describe(const DemuxSourceConfig& c) {
    using Kind = DemuxSourceConfig::Kind;
    const char* kinds[] = {"none", "file", "udp", "stdin", "dvb"};
    std::string text = kinds[static_cast<int>(c.kind)];
    if (c.kind == Kind::kFile)
        text += " " + c.path + (c.loop ? " loop" : "") + (c.paced ? " paced" : " unpaced");
    if (c.kind == Kind::kUdp)
        text += " " + c.host + ":" + std::to_string(c.port) + " " + c.iface;
    if (c.kind == Kind::kDvb)
        text += " " + std::to_string(c.adapter) + "." + std::to_string(c.demux);
    text += " queue " + std::to_string(c.queuePackets);
    return text + (c.overflow == DemuxSourceConfig::Overflow::kDrop ? " drop" : " wait");
}

TEST(DemuxSourceConfigTest, AcceptsEverySourceForm) {
    const struct {
        const char* text;
        const char* parsed;
    } cases[] = {
        {"file:/a/b.ts", "file /a/b.ts paced queue 8192 drop"},
        // Unpaced files wait for a slow reader unless told otherwise.
        {"file:x.ts?pace=none&loop=1", "file x.ts loop unpaced queue 8192 wait"},
        {"file:x.ts?pace=none&overflow=drop", "file x.ts unpaced queue 8192 drop"},
        {"file:x.ts?queue=16&pace=pcr", "file x.ts paced queue 16 drop"},
        {"udp://239.1.2.3:1234?iface=10.0.0.2", "udp 239.1.2.3:1234 10.0.0.2 queue 8192 drop"},
        {"udp://:5000?queue=100", "udp :5000  queue 100 drop"},
        {"udp://[::1]:5000", "udp ::1:5000  queue 8192 drop"},
        {"stdin?overflow=wait", "stdin queue 8192 wait"},
        {"dvb:0", "dvb 0.0 queue 8192 drop"},
        {"dvb:2.1", "dvb 2.1 queue 8192 drop"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.text);
        DemuxSourceConfig config;
        std::string error;
        ASSERT_TRUE(DemuxSourceConfig::parse(c.text, &config, &error)) << error;
        EXPECT_EQ(describe(config), c.parsed);
    }
}

TEST(DemuxSourceConfigTest, RefusesMalformedSourcesAndSaysWhy) {
    const struct {
        const char* text;
        const char* reason;
    } cases[] = {
        {"", "unknown source"},
        {"/tmp/x.ts", "unknown source"},
        {"file:", "needs a path"},
        {"file:x.ts?loop=yes", "loop must be"},
        {"file:x.ts?pace=fast", "pace must be"},
        {"file:x.ts?queue=8", "queue must be"},
        {"file:x.ts?queue=lots", "queue must be"},
        {"file:x.ts?speed=2", "unknown option"},
        {"file:x.ts?loop", "has no value"},
        {"udp://239.1.2.3", "needs GROUP:PORT"},
        {"udp://239.1.2.3:0", "port must be"},
        {"udp://239.1.2.3:70000", "port must be"},
        {"udp://239.1.2.3:12ab", "port must be"},
        {"dvb:", "ADAPTER"},
        {"dvb:0.x", "ADAPTER"},
        {"dvb:-1", "ADAPTER"},
        {"stdin?overflow=maybe", "overflow must be"},
    };
    for (const auto& c : cases) {
        DemuxSourceConfig config;
        config.path = "unchanged";
        std::string error;
        EXPECT_FALSE(DemuxSourceConfig::parse(c.text, &config, &error)) << c.text;
        EXPECT_NE(error.find(c.reason), std::string::npos) << c.text << " gave: " << error;
        EXPECT_EQ(config.path, "unchanged") << c.text;
    }
}

}  // namespace
}  // namespace TavoPlayer
