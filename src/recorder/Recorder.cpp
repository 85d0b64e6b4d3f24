#include "recorder/Recorder.h"

#include <cstdlib>
#include <cstring>
#include <map>
#include <string>

#include "common/Uri.h"
#include "platform/dtv/RecPlayerBinder.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {

namespace {

// The recording service's convention: 1 is success, anything else a failure.
void logOutcome(const char* operation, const char* function, int result) {
    if (result == 1)
        TAVO_LOGI("%s %s succeeded!", operation, function);
    else
        TAVO_LOGE("%s %s failed", operation, function);
}

// A missing or non-numeric value reads as 0.
int toInt(const std::map<std::string, std::string>& queries, const char* key) {
    auto it = queries.find(key);
    return it == queries.end() ? 0 : atoi(it->second.c_str());
}

// A malloc'ed copy of the query value, or null when it is missing or empty.
char* copyName(const std::map<std::string, std::string>& queries, const char* key,
               uint32_t* length) {
    auto it = queries.find(key);
    if (it == queries.end() || it->second.empty()) {
        *length = 0;
        return nullptr;
    }
    const size_t size = it->second.size();
    char* copy = static_cast<char*>(malloc(size + 1));
    if (copy == nullptr) {
        *length = 0;
        return nullptr;
    }
    memcpy(copy, it->second.c_str(), size + 1);
    *length = static_cast<uint32_t>(size);
    return copy;
}

}  // namespace

Recorder::Recorder() : mListener(nullptr) {}

Recorder::~Recorder() {
    // The recording service may still hold an event for this recorder (a refusal
    // posted after the recording was given up): it must not arrive after us.
    RecPlayerBinder_ForgetEvents(this);
}

void Recorder::start(const Uri* uri, int videoPid, int audioPid, int /*reserved*/, int isLATM) {
    const char* op = "start";
    std::map<std::string, std::string> queries;
    if (uri != nullptr)
        queries = uri->mQueries;
    const int storageType = toInt(queries, "storageType");

    // The recording service decides whether a recording exists: every step runs
    // whatever the one before returned, and the outcome shows in its details.
    logOutcome(op, "RecPlayerBinder_CreateTSRecorder",
               RecPlayerBinder_CreateTSRecorder(0, storageType, videoPid, audioPid, isLATM,
                                                &Recorder::recorderCallback, this));
    logOutcome(op, "RecPlayerBinder_AnyMoreRecordings", RecPlayerBinder_AnyMoreRecordings());
    logOutcome(op, "RecPlayerBinder_StartTSRecorder", RecPlayerBinder_StartTSRecorder());

    RecDetails* details = RecPlayerBinder_GetCurrTSRecDetails();
    if (details == nullptr) {
        TAVO_LOGE("%s: recDetails == null!", op);
        IRecorderListener* listener = mListener.load();
        if (listener != nullptr)
            listener->onRecorderStarted(0);
        else
            TAVO_LOGE("%s: no IRecorderListener set!", op);
        return;
    }

    const int fileNumName = details->fileNumName;
    TAVO_LOGI("%s recDetails->fileNumName: %d", op, details->fileNumName);
    if (details->stationName != nullptr)
        TAVO_LOGI("%s recDetails->stationName: %s", op, details->stationName);
    if (details->prgName != nullptr)
        TAVO_LOGI("%s recDetails->prgName: %s", op, details->prgName);
    TAVO_LOGI("%s recDetails->stationNameLength: %u", op, details->stationNameLength);
    TAVO_LOGI("%s recDetails->prgNameLength: %u", op, details->prgNameLength);
    TAVO_LOGI("%s recDetails->creationTime: %u", op, details->creationTime);
    TAVO_LOGI("%s recDetails->durationOfRec: %u", op, details->durationOfRec);
    TAVO_LOGI("%s recDetails->sizeOfRec: %u", op, details->sizeOfRec);
    details->recMode = 0;
    TAVO_LOGI("%s recDetails->recMode: %d", op, details->recMode);
    details->recLocation = storageType;
    TAVO_LOGI("%s recDetails->recLocation: %d", op, details->recLocation);
    details->bCanPlay = 1;
    TAVO_LOGI("%s recDetails->bCanPlay: %u", op, details->bCanPlay);
    details->playbackDuration = 0;
    TAVO_LOGI("%s recDetails->playbackDuration: %u", op, details->playbackDuration);
    TAVO_LOGI("%s recDetails->recStartTime: %u", op, details->recStartTime);
    TAVO_LOGI("%s recDetails->recEndTime: %u", op, details->recEndTime);
    details->iV_PID = videoPid;
    TAVO_LOGI("%s recDetails->iV_PID: %d", op, details->iV_PID);
    details->iA_PID = audioPid;
    TAVO_LOGI("%s recDetails->iA_PID: %d", op, details->iA_PID);
    details->isLATM = isLATM;
    TAVO_LOGI("%s recDetails->isLATM: %d", op, details->isLATM);

    // The names the service filled in belong to its record and go with it; ours
    // replace them in the copy handed back.
    char* library[2] = {details->stationName, details->prgName};
    uint32_t stationLength = 0;
    uint32_t programLength = 0;
    char* station = copyName(queries, "channelName", &stationLength);
    char* program = copyName(queries, "programName", &programLength);

    RecDetails copy;
    memcpy(&copy, details, sizeof(copy));
    copy.stationName = station;
    copy.stationNameLength = stationLength;
    copy.prgName = program;
    copy.prgNameLength = programLength;
    logOutcome(op, "RecPlayerBinder_SetCurrTSRecDetails",
               RecPlayerBinder_SetCurrTSRecDetails(&copy));

    free(library[0]);
    free(library[1]);
    free(details);
    free(station);
    free(program);

    IRecorderListener* listener = mListener.load();
    if (listener != nullptr)
        listener->onRecorderStarted(fileNumName);
    else
        TAVO_LOGE("%s: no IRecorderListener set!", op);
}

