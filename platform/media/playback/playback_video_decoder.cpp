#include "platform/media/playback/playback_video_decoder.h"

#include "platform/log.h"
#include "platform/media/core/decoder_setup.h"
#include "platform/media/core/frame_converter.h"
#include "platform/media/core/media_input.h"
#include "platform/media/core/media_log.h"
#include "platform/media/playback/playback_frame_window.h"

#include <cmath>
#include <limits>
#include <utility>

namespace zaf::media::playback {

namespace {

using Clock = std::chrono::steady_clock;

// A stalled source (EAGAIN over and over) ends the stream after this many attempts in a row.
constexpr int kMaxConsecutiveReadRetries = 1000;
// A stream that keeps failing to decode is given up after this many errors in a row.
constexpr int kMaxConsecutiveDecodeErrors = 200;
// Requests closer together than this are a drag: stand-in pictures are shown on the way.
constexpr auto kDragGap = std::chrono::milliseconds(150);
// While a drag's exact picture is being decoded, the stand-in is refreshed at most this often
// (about a display refresh of the eye, not of the screen: each costs a conversion).
constexpr auto kStandInInterval = std::chrono::milliseconds(30);
// Without an index, the stand-in may be this far before the target.
constexpr std::int64_t kStandInReachNs = 1'000'000'000;
// Seeks for one request beyond which the decoder gives up on it (each lands earlier than the last).
constexpr int kMaxSeeksPerRequest = 12;
// Decoding on rather than seeking while the next keyframe is at most this far ahead.
constexpr std::int64_t kDecodeOnMarginNs = 250'000'000;
// A seek that landed after its target tries again this much before the picture it landed on.
constexpr std::int64_t kLateSeekMarginNs = 100'000'000;
constexpr std::int64_t kNoTime = std::numeric_limits<std::int64_t>::min();

std::int64_t pictureBytes(const AVFrame *picture)
{
    std::int64_t bytes = 0;
    for (const AVBufferRef *buffer : picture->buf)
        bytes += buffer ? std::int64_t(buffer->size) : 0;
    return bytes;
}

} // namespace

// One run of the decoder thread: the opened stream and its decoder, the window of decoded pictures,
// and where the request under way stands. Every step runs on the decoder thread.
struct VideoDecoder::DecodeRun {
    explicit DecodeRun(VideoDecoder &owner) : d(owner), window(owner.m_budget.load()) {}

    // Opens the input, its video stream and a decoder for it; says why not through `failed`.
    bool open();
    // Takes a new request, if one came, and begins it; while there is nothing to do, waits for one.
    // False once the thread is to stop.
    bool takeRequest();
    void begin(const Request &request);
    // Hands on the next picture the request wants when the window holds it (or a stand-in while
    // dragging). False when decoding has to come first.
    bool handOnFromWindow();
    // Seeks unless decoding on from where the decoder stands reaches the picture at `neededNs`
    // soonest.
    void positionFor(std::int64_t neededNs);
    // Receives one picture into the window, or feeds the decoder one packet.
    void decodeStep();
    bool readPacket();
    void store(AVFrame *picture);
    void endOfStream();
    void decodeError(int rc);
    // Converts the picture at `ptsNs` from the window and queues it, waiting for room. False when
    // abandoned while waiting.
    bool handOn(std::int64_t ptsNs, bool seekResult, bool preview);
    void publishStatistics();
    std::int64_t ptsNsOf(const AVFrame *picture);
    // The time of the keyframe at or before `timeNs` from the stream's index; kNoTime when unknown.
    std::int64_t keyframeAtOrBefore(std::int64_t timeNs) const;
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
    FrameConverter converter;
    bool conversionFailed = false;
    FrameWindow window;

