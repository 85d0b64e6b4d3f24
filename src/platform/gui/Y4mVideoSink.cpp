#include "platform/gui/Y4mVideoSink.h"

#include <cerrno>
#include <cstring>

extern "C" {
#include <libavutil/pixfmt.h>
#include <libswscale/swscale.h>
}

#include "platform/os/Trace.h"

namespace android {

std::unique_ptr<Y4mVideoSink> Y4mVideoSink::open(const std::string& path, ShowLog& log) {
    if (path.empty()) {
        TAVO_LOGE("%s: the y4m sink needs a file name (y4m:PATH)\n", __func__);
        return nullptr;
    }
    FILE* file = fopen(path.c_str(), "wb");
    if (file == nullptr) {
        TAVO_LOGE("%s: cannot create %s: %s\n", __func__, path.c_str(), strerror(errno));
        return nullptr;
    }
    return std::unique_ptr<Y4mVideoSink>(new Y4mVideoSink(file, path, log));
}

Y4mVideoSink::Y4mVideoSink(FILE* file, const std::string& path, ShowLog& log)
    : mFile(file), mPath(path), mLog(log) {}

Y4mVideoSink::~Y4mVideoSink() {
    sws_freeContext(mScaler);
    fclose(mFile);
}

bool Y4mVideoSink::toPlanar(const SinkPicture& picture) {
    const size_t lumaSize = static_cast<size_t>(mWidth) * mHeight;
    mPlanar.resize(lumaSize * 3 / 2);
    uint8_t* planes[3] = {mPlanar.data(), mPlanar.data() + lumaSize,
                          mPlanar.data() + lumaSize + lumaSize / 4};
    if (picture.width == mWidth && picture.height == mHeight) {
        const size_t width = static_cast<size_t>(mWidth);
        const size_t chromaWidth = width / 2;
        for (int32_t row = 0; row < mHeight; ++row)
            memcpy(planes[0] + row * width, picture.y() + row * picture.lumaStride(), width);
        for (int32_t row = 0; row < mHeight / 2; ++row) {
            const uint8_t* uv = picture.uv() + row * picture.chromaStride();
            uint8_t* cb = planes[1] + row * chromaWidth;
            uint8_t* cr = planes[2] + row * chromaWidth;
            for (size_t i = 0; i < chromaWidth; ++i) {
                cb[i] = uv[2 * i];
                cr[i] = uv[2 * i + 1];
            }
        }
        return true;
    }
    mScaler =
        sws_getCachedContext(mScaler, picture.width, picture.height, AV_PIX_FMT_NV12, mWidth,
                             mHeight, AV_PIX_FMT_YUV420P, SWS_BILINEAR, nullptr, nullptr, nullptr);
    if (mScaler == nullptr)
        return false;
    const uint8_t* source[2] = {picture.y(), picture.uv()};
    const int sourceStrides[2] = {picture.lumaStride(), picture.chromaStride()};
    const int strides[3] = {mWidth, mWidth / 2, mWidth / 2};
    return sws_scale(mScaler, source, sourceStrides, 0, picture.height, planes, strides) == mHeight;
}

int Y4mVideoSink::show(const std::shared_ptr<const SinkPicture>& picture) {
    std::lock_guard<std::mutex> lock(mLock);
    if (mWriteFailed)
        return -EIO;
    if (mWidth == 0) {
        mWidth = picture->width;
        mHeight = picture->height;
        // YUV4MPEG2: 'C420mpeg2' is 4:2:0 with chroma sited left, as in ITU-T H.264
        // (chroma_sample_loc_type 0); 'I' gives the field order of the first picture.
        const char interlace = !picture->interlaced ? 'p' : (picture->topFieldFirst ? 't' : 'b');
        fprintf(mFile, "YUV4MPEG2 W%d H%d F30000:1001 I%c A1:1 C420mpeg2\n", mWidth, mHeight,
                interlace);
    }
    if (!toPlanar(*picture)) {
        TAVO_LOGW("%s: cannot scale a %dx%d picture to %dx%d; not written\n", __func__,
                  picture->width, picture->height, mWidth, mHeight);
        return -EINVAL;
    }
    if (fputs("FRAME\n", mFile) < 0 ||
        fwrite(mPlanar.data(), 1, mPlanar.size(), mFile) != mPlanar.size() || fflush(mFile) != 0) {
        TAVO_LOGE("%s: writing %s failed: %s; no more pictures are written\n", __func__,
                  mPath.c_str(), strerror(errno));
        mWriteFailed = true;
        return -EIO;
    }
    mLog.record(picture->pts90k, picture->width, picture->height);
    return 0;
}

}  // namespace android
