#include "platform/dtv/DemuxSourceConfig.h"

#include <gtest/gtest.h>

namespace TavoPlayer {
namespace {

using Kind = DemuxSourceConfig::Kind;
using Overflow = DemuxSourceConfig::Overflow;

struct Good {
    const char* text;
    Kind kind;
    const char* pathOrHost;
    int portOrAdapter;
    int demux;
    bool loop;
    bool paced;
    size_t queue;
    Overflow overflow;
};

TEST(DemuxSourceConfigTest, AcceptsEverySourceForm) {
    const Good cases[] = {
        {"file:/a/b.ts", Kind::kFile, "/a/b.ts", 0, 0, false, true, 8192, Overflow::kDrop},
        {"file:/a/b.ts?loop=1", Kind::kFile, "/a/b.ts", 0, 0, true, true, 8192, Overflow::kDrop},
        // Unpaced files wait for a slow reader unless told otherwise.
        {"file:x.ts?pace=none&loop=1", Kind::kFile, "x.ts", 0, 0, true, false, 8192,
         Overflow::kWait},
        {"file:x.ts?pace=none&overflow=drop", Kind::kFile, "x.ts", 0, 0, false, false, 8192,
         Overflow::kDrop},
        {"file:x.ts?queue=16&pace=pcr", Kind::kFile, "x.ts", 0, 0, false, true, 16,
         Overflow::kDrop},
        {"udp://239.1.2.3:1234", Kind::kUdp, "239.1.2.3", 1234, 0, false, true, 8192,
         Overflow::kDrop},
        {"udp://:5000?queue=100", Kind::kUdp, "", 5000, 0, false, true, 100, Overflow::kDrop},
        {"udp://[::1]:5000", Kind::kUdp, "::1", 5000, 0, false, true, 8192, Overflow::kDrop},
        {"stdin", Kind::kStdin, "", 0, 0, false, true, 8192, Overflow::kDrop},
        {"stdin?overflow=wait", Kind::kStdin, "", 0, 0, false, true, 8192, Overflow::kWait},
        {"dvb:0", Kind::kDvb, "", 0, 0, false, true, 8192, Overflow::kDrop},
        {"dvb:2.1", Kind::kDvb, "", 2, 1, false, true, 8192, Overflow::kDrop},
    };
    for (const Good& c : cases) {
        DemuxSourceConfig config;
        std::string error;
        ASSERT_TRUE(DemuxSourceConfig::parse(c.text, &config, &error)) << c.text << ": " << error;
        EXPECT_EQ(config.kind, c.kind) << c.text;
        if (c.kind == Kind::kFile) {
            EXPECT_EQ(config.path, c.pathOrHost) << c.text;
        }
        if (c.kind == Kind::kUdp) {
            EXPECT_EQ(config.host, c.pathOrHost) << c.text;
            EXPECT_EQ(config.port, c.portOrAdapter) << c.text;
        }
        if (c.kind == Kind::kDvb) {
            EXPECT_EQ(config.adapter, c.portOrAdapter) << c.text;
            EXPECT_EQ(config.demux, c.demux) << c.text;
        }
        EXPECT_EQ(config.loop, c.loop) << c.text;
        EXPECT_EQ(config.paced, c.paced) << c.text;
        EXPECT_EQ(config.queuePackets, c.queue) << c.text;
        EXPECT_EQ(config.overflow, c.overflow) << c.text;
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
        {"dvb:a", "ADAPTER"},
        {"dvb:0.", "ADAPTER"},
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
