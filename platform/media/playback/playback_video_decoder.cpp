#include "platform/media/playback/playback_video_decoder.h"

#include "platform/log.h"
#include "platform/media/core/frame_converter.h"
#include "platform/media/core/decoder_setup.h"
#include "platform/media/core/media_input.h"
#include "platform/media/core/media_log.h"

#include <cmath>
#include <utility>

namespace zaf::media::playback {

namespace {

// A stalled source (EAGAIN over and over) ends the stream after this many attempts in a row.
constexpr int kMaxConsecutiveReadRetries = 1000;
// A stream that keeps failing to decode is given up after this many errors in a row.
constexpr int kMaxConsecutiveDecodeErrors = 200;

} // namespace

VideoDecoder::VideoDecoder(QString path, int streamIndex, FrameQueue *queue, std::function<void()> framesReady,
    std::function<void(const QString &)> failed)
    : m_path(std::move(path))
    , m_streamIndex(streamIndex)
    , m_queue(queue)
    , m_framesReady(std::move(framesReady))
    , m_failed(std::move(failed))
{
    m_thread = std::thread([this] { run(); });
}

VideoDecoder::~VideoDecoder()
{
    m_stop.cancel();
    m_wake.notify_all();
    m_queue->wake();
    if (m_thread.joinable())
        m_thread.join();
}

void VideoDecoder::seek(std::int64_t targetNs, std::uint64_t generation)
{
    {
        std::lock_guard lock(m_mutex);
        m_request = Request{targetNs, generation};
        m_requestPending = true;
    }
    m_wake.notify_all();
    m_queue->wake();
}

bool VideoDecoder::hasNewerRequest() const
{
    return m_requestPending.load();
}

void VideoDecoder::run()
{
    QString error;
    ff::InputFormatContextPtr format = openInput(m_path, m_stop, &error);
    if (!format) {
        if (!m_stop.isCancelled())
            m_failed(QStringLiteral("no playback: %1").arg(error));
        return;
    }
    if (m_streamIndex < 0 || m_streamIndex >= int(format->nb_streams)
        || format->streams[m_streamIndex]->codecpar->codec_type != AVMEDIA_TYPE_VIDEO) {
        m_failed(QStringLiteral("%1 has no video stream %2").arg(m_path).arg(m_streamIndex));
        return;
    }
    AVStream *stream = format->streams[m_streamIndex];
    for (unsigned i = 0; i < format->nb_streams; ++i) {
        if (int(i) != m_streamIndex)
            format->streams[i]->discard = AVDISCARD_ALL;
    }
    ff::CodecContextPtr codec = openDecoder(stream, DecoderOptions{2}, &error);
    if (!codec) {
        m_failed(QStringLiteral("cannot decode the video of %1: %2").arg(m_path, error));
        return;
    }

    const double startSeconds = containerStartSeconds(format.get());
    const double timeBase = av_q2d(stream->time_base);
    ff::AVPacketPtr packet = ff::makePacket();
    ff::AVFramePtr frame = ff::makeFrame();
    ff::AVFramePtr held = ff::makeFrame();
    if (!packet || !frame || !held) {
        m_failed(QStringLiteral("out of memory"));
        return;
    }
    FrameConverter converter;
    bool conversionFailed = false;

    enum class Mode { Idle, Seeking, Running };
    Mode mode = Mode::Idle;
    Request current{0, 0};
    bool haveHeld = false;
    bool draining = false;
    int readRetries = 0;
    int decodeErrors = 0;
    std::int64_t lastPtsNs = 0;

    auto ptsNsOf = [&](const AVFrame *f) {
        std::int64_t ts = f->best_effort_timestamp;
        if (ts == AV_NOPTS_VALUE)
            ts = f->pts;
        if (ts == AV_NOPTS_VALUE)
            return lastPtsNs;
        lastPtsNs = std::llround((double(ts) * timeBase - startSeconds) * 1e9);
        return lastPtsNs;
    };
    auto deliver = [&](const AVFrame *f, std::int64_t ptsNs, bool seekResult) {
        QImage image = converter.toImage(f, QSize(f->width, f->height), SWS_BILINEAR);
        if (image.isNull()) {
            // Skipped; said once, not for every frame of a stream that cannot be shown.
            if (!std::exchange(conversionFailed, true))
                zaf::log::error(lcPlayback(), QStringLiteral("cannot convert a %1x%2 picture of %3 for display")
                                                  .arg(f->width).arg(f->height).arg(m_path));
            return true;
        }
        VideoFrame out{std::move(image), ptsNs, current.generation, seekResult};
        if (!m_queue->push(std::move(out), [this] { return m_stop.isCancelled() || hasNewerRequest(); }))
            return false;
        if (m_framesReady)
            m_framesReady();
        return true;
    };
    // Returns false when the picture was abandoned for a newer request or a stop.
    auto handle = [&](AVFrame *f) {
        const std::int64_t pts = ptsNsOf(f);
        if (mode != Mode::Seeking)
            return deliver(f, pts, false);
        if (pts < current.targetNs) {
            av_frame_unref(held.get());
            av_frame_move_ref(held.get(), f);
            haveHeld = true;
            return true;
        }
        mode = Mode::Running;
        if (pts > current.targetNs && haveHeld) {
            haveHeld = false;
            const std::int64_t heldPts = ptsNsOf(held.get());
            if (!deliver(held.get(), heldPts, true))
                return false;
            av_frame_unref(held.get());
            return deliver(f, pts, false);
        }
        return deliver(f, pts, true);
    };

    while (!m_stop.isCancelled()) {
        {
            std::unique_lock lock(m_mutex);
            if (!m_request && mode == Mode::Idle) {
                m_wake.wait(lock, [this] { return m_stop.isCancelled() || m_request.has_value(); });
            }
            if (m_stop.isCancelled())
                break;
            if (m_request) {
                current = *m_request;
                m_request.reset();
                m_requestPending = false;
                lock.unlock();
                const double targetSeconds = double(current.targetNs) / 1e9 + startSeconds;
                const std::int64_t ts = std::llround(targetSeconds / timeBase);
                int rc = av_seek_frame(format.get(), m_streamIndex, ts, AVSEEK_FLAG_BACKWARD);
                if (rc < 0)
                    rc = av_seek_frame(format.get(), m_streamIndex, stream->start_time == AV_NOPTS_VALUE ? 0 : stream->start_time, AVSEEK_FLAG_BACKWARD);
                if (rc < 0 && !m_stop.isCancelled())
                    zaf::log::error(lcPlayback(), QStringLiteral("cannot seek in %1: %2").arg(m_path, ff::errorString(rc)));
                avcodec_flush_buffers(codec.get());
                av_frame_unref(held.get());
                haveHeld = false;
                draining = false;
                readRetries = 0;
                mode = Mode::Seeking;
            }
        }

        if (!draining) {
            int rc = av_read_frame(format.get(), packet.get());
            if (rc == AVERROR(EAGAIN)) {
                if (++readRetries < kMaxConsecutiveReadRetries)
                    continue;
                rc = AVERROR_EOF;
            }
            if (rc < 0) {
                if (rc != AVERROR_EOF && !m_stop.isCancelled())
                    zaf::log::error(lcPlayback(), QStringLiteral("reading %1 stopped: %2").arg(m_path, ff::errorString(rc)));
                draining = true;
                avcodec_send_packet(codec.get(), nullptr);
            } else {
                readRetries = 0;
                if (packet->stream_index == m_streamIndex)
                    avcodec_send_packet(codec.get(), packet.get());
                av_packet_unref(packet.get());
            }
        }

        for (;;) {
            const int rc = avcodec_receive_frame(codec.get(), frame.get());
            if (rc == AVERROR(EAGAIN))
                break;
            if (rc == AVERROR_EOF) {
                if (mode == Mode::Seeking && haveHeld) {
                    haveHeld = false;
                    deliver(held.get(), ptsNsOf(held.get()), true);
                    av_frame_unref(held.get());
                }
                mode = Mode::Idle;
                break;
            }
            if (rc < 0) {
                if (++decodeErrors >= kMaxConsecutiveDecodeErrors) {
                    m_failed(QStringLiteral("cannot decode the video of %1: %2").arg(m_path, ff::errorString(rc)));
                    mode = Mode::Idle;
                    draining = true;
                }
                break;
            }
            decodeErrors = 0;
            const bool kept = handle(frame.get());
            av_frame_unref(frame.get());
            if (!kept || hasNewerRequest() || m_stop.isCancelled())
                break;
        }
    }
}

} // namespace zaf::media::playback
