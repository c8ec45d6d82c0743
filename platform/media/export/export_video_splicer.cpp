#include "platform/media/export/export_video_splicer.h"

#include "platform/media/export/export_video_encoder.h"
#include "platform/media/export/h264_bitstream.h"

#include <algorithm>
#include <vector>

namespace zaf::media::exportpipe {

namespace {

constexpr const char *kSpliceErrorDomain = "zaf.media.export.splice";
// A group held back to see whether it lies wholly inside the cut is given up (and re-encoded) past
// this size: a stream whose IDRs are that far apart gains nothing from a copy anyway.
constexpr qint64 kMaxHeldGroupBytes = qint64(256) << 20;
// Re-encoded packets wait for the decode-time shift until the first copied group fixes it; past
// this many, the source's own delay so far fixes it.
constexpr std::size_t kMaxWaitingPackets = 64;

ff::AVPacketPtr clonePacket(const AVPacket *packet)
{
    return ff::AVPacketPtr(av_packet_clone(packet));
}

} // namespace

Error spliceError(const QString &why)
{
    return Error{QString::fromLatin1(kSpliceErrorDomain), 1, why};
}

bool isSpliceError(const Error &error)
{
    return error.domain == QLatin1String(kSpliceErrorDomain);
}

struct ExportVideoSplicer::Private {
    Options options;
    AVStream *output = nullptr;
    PacketWriter writer;
    int lengthSize = 4;
    int parameterSetId = 0;
    QByteArray parameterSets;               // the encoder's, as every stretch must reproduce them
    std::int64_t startPts = 0, endPts = 0;  // the input's time base

    // The stretch being re-encoded: the head before any copy, the tail after.
    std::unique_ptr<ExportVideoEncoder> encoder;
    bool encoderIsTail = false;
    int encoderPackets = 0;                 // packets the current stretch has produced

    // A group starting at a clean IDR, held until it is known whether all of it is kept.
    std::vector<ff::AVPacketPtr> held;
    qint64 heldBytes = 0;
    bool heldIsCopyable = true;

    std::vector<ff::AVPacketPtr> waiting;   // re-encoded packets waiting for the decode-time shift
    std::optional<std::int64_t> dtsShift;
    std::int64_t largestSourceDelay = 0;
    std::int64_t lastDts = INT64_MIN;
    bool copiedAny = false;
    bool pastEnd = false;
    int copied = 0, encoded = 0;
    QList<std::int64_t> splices;            // output pts, the input's time base

