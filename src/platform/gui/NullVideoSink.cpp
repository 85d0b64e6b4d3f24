#include "platform/gui/NullVideoSink.h"

namespace android {

int NullVideoSink::show(const std::shared_ptr<const SinkPicture>& picture) {
    mLog.record(picture->pts90k, picture->width, picture->height);
    return 0;
}

}  // namespace android
