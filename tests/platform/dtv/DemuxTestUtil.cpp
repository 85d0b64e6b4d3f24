#include "platform/dtv/DemuxTestUtil.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <stdexcept>

namespace TavoPlayer::test {

namespace {
constexpr const char* kSourceEnv = "TAVOPLAYER_PROP_tavoplayer_demux_source";

size_t payloadOffset(const uint8_t* packet) {
    const uint8_t control = (packet[3] >> 4) & 3;
    if (control == 1)
        return 4;
    if (control == 3)
        return 5u + packet[4];
    return 188;
}
}  // namespace

std::vector<uint8_t> buildStream(const StreamPlan& plan) {
    std::vector<uint8_t> out;
    out.reserve(plan.rounds * plan.pids.size() * 188);
    std::map<uint16_t, uint32_t> sequence;
    for (size_t round = 0; round < plan.rounds; ++round) {
        for (uint16_t pid : plan.pids) {
            const uint32_t seq = plan.firstSequence + sequence[pid]++;
            std::vector<uint8_t> payload = {
                static_cast<uint8_t>(pid >> 8),  static_cast<uint8_t>(pid),
                static_cast<uint8_t>(seq >> 24), static_cast<uint8_t>(seq >> 16),
                static_cast<uint8_t>(seq >> 8),  static_cast<uint8_t>(seq)};
            TsPacketBuilder builder;
            builder.pid(pid).continuity(static_cast<uint8_t>(seq & 0xF));
            size_t room = 184;
            if (plan.pcrPid == pid) {
                const uint64_t base = plan.firstPcrBase + round * plan.pcrIntervalMs * 90ull;
                builder.pcr(base, 0);
                room = 184 - 8;
            }
            // A payload that is not exactly the room left is padded by stuffing.
            while (payload.size() < room) {
                payload.push_back(static_cast<uint8_t>(pid * 7 + seq * 13 + payload.size()));
            }
            // 0x47 inside payloads is what real streams have; keep some.
            builder.payload(payload);
            const TsPacket packet = builder.build();
            out.insert(out.end(), packet.begin(), packet.end());
        }
    }
    return out;
}

int64_t sequenceOf(const uint8_t* packet) {
    const size_t offset = payloadOffset(packet);
    if (offset + 6 > 188)
        return -1;
    const uint8_t* p = packet + offset;
    return (int64_t{p[2]} << 24) | (int64_t{p[3]} << 16) | (int64_t{p[4]} << 8) | p[5];
}

uint16_t pidOf(const uint8_t* packet) {
    return static_cast<uint16_t>(((packet[1] & 0x1f) << 8) | packet[2]);
}

std::vector<TsPacket> toPackets(const std::vector<uint8_t>& bytes) {
    std::vector<TsPacket> packets(bytes.size() / 188);
    for (size_t i = 0; i < packets.size(); ++i) {
        std::memcpy(packets[i].data(), bytes.data() + i * 188, 188);
    }
    return packets;
}

std::vector<std::string> summary(const std::vector<TsPacket>& packets) {
    std::vector<std::string> lines;
    for (const TsPacket& packet : packets) {
        uint32_t hash = 2166136261u;  // FNV-1a
        for (uint8_t b : packet)
            hash = (hash ^ b) * 16777619u;
        char line[48];
        snprintf(line, sizeof line, "0x%x#%lld %08x", pidOf(packet.data()),
                 static_cast<long long>(sequenceOf(packet.data())), hash);
        lines.emplace_back(line);
    }
    return lines;
}

std::map<uint16_t, std::vector<TsPacket>> packetsByPid(const std::vector<uint8_t>& bytes) {
    std::map<uint16_t, std::vector<TsPacket>> result;
    for (const TsPacket& packet : toPackets(bytes))
        result[pidOf(packet.data())].push_back(packet);
    return result;
}

TempFile::TempFile(const std::vector<uint8_t>& bytes, const std::string& suffix) {
    const char* dir = getenv("TMPDIR");
    std::string pattern =
        std::string(dir != nullptr ? dir : "/tmp") + "/tavo_demux_XXXXXX" + suffix;
    std::vector<char> name(pattern.begin(), pattern.end());
    name.push_back('\0');
    const int fd = mkstemps(name.data(), static_cast<int>(suffix.size()));
    if (fd < 0)
        throw std::runtime_error("mkstemps failed");
    size_t done = 0;
    while (done < bytes.size()) {
        const ssize_t n = ::write(fd, bytes.data() + done, bytes.size() - done);
        if (n <= 0)
            break;
        done += static_cast<size_t>(n);
    }
    close(fd);
    mPath = name.data();
}

TempFile::~TempFile() {
    unlink(mPath.c_str());
}

ScopedDemuxSource::ScopedDemuxSource(const std::string& value) {
    const char* previous = getenv(kSourceEnv);
    mHadPrevious = previous != nullptr;
    if (previous != nullptr)
        mPrevious = previous;
    set(value);
}

ScopedDemuxSource::~ScopedDemuxSource() {
    if (mHadPrevious) {
        setenv(kSourceEnv, mPrevious.c_str(), 1);
    } else {
        unsetenv(kSourceEnv);
    }
}

void ScopedDemuxSource::set(const std::string& value) {
    setenv(kSourceEnv, value.c_str(), 1);
}

StdinPipe::StdinPipe() {
    int fds[2];
    if (pipe2(fds, O_CLOEXEC) != 0)
        throw std::runtime_error("pipe failed");
    // Large enough for the tests' writes to never block on a reader that is not
    // reading yet.
    fcntl(fds[1], F_SETPIPE_SZ, 1 << 20);
    mSavedStdin = dup(STDIN_FILENO);
    dup2(fds[0], STDIN_FILENO);
    close(fds[0]);
    mWriteFd = fds[1];
}

StdinPipe::~StdinPipe() {
    closeWriter();
    dup2(mSavedStdin, STDIN_FILENO);
    close(mSavedStdin);
}

void StdinPipe::write(const std::vector<uint8_t>& bytes) {
    size_t done = 0;
    while (done < bytes.size()) {
        const ssize_t n = ::write(mWriteFd, bytes.data() + done, bytes.size() - done);
        if (n <= 0)
            throw std::runtime_error("pipe write failed");
        done += static_cast<size_t>(n);
    }
}

void StdinPipe::closeWriter() {
    if (mWriteFd >= 0)
        close(mWriteFd);
    mWriteFd = -1;
}

RingDrain::RingDrain(android::sp<RingBuffer> ring)
    : mRing(std::move(ring)), mThread([this] { run(); }) {}

RingDrain::~RingDrain() {
    stop();
}

void RingDrain::stop() {
    mStop = true;
    if (mThread.joinable())
        mThread.join();
}

void RingDrain::run() {
    while (!mStop) {
        if (!mRing->waitForData(188))
            continue;
        const uint32_t used = mRing->usedSpace() / 188 * 188;
        const uint8_t* data = mRing->readPointer();
        {
            std::lock_guard<std::mutex> lock(mLock);
            for (uint32_t offset = 0; offset < used; offset += 188) {
                TsPacket packet;
                std::memcpy(packet.data(), data + offset, 188);
                mPackets.push_back(packet);
            }
        }
        mChanged.notify_all();
        mRing->consume(used);
    }
}

bool RingDrain::waitForPackets(size_t packets, std::chrono::milliseconds deadline) {
    std::unique_lock<std::mutex> lock(mLock);
    return mChanged.wait_for(lock, deadline, [&] { return mPackets.size() >= packets; });
}

std::vector<TsPacket> RingDrain::packets() const {
    std::lock_guard<std::mutex> lock(mLock);
    return mPackets;
}

size_t RingDrain::count() const {
    std::lock_guard<std::mutex> lock(mLock);
    return mPackets.size();
}

android::sp<RingBuffer> makeRing(const std::string& name, unsigned int log2Size) {
    android::sp<RingBuffer> ring = new RingBuffer();
    if (ring->configure(name, log2Size) != 0)
        throw std::runtime_error("ring configure failed");
    return ring;
}

bool waitUntil(const std::function<bool()>& condition, std::chrono::milliseconds deadline) {
    const auto end = std::chrono::steady_clock::now() + deadline;
    while (!condition()) {
        if (std::chrono::steady_clock::now() >= end)
            return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    return true;
}

size_t threadsNamed(const std::string& name) {
    size_t count = 0;
    for (const auto& task : std::filesystem::directory_iterator("/proc/self/task")) {
        std::ifstream comm(task.path() / "comm");
        std::string line;
        if (std::getline(comm, line) && line == name)
            ++count;
    }
    return count;
}

int freeUdpPort() {
    const int fd = socket(AF_INET, SOCK_DGRAM, 0);
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    address.sin_port = 0;
    bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof address);
    socklen_t length = sizeof address;
    getsockname(fd, reinterpret_cast<sockaddr*>(&address), &length);
    close(fd);
    return ntohs(address.sin_port);
}

}  // namespace TavoPlayer::test
