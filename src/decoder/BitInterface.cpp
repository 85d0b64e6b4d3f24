#include "decoder/BitInterface.h"

namespace TavoPlayer {

BitInterface::BitInterface(void* buffer, unsigned int size)
    : mBitPosition(0), mCurrent(static_cast<uint8_t*>(buffer)), mRemaining(size) {}

BitInterface::~BitInterface() = default;

}  // namespace TavoPlayer
