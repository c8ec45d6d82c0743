// The Player on a manual clock, its layer and audio stage; the tests wait only for loading and decoding.
#include "platform/media/playback/playback_audio_decoder.h"
#include "platform/media/player.h"
#include "platform/media/player_layer.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/media/unusable_movies.h"
#include "tests/support/temp_dir.h"
#include "tests/support/wait_until.h"

#include <QDeadlineTimer>
#include <QFile>
#include <QThread>

#include <gtest/gtest.h>

#include <cmath>
#include <memory>
#include <numbers>
#include <vector>

namespace zaf::media {
namespace {

using zaf::fixture::FixtureSpec;
using zaf::test::readFrameNumber;
using zaf::test::sharedFixtureMovie;
using zaf::test::waitUntil;

ZAF_PRINT_CASES_AS_NAMES

// 4 s at 320 x 240 with a keyframe every 30 frames; 12 s and 2 s small ones; 1 s turned 90 degrees.
const FixtureSpec kMovie{.seconds = 4, .gop = 30};
const FixtureSpec kLong{.seconds = 12, .width = 160, .height = 120};
const FixtureSpec kShort{.seconds = 2, .width = 160, .height = 120};
const FixtureSpec kRotated{.seconds = 1, .rotation = 90};

MediaTime seconds(double s)
{
    return MediaTime::fromSeconds(s, 1000000000);
}

std::shared_ptr<PlayerItem> itemFor(const QString &path)
{
    return std::make_shared<PlayerItem>(MediaAsset::assetWithURL(QUrl::fromLocalFile(path)));
}

bool loaded(const PlayerItem &item)
{
    return waitUntil([&] { return item.status() != PlayerItem::Status::Unknown; });
}

// Lets the event loop run for `ms`, for late deliveries that must not come.
void settle(int ms)
{
    waitUntil([] { return false; }, ms);
}

TEST(PlaybackClockTest, MediaTimeFollowsTheAnchorAtItsRate)
{
    PlaybackClock clock;
    clock.setAnchor(5.0, 100.0, 1.0);
    EXPECT_DOUBLE_EQ(clock.mediaTimeAt(102.5), 7.5);
    clock.setAnchor(1.0, 10.0, 2.0);
    EXPECT_DOUBLE_EQ(clock.mediaTimeAt(11.0), 3.0);
}

TEST(PlaybackClockTest, ManualSourceOnlyMovesForward)
{
    ManualTimeSource source(3.0);
    int advanced = 0;
    QObject::connect(&source, &TimeSource::advanced, [&] { ++advanced; });
    source.advance(0.5);
    source.advance(-2);
    EXPECT_DOUBLE_EQ(source.now(), 3.5);
    EXPECT_EQ(advanced, 2);
}

// An item becomes ready once, with the duration ffprobe reads.
TEST(PlayerItemTest, ItemBecomesReadyWithDurationOfTheFileAndSignalsOnce)
{
    const QString path = sharedFixtureMovie(kShort);
    auto item = itemFor(path);
    EXPECT_EQ(item->status(), PlayerItem::Status::Unknown);
    EXPECT_FALSE(item->duration().isValid());
    int changes = 0;
    QObject::connect(item.get(), &PlayerItem::statusChanged, [&] { ++changes; });
    ASSERT_TRUE(loaded(*item));
    settle(100);
    EXPECT_EQ(changes, 1);
    EXPECT_EQ(item->status(), PlayerItem::Status::ReadyToPlay);
    EXPECT_FALSE(item->error().has_value());
    const double probed = zaf::test::ffprobe(path)["format"].toObject()["duration"].toString().toDouble();
    EXPECT_NEAR(item->duration().seconds(), probed, 0.001);
    EXPECT_EQ(item->currentTime(), MediaTime::zero());
}

// Unusable files fail the item once with a logged error, and a player of it stays inert.
class PlayerItemFailure : public ::testing::TestWithParam<zaf::test::UnusableMovie> {};

TEST_P(PlayerItemFailure, FailsOnceWithALoggedErrorAndAnInertPlayer)
{
    zaf::test::ScratchDir dir;
    const QString path = GetParam().make(dir);
    zaf::test::LogCapture log;
    auto item = itemFor(path);
    int changes = 0;
    QObject::connect(item.get(), &PlayerItem::statusChanged, [&] { ++changes; });
    ASSERT_TRUE(loaded(*item));
    EXPECT_EQ(item->status(), PlayerItem::Status::Failed);
    EXPECT_EQ(changes, 1);
    ASSERT_TRUE(item->error().has_value());
    EXPECT_EQ(item->error()->domain, QString::fromUtf8(kMediaErrorDomain));
    EXPECT_FALSE(item->duration().isValid());
    const QStringList messages = log.messages(QStringLiteral("zaf.media.playback"));
    EXPECT_TRUE(std::any_of(messages.begin(), messages.end(),
                            [&](const QString &m) { return m.startsWith(QStringLiteral("Cannot play")) && m.contains(path); }))
        << messages.join(u'\n').toStdString();

    Player player(item);
    auto clock = std::make_shared<ManualTimeSource>();
    player.setTimeSource(clock);
    player.play();
    EXPECT_EQ(player.rate(), 0.0f);
    player.seekToTime(MediaTime::make(1, 1));
    clock->advance(1);
    EXPECT_TRUE(player.currentVideoFrame().isNull());
}

INSTANTIATE_TEST_SUITE_P(Files, PlayerItemFailure, ::testing::ValuesIn(zaf::test::unusableMovies()), zaf::test::caseName);

TEST(PlayerItemTest, ItemWithoutAssetFails)
{
    PlayerItem noAsset(nullptr);
    ASSERT_TRUE(loaded(noAsset));
    EXPECT_EQ(noAsset.status(), PlayerItem::Status::Failed);
}

// Items and players released while loading do not crash.
TEST(PlayerItemTest, ItemDestroyedWhileLoadingIsSafe)
{
    zaf::test::ScratchDir dir;
    const QString path = dir.write(QStringLiteral("other.mp4"), 1000);
    for (int i = 0; i < 5; ++i) {
        auto item = itemFor(path);
        auto player = std::make_unique<Player>(item);
        player.reset();
        item.reset(); // the load completes after the item is gone
    }
    settle(200);
}

// The audio stage alone (no device): every audio track decoded, resampled to stereo and summed at
// unity gain into the ring, from the requested time to the end.
TEST(PlayerAudioMixTest, DecoderSumsEveryTrackAtUnityGainFromRequestedTime)
{
    const QString path = sharedFixtureMovie({.seconds = 2, .width = 64, .height = 48, .audioTracks = 2});
    const QList<QJsonObject> audio = zaf::test::probeStreams(path, "audio");
    ASSERT_EQ(audio.size(), 2);
    playback::AudioOutputFormat format{44100, 2, true};
    playback::AudioRing ring(format.sampleRate * format.bytesPerFrame()); // one second
    QString failure;
    playback::AudioDecoder decoder(path, {audio[0]["index"].toInt(), audio[1]["index"].toInt()},
                                   format, &ring, [&](const QString &message) { failure = message; });
    const std::uint64_t request = decoder.start(1'500'000'000); // 1.5 s: 0.5 s left

    std::vector<float> samples;
    QDeadlineTimer deadline(15000);
    while (!deadline.hasExpired() && !(decoder.servingRequest() == request && ring.ended() && ring.available() == 0)) {
        std::vector<float> chunk(4096);
        const qsizetype got = ring.read(reinterpret_cast<char *>(chunk.data()), qsizetype(chunk.size() * sizeof(float)));
        if (decoder.servingRequest() == request)
            samples.insert(samples.end(), chunk.begin(), chunk.begin() + got / qsizetype(sizeof(float)));
        if (got == 0)
            QThread::msleep(5);
    }
    EXPECT_TRUE(failure.isEmpty()) << failure.toStdString();
    ASSERT_TRUE(ring.ended());
    // 0.5 s of stereo, within the tail of the AAC stream.
    EXPECT_NEAR(double(samples.size()) / 2 / format.sampleRate, 0.5, 0.03);
    for (int channel : {0, 1}) {
        for (int track : {0, 1}) {
            double re = 0, im = 0;
            for (std::size_t i = 0; i < samples.size() / 2; ++i) {
                const double phase = 2 * std::numbers::pi * zaf::fixture::toneFrequency(track) * double(i) / format.sampleRate;
                re += samples[i * 2 + channel] * std::cos(phase);
                im += samples[i * 2 + channel] * std::sin(phase);
            }
            EXPECT_NEAR(4 * std::hypot(re, im) / double(samples.size()), zaf::fixture::kToneAmplitude, 0.05) << channel << " " << track;
        }
    }
    for (float v : samples)
        ASSERT_LE(std::fabs(v), 1.0f);
}

class PlayerTest : public ::testing::Test {
protected:
    // A Player of `shape`'s movie on the manual clock, with its item ready.
    std::unique_ptr<Player> readyPlayer(const FixtureSpec &shape) { return readyPlayer(sharedFixtureMovie(shape)); }
    std::unique_ptr<Player> readyPlayer(const QString &path)
    {
        EXPECT_FALSE(path.isEmpty());
        auto item = itemFor(path);
        auto player = std::make_unique<Player>(item);
        player->setTimeSource(m_clock);
        EXPECT_TRUE(loaded(*item));
        EXPECT_EQ(item->status(), PlayerItem::Status::ReadyToPlay);
        return player;
    }
    static int shownNumber(const Player &player) { return readFrameNumber(player.currentVideoFrame()); }

    std::shared_ptr<ManualTimeSource> m_clock = std::make_shared<ManualTimeSource>(100.0);
};

// Boundary observers fire in order, each at its own time, whether the clock moves in small steps or
// jumps past several in one; one that pauses stops playback exactly there.
class PlayerBoundaryTest : public PlayerTest, public ::testing::WithParamInterface<bool> {};

TEST_P(PlayerBoundaryTest, ObserversFireAtTheirTimesAndPauseThere)
{
    const bool oneJump = GetParam();
    auto player = readyPlayer(kLong);
    player->seekToTime(seconds(5));
    QList<double> order;
    player->addBoundaryTimeObserver({seconds(9)}, [&] { order.append(player->currentTime().seconds()); });
    player->addBoundaryTimeObserver({seconds(10), seconds(11.5)}, [&] {
        order.append(player->currentTime().seconds());
        player->pause();
    });
    player->play();
    EXPECT_EQ(player->rate(), 1.0f);
    for (int i = 0; i < (oneJump ? 1 : 100); ++i)
        m_clock->advance(oneJump ? 7 : 0.07); // 5 s -> 12 s
    EXPECT_EQ(order, (QList<double>{9, 10}));
    EXPECT_EQ(player->rate(), 0.0f);
    EXPECT_EQ(player->currentTime(), seconds(10));
    EXPECT_EQ(player->currentItem()->currentTime(), seconds(10));
    player->play();
    m_clock->advance(3);
    EXPECT_EQ(order, (QList<double>{9, 10, 11.5}));
    EXPECT_EQ(player->currentTime(), seconds(11.5));
}

INSTANTIATE_TEST_SUITE_P(Clock, PlayerBoundaryTest, ::testing::Bool(),
                         [](const auto &info) { return info.param ? "OneJump" : "SmallSteps"; });

// Observers stay silent when a seek jumps over their time or once removed.
TEST_F(PlayerTest, ObserversStaySilentWhenASeekJumpsOverThemOrOnceRemoved)
{
    auto player = readyPlayer(kLong);
    int fired = 0;
    const TimeObserverToken token = player->addBoundaryTimeObserver({seconds(3)}, [&] { ++fired; });
    EXPECT_NE(token, 0u);
    player->removeTimeObserver(player->addPeriodicTimeObserver(seconds(0.1), [&](const MediaTime &) { ++fired; }));
    player->play();
    player->seekToTime(seconds(4)); // jumps over 3 s while playing
    m_clock->advance(0.5);
    EXPECT_EQ(fired, 0);
    player->seekToTime(seconds(2));
    player->removeTimeObserver(token);
    m_clock->advance(2);
    EXPECT_EQ(fired, 0);
    EXPECT_EQ(player->currentTime(), seconds(4));
}

// Observers of invalid times are refused, an unknown one's removal and an invalid seek are ignored.
TEST_F(PlayerTest, InvalidTimesAreRefused)
{
    auto player = readyPlayer(kShort);
    EXPECT_EQ(player->addPeriodicTimeObserver(MediaTime::invalid(), [](const MediaTime &) {}), 0u);
    EXPECT_EQ(player->addPeriodicTimeObserver(MediaTime::zero(), [](const MediaTime &) {}), 0u);
    EXPECT_EQ(player->addBoundaryTimeObserver({MediaTime::invalid()}, [] {}), 0u);
    player->removeTimeObserver(12345);
    player->seekToTime(MediaTime::invalid());
    EXPECT_EQ(player->currentTime(), MediaTime::zero());
}

// The end pauses at the duration and signals once per arrival; with ActionAtItemEnd::None it keeps
// the rate.
class PlayerEndTest : public PlayerTest, public ::testing::WithParamInterface<ActionAtItemEnd> {};

TEST_P(PlayerEndTest, EndOfItemStopsAtTheDurationAndSignalsOncePerArrival)
{
    const ActionAtItemEnd action = GetParam();
    auto player = readyPlayer(kShort);
    player->setActionAtItemEnd(action);
    const float rateAtEnd = action == ActionAtItemEnd::None ? 1.0f : 0.0f;
    int ended = 0;
    float rateAtSignal = -1;
    QObject::connect(player->currentItem().get(), &PlayerItem::didPlayToEndTime, [&] {
        ++ended;
        rateAtSignal = player->rate();
    });
    player->play();
    for (int i = 0; i < 12; ++i)
        m_clock->advance(0.25);
    EXPECT_EQ(ended, 1);
    EXPECT_EQ(rateAtSignal, rateAtEnd);
    EXPECT_EQ(player->rate(), rateAtEnd);
    EXPECT_EQ(player->currentTime(), player->currentItem()->duration());
    m_clock->advance(1);
    EXPECT_EQ(ended, 1);

    // As the editor does: back to the start, play again, reach the end again.
    player->seekToTime(MediaTime::zero());
    player->play();
    m_clock->advance(5);
    EXPECT_EQ(ended, 2);
}

INSTANTIATE_TEST_SUITE_P(Actions, PlayerEndTest, ::testing::Values(ActionAtItemEnd::Pause, ActionAtItemEnd::None),
                         [](const auto &info) { return info.param == ActionAtItemEnd::None ? "None" : "Pause"; });

// A periodic observer fires once per interval while playing (one call for a step over several
// marks), and on play, pause and seek.
TEST_F(PlayerTest, PeriodicObserverFiresOncePerIntervalWhilePlayingAndOnPlayPauseAndSeek)
{
    auto player = readyPlayer(kLong);
    QList<double> calls;
    player->addPeriodicTimeObserver(seconds(0.25), [&](const MediaTime &t) { calls.append(t.seconds()); });
    player->play();
    EXPECT_EQ(calls, (QList<double>{0}));
    for (int i = 0; i < 8; ++i)
        m_clock->advance(0.125);
    EXPECT_EQ(calls, (QList<double>{0, 0.25, 0.5, 0.75, 1.0}));
    player->pause();
    EXPECT_EQ(calls.size(), 6);
    m_clock->advance(1); // paused: the clock moving does not move playback
    EXPECT_EQ(calls.size(), 6);
    EXPECT_EQ(player->currentTime(), seconds(1));
    player->seekToTime(seconds(3));
    ASSERT_EQ(calls.size(), 7);
    EXPECT_EQ(calls.last(), 3.0);
    player->play();
    m_clock->advance(1.1);
    EXPECT_EQ(calls.size(), 9);
    EXPECT_NEAR(calls.last(), 4.1, 1e-9);
}

TEST_F(PlayerTest, PlayBeforeReadyStartsOnceTheItemIsReady)
{
    auto item = itemFor(sharedFixtureMovie(kLong));
    Player player(item);
    player.setTimeSource(m_clock);
    player.seekToTime(MediaTime::zero());
    player.play();
    ASSERT_TRUE(waitUntil([&] { return item->status() == PlayerItem::Status::ReadyToPlay; }));
    m_clock->advance(2);
    EXPECT_EQ(player.currentTime(), seconds(2));
}

// Tearing a Player down on the real clock while it plays, decodes and seeks is safe.
TEST_F(PlayerTest, DestroyingPlayerWhilePlayingOnRealClockIsSafe)
{
    for (int round = 0; round < 3; ++round) {
        auto item = itemFor(sharedFixtureMovie(kLong));
        auto player = std::make_unique<Player>(item);
        player->play();
        if (round > 0) {
            ASSERT_TRUE(waitUntil([&] { return !player->currentVideoFrame().isNull(); }));
            for (int i = 0; i < 5; ++i)
                player->seekToTime(seconds(1.0 + i));
        }
        player.reset();
        EXPECT_EQ(item->currentTime(), MediaTime::make(0, 1000000000));
    }
}

// A new player shows the first frame; a seek shows the frame at its target, limited to the item.
struct SeekCase {
    const char *name;
    double target;
    double time; // the player's time afterwards; < 0: the item's duration
    int frame;
};

class PlayerSeekTest : public PlayerTest, public ::testing::WithParamInterface<SeekCase> {};

TEST_P(PlayerSeekTest, ShowsTheFrameAtItsTarget)
{
    const SeekCase &c = GetParam();
    auto player = readyPlayer(kMovie);
    ASSERT_TRUE(waitUntil([&] { return !player->currentVideoFrame().isNull(); }));
    EXPECT_EQ(shownNumber(*player), 0);
    EXPECT_EQ(player->currentVideoFrame().size(), QSize(320, 240));
    player->seekToTime(seconds(c.target));
    EXPECT_EQ(player->currentTime(), c.time < 0 ? player->currentItem()->duration() : seconds(c.time));
    EXPECT_TRUE(waitUntil([&] { return shownNumber(*player) == c.frame; })) << "shows " << shownNumber(*player);
}

INSTANTIATE_TEST_SUITE_P(Targets, PlayerSeekTest,
                         ::testing::Values(SeekCase{"BetweenKeyframes", 1.5, 1.5, 45}, SeekCase{"OnAKeyframe", 1.0, 1.0, 30},
                                           SeekCase{"BetweenFrameTimes", 2.51, 2.51, 75}, SeekCase{"InTheFirstGroup", 0.2, 0.2, 6},
                                           SeekCase{"NearTheEnd", 3.95, 3.95, 118}, SeekCase{"PastTheEnd", 60, -1, 119},
                                           SeekCase{"BeforeTheStart", -3, 0, 0}),
                         zaf::test::caseName);

MediaTime frameTime(int frame)
{
    return MediaTime::make(2 * std::int64_t(frame) + 1, 60); // the middle of the frame, at 30 fps
}

// A drag: each seek follows the picture the one before it brought. Every picture shown on the way
// stands in for its target from the same group of pictures, never from after it, and the exact
// picture of the last seek ends up on screen.
TEST_F(PlayerTest, DragShowsStandInsFromTheTargetsGroupAndEndsOnTheExactFrame)
{
    auto player = readyPlayer(kMovie);
    ASSERT_TRUE(waitUntil([&] { return shownNumber(*player) == 0; }));
    int target = 0;
    QList<QPair<int, int>> wrong; // (target, shown)
    QObject::connect(player.get(), &Player::videoFrameChanged, [&] {
        const int shown = shownNumber(*player);
        if (shown > target || shown < target / 30 * 30)
            wrong.append({target, shown});
    });
    for (target = 40; target <= 100; target += 3) {
        int pictures = 0;
        const auto counting = QObject::connect(player.get(), &Player::videoFrameChanged, [&] { ++pictures; });
        player->seekToTime(frameTime(target));
        EXPECT_TRUE(waitUntil([&] { return pictures > 0; })) << "no picture for the seek to frame " << target;
        QObject::disconnect(counting);
    }
    target = 100;
    EXPECT_TRUE(waitUntil([&] { return shownNumber(*player) == 100; })) << shownNumber(*player);
    EXPECT_TRUE(wrong.isEmpty()) << wrong.size() << " stand-ins from elsewhere, the first for frame "
                                 << wrong.value(0).first << ": " << wrong.value(0).second;
}

// Playing on a clock that stands still, the decoder fills the queue with the pictures after the
// first and waits for the main thread to take them; seeks must not wait for the decoder, or this
// would never end. The last one's picture comes once the main thread takes pictures again.
TEST_F(PlayerTest, SeeksNeverWaitForTheDecoder)
{
    auto player = readyPlayer(kMovie);
    player->play();
    ASSERT_TRUE(waitUntil([&] { return shownNumber(*player) == 0; }));
    for (int frame = 10; frame < 110; ++frame) {
        player->seekToTime(frameTime(frame));
        EXPECT_NEAR(player->currentTime().seconds(), frameTime(frame).seconds(), 1e-9);
    }
    EXPECT_TRUE(waitUntil([&] { return shownNumber(*player) == 109; })) << shownNumber(*player);
}

struct StepCase {
    const char *name;
    int from, to;         // steps back one frame at a time from `from` to `to`
    int firstStepDecodes; // at most, for the first step back
    bool reordered = false; // re-encoded with B-frames: seeks go by decoding times, which come first
};

class PlayerStepBackTest : public PlayerTest, public ::testing::WithParamInterface<StepCase> {};

// Stepping back one frame at a time shows each exact frame. Within the pictures kept around the
// playhead it decodes nothing; across a group boundary the first step decodes the group before once.
TEST_P(PlayerStepBackTest, DecodesAtMostTheGroupBeforeOnce)
{
    const StepCase &c = GetParam();
    auto player = readyPlayer(c.reordered ? zaf::test::sharedFfmpegOutput(QStringList{QStringLiteral("-i"), sharedFixtureMovie(kMovie)}
                                                                          << zaf::test::words("-c:v libx264 -preset veryfast -bf 3 -g 30 -sc_threshold 0 -c:a copy"))
                                          : sharedFixtureMovie(kMovie));
    player->seekToTime(frameTime(c.from));
    ASSERT_TRUE(waitUntil([&] { return shownNumber(*player) == c.from; })) << shownNumber(*player);
    std::uint64_t decoded = player->decodingStatistics().picturesDecoded;
    for (int frame = c.from - 1; frame >= c.to; --frame) {
        player->seekToTime(frameTime(frame));
        ASSERT_TRUE(waitUntil([&] { return shownNumber(*player) == frame; })) << frame << ": " << shownNumber(*player);
        const std::uint64_t now = player->decodingStatistics().picturesDecoded;
        EXPECT_LE(now - decoded, frame == c.from - 1 ? std::uint64_t(c.firstStepDecodes) : 0u) << "stepping back to " << frame;
        decoded = now;
    }
}

// kMovie has a keyframe every 30 frames; frame-threaded decoding reads a picture or two ahead.
INSTANTIATE_TEST_SUITE_P(Steps, PlayerStepBackTest,
                         ::testing::Values(StepCase{"WithinTheGroup", 50, 38, 0},
                                           StepCase{"AcrossAGroupBoundary", 60, 45, 30 + 4},
                                           // The seek for frame 59 lands on the keyframe of 60 first.
                                           StepCase{"AcrossAGroupBoundaryWithReorderedPictures", 60, 55, 2 * 30 + 8, true}),
                         zaf::test::caseName);

// With a small budget the kept pictures stay within it, while playing and seeking back and forth,
// and every exact frame still comes.
TEST_F(PlayerTest, KeptPicturesStayWithinTheBudget)
{
    auto player = readyPlayer(kMovie);
    constexpr std::int64_t kBudget = 1 << 20; // about eight 320 x 240 pictures
    player->setDecodedPictureBudget(kBudget);
    player->play();
    for (int i = 0; i < 60; ++i)
        m_clock->advance(1.0 / 30);
    ASSERT_TRUE(waitUntil([&] { return shownNumber(*player) == 60; })) << shownNumber(*player);
    player->pause();
    for (int frame : {20, 59, 58, 31, 30, 29, 90, 12}) {
        player->seekToTime(frameTime(frame));
        ASSERT_TRUE(waitUntil([&] { return shownNumber(*player) == frame; })) << frame << ": " << shownNumber(*player);
    }
    const playback::VideoDecoderStatistics statistics = player->decodingStatistics();
    EXPECT_EQ(statistics.windowBudgetBytes, kBudget);
    EXPECT_GT(statistics.windowPeakBytes, kBudget / 2);
    EXPECT_LE(statistics.windowPeakBytes, kBudget);
}

// While playing, the picture is the one due at the clock's time once the decoder catches up, and
// never one ahead of it.
TEST_F(PlayerTest, PlayingShowsFrameOfClockTimeAfterDecoderCatchesUp)
{
    auto player = readyPlayer(kMovie);
    player->seekToTime(seconds(1));
    player->play();
    for (int i = 0; i < 30; ++i)
        m_clock->advance(1.0 / 32); // 1.9375 s: frame 58 (1.9333 s) is on screen, 59 (1.9667 s) is not due
    EXPECT_TRUE(waitUntil([&] { return shownNumber(*player) == 58; })) << shownNumber(*player);
    settle(200);
    EXPECT_EQ(shownNumber(*player), 58);
    m_clock->advance(1.0 / 16);
    EXPECT_TRUE(waitUntil([&] { return shownNumber(*player) == 60; })) << shownNumber(*player);
}

// The layer paints a rotated movie upright, aspect-fit on black, and black without a player.
TEST_F(PlayerTest, LayerPaintsRotatedMovieUprightAspectFitOnBlack)
{
    auto player = readyPlayer(kRotated);
    PlayerLayer layer;
    layer.resize(400, 400);
    layer.setPlayer(player.get());
    ASSERT_TRUE(waitUntil([&] { return !player->currentVideoFrame().isNull(); }));
    // The stored picture is 320 x 240 and turned back; upright it is 240 x 320, so it fits 300 x 400.
    EXPECT_EQ(player->currentVideoFrame().size(), QSize(320, 240));
    EXPECT_EQ(shownNumber(*player), -1);
    const QRectF rect = layer.videoRect();
    EXPECT_EQ(rect, QRectF(50, 0, 300, 400));

    const QImage shot = layer.grab().toImage().convertToFormat(QImage::Format_RGB32);
    const qreal dpr = shot.devicePixelRatio();
    ASSERT_EQ(shot.size(), (QSizeF(400, 400) * dpr).toSize());
    EXPECT_EQ(QColor(shot.pixel(QPoint(10, 200) * dpr)), QColor(Qt::black));
    EXPECT_EQ(QColor(shot.pixel(QPoint(390, 200) * dpr)), QColor(Qt::black));
    const QColor corner = shot.pixelColor((QPointF(50 + 300 / 8.0, 400 / 10.0) * dpr).toPoint());
    EXPECT_TRUE(corner.red() > 180 && corner.green() < 80 && corner.blue() < 80) << qPrintable(corner.name()); // red cell
    EXPECT_EQ(readFrameNumber(shot.copy(QRectF(rect.topLeft() * dpr, rect.size() * dpr).toRect())), 0);

    layer.setPlayer(nullptr);
    EXPECT_TRUE(layer.videoRect().isEmpty());
    const QImage cleared = layer.grab().toImage();
    EXPECT_EQ(QColor(cleared.pixel(cleared.width() / 2, cleared.height() / 2)), QColor(Qt::black));
}

} // namespace
} // namespace zaf::media
