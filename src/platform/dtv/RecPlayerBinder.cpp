#include "platform/dtv/RecPlayerBinder.h"

#include <atomic>

#include "platform/dtv/RecPlayerService.h"

namespace TavoPlayer {
namespace {

// Written by the audio TS parser's thread, read by the recording service's.
std::atomic<unsigned int> sLastNotifiedAudioPTSMs{0};
std::atomic<uint64_t> sAudioPTSNotificationCount{0};

RecPlayerService& service() {
    return RecPlayerService::instance();
}

}  // namespace

int RecPlayerBinder_CreateTSRecorder(int, int storageType, int videoPid, int audioPid, int isLATM,
                                     RecPlayerEventCallback callback, void* userData) {
    return service().createTSRecorder(storageType, videoPid, audioPid, isLATM, callback, userData);
}

int RecPlayerBinder_AnyMoreRecordings() {
    return service().anyMoreRecordings();
}

int RecPlayerBinder_StartTSRecorder() {
    return service().startTSRecorder();
}

RecDetails* RecPlayerBinder_GetCurrTSRecDetails() {
    return service().getCurrTSRecDetails();
}

int RecPlayerBinder_SetCurrTSRecDetails(RecDetails* details) {
    return service().setCurrTSRecDetails(details);
}

int RecPlayerBinder_StopTSRecorder() {
    return service().stopTSRecorder();
}

int RecPlayerBinder_CancelTSRecorder() {
    return service().cancelTSRecorder();
}

int RecPlayerBinder_DeleteTSRecorder() {
    return service().deleteTSRecorder();
}

int RecPlayerBinder_IsTSPlayerActive(RecPlayerEventCallback callback, void* userData) {
    return service().isTSPlayerActive(callback, userData);
}

int RecPlayerBinder_ForgetEvents(void* userData) {
    service().events().forget(userData);
    return 1;
}

RecDetails* RecPlayerBinder_GetRecClipDetails(const char* clipPath, int notOnExternalCard) {
    return service().getRecClipDetails(clipPath, notOnExternalCard);
}

int RecPlayerBinder_PauseTSPlayer() {
    return service().pauseTSPlayer();
}

int RecPlayerBinder_ResumeTSPlayer() {
    return service().resumeTSPlayer();
}

int RecPlayerBinder_IsPossibleSeek() {
    return service().isPossibleSeek();
}

int RecPlayerBinder_RepositioningTSPlayer(unsigned int elapsedTimeSec, int positionMs) {
    return service().repositioningTSPlayer(elapsedTimeSec, positionMs);
}

int RecPlayerBinder_SetCurrLapTime(unsigned int elapsedMs, unsigned int ptsMs) {
    return service().setCurrLapTime(elapsedMs, ptsMs);
}

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
