// Shared by the TS parser benchmarks: the input stream (a 1080i H.264 stream at
// about 18 Mbit/s, made once with FFmpeg in the build folder unless
// TAVO_BENCH_TS names another file), its programme map, and a reader that drains
// PESData records from an output ring as a decoder would.
#pragma once

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include <utils/StrongPointer.h>

#include "common/RingBuffer.h"

namespace TavoPlayer::bench {

constexpr uint32_t kPacket = 188;

inline bool fileExists(const std::string& path) {
    struct stat st {};
    return stat(path.c_str(), &st) == 0 && st.st_size > 0;
}

// The benchmark stream: TAVO_BENCH_TS, or a 10 s 1080i H.264 + AAC stream at a
// constant 18 Mbit/s video rate made with FFmpeg on first use. "" when neither.
inline std::string benchStream() {
    if (const char* env = getenv("TAVO_BENCH_TS"); env != nullptr && *env != '\0')
        return env;
    const std::string path = std::string(TAVO_BINARY_DIR) + "/bench_1080i_18mbps.ts";
    if (fileExists(path))
        return path;
    const std::string command =
        "ffmpeg -y -v error -f lavfi -i testsrc2=size=1920x1080:rate=30000/1001 "
        "-f lavfi -i sine=frequency=1000:sample_rate=48000 -t 10 -map 0:v -map 1:a "
        "-c:v libx264 -preset ultrafast -x264-params interlaced=1:tff=1:nal-hrd=cbr:force-cfr=1 "
        "-b:v 18M -minrate 18M -maxrate 18M -bufsize 9M -g 30 -c:a aac -b:a 128k -muxrate 20M "
        "-f mpegts " +
        path + ".tmp && mv " + path + ".tmp " + path;
    if (system(command.c_str()) != 0 || !fileExists(path))
        return "";
    return path;
}

inline std::vector<uint8_t> readFile(const std::string& path) {
    std::vector<uint8_t> bytes;
    FILE* f = fopen(path.c_str(), "rb");
    if (f == nullptr)
        return bytes;
    struct stat st {};
    if (fstat(fileno(f), &st) == 0 && st.st_size > 0) {
        bytes.resize(static_cast<size_t>(st.st_size));
        bytes.resize(fread(bytes.data(), 1, bytes.size(), f));
    }
    fclose(f);
    return bytes;
}

// A read-only mapping of a whole file, pages populated up front: the bytes are
// copied once, into the rings, as a receiver reading the demux would.
class MappedFile {
public:
    explicit MappedFile(const std::string& path) {
        const int fd = open(path.c_str(), O_RDONLY);
        if (fd < 0)
            return;
        struct stat st {};
        if (fstat(fd, &st) == 0 && st.st_size > 0) {
            void* at = mmap(nullptr, static_cast<size_t>(st.st_size), PROT_READ,
                            MAP_PRIVATE | MAP_POPULATE, fd, 0);
            if (at != MAP_FAILED) {
                mData = static_cast<const uint8_t*>(at);
                mSize = static_cast<size_t>(st.st_size);
            }
        }
        close(fd);
    }
    ~MappedFile() {
        if (mData != nullptr)
            munmap(const_cast<uint8_t*>(mData), mSize);
    }
    MappedFile(const MappedFile&) = delete;
    MappedFile& operator=(const MappedFile&) = delete;
    const uint8_t* data() const { return mData; }
    size_t size() const { return mSize; }

private:
    const uint8_t* mData = nullptr;
    size_t mSize = 0;
};

inline uint16_t pidOf(const uint8_t* p) {
    return static_cast<uint16_t>(((p[1] & 0x1F) << 8) | p[2]);
}

// The PIDs of the four chains of the first programme, from its PAT and PMT
// (ISO/IEC 13818-1, 2.4.4.3 and 2.4.4.8); -1 where the programme has none.
struct ChainPids {
    int pcr = -1;
    int video = -1;
    int audio = -1;
    int caption = -1;
};

inline const uint8_t* sectionStart(const uint8_t* p) {
    if (!(p[1] & 0x40) || !(p[3] & 0x10))
        return nullptr;  // needs unit start and payload
    uint32_t at = 4;
    if (p[3] & 0x20)
        at += 1u + p[4];
    if (at >= kPacket)
        return nullptr;
    at += 1u + p[at];  // pointer_field
    return at + 3 < kPacket ? p + at : nullptr;
}

inline ChainPids findChainPids(const uint8_t* ts, size_t size) {
    ChainPids pids;
    int pmtPid = -1;
    for (size_t at = 0; at + kPacket <= size; at += kPacket) {
        const uint8_t* p = ts + at;
        if (p[0] != 0x47)
            continue;
        const uint16_t pid = pidOf(p);
        const uint8_t* s = (pid == 0 || pid == pmtPid) ? sectionStart(p) : nullptr;
        if (s == nullptr)
            continue;
        const uint8_t* end = p + kPacket;
        const uint32_t sectionLength = ((s[1] & 0x0F) << 8) | s[2];
        const uint8_t* last = std::min(end, s + 3 + sectionLength - 4);  // before the CRC
        if (pid == 0 && s[0] == 0x00) {
            for (const uint8_t* e = s + 8; e + 4 <= last; e += 4) {
                if (((e[0] << 8) | e[1]) != 0) {
                    pmtPid = ((e[2] & 0x1F) << 8) | e[3];
                    break;
                }
            }
        } else if (pid == pmtPid && s[0] == 0x02 && s + 12 <= last) {
            pids.pcr = ((s[8] & 0x1F) << 8) | s[9];
            const uint8_t* e = s + 12 + (((s[10] & 0x0F) << 8) | s[11]);
            for (; e + 5 <= last; e += 5 + (((e[3] & 0x0F) << 8) | e[4])) {
                const int esPid = ((e[1] & 0x1F) << 8) | e[2];
                switch (e[0]) {
                    case 0x01:
                    case 0x02:
                    case 0x1B:
                    case 0x24:
                        if (pids.video < 0)
                            pids.video = esPid;
                        break;
                    case 0x03:
                    case 0x04:
                    case 0x0F:
                    case 0x11:
                    case 0x81:
                        if (pids.audio < 0)
                            pids.audio = esPid;
                        break;
                    case 0x06:  // PES private data: the ISDB-T caption stream
                        if (pids.caption < 0)
                            pids.caption = esPid;
                        break;
                    default:
                        break;
                }
            }
            return pids;
        }
    }
    return pids;
}

inline ChainPids findChainPids(const std::vector<uint8_t>& ts) {
    return findChainPids(ts.data(), ts.size());
}

inline std::vector<uint8_t> packetsOfPid(const std::vector<uint8_t>& ts, int pid) {
    std::vector<uint8_t> out;
    for (size_t at = 0; at + kPacket <= ts.size(); at += kPacket) {
        if (ts[at] == 0x47 && pidOf(ts.data() + at) == pid) {
            out.insert(out.end(), ts.begin() + at, ts.begin() + at + kPacket);
        }
    }
    return out;
}

// Drains records from a ring on its own thread until stopped.
class RecordDrainer {
public:
    explicit RecordDrainer(android::sp<RingBuffer> ring)
        : mRing(std::move(ring)), mThread([this] { run(); }) {}
    ~RecordDrainer() {
        mStop = true;
        // Cuts the 100 ms wait short, so that tearing down costs no idle time.
        mRing->wakeAll();
        mThread.join();
    }
    uint64_t records() const { return mRecords.load(); }

private:
    void run() {
        while (!mStop) {
            if (!mRing->waitForData(40))
                continue;
            uint32_t size;
            memcpy(&size, mRing->readPointer() + 12, 4);
            mRing->consume(size);
            mRecords.fetch_add(1, std::memory_order_relaxed);
        }
    }
    android::sp<RingBuffer> mRing;
    std::atomic<bool> mStop{false};
    std::atomic<uint64_t> mRecords{0};
    std::thread mThread;
};

// Writes `bytes` into the ring in commits of at most `chunk` bytes, waiting for
// room as a receiver would.
inline void feedRing(RingBuffer& ring, const uint8_t* bytes, size_t size, size_t chunk) {
    size_t at = 0;
    while (at < size) {
        const auto n = static_cast<uint32_t>(std::min(chunk, size - at));
        if (!ring.waitForSpace(n))
            continue;
        memcpy(ring.writePointer(), bytes + at, n);
        ring.commitWrite(n);
        at += n;
    }
}

inline void waitDrained(RingBuffer& ring) {
    while (ring.usedSpace() != 0)
        std::this_thread::yield();
}

}  // namespace TavoPlayer::bench
