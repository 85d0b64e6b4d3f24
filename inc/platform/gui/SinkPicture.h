// SinkPicture: one shown picture as the sinks and the capture keep it: the crop
// rectangle of a decoded picture in NV12 (Y rows, then height / 2 rows of Cb/Cr
// pairs, Cb first).
//
// The planes are either packed in `data` (rows of `width` bytes, no padding) or, when
// `storage` is set, rows inside a buffer the picture shares with its producer (the
// codec's output buffer), `yStride`/`uvStride` bytes apart. Shared planes are never
// written again while the picture holds them, so a reader may keep the picture as
// long as it likes. A shared picture whose producer kept its chroma planar carries
// it as `planarChroma`, interleaved for the first reader of uv(). Readers go through
// y(), uv(), lumaStride() and chromaStride().
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

#include "platform/gui/PlanarChroma.h"

namespace android {

struct SinkPicture {
    std::vector<uint8_t> data;  // packed: width x height luma bytes, then width x height / 2 chroma
    int32_t width = 0;          // even, as 4:2:0 crops are
    int32_t height = 0;         // even
    int64_t ptsUs = 0;
    uint64_t pts90k = 0;  // ptsUs on the 33-bit 90 kHz clock
    bool interlaced = false;
    bool topFieldFirst = true;

    // Shared planes (storage set): the crop's first luma and chroma bytes.
    std::shared_ptr<const void> storage;
    const uint8_t* sharedY = nullptr;
    const uint8_t* sharedUV = nullptr;
    int32_t yStride = 0;
    int32_t uvStride = 0;
    // The crop's chroma when the producer's is planar (then sharedUV is unused).
    std::shared_ptr<const PlanarChroma> planarChroma;

    const uint8_t* y() const { return storage != nullptr ? sharedY : data.data(); }
    const uint8_t* uv() const {
        if (planarChroma != nullptr)
            return planarChroma->interleaved();
        return storage != nullptr ? sharedUV : data.data() + static_cast<size_t>(width) * height;
    }
    int32_t lumaStride() const { return storage != nullptr ? yStride : width; }
    int32_t chromaStride() const {
        return planarChroma != nullptr ? width : storage != nullptr ? uvStride : width;
    }
    // Bytes of the picture packed (what a capture of the whole picture maps).
    size_t byteSize() const { return static_cast<size_t>(width) * height * 3 / 2; }
};

}  // namespace android
