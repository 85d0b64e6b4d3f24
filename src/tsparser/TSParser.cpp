#include "tsparser/TSParser.h"

#include <unistd.h>

#include <cstring>
#include <string>

#include "common/Uint33.h"
#include "platform/dtv/RecPlayerBinder.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {
namespace {

constexpr uint32_t kPacketSize = TSPacketParser::kPacketSize;
constexpr uint32_t kHeaderSize = PESData::kHeaderSize;
static_assert(sizeof(PESData) == PESData::kHeaderSize, "PESData header is 40 bytes");

// Record headers are written and updated by byte copies: a ring position is only
// 4-byte aligned, and PESData holds 8-byte fields, so the header is never accessed
// through a PESData lvalue in the ring.
void writeRecordHeader(uint8_t* at, uint32_t size, uint64_t pts, uint64_t dts, uint32_t offsetES,
                       uint32_t sizeES) {
    PESData header;
    header.mSize = size;
    header.mPTS = pts;
    header.mDTS = dts;
    header.mOffsetES = offsetES;
    header.mSizeES = sizeES;
    memcpy(at, static_cast<const void*>(&header), kHeaderSize);
}

}  // namespace

TSParser::TSParser(int kind)
    : Module("TS Parser"),
      mpPESWriter(nullptr),
      mpPESData(nullptr),
      mPESSize(0),
      mRBFreeSpace(0),
      mKind(kind),
      mNotify(0),
      mScrambledCount(0),
      mHoldsRecord(false),
      mReservePending(false),
      mPendingPacket(false) {}

TSParser::~TSParser() {
    if (mThread != nullptr)
        stop();
}

unsigned int TSParser::configure(android::sp<Synchronization>& synchronization) {
    mSynchronization = synchronization;
    return OK;
}

unsigned int TSParser::start() {
    if (mInput == nullptr) {
        TAVO_LOGE("%s - no input Ring Buffer set!\n", __func__);
        return ERROR_TSPARSER_NO_INPUT;
    }
    if (mThread != nullptr) {
        TAVO_LOGE("%s - could not start thread!\n", __func__);
        return ERROR_TSPARSER_START_STOP;
    }
    if (!mOutputs.empty()) {
        // The first record must be laid by the worker, which then owns the writer
        // lock for as long as the record is in assembly. Here only check that there
        // is room for its header, and release at once what this thread took.
        const android::sp<RingBuffer>& first = mOutputs.front();
        if (!first->waitForSpace(kHeaderSize)) {
            mpPESWriter = nullptr;
            TAVO_LOGE("%s - mpPESWriter is NULL !!!!\n", __func__);
            return ERROR_TSPARSER_START_STOP;
        }
        first->abortWrite();
        mReservePending = true;
    }
    mTSPacketParser = std::make_unique<TSPacketParser>();
    mPESPacketParser = std::make_unique<PESPacketParser>();
    mTSParsedData = std::make_unique<TSParsedData>();
    mPESParsedData = std::make_unique<PESParsedData>();
    mpPESWriter = nullptr;
    mpPESData = nullptr;
    mPESSize = 0;
    mRBFreeSpace = 0;
    mHoldsRecord = false;
    mPendingPacket = false;
    mScrambledCount = 0;

    mThread = new TSParserThread(this);
    if (mThread->run("TSParser") != android::OK) {
        TAVO_LOGE("%s - could not start thread!\n", __func__);
        mThread.clear();
        mReservePending = false;
        return ERROR_TSPARSER_START_STOP;
    }
    return OK;
}

unsigned int TSParser::stop() {
    if (mThread != nullptr) {
        mThread->requestExit();
        // The worker may be waiting on either side of any of its rings; each wait
        // lasts at most 100 ms, and these wake-ups usually cut it short.
        if (mInput != nullptr)
            mInput->wakeAll();
        for (const auto& output : mOutputs)
            output->wakeAll();
        if (mThread->join() != android::OK) {
            TAVO_LOGE("%s - could not stop thread!\n", __func__);
            return ERROR_TSPARSER_START_STOP;
        }
        // The thread drops its own reference to itself just after join returns.
        // Waiting for that (briefly) makes this thread release the last one, so the
        // thread object is destroyed here, after everything the thread did with it.
        for (int i = 0; i < 1000 && mThread->getStrongCount() > 1; ++i)
            usleep(1000);
        mThread.clear();
    }
    // The worker has released the input's read lock and the first output's writer
    // lock on its way out; any record in assembly ends uncommitted.
    mTSPacketParser.reset();
    mPESPacketParser.reset();
    mTSParsedData.reset();
    mPESParsedData.reset();
    mpPESWriter = nullptr;
    mpPESData = nullptr;
    mPESSize = 0;
    mRBFreeSpace = 0;
    mReservePending = false;
    mPendingPacket = false;
    if (mInput != nullptr)
        mInput->wakeAll();
    for (const auto& output : mOutputs)
        output->wakeAll();
    return OK;
}

