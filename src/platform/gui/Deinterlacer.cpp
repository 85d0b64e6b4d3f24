#include "platform/gui/Deinterlacer.h"

#include <string>

extern "C" {
#include <libavfilter/avfilter.h>
#include <libavfilter/buffersink.h>
#include <libavfilter/buffersrc.h>
#include <libavutil/error.h>
#include <libavutil/frame.h>
#include <libavutil/mathematics.h>
}

#include "platform/os/SharedLibrary.h"
#include "platform/os/Trace.h"

namespace android {

namespace {

// libavfilter, opened when the first picture is deinterlaced (see SharedLibrary).
struct AvfilterLibrary {
    decltype(&::av_buffersink_get_frame) av_buffersink_get_frame;
    decltype(&::av_buffersink_get_time_base) av_buffersink_get_time_base;
    decltype(&::av_buffersrc_write_frame) av_buffersrc_write_frame;
    decltype(&::avfilter_get_by_name) avfilter_get_by_name;
    decltype(&::avfilter_graph_alloc) avfilter_graph_alloc;
    decltype(&::avfilter_graph_config) avfilter_graph_config;
    decltype(&::avfilter_graph_create_filter) avfilter_graph_create_filter;
    decltype(&::avfilter_graph_free) avfilter_graph_free;
    decltype(&::avfilter_graph_parse_ptr) avfilter_graph_parse_ptr;
    decltype(&::avfilter_inout_alloc) avfilter_inout_alloc;
    decltype(&::avfilter_inout_free) avfilter_inout_free;

