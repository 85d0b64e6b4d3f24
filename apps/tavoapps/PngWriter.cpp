#include "tavoapps/PngWriter.h"

#include <cstdio>
#include <cstring>
#include <memory>

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavutil/frame.h>
#include <libswscale/swscale.h>
}

namespace tavoapps {

namespace {

struct CodecContextFree {
    void operator()(AVCodecContext* c) const { avcodec_free_context(&c); }
};
struct FrameFree {
    void operator()(AVFrame* f) const { av_frame_free(&f); }
};
struct PacketFree {
    void operator()(AVPacket* p) const { av_packet_free(&p); }
};

}  // namespace

std::string writeArgbPng(const std::string& path, const uint8_t* pixels, int srcWidth,
                         int srcHeight, int width, int height) {
    if (pixels == nullptr || srcWidth <= 0 || srcHeight <= 0 || width <= 0 || height <= 0)
        return "empty frame";
    const AVCodec* codec = avcodec_find_encoder(AV_CODEC_ID_PNG);
    if (codec == nullptr)
        return "FFmpeg has no PNG encoder";
    std::unique_ptr<AVCodecContext, CodecContextFree> ctx(avcodec_alloc_context3(codec));
    std::unique_ptr<AVFrame, FrameFree> frame(av_frame_alloc());
    std::unique_ptr<AVPacket, PacketFree> packet(av_packet_alloc());
    if (!ctx || !frame || !packet)
        return "out of memory";
    ctx->width = width;
    ctx->height = height;
    ctx->pix_fmt = AV_PIX_FMT_RGB24;
    ctx->time_base = AVRational{1, 25};
    if (avcodec_open2(ctx.get(), codec, nullptr) < 0)
        return "cannot open the PNG encoder";
    frame->format = AV_PIX_FMT_RGB24;
    frame->width = width;
    frame->height = height;
    if (av_frame_get_buffer(frame.get(), 0) < 0)
        return "out of memory";
    // 0xAARRGGBB in host order is B, G, R, A in memory on a little-endian host.
    const AVPixelFormat srcFormat =
        __BYTE_ORDER__ == __ORDER_LITTLE_ENDIAN__ ? AV_PIX_FMT_BGRA : AV_PIX_FMT_ARGB;
    SwsContext* sws = sws_getContext(srcWidth, srcHeight, srcFormat, width, height,
                                     AV_PIX_FMT_RGB24, SWS_BICUBIC, nullptr, nullptr, nullptr);
    if (sws == nullptr)
        return "cannot scale the frame";
    const uint8_t* srcPlanes[1] = {pixels};
    const int srcStrides[1] = {srcWidth * 4};
    sws_scale(sws, srcPlanes, srcStrides, 0, srcHeight, frame->data, frame->linesize);
    sws_freeContext(sws);
    if (avcodec_send_frame(ctx.get(), frame.get()) < 0 ||
        avcodec_receive_packet(ctx.get(), packet.get()) < 0)
        return "PNG encoding failed";
    FILE* out = std::fopen(path.c_str(), "wb");
    if (out == nullptr)
        return "cannot write " + path + ": " + std::strerror(errno);
    const bool written =
        std::fwrite(packet->data, 1, packet->size, out) == static_cast<size_t>(packet->size);
    const bool closed = std::fclose(out) == 0;
    return written && closed ? "" : "cannot write " + path;
}

}  // namespace tavoapps