unsigned int TSParser::dump(FILE* stream, int indent) {
    if (stream == nullptr)
        return OK;
    Module::dump(stream, indent);
    const std::string prefix(indent >= 0 ? static_cast<size_t>(indent) + 1 : 1, '\t');
    fprintf(stream, "%s - mpPESWriter: %p\n", prefix.c_str(), static_cast<void*>(mpPESWriter));
    fprintf(stream, "%s - mpPESData: %p\n", prefix.c_str(), static_cast<void*>(mpPESData));
    fprintf(stream, "%s - mPESSize: %d\n", prefix.c_str(), static_cast<int>(mPESSize));
    fprintf(stream, "%s - mRBFreeSpace: %d\n", prefix.c_str(), mRBFreeSpace);
    return OK;
}

bool TSParser::copyPEStoOtherOutputs(unsigned char* record, unsigned int size) {
    bool allTook = true;
    bool first = true;
    for (const auto& output : mOutputs) {
        if (first) {
            first = false;
            continue;
        }
        if (!output->waitForSpace(RingBuffer::roundUp4(size))) {
            allTook = false;
            continue;
        }
        memcpy(output->writePointer(), record, size);
        output->commitWrite(size);
    }
    return allTook;
}

bool TSParser::exitRequested() {
    return mThread != nullptr && mThread->exitRequested();
}

void TSParser::reserveRecord() {
    const android::sp<RingBuffer>& first = mOutputs.front();
    mPESSize = 0;
    if (!first->waitForSpace(kHeaderSize)) {
        mHoldsRecord = false;
        mpPESWriter = nullptr;
        mpPESData = nullptr;
        TAVO_LOGE("%s - mpPESWriter is NULL !!!!\n", __func__);
        return;
    }
    uint8_t* at = first->writePointer();
    writeRecordHeader(at, 0, 0, 0, 0, 0);
    mpPESData = reinterpret_cast<PESData*>(at);
    mpPESWriter = at + kHeaderSize;
    mRBFreeSpace = static_cast<int32_t>(first->freeSpace() - kHeaderSize);
    mHoldsRecord = true;
}

void TSParser::releaseRecord_l(uint32_t commitBytes) {
    const android::sp<RingBuffer>& first = mOutputs.front();
    // commitWrite and abortWrite both wake the reader with a try-lock, never blocking.
    if (commitBytes != 0) {
        first->commitWrite(commitBytes);
    } else {
        first->abortWrite();
    }
    mHoldsRecord = false;
    mpPESWriter = nullptr;
}

bool TSParser::finishPES() {
    bool emitted = false;
    if (mHoldsRecord) {
        uint8_t* record = reinterpret_cast<uint8_t*>(mpPESData);
        PESParsedData* pes = mPESParsedData.get();
        if (mPESPacketParser->parse(record + kHeaderSize, mPESSize, pes)) {
            const uint32_t size = mPESSize + kHeaderSize;
            const uint64_t pts = mask33(pes->mPTS);
            const uint64_t dts = mask33(pes->mDTS);
            writeRecordHeader(record, size, pts, dts, size - pes->mElementaryStreamSize,
                              pes->mElementaryStreamSize);
            copyPEStoOtherOutputs(record, size);
            feedClock(pts);
            releaseRecord_l(size);
            emitted = true;
        } else {
            TAVO_LOGE("%s - PES parser error; discarding entire packet.", __func__);
            releaseRecord_l(0);
        }
    }
    // Without a record (no room when it was reserved) the payload was only counted:
    // there is nothing to parse or commit, and the next PES gets a fresh try.
    mPESSize = 0;
    mReservePending = true;
    return emitted;
}

void TSParser::discardPES() {
    if (mHoldsRecord)
        releaseRecord_l(0);
    mPESSize = 0;
    mReservePending = true;
}

