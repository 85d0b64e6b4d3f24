// The recording service's client interface: the calls through which the system
// starts, stops and describes recordings of the live stream and drives the
// playback of a recorded clip. Every operation returns 1 for success, the
// recording service's convention; any other value is a failure.
//
// Events come back on the recording service's own thread through the event
// function given at creation, with the user data given there.
//
// On Linux the recording service runs inside the process (docs/recording.md): a
// recording writes the live packets of its PIDs from the demux to a TS file in the
// folder named by the property tavoplayer.recordings.dir, with an SQLite catalog of
// the recordings beside the files; a recorded clip is fed back into the demux at
// the pace of its PCR.
#pragma once

#include <cstdint>

namespace TavoPlayer {

// Event function of a recording or a clip player: (event, user data).
using RecPlayerEventCallback = void (*)(int event, void* userData);

// Events of a recording, given to the event function of CreateTSRecorder. Each
// one ends the writing; the file keeps what was written, whole packets only.
constexpr int kRecEventDiskFull = 0;           // no space left for the file
constexpr int kRecEventFileError = 1;          // the file or folder cannot be written
constexpr int kRecEventDemuxLost = 2;          // the demux stopped delivering
constexpr int kRecEventTooManyRecordings = 3;  // a recording is already running
// Events of a clip player, given to the event function of IsTSPlayerActive.
constexpr int kClipEventReadError = 4;  // the clip file cannot be read any more
constexpr int kClipEventNotTs = 5;      // the clip holds no transport stream
constexpr int kClipEventEnd = 6;        // every packet of the clip has been fed

// The property naming the recordings folder; unset: $XDG_DATA_HOME/tavoplayer/
// recordings, or ~/.local/share/tavoplayer/recordings without XDG_DATA_HOME.
constexpr const char* kRecordingsDirProperty = "tavoplayer.recordings.dir";

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
// No event reaches `userData` after this returns (queued ones are dropped, one being
// delivered is waited for): whoever registered an event function calls it before
// going away. Always 1.
int RecPlayerBinder_ForgetEvents(void* userData);
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