    // The table, resolved once; nullptr when the library cannot be loaded (logged).
    static const AvfilterLibrary* get() {
        static const std::string soname =
            "libavfilter.so." + std::to_string(LIBAVFILTER_VERSION_MAJOR);
        return SharedLibrary::loadOnce<AvfilterLibrary>(
            soname.c_str(), [](void* handle, AvfilterLibrary& table) {
                return TAVO_RESOLVE(handle, table, av_buffersink_get_frame) &&
                       TAVO_RESOLVE(handle, table, av_buffersink_get_time_base) &&
                       TAVO_RESOLVE(handle, table, av_buffersrc_write_frame) &&
                       TAVO_RESOLVE(handle, table, avfilter_get_by_name) &&
                       TAVO_RESOLVE(handle, table, avfilter_graph_alloc) &&
                       TAVO_RESOLVE(handle, table, avfilter_graph_config) &&
                       TAVO_RESOLVE(handle, table, avfilter_graph_create_filter) &&
                       TAVO_RESOLVE(handle, table, avfilter_graph_free) &&
                       TAVO_RESOLVE(handle, table, avfilter_graph_parse_ptr) &&
                       TAVO_RESOLVE(handle, table, avfilter_inout_alloc) &&
                       TAVO_RESOLVE(handle, table, avfilter_inout_free);
            });
    }
};

// Only once get() has succeeded.
const AvfilterLibrary& libavfilter() {
    return *AvfilterLibrary::get();
}

std::string errorText(int status) {
    char text[AV_ERROR_MAX_STRING_SIZE] = {};
    av_strerror(status, text, sizeof(text));
    return text;
}

}  // namespace

Deinterlacer::Deinterlacer() : mOut(av_frame_alloc()) {}

Deinterlacer::~Deinterlacer() {
    release();
    av_frame_free(&mOut);
}

void Deinterlacer::release() {
    if (mGraph != nullptr)
        libavfilter().avfilter_graph_free(&mGraph);
    mSource = nullptr;
    mSink = nullptr;
}

bool Deinterlacer::configure(int32_t width, int32_t height, bool topFieldFirst) {
    release();
    if (AvfilterLibrary::get() == nullptr)
        return false;
    mGraph = libavfilter().avfilter_graph_alloc();
    if (mGraph == nullptr || mOut == nullptr)
        return false;
    // bwdif works on planar formats only, so the NV12 pictures are converted first.
    const std::string source = "video_size=" + std::to_string(width) + "x" +
                               std::to_string(height) +
                               ":pix_fmt=nv12:time_base=1/90000:pixel_aspect=1/1";
    const std::string filters = std::string("format=yuv420p,bwdif=mode=send_frame:parity=") +
                                (topFieldFirst ? "tff" : "bff") + ":deint=all";
    int status = libavfilter().avfilter_graph_create_filter(
        &mSource, libavfilter().avfilter_get_by_name("buffer"), "in", source.c_str(), nullptr,
        mGraph);
    if (status >= 0) {
        status = libavfilter().avfilter_graph_create_filter(
            &mSink, libavfilter().avfilter_get_by_name("buffersink"), "out", nullptr, nullptr,
            mGraph);
    }
    AVFilterInOut* outputs = libavfilter().avfilter_inout_alloc();
    AVFilterInOut* inputs = libavfilter().avfilter_inout_alloc();
    if (status >= 0 && (outputs == nullptr || inputs == nullptr))
        status = AVERROR(ENOMEM);
    if (status >= 0) {
        outputs->name = av_strdup("in");
        outputs->filter_ctx = mSource;
        inputs->name = av_strdup("out");
        inputs->filter_ctx = mSink;
        status = libavfilter().avfilter_graph_parse_ptr(mGraph, filters.c_str(), &inputs, &outputs,
                                                        nullptr);
    }
    libavfilter().avfilter_inout_free(&inputs);
    libavfilter().avfilter_inout_free(&outputs);
    if (status >= 0)
        status = libavfilter().avfilter_graph_config(mGraph, nullptr);
    if (status < 0) {
        TAVO_LOGE("%s: the bwdif deinterlacer cannot run: %s; pictures are shown as they are\n",
                  __func__, errorText(status).c_str());
        release();
        return false;
    }
    mWidth = width;
    mHeight = height;
    mTopFieldFirst = topFieldFirst;
    return true;
}

bool Deinterlacer::push(const SinkPicture& picture) {
    if (mFailed)
        return false;
    if (mGraph == nullptr || picture.width != mWidth || picture.height != mHeight ||
        picture.topFieldFirst != mTopFieldFirst) {
        if (!configure(picture.width, picture.height, picture.topFieldFirst)) {
            mFailed = true;
            return false;
        }
    }
    AVFrame* in = av_frame_alloc();
    if (in == nullptr)
        return false;
    in->width = picture.width;
    in->height = picture.height;
    in->format = AV_PIX_FMT_NV12;
    in->pts = static_cast<int64_t>(picture.pts90k);
    in->data[0] = const_cast<uint8_t*>(picture.y());
    in->linesize[0] = picture.lumaStride();
    in->data[1] = const_cast<uint8_t*>(picture.uv());
    in->linesize[1] = picture.chromaStride();
    in->interlaced_frame = 1;
    in->top_field_first = picture.topFieldFirst ? 1 : 0;
    // The frame holds no buffer references, so the source copies the planes.
    const int status = libavfilter().av_buffersrc_write_frame(mSource, in);
    av_frame_free(&in);
    if (status < 0) {
        TAVO_LOGW("%s: the deinterlacer refused a picture: %s\n", __func__,
                  errorText(status).c_str());
        return false;
    }
    return true;
}

const AVFrame* Deinterlacer::pull() {
    if (mGraph == nullptr)
        return nullptr;
    av_frame_unref(mOut);
    if (libavfilter().av_buffersink_get_frame(mSink, mOut) < 0)
        return nullptr;
    // bwdif halves the time base (it can make one picture per field): back to 90 kHz.
    mOut->pts = av_rescale_q(mOut->pts, libavfilter().av_buffersink_get_time_base(mSink),
                             AVRational{1, 90000});
    return mOut;
}

}  // namespace android