    // Where the decoder stands. `positioned`: its output runs on from `headNs` (the last picture it
    // produced), or, with no picture yet since the seek, from the keyframe at `seekPointNs`.
    bool positioned = false;
    std::optional<std::int64_t> headNs;
    std::optional<std::int64_t> beforeHeadNs; // the picture it produced before that one
    std::int64_t seekPointNs = 0;
    std::int64_t runKeyframeNs = kNoTime; // the index entry the last seek was aimed at
    std::int64_t seekTargetNs = 0;
    bool seekFromStart = false; // the last seek went to the stream's first keyframe
    // Demuxers seek by decoding time: with reordered pictures a seek can land on a keyframe shown
    // after the target. The next seek for the same picture then goes this much further back.
    std::optional<std::int64_t> lateFor;
    std::int64_t lateBackoffNs = 0;
    std::int64_t streamStartNs = 0;
    bool draining = false; // the input is read to its end; the decoder gives up what it holds
    int readRetries = 0;
    int decodeErrors = 0;
    std::int64_t lastPtsNs = 0; // the time given to a picture that carries none

    // The request under way.
    Request current{0, 0, false, {}};
    Clock::time_point previousPostedAt{};
    bool active = false;   // false: nothing to do until the next request
    bool dragging = false; // the request came close after the one before it
    bool answered = false; // its exact picture was handed on
    int endsReached = 0;   // how often decoding hit the end of the stream for it
    int seeksForRequest = 0;
    std::optional<std::int64_t> delivered; // the last picture handed on for it, once answered

