#include "platform/dtv/RecPlayerBinder.h"

#include <atomic>

namespace TavoPlayer {
namespace {

// Written by the audio TS parser's thread, read by the recording service's.
std::atomic<unsigned int> sLastNotifiedAudioPTSMs{0};
std::atomic<uint64_t> sAudioPTSNotificationCount{0};

}  // namespace

int RecPlayerBinder_NotifyAudioPTS(unsigned int ptsMs) {
    sLastNotifiedAudioPTSMs.store(ptsMs, std::memory_order_relaxed);
    sAudioPTSNotificationCount.fetch_add(1, std::memory_order_release);
    return 1;
}

unsigned int RecPlayerBinder_GetLastNotifiedAudioPTS() {
    return sLastNotifiedAudioPTSMs.load(std::memory_order_relaxed);
}

uint64_t RecPlayerBinder_GetAudioPTSNotificationCount() {
    return sAudioPTSNotificationCount.load(std::memory_order_acquire);
}

}  // namespace TavoPlayer
