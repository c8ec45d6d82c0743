// Playback on a stepped clock: boundary observers, periodic observers, the end of the item, and
// tearing a Player down while its threads run.
#include "platform/media/player.h"
#include "tests/platform/media/player_test_support.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/temp_dir.h"

#include <QEventLoop>
#include <QTimer>

#include <gtest/gtest.h>

#include <functional>
#include <memory>

namespace zaf::media {
namespace {

using test::readyPlayerOn;
using test::runUntil;
using test::seconds;



class PlayerPlaybackTest : public ::testing::Test {
protected:
    static void SetUpTestSuite()
    {
        s_dir = new zaf::test::ScratchDir;
        zaf::fixture::FixtureSpec longSpec;
        longSpec.seconds = 12;
        longSpec.width = 160;
        longSpec.height = 120;
        s_longMovie = new QString(zaf::test::makeFixtureMovie(s_dir->path(), longSpec));
        zaf::fixture::FixtureSpec shortSpec;
        shortSpec.seconds = 2;
        shortSpec.width = 160;
        shortSpec.height = 120;
        s_shortMovie = new QString(zaf::test::makeFixtureMovie(s_dir->path(), shortSpec));
    }
    static void TearDownTestSuite()
    {
        delete s_longMovie;
        delete s_shortMovie;
        delete s_dir;
    }

    // A Player of `path` on a manual clock, with its item ready.
    std::unique_ptr<Player> readyPlayer(const QString &path) { return readyPlayerOn(path, m_clock); }