void Recorder::stop(int reason) {
    const char* op = "stop";
    int result = 0;
    if (reason >= 1) {
        result = RecPlayerBinder_StopTSRecorder();
        logOutcome(op, "RecPlayerBinder_StopTSRecorder", result);
    } else {
        result = RecPlayerBinder_CancelTSRecorder();
        logOutcome(op, "RecPlayerBinder_CancelTSRecorder", result);
    }

    int report = 0;
    if (result != 0) {
        const int deleted = RecPlayerBinder_DeleteTSRecorder();
        logOutcome(op, "RecPlayerBinder_DeleteTSRecorder", deleted);
        // The delete's own code, low 8 bits, when it is not the library's success.
        report = deleted == 1 ? 1 : (deleted & 0xFF);
    }
    IRecorderListener* listener = mListener.load();
    if (listener != nullptr)
        listener->onRecorderStopped(report);
    else
        TAVO_LOGE("%s: no IRecorderListener set!", op);
}

void Recorder::recorderCallback(int event, void* userData) {
    const char* op = "recorderCallback";
    TAVO_LOGI("%s event received: %d", op, event);
    if (userData == nullptr) {
        TAVO_LOGE("%s: userData is null!", op);
        return;
    }
    IRecorderListener* listener = static_cast<Recorder*>(userData)->mListener.load();
    if (listener == nullptr) {
        TAVO_LOGE("%s: no IRecorderListener set!", op);
        return;
    }
    switch (event) {
        case 0:
            listener->onError(kErrorEvent0);
            break;
        case 1:
            listener->onError(kErrorEvent1);
            break;
        case 2:
            listener->onError(kErrorEvent2);
            break;
        case 3:
            listener->onError(kErrorEvent3);
            break;
        default:
            break;
    }
}

}  // namespace TavoPlayer
