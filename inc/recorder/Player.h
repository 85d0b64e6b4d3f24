// Player: drives the recording service while a recorded clip plays. It handles no
// stream data: it asks the recording service to pause, resume and reposition,
// reads the clip's duration, turns the PTS of presented frames into elapsed whole
// seconds for the recording service and an IPlayerListener, and turns the
// recording service's events into end of content or errors.
//
// Threads: updateCurTime runs on the presenting renderer's thread; start, stop,
// pause, resume and seek on the controller's caller (a binder thread);
// playerCallback on the recording service's thread. No lock is taken, as
// designed: each member is a single word written by one side at a time, held in
// an atomic here so that the sides see each other's writes.
#pragma once

#include <atomic>
#include <cstdint>
#include <string>

#include <utils/RefBase.h>

#include "common/Uint33.h"
#include "recorder/IPlayerListener.h"

namespace TavoPlayer {

// The recording service's event function for clip playback; userData is the
// IPlayerListener given to RecPlayerBinder_IsTSPlayerActive.
void playerCallback(int event, void* userData);

class Player : public virtual android::RefBase {
public:
    // What the listener's onError receives for the recording service's events 4 and 5.
    static constexpr int kPlaybackError = 0x21001;
    // A seek this close to the clip's end is taken as reaching the end.
    static constexpr uint32_t kTailMs = 1500;

    Player();
    ~Player() override;

    // Not owned: the listener must outlive this player.
    void setListener(IPlayerListener* listener) { mListener = listener; }
    void setClipPath(const std::string& path) { mClipPath = path; }
    const std::string& getClipPath() const { return mClipPath; }
    // Clip duration in ms; 0 while unknown.
    uint32_t getDuration() const { return mDuration.load(); }

    void start();
    void stop();
    void pause();
    void resume();
    bool isPossibleSeek();
    void seek(int ms);
    // With the 90 kHz PTS of every presented frame.
    void updateCurTime(Uint33 pts);

    uint32_t getElapsedTimeSec() const { return m_elapsedTimeSec.load(); }
    uint64_t getStartPTS() const { return m_startPTS.load(); }

private:
    std::atomic<IPlayerListener*> mListener;
    std::atomic<uint32_t> m_elapsedTimeSec;
    std::atomic<bool> mStopped;
    std::string mClipPath;
    std::atomic<uint32_t> mDuration;
    std::atomic<uint64_t> m_startPTS;
};

}  // namespace TavoPlayer
