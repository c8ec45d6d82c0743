// Pictures from the decoding thread: exact seeks, coalesced seeks, and pictures during playback,
// checked against the frame numbers the fixture movie draws into every picture.
#include "platform/media/player.h"
#include "tests/platform/media/player_test_support.h"
#include "platform/media/player_layer.h"
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



class PlayerSeekTest : public ::testing::Test {
protected:
    static void SetUpTestSuite()
    {
        s_dir = new zaf::test::ScratchDir;
        zaf::fixture::FixtureSpec spec;
        spec.seconds = 4;
        spec.gop = 30;
        s_movie = new QString(zaf::test::makeFixtureMovie(s_dir->path(), spec));
        zaf::fixture::FixtureSpec rotated;
        rotated.seconds = 1;
        rotated.rotation = 90;
        s_rotated = new QString(zaf::test::makeFixtureMovie(s_dir->path(), rotated));
    }
    static void TearDownTestSuite()
    {
        delete s_movie;
        delete s_rotated;
        delete s_dir;
    }

    std::unique_ptr<Player> readyPlayer(const QString &path) { return readyPlayerOn(path, m_clock); }

    static int shownNumber(const Player &player) { return zaf::test::readFrameNumber(player.currentVideoFrame()); }

    std::shared_ptr<ManualTimeSource> m_clock = std::make_shared<ManualTimeSource>();
    static zaf::test::ScratchDir *s_dir;
    static QString *s_movie;
    static QString *s_rotated;
};

zaf::test::ScratchDir *PlayerSeekTest::s_dir = nullptr;
QString *PlayerSeekTest::s_movie = nullptr;
QString *PlayerSeekTest::s_rotated = nullptr;

TEST_F(PlayerSeekTest, NewPlayerShowsFirstFrameOnceReady)
{
    ASSERT_FALSE(s_movie->isEmpty());
    auto player = readyPlayer(*s_movie);
    ASSERT_TRUE(runUntil([&] { return !player->currentVideoFrame().isNull(); }));
    EXPECT_EQ(shownNumber(*player), 0);
    EXPECT_EQ(player->currentVideoFrame().size(), QSize(320, 240));
}

TEST_F(PlayerSeekTest, SeekShowsFrameAtTargetBetweenKeyframesOnKeyframeAndBetweenFrameTimes)
{
    auto player = readyPlayer(*s_movie);
    // (target seconds, frame shown at that time) at 30 fps with a keyframe every 30 frames.
    const QList<std::pair<double, int>> cases = {{1.5, 45}, {1.0, 30}, {2.51, 75}, {0.2, 6}, {3.95, 118}, {0.0, 0}};
    for (const auto &[target, expected] : cases) {
        player->seekToTime(seconds(target));
        EXPECT_EQ(player->currentTime(), seconds(target));
        EXPECT_TRUE(runUntil([&] { return shownNumber(*player) == expected; }))
            << "seek to " << target << " shows " << shownNumber(*player) << ", expected " << expected;
    }
}

TEST_F(PlayerSeekTest, RapidSeeksShowOnlyTheLatestTarget)
{
    auto player = readyPlayer(*s_movie);
    ASSERT_TRUE(runUntil([&] { return shownNumber(*player) == 0; }));
    QList<int> shown;
    QObject::connect(player.get(), &Player::videoFrameChanged, [&] { shown.append(shownNumber(*player)); });
    for (double target : {0.5, 1.2, 2.9, 1.7, 3.3})
        player->seekToTime(seconds(target));
    ASSERT_TRUE(runUntil([&] { return shownNumber(*player) == 99; }));
    // Let any late picture of an abandoned seek arrive: none may be shown.
    runUntil([] { return false; }, 300);
    EXPECT_EQ(shown, QList<int>{99});
}

TEST_F(PlayerSeekTest, SeekBeyondDurationOrBeforeZeroIsLimitedToTheItem)
{
    auto player = readyPlayer(*s_movie);
    player->seekToTime(seconds(60));
    EXPECT_EQ(player->currentTime(), player->currentItem()->duration());
    EXPECT_TRUE(runUntil([&] { return shownNumber(*player) == 119; }));
    player->seekToTime(seconds(-3));
    EXPECT_EQ(player->currentTime(), MediaTime::zero());
    EXPECT_TRUE(runUntil([&] { return shownNumber(*player) == 0; }));
    player->seekToTime(MediaTime::invalid()); // ignored
    EXPECT_EQ(player->currentTime(), MediaTime::zero());
}

TEST_F(PlayerSeekTest, PlayingShowsFrameOfClockTimeAfterDecoderCatchesUp)
{
    auto player = readyPlayer(*s_movie);
    player->seekToTime(seconds(1));
    player->play();
    for (int i = 0; i < 30; ++i)
        m_clock->advance(1.0 / 32); // 1.9375 s: frame 58 (1.9333 s) is on screen, 59 (1.9667 s) is not due
    EXPECT_TRUE(runUntil([&] { return shownNumber(*player) == 58; })) << shownNumber(*player);
    // Never ahead of the clock, although the decoder has pictures ahead.
    runUntil([] { return false; }, 200);
    EXPECT_EQ(shownNumber(*player), 58);
    m_clock->advance(1.0 / 16);
    EXPECT_TRUE(runUntil([&] { return shownNumber(*player) == 60; })) << shownNumber(*player);
}

TEST_F(PlayerSeekTest, LayerPaintsRotatedMovieUprightAspectFitOnBlack)
{
    auto player = readyPlayer(*s_rotated);
    PlayerLayer layer;
    layer.resize(400, 400);
    layer.setPlayer(player.get());
    ASSERT_TRUE(runUntil([&] { return !player->currentVideoFrame().isNull(); }));
    // The stored picture is 320 x 240 and turned back; upright it is 240 x 320, so it fits 300 x 400.
    EXPECT_EQ(player->currentVideoFrame().size(), QSize(320, 240));
    EXPECT_EQ(zaf::test::readFrameNumber(player->currentVideoFrame()), -1);
    const QRectF rect = layer.videoRect();
    EXPECT_EQ(rect, QRectF(50, 0, 300, 400));

    const QImage shot = layer.grab().toImage().convertToFormat(QImage::Format_RGB32);
    const qreal dpr = shot.devicePixelRatio();
    ASSERT_EQ(shot.size(), (QSizeF(400, 400) * dpr).toSize());
    EXPECT_EQ(QColor(shot.pixel(QPoint(10, 200) * dpr)), QColor(Qt::black));
    EXPECT_EQ(QColor(shot.pixel(QPoint(390, 200) * dpr)), QColor(Qt::black));
    // Top-left cell of the upright pattern is red.
    const QColor corner = shot.pixelColor((QPointF(50 + 300 / 8.0, 400 / 10.0) * dpr).toPoint());
    EXPECT_GT(corner.red(), 180);
    EXPECT_LT(corner.green(), 80);
    EXPECT_LT(corner.blue(), 80);
    const QRect inside = QRectF(rect.topLeft() * dpr, rect.size() * dpr).toRect();
    EXPECT_EQ(zaf::test::readFrameNumber(shot.copy(inside)), 0);

    layer.setPlayer(nullptr);
    EXPECT_TRUE(layer.videoRect().isEmpty());
    const QImage cleared = layer.grab().toImage();
    EXPECT_EQ(QColor(cleared.pixel(cleared.width() / 2, cleared.height() / 2)), QColor(Qt::black));
}

} // namespace
} // namespace zaf::media
