#include "platform/media/playback/playback_video_decoder.h"

#include "platform/log.h"
#include "platform/media/core/decoder_setup.h"
#include "platform/media/core/frame_converter.h"
#include "platform/media/core/media_input.h"
#include "platform/media/core/media_log.h"
#include "platform/media/playback/playback_exact_seek.h"

#include <cmath>
#include <utility>

namespace zaf::media::playback {

namespace {

// A stalled source (EAGAIN over and over) ends the stream after this many attempts in a row.
constexpr int kMaxConsecutiveReadRetries = 1000;
// A stream that keeps failing to decode is given up after this many errors in a row.
constexpr int kMaxConsecutiveDecodeErrors = 200;

} // namespace

// One run of the decoder thread: the opened stream and its decoder, and where the request under way
// stands. Every step runs on the decoder thread.
struct VideoDecoder::DecodeRun {
    explicit DecodeRun(VideoDecoder &owner) : d(owner) {}

    // Opens the input, its video stream and a decoder for it; says why not through `failed`.
    bool open();
    // Takes a new request, if one came, and seeks to it; while there is nothing to decode, waits
    // for one. False once the thread is to stop.
    bool takeRequest();
    void seek(const Request &request);
    // Reads the next packet into the decoder; at the end of the input, or when it fails or keeps
    // stalling, starts draining the decoder. False when a stalled read is to be tried again first.
    bool readPacket();
    // Receives the pictures the decoder has ready and hands them on, until it wants more input, the
    // stream ends or the request is abandoned.
    void receivePictures();
    // One decoded picture: held back, dropped or handed on as the exact seek wants. False when it
    // was abandoned for a newer request or a stop.
    bool takePicture(AVFrame *picture);
    void endOfStream();
    void decodeError(int rc);
    // Converts a picture and queues it, waiting for room. False when abandoned while waiting.
    bool handOn(const AVFrame *picture, std::int64_t ptsNs, bool seekResult);
    std::int64_t ptsNsOf(const AVFrame *picture);
    bool abandoned() const { return d.m_thread.stopping() || d.m_thread.hasNewerRequest(); }

    VideoDecoder &d;

    // The stream, from open() on.
    ff::InputFormatContextPtr format;
    AVStream *stream = nullptr;
    ff::CodecContextPtr codec;
    double startSeconds = 0;
    double timeBase = 0;
    ff::AVPacketPtr packet;
    ff::AVFramePtr decoded;
    ff::AVFramePtr held; // the last picture before the target of the seek under way
    FrameConverter converter;
    bool conversionFailed = false;

