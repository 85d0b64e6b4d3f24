// TSReceiver: the first module of the broadcast pipeline.
//
// Asks the demux service to filter a set of PIDs, waits on all filter handles at
// once and copies the TS packets of each PID into that PID's own output ring, where
// a TS parser reads them. The i-th entry of the PID map (in ascending kind order),
// the i-th demux handle and the i-th output ring belong together.
//
// Threads: configure/start/stop/changePID/startFilteringNewPID run on the
// controller's thread; TSReceiverThread ("TSReceiver") is the only writer of every
// output ring. changePID and startFilteringNewPID change the PID map, handle list
// and handle set while the thread runs; mLock guards those three (and the outputs,
// which the controller may add to after startFilteringNewPID), and the thread only
// takes a snapshot of them under it once per round, so it never waits on the
// controller for longer than a copy.
#pragma once

#include <cstdint>
#include <cstdio>
#include <list>
#include <map>
#include <mutex>
#include <vector>

#include <utils/StrongPointer.h>
#include <utils/Thread.h>

#include "common/Module.h"
#include "platform/dtv/DemuxBinder.h"

namespace TavoPlayer {

enum TSReceiverPIDType : int32_t {
    PCR_PID = 0,
    VIDEO_PID = 1,
    AUDIO_PID = 2,
    CC_PID = 3,
};

class TSReceiver : public Module {
public:
    // The demux time-out of one select, in milliseconds.
    static constexpr int kSelectTimeoutMs = 30;
    static constexpr uint32_t kTsPacketBytes = 188;

    class TSReceiverThread : public android::Thread {
    public:
        explicit TSReceiverThread(TSReceiver& receiver);

    private:
        // Names the kernel thread "TSReceiver" (libutils does so only on Android), so
        // that logs and tools such as top show it.
        android::status_t readyToRun() override;
        bool threadLoop() override;
        TSReceiver& mReceiver;  // owns this thread and joins it before it goes
    };

    TSReceiver();
    ~TSReceiver() override;

    // Replaces the PID map; 0x11003 when its size differs from the number of outputs.
    unsigned int configure(std::map<TSReceiverPIDType, unsigned short> pids);
    unsigned int start() override;
    unsigned int stop() override;
    unsigned int addOutput(const android::sp<RingBuffer>& ring,
                           OutputList::iterator* where) override;
    void removeOutput(OutputList::iterator* where) override;
    unsigned int dump(FILE* stream, int indent) override;

    // Starts one filter per PID-map entry; true only if every one started.
    bool startFiltering();
    // Stops every started filter. Returns true.
    bool stopFiltering();
    bool isPIDSet(unsigned short pid);
    unsigned int startFilteringNewPID(TSReceiverPIDType type, unsigned short pid);
    unsigned int changePID(TSReceiverPIDType type, unsigned short oldPid, unsigned short newPid);

    // The demux filter kind of each PID kind.
    static int filterKindOf(TSReceiverPIDType type);
    // The read request for an output with `freeBytes` free: whole packets, at least one.
    static uint32_t requestSize(uint32_t freeBytes);

private:
    struct Entry {
        android::sp<RingBuffer> output;
        int handle;
        unsigned short pid;
    };
    std::mutex mLock;
    std::map<TSReceiverPIDType, unsigned short> mPIDMap;  // mLock
    DemuxHandleSet mHandleSet;                            // mLock
    std::list<int> mHandleList;                           // mLock
    android::sp<TSReceiverThread> mThread;                // controller's thread only
    std::vector<Entry> mRound;                            // receiver thread only
};

}  // namespace TavoPlayer
