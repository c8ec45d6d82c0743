#include "platform/media/export/export_video_encoder.h"
#include "platform/media/core/decoder_setup.h"
#include "platform/media/core/frame_converter.h"

extern "C" {
#include <libavutil/opt.h>
#include <libavutil/pixdesc.h>
}

#include <algorithm>
#include <cstring>

namespace zaf::media::exportpipe {

namespace {

// x264 settings of a cut: visually lossless quality (crf 18) with the "veryfast" preset, a fair
// trade between speed and file size for movies that are re-cut interactively.
constexpr const char *kX264Preset = "veryfast";
constexpr const char *kX264Crf = "18";
// The stretches of a smart cut are short and few; the same quality at a faster preset keeps a trim
// close to the cost of a copy.
constexpr const char *kX264SplicePreset = "veryfast";
constexpr int kMaxConsecutiveDecodeErrors = 100;

bool encoderSupports(const AVCodec *codec, AVPixelFormat format)
{
    if (!codec->pix_fmts)
        return true;
    for (const AVPixelFormat *f = codec->pix_fmts; *f != AV_PIX_FMT_NONE; ++f) {
        if (*f == format)
            return true;
    }
    return false;
}

// The encoder's format for a source format it cannot take: 4:2:0 loses nothing of a subsampled
// source, but needs even sides, and would halve the colour of an RGB or 4:4:4 source.
AVPixelFormat fallbackFormat(AVPixelFormat source, int width, int height)
{
    const AVPixFmtDescriptor *descriptor = av_pix_fmt_desc_get(source);
    const bool fullChroma = descriptor && descriptor->log2_chroma_w == 0 && descriptor->log2_chroma_h == 0;
    return fullChroma || width % 2 || height % 2 ? AV_PIX_FMT_YUV444P : AV_PIX_FMT_YUV420P;
}

} // namespace

struct ExportVideoEncoder::Private {
    const AVStream *input = nullptr;
    ff::CodecContextPtr decoder;
    ff::CodecContextPtr encoder;
    FrameConverter converter;
    ff::AVFramePtr decoded = ff::makeFrame();
    ff::AVFramePtr pending = ff::makeFrame();   // the latest frame before the cut's start
    ff::AVFramePtr converted;
    ff::AVPacketPtr encoded = ff::makePacket();
    PacketWriter writer;
    int outputIndex = -1;
    std::int64_t startPts = 0, endPts = 0;      // in the input's time base
    std::int64_t lastOutputPts = AV_NOPTS_VALUE;
    bool spliceMode = false;
    bool hasPending = false;
    bool emittedAny = false;
    bool pastEnd = false;
    int consecutiveErrors = 0;