    // The last picture handed on, whatever the request, and its conversion.
    std::optional<std::int64_t> shownNs;
    QImage shownImage;
    Clock::time_point shownAt{};
};

VideoDecoder::VideoDecoder(QString path, int streamIndex, FrameQueue *queue, std::int64_t windowBudgetBytes,
    std::function<void()> framesReady, std::function<void(const QString &)> failed)
    : m_path(std::move(path))
    , m_streamIndex(streamIndex)
    , m_queue(queue)
    , m_framesReady(std::move(framesReady))
    , m_failed(std::move(failed))
    , m_budget(windowBudgetBytes)
    , m_thread([this] { m_queue->wake(); })
{
    m_thread.start([this] { run(); });
}

VideoDecoder::~VideoDecoder()
{
    m_thread.stop();
}

void VideoDecoder::seek(std::int64_t targetNs, std::uint64_t generation, bool playing)
{
    m_thread.post(Request{targetNs, generation, playing, Clock::now()});
}

VideoDecoderStatistics VideoDecoder::statistics() const
{
    return {m_decoded.load(), m_windowBytes.load(), m_windowPeakBytes.load(), m_budget.load(), m_windowPictures.load()};
}

void VideoDecoder::run()
{
    DecodeRun run(*this);
    if (!run.open())
        return;
    while (run.takeRequest()) {
        if (!run.active || run.handOnFromWindow())
            continue;
        if (!run.active || run.abandoned())
            continue;
        run.positionFor(run.answered ? *run.delivered : run.current.targetNs);
        if (run.active)
            run.decodeStep();
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
    if (stream->start_time != AV_NOPTS_VALUE)
        streamStartNs = std::llround((double(stream->start_time) * timeBase - startSeconds) * 1e9);
    packet = ff::makePacket();
    decoded = ff::makeFrame();
    if (!packet || !decoded) {
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
        begin(next->request);
    return true;
}

void VideoDecoder::DecodeRun::begin(const Request &request)
{
    dragging = previousPostedAt != Clock::time_point{} && request.postedAt - previousPostedAt < kDragGap;
    previousPostedAt = request.postedAt;
    current = request;
    active = true;
    answered = false;
    endsReached = 0;
    seeksForRequest = 0;
    delivered.reset();
}

bool VideoDecoder::DecodeRun::handOnFromWindow()
{
    if (answered) {
        if (!current.playing || window.isLast(*delivered)) {
            active = false; // paused on the answer, or the stream is played out
            return true;
        }
        const std::optional<std::int64_t> next = window.successorOf(*delivered);
        if (!next)
            return false;
        if (handOn(*next, false, false))
            delivered = next;
        return true;
    }
    if (const std::optional<std::int64_t> exact = window.exactAt(current.targetNs)) {
        if (handOn(*exact, true, false)) {
            answered = true;
            delivered = exact;
        }
        return true;
    }
    if (!dragging || (shownNs && Clock::now() - shownAt < kStandInInterval))
        return false;
    const std::int64_t keyframe = keyframeAtOrBefore(current.targetNs);
    const std::optional<std::int64_t> standIn = window.latestAt(current.targetNs,
        keyframe != kNoTime ? keyframe : current.targetNs - kStandInReachNs);
    if (!standIn || standIn == shownNs)
        return false;
    handOn(*standIn, false, true);
    return true;
}

void VideoDecoder::DecodeRun::positionFor(std::int64_t neededNs)
{
    const std::int64_t from = headNs ? *headNs : seekPointNs;
    const std::int64_t backoffNs = lateFor == neededNs ? lateBackoffNs : 0;
    if (lateFor != neededNs)
        lateFor.reset();
    const std::int64_t keyframe = keyframeAtOrBefore(neededNs - backoffNs);
    // Decoding on reaches the picture when the decoder stands before it, and is the cheaper way
    // unless a seek would start at a keyframe well between the two. The index gives decoding
    // times, not the presentation times of reordered pictures, so a seek is only worth it toward
    // another index entry than the one this run started from, and beyond a margin.
    const bool seekSkipsAhead = keyframe != kNoTime && keyframe != runKeyframeNs && keyframe > from + kDecodeOnMarginNs;
    if (positioned && from <= neededNs && !seekSkipsAhead)
        return;
    if (++seeksForRequest > kMaxSeeksPerRequest) {
        // A stream whose times the window cannot make sense of: show what there is and stop.
        zaf::log::error(lcPlayback(), QStringLiteral("%1: no picture found for %2 s after %3 seeks")
                                          .arg(d.m_path).arg(double(neededNs) / 1e9).arg(kMaxSeeksPerRequest));
        if (!answered) {
            if (const std::optional<std::int64_t> latest = window.latestAt(current.targetNs, kNoTime))
                handOn(*latest, true, false);
        }
        active = false;
        return;
    }
    const double targetSeconds = double(neededNs - backoffNs) / 1e9 + startSeconds;
    const std::int64_t ts = std::llround(targetSeconds / timeBase);
    int rc = av_seek_frame(format.get(), d.m_streamIndex, ts, AVSEEK_FLAG_BACKWARD);
    if (rc < 0)
        rc = av_seek_frame(format.get(), d.m_streamIndex, stream->start_time == AV_NOPTS_VALUE ? 0 : stream->start_time, AVSEEK_FLAG_BACKWARD);
    if (rc < 0 && !d.m_thread.stopping())
        zaf::log::error(lcPlayback(), QStringLiteral("cannot seek in %1: %2").arg(d.m_path, ff::errorString(rc)));
    avcodec_flush_buffers(codec.get());
    positioned = true;
    headNs.reset();
    beforeHeadNs.reset();
    seekPointNs = keyframe != kNoTime ? std::min(keyframe, neededNs) : neededNs;
    runKeyframeNs = keyframe;
    seekTargetNs = neededNs;
    seekFromStart = neededNs - backoffNs <= streamStartNs || rc < 0;
    draining = false;
    readRetries = 0;
}

void VideoDecoder::DecodeRun::decodeStep()
{
    const int rc = avcodec_receive_frame(codec.get(), decoded.get());
    if (rc == 0) {
        decodeErrors = 0;
        store(decoded.get());
        av_frame_unref(decoded.get());
    } else if (rc == AVERROR(EAGAIN)) {
        readPacket();
    } else if (rc == AVERROR_EOF) {
        endOfStream();
    } else {
        decodeError(rc);
    }
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

void VideoDecoder::DecodeRun::store(AVFrame *picture)
{
    AVFrame *kept = av_frame_alloc();
    if (!kept)
        return;
    av_frame_move_ref(kept, picture);
    const std::int64_t ptsNs = ptsNsOf(kept);
    const std::int64_t bytes = pictureBytes(kept);
    // The first picture after a seek that starts after the target: when the seek went to the
    // stream's start, nothing comes before it, so it is what is shown at the target; otherwise the
    // seek landed late, and the next one goes further back.
    const bool late = !headNs && ptsNs > seekTargetNs;
    const bool first = late && seekFromStart;
    if (late && !first) {
        lateBackoffNs = lateFor == seekTargetNs ? 2 * lateBackoffNs : ptsNs - seekTargetNs + kLateSeekMarginNs;
        lateFor = seekTargetNs;
    }
    window.insert(ptsNs, FrameWindow::Picture(kept, [](const AVFrame *f) {
        AVFrame *owned = const_cast<AVFrame *>(f);
        av_frame_free(&owned);
    }), bytes, headNs, first);
    beforeHeadNs = std::exchange(headNs, ptsNs);
    d.m_decoded.fetch_add(1);
    window.setBudget(d.m_budget.load());
    window.trim(answered ? *delivered : current.targetNs, {headNs, beforeHeadNs, shownNs});
    publishStatistics();
}

// The decoder gave up everything it held: the last picture is shown at every later time. A request
// that the window still cannot answer is answered with the last picture at or before its target.
void VideoDecoder::DecodeRun::endOfStream()
{
    if (headNs)
        window.markLast(*headNs);
    positioned = false;
    headNs.reset();
    if (++endsReached < 2 || d.m_thread.stopping())
        return;
    if (!answered) {
        if (const std::optional<std::int64_t> last = window.latestAt(current.targetNs, kNoTime)) {
            handOn(*last, true, false);
        }
    }
    active = false;
}

void VideoDecoder::DecodeRun::decodeError(int rc)
{
    if (++decodeErrors < kMaxConsecutiveDecodeErrors)
        return;
    d.m_failed(QStringLiteral("cannot decode the video of %1: %2").arg(d.m_path, ff::errorString(rc)));
    active = false;
    positioned = false;
    headNs.reset();
    decodeErrors = 0;
}

bool VideoDecoder::DecodeRun::handOn(std::int64_t ptsNs, bool seekResult, bool preview)
{
    if (ptsNs != shownNs || shownImage.isNull()) {
        const FrameWindow::Picture picture = window.picture(ptsNs);
        if (!picture)
            return true;
        QImage image = converter.toImage(picture.get(), QSize(picture->width, picture->height), SWS_BILINEAR);
        if (image.isNull()) {
            // Skipped; said once, not for every frame of a stream that cannot be shown.
            if (!std::exchange(conversionFailed, true))
                zaf::log::error(lcPlayback(), QStringLiteral("cannot convert a %1x%2 picture of %3 for display")
                                                  .arg(picture->width).arg(picture->height).arg(d.m_path));
            return true;
        }
        shownImage = std::move(image);
        shownNs = ptsNs;
    }
    shownAt = Clock::now();
    VideoFrame out{shownImage, ptsNs, current.generation, seekResult, preview};
    if (!d.m_queue->push(std::move(out), [this] { return abandoned(); }))
        return false;
    if (d.m_framesReady)
        d.m_framesReady();
    return true;
}

void VideoDecoder::DecodeRun::publishStatistics()
{
    d.m_windowBytes.store(window.bytes());
    d.m_windowPictures.store(std::int64_t(window.size()));
    if (window.bytes() > d.m_windowPeakBytes.load())
        d.m_windowPeakBytes.store(window.bytes());
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

std::int64_t VideoDecoder::DecodeRun::keyframeAtOrBefore(std::int64_t timeNs) const
{
    const std::int64_t ts = std::llround((double(timeNs) / 1e9 + startSeconds) / timeBase);
    const AVIndexEntry *entry = avformat_index_get_entry_from_timestamp(stream, ts, AVSEEK_FLAG_BACKWARD);
    if (!entry)
        return kNoTime;
    return std::llround((double(entry->timestamp) * timeBase - startSeconds) * 1e9);
}

} // namespace zaf::media::playback
