#include "DecoderTestUtil.h"

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <sstream>
#include <thread>

extern "C" {
#include <libavutil/md5.h>
}

#include "PesRecordTestUtil.h"
#include "common/RingBuffer.h"
#include "common/Synchronization.h"
#include "common/data/AudioFragmentData.h"
#include "common/data/VideoFrameData.h"
#include "decoder/MediaCodecDecoder.h"
#include "tsparser/TSParser.h"

namespace TavoPlayer::test {

namespace {

std::string md5Hex(const uint8_t* data, size_t size) {
    uint8_t digest[16];
    av_md5_sum(digest, data, static_cast<int>(size));
    char text[33];
    for (int i = 0; i < 16; ++i)
        snprintf(text + 2 * i, 3, "%02x", digest[i]);
    return text;
}

struct ResolutionListener : Decoder::DecoderInfoListener, Recorded<std::pair<int, int>> {
    void onVideoResolution(int width, int height) override { push({width, height}); }
};

}  // namespace

int RecordingSurface::showPicture(const android::SurfacePicture& picture) {
    std::lock_guard<std::mutex> lock(mMutex);
    const android::android_native_rect_t crop =
        mCropSet ? mCrop : android::android_native_rect_t{0, 0, picture.width, picture.height};
    const int width = crop.right - crop.left;
    const int height = crop.bottom - crop.top;
    std::vector<uint8_t> nv12;
    nv12.reserve(static_cast<size_t>(width) * height * 3 / 2);
    for (int row = crop.top; row < crop.bottom; ++row) {
        const uint8_t* from = picture.y + static_cast<size_t>(row) * picture.yStride + crop.left;
        nv12.insert(nv12.end(), from, from + width);
    }
    for (int row = crop.top / 2; row < (crop.bottom + 1) / 2; ++row) {
        const uint8_t* from =
            picture.uv + static_cast<size_t>(row) * picture.uvStride + (crop.left & ~1);
        nv12.insert(nv12.end(), from, from + ((width + 1) & ~1));
    }
    mShown.push_back({picture.ptsUs, md5Hex(nv12.data(), nv12.size()), width, height});
    mLast = std::move(nv12);
    mLastWidth = width;
    mLastHeight = height;
    return 0;
}

int RecordingSurface::setCrop(const android::android_native_rect_t* crop) {
    std::lock_guard<std::mutex> lock(mMutex);
    mCrop = *crop;
    mCropSet = true;
    return 0;
}

int RecordingSurface::dequeueBuffer(android::ANativeWindowBuffer** buffer) {
    if (dequeueStatus != 0)
        return dequeueStatus;
    *buffer = &mBuffer;
    return 0;
}

int RecordingSurface::queueBuffer(android::ANativeWindowBuffer* /*buffer*/, int /*fenceFd*/) {
    ++queuedBack;
    return 0;
}

int RecordingSurface::Buffer::lockYCbCr(uint32_t /*usage*/, const android::Rect& /*bounds*/,
                                        android::android_ycbcr* ycbcr) {
    if (mSurface.lockStatus != 0)
        return mSurface.lockStatus;
    std::lock_guard<std::mutex> lock(mSurface.mMutex);
    uint8_t* base = mSurface.mLast.data();
    const size_t luma = static_cast<size_t>(mSurface.mLastWidth) * mSurface.mLastHeight;
    *ycbcr = {base,
              base + luma,
              base + luma + 1,
              static_cast<size_t>(mSurface.mLastWidth),
              static_cast<size_t>(mSurface.mLastWidth),
              2};
    return 0;
}

std::vector<RecordingSurface::Shown> RecordingSurface::shown() const {
    std::lock_guard<std::mutex> lock(mMutex);
    return mShown;
}

std::vector<uint8_t> RecordingSurface::lastPicture(int* width, int* height) const {
    std::lock_guard<std::mutex> lock(mMutex);
    *width = mLastWidth;
    *height = mLastHeight;
    return mLast;
}

void RecordingSurface::setLastPicture(std::vector<uint8_t> nv12, int width, int height) {
    std::lock_guard<std::mutex> lock(mMutex);
    mLast = std::move(nv12);
    mLastWidth = width;
    mLastHeight = height;
}

DecodedRun runDecoder(const std::vector<uint8_t>& ts, uint16_t pid, Decoder::codingType_t type,
                      const android::sp<android::Surface>& surface) {
    using Clock = std::chrono::steady_clock;
    const auto deadline = Clock::now() + std::chrono::seconds(120);
    DecodedRun run;
    const bool video = type == Decoder::CODING_H264;
    android::sp<RingBuffer> input = makeRing("TestTS", 1u << 20);
    android::sp<RingBuffer> pes = makeRing(video ? "VideoPES" : "AudioPES", 1u << 22);
    android::sp<RingBuffer> output = makeRing(video ? "VideoRaw" : "AudioRaw", 1u << 22);
    android::sp<Synchronization> clock = new Synchronization();
    android::sp<TSParser> parser =
        new TSParser(video ? TSParser::KIND_VIDEO : TSParser::KIND_AUDIO);
    parser->setInput(input);
    parser->addOutput(pes, nullptr);
    parser->configure(clock);
    android::sp<MediaCodecDecoder> decoder = new MediaCodecDecoder();
    decoder->setInput(pes);
    decoder->addOutput(output, nullptr);
    ResolutionListener listener;
    decoder->setDecoderInfoListenerListener(&listener);
    if (decoder->configure(type) != 0)
        return run;
    android::sp<android::Surface> target = surface;
    if (surface != nullptr)
        decoder->setSurface(target);
    if (parser->start() != 0 || decoder->start() != 0)
        return run;
    run.started = true;
    const android::sp<android::MediaCodec> codec = decoder->getCodecForTest();

    std::atomic<bool> fed{false};
    std::thread feeder([&] {
        feedPid(*input, ts, pid, deadline);
        fed = true;
    });

    // The reader: the renderer's part. Done when everything is fed and no record has
    // come for two seconds (frame threads keep the last pictures until more input).
    auto lastRecord = Clock::now();
    while (Clock::now() < deadline) {
        if (!output->waitForData(sizeof(Data))) {
            if (fed && input->usedSpace() == 0 &&
                Clock::now() - lastRecord > std::chrono::seconds(2))
                break;
            continue;
        }
        lastRecord = Clock::now();
        auto* record = reinterpret_cast<Data*>(output->readPointer());
        if (record->mType == Data::TYPE_VIDEO_FRAME) {
            auto* frame = static_cast<VideoFrameData*>(record);
            run.video.push_back({frame->mPTS, frame->mColorFormat, frame->mFlag, frame->mCropWidth,
                                 frame->mCropHeight});
            frame->mListener->renderFrame(true, *frame);
        } else if (record->mType == Data::TYPE_AUDIO_FRAGMENT) {
            auto* fragment = static_cast<AudioFragmentData*>(record);
            const uint32_t bytes = fragment->mSize - AudioFragmentData::kHeaderSize;
            run.audio.push_back(
                {fragment->mPTS, fragment->mNumberChannels, fragment->mSamplingRate, bytes});
            const auto* pcm =
                reinterpret_cast<const uint8_t*>(fragment) + AudioFragmentData::kHeaderSize;
            run.pcm.insert(run.pcm.end(), pcm, pcm + bytes);
        }
        output->consume(record->mSize);
    }
    feeder.join();
    run.resolutions = listener.snapshot();
    if (codec != nullptr) {
        run.rejectedUnits = codec->rejectedUnits();
        run.configInputs = codec->configInputs();
        run.heldOutputBuffers = codec->clientOutputBuffers();
    }
    run.stopResult = decoder->stop();
    parser->stop();
    return run;
}

std::vector<FramemdLine> ffmpegFramemd5(const std::string& path) {
    const std::string text =
        runCommand("ffmpeg -v error -copyts -i '" + path +
                   "' -map 0:v:0 -pix_fmt nv12 -vsync passthrough -enc_time_base -1 -f framemd5 -")
            .out;
    std::vector<FramemdLine> lines;
    std::istringstream in(text);
    std::string line;
    // "stream, dts, pts, duration, size, hash" per frame; the header lines start with '#'.
    while (std::getline(in, line)) {
        long long pts = 0;
        char md5[64] = {};
        if (sscanf(line.c_str(), "0, %*d, %lld, %*d, %*d, %63s", &pts, md5) == 2)
            lines.push_back({pts, md5});
    }
    return lines;
}

std::vector<uint8_t> ffmpegPcm(const std::string& path, const std::string& format) {
    const std::string pcm = runCommand("ffmpeg -v error " + (format.empty() ? "" : "-f " + format) +
                                       " -i '" + path + "' -map 0:a:0 -f s16le -acodec pcm_s16le -")
                                .out;
    return std::vector<uint8_t>(pcm.begin(), pcm.end());
}

}  // namespace TavoPlayer::test