    StageResult openStretch(std::unique_ptr<ExportVideoEncoder> *into);
    PacketWriter stretchWriter();
    bool isCleanIdr(const AVPacket *packet) const;
    bool collidesWithSpliceId(const AVPacket *packet) const;
    StageResult writeEncoded(AVPacket *packet);
    StageResult writeCopied(const AVPacket *packet);
    void fixDtsShift(std::int64_t shift);
    StageResult flushWaiting();
    StageResult feedEncoder(const AVPacket *packet);
    StageResult resolveHeld(bool complete);
    StageResult startOrFeed(const AVPacket *packet);
};

ExportVideoSplicer::ExportVideoSplicer()
    : d(std::make_unique<Private>())
{
}

ExportVideoSplicer::~ExportVideoSplicer() = default;

std::optional<QString> ExportVideoSplicer::whyNotSpliceable(const AVStream *input)
{
    const AVCodecParameters *par = input->codecpar;
    if (par->codec_id != AV_CODEC_ID_H264)
        return QStringLiteral("the video is %1, not H.264").arg(QString::fromLatin1(avcodec_get_name(par->codec_id)));
    if (par->field_order != AV_FIELD_UNKNOWN && par->field_order != AV_FIELD_PROGRESSIVE)
        return QStringLiteral("the video is interlaced");
    if (!ExportVideoEncoder::spliceProfile(par))
        return QStringLiteral("the H.264 encoder does not write profile %1").arg(par->profile);
    if (par->level <= 0)
        return QStringLiteral("the video declares no level");
    const auto config = h264::DecoderConfiguration::parse(par->extradata, par->extradata_size);
    if (!config || config->sps.isEmpty() || config->pps.isEmpty())
        return QStringLiteral("the video's sample description holds no readable parameter sets");
    const QList<int> used = config->usedIds();
    if (used.size() != config->sps.size() + config->pps.size())
        return QStringLiteral("the video's parameter sets cannot be read");
    if (config->sps.size() + 1 > 31 || config->pps.size() + 1 > 255)
        return QStringLiteral("the video's sample description is full");
    if (input->time_base.num <= 0 || input->time_base.den <= 0)
        return QStringLiteral("the video has no time base");
    return std::nullopt;
}

std::unique_ptr<ExportVideoSplicer> ExportVideoSplicer::create(const Options &options, AVStream *output,
                                                               PacketWriter writer, Error *error)
{
    std::unique_ptr<ExportVideoSplicer> stage(new ExportVideoSplicer);
    Private &p = *stage->d;
    const AVStream *in = options.input;
    p.options = options;
    p.output = output;
    p.writer = std::move(writer);
    p.startPts = av_rescale_q(options.startMicros, AV_TIME_BASE_Q, in->time_base);
    p.endPts = av_rescale_q(options.endMicros, AV_TIME_BASE_Q, in->time_base);

    auto config = h264::DecoderConfiguration::parse(in->codecpar->extradata, in->codecpar->extradata_size);
    if (!config) {
        *error = spliceError(QStringLiteral("unreadable sample description"));
        return {};
    }
    p.lengthSize = config->lengthSize;
    // The lowest id no SPS or PPS of the source uses (an SPS id is at most 31).
    const QList<int> used = config->usedIds();
    p.parameterSetId = 0;
    while (used.contains(p.parameterSetId))
        ++p.parameterSetId;

    if (StageResult r = p.openStretch(&p.encoder)) {
        *error = *r;
        return {};
    }
    p.parameterSets = p.encoder->parameterSets();
    int added = 0;
    for (const QByteArray &unit : h264::annexBNalUnits(reinterpret_cast<const uint8_t *>(p.parameterSets.constData()), int(p.parameterSets.size()))) {
        const int type = unit[0] & 0x1f;
        if ((type != h264::kNalSps && type != h264::kNalPps) || h264::parameterSetId(unit) != p.parameterSetId) {
            *error = spliceError(QStringLiteral("the encoder's parameter sets are not under id %1").arg(p.parameterSetId));
            return {};
        }
        (type == h264::kNalSps ? config->sps : config->pps).append(unit);
        ++added;
    }
    if (added != 2) {
        *error = spliceError(QStringLiteral("the encoder wrote %1 parameter sets").arg(added));
        return {};
    }
    const QByteArray description = config->serialize();
    av_freep(&output->codecpar->extradata);
    output->codecpar->extradata = static_cast<uint8_t *>(av_mallocz(description.size() + AV_INPUT_BUFFER_PADDING_SIZE));
    if (!output->codecpar->extradata) {
        *error = stageError(kMediaErrorUnknown, QStringLiteral("out of memory"));
        return {};
    }
    std::copy(description.cbegin(), description.cend(), output->codecpar->extradata);
    output->codecpar->extradata_size = int(description.size());
    return stage;
}

int ExportVideoSplicer::sourceStreamIndex() const
{
    return d->options.input->index;
}

bool ExportVideoSplicer::isPastEnd() const
{
    return d->pastEnd;
}

QList<std::int64_t> ExportVideoSplicer::splicePoints() const
{
    QList<std::int64_t> micros;
    for (std::int64_t pts : d->splices)
        micros.append(av_rescale_q(pts, d->options.input->time_base, AV_TIME_BASE_Q));
    return micros;
}

int ExportVideoSplicer::copiedPictures() const
{
    return d->copied;
}

int ExportVideoSplicer::encodedPictures() const
{
    return d->encoded;
}

StageResult ExportVideoSplicer::Private::openStretch(std::unique_ptr<ExportVideoEncoder> *into)
{
    ExportVideoEncoder::Options stretch{options.input, options.startMicros, options.endMicros, std::nullopt};
    stretch.splice = ExportVideoEncoder::Options::Splice{parameterSetId, output->index};
    Error error;
    auto encoder = ExportVideoEncoder::create(stretch, nullptr, stretchWriter(), &error);
    if (!encoder)
        return spliceError(QStringLiteral("no encoder for a stretch: %1").arg(error.message));
    // Every stretch must write the parameter sets the sample description holds.
    if (!parameterSets.isEmpty() && encoder->parameterSets() != parameterSets)
        return spliceError(QStringLiteral("the encoder's parameter sets changed between stretches"));
    *into = std::move(encoder);
    encoderPackets = 0;
    return std::nullopt;
}

PacketWriter ExportVideoSplicer::Private::stretchWriter()
{
    return [this](AVPacket *packet, AVRational timeBase, int) -> int {
        const std::optional<QByteArray> sample = h264::annexBToLengthPrefixed(packet->data, packet->size, lengthSize);
        if (!sample)
            return AVERROR(EINVAL);
        ff::AVPacketPtr out = ff::makePacket();
        if (!out || av_new_packet(out.get(), int(sample->size())) < 0)
            return AVERROR(ENOMEM);
        std::copy(sample->cbegin(), sample->cend(), out->data);
        av_packet_copy_props(out.get(), packet);
        av_packet_rescale_ts(out.get(), timeBase, options.input->time_base);
        ++encoderPackets;
        ++encoded;
        if (!dtsShift) {
            waiting.push_back(std::move(out));
            if (waiting.size() > kMaxWaitingPackets) {
                fixDtsShift(largestSourceDelay);
                if (StageResult r = flushWaiting())
                    return AVERROR(EIO);
            }
            return 0;
        }
        StageResult r = writeEncoded(out.get());
        return r ? AVERROR(EIO) : 0;
    };
}

bool ExportVideoSplicer::Private::isCleanIdr(const AVPacket *packet) const
{
    if (!(packet->flags & AV_PKT_FLAG_KEY) || packet->pts == AV_NOPTS_VALUE || packet->dts == AV_NOPTS_VALUE)
        return false;
    bool idr = false;
    const bool wellFormed = h264::forEachLengthPrefixedNal(packet->data, packet->size, lengthSize, [&](const uint8_t *nal, int) {
        if ((nal[0] & 0x1f) == h264::kNalIdrSlice)
            idr = true;
    });
    return wellFormed && idr;
}

bool ExportVideoSplicer::Private::collidesWithSpliceId(const AVPacket *packet) const
{
    bool collides = false;
    const bool wellFormed = h264::forEachLengthPrefixedNal(packet->data, packet->size, lengthSize, [&](const uint8_t *nal, int size) {
        const int type = nal[0] & 0x1f;
        if (type == h264::kNalSps || type == h264::kNalPps) {
            if (h264::parameterSetId(QByteArray(reinterpret_cast<const char *>(nal), size)) == parameterSetId)
                collides = true;
        }
    });
    return collides || !wellFormed;
}

// Re-encoded pictures have no B-frames: each decode time is its presentation time less the shift,
// and never earlier than the packet before it.
StageResult ExportVideoSplicer::Private::writeEncoded(AVPacket *packet)
{
    const std::int64_t dts = std::max(packet->pts - *dtsShift, lastDts == INT64_MIN ? INT64_MIN : lastDts + 1);
    if (dts > packet->pts)
        return spliceError(QStringLiteral("a re-encoded picture cannot be placed after the copied ones"));
    packet->dts = dts;
    lastDts = dts;
    const int rc = writer(packet, options.input->time_base, output->index);
    return rc < 0 ? writeError(QStringLiteral("writing video"), rc) : StageResult{};
}

StageResult ExportVideoSplicer::Private::writeCopied(const AVPacket *source)
{
    ff::AVPacketPtr packet = clonePacket(source);
    if (!packet)
        return stageError(kMediaErrorUnknown, QStringLiteral("out of memory"));
    packet->pts -= startPts;
    packet->dts -= startPts;
    if (packet->dts <= lastDts || packet->dts > packet->pts)
        return spliceError(QStringLiteral("a copied picture's decode time falls before the re-encoded ones"));
    lastDts = packet->dts;
    ++copied;
    const int rc = writer(packet.get(), options.input->time_base, output->index);
    return rc < 0 ? writeError(QStringLiteral("writing video"), rc) : StageResult{};
}

void ExportVideoSplicer::Private::fixDtsShift(std::int64_t shift)
{
    if (!dtsShift)
        dtsShift = std::max<std::int64_t>(0, shift);
}

StageResult ExportVideoSplicer::Private::flushWaiting()
{
    for (ff::AVPacketPtr &packet : waiting) {
        if (StageResult r = writeEncoded(packet.get()))
            return r;
    }
    waiting.clear();
    return std::nullopt;
}

StageResult ExportVideoSplicer::Private::feedEncoder(const AVPacket *packet)
{
    if (!encoder) {
        // The first stretch after a copy: it starts at the IDR the copied pictures end at.
        if (StageResult r = openStretch(&encoder))
            return r;
        encoderIsTail = true;
        if (copiedAny && packet->pts != AV_NOPTS_VALUE)
            splices.append(packet->pts - startPts);
    }
    StageResult r = encoder->sendPacket(packet);
    if (encoder->isPastEnd())
        pastEnd = true;
    return r;
}

// Decides what becomes of the held group: copied when all of it is kept (`complete`: the next clean
// IDR or the end of the input follows it), re-encoded otherwise.
StageResult ExportVideoSplicer::Private::resolveHeld(bool complete)
{
    std::vector<ff::AVPacketPtr> group = std::move(held);
    held.clear();
    heldBytes = 0;
    if (group.empty())
        return std::nullopt;
    const AVPacket *first = group.front().get();
    if (complete && heldIsCopyable) {
        if (encoder) {
            // The head ends where the copy begins.
            encoder->endBefore(first->pts);
            if (StageResult r = encoder->finish())
                return r;
            if (encoderPackets > 0)
                splices.append(first->pts - startPts);
            encoder.reset();
        }
        fixDtsShift(std::max(largestSourceDelay, first->pts - first->dts));
        if (StageResult r = flushWaiting())
            return r;
        for (const ff::AVPacketPtr &packet : group) {
            if (StageResult r = writeCopied(packet.get()))
                return r;
        }
        copiedAny = true;
        return std::nullopt;
    }
    for (const ff::AVPacketPtr &packet : group) {
        if (StageResult r = feedEncoder(packet.get()))
            return r;
        if (pastEnd)
            break;
    }
    return std::nullopt;
}

// A packet that is not held: a clean IDR inside the cut starts a new held group (unless a tail is
// already being re-encoded), anything else goes to the current stretch.
StageResult ExportVideoSplicer::Private::startOrFeed(const AVPacket *packet)
{
    if (!encoderIsTail && isCleanIdr(packet) && packet->pts >= startPts) {
        if (packet->pts >= endPts) {
            // Everything from this IDR on is shown after the end, and the head before it is whole.
            pastEnd = true;
            return std::nullopt;
        }
        fixDtsShift(std::max(largestSourceDelay, packet->pts - packet->dts));
        if (StageResult r = flushWaiting())
            return r;
        held.push_back(clonePacket(packet));
        heldBytes = packet->size;
        heldIsCopyable = !collidesWithSpliceId(packet);
        return std::nullopt;
    }
    return feedEncoder(packet);
}

StageResult ExportVideoSplicer::sendPacket(const AVPacket *packet)
{
    if (d->pastEnd)
        return std::nullopt;
    if (packet->pts != AV_NOPTS_VALUE && packet->dts != AV_NOPTS_VALUE)
        d->largestSourceDelay = std::max(d->largestSourceDelay, packet->pts - packet->dts);
    if (d->held.empty())
        return d->startOrFeed(packet);
    if (d->isCleanIdr(packet)) {
        if (StageResult r = d->resolveHeld(true))
            return r;
        return d->pastEnd ? std::nullopt : d->startOrFeed(packet);
    }
    d->held.push_back(clonePacket(packet));
    d->heldBytes += packet->size;
    const std::int64_t firstPts = d->held.front()->pts;
    if (packet->pts == AV_NOPTS_VALUE || packet->dts == AV_NOPTS_VALUE || packet->pts < firstPts || d->collidesWithSpliceId(packet))
        d->heldIsCopyable = false; // a picture shown before its IDR, or one that cannot be placed
    if (packet->pts != AV_NOPTS_VALUE && packet->pts >= d->endPts)
        return d->resolveHeld(false); // the end falls inside this group
    if (d->heldBytes > kMaxHeldGroupBytes)
        return d->resolveHeld(false);
    return std::nullopt;
}

StageResult ExportVideoSplicer::finish()
{
    if (!d->held.empty()) {
        if (StageResult r = d->resolveHeld(true)) // the input ends inside the cut: the last group is whole
            return r;
    }
    if (d->encoder) {
        if (StageResult r = d->encoder->finish())
            return r;
    }
    d->fixDtsShift(0);
    if (StageResult r = d->flushWaiting())
        return r;
    if (d->copied + d->encoded == 0)
        return stageError(kMediaErrorDecodeFailed, QStringLiteral("no video frame in the range"));
    return std::nullopt;
}

} // namespace zaf::media::exportpipe
