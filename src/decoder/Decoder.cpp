#include "decoder/Decoder.h"

namespace TavoPlayer {

unsigned int Decoder::configure(codingType_t /*type*/) {
    return ERROR_DECODER_CROP_UNSUPPORTED;
}

unsigned int Decoder::getResolution(int* /*width*/, int* /*height*/) {
    return ERROR_DECODER_CROP_UNSUPPORTED;
}

unsigned int Decoder::setAudioOnlyMode(int /*mode*/) {
    return ERROR_DECODER_CROP_UNSUPPORTED;
}

unsigned int Decoder::setCropRect(int /*left*/, int /*top*/, int /*right*/, int /*bottom*/,
                                  int /*mode*/) {
    return ERROR_DECODER_CROP_UNSUPPORTED;
}

unsigned int Decoder::setSurface(android::sp<android::Surface>& /*surface*/) {
    return ERROR_DECODER_CROP_UNSUPPORTED;
}

android::sp<android::Surface> Decoder::getSurface() {
    return nullptr;
}

void Decoder::setDecoderInfoListenerListener(DecoderInfoListener* /*listener*/) {}

}  // namespace TavoPlayer