void TSParser::feedClock(uint64_t pts) {
    switch (mKind) {
        case KIND_VIDEO:
            if (mSynchronization != nullptr)
                mSynchronization->setBasePCR(pts, Synchronization::Video);
            break;
        case KIND_AUDIO:
            if (mSynchronization != nullptr)
                mSynchronization->setBasePCR(pts, Synchronization::Audio);
            if (mNotify)
                RecPlayerBinder_NotifyAudioPTS(static_cast<unsigned int>(pts / 90));
            break;
        default:
            break;
    }
}

bool TSParser::waitForOutputSpace_l(uint32_t length) {
    const android::sp<RingBuffer>& first = mOutputs.front();
    TAVO_LOGW("%s - output RB is full; waiting for free space. payload size = %d type = %d",
              "threadLoop", static_cast<int>(length), mKind);
    if (exitRequested())
        return false;
    const uint32_t freeNow = first->freeSpace();
    mRBFreeSpace = static_cast<int32_t>(freeNow - kHeaderSize - mPESSize);
    // The whole record, header and all payload so far, must fit: it is committed
    // in one piece.
    const uint32_t request = freeNow + length - static_cast<uint32_t>(mRBFreeSpace);
    const uint32_t need = RingBuffer::roundUp4(request);
    while (need > first->freeSpace()) {
        first->waitForSpace_l(need);
        if (need <= first->freeSpace())
            break;
        if (exitRequested())
            return false;
        TAVO_LOGW("%s - lack of buffer...remained ringbuffer (%u), request size = %u\n",
                  "threadLoop", first->freeSpace(), request);
        TAVO_LOGW("%s - waiting for free space in PES ring buffer (%d)\n", "threadLoop",
                  static_cast<int>(length));
    }
    return true;
}

bool TSParser::appendPayload(const uint8_t* payload, uint32_t length) {
    if (length == 0)
        return true;
    if (!mHoldsRecord) {
        TAVO_LOGE("%s - mpPESWriter is NULL !!!!\n", "threadLoop");
        mPESSize += length;
        return true;
    }
    const android::sp<RingBuffer>& first = mOutputs.front();
    mRBFreeSpace = static_cast<int32_t>(first->freeSpace() - kHeaderSize - mPESSize);
    if (mRBFreeSpace < static_cast<int32_t>(length)) {
        if (RingBuffer::roundUp4(kHeaderSize + mPESSize + length) > first->size()) {
            // No reader can ever make room for this: the PES is larger than the whole
            // ring (a unit start lost for good). Drop it rather than wait forever.
            TAVO_LOGE("%s - TS parser error; discarding entire PES packet.", "threadLoop");
            discardPES();
            return true;
        }
        // Waited for at the start of the next round, without the input's read lock.
        return false;
    }
    memcpy(mpPESWriter, payload, length);
    mpPESWriter += length;
    mPESSize += length;
    mRBFreeSpace = static_cast<int32_t>(first->freeSpace() - kHeaderSize - mPESSize);
    return true;
}

void TSParser::releaseOnExit() {
    if (mHoldsRecord)
        releaseRecord_l(0);
    mpPESData = nullptr;
}

bool TSParser::leaveForExit(bool holdingInput) {
    if (holdingInput)
        mInput->abortRead();
    return false;
}

