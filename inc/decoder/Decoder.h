// Decoder: the base of the decoder modules. Each operation a particular decoder does
// not support answers ERROR_DECODER_CROP_UNSUPPORTED (0x31008, "not supported").
#pragma once

#include <utils/RefBase.h>
#include <utils/StrongPointer.h>

#include "common/Module.h"
#include "platform/gui/Surface.h"

namespace TavoPlayer {

class Decoder : public Module {
public:
    enum codingType_t : int {
        CODING_H264 = 0,
        CODING_AAC_LATM = 1,  // AAC in LATM/LOAS (ISO/IEC 14496-3, 1.7)
        CODING_AAC_ADTS = 2,  // AAC in ADTS (ISO/IEC 13818-7 / 14496-3, 1.A.2)
        CODING_MPEG_AUDIO = 3,
    };

    // Told the cropped picture size whenever the video stream brings a new SPS. Calls
    // arrive on the decoder's input thread.
    class DecoderInfoListener {
    public:
        virtual ~DecoderInfoListener() = default;
        virtual void onVideoResolution(int width, int height) = 0;
    };

    explicit Decoder(const std::string& name) : Module(name) {}

    virtual unsigned int configure(codingType_t type);
    virtual unsigned int getResolution(int* width, int* height);
    virtual unsigned int setAudioOnlyMode(int mode);
    virtual unsigned int setCropRect(int left, int top, int right, int bottom, int mode);
    virtual unsigned int setSurface(android::sp<android::Surface>& surface);
    virtual android::sp<android::Surface> getSurface();
    // The listener is not owned; it must outlive the decoder's threads.
    virtual void setDecoderInfoListenerListener(DecoderInfoListener* listener);
};

}  // namespace TavoPlayer