    StageResult handleFrame(AVFrame *frame);
    StageResult emit(AVFrame *frame, std::int64_t sourcePts);
    StageResult encode(AVFrame *frame);
    StageResult decode(const AVPacket *packet);
};

ExportVideoEncoder::ExportVideoEncoder()
    : d(std::make_unique<Private>())
{
}

ExportVideoEncoder::~ExportVideoEncoder() = default;

std::unique_ptr<ExportVideoEncoder> ExportVideoEncoder::create(const Options &options, AVFormatContext *output,
                                                               PacketWriter writer, Error *error)
{
    std::unique_ptr<ExportVideoEncoder> stage(new ExportVideoEncoder);
    Private &p = *stage->d;
    auto failed = [&](const Error &e) {
        *error = e;
        return std::unique_ptr<ExportVideoEncoder>();
    };
    const AVStream *in = options.input;
    const AVCodecParameters *par = in->codecpar;
    p.input = in;
    p.writer = std::move(writer);
    p.startPts = av_rescale_q(options.startMicros, AV_TIME_BASE_Q, in->time_base);
    p.endPts = av_rescale_q(options.endMicros, AV_TIME_BASE_Q, in->time_base);
    QString decoderError;
    p.decoder = media::openDecoder(in, DecoderOptions{0, FF_THREAD_FRAME | FF_THREAD_SLICE}, &decoderError);
    if (!p.decoder)
        return failed(stageError(kMediaErrorDecodeFailed, decoderError));

    const AVCodec *codec = avcodec_find_encoder_by_name("libx264");
    if (!codec)
        return failed(stageError(kMediaErrorEncodeFailed, QStringLiteral("no H.264 encoder (libx264)")));
    p.encoder.reset(avcodec_alloc_context3(codec));
    if (!p.encoder)
        return failed(stageError(kMediaErrorUnknown, QStringLiteral("out of memory")));
    AVCodecContext *enc = p.encoder.get();
    const AVPixelFormat sourceFormat = AVPixelFormat(par->format);
    const bool sourceFormatFits = sourceFormat != AV_PIX_FMT_NONE && encoderSupports(codec, sourceFormat);
    p.spliceMode = options.splice.has_value();
    if (p.spliceMode && (!sourceFormatFits || !spliceProfile(par)))
        return failed(stageError(kMediaErrorEncodeFailed, QStringLiteral("the H.264 encoder cannot reproduce the source's format")));
    enc->pix_fmt = sourceFormatFits ? sourceFormat : fallbackFormat(sourceFormat, par->width, par->height);
    enc->width = par->width;
    enc->height = par->height;
    enc->sample_aspect_ratio = par->sample_aspect_ratio;
    enc->color_range = par->color_range;
    enc->color_primaries = par->color_primaries;
    enc->color_trc = par->color_trc;
    enc->colorspace = par->color_space;
    if (enc->pix_fmt != sourceFormat && isRgbFormat(sourceFormat)) {
        // Converted to YUV on the way in: the stream says which matrix made it.
        enc->colorspace = kYuvFromRgbColorspace;
        enc->color_range = kYuvFromRgbRange;
    }
    enc->chroma_sample_location = par->chroma_location;
    enc->time_base = in->time_base;
    AVRational rate = in->avg_frame_rate.num > 0 && in->avg_frame_rate.den > 0 ? in->avg_frame_rate : in->r_frame_rate;
    if (rate.num > 0 && rate.den > 0)
        enc->framerate = rate;
    enc->thread_count = 0; // x264 picks its own thread count
    ff::Dictionary opts;
    opts.set("crf", kX264Crf);
    if (p.spliceMode) {
        // Parameter sets go into the sample description (never in-band) under an id the source does
        // not use; the first picture is an IDR; without B-frames every decode timestamp can be placed
        // between the copied pictures'.
        enc->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
        enc->max_b_frames = 0;
        enc->level = par->level;
        opts.set("preset", kX264SplicePreset);
        opts.set("profile", spliceProfile(par));
        opts.set("x264-params", QStringLiteral("sps-id=%1").arg(options.splice->parameterSetId).toLatin1().constData());
    } else {
        if (output->oformat->flags & AVFMT_GLOBALHEADER)
            enc->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
        opts.set("preset", kX264Preset);
    }
    int rc = avcodec_open2(enc, codec, opts.address());
    if (rc < 0)
        return failed(stageError(kMediaErrorEncodeFailed, QStringLiteral("cannot open the H.264 encoder"), rc));
    if (p.spliceMode) {
        p.outputIndex = options.splice->outputIndex;
        return stage;
    }

    AVStream *stream = avformat_new_stream(output, nullptr);
    if (!stream)
        return failed(stageError(kMediaErrorUnknown, QStringLiteral("out of memory")));
    rc = avcodec_parameters_from_context(stream->codecpar, enc);
    if (rc < 0)
        return failed(stageError(kMediaErrorEncodeFailed, QStringLiteral("video stream parameters"), rc));
    stream->time_base = enc->time_base;
    stream->avg_frame_rate = enc->framerate;
    stream->sample_aspect_ratio = enc->sample_aspect_ratio;
    // The rotation of the source stays a property of the stream, as in the source.
    size_t matrixSize = 0;
    if (const uint8_t *matrix = av_stream_get_side_data(in, AV_PKT_DATA_DISPLAYMATRIX, &matrixSize)) {
        if (uint8_t *copy = av_stream_new_side_data(stream, AV_PKT_DATA_DISPLAYMATRIX, matrixSize))
            std::memcpy(copy, matrix, matrixSize);
    }
    p.outputIndex = stream->index;
    return stage;
}

const char *ExportVideoEncoder::spliceProfile(const AVCodecParameters *source)
{
    switch (source->profile) {
    case FF_PROFILE_H264_BASELINE:
    case FF_PROFILE_H264_CONSTRAINED_BASELINE:
        return "baseline";
    case FF_PROFILE_H264_MAIN:
        return "main";
    case FF_PROFILE_H264_HIGH:
        return "high";
    case FF_PROFILE_H264_HIGH_10:
        return "high10";
    case FF_PROFILE_H264_HIGH_422:
        return "high422";
    case FF_PROFILE_H264_HIGH_444_PREDICTIVE:
        return "high444";
    default:
        return nullptr; // extended, intra-only and the rest: x264 does not write them
    }
}

void ExportVideoEncoder::endBefore(std::int64_t sourcePts)
{
    d->endPts = std::min(d->endPts, sourcePts);
}

QByteArray ExportVideoEncoder::parameterSets() const
{
    const AVCodecContext *enc = d->encoder.get();
    return QByteArray(reinterpret_cast<const char *>(enc->extradata), enc->extradata_size);
}

int ExportVideoEncoder::sourceStreamIndex() const
{
    return d->input->index;
}

bool ExportVideoEncoder::isPastEnd() const
{
    return d->pastEnd;
}

double ExportVideoEncoder::encodedSeconds() const
{
    return d->lastOutputPts == AV_NOPTS_VALUE ? 0.0 : d->lastOutputPts * av_q2d(d->input->time_base);
}

StageResult ExportVideoEncoder::Private::encode(AVFrame *frame)
{
    int rc = avcodec_send_frame(encoder.get(), frame);
    if (rc < 0 && rc != AVERROR_EOF)
        return stageError(kMediaErrorEncodeFailed, QStringLiteral("H.264 encoding"), rc);
    for (;;) {
        rc = avcodec_receive_packet(encoder.get(), encoded.get());
        if (rc == AVERROR(EAGAIN) || rc == AVERROR_EOF)
            return std::nullopt;
        if (rc < 0)
            return stageError(kMediaErrorEncodeFailed, QStringLiteral("H.264 encoding"), rc);
        rc = writer(encoded.get(), encoder->time_base, outputIndex);
        av_packet_unref(encoded.get());
        if (rc < 0)
            return writeError(QStringLiteral("writing video"), rc);
    }
}

StageResult ExportVideoEncoder::Private::emit(AVFrame *frame, std::int64_t sourcePts)
{
    const std::int64_t pts = sourcePts - startPts;
    if (lastOutputPts != AV_NOPTS_VALUE && pts <= lastOutputPts)
        return std::nullopt; // a repeated or out-of-order timestamp: the frame cannot be placed
    AVFrame *toEncode = frame;
    if (frame->format != encoder->pix_fmt || frame->width != encoder->width || frame->height != encoder->height) {
        converted = converter.convert(frame, QSize(encoder->width, encoder->height), encoder->pix_fmt, SWS_BICUBIC);
        if (!converted)
            return stageError(kMediaErrorEncodeFailed, QStringLiteral("no conversion of a %1x%2 picture from pixel format %3")
                                                          .arg(frame->width).arg(frame->height)
                                                          .arg(QString::fromLatin1(av_get_pix_fmt_name(AVPixelFormat(frame->format)))));
        toEncode = converted.get();
    }
    toEncode->pts = pts;
    toEncode->pict_type = AV_PICTURE_TYPE_NONE;
    lastOutputPts = pts;
    emittedAny = true;
    return encode(toEncode);
}

StageResult ExportVideoEncoder::Private::handleFrame(AVFrame *frame)
{
    const std::int64_t pts = frame->best_effort_timestamp;
    if (pts == AV_NOPTS_VALUE || pastEnd)
        return std::nullopt;
    if (pts < startPts) {
        // Shown before the start; it becomes the first frame if the next one starts after it.
        av_frame_unref(pending.get());
        av_frame_move_ref(pending.get(), frame);
        pending->best_effort_timestamp = pts;
        hasPending = true;
        return std::nullopt;
    }
    if (hasPending) {
        hasPending = false;
        if (pts > startPts && !emittedAny) {
            StageResult r = emit(pending.get(), startPts);
            av_frame_unref(pending.get());
            if (r)
                return r;
        }
        av_frame_unref(pending.get());
    }
    if (pts >= endPts) {
        pastEnd = true;
        return std::nullopt;
    }
    return emit(frame, pts);
}

StageResult ExportVideoEncoder::Private::decode(const AVPacket *packet)
{
    int rc = avcodec_send_packet(decoder.get(), packet);
    if (rc == AVERROR_INVALIDDATA) {
        if (++consecutiveErrors > kMaxConsecutiveDecodeErrors)
            return stageError(kMediaErrorDecodeFailed, QStringLiteral("the video cannot be decoded"), rc);
        return std::nullopt;
    }
    if (rc < 0 && rc != AVERROR_EOF)
        return stageError(kMediaErrorDecodeFailed, QStringLiteral("video decoding"), rc);
    for (;;) {
        rc = avcodec_receive_frame(decoder.get(), decoded.get());
        if (rc == AVERROR(EAGAIN) || rc == AVERROR_EOF)
            return std::nullopt;
        if (rc == AVERROR_INVALIDDATA) {
            if (++consecutiveErrors > kMaxConsecutiveDecodeErrors)
                return stageError(kMediaErrorDecodeFailed, QStringLiteral("the video cannot be decoded"), rc);
            continue;
        }
        if (rc < 0)
            return stageError(kMediaErrorDecodeFailed, QStringLiteral("video decoding"), rc);
        consecutiveErrors = 0;
        StageResult r = handleFrame(decoded.get());
        av_frame_unref(decoded.get());
        if (r)
            return r;
    }
}

StageResult ExportVideoEncoder::sendPacket(const AVPacket *packet)
{
    if (d->pastEnd)
        return std::nullopt;
    return d->decode(packet);
}

StageResult ExportVideoEncoder::finish()
{
    if (!d->pastEnd) {
        if (StageResult r = d->decode(nullptr))
            return r;
    }
    // A cut that starts on the last frame: that frame is the only one shown in the range.
    if (d->hasPending && !d->emittedAny && d->startPts < d->endPts) {
        d->hasPending = false;
        if (StageResult r = d->emit(d->pending.get(), d->startPts))
            return r;
    }
    if (!d->emittedAny && !d->spliceMode)
        return stageError(kMediaErrorDecodeFailed, QStringLiteral("no video frame in the range"));
    return d->encode(nullptr);
}

} // namespace zaf::media::exportpipe