// Lock order: the first output's writer lock, then the input's read lock; never the
// other way round, so that no wait on the output happens with the input held. A
// record is therefore reserved, and room in the output waited for, only between
// batches: a batch ends just before the first packet whose payload needs a record
// that is not reserved yet (the packet that starts the next PES, mostly) or more
// room than the output has. That packet has been parsed; the next round reserves
// the record or waits for room, then appends its payload without parsing it again.
bool TSParser::threadLoop() {
    if (mReservePending) {
        mReservePending = false;
        if (!mOutputs.empty())
            reserveRecord();
    }
    if (mPendingPacket && mHoldsRecord) {
        const android::sp<RingBuffer>& first = mOutputs.front();
        mRBFreeSpace = static_cast<int32_t>(first->freeSpace() - kHeaderSize - mPESSize);
        if (mRBFreeSpace < static_cast<int32_t>(mTSParsedData->mPayloadLength) &&
            !waitForOutputSpace_l(mTSParsedData->mPayloadLength)) {
            return false;  // exit requested; the thread releases the record
        }
    }
    RingBuffer* input = mInput.get();
    if (!input->waitForData(kPacketSize))
        return true;

    // The batch: the whole packets readable now, under one read-lock acquisition.
    const uint32_t available = input->usedSpace();
    const uint32_t packets = available / kPacketSize;
    const uint8_t* base = input->readPointer();
    TSParsedData* ts = mTSParsedData.get();
    const bool hasOutputs = !mOutputs.empty();
    bool pcrSeen = false;
    uint64_t lastPCR = 0;

    for (uint32_t i = 0; i < packets; ++i) {
        if (exitRequested())
            return leaveForExit(true);
        if (mPendingPacket) {
            // Parsed in the round before, which ended here to reserve its record or
            // to wait for room; ts still describes it, and it has stayed in place.
            mPendingPacket = false;
            if (!appendPayload(ts->mPayload, ts->mPayloadLength)) {
                mPendingPacket = true;
                endBatch(0, false, 0);
                return true;
            }
            continue;
        }
        const uint8_t* packet = base + static_cast<size_t>(kPacketSize) * i;
        ts->mTransportScramblingControl = 0;
        uint32_t r = mTSPacketParser->parse(packet, ts);
        // A header code is OR-ed into the result, and 255 (adaptation field too long)
        // would read as every result bit at once, skip included: the PES in assembly
        // would survive and the next unit's bytes be appended to it. Any header code
        // means only "error".
        if (r > 0x0F)
            r = TSPacketParser::RESULT_ERROR;

        if (mKind == KIND_VIDEO && ts->mTransportScramblingControl != 0) {
            if (mScrambledCount >= kScrambledPacketLimit) {
                input->abortRead();
                TAVO_LOGE("%s send error by scrambled ts pid = 0x%x\n", __func__, ts->mPID);
                onError(ERROR_TSPARSER_SCRAMBLED);
                return false;
            }
            ++mScrambledCount;
        }
        // Only TS errors reset the count, never clear packets: a stream that is
        // scrambled now and then still ends up reported, deliberately.
        if (r & TSPacketParser::RESULT_ERROR)
            mScrambledCount = 0;
        // The PCR flag keeps its value from the last packet with an adaptation field,
        // so once a PCR has been seen every later packet repeats it; intended.
        if (ts->mPCRFlag) {
            lastPCR = mask33(ts->mPCRBase);
            pcrSeen = true;
        }
        if ((r & TSPacketParser::RESULT_SKIP) || !hasOutputs)
            continue;

        if (r & TSPacketParser::RESULT_NEW_PES)
            finishPES();
        if ((r & TSPacketParser::RESULT_ERROR) || ts->mPayloadLength >= 185) {
            TAVO_LOGE("%s - TS parser error; discarding entire PES packet.", __func__);
            discardPES();
            // A continuity error on a unit start (error and payload, nothing else)
            // breaks only the PES before it: this packet's payload starts the next
            // one, in a fresh record, like any unit start.
            if (r != (TSPacketParser::RESULT_ERROR | TSPacketParser::RESULT_PAYLOAD) ||
                ts->mPayloadLength >= 185)
                continue;
        }
        if (!(r & TSPacketParser::RESULT_PAYLOAD))
            continue;
        if (mReservePending || !appendPayload(ts->mPayload, ts->mPayloadLength)) {
            mPendingPacket = true;
            endBatch(static_cast<uint32_t>(kPacketSize) * i, pcrSeen, lastPCR);
            return true;
        }
    }
    // The whole readable area goes, even bytes after the last whole packet: the
    // receiver writes whole packets, so a partial one can only be garbage.
    endBatch(available, pcrSeen, lastPCR);
    return true;
}

void TSParser::endBatch(uint32_t consumeBytes, bool pcrSeen, uint64_t lastPCR) {
    if (mSynchronization != nullptr && mKind == KIND_PCR && pcrSeen) {
        mSynchronization->setBasePCR(lastPCR, Synchronization::RealPCR);
    }
    if (!mPendingPacket) {
        mTSParsedData->mPayload = nullptr;
        mTSParsedData->mPayloadLength = 0;
    }
    if (consumeBytes == 0) {
        mInput->abortRead();
    } else {
        mInput->consume(consumeBytes);
    }
}

}  // namespace TavoPlayer
