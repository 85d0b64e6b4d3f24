#include "recorder/Player.h"

#include <cstdlib>

#include "platform/dtv/RecPlayerBinder.h"
#include "platform/os/Properties.h"
#include "platform/os/Trace.h"

namespace TavoPlayer {

namespace {

// The recording service's convention: 1 is success, anything else a failure.
int logOutcome(const char* operation, const char* function, int result) {
    if (result == 1)
        TAVO_LOGD("%s %s succeeded!", operation, function);
    else
        TAVO_LOGE("%s %s failed", operation, function);
    return result;
}

}  // namespace

void playerCallback(int event, void* userData) {
    TAVO_LOGI("%s event received: %d", "playerCallback", event);
    // The listener is registered by start before any event can come; it is not
    // tested here, as designed.
    auto* listener = static_cast<IPlayerListener*>(userData);
    switch (event) {
        case 6:
            listener->onEndOfContent();
            break;
        case 4:
        case 5:
            listener->onError(Player::kPlaybackError);
            break;
        default:
            break;
    }
}

Player::Player()
    : mListener(nullptr), m_elapsedTimeSec(0), mStopped(false), mDuration(0), m_startPTS(0) {}

Player::~Player() = default;

void Player::start() {
    const char* op = "start";
    TAVO_LOGI("%s", op);
    mStopped = false;
    logOutcome(op, "RecPlayerBinder_IsTSPlayerActive",
               RecPlayerBinder_IsTSPlayerActive(&playerCallback, mListener.load()));

    char extSdCard[kPropertyValueMax] = {};
    property_get("oneseg.extSdCard.path", extSdCard, "");
    // A plain substring search: an empty property is found in every path, so the
    // clip then counts as on the external card.
    const int notOnExternalCard = mClipPath.find(extSdCard) == std::string::npos ? 1 : 0;

    RecDetails* details = RecPlayerBinder_GetRecClipDetails(mClipPath.c_str(), notOnExternalCard);
    if (details == nullptr) {
        TAVO_LOGE("%s fail to get duration", op);
        return;
    }
    mDuration = details->playbackDuration;
    if (details->stationName != nullptr) {
        free(details->stationName);
        details->stationName = nullptr;
    }
    if (details->prgName != nullptr) {
        free(details->prgName);
        details->prgName = nullptr;
        details->prgNameLength = 0;
    }
    free(details);
    TAVO_LOGI("%s duration = %d(ms)", op, static_cast<int>(mDuration.load()));
}

void Player::stop() {
    TAVO_LOGI("%s", "stop");
    mStopped = true;
}

void Player::pause() {
    TAVO_LOGI("%s", "pause");
    logOutcome("pause", "RecPlayerBinder_PauseTSPlayer", RecPlayerBinder_PauseTSPlayer());
}

void Player::resume() {
    TAVO_LOGI("%s", "resume");
    logOutcome("resume", "RecPlayerBinder_ResumeTSPlayer", RecPlayerBinder_ResumeTSPlayer());
}

bool Player::isPossibleSeek() {
    // Any non-zero answer reads as possible, a failure code included: kept as is.
    return logOutcome("isPossibleSeek", "RecPlayerBinder_IsPossibleSeek",
                      RecPlayerBinder_IsPossibleSeek()) != 0;
}

void Player::seek(int ms) {
    const int seconds = ms / 1000;
    // Compared as unsigned 32-bit numbers on purpose: with a duration under
    // 1500 ms the subtraction wraps and only huge positions take this branch.
    if (mDuration.load() - kTailMs <= static_cast<uint32_t>(ms)) {
        // The last 1.5 s of a clip: treated as its end, nothing is asked of the
        // recording service.
        m_elapsedTimeSec = static_cast<uint32_t>(seconds);
        m_startPTS = 0;
        IPlayerListener* listener = mListener.load();
        if (listener != nullptr)
            listener->onEndOfContent();
    } else if (logOutcome("seek", "RecPlayerBinder_RepositioningTSPlayer",
                          RecPlayerBinder_RepositioningTSPlayer(m_elapsedTimeSec.load(), ms)) ==
               1) {
        m_elapsedTimeSec = static_cast<uint32_t>(seconds);
        m_startPTS = 0;  // re-anchored by the next frame
    }
    TAVO_LOGI("%s: millisec %d - m_elapsedTimeSec %d", "seek", ms,
              static_cast<int>(m_elapsedTimeSec.load()));
}

void Player::updateCurTime(Uint33 pts) {
    if (mStopped.load())
        return;
    const uint64_t startPTS = m_startPTS.load();
    if (startPTS > pts) {
        // The stream jumped back: anchor again on the next frame.
        m_startPTS = 0;
        return;
    }
    const uint32_t elapsedTimeSec = m_elapsedTimeSec.load();
    if (startPTS == 0) {
        // The product is taken in 32 bits on purpose: it wraps beyond 47,721 s.
        m_startPTS = pts - static_cast<uint32_t>(elapsedTimeSec * 90000u);
        return;
    }
    const uint32_t elapsedMs = static_cast<uint32_t>((pts - startPTS) / 90);
    uint32_t elapsedSec = elapsedMs / 1000;
    TAVO_LOGD(
        "%s: pts =%llu, m_startPTS = %u, elapsedTimeMSec = %u, elapsedTimeSec = %u, "
        "m_elapsedTimeSec = %u",
        "updateCurTime", static_cast<unsigned long long>(pts), static_cast<unsigned int>(startPTS),
        elapsedMs, elapsedSec, elapsedTimeSec);
    const uint32_t duration = mDuration.load();
    if (duration != 0 && elapsedSec > duration / 1000)
        elapsedSec = duration / 1000;
    // One report per new whole second.
    if (elapsedSec <= elapsedTimeSec)
        return;
    logOutcome("updateCurTime", "RecPlayerBinder_SetCurrLapTime",
               RecPlayerBinder_SetCurrLapTime(elapsedMs, static_cast<unsigned int>(pts / 90)));
    IPlayerListener* listener = mListener.load();
    if (listener != nullptr)
        listener->onTimeUpdate(static_cast<int>(elapsedSec));
    m_elapsedTimeSec = elapsedSec;
}

}  // namespace TavoPlayer
