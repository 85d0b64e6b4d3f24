// The recording service's client interface: the calls through which the system
// starts, stops and describes recordings of the live stream and drives the
// playback of a recorded clip. Every operation returns 1 for success, the
// recording service's convention; any other value is a failure.
//
// Events come back on the recording service's own thread through the event
// function given at creation, with the user data given there.
//
// Implemented so far: RecPlayerBinder_NotifyAudioPTS only, which records the time
// where the recording service reads it (RecPlayerBinder_GetLastNotifiedAudioPTS).
// The other operations are declared for their callers and have no definition yet:
// a call to one of them does not link.
#pragma once

#include <cstdint>

namespace TavoPlayer {

// Event function of a recording or a clip player: (event, user data).
using RecPlayerEventCallback = void (*)(int event, void* userData);

// The 96-byte record that describes a recording (little-endian, natural alignment).
// The service allocates it with the C allocator; the caller frees it, and the two
// names when they are set, with free().
struct RecDetails {
    uint8_t reserved0[8];
    char* stationName;
    char* prgName;
    uint32_t stationNameLength;
    uint32_t prgNameLength;
    uint32_t creationTime;
    uint32_t durationOfRec;
    uint32_t sizeOfRec;
    int32_t recMode;
    int32_t recLocation;
    uint32_t bCanPlay;
    uint32_t playbackDuration;  // milliseconds
    uint32_t recStartTime;
    uint32_t recEndTime;
    int32_t iV_PID;
    int32_t iA_PID;
    int32_t isLATM;
    int32_t fileNumName;
    uint8_t reserved84[12];
};
static_assert(sizeof(RecDetails) == 96, "the recording details record is 96 bytes");

// --- recording ----------------------------------------------------------------
int RecPlayerBinder_CreateTSRecorder(int reserved, int storageType, int videoPid, int audioPid,
                                     int isLATM, RecPlayerEventCallback callback, void* userData);
int RecPlayerBinder_AnyMoreRecordings();
int RecPlayerBinder_StartTSRecorder();
RecDetails* RecPlayerBinder_GetCurrTSRecDetails();
int RecPlayerBinder_SetCurrTSRecDetails(RecDetails* details);
int RecPlayerBinder_StopTSRecorder();
int RecPlayerBinder_CancelTSRecorder();
int RecPlayerBinder_DeleteTSRecorder();

// --- recorded-clip playback ---------------------------------------------------
int RecPlayerBinder_IsTSPlayerActive(RecPlayerEventCallback callback, void* userData);
// notOnExternalCard: 1 when the clip path is not on the external storage card.
RecDetails* RecPlayerBinder_GetRecClipDetails(const char* clipPath, int notOnExternalCard);
int RecPlayerBinder_PauseTSPlayer();
int RecPlayerBinder_ResumeTSPlayer();
int RecPlayerBinder_IsPossibleSeek();
int RecPlayerBinder_RepositioningTSPlayer(unsigned int elapsedTimeSec, int positionMs);
int RecPlayerBinder_SetCurrLapTime(unsigned int elapsedMs, unsigned int ptsMs);
// The presentation time (ms) of the audio just parsed from a recorded clip; called
// by the audio TS parser's thread. Returns 1.
int RecPlayerBinder_NotifyAudioPTS(unsigned int ptsMs);

// Where the recording service reads the last time given to NotifyAudioPTS: the ms
// value, and how many notifications there have been (0: none yet). Any thread.
unsigned int RecPlayerBinder_GetLastNotifiedAudioPTS();
uint64_t RecPlayerBinder_GetAudioPTSNotificationCount();

}  // namespace TavoPlayer