    std::shared_ptr<ManualTimeSource> m_clock = std::make_shared<ManualTimeSource>(100.0);
    static zaf::test::ScratchDir *s_dir;
    static QString *s_longMovie;
    static QString *s_shortMovie;
};

zaf::test::ScratchDir *PlayerPlaybackTest::s_dir = nullptr;
QString *PlayerPlaybackTest::s_longMovie = nullptr;
QString *PlayerPlaybackTest::s_shortMovie = nullptr;

TEST_F(PlayerPlaybackTest, BoundaryObserverThatPausesStopsPlaybackExactlyAtItsTimeInSmallSteps)
{
    ASSERT_FALSE(s_longMovie->isEmpty());
    auto player = readyPlayer(*s_longMovie);
    player->seekToTime(seconds(5));
    int fired = 0;
    MediaTime firedAt;
    player->addBoundaryTimeObserver({seconds(10)}, [&] {
        ++fired;
        firedAt = player->currentTime();
        player->pause();
    });
    player->play();
    EXPECT_EQ(player->rate(), 1.0f);
    for (int i = 0; i < 100; ++i)
        m_clock->advance(0.07);
    EXPECT_EQ(fired, 1);
    EXPECT_EQ(firedAt, seconds(10));
    EXPECT_EQ(player->rate(), 0.0f);
    EXPECT_EQ(player->currentTime(), seconds(10));
    EXPECT_EQ(player->currentItem()->currentTime(), seconds(10));
}

TEST_F(PlayerPlaybackTest, BoundaryObserverFiresAtItsTimeWhenOneClockStepJumpsPastIt)
{
    auto player = readyPlayer(*s_longMovie);
    player->seekToTime(seconds(5));
    QList<double> order;
    player->addBoundaryTimeObserver({seconds(9)}, [&] { order.append(player->currentTime().seconds()); });
    player->addBoundaryTimeObserver({seconds(10), seconds(11.5)}, [&] {
        order.append(player->currentTime().seconds());
        player->pause();
    });
    player->play();
    m_clock->advance(7); // 5 s -> 12 s in one step
    EXPECT_EQ(order, (QList<double>{9, 10}));
    EXPECT_EQ(player->currentTime(), seconds(10));
    // Playing on from 10 s reaches the second time of the same observer.
    player->play();
    m_clock->advance(3);
    EXPECT_EQ(order, (QList<double>{9, 10, 11.5}));
    EXPECT_EQ(player->currentTime(), seconds(11.5));
}

TEST_F(PlayerPlaybackTest, BoundaryObserverStaysSilentWhenSeekJumpsOverItOrAfterRemoval)
{
    auto player = readyPlayer(*s_longMovie);
    int fired = 0;
    const TimeObserverToken token = player->addBoundaryTimeObserver({seconds(3)}, [&] { ++fired; });
    EXPECT_NE(token, 0u);
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

TEST_F(PlayerPlaybackTest, EndOfItemPausesAtDurationAndEmitsDidPlayToEndTimeOncePerArrival)
{
    auto player = readyPlayer(*s_shortMovie);
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
    EXPECT_EQ(rateAtSignal, 0.0f);
    EXPECT_EQ(player->rate(), 0.0f);
    EXPECT_EQ(player->currentTime(), player->currentItem()->duration());
    m_clock->advance(1);
    EXPECT_EQ(ended, 1);

    // As the editor does: back to the start, play again, reach the end again.
    player->seekToTime(MediaTime::zero());
    player->play();
    m_clock->advance(5);
    EXPECT_EQ(ended, 2);
}

TEST_F(PlayerPlaybackTest, EndOfItemKeepsRateWhenActionAtItemEndIsNone)
{
    auto player = readyPlayer(*s_shortMovie);
    player->setActionAtItemEnd(ActionAtItemEnd::None);
    EXPECT_EQ(player->actionAtItemEnd(), ActionAtItemEnd::None);
    int ended = 0;
    QObject::connect(player->currentItem().get(), &PlayerItem::didPlayToEndTime, [&] { ++ended; });
    player->play();
    m_clock->advance(3);
    m_clock->advance(3);
    EXPECT_EQ(ended, 1);
    EXPECT_EQ(player->rate(), 1.0f);
    EXPECT_EQ(player->currentTime(), player->currentItem()->duration());
}

TEST_F(PlayerPlaybackTest, PeriodicObserverFiresOncePerIntervalWhilePlayingAndOnPlayPauseAndSeek)
{
    auto player = readyPlayer(*s_longMovie);
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
    // One step over several marks makes one call, with the new time.
    player->play();
    m_clock->advance(1.1);
    EXPECT_EQ(calls.size(), 9);
    EXPECT_NEAR(calls.last(), 4.1, 1e-9);
}

TEST_F(PlayerPlaybackTest, RemovedPeriodicObserverIsNotCalledAndBadObserversAreRefused)
{
    auto player = readyPlayer(*s_longMovie);
    int calls = 0;
    const TimeObserverToken token = player->addPeriodicTimeObserver(seconds(0.1), [&](const MediaTime &) { ++calls; });
    player->removeTimeObserver(token);
    player->play();
    m_clock->advance(1);
    EXPECT_EQ(calls, 0);
    EXPECT_EQ(player->addPeriodicTimeObserver(MediaTime::invalid(), [](const MediaTime &) {}), 0u);
    EXPECT_EQ(player->addPeriodicTimeObserver(MediaTime::zero(), [](const MediaTime &) {}), 0u);
    EXPECT_EQ(player->addBoundaryTimeObserver({MediaTime::invalid()}, [] {}), 0u);
    player->removeTimeObserver(12345); // unknown: ignored
}

TEST_F(PlayerPlaybackTest, PlayBeforeReadyStartsOnceTheItemIsReady)
{
    auto item = std::make_shared<PlayerItem>(MediaAsset::assetWithURL(QUrl::fromLocalFile(*s_longMovie)));
    Player player(item);
    player.setTimeSource(m_clock);
    player.seekToTime(MediaTime::zero());
    player.play();
    ASSERT_TRUE(runUntil([&] { return item->status() == PlayerItem::Status::ReadyToPlay; }));
    m_clock->advance(2);
    EXPECT_EQ(player.currentTime(), seconds(2));
}

TEST_F(PlayerPlaybackTest, DestroyingPlayerWhilePlayingOnRealClockIsSafe)
{
    for (int round = 0; round < 3; ++round) {
        auto item = std::make_shared<PlayerItem>(MediaAsset::assetWithURL(QUrl::fromLocalFile(*s_longMovie)));
        auto player = std::make_unique<Player>(item);
        player->play();
        if (round > 0) {
            ASSERT_TRUE(runUntil([&] { return !player->currentVideoFrame().isNull(); }));
            for (int i = 0; i < 5; ++i)
                player->seekToTime(seconds(1.0 + i));
        }
        player.reset();
        EXPECT_EQ(item->currentTime(), MediaTime::make(0, 1000000000));
    }
}

} // namespace
} // namespace zaf::media
