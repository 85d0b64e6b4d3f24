#include "tsreceiver/TSReceiver.h"

#include <pthread.h>
#include <unistd.h>

#include <cstring>
#include <string>

#include "platform/os/Trace.h"

namespace TavoPlayer {

namespace {

// libutils' thread drops its own strong reference just after join() has returned.
// Waiting for that makes the joining thread the one that destroys the thread object,
// after the thread's last step; otherwise the exiting thread may destroy it while the
// joiner is still leaving join(), which ThreadSanitizer reports as a race because it
// cannot see libutils' (uninstrumented) reference counts.
void waitForLastReference(const android::sp<TSReceiver::TSReceiverThread>& thread) {
    for (int i = 0; i < 10000 && thread->getStrongCount() > 1; ++i)
        usleep(100);
    thread->isRunning();  // takes the thread's lock: orders its last unlock before us
}

}  // namespace

TSReceiver::TSReceiverThread::TSReceiverThread(TSReceiver& receiver)
    : android::Thread(false), mReceiver(receiver) {}

android::status_t TSReceiver::TSReceiverThread::readyToRun() {
    pthread_setname_np(pthread_self(), "TSReceiver");
    return android::NO_ERROR;
}

bool TSReceiver::TSReceiverThread::threadLoop() {
    TSReceiver& r = mReceiver;
    DemuxHandleSet set;
    {
        // Snapshot what the controller may change while we run.
        std::lock_guard<std::mutex> lock(r.mLock);
        set = r.mHandleSet;
        r.mRound.clear();
        auto output = r.mOutputs.begin();
        auto pid = r.mPIDMap.begin();
        auto handle = r.mHandleList.begin();
        for (;
             output != r.mOutputs.end() && pid != r.mPIDMap.end() && handle != r.mHandleList.end();
             ++output, ++pid, ++handle) {
            r.mRound.push_back({*output, *handle, pid->second});
        }
    }

    const int ready = DemuxBinder_Select(&set, kSelectTimeoutMs);
    if (ready == 0)
        return true;
    if (ready < 0) {
        TAVO_LOGE("%s: DemuxBinder_Select error: %d\n", __func__, ready);
        // A failing select returns at once; waiting out its time-out keeps the
        // round rate (and the log) where a quiet demux would have it.
        usleep(kSelectTimeoutMs * 1000);
        return true;
    }

    for (Entry& entry : r.mRound) {
        if (exitPending())
            return true;
        if (entry.handle == -1 || entry.handle == -2)
            continue;
        if (!DemuxBinder_HandleISSET(entry.handle, &set))
            continue;
        RingBuffer& output = *entry.output;
        const uint32_t request = requestSize(output.freeSpace());
        if (!output.waitForSpace(request)) {
            // waitForSpace has released the writer lock; the packets stay in the
            // demux service until a later round finds room.
            TAVO_LOGE("%s: no room for TS data in RB; free space = %d; PID = %d", __func__,
                      static_cast<int>(output.freeSpace()), entry.pid);
            continue;
        }
        const int read =
            DemuxBinder_ReadData(entry.handle, output.writePointer(), static_cast<int>(request));
        if (read < 1) {
            TAVO_LOGE("%s - DemuxBinder_ReadData returned %d; DmxHandle = %d\n", __func__, read,
                      entry.handle);
            output.abortWrite();
            continue;
        }
        // Whole TS packets are multiples of 4, so the ring's rounding adds nothing.
        output.commitWrite(static_cast<uint32_t>(read));
    }
    r.mRound.clear();
    return true;
}

TSReceiver::TSReceiver() : Module("TS Receiver") {
    DemuxBinder_HandleZERO(&mHandleSet);
}

TSReceiver::~TSReceiver() {
    if (mThread != nullptr) {
        mThread->requestExit();
        for (auto& output : mOutputs)
            output->wakeAll();
        mThread->join();
    }
    // Filters left started (a start that failed half-way) go back to the demux.
    stopFiltering();
}

int TSReceiver::filterKindOf(TSReceiverPIDType type) {
    switch (type) {
        case PCR_PID:
            return kDemuxFilterPcr;
        case VIDEO_PID:
            return kDemuxFilterVideo;
        case AUDIO_PID:
        case CC_PID:
            return kDemuxFilterPes;
    }
    return kDemuxFilterPes;
}

uint32_t TSReceiver::requestSize(uint32_t freeBytes) {
    const uint32_t whole = freeBytes / kTsPacketBytes * kTsPacketBytes;
    return whole < kTsPacketBytes ? kTsPacketBytes : whole;
}

unsigned int TSReceiver::configure(std::map<TSReceiverPIDType, unsigned short> pids) {
    std::lock_guard<std::mutex> lock(mLock);
    if (pids.size() != mOutputs.size()) {
        // "diferent" is the program's own spelling, kept on purpose.
        TAVO_LOGE("%s - number of PIDs (%d) and number of outputs (%d) are diferent!\n", __func__,
                  static_cast<int>(pids.size()), static_cast<int>(mOutputs.size()));
        return ERROR_TSRECEIVER_PID_COUNT;
    }
    mPIDMap = std::move(pids);
    return OK;
}

unsigned int TSReceiver::addOutput(const android::sp<RingBuffer>& ring,
                                   OutputList::iterator* where) {
    std::lock_guard<std::mutex> lock(mLock);
    return Module::addOutput(ring, where);
}

void TSReceiver::removeOutput(OutputList::iterator* where) {
    std::lock_guard<std::mutex> lock(mLock);
    Module::removeOutput(where);
}

unsigned int TSReceiver::start() {
    size_t pids;
    size_t outputs;
    {
        std::lock_guard<std::mutex> lock(mLock);
        pids = mPIDMap.size();
        outputs = mOutputs.size();
    }
    if (pids == 0) {
        TAVO_LOGE("%s - cannot start TSReceiver: no PID set!\n", __func__);
        return ERROR_TSRECEIVER_NO_PID;
    }
    if (pids != outputs) {
        TAVO_LOGE("%s - number of PIDs (%d) and number of outputs (%d) are diferent!\n", __func__,
                  static_cast<int>(pids), static_cast<int>(outputs));
        return ERROR_TSRECEIVER_PID_COUNT;
    }
    if (!startFiltering()) {
        TAVO_LOGE("%s - could not start filtering!\n", __func__);
        return ERROR_TSRECEIVER_FILTERING;
    }
    mThread = new TSReceiverThread(*this);
    if (mThread->run("TSReceiver") != android::OK) {
        TAVO_LOGE("%s - could not start thread!\n", __func__);
        mThread.clear();
        return ERROR_TSRECEIVER_PID_OR_THREAD;
    }
    return OK;
}

unsigned int TSReceiver::stop() {
    if (mThread != nullptr) {
        mThread->requestExit();
        // A thread waiting for room in an output wakes now rather than after 100 ms.
        {
            std::lock_guard<std::mutex> lock(mLock);
            for (auto& output : mOutputs)
                output->wakeAll();
        }
        if (mThread->join() != android::OK) {
            TAVO_LOGE("%s - could not stop thread!\n", __func__);
            return ERROR_TSRECEIVER_PID_OR_THREAD;
        }
        waitForLastReference(mThread);
        mThread.clear();
    }
    stopFiltering();
    // The thread released every writer lock it took before it ended (a lock is
    // released by the thread that took it); what is left is to wake the readers.
    std::lock_guard<std::mutex> lock(mLock);
    for (auto& output : mOutputs)
        output->wakeAll();
    return OK;
}

bool TSReceiver::startFiltering() {
    std::map<TSReceiverPIDType, unsigned short> pids;
    {
        std::lock_guard<std::mutex> lock(mLock);
        pids = mPIDMap;
    }
    bool allStarted = true;
    std::list<int> handles;
    DemuxHandleSet set;
    DemuxBinder_HandleZERO(&set);
    for (const auto& [type, pid] : pids) {
        int handle = DemuxBinder_StartFiltering(pid, filterKindOf(type));
        if (handle < 0) {
            TAVO_LOGE("%s Could not start filtering PID %d!\n", __func__, pid);
            allStarted = false;
            handle = -1;
        }
        handles.push_back(handle);
        DemuxBinder_HandleSET(handle, &set);  // -1 is ignored by the set
    }
    std::lock_guard<std::mutex> lock(mLock);
    mHandleList = std::move(handles);
    mHandleSet = set;
    return allStarted;
}

bool TSReceiver::stopFiltering() {
    std::lock_guard<std::mutex> lock(mLock);
    for (int& handle : mHandleList) {
        if (handle >= 0) {
            DemuxBinder_StopFiltering(handle);
            handle = -1;
        }
    }
    return true;
}

bool TSReceiver::isPIDSet(unsigned short pid) {
    std::lock_guard<std::mutex> lock(mLock);
    for (const auto& [type, value] : mPIDMap) {
        if (value == pid)
            return true;
    }
    return false;
}

unsigned int TSReceiver::startFilteringNewPID(TSReceiverPIDType type, unsigned short pid) {
    const int handle = DemuxBinder_StartFiltering(pid, filterKindOf(type));
    if (handle < 0) {
        TAVO_LOGE("%s Could not start filtering PID %d!\n", __func__, pid);
        return ERROR_TSRECEIVER_PID_OR_THREAD;
    }
    std::lock_guard<std::mutex> lock(mLock);
    mPIDMap[type] = pid;
    mHandleList.push_back(handle);
    DemuxBinder_HandleSET(handle, &mHandleSet);
    return OK;
}

unsigned int TSReceiver::changePID(TSReceiverPIDType type, unsigned short oldPid,
                                   unsigned short newPid) {
    std::lock_guard<std::mutex> lock(mLock);
    if (mPIDMap.empty()) {
        TAVO_LOGE("%s - no PID set!\n", __func__);
        return ERROR_TSRECEIVER_NO_PID;
    }
    auto handle = mHandleList.begin();
    auto entry = mPIDMap.begin();
    for (; entry != mPIDMap.end() && handle != mHandleList.end(); ++entry, ++handle) {
        if (entry->second == oldPid)
            break;
    }
    if (entry == mPIDMap.end() || handle == mHandleList.end() || *handle < 0) {
        return ERROR_TSRECEIVER_PID_OR_THREAD;
    }
    DemuxBinder_StopFiltering(*handle);
    *handle = -1;
    const int newHandle = DemuxBinder_StartFiltering(newPid, filterKindOf(type));
    if (newHandle < 0) {
        // The old filter stays stopped.
        TAVO_LOGE("%s Could not start filtering PID %d!\n", __func__, newPid);
        return ERROR_TSRECEIVER_PID_OR_THREAD;
    }
    *handle = newHandle;
    mPIDMap[type] = newPid;
    // The old handle stays in the set; the demux never reports a stopped handle ready.
    DemuxBinder_HandleSET(newHandle, &mHandleSet);
    return OK;
}

unsigned int TSReceiver::dump(FILE* stream, int indent) {
    if (stream == nullptr)
        return 0;
    Module::dump(stream, indent);
    const std::string prefix(static_cast<size_t>(indent < 0 ? 0 : indent), '\t');
    std::lock_guard<std::mutex> lock(mLock);
    auto handle = mHandleList.begin();
    for (const auto& [type, pid] : mPIDMap) {
        const int h = handle != mHandleList.end() ? *handle++ : -1;
        fprintf(stream, "%s\tPID type %d: PID %d (0x%x), handle %d\n", prefix.c_str(),
                static_cast<int>(type), pid, pid, h);
    }
    for (auto& output : mOutputs)
        output->dump(stream, indent + 1);
    return 0;
}

}  // namespace TavoPlayer
