// BnCTavoPlayerClient: the client application's side of the callbacks (tavoctl,
// tests). onTransact checks the token "TavoPlayerClient", reads each callback's
// parcel and calls the matching method on a binder thread.
//
// A captured frame arrives as a shared-memory descriptor: onCaptureFrameRegion
// receives it first; its default maps the region read-only, checks that it holds
// the frame's bytes, and hands the mapping to onCaptureFrame for the duration of
// the call.
#pragma once

#include "platform/binder/BnInterface.h"
#include "service/ICTavoPlayerClient.h"

namespace TavoPlayer {

class BnCTavoPlayerClient : public android::BnInterface<ICTavoPlayerClient> {
public:
    android::status_t onTransact(uint32_t code, const android::Parcel& data, android::Parcel* reply,
                                 uint32_t flags = 0) override;

protected:
    // `fd` is the parcel's: valid during the call only.
    virtual void onCaptureFrameRegion(int fd, int32_t width, int32_t height, int32_t flag);
};

}  // namespace TavoPlayer
