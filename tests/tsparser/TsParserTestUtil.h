// Ring-side helpers for the TS parser module's tests: feed packets as the receiver
// would, read PESData records back as a decoder would, wait for events with a
// generous deadline.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include <utils/StrongPointer.h>

#include "common/ErrorListener.h"
#include "common/Module.h"
#include "common/RingBuffer.h"

namespace TavoPlayer::test {

constexpr std::chrono::seconds kDeadline{10};

android::sp<RingBuffer> makeRing(const std::string& name, uint32_t sizeBytes);

// Writes `bytes` as one commit (one batch for an idle parser); false when the ring
// has no room for them after a generous wait.
bool writeAll(RingBuffer& ring, const std::vector<uint8_t>& bytes);

// Polls `condition` until it holds or the deadline passes.
bool waitUntil(const std::function<bool()>& condition,
               std::chrono::milliseconds deadline = kDeadline);

// Waits until the reader has consumed everything written to `ring`.
bool waitConsumed(RingBuffer& ring);

// A PESData record as read from a ring, field by field at its documented offsets.
struct PesRecord {
    uint32_t type;
    uint32_t size;
    uint64_t pts;
    uint64_t dts;
    uint32_t offsetES;
    uint32_t sizeES;
    std::vector<uint8_t> pes;  // bytes 40 .. size

    std::vector<uint8_t> es() const {
        if (offsetES < 40 || offsetES > size)
            return {};
        return std::vector<uint8_t>(pes.begin() + (offsetES - 40), pes.end());
    }
};

// Reads and consumes the record at the read position, if one is there (waiting up
// to `deadline` for one to appear).
std::optional<PesRecord> readRecord(RingBuffer& ring,
                                    std::chrono::milliseconds deadline = kDeadline);
// Every record readable now, consumed.
std::vector<PesRecord> drainRecords(RingBuffer& ring);

class RecordingErrorListener : public ErrorListener {
public:
    void onError(unsigned int code, const Module* module) const override;
    bool waitForError(std::chrono::milliseconds deadline = kDeadline) const;
    std::vector<unsigned int> codes() const;

private:
    mutable std::mutex mMutex;
    mutable std::condition_variable mCondition;
    mutable std::vector<unsigned int> mCodes;
};

// Runs a shell command and returns its standard output; `ok` tells whether it
// exited with status 0.
std::string runCommand(const std::string& command, bool* ok);

}  // namespace TavoPlayer::test
