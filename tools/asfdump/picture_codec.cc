#include "picture_codec.h"

#include <cstdio>
#include <cstring>

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavutil/imgutils.h>
#include <libavutil/log.h>
#include <libswscale/swscale.h>
}

#include "codec_names.h"
#include "hova_codec.h"

namespace asfdump {

namespace {

struct CodecMap {
    int code;
    AVCodecID id;
};

// The host's video codes libavcodec decodes; WMVA is early VC-1 advanced profile.
constexpr CodecMap kCodecs[] = {
    {CLIP_VIDEO_TYPE_WMV1, AV_CODEC_ID_WMV1},     {CLIP_VIDEO_TYPE_WMV2, AV_CODEC_ID_WMV2},
    {CLIP_VIDEO_TYPE_WMV3, AV_CODEC_ID_WMV3},     {CLIP_VIDEO_TYPE_WMVA, AV_CODEC_ID_VC1},
    {CLIP_VIDEO_TYPE_WVC1, AV_CODEC_ID_VC1},      {CLIP_VIDEO_TYPE_MP41, AV_CODEC_ID_MSMPEG4V1},
    {CLIP_VIDEO_TYPE_MP42, AV_CODEC_ID_MSMPEG4V2}, {CLIP_VIDEO_TYPE_MP43, AV_CODEC_ID_MSMPEG4V3},
    {CLIP_VIDEO_TYPE_DIV3, AV_CODEC_ID_MSMPEG4V3}, {CLIP_VIDEO_TYPE_M4V, AV_CODEC_ID_MPEG4},
    {CLIP_VIDEO_TYPE_MP4S, AV_CODEC_ID_MPEG4},    {CLIP_VIDEO_TYPE_M4S2, AV_CODEC_ID_MPEG4},
    {CLIP_VIDEO_TYPE_DIVX, AV_CODEC_ID_MPEG4},    {CLIP_VIDEO_TYPE_DX50, AV_CODEC_ID_MPEG4},
    {CLIP_VIDEO_TYPE_H263, AV_CODEC_ID_H263},     {CLIP_VIDEO_TYPE_M263, AV_CODEC_ID_H263},
    {CLIP_VIDEO_TYPE_AVC1, AV_CODEC_ID_H264},     {CLIP_VIDEO_TYPE_HEVC, AV_CODEC_ID_HEVC},
    {CLIP_VIDEO_TYPE_MP2V, AV_CODEC_ID_MPEG2VIDEO}, {CLIP_VIDEO_TYPE_MJPG, AV_CODEC_ID_MJPEG},
    {CLIP_VIDEO_TYPE_FLV1, AV_CODEC_ID_FLV1},     {CLIP_VIDEO_TYPE_MSVC, AV_CODEC_ID_MSVIDEO1},
    {CLIP_VIDEO_TYPE_VP60, AV_CODEC_ID_VP6F},     {CLIP_VIDEO_TYPE_VP80, AV_CODEC_ID_VP8},
    {CLIP_VIDEO_TYPE_IV32, AV_CODEC_ID_INDEO3},   {CLIP_VIDEO_TYPE_IV41, AV_CODEC_ID_INDEO4},
    {CLIP_VIDEO_TYPE_DVSD, AV_CODEC_ID_DVVIDEO},  {CLIP_VIDEO_TYPE_MSS2, AV_CODEC_ID_MSS2},
};

AVCodecID codec_id(int code) {
    for (const CodecMap& m : kCodecs)
        if (m.code == code) return m.id;
    return AV_CODEC_ID_NONE;
}

}  // namespace

struct VideoDecoder::Impl {
    AVCodecContext* ctx = nullptr;
    AVPacket* packet = nullptr;
    AVFrame* frame = nullptr;

