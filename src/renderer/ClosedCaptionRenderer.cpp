#include "renderer/ClosedCaptionRenderer.h"

#include <unistd.h>

#include <string>
#include <utility>

#include "common/Uint33.h"
#include "common/data/ClosedCaptionFragmentData.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {
namespace {

constexpr uint32_t kHeaderSize = ClosedCaptionFragmentData::kHeaderSize;
constexpr int64_t kTicksPerMs = 90;  // ISO/IEC 13818-1, 2.4.2.1: time stamps count 90 kHz
// Each timed wait is cut into steps of this length, after which stop is checked.
constexpr auto kWaitStep = std::chrono::milliseconds(100);

}  // namespace

ClosedCaptionRenderer::ClosedCaptionRenderer(android::sp<Synchronization> synchronization)
    : Module("ClosedCaptionRenderer"),
      mSynchronization(std::move(synchronization)),
      mListener(nullptr),
      mCaptionSync(0),
      mEnabled(0),
      mStopping(false) {}

ClosedCaptionRenderer::~ClosedCaptionRenderer() {
    if (mWorkerThread != nullptr)
        stop();
}

unsigned int ClosedCaptionRenderer::start() {
    if (mInput == nullptr) {
        TAVO_LOGD("%s NULL parameter!\n", __func__);
        return REFUSED;
    }
    if (mWorkerThread != nullptr)
        return OK;
    mStopping.store(false);
    mWorkerThread = new WorkerThread(this);
    if (mWorkerThread->run("CCWorkerThreadRenderer") != android::OK) {
        TAVO_LOGE("%s: could not start CCWorkerThreadRenderer\n", __func__);
        mWorkerThread.clear();
        return REFUSED;
    }
    return OK;
}

unsigned int ClosedCaptionRenderer::stop() {
    // Raised before the wake-up: a worker that holds the lock now and is about to
    // wait sees it and does not wait at all.
    mStopping.store(true);
    if (mRenderLock.try_lock()) {
        mWakeCondition.notify_all();
        mRenderLock.unlock();
    }
    if (mWorkerThread != nullptr) {
        mWorkerThread->requestExit();
        if (mInput != nullptr)
            mInput->wakeAll();
        mWorkerThread->join();
        // The thread drops its own reference just after join returns; waiting for
        // that lets this thread release the last one, after the thread is done.
        for (int i = 0; i < 1000 && mWorkerThread->getStrongCount() > 1; ++i)
            usleep(1000);
        mWorkerThread.clear();
    }
    if (mInput != nullptr)
        mInput->wakeAll();
    return OK;
}

unsigned int ClosedCaptionRenderer::dump(FILE* stream, int indent) {
    if (stream == nullptr)
        return OK;
    Module::dump(stream, indent);
    const std::string prefix(indent >= 0 ? static_cast<size_t>(indent) + 1 : 1, '\t');
    fprintf(stream, "%s - Caption sync: %d\n", prefix.c_str(), mCaptionSync.load());
    fprintf(stream, "%s - Enabled: %u\n", prefix.c_str(), mEnabled.load());
    return OK;
}

void ClosedCaptionRenderer::setCaptionSync(int ms) {
    TAVO_LOGD("%s: ClosedCaptionRenderer::setCaptionSync %d\n", __func__, ms);
    mCaptionSync.store(ms);
}

void ClosedCaptionRenderer::registerListener(ClosedCaptionListener* listener) {
    mListener.store(listener);
}

int64_t ClosedCaptionRenderer::delayUntil(uint64_t pts) {
    if (mSynchronization == nullptr)
        return 0;
    // The clock reads 0 exactly when no source drives it; a real PCR of 0 is one
    // tick in 26.5 hours and then costs only a caption shown without waiting.
    const Uint33 pcr = mSynchronization->getPCR();
    if (pcr == 0)
        return 0;
    return diff33(pts, pcr) / kTicksPerMs;
}

void ClosedCaptionRenderer::waitFor_l(std::unique_lock<std::mutex>& lock, int64_t waitMs) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(waitMs);
    while (!mStopping.load()) {
        const auto now = std::chrono::steady_clock::now();
        if (now >= deadline)
            return;
        mWakeCondition.wait_until(lock, std::min(deadline, now + kWaitStep));
    }
}

void ClosedCaptionRenderer::renderFrame() {
    std::unique_lock<std::mutex> lock(mRenderLock);
    if (!mInput->waitForData(kHeaderSize))
        return;
    auto* caption = reinterpret_cast<ClosedCaptionFragmentData*>(mInput->readPointer());
    const uint32_t size = caption->mSize;
    // The header is here; the text may still be on its way. Let the writer go on.
    mInput->abortRead();
    if (!mInput->waitForData(RingBuffer::roundUp4(size))) {
        TAVO_LOGE("%s: m_pInputRingBuffer read failed to get Closed Caption String\n", __func__);
        return;
    }
    caption = reinterpret_cast<ClosedCaptionFragmentData*>(mInput->readPointer());

    const int64_t delayMs = delayUntil(caption->mPTS);
    if (delayMs >= 1 && delayMs < kMaxWaitMs) {
        // The input's read lock is let go for the wait: the wait gives the render lock
        // back and retakes it, so holding the read lock across it would order the two
        // locks both ways. This thread is the ring's only reader, so the record stays.
        const uint32_t tail = mInput->tail();
        mInput->abortRead();
        waitFor_l(lock, delayMs + mCaptionSync.load());
        if (!mInput->waitForData(RingBuffer::roundUp4(size)))
            return;
        if (mInput->tail() != tail) {
            // The ring was reset meanwhile: the record is gone.
            mInput->abortRead();
            return;
        }
        caption = reinterpret_cast<ClosedCaptionFragmentData*>(mInput->readPointer());
    }

    ClosedCaptionListener* listener = mListener.load();
    if (listener != nullptr && mEnabled.load() != 0 && size >= kHeaderSize)
        listener->onClosedCaptionReceived(caption->textBytes(),
                                          static_cast<int>(size - kHeaderSize));
    mInput->consume(size);
}

}  // namespace TavoPlayer
