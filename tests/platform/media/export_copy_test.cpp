#include "platform/media/export_session.h"
#include "tests/platform/media/export_test_helpers.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>

#include <gtest/gtest.h>

#include <atomic>
#include <thread>

namespace zaf::media {
namespace {

using zaf::fixture::FixtureSpec;
using zaf::test::ScratchDir;

TEST(ExportCopyTest, ExportWithoutRangeOrMixCopiesEveryStreamBitExact)
{
    ScratchDir scratch;
    const QString source = zaf::test::makeFixtureMovie(scratch.path(), FixtureSpec{.seconds = 2, .audioTracks = 2, .rotation = 90});
    ASSERT_FALSE(source.isEmpty());
    const QString output = scratch.file(QStringLiteral("copy.mp4"));
    auto session = zaf::test::makeSession(source, output);
    EXPECT_EQ(session->status(), ExportStatus::Unknown);
    EXPECT_EQ(session->progress(), 0.0f);
    ASSERT_EQ(zaf::test::runToEnd(session), ExportStatus::Completed);
    EXPECT_FALSE(session->error().has_value());
    EXPECT_FLOAT_EQ(session->progress(), 1.0f);
    EXPECT_EQ(session->outputURL(), QUrl::fromLocalFile(output));

    const QJsonObject in = zaf::test::ffprobe(source), out = zaf::test::ffprobe(output);
    ASSERT_EQ(zaf::test::probeStreams(out, QStringLiteral("video")).size(), 1);
    ASSERT_EQ(zaf::test::probeStreams(out, QStringLiteral("audio")).size(), 2);
    for (const QString &map : {QStringLiteral("0:v:0"), QStringLiteral("0:a:0"), QStringLiteral("0:a:1")}) {
        SCOPED_TRACE(map.toStdString());
        const QString hash = zaf::test::streamMD5(output, map);
        EXPECT_FALSE(hash.isEmpty());
        EXPECT_EQ(hash, zaf::test::streamMD5(source, map));
    }
    EXPECT_EQ(zaf::test::probeRotation(zaf::test::probeStreams(out, QStringLiteral("video"))[0]), 90);
    EXPECT_EQ(zaf::test::readFrameNumbers(output), zaf::test::readFrameNumbers(source));
    // Nothing but the source and the output is left in the directory.
    EXPECT_EQ(QDir(scratch.path()).entryList(QDir::Files | QDir::Hidden).size(), 2);
    // The output has the permissions any new file of the user gets, not those of a private temporary.
    QFile plain(scratch.file(QStringLiteral("plain")));
    ASSERT_TRUE(plain.open(QIODevice::WriteOnly));
    EXPECT_EQ(QFileInfo(output).permissions(), plain.permissions());
}

TEST(ExportCopyTest, ProgressRisesToOneWhileExporting)
{
    ScratchDir scratch;
    const QString source = zaf::test::makeFixtureMovie(scratch.path(), FixtureSpec{.seconds = 6, .audioTracks = 1});
    ASSERT_FALSE(source.isEmpty());
    auto session = zaf::test::makeSession(source, scratch.file(QStringLiteral("progress.mp4")));
    session->setTimeRange(MediaTimeRange{MediaTime::make(1, 1), MediaTime::make(4, 1)});
    std::atomic<bool> done{false};
    std::vector<float> seen;
    zaf::test::ExportWaiter waiter;
    auto completion = waiter.completion(session);
    session->exportAsynchronously([&, completion] {
        done = true;
        completion();
    });
    while (!done) {
        seen.push_back(session->progress());
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    waiter.wait();
    ASSERT_EQ(session->status(), ExportStatus::Completed);
    for (std::size_t i = 1; i < seen.size(); ++i)
        EXPECT_GE(seen[i], seen[i - 1]);
    for (float p : seen) {
        EXPECT_GE(p, 0.0f);
        EXPECT_LE(p, 1.0f);
    }
    EXPECT_FLOAT_EQ(session->progress(), 1.0f);
}

} // namespace
} // namespace zaf::media