    ~Impl() {
        av_frame_free(&frame);
        av_packet_free(&packet);
        avcodec_free_context(&ctx);
    }
};

VideoDecoder::VideoDecoder(std::unique_ptr<Impl> impl) : impl_(std::move(impl)) {}
VideoDecoder::~VideoDecoder() = default;

std::unique_ptr<VideoDecoder> VideoDecoder::create(const uint8_t* record, size_t size, int width,
                                                   int height, std::string* error) {
    int32_t code = -1;
    if (size >= 4) std::memcpy(&code, record, 4);
    const AVCodec* codec = avcodec_find_decoder(codec_id(code));
    if (!codec) {
        *error = "no decoder for the video codec " + video_codec_name(code);
        return nullptr;
    }
    auto impl = std::make_unique<Impl>();
    impl->ctx = avcodec_alloc_context3(codec);
    impl->packet = av_packet_alloc();
    impl->frame = av_frame_alloc();
    if (!impl->ctx || !impl->packet || !impl->frame) {
        *error = "out of memory";
        return nullptr;
    }
    impl->ctx->width = impl->ctx->coded_width = width;
    impl->ctx->height = impl->ctx->coded_height = height;
    // One thread: pictures come out as soon as they are decoded, in order.
    impl->ctx->thread_count = 1;
    const size_t extra = size > 4 ? size - 4 : 0;
    if (extra > 0) {
        impl->ctx->extradata = static_cast<uint8_t*>(av_mallocz(extra + AV_INPUT_BUFFER_PADDING_SIZE));
        if (!impl->ctx->extradata) {
            *error = "out of memory";
            return nullptr;
        }
        std::memcpy(impl->ctx->extradata, record + 4, extra);
        impl->ctx->extradata_size = static_cast<int>(extra);
    }
    const int rc = avcodec_open2(impl->ctx, codec, nullptr);
    if (rc < 0) {
        char why[AV_ERROR_MAX_STRING_SIZE] = {};
        av_strerror(rc, why, sizeof why);
        *error = std::string("the ") + codec->name + " decoder refuses the stream: " + why;
        return nullptr;
    }
    return std::unique_ptr<VideoDecoder>(new VideoDecoder(std::move(impl)));
}

bool VideoDecoder::send(const uint8_t* bytes, size_t size, int64_t pts) {
    AVPacket* p = impl_->packet;
    if (av_new_packet(p, static_cast<int>(size)) < 0) return false;
    std::memcpy(p->data, bytes, size);
    // The frame's time stands as its decoding time: with reordering, a
    // picture is timed by the frame that brings it out, as ffmpeg times it.
    p->pts = AV_NOPTS_VALUE;
    p->dts = pts;
    const int rc = avcodec_send_packet(impl_->ctx, p);
    av_packet_unref(p);
    return rc >= 0;
}

void VideoDecoder::send_end() { avcodec_send_packet(impl_->ctx, nullptr); }

bool VideoDecoder::receive(int64_t* pts, bool* key) {
    if (avcodec_receive_frame(impl_->ctx, impl_->frame) < 0) return false;
    const AVFrame* f = impl_->frame;
    *pts = f->best_effort_timestamp;
    *key = f->key_frame != 0 || f->pict_type == AV_PICTURE_TYPE_I;
    return true;
}

void VideoDecoder::reset() { avcodec_flush_buffers(impl_->ctx); }

Image VideoDecoder::rgb(int width) const {
    const AVFrame* f = impl_->frame;
    Image out;
    out.width = width > 0 ? width : f->width;
    out.height = width > 0 ? static_cast<int>((static_cast<int64_t>(f->height) * width + f->width / 2) / f->width)
                           : f->height;
    if (out.height < 1) out.height = 1;
    // The scaler ffmpeg's command line uses by default, so that an unscaled
    // picture converts as `ffmpeg -frames:v 1 out.png` converts it.
    SwsContext* sws = sws_getContext(f->width, f->height, static_cast<AVPixelFormat>(f->format), out.width,
                                     out.height, AV_PIX_FMT_RGB24, SWS_BICUBIC, nullptr, nullptr, nullptr);
    // swscale's vector code writes whole blocks past a row's end: it scales
    // into a padded frame, whose rows are then copied out.
    AVFrame* dst = av_frame_alloc();
    bool ok = sws && dst;
    if (ok) {
        dst->format = AV_PIX_FMT_RGB24;
        dst->width = out.width;
        dst->height = out.height;
        ok = av_frame_get_buffer(dst, 0) >= 0 &&
             sws_scale(sws, f->data, f->linesize, 0, f->height, dst->data, dst->linesize) == out.height;
    }
    if (ok) {
        out.rgb.resize(static_cast<size_t>(out.width) * out.height * 3);
        for (int y = 0; y < out.height; ++y)
            std::memcpy(out.pixel(0, y), dst->data[0] + static_cast<ptrdiff_t>(y) * dst->linesize[0],
                        static_cast<size_t>(out.width) * 3);
    }
    av_frame_free(&dst);
    sws_freeContext(sws);
    if (!ok) return Image{};
    return out;
}

bool write_png(const Image& image, const std::string& path, std::string* error) {
    const AVCodec* codec = avcodec_find_encoder(AV_CODEC_ID_PNG);
    if (!codec) {
        *error = "libavcodec has no PNG encoder";
        return false;
    }
    AVCodecContext* ctx = avcodec_alloc_context3(codec);
    AVFrame* frame = av_frame_alloc();
    AVPacket* packet = av_packet_alloc();
    bool ok = ctx && frame && packet;
    if (ok) {
        ctx->width = frame->width = image.width;
        ctx->height = frame->height = image.height;
        ctx->pix_fmt = AV_PIX_FMT_RGB24;
        frame->format = AV_PIX_FMT_RGB24;
        ctx->time_base = AVRational{1, 1};
        ok = avcodec_open2(ctx, codec, nullptr) >= 0 && av_frame_get_buffer(frame, 0) >= 0;
    }
    if (ok) {
        for (int y = 0; y < image.height; ++y)
            std::memcpy(frame->data[0] + static_cast<ptrdiff_t>(y) * frame->linesize[0], image.pixel(0, y),
                        static_cast<size_t>(image.width) * 3);
        ok = avcodec_send_frame(ctx, frame) >= 0 && avcodec_receive_packet(ctx, packet) >= 0;
    }
    if (!ok) {
        *error = "the PNG encoder failed";
    } else if (FILE* f = std::fopen(path.c_str(), "wb")) {
        ok = std::fwrite(packet->data, 1, static_cast<size_t>(packet->size), f) == static_cast<size_t>(packet->size);
        ok = std::fclose(f) == 0 && ok;
        if (!ok) *error = "cannot write " + path;
    } else {
        ok = false;
        *error = "cannot write " + path;
    }
    av_packet_free(&packet);
    av_frame_free(&frame);
    avcodec_free_context(&ctx);
    return ok;
}

void set_codec_log(bool verbose) { av_log_set_level(verbose ? AV_LOG_INFO : AV_LOG_QUIET); }

}  // namespace asfdump
