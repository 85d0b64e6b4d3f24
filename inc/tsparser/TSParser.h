// TSParser: the pipeline module that turns the 188-byte TS packets of one PID, as
// the TS receiver writes them into the input ring, into PESData records on the
// output rings, and feeds the clock with PCR values or presentation times.
//
//   kind 0  PCR PID           after each batch that held a PCR: setBasePCR(PCR, RealPCR)
//   kind 1  video             after each finished PES: setBasePCR(PTS, Video); scrambling watchdog
//   kind 2  audio             after each finished PES: setBasePCR(PTS, Audio); with the notify
//                             flag, RecPlayerBinder_NotifyAudioPTS(PTS / 90)
//   kind 3  closed captions   no clock feed
//
// A PES packet is assembled in place in the first output ring: its record header is
// laid at the write position and TS payloads are copied straight behind it, so the
// first output's writer lock stays held, across thread-loop rounds, from the
// reservation of a record until the commit (or discard) that ends it. Every further
// output gets a byte copy of each finished record. A PES is finished only when the
// next unit start arrives, so the last one before a stop is never emitted.
//
// Threads: the controller calls configure, setNotifyFlag, start, stop and dump; the
// module's own thread "TSParser" runs threadLoop and is the only one that touches
// the parsers, the record fields (mpPESWriter, mpPESData, mPESSize, mRBFreeSpace)
// and the ring locks it holds. Since a lock must be released by the thread that
// took it, the worker releases everything it holds when it sees the exit request;
// stop() only wakes, joins and cleans up. dump reads the record fields unlocked.
// Lock order: the first output's writer lock, then the input's read lock, then the
// further outputs' writer locks (only while a copy is made).
#pragma once

#include <cstdint>
#include <cstdio>
#include <memory>

#include <utils/StrongPointer.h>
#include <utils/Thread.h>

#include "common/Module.h"
#include "common/Synchronization.h"
#include "common/data/PESData.h"
#include "platform/os/ThreadName.h"
#include "tsparser/PESPacketParser.h"
#include "tsparser/TSPacketParser.h"

namespace TavoPlayer {

class TSParser : public Module {
public:
    enum Kind : int32_t {
        KIND_PCR = 0,
        KIND_VIDEO = 1,
        KIND_AUDIO = 2,
        KIND_CLOSED_CAPTION = 3,
    };

    // The video parser gives up on the 12th scrambled packet (ARIB's conditional
    // access is not handled here): the 11 before it are tolerated.
    static constexpr uint16_t kScrambledPacketLimit = 11;

    explicit TSParser(int kind);
    ~TSParser() override;

    unsigned int configure(android::sp<Synchronization>& synchronization);
    // Set on the audio parser when the source is a recorded clip: the audio PTS of
    // every finished PES is then reported to the recording service.
    void setNotifyFlag(bool notify) { mNotify = notify ? 1 : 0; }

    unsigned int start() override;
    unsigned int stop() override;
    unsigned int dump(FILE* stream, int indent) override;

    // Copies a finished record to every output after the first. True only if each
    // took it; an output without room after one 100 ms wait misses this record.
    bool copyPEStoOtherOutputs(unsigned char* record, unsigned int size);

    // One round of the worker thread: one batch of input. False ends the thread.
    bool threadLoop();

    int kind() const { return mKind; }

private:
    class TSParserThread : public android::Thread {
    public:
        // The parser owns this thread and outlives it (stop() joins it).
        explicit TSParserThread(TSParser* parser) : android::Thread(false), mParser(parser) {}
        bool exitRequested() { return exitPending(); }

    private:
        android::status_t readyToRun() override {
            setCurrentThreadName("TSParser");
            return android::OK;
        }
        // Rounds run here rather than in the base class's loop, so that the thread
        // can only end through releaseOnExit(): the base would otherwise leave
        // between two rounds, holding the first output's writer lock.
        bool threadLoop() override {
            while (mParser->threadLoop() && !exitPending()) {
            }
            mParser->releaseOnExit();
            return false;
        }
        TSParser* mParser;
    };

    // Worker-thread helpers; "_l" ones expect the first output's writer lock held.
    void reserveRecord();
    void releaseRecord_l(uint32_t commitBytes);
    bool finishPES();
    void discardPES();
    // Appends to the record in assembly (or only counts, without one). False: the
    // first output lacks room for it now; nothing was done.
    bool appendPayload(const uint8_t* payload, uint32_t length);
    // Waits, 100 ms at a time, until the record and `length` more bytes fit; false
    // on an exit request.
    bool waitForOutputSpace_l(uint32_t length);
    bool exitRequested();
    // Releases what the worker holds and ends the round with "stop".
    bool leaveForExit(bool holdingInput);
    // Feeds the batch's last PCR (kind 0), consumes `consumeBytes` of the input and
    // releases its read lock.
    void endBatch(uint32_t consumeBytes, bool pcrSeen, uint64_t lastPCR);
    void feedClock(uint64_t pts);
    void releaseOnExit();

    android::sp<TSParserThread> mThread;
    std::unique_ptr<TSPacketParser> mTSPacketParser;
    std::unique_ptr<PESPacketParser> mPESPacketParser;
    std::unique_ptr<TSParsedData> mTSParsedData;
    std::unique_ptr<PESParsedData> mPESParsedData;
    uint8_t* mpPESWriter;
    PESData* mpPESData;
    uint32_t mPESSize;
    int32_t mRBFreeSpace;
    android::sp<Synchronization> mSynchronization;
    int32_t mKind;
    uint32_t mNotify;
    uint16_t mScrambledCount;

    // Worker only: whether it holds the first output's writer lock (a record is in
    // assembly); whether it must reserve a record before its next batch; whether the
    // first packet of the next batch was parsed already and only waits for that
    // record to take its payload.
    bool mHoldsRecord;
    bool mReservePending;
    bool mPendingPacket;
};

}  // namespace TavoPlayer
