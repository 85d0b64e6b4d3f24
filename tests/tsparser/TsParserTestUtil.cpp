#include "TsParserTestUtil.h"

#include <cstdio>
#include <cstring>
#include <thread>

namespace TavoPlayer::test {

android::sp<RingBuffer> makeRing(const std::string& name, uint32_t sizeBytes) {
    android::sp<RingBuffer> ring = new RingBuffer();
    if (ring->configureWithSize(name, sizeBytes) != 0)
        return nullptr;
    return ring;
}

bool writeAll(RingBuffer& ring, const std::vector<uint8_t>& bytes) {
    const auto until = std::chrono::steady_clock::now() + kDeadline;
    const auto size = static_cast<uint32_t>(bytes.size());
    while (!ring.waitForSpace(RingBuffer::roundUp4(size))) {
        if (std::chrono::steady_clock::now() > until)
            return false;
    }
    memcpy(ring.writePointer(), bytes.data(), bytes.size());
    ring.commitWrite(size);
    return true;
}

bool waitUntil(const std::function<bool()>& condition, std::chrono::milliseconds deadline) {
    const auto until = std::chrono::steady_clock::now() + deadline;
    while (!condition()) {
        if (std::chrono::steady_clock::now() > until)
            return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    return true;
}

bool waitConsumed(RingBuffer& ring) {
    return waitUntil([&] { return ring.usedSpace() == 0; });
}

std::optional<PesRecord> readRecord(RingBuffer& ring, std::chrono::milliseconds deadline) {
    const auto until = std::chrono::steady_clock::now() + deadline;
    while (!ring.waitForData(40)) {
        if (std::chrono::steady_clock::now() > until)
            return std::nullopt;
    }
    const uint8_t* at = ring.readPointer();
    PesRecord r{};
    memcpy(&r.type, at + 8, 4);
    memcpy(&r.size, at + 12, 4);
    memcpy(&r.pts, at + 16, 8);
    memcpy(&r.dts, at + 24, 8);
    memcpy(&r.offsetES, at + 32, 4);
    memcpy(&r.sizeES, at + 36, 4);
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

void RecordingErrorListener::onError(unsigned int code, const Module*) const {
    std::lock_guard<std::mutex> lock(mMutex);
    mCodes.push_back(code);
    mCondition.notify_all();
}

bool RecordingErrorListener::waitForError(std::chrono::milliseconds deadline) const {
    std::unique_lock<std::mutex> lock(mMutex);
    return mCondition.wait_for(lock, deadline, [this] { return !mCodes.empty(); });
}

std::vector<unsigned int> RecordingErrorListener::codes() const {
    std::lock_guard<std::mutex> lock(mMutex);
    return mCodes;
}

std::string runCommand(const std::string& command, bool* ok) {
    std::string out;
    FILE* pipe = popen(command.c_str(), "r");
    if (pipe == nullptr) {
        *ok = false;
        return out;
    }
    char buffer[65536];
    size_t n;
    while ((n = fread(buffer, 1, sizeof buffer, pipe)) > 0)
        out.append(buffer, n);
    *ok = pclose(pipe) == 0;
    return out;
}

}  // namespace TavoPlayer::test
