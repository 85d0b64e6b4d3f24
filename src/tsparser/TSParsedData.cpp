#include "tsparser/TSParsedData.h"

#include <cstring>

namespace TavoPlayer {

TSParsedData::TSParsedData()
    : mTransportErrorIndicator(0),
      mPayloadUnitStartIndicator(0),
      mTransportPriority(0),
      mPID(0xFFFF),
      mTransportScramblingControl(0),
      mAdaptationFieldControl(0),
      mContinuityCounter(0),
      mAdaptationFieldLength(0),
      mDiscontinuityIndicator(0),
      mRandomAccessIndicator(0),
      mElementaryStreamPriorityIndicator(0),
      mPCRFlag(0),
      mOPCRFlag(0),
      mSplicingPointFlag(0),
      mTransportPrivateDataFlag(0),
      mAdaptationFieldExtensionFlag(0),
      mPCRBase(0),
      mPCRExtension(0),
      mOPCRBase(0),
      mOPCRExtension(0),
      mSpliceCountdown(0),
      mTransportPrivateDataLength(0),
      mTransportPrivateData(nullptr),
      mAdaptationFieldExtensionLength(0),
      mLtwFlag(0),
      mPiecewiseRateFlag(0),
      mSeamlessSpliceFlag(0),
      mLtwValidFlag(0),
      mLtwOffset(0),
      mPiecewiseRate(0),
      mSpliceType(0),
      mDTSNextAU(0),
      mPayload(nullptr),
      mPayloadLength(0) {}

TSParsedData::~TSParsedData() {
    mPayload = nullptr;
    delete[] mTransportPrivateData;
}

void TSParsedData::setPrivateData(const uint8_t* bytes, uint8_t length) {
    // The previous copy is freed here rather than kept until destruction: a PID
    // that carries private data in every packet would otherwise grow without bound.
    delete[] mTransportPrivateData;
    mTransportPrivateData = nullptr;
    if (bytes != nullptr && length != 0) {
        mTransportPrivateData = new uint8_t[length];
        memcpy(mTransportPrivateData, bytes, length);
    }
}

}  // namespace TavoPlayer
