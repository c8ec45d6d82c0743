#include "platform/media/core/decoder_setup.h"

namespace zaf::media {

ff::CodecContextPtr openDecoder(const AVStream *stream, const DecoderOptions &options, QString *error)
{
    const AVCodecParameters *par = stream->codecpar;
    const QString kind = QString::fromLatin1(av_get_media_type_string(par->codec_type) ? av_get_media_type_string(par->codec_type) : "unknown");
    if (par->codec_type == AVMEDIA_TYPE_VIDEO
        && (par->width <= 0 || par->height <= 0 || std::int64_t(par->width) * par->height > options.maxPixels)) {
        *error = QStringLiteral("video stream %1 has an unusable size %2x%3").arg(stream->index).arg(par->width).arg(par->height);
        return {};
    }
    const AVCodec *codec = avcodec_find_decoder(par->codec_id);
    if (!codec) {
        *error = QStringLiteral("no decoder for %1 codec %2").arg(kind, QString::fromLatin1(avcodec_get_name(par->codec_id)));
        return {};
    }
    ff::CodecContextPtr context(avcodec_alloc_context3(codec));
    if (!context) {
        *error = QStringLiteral("out of memory");
        return {};
    }
    int rc = avcodec_parameters_to_context(context.get(), par);
    if (rc < 0) {
        *error = QStringLiteral("bad %1 decoder parameters: %2").arg(kind, ff::errorString(rc));
        return {};
    }
    context->pkt_timebase = stream->time_base;
    context->max_pixels = options.maxPixels;
    context->thread_count = options.threadCount;
    if (options.errorRecognition != 0)
        context->err_recognition = options.errorRecognition;
    if (options.threadType != 0)
        context->thread_type = options.threadType;
    rc = avcodec_open2(context.get(), codec, nullptr);
    if (rc < 0) {
        *error = QStringLiteral("cannot open the %1 decoder: %2").arg(kind, ff::errorString(rc));
        return {};
    }
    return context;
}

} // namespace zaf::media
