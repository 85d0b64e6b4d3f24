#include "support/TsTestUtil.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <future>
#include <stdexcept>

namespace TavoPlayer::test {
namespace {

size_t payloadOffset(const uint8_t* packet) {
    const uint8_t control = (packet[3] >> 4) & 3;
    if (control == 1)
        return 4;
    return control == 3 ? 5u + packet[4] : 188;
}

}  // namespace

android::sp<RingBuffer> makeRing(const std::string& name, uint32_t sizeBytes) {
    android::sp<RingBuffer> ring = new RingBuffer();
    if (ring->configureWithSize(name, sizeBytes) != 0)
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

bool writeAll(RingBuffer& ring, const std::vector<uint8_t>& bytes) {
    const auto size = static_cast<uint32_t>(bytes.size());
    if (!waitUntil([&] { return ring.waitForSpace(RingBuffer::roundUp4(size)); }))
        return false;
    memcpy(ring.writePointer(), bytes.data(), bytes.size());
    ring.commitWrite(size);
    return true;
}

bool waitConsumed(RingBuffer& ring) {
    return waitUntil([&] { return ring.usedSpace() == 0; });
}

bool writerLockFree(RingBuffer& ring) {
    auto locked = std::async(std::launch::async, [&] {
        const bool room = ring.waitForSpace(4);
        if (room)
            ring.abortWrite();
        return room;
    });
    return locked.wait_for(kDeadline) == std::future_status::ready && locked.get();
}

std::optional<PesRecord> readRecord(RingBuffer& ring, std::chrono::milliseconds deadline) {
    if (!waitUntil([&] { return ring.waitForData(40); }, deadline))
        return std::nullopt;
    const uint8_t* at = ring.readPointer();
    PesRecord r{};
    memcpy(static_cast<PesRecordHeader*>(&r), at, sizeof(PesRecordHeader));
    if (r.size < 40 || r.size > ring.usedSpace()) {
        ring.abortRead();
        return std::nullopt;
    }
    r.pes.assign(at + 40, at + r.size);
    ring.consume(r.size);
    return r;
}

std::vector<PesRecord> drainRecords(RingBuffer& ring) {
    std::vector<PesRecord> records;
    while (ring.usedSpace() >= 40) {
        auto r = readRecord(ring, std::chrono::milliseconds(0));
        if (!r)
            break;
        records.push_back(std::move(*r));
    }
    return records;
}

std::string printed(const std::function<void(FILE*)>& write) {
    char* text = nullptr;
    size_t length = 0;
    FILE* f = open_memstream(&text, &length);
    write(f);
    fclose(f);
    std::string out(text, length);
    free(text);
    return out;
}

std::vector<uint8_t> buildStream(const StreamPlan& plan) {
    std::vector<uint8_t> out;
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
                builder.pcr(900000 + round * plan.pcrIntervalMs * 90ull, 0);
                room = 184 - 8;
            }
            // The pattern keeps some 0x47 bytes inside payloads, as real streams have.
            while (payload.size() < room)
                payload.push_back(static_cast<uint8_t>(pid * 7 + seq * 13 + payload.size()));
            const TsPacket packet = builder.payload(payload).build();
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
    for (size_t i = 0; i < packets.size(); ++i)
        std::memcpy(packets[i].data(), bytes.data() + i * 188, 188);
    return packets;
}

std::map<uint16_t, std::vector<TsPacket>> packetsByPid(const std::vector<uint8_t>& bytes) {
    std::map<uint16_t, std::vector<TsPacket>> result;
    for (const TsPacket& packet : toPackets(bytes))
        result[pidOf(packet.data())].push_back(packet);
    return result;
}

std::vector<uint8_t> bytesOfPid(const std::vector<uint8_t>& ts, uint16_t pid) {
    return concatPackets(packetsByPid(ts)[pid]);
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

TempFile::TempFile(const std::vector<uint8_t>& bytes, const std::string& suffix) {
    static std::atomic<int> count{0};
    mPath = tempPath("file" + std::to_string(++count) + suffix);
    std::ofstream(mPath, std::ios::binary)
        .write(reinterpret_cast<const char*>(bytes.data()),
               static_cast<std::streamsize>(bytes.size()));
}

TempFile::~TempFile() {
    unlink(mPath.c_str());
}

StdinPipe::StdinPipe() {
    int fds[2];
    if (pipe2(fds, O_CLOEXEC) != 0)
        throw std::runtime_error("pipe failed");
    // Large enough that the tests' writes never block on a reader not reading yet.
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
    for (size_t done = 0; done < bytes.size();) {
        const ssize_t n = ::write(mWriteFd, bytes.data() + done, bytes.size() - done);
        if (n <= 0)
            throw std::runtime_error("write failed");
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
    mStop = true;
    mThread.join();
}

void RingDrain::run() {
    while (!mStop) {
        if (!mRing->waitForData(188))
            continue;
        const uint32_t used = mRing->usedSpace() / 188 * 188;
        const uint8_t* at = mRing->readPointer();
        for (const TsPacket& packet : toPackets(std::vector<uint8_t>(at, at + used)))
            mPackets.push(packet);
        mRing->consume(used);
    }
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
    bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof address);
    socklen_t length = sizeof address;
    getsockname(fd, reinterpret_cast<sockaddr*>(&address), &length);
    close(fd);
    return ntohs(address.sin_port);
}

}  // namespace TavoPlayer::test