    // The request under way.
    Request current{0, 0};
    bool active = false;   // false: nothing to decode until the next request
    bool draining = false; // the input is read to its end; the decoder gives up what it holds
    ExactSeek exactSeek;
    int readRetries = 0;
    int decodeErrors = 0;
    std::int64_t lastPtsNs = 0; // the time given to a picture that carries none
};

VideoDecoder::VideoDecoder(QString path, int streamIndex, FrameQueue *queue, std::function<void()> framesReady,
    std::function<void(const QString &)> failed)
    : m_path(std::move(path))
    , m_streamIndex(streamIndex)
    , m_queue(queue)
    , m_framesReady(std::move(framesReady))
    , m_failed(std::move(failed))
    , m_thread([this] { m_queue->wake(); })
{
    m_thread.start([this] { run(); });
}

VideoDecoder::~VideoDecoder()
{
    m_thread.stop();
}

void VideoDecoder::seek(std::int64_t targetNs, std::uint64_t generation)
{
    m_thread.post(Request{targetNs, generation});
}

void VideoDecoder::run()
{
    DecodeRun run(*this);
    if (!run.open())
        return;
    while (run.takeRequest()) {
        if (run.readPacket())
            run.receivePictures();
    }
}

bool VideoDecoder::DecodeRun::open()
{
    QString error;
    format = openInput(d.m_path, d.m_thread.stopToken(), &error);
    if (!format) {
        if (!d.m_thread.stopping())
            d.m_failed(QStringLiteral("no playback: %1").arg(error));
        return false;
    }
    const int index = d.m_streamIndex;
    if (index < 0 || index >= int(format->nb_streams) || format->streams[index]->codecpar->codec_type != AVMEDIA_TYPE_VIDEO) {
        d.m_failed(QStringLiteral("%1 has no video stream %2").arg(d.m_path).arg(index));
        return false;
    }
    stream = format->streams[index];
    for (unsigned i = 0; i < format->nb_streams; ++i) {
        if (int(i) != index)
            format->streams[i]->discard = AVDISCARD_ALL;
    }
    codec = openDecoder(stream, DecoderOptions{2}, &error);
    if (!codec) {
        d.m_failed(QStringLiteral("cannot decode the video of %1: %2").arg(d.m_path, error));
        return false;
    }
    startSeconds = containerStartSeconds(format.get());
    timeBase = av_q2d(stream->time_base);
    packet = ff::makePacket();
    decoded = ff::makeFrame();
    held = ff::makeFrame();
    if (!packet || !decoded || !held) {
        d.m_failed(QStringLiteral("out of memory"));
        return false;
    }
    return true;
}

bool VideoDecoder::DecodeRun::takeRequest()
{
    const std::optional<DecoderThread<Request>::Taken> next = d.m_thread.take(!active);
    if (d.m_thread.stopping())
        return false;
    if (next)
        seek(next->request);
    return true;
}

// Exact: the demuxer goes to the keyframe before the target, and exactSeek picks the pictures.
void VideoDecoder::DecodeRun::seek(const Request &request)
{
    current = request;
    const double targetSeconds = double(current.targetNs) / 1e9 + startSeconds;
    const std::int64_t ts = std::llround(targetSeconds / timeBase);
    int rc = av_seek_frame(format.get(), d.m_streamIndex, ts, AVSEEK_FLAG_BACKWARD);
    if (rc < 0)
        rc = av_seek_frame(format.get(), d.m_streamIndex, stream->start_time == AV_NOPTS_VALUE ? 0 : stream->start_time, AVSEEK_FLAG_BACKWARD);
    if (rc < 0 && !d.m_thread.stopping())
        zaf::log::error(lcPlayback(), QStringLiteral("cannot seek in %1: %2").arg(d.m_path, ff::errorString(rc)));
    avcodec_flush_buffers(codec.get());
    av_frame_unref(held.get());
    exactSeek.begin(current.targetNs);
    active = true;
    draining = false;
    readRetries = 0;
}

bool VideoDecoder::DecodeRun::readPacket()
{
    if (draining)
        return true;
    int rc = av_read_frame(format.get(), packet.get());
    if (rc == AVERROR(EAGAIN)) {
        if (++readRetries < kMaxConsecutiveReadRetries)
            return false;
        rc = AVERROR_EOF;
    }
    if (rc < 0) {
        if (rc != AVERROR_EOF && !d.m_thread.stopping())
            zaf::log::error(lcPlayback(), QStringLiteral("reading %1 stopped: %2").arg(d.m_path, ff::errorString(rc)));
        draining = true;
        avcodec_send_packet(codec.get(), nullptr);
        return true;
    }
    readRetries = 0;
    if (packet->stream_index == d.m_streamIndex)
        avcodec_send_packet(codec.get(), packet.get());
    av_packet_unref(packet.get());
    return true;
}

void VideoDecoder::DecodeRun::receivePictures()
{
    for (;;) {
        const int rc = avcodec_receive_frame(codec.get(), decoded.get());
        if (rc == AVERROR(EAGAIN))
            return;
        if (rc == AVERROR_EOF) {
            endOfStream();
            return;
        }
        if (rc < 0) {
            decodeError(rc);
            return;
        }
        decodeErrors = 0;
        const bool kept = takePicture(decoded.get());
        av_frame_unref(decoded.get());
        if (!kept || abandoned())
            return;
    }
}

bool VideoDecoder::DecodeRun::takePicture(AVFrame *picture)
{
    const std::int64_t pts = ptsNsOf(picture);
    const ExactSeek::Choice choice = exactSeek.next(pts);
    if (choice.hold) {
        av_frame_unref(held.get());
        av_frame_move_ref(held.get(), picture);
        return true;
    }
    if (choice.handOnHeld) {
        if (!handOn(held.get(), ptsNsOf(held.get()), true))
            return false;
        av_frame_unref(held.get());
    }
    return handOn(picture, pts, choice.seekResult);
}

// A seek past the last picture is answered by the last picture.
void VideoDecoder::DecodeRun::endOfStream()
{
    if (exactSeek.end()) {
        handOn(held.get(), ptsNsOf(held.get()), true);
        av_frame_unref(held.get());
    }
    active = false;
}

void VideoDecoder::DecodeRun::decodeError(int rc)
{
    if (++decodeErrors < kMaxConsecutiveDecodeErrors)
        return;
    d.m_failed(QStringLiteral("cannot decode the video of %1: %2").arg(d.m_path, ff::errorString(rc)));
    exactSeek.end();
    active = false;
    draining = true;
}

bool VideoDecoder::DecodeRun::handOn(const AVFrame *picture, std::int64_t ptsNs, bool seekResult)
{
    QImage image = converter.toImage(picture, QSize(picture->width, picture->height), SWS_BILINEAR);
    if (image.isNull()) {
        // Skipped; said once, not for every frame of a stream that cannot be shown.
        if (!std::exchange(conversionFailed, true))
            zaf::log::error(lcPlayback(), QStringLiteral("cannot convert a %1x%2 picture of %3 for display")
                                              .arg(picture->width).arg(picture->height).arg(d.m_path));
        return true;
    }
    VideoFrame out{std::move(image), ptsNs, current.generation, seekResult};
    if (!d.m_queue->push(std::move(out), [this] { return abandoned(); }))
        return false;
    if (d.m_framesReady)
        d.m_framesReady();
    return true;
}

std::int64_t VideoDecoder::DecodeRun::ptsNsOf(const AVFrame *picture)
{
    std::int64_t ts = picture->best_effort_timestamp;
    if (ts == AV_NOPTS_VALUE)
        ts = picture->pts;
    if (ts == AV_NOPTS_VALUE)
        return lastPtsNs;
    lastPtsNs = std::llround((double(ts) * timeBase - startSeconds) * 1e9);
    return lastPtsNs;
}

} // namespace zaf::media::playback
