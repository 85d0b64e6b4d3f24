#include "common/data/ClosedCaptionFragmentData.h"

#include <cstddef>

#include "platform/os/Trace.h"

namespace TavoPlayer {

// The virtual base Data sits after the caption part: dispatch header at 0, mPTS at
// 8, the Data part's dispatch header at 16, mType at 24, mSize at 28, text at 32.
static_assert(sizeof(ClosedCaptionFragmentData) == ClosedCaptionFragmentData::kHeaderSize);

std::string ClosedCaptionFragmentData::toString() {
    TAVO_LOGE("%s: caption records have no text form\n", __func__);
    return {};
}

bool ClosedCaptionFragmentData::fromString(char*) {
    return true;
}

int ClosedCaptionFragmentData::getRaw(unsigned char**, unsigned int*) {
    return 0;
}

}  // namespace TavoPlayer
