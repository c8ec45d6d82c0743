// ExportSession without a range or a mix, and the progress it reports on the way.
#include "tests/platform/media/export_test_support.h"

#include <QFile>

#include <atomic>
#include <thread>

namespace zaf::media {
namespace {

using namespace zaf::test;

// Every stream is copied packet for packet, rotation included, and only the output is left behind,
// with the permissions of any new file of the user.
TEST_F(ExportTest, ExportWithoutRangeOrMixCopiesEveryStreamBitExact)
{
    const QString source = sharedFixtureMovie(kRotated);
    const QString output = scratch.file(QStringLiteral("copy.mp4"));
    auto session = makeSession(source, output);
    EXPECT_EQ(session->status(), ExportStatus::Unknown);
    EXPECT_EQ(session->progress(), 0.0f);
    ASSERT_EQ(runToEnd(session), ExportStatus::Completed);
    EXPECT_FALSE(session->error().has_value());
    EXPECT_FLOAT_EQ(session->progress(), 1.0f);
    EXPECT_EQ(session->outputURL(), QUrl::fromLocalFile(output));

    const auto streamDigests = [](const QString &path) {
        return QStringList{streamMD5(path, "0:v:0"), streamMD5(path, "0:a:0"), streamMD5(path, "0:a:1")};
    };
    EXPECT_EQ(streamDigests(output), streamDigests(source));
    EXPECT_EQ(probeStreams(output, "audio").size(), 2);
    EXPECT_EQ(probeRotation(probeStreams(output, "video").value(0)), 90);
    EXPECT_EQ(readFrameNumbers(output), readFrameNumbers(source));
    EXPECT_EQ(entryNames(scratch.path()), QStringList{QStringLiteral("copy.mp4")});
    QFile plain(scratch.file(QStringLiteral("plain")));
    ASSERT_TRUE(plain.open(QIODevice::WriteOnly));
    EXPECT_EQ(QFileInfo(output).permissions(), plain.permissions());
}

// Progress read while exporting stays within 0..1, never goes back, and ends at 1.
TEST_F(ExportTest, ProgressRisesToOneWhileExporting)
{
    auto session = makeSession(sharedFixtureMovie(kLong), scratch.file(QStringLiteral("progress.mp4")));
    session->setTimeRange(MediaTimeRange{MediaTime::make(1, 1), MediaTime::make(4, 1)});
    std::atomic<bool> done{false};
    std::vector<float> seen;
    ExportWaiter waiter;
    session->exportAsynchronously([&, completion = waiter.completion(session)] {
        done = true;
        completion();
    });
    while (!done) {
        seen.push_back(session->progress());
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    waiter.wait();
    ASSERT_EQ(session->status(), ExportStatus::Completed);
    for (std::size_t i = 0; i < seen.size(); ++i) {
        EXPECT_TRUE(seen[i] >= 0.0f && seen[i] <= 1.0f) << seen[i];
        EXPECT_GE(seen[i], i ? seen[i - 1] : 0.0f);
    }
    EXPECT_FLOAT_EQ(session->progress(), 1.0f);
}

} // namespace
} // namespace zaf::media
