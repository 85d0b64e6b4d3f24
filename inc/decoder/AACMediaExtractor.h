// AACMediaExtractor: cuts raw AAC access units, with presentation times, out of the
// PESData records of an AAC stream carried as LATM in LOAS framing or as ADTS, for the
// "audio/mp4a-latm" decoder. The framing is undone by the transport decoder; the
// AudioSpecificConfig it reports is delivered first (flag 1), built by ASCParser.
//
// Until the first configuration has been delivered the extractor counts transport
// errors and records that look like the other framing, and switches between LOAS and
// ADTS on its own when the counts say the wrong one was chosen.
//
// Threads: only the decoder's input thread calls getDecodableUnit and reset. The
// ring's reader lock is held from adopting a record while access units are cut from
// it, and released (the record staying in use, unconsumed) after a configuration is
// delivered and whenever the record has not been fully handed to the transport
// decoder yet; it is taken again on the next call.
#pragma once

#include <cstdint>

#include "decoder/MediaExtractor.h"
#include "decoder/TransportDecoder.h"

namespace TavoPlayer {

class AACMediaExtractor : public MediaExtractor {
public:
    enum transportLayer_t : uint32_t {
        TRANSPORT_LAYER_LOAS = 0,
        TRANSPORT_LAYER_ADTS = 1,
    };

    // Unit flag: the unit is the codec configuration (AudioSpecificConfig), not audio.
    static constexpr unsigned char FLAG_CODEC_CONFIG = 1;

    // Fragment-step results.
    enum fragment_t : unsigned int {
        FRAGMENT_DONE = 0,           // done for this call (a unit, or nothing usable)
        FRAGMENT_NOT_FULLY_FED = 1,  // the record still has bytes for the transport decoder
        FRAGMENT_EXHAUSTED = 2,      // the record has been fed and nothing more comes of it
        FRAGMENT_CONFIG = 3,         // the configuration was written instead of a unit
    };

    // Framing-switch thresholds, counted only before the first configuration.
    static constexpr uint32_t kSwitchErrorCount = 50;
    static constexpr uint32_t kSuspectErrorCount = 26;
    static constexpr uint32_t kLoasSuspectsNeeded = 10;  // when decoding ADTS
    static constexpr uint32_t kAdtsSuspectsNeeded = 1;   // when decoding LOAS

    AACMediaExtractor(android::sp<RingBuffer> ring, transportLayer_t layer);
    ~AACMediaExtractor() override;

    unsigned int getDecodableUnit(void* buffer, unsigned long size, unsigned long* length,
                                  long long* pts, unsigned char* flags) override;
    // The configuration is delivered again before the next audio unit; a record in use
    // is given back unconsumed. Nothing else changes.
    void reset() override;

    static int32_t ASCCallback(void* self, const CSAudioSpecificConfig* config,
                               unsigned char configMode, unsigned char* configChanged);
    // Writes the AudioSpecificConfig into `buffer`; 0, or 1 on failure.
    unsigned int getASC(void* buffer, unsigned long size, unsigned long* length);

    transportLayer_t transportLayer() const { return mTransportLayer; }
    uint32_t errorCount() const { return mErrorCnt; }
    uint32_t suspectCount() const { return mSuspectCount; }
    bool configSent() const { return mConfigSent; }

private:
    unsigned int getNextFragment(void* buffer, unsigned long size, unsigned long* length,
                                 long long* pts);
    // Opens, configures and registers a transport decoder for mTransportLayer,
    // logging failures under `function`.
    void openTransport(const char* function);
    // Counts the just-finished record as a suspect of the other framing; returns
    // whether to switch now.
    bool shouldSwitch(const uint8_t* head, uint32_t headBytes);
    void releaseReadLock();

    HANDLE_TRANSPORTDEC mTransportDecoder = nullptr;
    const uint8_t* mPayload = nullptr;
    uint32_t mPayloadSize = 0;  // mSizeES bounded by the record's own mSize
    uint32_t mBytesValid = 0;
    uint32_t mScanOffset = 0;
    uint64_t mFrameDuration = 0;  // 90 kHz ticks per access unit
    int64_t mCurrentPTS = 0;
    bool mPtsCarry = false;
    bool mConfigSent = false;
    PESData* mCurrentRecord = nullptr;
    bool mReadLocked = false;  // this thread holds the ring's reader lock
    bool mNeedFill = true;
    // The first configuration reported, kept as a copy: the transport decoder that
    // reported it may be closed by a framing switch while this is still needed.
    const CSAudioSpecificConfig* mConfig = nullptr;
    CSAudioSpecificConfig mConfigCopy;
    transportLayer_t mTransportLayer;
    bool mErrorCounting = true;
    uint32_t mErrorCnt = 0;
    uint32_t mSuspectCount = 0;
};

}  // namespace TavoPlayer
