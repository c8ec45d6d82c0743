// PlayerItem loading (ready with the file's duration, or failed with an error for bad files) and
// the PlaybackClock arithmetic the Player builds on.
#include "platform/media/player.h"
#include "tests/platform/media/player_test_support.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/temp_dir.h"

#include <QEventLoop>
#include <QFile>
#include <QTimer>

#include <gtest/gtest.h>

#include <functional>
#include <memory>

namespace zaf::media {
namespace {

using test::readyPlayerOn;
using test::runUntil;
using test::seconds;


std::shared_ptr<PlayerItem> itemFor(const QString &path)
{
    return std::make_shared<PlayerItem>(MediaAsset::assetWithURL(QUrl::fromLocalFile(path)));
}

TEST(PlaybackClockTest, MediaTimeFollowsAnchorAtRateAndReanchoringMovesIt)
{
    PlaybackClock clock;
    clock.setAnchor(5.0, 100.0, 1.0);
    EXPECT_DOUBLE_EQ(clock.mediaTimeAt(100.0), 5.0);
    EXPECT_DOUBLE_EQ(clock.mediaTimeAt(102.5), 7.5);
    clock.setAnchor(7.5, 102.5, 0.0); // paused: time stands
    EXPECT_DOUBLE_EQ(clock.mediaTimeAt(200.0), 7.5);
    clock.setAnchor(1.0, 10.0, 2.0);
    EXPECT_DOUBLE_EQ(clock.mediaTimeAt(11.0), 3.0);
    EXPECT_DOUBLE_EQ(clock.rate(), 2.0);
}

TEST(PlaybackClockTest, ManualTimeSourceMovesOnlyForwardAndReportsEachAdvance)
{
    ManualTimeSource source(3.0);
    int advanced = 0;
    QObject::connect(&source, &TimeSource::advanced, [&] { ++advanced; });
    source.advance(0.5);
    source.advance(-2);
    EXPECT_DOUBLE_EQ(source.now(), 3.5);
    EXPECT_EQ(advanced, 2);
}

class PlayerItemTest : public ::testing::Test {
protected:
    zaf::test::ScratchDir m_dir;
};

TEST_F(PlayerItemTest, ItemBecomesReadyWithDurationOfTheFileAndSignalsOnce)
{
    zaf::fixture::FixtureSpec spec;
    spec.seconds = 3;
    spec.width = 160;
    spec.height = 120;
    const QString path = zaf::test::makeFixtureMovie(m_dir.path(), spec);
    ASSERT_FALSE(path.isEmpty());
    auto item = itemFor(path);
    EXPECT_EQ(item->status(), PlayerItem::Status::Unknown);
    EXPECT_FALSE(item->duration().isValid());
    int changes = 0;
    QObject::connect(item.get(), &PlayerItem::statusChanged, [&] { ++changes; });
    ASSERT_TRUE(runUntil([&] { return item->status() != PlayerItem::Status::Unknown; }));
    runUntil([] { return false; }, 100);
    EXPECT_EQ(changes, 1);
    EXPECT_EQ(item->status(), PlayerItem::Status::ReadyToPlay);
    EXPECT_EQ(static_cast<int>(item->status()), 1);
    EXPECT_FALSE(item->error().has_value());
    const double probed = zaf::test::ffprobe(path).value(QStringLiteral("format")).toObject()
                              .value(QStringLiteral("duration")).toString().toDouble();
    EXPECT_NEAR(item->duration().seconds(), probed, 0.001);
    EXPECT_EQ(item->currentTime(), MediaTime::zero());
}

TEST_F(PlayerItemTest, ItemFailsWithLoggedErrorForMissingEmptyGarbageAndTruncatedFiles)
{
    zaf::fixture::FixtureSpec spec;
    spec.seconds = 1;
    const QString good = zaf::test::makeFixtureMovie(m_dir.path(), spec);
    QFile source(good);
    ASSERT_TRUE(source.open(QIODevice::ReadOnly));
    QFile truncated(m_dir.file(QStringLiteral("truncated.mp4")));
    ASSERT_TRUE(truncated.open(QIODevice::WriteOnly));
    truncated.write(source.read(source.size() / 3).left(2000));
    truncated.close();
    const QString garbage = m_dir.write(QStringLiteral("garbage.mp4"), 50000);
    const QString empty = m_dir.write(QStringLiteral("empty.mov"), 0);
    const QString missing = m_dir.file(QStringLiteral("missing.mp4"));

    for (const QString &path : {missing, empty, garbage, truncated.fileName()}) {
        SCOPED_TRACE(path.toStdString());
        zaf::test::LogCapture log;
        auto item = itemFor(path);
        int changes = 0;
        QObject::connect(item.get(), &PlayerItem::statusChanged, [&] { ++changes; });
        ASSERT_TRUE(runUntil([&] { return item->status() != PlayerItem::Status::Unknown; }));
        EXPECT_EQ(item->status(), PlayerItem::Status::Failed);
        EXPECT_EQ(changes, 1);
        ASSERT_TRUE(item->error().has_value());
        EXPECT_EQ(item->error()->domain, QString::fromUtf8(kMediaErrorDomain));
        EXPECT_FALSE(item->duration().isValid());
        const QStringList messages = log.messages(QStringLiteral("zaf.media"));
        EXPECT_TRUE(std::any_of(messages.begin(), messages.end(),
            [&](const QString &m) { return m.startsWith(QStringLiteral("Cannot play")) && m.contains(path); }))
            << messages.join(u'\n').toStdString();

        // A player of a failed item does nothing, and never crashes.
        Player player(item);
        auto clock = std::make_shared<ManualTimeSource>();
        player.setTimeSource(clock);
        player.play();
        EXPECT_EQ(player.rate(), 0.0f);
        player.seekToTime(MediaTime::make(1, 1));
        clock->advance(1);
        EXPECT_TRUE(player.currentVideoFrame().isNull());
    }
}

TEST_F(PlayerItemTest, ItemWithoutAssetFailsAndItemDestroyedWhileLoadingIsSafe)
{
    PlayerItem noAsset(nullptr);
    ASSERT_TRUE(runUntil([&] { return noAsset.status() != PlayerItem::Status::Unknown; }));
    EXPECT_EQ(noAsset.status(), PlayerItem::Status::Failed);

    const QString path = m_dir.write(QStringLiteral("other.mp4"), 1000);
    for (int i = 0; i < 5; ++i) {
        auto item = itemFor(path);
        auto player = std::make_unique<Player>(item);
        player.reset();
        item.reset(); // the load completes after the item is gone
    }
    runUntil([] { return false; }, 200);
}

} // namespace
} // namespace zaf::media
