#pragma once

// Player: plays one PlayerItem.
//
// Threads. The Player lives on the main thread, and every public method must be called there.
// Once its item is ready it starts a video thread (demux and decode of the first video track, with
// exact seeks) and, when an audio device exists and the item has audio, an audio thread (demux,
// decode, resample, mix of every audio track) feeding the device. Pictures come back through a
// small bounded queue; the main thread never waits for I/O or decoding.
//
// Time. The media time follows a PlaybackClock anchored at each play and seek, read from a
// TimeSource: the audio device's clock when the device plays this item's sound, otherwise a steady
// clock, or whatever setTimeSource() installed. Each time the source advances, the Player moves to
// the new time at once.
//
// Callbacks, all on the main thread, in this order when one step of time crosses several:
//   1. boundary observers whose time was passed, earliest first, with currentTime() at that time
//      (if one of them pauses or seeks, the step ends there);
//   2. periodic observers (once for the step, when an interval mark was passed);
//   3. at the end of the item: the pause of ActionAtItemEnd::Pause, then PlayerItem::didPlayToEndTime.
// videoFrameChanged() follows whenever a newer picture has been taken from the decoder. Seeks, play
// and pause call every periodic observer once with the new time; they never call boundary observers.

#include "platform/media/media_time.h"
#include "platform/media/playback/playback_clock.h"
#include "platform/media/playback/playback_statistics.h"
#include "platform/media/player_item.h"

#include <QImage>
#include <QList>
#include <QObject>

#include <atomic>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>

namespace zaf::media {

namespace playback {
class FrameQueue;
class VideoDecoder;
class AudioDecoder;
class AudioOutput;
} // namespace playback

enum class ActionAtItemEnd { Pause, None };
using TimeObserverToken = quint64; // 0 is never a valid token

class Player : public QObject {
    Q_OBJECT
public:
    explicit Player(std::shared_ptr<PlayerItem> item, QObject *parent = nullptr);
    // Stops and joins the pipeline threads; safe while playing or seeking.
    ~Player() override;

    std::shared_ptr<PlayerItem> currentItem() const { return m_item; }

    // Starts playback at rate 1. Before the item is ready the request is kept and playback starts
    // when it becomes ready; on a failed item it does nothing.
    void play();
    void pause();
    float rate() const { return m_rate; }

    // Exact seek: currentTime() becomes `time` (limited to 0 ... duration) at once, and the picture
    // at that time becomes currentVideoFrame() as soon as it is decoded; the seek never waits for
    // it. Seeks issued while one is being decoded replace it: only the latest is carried out. While
    // seeks come in a quick series (a drag), the best picture at hand for the latest time is shown on
    // the way (a decoded picture of the same group of pictures, the nearest before it), and the
    // exact picture of the last seek always ends up on screen. Pictures decoded near the playhead
    // are kept (see setDecodedPictureBudget), so steps back and forth there cost no decoding.
    void seekToTime(const MediaTime &time);
    // Timescale 1000000000 (nanoseconds).
    MediaTime currentTime() const;

    void setActionAtItemEnd(ActionAtItemEnd action) { m_actionAtItemEnd = action; }
    ActionAtItemEnd actionAtItemEnd() const { return m_actionAtItemEnd; }

    // `block` runs on the main thread each time playback passes a multiple of `interval` (at most
    // once per step of the clock), and on seeks, play and pause. Returns the token, or 0 when the
    // interval is not a positive time or the block is empty.
    TimeObserverToken addPeriodicTimeObserver(const MediaTime &interval, std::function<void(const MediaTime &)> block);
    // `block` runs on the main thread when playback passes one of `times` while playing (not when
    // a seek jumps over it). Returns the token, or 0 when no time is numeric or the block is empty.
    TimeObserverToken addBoundaryTimeObserver(const QList<MediaTime> &times, std::function<void()> block);
    // Unknown tokens are ignored. A block removed while the Player is calling blocks is not called.
    void removeTimeObserver(TimeObserverToken token);

    // The current picture, as coded (the track's transform is not applied); null before the first.
    QImage currentVideoFrame() const { return m_frame; }

    // The memory the decoded pictures kept around the playhead may take, in bytes; the default is
    // kDefaultDecodedPictureBudget. Takes effect with the next decoded picture.
    void setDecodedPictureBudget(std::int64_t bytes);
    static constexpr std::int64_t kDefaultDecodedPictureBudget = 128 * 1024 * 1024;
    // What the video decoder has done so far; zeros before the item is ready.
    playback::VideoDecoderStatistics decodingStatistics() const;

    // Replaces the time source (the default is chosen when the item becomes ready). While a source
    // other than the default one is installed, playback runs silently on it. Null restores the
    // default.
    void setTimeSource(std::shared_ptr<TimeSource> source);

Q_SIGNALS:
    // Main thread: currentVideoFrame() changed.
    void videoFrameChanged();

private:
    struct PeriodicObserver {
        std::int64_t intervalNs = 0;
        std::int64_t lastMark = 0;
        std::function<void(const MediaTime &)> block;
    };
    struct BoundaryObserver {
        QList<std::int64_t> timesNs; // sorted
        std::function<void()> block;
    };

    void itemStatusChanged();
    void startPipeline();
    void requestPictures(bool playing);
    void stopPipeline();
    void chooseDefaultTimeSource();
    void installTimeSource(std::shared_ptr<TimeSource> source);
    void audioFailed(const QString &message);
    void framesReady();

    bool canRun() const;
    void startRunning();
    void stopRunning(bool keepTime);
    std::int64_t clockNs() const;
    void timeSourceAdvanced();
    void advanceTo(std::int64_t targetNs);
    bool presentDueFrame();
    // False when a block destroyed the Player.
    bool callPeriodicObservers(bool discontinuity);

    std::shared_ptr<PlayerItem> m_item;
    ActionAtItemEnd m_actionAtItemEnd = ActionAtItemEnd::Pause;
    float m_rate = 0;
    bool m_running = false;           // the clock runs: rate 1 and the item is ready
    std::int64_t m_currentNs = 0;
    std::int64_t m_durationNs = -1;   // unknown until ready
    bool m_endReported = false;
    bool m_inStep = false;            // inside advanceTo(): blocks may pause or seek
    std::uint64_t m_interruptions = 0; // counts pauses and seeks, to notice them inside a block
    std::uint64_t m_generation = 0;    // the latest video seek request
    std::int64_t m_decodedPictureBudget = kDefaultDecodedPictureBudget;
    bool m_decoderPlaying = false;     // the latest request asks for the pictures after its target

    PlaybackClock m_clock;
    std::shared_ptr<TimeSource> m_timeSource;
    bool m_customTimeSource = false;
    QMetaObject::Connection m_sourceConnection;

    std::unique_ptr<playback::FrameQueue> m_frames;
    std::unique_ptr<playback::VideoDecoder> m_videoDecoder;
    std::shared_ptr<playback::AudioOutput> m_audioOutput;
    std::unique_ptr<playback::AudioDecoder> m_audioDecoder;
    std::uint64_t m_audioRequest = 0;
    std::shared_ptr<std::atomic<bool>> m_framesNotifyPending;

    QImage m_frame;
    TimeObserverToken m_nextToken = 1;
    std::map<TimeObserverToken, PeriodicObserver> m_periodic;
    std::map<TimeObserverToken, BoundaryObserver> m_boundary;
};

} // namespace zaf::media
