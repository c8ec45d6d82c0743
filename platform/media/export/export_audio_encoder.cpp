#include "platform/media/export/export_audio_encoder.h"
#include "platform/media/core/decoder_setup.h"

#include "platform/log.h"

extern "C" {
#include <libavfilter/buffersink.h>
#include <libavfilter/buffersrc.h>
#include <libavutil/channel_layout.h>
#include <libavutil/opt.h>
}

#include <vector>

namespace zaf::media::exportpipe {

namespace {

constexpr int kOutputSampleRate = 48000;
constexpr std::int64_t kOutputBitRate = 256000;
// Corrupt packets are skipped, but a stream that yields nothing but errors ends the export.
constexpr int kMaxConsecutiveDecodeErrors = 100;

QString channelLayoutText(const AVChannelLayout &layout)
{
    AVChannelLayout known{};
    if (layout.order == AV_CHANNEL_ORDER_UNSPEC || layout.nb_channels <= 0)
        av_channel_layout_default(&known, layout.nb_channels > 0 ? layout.nb_channels : 2);
    else
        av_channel_layout_copy(&known, &layout);
    char text[128] = {};
    av_channel_layout_describe(&known, text, sizeof text);
    av_channel_layout_uninit(&known);
    return QString::fromLatin1(text);
}

} // namespace

struct ExportAudioEncoder::Private {
    struct Input {
        const AVStream *stream = nullptr;
        ff::CodecContextPtr decoder;
        AVFilterContext *source = nullptr;   // owned by the graph
        std::int64_t endPts = AV_NOPTS_VALUE; // in the stream's time base
        bool pastEnd = false;
        int consecutiveErrors = 0;
    };
    std::vector<Input> inputs;
    ff::FilterGraphPtr graph;
    AVFilterContext *sink = nullptr;
    ff::CodecContextPtr encoder;
    ff::AVFramePtr decoded = ff::makeFrame();
    ff::AVFramePtr filtered = ff::makeFrame();
    ff::AVPacketPtr encoded = ff::makePacket();
    PacketWriter writer;
    int outputIndex = -1;
    bool hasCut = false;

