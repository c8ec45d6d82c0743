#include "platform/media/player.h"
#include "platform/dispatch.h"
#include "platform/media/core/media_log.h"

#include "platform/log.h"
#include "platform/media/playback/playback_audio_decoder.h"
#include "platform/media/playback/playback_audio_output.h"
#include "platform/media/playback/playback_frame_queue.h"
#include "platform/media/core/media_log.h"
#include "platform/media/playback/playback_video_decoder.h"
#include "platform/thread_rules.h"

#include <QPointer>

#include <algorithm>
#include <cmath>
#include <limits>

namespace zaf::media {

namespace {

constexpr std::int32_t kNanoTimescale = 1000000000;
// Pictures decoded ahead of the one on screen.
constexpr std::size_t kFrameQueueCapacity = 3;

// Nanoseconds of a numeric time; false when it is not numeric or does not fit.
bool toNanoseconds(const MediaTime &time, std::int64_t *ns)
{
    if (!time.isNumeric())
        return false;
    const double seconds = time.seconds();
    if (!std::isfinite(seconds) || std::fabs(seconds) > 9.0e9)
        return false;
    const MediaTime converted = time.convertScale(kNanoTimescale);
    if (!converted.isNumeric())
        return false;
    *ns = converted.value;
    return true;
}

} // namespace

Player::Player(std::shared_ptr<PlayerItem> item, QObject *parent)
    : QObject(parent)
    , m_item(std::move(item))
    , m_framesNotifyPending(std::make_shared<std::atomic<bool>>(false))
{
    ZAF_ASSERT_MAIN_THREAD();
    installTimeSource(std::make_shared<MonotonicTimeSource>());
    if (!m_item)
        return;
    m_item->setPlayer(this);
    connect(m_item.get(), &PlayerItem::statusChanged, this, &Player::itemStatusChanged);
    if (m_item->status() != PlayerItem::Status::Unknown)
        itemStatusChanged();
}

Player::~Player()
{
    ZAF_ASSERT_MAIN_THREAD();
    stopRunning(true);
    QObject::disconnect(m_sourceConnection);
    stopPipeline();
}

void Player::itemStatusChanged()
{
    ZAF_ASSERT_MAIN_THREAD();
    if (m_item->status() == PlayerItem::Status::Failed) {
        stopRunning(true);
        m_rate = 0;
        return;
    }
    if (m_item->status() != PlayerItem::Status::ReadyToPlay || m_durationNs >= 0)
        return;
    if (!toNanoseconds(m_item->duration(), &m_durationNs) || m_durationNs < 0)
        m_durationNs = 0;
    m_currentNs = std::clamp<std::int64_t>(m_currentNs, 0, m_durationNs);
    startPipeline();
    if (m_rate != 0)
        startRunning();
}

void Player::startPipeline()
{
    const std::shared_ptr<MediaAsset> asset = m_item->asset();
    const QString path = asset->url().toLocalFile();
    const QList<AssetTrack> video = asset->tracksWithMediaType(MediaType::Video);
    if (!video.isEmpty()) {
        m_frames = std::make_unique<playback::FrameQueue>(kFrameQueueCapacity);
        std::shared_ptr<std::atomic<bool>> pending = m_framesNotifyPending;
        Player *self = this;
        // Runs on the video thread; the decoder is joined before this Player goes away.
        auto framesReady = [pending, self] {
            if (!pending->exchange(true))
                zaf::dispatch::onThreadOf(self, [self] { self->framesReady(); });
        };
        auto failed = [](const QString &message) { zaf::log::error(lcPlayback(), message); };
        m_videoDecoder = std::make_unique<playback::VideoDecoder>(path, video.first().streamIndex, m_frames.get(),
            m_decodedPictureBudget, std::move(framesReady), std::move(failed));
        requestPictures(false);
    }
    if (!m_customTimeSource)
        chooseDefaultTimeSource();
}

void Player::stopPipeline()
{
    m_videoDecoder.reset();
    m_audioDecoder.reset(); // before the output: it writes into the output's ring
    m_audioOutput.reset();
    m_frames.reset();
}

void Player::chooseDefaultTimeSource()
{
    if (!m_audioOutput && m_item && m_item->status() == PlayerItem::Status::ReadyToPlay) {
        const std::shared_ptr<MediaAsset> asset = m_item->asset();
        const QList<AssetTrack> audio = asset->tracksWithMediaType(MediaType::Audio);
        const QAudioDevice device = audio.isEmpty() ? QAudioDevice() : playback::AudioOutput::defaultDevice();
        if (!device.isNull()) {
            QList<int> streams;
            for (const AssetTrack &track : audio)
                streams.append(track.streamIndex);
            m_audioOutput = std::make_shared<playback::AudioOutput>(device);
            QPointer<Player> self(this);
            auto failed = [self](const QString &message) {
                zaf::dispatch::onThreadOf(self.data(), [self, message] {
                    if (self)
                        self->audioFailed(message);
                });
            };
            m_audioOutput->setFailureHandler(failed);
            m_audioDecoder = std::make_unique<playback::AudioDecoder>(asset->url().toLocalFile(), streams,
                m_audioOutput->format(), m_audioOutput->ring(), std::move(failed));
            m_audioOutput->setReadyCheck([this] { return m_audioDecoder && m_audioDecoder->servingRequest() == m_audioRequest; });
        }
    }
    if (m_audioOutput) {
        if (m_timeSource != m_audioOutput)
            installTimeSource(m_audioOutput);
    } else if (!std::dynamic_pointer_cast<MonotonicTimeSource>(m_timeSource)) {
        installTimeSource(std::make_shared<MonotonicTimeSource>());
    }
}

void Player::installTimeSource(std::shared_ptr<TimeSource> source)
{
    const bool wasRunning = m_running;
    stopRunning(false);
    QObject::disconnect(m_sourceConnection);
    m_timeSource = std::move(source);
    m_sourceConnection = connect(m_timeSource.get(), &TimeSource::advanced, this, &Player::timeSourceAdvanced);
    if (wasRunning)
        startRunning();
}

void Player::setTimeSource(std::shared_ptr<TimeSource> source)
{
    ZAF_ASSERT_MAIN_THREAD();
    if (source) {
        m_customTimeSource = true;
        installTimeSource(std::move(source));
        return;
    }
    m_customTimeSource = false;
    chooseDefaultTimeSource();
}

void Player::audioFailed(const QString &message)
{
    zaf::log::error(lcPlayback(), message);
    const bool audioWasClock = m_timeSource && m_timeSource == m_audioOutput;
    if (audioWasClock)
        installTimeSource(std::make_shared<MonotonicTimeSource>());
    m_audioDecoder.reset();
    m_audioOutput.reset();
}

void Player::framesReady()
{
    ZAF_ASSERT_MAIN_THREAD();
    m_framesNotifyPending->store(false);
    presentDueFrame();
}

bool Player::canRun() const
{
    return m_item && m_item->status() == PlayerItem::Status::ReadyToPlay && m_durationNs >= 0;
}

std::int64_t Player::clockNs() const
{
    const double seconds = m_clock.mediaTimeAt(m_timeSource->now());
    if (!std::isfinite(seconds))
        return m_currentNs;
    return std::llround(std::clamp(seconds, -9.0e9, 9.0e9) * 1e9);
}

void Player::startRunning()
{
    if (m_running || !canRun())
        return;
    m_running = true;
    if (!m_decoderPlaying)
        requestPictures(true);
    if (m_timeSource == m_audioOutput && m_audioDecoder)
        m_audioRequest = m_audioDecoder->start(m_currentNs);
    // Anchored before the source is switched on: switching on may already report an advance.
    m_clock.setAnchor(double(m_currentNs) / 1e9, m_timeSource->now(), 1);
    m_timeSource->setActive(true);
}

void Player::stopRunning(bool keepTime)
{
    if (!m_running)
        return;
    if (!keepTime && !m_inStep)
        m_currentNs = std::clamp<std::int64_t>(clockNs(), m_currentNs, m_durationNs);
    m_running = false;
    m_timeSource->setActive(false);
    if (m_timeSource == m_audioOutput && m_audioDecoder)
        m_audioDecoder->stop();
}

void Player::play()
{
    ZAF_ASSERT_MAIN_THREAD();
    if (!m_item || m_item->status() == PlayerItem::Status::Failed) {
        zaf::log::info(lcPlayback(), QStringLiteral("play() ignored: the item cannot be played"));
        return;
    }
    if (m_rate != 0)
        return;
    m_rate = 1;
    m_endReported = false; // playing on from the end reaches it again
    startRunning();
    callPeriodicObservers(true);
}

void Player::pause()
{
    ZAF_ASSERT_MAIN_THREAD();
    if (m_rate == 0)
        return;
    m_rate = 0;
    stopRunning(false);
    requestPictures(false);
    ++m_interruptions;
    presentDueFrame();
    callPeriodicObservers(true);
}

void Player::seekToTime(const MediaTime &time)
{
    ZAF_ASSERT_MAIN_THREAD();
    std::int64_t ns = 0;
    if (!toNanoseconds(time, &ns)) {
        zaf::log::error(lcPlayback(), QStringLiteral("seek to %1 ignored: not a numeric time").arg(time.debugDescription()));
        return;
    }
    ns = std::max<std::int64_t>(ns, 0);
    if (m_durationNs >= 0)
        ns = std::min(ns, m_durationNs);
    const bool wasRunning = m_running;
    stopRunning(true);
    m_currentNs = ns;
    m_endReported = false;
    ++m_interruptions;
    requestPictures(wasRunning);
    if (wasRunning)
        startRunning();
    callPeriodicObservers(true);
}

// The picture at the current time, and while `playing` the pictures after it; paused, the decoder
// decodes nothing beyond what is on screen.
void Player::requestPictures(bool playing)
{
    m_decoderPlaying = playing;
    if (m_videoDecoder)
        m_videoDecoder->seek(m_currentNs, ++m_generation, playing);
}

void Player::setDecodedPictureBudget(std::int64_t bytes)
{
    ZAF_ASSERT_MAIN_THREAD();
    m_decodedPictureBudget = std::max<std::int64_t>(bytes, 0);
    if (m_videoDecoder)
        m_videoDecoder->setWindowBudget(m_decodedPictureBudget);
}

playback::VideoDecoderStatistics Player::decodingStatistics() const
{
    ZAF_ASSERT_MAIN_THREAD();
    return m_videoDecoder ? m_videoDecoder->statistics() : playback::VideoDecoderStatistics{};
}

MediaTime Player::currentTime() const
{
    return MediaTime::make(m_currentNs, kNanoTimescale);
}

TimeObserverToken Player::addPeriodicTimeObserver(const MediaTime &interval, std::function<void(const MediaTime &)> block)
{
    ZAF_ASSERT_MAIN_THREAD();
    std::int64_t ns = 0;
    if (!block || !toNanoseconds(interval, &ns) || ns <= 0) {
        zaf::log::error(lcPlayback(), QStringLiteral("periodic time observer refused: interval %1").arg(interval.debugDescription()));
        return 0;
    }
    const TimeObserverToken token = m_nextToken++;
    m_periodic[token] = PeriodicObserver{ns, m_currentNs / ns, std::move(block)};
    return token;
}

TimeObserverToken Player::addBoundaryTimeObserver(const QList<MediaTime> &times, std::function<void()> block)
{
    ZAF_ASSERT_MAIN_THREAD();
    QList<std::int64_t> ns;
    for (const MediaTime &time : times) {
        std::int64_t value = 0;
        if (toNanoseconds(time, &value))
            ns.append(value);
    }
    if (!block || ns.isEmpty()) {
        zaf::log::error(lcPlayback(), QStringLiteral("boundary time observer refused: no numeric time"));
        return 0;
    }
    std::sort(ns.begin(), ns.end());
    const TimeObserverToken token = m_nextToken++;
    m_boundary[token] = BoundaryObserver{ns, std::move(block)};
    return token;
}

void Player::removeTimeObserver(TimeObserverToken token)
{
    ZAF_ASSERT_MAIN_THREAD();
    m_periodic.erase(token);
    m_boundary.erase(token);
}

void Player::timeSourceAdvanced()
{
    ZAF_ASSERT_MAIN_THREAD();
    if (m_running && !m_inStep)
        advanceTo(clockNs());
}

void Player::advanceTo(std::int64_t targetNs)
{
    QPointer<Player> guard(this);
    const std::uint64_t interruptions = m_interruptions;
    m_inStep = true;
    auto interrupted = [&] { return !guard || m_interruptions != interruptions || !m_running; };

    bool atEnd = false;
    if (targetNs >= m_durationNs) {
        targetNs = m_durationNs;
        atEnd = true;
    }
    targetNs = std::max(targetNs, m_currentNs);

    // Boundaries passed on the way, earliest first.
    for (;;) {
        std::int64_t next = std::numeric_limits<std::int64_t>::max();
        for (const auto &[token, observer] : m_boundary) {
            auto it = std::upper_bound(observer.timesNs.begin(), observer.timesNs.end(), m_currentNs);
            if (it != observer.timesNs.end() && *it <= targetNs)
                next = std::min(next, *it);
        }
        if (next == std::numeric_limits<std::int64_t>::max())
            break;
        m_currentNs = next;
        QList<TimeObserverToken> due;
        for (const auto &[token, observer] : m_boundary) {
            if (observer.timesNs.contains(next))
                due.append(token);
        }
        for (TimeObserverToken token : due) {
            auto it = m_boundary.find(token);
            if (it == m_boundary.end())
                continue;
            const std::function<void()> block = it->second.block;
            block();
            if (!guard)
                return;
        }
        if (interrupted()) {
            m_inStep = false;
            presentDueFrame();
            return;
        }
    }

    m_currentNs = targetNs;
    presentDueFrame();
    if (!callPeriodicObservers(false))
        return;
    if (interrupted()) {
        m_inStep = false;
        return;
    }
    if (atEnd && !m_endReported) {
        m_endReported = true;
        if (m_actionAtItemEnd == ActionAtItemEnd::Pause) {
            m_rate = 0;
            stopRunning(true);
            ++m_interruptions;
            if (!callPeriodicObservers(true))
                return;
        }
        m_inStep = false;
        const std::shared_ptr<PlayerItem> item = m_item;
        Q_EMIT item->didPlayToEndTime();
        return;
    }
    m_inStep = false;
}

bool Player::presentDueFrame()
{
    if (!m_frames)
        return false;
    std::optional<playback::VideoFrame> frame = m_frames->takeDue(m_generation, m_currentNs);
    if (!frame)
        return false;
    // The answer to a play or pause is often the picture already on screen (the same image).
    if (frame->image.cacheKey() == m_frame.cacheKey())
        return false;
    m_frame = std::move(frame->image);
    Q_EMIT videoFrameChanged();
    return true;
}

bool Player::callPeriodicObservers(bool discontinuity)
{
    QPointer<Player> guard(this);
    QList<TimeObserverToken> tokens;
    for (const auto &entry : m_periodic)
        tokens.append(entry.first);
    for (TimeObserverToken token : tokens) {
        auto it = m_periodic.find(token);
        if (it == m_periodic.end())
            continue;
        const std::int64_t mark = m_currentNs / it->second.intervalNs;
        if (!discontinuity && mark == it->second.lastMark)
            continue;
        it->second.lastMark = mark;
        const std::function<void(const MediaTime &)> block = it->second.block;
        block(currentTime());
        if (!guard)
            return false;
    }
    return true;
}

} // namespace zaf::media
