#include "platform/media/playback_input.h"

namespace zaf::media::playback {

namespace {

int interruptWhenCancelled(void *opaque)
{
    return static_cast<const std::atomic<bool> *>(opaque)->load(std::memory_order_relaxed) ? 1 : 0;
}

} // namespace

ff::InputFormatContextPtr openInput(const QString &path, const std::atomic<bool> *cancel, QString *error)
{
    AVFormatContext *raw = avformat_alloc_context();
    if (!raw) {
        *error = QStringLiteral("out of memory");
        return {};
    }
    raw->interrupt_callback.callback = &interruptWhenCancelled;
    raw->interrupt_callback.opaque = const_cast<std::atomic<bool> *>(cancel);
    // avformat_open_input frees the context itself when it fails.
    int rc = avformat_open_input(&raw, path.toUtf8().constData(), nullptr, nullptr);
    if (rc < 0) {
        *error = ff::errorString(rc);
        return {};
    }
    ff::InputFormatContextPtr format(raw);
    rc = avformat_find_stream_info(format.get(), nullptr);
    if (rc < 0) {
        *error = ff::errorString(rc);
        return {};
    }
    return format;
}

ff::CodecContextPtr openDecoder(const AVStream *stream, QString *error)
{
    const AVCodec *codec = avcodec_find_decoder(stream->codecpar->codec_id);
    if (!codec) {
        *error = QStringLiteral("no decoder for %1").arg(QString::fromUtf8(avcodec_get_name(stream->codecpar->codec_id)));
        return {};
    }
    ff::CodecContextPtr context(avcodec_alloc_context3(codec));
    if (!context) {
        *error = QStringLiteral("out of memory");
        return {};
    }
    int rc = avcodec_parameters_to_context(context.get(), stream->codecpar);
    if (rc < 0) {
        *error = ff::errorString(rc);
        return {};
    }
    context->pkt_timebase = stream->time_base;
    context->max_pixels = ff::kMaxPixels;
    context->thread_count = 2;
    rc = avcodec_open2(context.get(), codec, nullptr);
    if (rc < 0) {
        *error = ff::errorString(rc);
        return {};
    }
    return context;
}

double containerStartSeconds(const AVFormatContext *format)
{
    if (!format || format->start_time == AV_NOPTS_VALUE)
        return 0;
    return double(format->start_time) / AV_TIME_BASE;
}

} // namespace zaf::media::playback
