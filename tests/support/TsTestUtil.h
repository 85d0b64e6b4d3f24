// Helpers shared by the transport-stream tests (TS parser module, demux, receiver):
// rings fed and read as the neighbouring modules do, streams of recognisable
// packets, temporary files, the demux source property and a pipe on standard input.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include <utils/StrongPointer.h>

#include "common/RingBuffer.h"
#include "support/Recorded.h"
#include "support/RunCommand.h"
#include "support/ScopedEnv.h"
#include "support/TsPacketBuilder.h"

namespace TavoPlayer::test {

android::sp<RingBuffer> makeRing(const std::string& name, uint32_t sizeBytes);
// Polls `condition` every few milliseconds until it holds or `deadline` passes.
bool waitUntil(const std::function<bool()>& condition,
               std::chrono::milliseconds deadline = kDeadline);
// Writes `bytes` as one commit (one batch for an idle parser); false when the ring
// has no room for them within the deadline.
bool writeAll(RingBuffer& ring, const std::vector<uint8_t>& bytes);
// Waits until the reader has consumed everything written to `ring`.
bool waitConsumed(RingBuffer& ring);
// True when a writer can take the ring's writer lock: whoever held it released it.
bool writerLockFree(RingBuffer& ring);

// A PESData record as read from a ring: its 40-byte header as laid out there (the
// first 8 bytes are the record's own bookkeeping), then the PES bytes.
struct PesRecordHeader {
    uint64_t reserved;
    uint32_t type;
    uint32_t size;
    uint64_t pts;
    uint64_t dts;
    uint32_t offsetES;
    uint32_t sizeES;
};
static_assert(sizeof(PesRecordHeader) == 40);
struct PesRecord : PesRecordHeader {
    std::vector<uint8_t> pes;  // bytes 40 .. size
};
// Reads and consumes the record at the read position, waiting up to `deadline`.
std::optional<PesRecord> readRecord(RingBuffer& ring,
                                    std::chrono::milliseconds deadline = kDeadline);
// Every record readable now, consumed.
std::vector<PesRecord> drainRecords(RingBuffer& ring);

// What `write` prints to a stream (a module's dump).
std::string printed(const std::function<void(FILE*)>& write);

// A stream made of rounds: each round has one packet of every PID, in order. Each
// payload starts with its PID (2 bytes) and its sequence number within its PID
// (4 bytes, big-endian), then a pattern derived from both, so any packet out of
// place or damaged is recognisable.
struct StreamPlan {
    std::vector<uint16_t> pids;
    size_t rounds = 10;
    int pcrPid = -1;              // this PID's packets carry a PCR
    uint32_t pcrIntervalMs = 40;  // the PCR advances this much per round, from 10 s
    uint32_t firstSequence = 0;
};
std::vector<uint8_t> buildStream(const StreamPlan& plan);

// The payload's sequence number as written by buildStream (-1 if absent), and the PID.
int64_t sequenceOf(const uint8_t* packet);
uint16_t pidOf(const uint8_t* packet);
std::vector<TsPacket> toPackets(const std::vector<uint8_t>& bytes);
std::map<uint16_t, std::vector<TsPacket>> packetsByPid(const std::vector<uint8_t>& bytes);
// The 188-byte packets of one PID in a packet-aligned stream, laid end to end.
std::vector<uint8_t> bytesOfPid(const std::vector<uint8_t>& ts, uint16_t pid);
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

// Sets tavoplayer.demux.source (through its environment override) while it lives.
class ScopedDemuxSource {
public:
    explicit ScopedDemuxSource(const std::string& value) : mEnv(kVariable, value) {}

private:
    static constexpr const char* kVariable = "TAVOPLAYER_PROP_tavoplayer_demux_source";
    ScopedEnv mEnv;
};

// `bytes` in a temporary file that is the demux source, with these options.
struct FileSource {
    FileSource(const std::vector<uint8_t>& bytes, const std::string& options = "?pace=none")
        : file(bytes), source("file:" + file.path() + options) {}
    TempFile file;
    ScopedDemuxSource source;
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
    bool waitForPackets(size_t packets, std::chrono::milliseconds deadline = kDeadline) {
        return mPackets.waitFor([&](auto& all) { return all.size() >= packets; }, deadline);
    }
    std::vector<TsPacket> packets() const { return mPackets.snapshot(); }
    size_t count() const {
        return mPackets.read([](auto& all) { return all.size(); });
    }

private:
    void run();
    android::sp<RingBuffer> mRing;
    Recorded<TsPacket> mPackets;
    std::atomic<bool> mStop{false};
    std::thread mThread;
};

// Threads of this process with this name (/proc/self/task/*/comm).
size_t threadsNamed(const std::string& name);
// A free UDP port on 127.0.0.1 at the time of the call.
int freeUdpPort();

}  // namespace TavoPlayer::test
