#include "platform/media/thumbnails/image_frame_source.h"
#include "platform/media/core/decoder_setup.h"
#include "platform/media/core/media_input.h"
#include "platform/media/core/media_log.h"

#include "platform/log.h"

#include <QLoggingCategory>
#include <QTransform>

#include <algorithm>
#include <cmath>
#include <limits>

namespace zaf::media {

namespace {

using zaf::media::lcMedia;

// Far outside any real timestamp, yet safe to add and subtract without overflow.
constexpr std::int64_t kFarTicks = std::numeric_limits<std::int64_t>::max() / 4;
// Bounds on the work of one request, so a damaged file cannot keep a decoder busy forever.
constexpr int kMaxFramesPerRequest = 20000;
constexpr int kMaxPacketsPerFrame = 20000;
constexpr int kMaxBadPackets = 64;
constexpr int kMaxSeekRetries = 4;

Error sourceError(int code, const QString &message)
{
    zaf::log::error(lcMedia(), QStringLiteral("ImageGenerator: %1").arg(message));
    return Error{QString::fromLatin1(kMediaErrorDomain), code, message};
}

std::int64_t saturatingAdd(std::int64_t a, std::int64_t b)
{
    return std::clamp<std::int64_t>(a + std::clamp(b, -kFarTicks, kFarTicks), -kFarTicks * 2, kFarTicks * 2);
}

std::int64_t framePts(const AVFrame *frame)
{
    if (frame->best_effort_timestamp != AV_NOPTS_VALUE)
        return frame->best_effort_timestamp;
    return frame->pts != AV_NOPTS_VALUE ? frame->pts : 0;
}

} // namespace

ImageFrameSource::ImageFrameSource(QString path, int streamIndex, int rotationClockwise, const CancelToken &interrupt)
    : m_path(std::move(path)), m_streamIndex(streamIndex), m_rotation(rotationClockwise), m_interrupt(interrupt)
{
}

ImageFrameSource::~ImageFrameSource()
{
    close();
}

bool ImageFrameSource::interrupted() const
{
    return m_interrupt.isCancelled();
}

void ImageFrameSource::close()
{
    m_last.reset();
    m_decoder.reset();
    m_format.reset();
    m_stream = nullptr;
    m_positioned = false;
    m_draining = false;
}

OptionalError ImageFrameSource::open()
{
    QString error;
    m_format = openInput(m_path, m_interrupt, &error);
    if (!m_format)
        return sourceError(kMediaErrorCannotOpen, error);

    if (m_streamIndex < 0 || m_streamIndex >= int(m_format->nb_streams)
        || m_format->streams[m_streamIndex]->codecpar->codec_type != AVMEDIA_TYPE_VIDEO)
        m_streamIndex = av_find_best_stream(m_format.get(), AVMEDIA_TYPE_VIDEO, -1, -1, nullptr, 0);
    if (m_streamIndex < 0)
        return sourceError(kMediaErrorNoTracks, QStringLiteral("%1 has no video track").arg(m_path));
    for (unsigned i = 0; i < m_format->nb_streams; ++i)
        m_format->streams[i]->discard = int(i) == m_streamIndex ? AVDISCARD_DEFAULT : AVDISCARD_ALL;
    m_stream = m_format->streams[m_streamIndex];

    // One thread: a still needs one or a few frames, and a single-threaded decoder hands each frame
    // out as soon as it is decoded.
    m_decoder = openDecoder(m_stream, DecoderOptions{1}, &error);
    if (!m_decoder)
        return sourceError(kMediaErrorDecodeFailed, QStringLiteral("%1 (the video of %2)").arg(error, m_path));

    if (!m_packet)
        m_packet = ff::makePacket();
    if (!m_frame)
        m_frame = ff::makeFrame();
    if (!m_packet || !m_frame)
        return sourceError(kMediaErrorUnknown, QStringLiteral("out of memory opening %1").arg(m_path));
    m_startTicks = m_stream->start_time != AV_NOPTS_VALUE ? m_stream->start_time : 0;
    const AVRational rate = m_stream->avg_frame_rate.num > 0 ? m_stream->avg_frame_rate : m_stream->r_frame_rate;
    m_nominalDuration = rate.num > 0 ? std::max<std::int64_t>(1, av_rescale_q(1, av_inv_q(rate), m_stream->time_base)) : 1;
    m_positioned = false;
    m_draining = false;
    return std::nullopt;
}

std::int64_t ImageFrameSource::toStreamTicks(const MediaTime &time, bool roundDown) const
{
    if (time.isPositiveInfinity() || !time.isValid())
        return kFarTicks;
    if (time.isNegativeInfinity())
        return -kFarTicks;
    const auto rounding = AVRounding((roundDown ? AV_ROUND_DOWN : AV_ROUND_NEAR_INF) | AV_ROUND_PASS_MINMAX);
    return std::clamp(av_rescale_q_rnd(time.value, AVRational{1, time.timescale}, m_stream->time_base, rounding), -kFarTicks, kFarTicks);
}

std::int64_t ImageFrameSource::frameDuration(const AVFrame *frame) const
{
    return frame->pkt_duration > 0 ? frame->pkt_duration : m_nominalDuration;
}

bool ImageFrameSource::seekTo(std::int64_t ts)
{
    int rc = av_seek_frame(m_format.get(), m_streamIndex, ts, AVSEEK_FLAG_BACKWARD);
    if (rc < 0)
        rc = avformat_seek_file(m_format.get(), m_streamIndex, std::numeric_limits<std::int64_t>::min(), ts, ts, 0);
    avcodec_flush_buffers(m_decoder.get());
    m_last.reset();
    m_draining = false;
    m_positioned = rc >= 0;
    return rc >= 0;
}

int ImageFrameSource::nextFrame(AVFrame *out)
{
    int badPackets = 0;
    for (int packets = 0; packets < kMaxPacketsPerFrame; ++packets) {
        int rc = avcodec_receive_frame(m_decoder.get(), out);
        if (rc == 0)
            return 0;
        if (rc == AVERROR_EOF)
            return AVERROR_EOF;
        if (rc != AVERROR(EAGAIN))
            return rc;
        if (m_draining)
            return AVERROR_EOF;
        if (interrupted())
            return AVERROR_EXIT;
        rc = av_read_frame(m_format.get(), m_packet.get());
        if (rc < 0) {
            if (rc == AVERROR_EXIT || interrupted())
                return AVERROR_EXIT;
            if (rc != AVERROR_EOF)
                zaf::log::info(lcMedia(), QStringLiteral("ImageGenerator: reading %1 stopped: %2").arg(m_path, ff::errorString(rc)));
            // End of file (or of what can be read): hand out the frames the decoder still holds.
            avcodec_send_packet(m_decoder.get(), nullptr);
            m_draining = true;
            continue;
        }
        if (m_packet->stream_index != m_streamIndex) {
            av_packet_unref(m_packet.get());
            continue;
        }
        // Frames nothing refers to and that are shown well before any acceptable time need not be
        // decoded at all: on the way from a sync frame to an exact time that skips most B-frames.
        const bool useless = !(m_packet->flags & AV_PKT_FLAG_KEY) && m_packet->pts != AV_NOPTS_VALUE
                             && m_packet->pts + 2 * m_nominalDuration <= m_skipBefore;
        m_decoder->skip_frame = useless ? AVDISCARD_NONREF : AVDISCARD_DEFAULT;
        rc = avcodec_send_packet(m_decoder.get(), m_packet.get());
        av_packet_unref(m_packet.get());
        if (rc < 0 && rc != AVERROR(EAGAIN) && ++badPackets > kMaxBadPackets)
            return rc;
    }
    return AVERROR_INVALIDDATA;
}

// The fast way to an answer: when the sync frame at or before the target lies within the
// tolerance, decode that one frame alone.
bool ImageFrameSource::keyframeOnly(std::int64_t target, std::int64_t lowest, Answer *answer, const Request &request)
{
    const AVIndexEntry *entry = avformat_index_get_entry_from_timestamp(m_stream, target, AVSEEK_FLAG_BACKWARD);
    if (!entry || entry->timestamp + m_nominalDuration <= lowest)
        return false;
    std::int64_t seekPoint = target;
    for (int attempt = 0; attempt <= kMaxSeekRetries; ++attempt) {
        if (!seekTo(seekPoint))
            return false;
        // The first packet of the stream after a backward seek is the sync sample.
        int rc = 0;
        int packets = 0;
        while ((rc = av_read_frame(m_format.get(), m_packet.get())) >= 0 && m_packet->stream_index != m_streamIndex
               && ++packets < kMaxPacketsPerFrame)
            av_packet_unref(m_packet.get());
        if (rc < 0 || m_packet->stream_index != m_streamIndex || !(m_packet->flags & AV_PKT_FLAG_KEY)) {
            av_packet_unref(m_packet.get());
            return false;
        }
        const std::int64_t pts = m_packet->pts != AV_NOPTS_VALUE ? m_packet->pts : m_packet->dts;
        if (pts != AV_NOPTS_VALUE && pts > target && seekPoint > m_startTicks && attempt < kMaxSeekRetries) {
            // The index is in decode order: this sync frame is shown after the target. Step back.
            seekPoint = std::min(seekPoint, (m_packet->dts != AV_NOPTS_VALUE ? m_packet->dts : pts)) - 1;
            av_packet_unref(m_packet.get());
            continue;
        }
        if (pts != AV_NOPTS_VALUE && pts + m_nominalDuration <= lowest) {
            av_packet_unref(m_packet.get());
            return false;
        }
        m_decoder->skip_frame = AVDISCARD_DEFAULT;
        rc = avcodec_send_packet(m_decoder.get(), m_packet.get());
        av_packet_unref(m_packet.get());
        if (rc < 0)
            return false;
        avcodec_send_packet(m_decoder.get(), nullptr); // drain: the frame comes out without waiting for reordering
        rc = avcodec_receive_frame(m_decoder.get(), m_frame.get());
        avcodec_flush_buffers(m_decoder.get());
        m_positioned = false;
        m_draining = false;
        m_last.reset();
        if (rc < 0)
            return false;
        *answer = deliver(m_frame.get(), request);
        av_frame_unref(m_frame.get());
        return true;
    }
    return false;
}

ImageFrameSource::Answer ImageFrameSource::imageAt(const Request &request)
{
    if (!request.time.isNumeric()) {
        Answer answer;
        answer.error = sourceError(kMediaErrorInvalidArgument,
                                   QStringLiteral("cannot make a picture of %1 at time %2").arg(m_path, request.time.debugDescription()));
        return answer;
    }
    if (m_openError)
        return Answer{{}, MediaTime::invalid(), m_openError, false};
    if (!m_format) {
        if (OptionalError error = open()) {
            close();
            // An interrupted open is a cancellation; it is tried again next time.
            if (interrupted())
                return Answer{{}, MediaTime::invalid(), makeMediaError(kMediaErrorCancelled, QStringLiteral("cancelled")), true};
            m_openError = error;
            return Answer{{}, MediaTime::invalid(), error, false};
        }
    }

    const std::int64_t target = std::max(toStreamTicks(request.time, false), m_startTicks);
    const std::int64_t before = std::max<std::int64_t>(0, toStreamTicks(request.toleranceBefore, true));
    const std::int64_t after = std::max<std::int64_t>(0, toStreamTicks(request.toleranceAfter, true));
    const std::int64_t lowest = saturatingAdd(target, -before);
    const std::int64_t highest = saturatingAdd(target, after);
    m_skipBefore = lowest;
    auto acceptable = [&](const AVFrame *f) {
        const std::int64_t p = framePts(f);
        return p <= highest && p + frameDuration(f) > lowest;
    };
    auto cancelled = [this] {
        close(); // the demuxer's state after an interrupted read is not trusted: reopen next time
        return Answer{{}, MediaTime::invalid(), makeMediaError(kMediaErrorCancelled, QStringLiteral("cancelled")), true};
    };

    // Decoding on from the previous answer beats seeking while no sync frame lies in between.
    bool decodeOn = m_positioned && m_last && !m_draining && framePts(m_last.get()) <= target;
    if (decodeOn) {
        const AVIndexEntry *entry = avformat_index_get_entry_from_timestamp(m_stream, target, AVSEEK_FLAG_BACKWARD);
        if (entry && entry->timestamp > framePts(m_last.get()))
            decodeOn = false;
    }
    ff::AVFramePtr previous;
    std::int64_t seekPoint = target;
    if (decodeOn) {
        previous = std::move(m_last);
        if (acceptable(previous.get())) {
            Answer answer = deliver(previous.get(), request);
            m_last = std::move(previous);
            return answer;
        }
    } else {
        Answer answer;
        if (keyframeOnly(target, lowest, &answer, request))
            return answer;
        if (interrupted())
            return cancelled();
        if (!seekTo(seekPoint)) {
            Answer failed;
            failed.error = sourceError(kMediaErrorDecodeFailed, QStringLiteral("cannot seek in %1").arg(m_path));
            return failed;
        }
    }

    int seekRetries = 0;
    for (int frames = 0; frames < kMaxFramesPerRequest; ++frames) {
        ff::AVFramePtr frame = ff::makeFrame();
        const int rc = frame ? nextFrame(frame.get()) : AVERROR(ENOMEM);
        if (rc == AVERROR_EXIT || interrupted())
            return cancelled();
        if (rc == AVERROR_EOF) {
            // Past the last frame: the last one is shown.
            m_positioned = false;
            if (previous)
                return deliver(previous.get(), request);
            Answer failed;
            failed.error = sourceError(kMediaErrorDecodeFailed, QStringLiteral("no picture could be decoded from %1").arg(m_path));
            return failed;
        }
        if (rc < 0) {
            m_positioned = false;
            Answer failed;
            failed.error = sourceError(kMediaErrorDecodeFailed, QStringLiteral("decoding %1 failed: %2").arg(m_path, ff::errorString(rc)));
            return failed;
        }
        const std::int64_t p = framePts(frame.get());
        if (!previous && !decodeOn && p > target && seekPoint > m_startTicks && seekRetries < kMaxSeekRetries) {
            // The seek landed on a frame shown after the target: go back further.
            seekPoint = saturatingAdd(seekPoint, -std::max<std::int64_t>(m_nominalDuration * 30, p - target + 1));
            ++seekRetries;
            if (!seekTo(seekPoint))
                break;
            continue;
        }
        if (acceptable(frame.get())) {
            Answer answer = deliver(frame.get(), request);
            m_last = std::move(frame);
            return answer;
        }
        if (p > highest) {
            // Nothing falls inside the window (a gap in the stream): take the nearer neighbour.
            const bool usePrevious = previous && target - (framePts(previous.get()) + frameDuration(previous.get())) <= p - target;
            Answer answer = deliver(usePrevious ? previous.get() : frame.get(), request);
            m_last = std::move(frame);
            return answer;
        }
        previous = std::move(frame);
    }
    m_positioned = false;
    Answer failed;
    failed.error = sourceError(kMediaErrorDecodeFailed, QStringLiteral("no picture for %1 in %2").arg(request.time.debugDescription(), m_path));
    return failed;
}

ImageFrameSource::Answer ImageFrameSource::deliver(const AVFrame *frame, const Request &request)
{
    Answer answer;
    const int w = frame->width, h = frame->height;
    if (w <= 0 || h <= 0) {
        answer.error = sourceError(kMediaErrorDecodeFailed, QStringLiteral("empty picture in %1").arg(m_path));
        return answer;
    }
    const int rotation = request.appliesTransform ? m_rotation : 0;
    const bool quarterTurn = rotation == 90 || rotation == 270;
    const AVRational sar = frame->sample_aspect_ratio;
    const double shownWidth = sar.num > 0 && sar.den > 0 ? w * av_q2d(sar) : w;
    const double uprightWidth = quarterTurn ? h : shownWidth;
    const double uprightHeight = quarterTurn ? shownWidth : h;
    double scale = 1;
    if (request.maximumSize.width() > 0)
        scale = std::min(scale, request.maximumSize.width() / uprightWidth);
    if (request.maximumSize.height() > 0)
        scale = std::min(scale, request.maximumSize.height() / uprightHeight);
    const int outWidth = std::max(1, int(std::lround(uprightWidth * scale)));
    const int outHeight = std::max(1, int(std::lround(uprightHeight * scale)));
    // Scale the stored picture straight to the size it takes before it is turned.
    const int scaledWidth = quarterTurn ? outHeight : outWidth;
    const int scaledHeight = quarterTurn ? outWidth : outHeight;
    const int flags = scaledWidth * 2 < w ? SWS_AREA : SWS_BILINEAR;
    QImage image = m_converter.toImage(frame, QSize(scaledWidth, scaledHeight), flags);
    if (image.isNull()) {
        answer.error = sourceError(kMediaErrorDecodeFailed, QStringLiteral("cannot convert a %1x%2 picture of %3 to %4x%5")
                                                                .arg(w).arg(h).arg(m_path).arg(scaledWidth).arg(scaledHeight));
        return answer;
    }
    if (rotation != 0)
        image = image.transformed(QTransform().rotate(rotation));
    answer.image = std::move(image);
    const std::int64_t pts = framePts(frame);
    const AVRational tb = m_stream->time_base;
    answer.actualTime = MediaTime::make(pts * tb.num, tb.den);
    return answer;
}

} // namespace zaf::media
