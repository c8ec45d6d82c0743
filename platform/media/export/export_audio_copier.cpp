#include "platform/media/export/export_audio_copier.h"

#include "platform/log.h"
#include "platform/media/export/stream_copy.h"

namespace zaf::media::exportpipe {

namespace {

// Samples in one AAC-LC frame, as stored in MPEG-4.
constexpr std::int64_t kAacFrameSamples = 1024;

// Removes every side data entry of `type` from `packet` (its other side data stays).
void removeSideData(AVPacket *packet, AVPacketSideDataType type)
{
    for (int i = 0; i < packet->side_data_elems;) {
        if (packet->side_data[i].type == type) {
            av_freep(&packet->side_data[i].data);
            packet->side_data[i] = packet->side_data[--packet->side_data_elems];
        } else {
            ++i;
        }
    }
    if (packet->side_data_elems == 0)
        av_freep(&packet->side_data);
}

} // namespace

struct ExportAudioCopier::Private {
    const AVStream *input = nullptr;
    PacketWriter writer;
    int outputIndex = -1;
    std::int64_t start = 0;                    // the cut, in samples (the stream's time base)
    std::int64_t end = 0;
    ff::AVPacketPtr preRoll = ff::makePacket(); // the latest packet ending at or before the start
    bool hasPreRoll = false;
    ff::AVPacketPtr out = ff::makePacket();
    bool started = false;
    bool pastEnd = false;
    std::int64_t writtenEnd = AV_NOPTS_VALUE;  // where the last packet written ends, in samples
    std::int64_t copied = 0;

