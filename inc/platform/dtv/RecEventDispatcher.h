// RecEventDispatcher: the recording service's own thread for its events.
//
// Events reach the recorder and the clip player through the event functions they
// registered, never on the thread that noticed the failure: a listener may well
// answer an event by stopping the recording or the playback, which joins the very
// threads that notice failures (the writer thread, the demux's source thread).
// Events are delivered one at a time, in the order they were posted.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <mutex>
#include <thread>

namespace TavoPlayer {

using RecPlayerEventCallback = void (*)(int event, void* userData);

class RecEventDispatcher {
public:
    RecEventDispatcher();
    // Delivers what is still queued, then joins the thread.
    ~RecEventDispatcher();
    RecEventDispatcher(const RecEventDispatcher&) = delete;
    RecEventDispatcher& operator=(const RecEventDispatcher&) = delete;

    // Any thread. A null callback is dropped.
    void post(RecPlayerEventCallback callback, void* userData, int event);
    // Waits until every event posted before the call has been delivered; false when
    // the time-out passed first. Must not be called from an event function.
    bool drain(std::chrono::milliseconds timeout);
    // Drops the events still queued for `userData` and, unless called from an event
    // function, waits until one being delivered to it has returned: its owner is
    // about to go away.
    void forget(void* userData);
    uint64_t delivered() const;

private:
    struct Event {
        RecPlayerEventCallback callback;
        void* userData;
        int event;
    };
    void run();

    mutable std::mutex mLock;
    std::condition_variable mChanged;
    std::deque<Event> mQueue;   // mLock
    uint64_t mPosted = 0;       // mLock
    uint64_t mDelivered = 0;    // mLock
    void* mInFlight = nullptr;  // mLock: userData of the event being delivered
    bool mStop = false;         // mLock
    std::thread mThread;
};

}  // namespace TavoPlayer
