#pragma once

// RAII holders for FFmpeg objects, declared once. Private to platform/media: include it from .cpp
// files of this folder only. No raw av_*_free anywhere else.

extern "C" {
#include <libavcodec/avcodec.h>
#include <libavfilter/avfilter.h>
#include <libavformat/avformat.h>
#include <libavutil/frame.h>
#include <libswresample/swresample.h>
#include <libswscale/swscale.h>
}

#include <QString>

#include <memory>

namespace zaf::media::ff {

struct InputFormatDeleter {
    void operator()(AVFormatContext *c) const { avformat_close_input(&c); }
};
struct OutputFormatDeleter {
    void operator()(AVFormatContext *c) const
    {
        if (!c)
            return;
        if (c->pb && !(c->oformat->flags & AVFMT_NOFILE))
            avio_closep(&c->pb);
        avformat_free_context(c);
    }
};
struct CodecContextDeleter {
    void operator()(AVCodecContext *c) const { avcodec_free_context(&c); }
};
struct FrameDeleter {
    void operator()(AVFrame *f) const { av_frame_free(&f); }
};
struct PacketDeleter {
    void operator()(AVPacket *p) const { av_packet_free(&p); }
};
struct SwsContextDeleter {
    void operator()(SwsContext *c) const { sws_freeContext(c); }
};
struct SwrContextDeleter {
    void operator()(SwrContext *c) const { swr_free(&c); }
};
struct FilterGraphDeleter {
    void operator()(AVFilterGraph *g) const { avfilter_graph_free(&g); }
};
struct FilterInOutDeleter {
    void operator()(AVFilterInOut *io) const { avfilter_inout_free(&io); }
};

using InputFormatContextPtr = std::unique_ptr<AVFormatContext, InputFormatDeleter>;
using OutputFormatContextPtr = std::unique_ptr<AVFormatContext, OutputFormatDeleter>;
using CodecContextPtr = std::unique_ptr<AVCodecContext, CodecContextDeleter>;
using AVFramePtr = std::unique_ptr<AVFrame, FrameDeleter>;
using AVPacketPtr = std::unique_ptr<AVPacket, PacketDeleter>;
using SwsContextPtr = std::unique_ptr<SwsContext, SwsContextDeleter>;
using SwrContextPtr = std::unique_ptr<SwrContext, SwrContextDeleter>;
using FilterGraphPtr = std::unique_ptr<AVFilterGraph, FilterGraphDeleter>;
using FilterInOutPtr = std::unique_ptr<AVFilterInOut, FilterInOutDeleter>;

// An AVDictionary of options, freed with its holder. Pass address() where FFmpeg takes an
// AVDictionary ** (it may consume entries and leave the rest, which are freed here too).
class Dictionary {
public:
    Dictionary() = default;
    ~Dictionary() { av_dict_free(&m_dictionary); }
    Dictionary(const Dictionary &) = delete;
    Dictionary &operator=(const Dictionary &) = delete;

    // An AVERROR code or 0.
    int set(const char *key, const char *value) { return av_dict_set(&m_dictionary, key, value, 0); }
    AVDictionary *get() const { return m_dictionary; }
    AVDictionary **address() { return &m_dictionary; }

private:
    AVDictionary *m_dictionary = nullptr;
};

inline AVFramePtr makeFrame() { return AVFramePtr(av_frame_alloc()); }
inline AVPacketPtr makePacket() { return AVPacketPtr(av_packet_alloc()); }

// FFmpeg's text for an AVERROR code.
inline QString errorString(int averror)
{
    char buffer[AV_ERROR_MAX_STRING_SIZE] = {};
    av_strerror(averror, buffer, sizeof buffer);
    return QString::fromUtf8(buffer);
}

// Decoders never allocate frames larger than this many pixels (a corrupt header cannot make us
// allocate gigabytes): 8K UHD with room to spare.
inline constexpr int64_t kMaxPixels = int64_t(8192) * 8192;

} // namespace zaf::media::ff