    StageResult write(const AVPacket *packet, std::int64_t pts, std::int64_t duration);
};

ExportAudioCopier::ExportAudioCopier()
    : d(std::make_unique<Private>())
{
}

ExportAudioCopier::~ExportAudioCopier() = default;

std::optional<QString> ExportAudioCopier::whyNotCopyable(const Options &options)
{
    const AVStream *in = options.input;
    const AVCodecParameters *par = in->codecpar;
    if (par->codec_id != AV_CODEC_ID_AAC)
        return QStringLiteral("its codec is %1, not AAC").arg(QString::fromLatin1(avcodec_get_name(par->codec_id)));
    if (par->sample_rate <= 0 || par->ch_layout.nb_channels <= 0)
        return QStringLiteral("it has no known sample rate or channel count");
    // HE-AAC and the low-delay profiles have frames of other sizes; a source may leave the size
    // unset for plain AAC-LC.
    if (par->frame_size != kAacFrameSamples && !(par->frame_size == 0 && par->profile == FF_PROFILE_AAC_LOW))
        return QStringLiteral("its frames are not of %1 samples (profile %2, frame size %3)").arg(kAacFrameSamples).arg(par->profile).arg(par->frame_size);
    if (par->extradata_size < 2)
        return QStringLiteral("it has no decoder configuration");
    if (in->time_base.num != 1 || in->time_base.den != par->sample_rate)
        return QStringLiteral("its timestamps count %1/%2 s, not samples").arg(in->time_base.num).arg(in->time_base.den);

    // The packets from the pre-roll to the end, as the demuxer's index lists them, must follow each
    // other frame by frame: the copy keeps their timing as it is.
    AVStream *stream = const_cast<AVStream *>(in);
    const int count = avformat_index_get_entries_count(stream);
    if (count <= 0)
        return QStringLiteral("the source has no sample index for it");
    const std::int64_t start = av_rescale_q(options.startMicros, AV_TIME_BASE_Q, in->time_base);
    const std::int64_t end = av_rescale_q(options.endMicros, AV_TIME_BASE_Q, in->time_base);
    int first = av_index_search_timestamp(stream, start, AVSEEK_FLAG_BACKWARD | AVSEEK_FLAG_ANY);
    first = std::max(first - 1, 0); // the pre-roll
    const AVIndexEntry *previous = nullptr;
    for (int i = first; i < count; ++i) {
        const AVIndexEntry *entry = avformat_index_get_entry(stream, i);
        if (!entry || entry->timestamp == AV_NOPTS_VALUE)
            return QStringLiteral("a packet has no timestamp");
        if (entry->timestamp >= end || (previous && (entry->flags & AVINDEX_DISCARD_FRAME)))
            break;
        if (previous && entry->timestamp - previous->timestamp != kAacFrameSamples)
            return QStringLiteral("its packets at %1 and %2 are not one frame apart").arg(previous->timestamp).arg(entry->timestamp);
        previous = entry;
    }
    return std::nullopt;
}

std::unique_ptr<ExportAudioCopier> ExportAudioCopier::create(const Options &options, AVFormatContext *output,
                                                             PacketWriter writer, Error *error)
{
    std::unique_ptr<ExportAudioCopier> stage(new ExportAudioCopier);
    Private &p = *stage->d;
    p.input = options.input;
    p.writer = std::move(writer);
    p.start = av_rescale_q(options.startMicros, AV_TIME_BASE_Q, options.input->time_base);
    p.end = av_rescale_q(options.endMicros, AV_TIME_BASE_Q, options.input->time_base);
    AVStream *out = addStreamCopy(output, options.input, error);
    if (!out)
        return nullptr;
    // Timestamps count samples, so the cut and the edit list are exact to the sample.
    out->time_base = AVRational{1, options.input->codecpar->sample_rate};
    p.outputIndex = out->index;
    return stage;
}

bool ExportAudioCopier::handlesStream(int sourceStreamIndex) const
{
    return d->input->index == sourceStreamIndex;
}

bool ExportAudioCopier::isPastEnd() const
{
    return d->pastEnd;
}

StageResult ExportAudioCopier::Private::write(const AVPacket *packet, std::int64_t pts, std::int64_t duration)
{
    if (writtenEnd != AV_NOPTS_VALUE && pts < writtenEnd) {
        zaf::log::info(lcExport(), QStringLiteral("audio stream %1: a packet at %2 overlaps the one before; dropped").arg(input->index).arg(pts));
        return std::nullopt;
    }
    int rc = av_packet_ref(out.get(), packet);
    if (rc < 0)
        return stageError(kMediaErrorUnknown, QStringLiteral("out of memory"), rc);
    // The muxer's edit list does what the source's skip instruction did; the output's own edit
    // list starts the track at the cut.
    removeSideData(out.get(), AV_PKT_DATA_SKIP_SAMPLES);
    out->pts = out->dts = pts - start;
    out->duration = duration;
    out->flags &= ~AV_PKT_FLAG_DISCARD;
    rc = writer(out.get(), input->time_base, outputIndex);
    av_packet_unref(out.get());
    if (rc < 0)
        return writeError(QStringLiteral("writing audio"), rc);
    writtenEnd = pts + duration;
    ++copied;
    return std::nullopt;
}

StageResult ExportAudioCopier::sendPacket(const AVPacket *packet)
{
    if (packet->stream_index != d->input->index || d->pastEnd)
        return std::nullopt;
    std::int64_t pts = packet->pts != AV_NOPTS_VALUE ? packet->pts : packet->dts;
    if (pts == AV_NOPTS_VALUE) {
        if (d->writtenEnd == AV_NOPTS_VALUE)
            return std::nullopt; // nothing to place it after
        pts = d->writtenEnd;
    }
    std::int64_t duration = packet->duration > 0 ? packet->duration : kAacFrameSamples;

    if (!d->started) {
        if (pts + duration <= d->start) {
            av_packet_unref(d->preRoll.get());
            const int rc = av_packet_ref(d->preRoll.get(), packet);
            if (rc < 0)
                return stageError(kMediaErrorUnknown, QStringLiteral("out of memory"), rc);
            d->preRoll->pts = pts;
            d->preRoll->duration = duration;
            d->hasPreRoll = true;
            return std::nullopt;
        }
        d->started = true;
        // The frame before the start primes the decoder for the start's frame.
        if (d->hasPreRoll && d->preRoll->pts + d->preRoll->duration == pts) {
            if (StageResult r = d->write(d->preRoll.get(), d->preRoll->pts, d->preRoll->duration))
                return r;
        } else if (pts < d->start) {
            zaf::log::info(lcExport(), QStringLiteral("audio stream %1: no packet before the cut to prime the decoder").arg(d->input->index));
        }
        av_packet_unref(d->preRoll.get());
    } else if (packet->flags & AV_PKT_FLAG_DISCARD) {
        d->pastEnd = true; // past the end the source's own edit list shows
        return std::nullopt;
    }

    if (pts >= d->end) {
        d->pastEnd = true;
        return std::nullopt;
    }
    if (pts + duration >= d->end) {
        duration = d->end - pts; // the track, and its edit list, end at the cut
        d->pastEnd = true;
    }
    return d->write(packet, pts, duration);
}

StageResult ExportAudioCopier::finish()
{
    zaf::log::info(lcExport(), QStringLiteral("audio stream %1 cut by copying %2 packets").arg(d->input->index).arg(d->copied));
    return std::nullopt;
}

} // namespace zaf::media::exportpipe
