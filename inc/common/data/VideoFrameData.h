// VideoFrameData: one decoded picture in a ring (type 2), fixed 80 bytes. The
// picture itself stays in the codec's output buffer named by mBufferIndex; the
// renderer hands the record back through mListener to render or release it.
//
//   offset  8  mType = 2           offset 40  mListener (the producing decoder)
//   offset 12  mSize = 80          offset 48  mFlag (0 when written)
//   offset 16  mPTS (90 kHz)       offset 56  mReserved (0 when written)
//   offset 24  mColorFormat        offset 64  mCropWidth
//   offset 28  mBufferIndex        offset 68  mCropHeight
//   offset 32  mGraphicBuffer      offset 72  mReserved2 (not written)
#pragma once

#include "common/data/Data.h"

namespace TavoPlayer {

class GraphicBuffer;
class CaptureFrameListener;

class TAVO_RING_RECORD VideoFrameData : public Data {
public:
    static constexpr uint32_t kRecordSize = 80;

    // Implemented by the decoder that produced the frame.
    class VideoListener {
    public:
        virtual ~VideoListener() = default;
        // Renders the frame's output buffer to the surface (render true) or releases
        // it unrendered.
        virtual void renderFrame(bool render, VideoFrameData& frame) = 0;
        // Copies the frame for a still capture; true when a capture was started.
        virtual bool captureFrame(VideoFrameData& frame, CaptureFrameListener* listener) = 0;
    };

    VideoFrameData()
        : Data(TYPE_VIDEO_FRAME, kRecordSize),
          mPTS(0),
          mColorFormat(0),
          mBufferIndex(0),
          mGraphicBuffer(nullptr),
          mListener(nullptr),
          mFlag(0),
          mPadding{},
          mReserved(0),
          mCropWidth(0),
          mCropHeight(0) {}

    std::string toString() override;
    bool fromString(char* text) override;
    // With a graphic buffer: a new[] copy of the locked picture (the caller frees it
    // with delete[]); *size is its byte size. Without: the bytes after the 80-byte
    // record, none for a decoder record. Returns the lock's status (0 without a buffer).
    int getRaw(unsigned char** data, unsigned int* size) override;

    // Colour formats a capture can convert.
    static constexpr int kColorFormatYUV420SemiPlanar = 261;  // Y, then Cb/Cr pairs
    static constexpr int kColorFormatYUV420SemiPlanarAlt = 289;
    static constexpr int kColorFormatYV12 = 0x32315659;  // Y, then Cr, then Cb planes

    // Converts a 4:2:0 picture in `colorFormat` to pixels 0xFF000000 | R << 16 |
    // G << 8 | B, rows of `width` pixels. Luma rows are `stride` bytes apart. 0 on
    // success, 1 for an unsupported format (nothing written).
    static int convertFrameFromYvuToRgba(unsigned char* source, int* destination,
                                         unsigned int width, unsigned int height, int colorFormat,
                                         unsigned int stride);

    uint64_t mPTS;
    int32_t mColorFormat;
    int32_t mBufferIndex;
    GraphicBuffer* mGraphicBuffer;  // not owned; null in records written by the decoder
    VideoListener* mListener;       // not owned; the decoder outlives its records
    uint8_t mFlag;
    uint8_t mPadding[7];  // keeps mReserved at 56
    uint64_t mReserved;
    uint32_t mCropWidth;
    uint32_t mCropHeight;
    uint64_t mReserved2;
};

}  // namespace TavoPlayer
