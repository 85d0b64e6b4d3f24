// Helpers shared by the demux and TS receiver tests: streams with known contents,
// temporary files, the demux source property, a pipe on standard input, and a
// reader that drains a ring buffer.
#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include <utils/StrongPointer.h>

#include "common/RingBuffer.h"
#include "support/TsPacketBuilder.h"

namespace TavoPlayer::test {

// A stream made of rounds: each round has one packet of every PID, in order. Each
// packet's payload starts with its PID (2 bytes) and its sequence number within
// its PID (4 bytes, big-endian), then a pattern derived from both, so any packet
// out of place or damaged is recognisable.
struct StreamPlan {
    std::vector<uint16_t> pids;
    size_t rounds = 10;
    int pcrPid = -1;                 // this PID's packets carry a PCR
    uint32_t pcrIntervalMs = 40;     // the PCR advances this much per round
    uint64_t firstPcrBase = 900000;  // 90 kHz units
    uint32_t firstSequence = 0;
};
std::vector<uint8_t> buildStream(const StreamPlan& plan);

// The payload's PID and sequence number as written by buildStream (-1 if absent).
int64_t sequenceOf(const uint8_t* packet);
uint16_t pidOf(const uint8_t* packet);

// The 188-byte packets of a packet-aligned byte string, grouped by PID.
std::map<uint16_t, std::vector<TsPacket>> packetsByPid(const std::vector<uint8_t>& bytes);
std::vector<TsPacket> toPackets(const std::vector<uint8_t>& bytes);
// One short line per packet ("0x100#12 5f3a9c01": PID, sequence number, a hash of
// all 188 bytes), so that a failed comparison prints something a reader can follow.
std::vector<std::string> summary(const std::vector<TsPacket>& packets);

// A file in the temporary folder, removed at destruction.
class TempFile {
public:
    explicit TempFile(const std::vector<uint8_t>& bytes, const std::string& suffix = ".ts");
    ~TempFile();
    TempFile(const TempFile&) = delete;
    TempFile& operator=(const TempFile&) = delete;
    const std::string& path() const { return mPath; }

private:
    std::string mPath;
};

// Sets tavoplayer.demux.source (through its environment override) for the
// lifetime of the object.
class ScopedDemuxSource {
public:
    explicit ScopedDemuxSource(const std::string& value);
    ~ScopedDemuxSource();
    void set(const std::string& value);

private:
    std::string mPrevious;
    bool mHadPrevious;
};

// A pipe whose read end replaces standard input while the object lives.
class StdinPipe {
public:
    StdinPipe();
    ~StdinPipe();
    StdinPipe(const StdinPipe&) = delete;
    StdinPipe& operator=(const StdinPipe&) = delete;
    void write(const std::vector<uint8_t>& bytes);
    void closeWriter();

private:
    int mSavedStdin = -1;
    int mWriteFd = -1;
};

// Reads every byte written to a ring on a thread of its own, as a TS parser would.
class RingDrain {
public:
    explicit RingDrain(android::sp<RingBuffer> ring);
    ~RingDrain();
    RingDrain(const RingDrain&) = delete;
    RingDrain& operator=(const RingDrain&) = delete;
    // Waits (generous deadline) until at least `packets` packets have been read.
    bool waitForPackets(size_t packets, std::chrono::milliseconds deadline);
    std::vector<TsPacket> packets() const;
    size_t count() const;
    void stop();

private:
    void run();
    android::sp<RingBuffer> mRing;
    mutable std::mutex mLock;
    std::condition_variable mChanged;
    std::vector<TsPacket> mPackets;
    std::atomic<bool> mStop{false};
    std::thread mThread;
};

// A ring of `log2Size` that the test owns.
android::sp<RingBuffer> makeRing(const std::string& name, unsigned int log2Size);

// Polls `condition` every few milliseconds until it holds or `deadline` passes.
bool waitUntil(const std::function<bool()>& condition, std::chrono::milliseconds deadline);

// Threads of this process with this name (/proc/self/task/*/comm).
size_t threadsNamed(const std::string& name);

// A free UDP port on 127.0.0.1 at the time of the call.
int freeUdpPort();

}  // namespace TavoPlayer::test