    StageResult openDecoder(Input &input);
    StageResult buildGraph(const Options &options);
    StageResult decodeInto(Input &input, const AVPacket *packet);
    StageResult pullFiltered();
    StageResult encode(AVFrame *frame);
};

ExportAudioEncoder::ExportAudioEncoder()
    : d(std::make_unique<Private>())
{
}

ExportAudioEncoder::~ExportAudioEncoder() = default;

StageResult ExportAudioEncoder::Private::openDecoder(Input &input)
{
    QString error;
    input.decoder = media::openDecoder(input.stream, DecoderOptions{}, &error);
    if (!input.decoder)
        return stageError(kMediaErrorDecodeFailed, error);
    if (input.decoder->sample_rate <= 0 || input.decoder->sample_fmt == AV_SAMPLE_FMT_NONE)
        return stageError(kMediaErrorDecodeFailed, QStringLiteral("audio stream %1 has no usable format").arg(input.stream->index));
    return std::nullopt;
}

StageResult ExportAudioEncoder::Private::buildGraph(const Options &options)
{
    graph.reset(avfilter_graph_alloc());
    if (!graph)
        return stageError(kMediaErrorUnknown, QStringLiteral("out of memory"));
    graph->nb_threads = 1;

    // Each input: cut (in its own time base), shift so the cut starts at 0, resample to the output
    // rate and layout. Then either sum at unity gain and limit, or pass the one input through.
    QString description;
    for (std::size_t i = 0; i < inputs.size(); ++i) {
        Input &input = inputs[i];
        const AVCodecContext *dec = input.decoder.get();
        const AVRational tb = input.stream->time_base;
        const QString args = QStringLiteral("time_base=%1/%2:sample_rate=%3:sample_fmt=%4:channel_layout=%5")
                                 .arg(tb.num).arg(tb.den).arg(dec->sample_rate)
                                 .arg(QString::fromLatin1(av_get_sample_fmt_name(dec->sample_fmt)),
                                      channelLayoutText(dec->ch_layout));
        const QByteArray name = QStringLiteral("in%1").arg(i).toLatin1();
        int rc = avfilter_graph_create_filter(&input.source, avfilter_get_by_name("abuffer"), name.constData(),
                                              args.toLatin1().constData(), nullptr, graph.get());
        if (rc < 0)
            return stageError(kMediaErrorDecodeFailed, QStringLiteral("audio source filter (%1)").arg(args), rc);

        QString chain = QStringLiteral("[in%1]").arg(i);
        if (options.cut) {
            // atrim counts in samples whatever the stream's time base (a Matroska stream counts
            // milliseconds); asetpts works in the time base.
            const AVRational samples{1, dec->sample_rate};
            const std::int64_t start = av_rescale_q(options.cut->startMicros, AV_TIME_BASE_Q, tb);
            input.endPts = av_rescale_q(options.cut->endMicros, AV_TIME_BASE_Q, tb);
            chain += QStringLiteral("atrim=start_pts=%1:end_pts=%2,asetpts=PTS-%3,")
                         .arg(av_rescale_q(options.cut->startMicros, AV_TIME_BASE_Q, samples))
                         .arg(av_rescale_q(options.cut->endMicros, AV_TIME_BASE_Q, samples))
                         .arg(start);
        }
        chain += QStringLiteral("aresample=%1,aformat=sample_fmts=fltp:channel_layouts=stereo[a%2];")
                     .arg(kOutputSampleRate).arg(i);
        description += chain;
    }
    for (std::size_t i = 0; i < inputs.size(); ++i)
        description += QStringLiteral("[a%1]").arg(i);
    if (options.mix) {
        if (inputs.size() > 1)
            description += QStringLiteral("amix=inputs=%1:normalize=0:duration=longest:dropout_transition=0,").arg(inputs.size());
        // A look-ahead limiter a hair under full scale; its delay is compensated so the audio stays
        // in sync, and its automatic levelling is off so quiet passages keep unity gain.
        description += QStringLiteral("alimiter=limit=0.977:attack=5:release=50:level=0:latency=1,");
    }
    description += QStringLiteral("aformat=sample_fmts=fltp:sample_rates=%1:channel_layouts=stereo[out]").arg(kOutputSampleRate);

    int rc = avfilter_graph_create_filter(&sink, avfilter_get_by_name("abuffersink"), "out", nullptr, nullptr, graph.get());
    if (rc < 0)
        return stageError(kMediaErrorUnknown, QStringLiteral("audio sink filter"), rc);

    // Open ends of the description: the sources feed its [inN] labels, its [out] feeds the sink.
    AVFilterInOut *outputs = nullptr;
    for (std::size_t i = inputs.size(); i-- > 0;) {
        AVFilterInOut *io = avfilter_inout_alloc();
        if (!io) {
            avfilter_inout_free(&outputs);
            return stageError(kMediaErrorUnknown, QStringLiteral("out of memory"));
        }
        io->name = av_strdup(QStringLiteral("in%1").arg(i).toLatin1().constData());
        io->filter_ctx = inputs[i].source;
        io->pad_idx = 0;
        io->next = outputs;
        outputs = io;
    }
    ff::FilterInOutPtr outputList(outputs);
    ff::FilterInOutPtr inputList(avfilter_inout_alloc());
    if (!inputList)
        return stageError(kMediaErrorUnknown, QStringLiteral("out of memory"));
    inputList->name = av_strdup("out");
    inputList->filter_ctx = sink;
    inputList->pad_idx = 0;
    inputList->next = nullptr;

    AVFilterInOut *in = inputList.release(), *out = outputList.release();
    rc = avfilter_graph_parse_ptr(graph.get(), description.toLatin1().constData(), &in, &out, nullptr);
    inputList.reset(in);
    outputList.reset(out);
    if (rc < 0)
        return stageError(kMediaErrorUnknown, QStringLiteral("audio filter graph \"%1\"").arg(description), rc);
    rc = avfilter_graph_config(graph.get(), nullptr);
    if (rc < 0)
        return stageError(kMediaErrorUnknown, QStringLiteral("audio filter graph \"%1\"").arg(description), rc);
    zaf::log::info(lcExport(), QStringLiteral("audio graph %1").arg(description));
    return std::nullopt;
}

std::unique_ptr<ExportAudioEncoder> ExportAudioEncoder::create(const Options &options, AVFormatContext *output,
                                                               PacketWriter writer, Error *error)
{
    std::unique_ptr<ExportAudioEncoder> stage(new ExportAudioEncoder);
    Private &p = *stage->d;
    auto failed = [&](const Error &e) {
        *error = e;
        return std::unique_ptr<ExportAudioEncoder>();
    };
    if (options.inputs.isEmpty())
        return failed(stageError(kMediaErrorInvalidArgument, QStringLiteral("no audio input")));
    p.writer = std::move(writer);
    p.hasCut = options.cut.has_value();
    for (const AVStream *stream : options.inputs) {
        Private::Input input;
        input.stream = stream;
        if (StageResult r = p.openDecoder(input))
            return failed(*r);
        p.inputs.push_back(std::move(input));
    }

    const AVCodec *codec = avcodec_find_encoder_by_name("aac");
    if (!codec)
        return failed(stageError(kMediaErrorEncodeFailed, QStringLiteral("no AAC encoder")));
    p.encoder.reset(avcodec_alloc_context3(codec));
    if (!p.encoder)
        return failed(stageError(kMediaErrorUnknown, QStringLiteral("out of memory")));
    AVCodecContext *enc = p.encoder.get();
    enc->sample_fmt = AV_SAMPLE_FMT_FLTP;
    enc->sample_rate = kOutputSampleRate;
    av_channel_layout_default(&enc->ch_layout, 2);
    enc->bit_rate = kOutputBitRate;
    enc->time_base = AVRational{1, kOutputSampleRate};
    if (output->oformat->flags & AVFMT_GLOBALHEADER)
        enc->flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
    int rc = avcodec_open2(enc, codec, nullptr);
    if (rc < 0)
        return failed(stageError(kMediaErrorEncodeFailed, QStringLiteral("cannot open the AAC encoder"), rc));

    if (StageResult r = p.buildGraph(options))
        return failed(*r);
    av_buffersink_set_frame_size(p.sink, enc->frame_size);

    AVStream *stream = avformat_new_stream(output, nullptr);
    if (!stream)
        return failed(stageError(kMediaErrorUnknown, QStringLiteral("out of memory")));
    rc = avcodec_parameters_from_context(stream->codecpar, enc);
    if (rc < 0)
        return failed(stageError(kMediaErrorEncodeFailed, QStringLiteral("audio stream parameters"), rc));
    stream->time_base = enc->time_base;
    p.outputIndex = stream->index;
    return stage;
}

bool ExportAudioEncoder::handlesStream(int sourceStreamIndex) const
{
    for (const auto &input : d->inputs) {
        if (input.stream->index == sourceStreamIndex)
            return true;
    }
    return false;
}

bool ExportAudioEncoder::isPastEnd() const
{
    if (!d->hasCut)
        return false;
    for (const auto &input : d->inputs) {
        if (!input.pastEnd)
            return false;
    }
    return true;
}

StageResult ExportAudioEncoder::Private::encode(AVFrame *frame)
{
    int rc = avcodec_send_frame(encoder.get(), frame);
    if (rc < 0 && rc != AVERROR_EOF)
        return stageError(kMediaErrorEncodeFailed, QStringLiteral("AAC encoding"), rc);
    for (;;) {
        rc = avcodec_receive_packet(encoder.get(), encoded.get());
        if (rc == AVERROR(EAGAIN) || rc == AVERROR_EOF)
            return std::nullopt;
        if (rc < 0)
            return stageError(kMediaErrorEncodeFailed, QStringLiteral("AAC encoding"), rc);
        rc = writer(encoded.get(), encoder->time_base, outputIndex);
        av_packet_unref(encoded.get());
        if (rc < 0)
            return writeError(QStringLiteral("writing audio"), rc);
    }
}

StageResult ExportAudioEncoder::Private::pullFiltered()
{
    for (;;) {
        int rc = av_buffersink_get_frame(sink, filtered.get());
        if (rc == AVERROR(EAGAIN) || rc == AVERROR_EOF)
            return std::nullopt;
        if (rc < 0)
            return stageError(kMediaErrorUnknown, QStringLiteral("audio filtering"), rc);
        if (filtered->pts != AV_NOPTS_VALUE)
            filtered->pts = av_rescale_q(filtered->pts, av_buffersink_get_time_base(sink), encoder->time_base);
        StageResult r = encode(filtered.get());
        av_frame_unref(filtered.get());
        if (r)
            return r;
    }
}

StageResult ExportAudioEncoder::Private::decodeInto(Input &input, const AVPacket *packet)
{
    int rc = avcodec_send_packet(input.decoder.get(), packet);
    if (rc == AVERROR_INVALIDDATA) {
        if (++input.consecutiveErrors > kMaxConsecutiveDecodeErrors)
            return stageError(kMediaErrorDecodeFailed, QStringLiteral("audio stream %1 cannot be decoded").arg(input.stream->index), rc);
        return std::nullopt;
    }
    if (rc < 0 && rc != AVERROR_EOF)
        return stageError(kMediaErrorDecodeFailed, QStringLiteral("audio decoding"), rc);
    for (;;) {
        rc = avcodec_receive_frame(input.decoder.get(), decoded.get());
        if (rc == AVERROR(EAGAIN) || rc == AVERROR_EOF)
            break;
        if (rc == AVERROR_INVALIDDATA) {
            if (++input.consecutiveErrors > kMaxConsecutiveDecodeErrors)
                return stageError(kMediaErrorDecodeFailed, QStringLiteral("audio stream %1 cannot be decoded").arg(input.stream->index), rc);
            continue;
        }
        if (rc < 0)
            return stageError(kMediaErrorDecodeFailed, QStringLiteral("audio decoding"), rc);
        input.consecutiveErrors = 0;
        decoded->pts = decoded->best_effort_timestamp;
        if (input.endPts != AV_NOPTS_VALUE && decoded->pts != AV_NOPTS_VALUE && decoded->pts >= input.endPts)
            input.pastEnd = true;
        if (input.pastEnd && hasCut) {
            av_frame_unref(decoded.get());
            continue; // nothing past the cut reaches the graph
        }
        rc = av_buffersrc_add_frame_flags(input.source, decoded.get(), 0);
        av_frame_unref(decoded.get());
        if (rc < 0)
            return stageError(kMediaErrorDecodeFailed, QStringLiteral("audio stream %1 changed format").arg(input.stream->index), rc);
    }
    return pullFiltered();
}

StageResult ExportAudioEncoder::sendPacket(const AVPacket *packet)
{
    for (auto &input : d->inputs) {
        if (input.stream->index == packet->stream_index)
            return input.pastEnd && d->hasCut ? std::nullopt : d->decodeInto(input, packet);
    }
    return std::nullopt;
}

StageResult ExportAudioEncoder::finish()
{
    for (auto &input : d->inputs) {
        if (StageResult r = d->decodeInto(input, nullptr))
            return r;
        int rc = av_buffersrc_add_frame_flags(input.source, nullptr, 0);
        if (rc < 0)
            return stageError(kMediaErrorUnknown, QStringLiteral("ending the audio input"), rc);
    }
    if (StageResult r = d->pullFiltered())
        return r;
    return d->encode(nullptr);
}

} // namespace zaf::media::exportpipe
