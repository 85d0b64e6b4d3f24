#include "platform/media/ALooper.h"

#include <pthread.h>
#include <unistd.h>

#include <utility>

namespace android {

namespace {
constexpr nsecs_t kWaitNs = 100'000'000;
}

ALooper::~ALooper() {
    stop();
}

void ALooper::setName(const char* name) {
    Mutex::Autolock lock(mLock);
    mName.setTo(name);
}

status_t ALooper::start(bool /*runOnCallingThread*/, bool /*canCallJava*/, int32_t /*priority*/) {
    Mutex::Autolock lock(mLock);
    if (mThread != nullptr)
        return INVALID_OPERATION;
    mStopping = false;
    mThread = new LooperThread(this);
    const status_t result = mThread->run(mName.c_str());
    if (result != OK)
        mThread.clear();
    return result;
}

status_t ALooper::stop() {
    sp<LooperThread> thread;
    {
        Mutex::Autolock lock(mLock);
        if (mThread == nullptr)
            return OK;
        thread = mThread;
        mThread.clear();  // `thread` is then this side's only reference
        mStopping = true;
        thread->requestExit();
        mQueueChanged.broadcast();
    }
    const status_t result = thread->join();
    // The thread drops its own reference just after join returns; waiting for that
    // makes this thread release the last one, after everything the thread did.
    for (int i = 0; i < 1000 && thread->getStrongCount() > 1; ++i)
        usleep(1000);
    Mutex::Autolock lock(mLock);
    mQueue.clear();
    return result;
}

status_t ALooper::post(std::function<void()> work) {
    Mutex::Autolock lock(mLock);
    if (mThread == nullptr)
        return INVALID_OPERATION;
    mQueue.push_back(std::move(work));
    mQueueChanged.broadcast();
    return OK;
}

bool ALooper::loopOnce() {
    std::function<void()> work;
    {
        Mutex::Autolock lock(mLock);
        if (mQueue.empty()) {
            if (mStopping)
                return false;
            mQueueChanged.waitRelative(mLock, kWaitNs);
            return true;
        }
        work = std::move(mQueue.front());
        mQueue.pop_front();
    }
    work();
    return true;
}

status_t ALooper::LooperThread::readyToRun() {
    // Thread names are limited to 15 characters; "MTVMediaCodecLoop" is cut.
    char name[16] = {};
    snprintf(name, sizeof(name), "%s", mLooper->getName());
    pthread_setname_np(pthread_self(), name);
    return OK;
}

bool ALooper::LooperThread::threadLoop() {
    return mLooper->loopOnce();
}

}  // namespace android
