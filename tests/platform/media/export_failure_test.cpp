#include "platform/media/export_session.h"
#include "tests/platform/media/export_test_helpers.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>

#include <gtest/gtest.h>

#include <thread>

namespace zaf::media {
namespace {

using zaf::fixture::FixtureSpec;
using zaf::test::ScratchDir;

class ExportFailureTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        source = zaf::test::makeFixtureMovie(scratch.path(), FixtureSpec{.seconds = 2, .audioTracks = 1});
        ASSERT_FALSE(source.isEmpty());
        output = scratch.file(QStringLiteral("out.mp4"));
    }
    // Runs the session, expects Failed with `code`, and no output file at all.
    void expectFailure(const std::shared_ptr<ExportSession> &session, int code)
    {
        zaf::test::LogCapture log;
        ASSERT_EQ(zaf::test::runToEnd(session), ExportStatus::Failed);
        ASSERT_TRUE(session->error().has_value());
        EXPECT_EQ(session->error()->domain, QString::fromLatin1(kMediaErrorDomain));
        EXPECT_EQ(session->error()->code, code) << session->error()->description().toStdString();
        EXPECT_FALSE(log.messages(QStringLiteral("zaf.media")).isEmpty());
        EXPECT_FALSE(QFile::exists(output));
        expectNoPartialFiles();
    }
    void expectNoPartialFiles()
    {
        for (const QString &name : QDir(scratch.path()).entryList(QDir::Files | QDir::Hidden))
            EXPECT_FALSE(name.contains(QStringLiteral("partial"))) << name.toStdString();
    }
    ScratchDir scratch;
    QString source, output;
};

TEST_F(ExportFailureTest, SessionCreationFailsForNullAssetOrUnknownPreset)
{
    EXPECT_EQ(ExportSession::exportSessionWithAsset(nullptr, QString::fromLatin1(kExportPresetHighestQuality)), nullptr);
    EXPECT_EQ(ExportSession::exportSessionWithAsset(MediaAsset::assetWithURL(QUrl::fromLocalFile(source)),
                                                    QStringLiteral("LowQuality")), nullptr);
}

TEST_F(ExportFailureTest, ExportFailsWithInvalidArgumentForBadSettings)
{
    {
        SCOPED_TRACE("other file type");
        auto session = zaf::test::makeSession(source, output);
        session->setOutputFileType(QStringLiteral("com.example.matroska"));
        expectFailure(session, kMediaErrorInvalidArgument);
    }
    {
        SCOPED_TRACE("no output URL");
        auto session = zaf::test::makeSession(source, output);
        session->setOutputURL(QUrl());
        expectFailure(session, kMediaErrorInvalidArgument);
    }
    const QList<std::pair<const char *, MediaTimeRange>> badRanges{
        {"empty range", MediaTimeRange{MediaTime::make(1, 1), MediaTime::zero()}},
        {"negative duration", MediaTimeRange{MediaTime::make(1, 1), MediaTime::make(-1, 2)}},
        {"invalid start", MediaTimeRange{MediaTime::invalid(), MediaTime::make(1, 1)}},
        {"negative start", MediaTimeRange{MediaTime::make(-1, 1), MediaTime::make(2, 1)}},
        {"starts after the end", MediaTimeRange{MediaTime::make(5, 1), MediaTime::make(1, 1)}},
    };
    for (const auto &[name, range] : badRanges) {
        SCOPED_TRACE(name);
        auto session = zaf::test::makeSession(source, output);
        session->setTimeRange(range);
        expectFailure(session, kMediaErrorInvalidArgument);
    }
    {
        SCOPED_TRACE("mix names a video track");
        auto session = zaf::test::makeSession(source, output);
        session->setAudioMix(AudioMix{{{1}}});
        expectFailure(session, kMediaErrorInvalidArgument);
    }
}

TEST_F(ExportFailureTest, ExportNeverOverwritesAnExistingOutput)
{
    QFile existing(output);
    ASSERT_TRUE(existing.open(QIODevice::WriteOnly));
    existing.write("keep me");
    existing.close();
    auto session = zaf::test::makeSession(source, output);
    zaf::test::LogCapture log;
    ASSERT_EQ(zaf::test::runToEnd(session), ExportStatus::Failed);
    EXPECT_EQ(session->error()->code, kMediaErrorOutputExists);
    ASSERT_TRUE(existing.open(QIODevice::ReadOnly));
    EXPECT_EQ(existing.readAll(), QByteArray("keep me"));
    expectNoPartialFiles();
}

TEST_F(ExportFailureTest, ExportIntoMissingDirectoryFailsWithWriteError)
{
    output = scratch.file(QStringLiteral("no-such-dir/out.mp4"));
    expectFailure(zaf::test::makeSession(source, output), kMediaErrorWriteFailed);
}

TEST_F(ExportFailureTest, ExportOfMissingEmptyTruncatedOrNonMovieInputFails)
{
    QFile good(source);
    ASSERT_TRUE(good.open(QIODevice::ReadOnly));
    const QByteArray bytes = good.readAll();
    auto writeFile = [&](const char *name, const QByteArray &data) {
        const QString path = scratch.file(QString::fromLatin1(name));
        QFile f(path);
        EXPECT_TRUE(f.open(QIODevice::WriteOnly));
        f.write(data);
        return path;
    };
    const QList<std::pair<QString, int>> inputs{
        {scratch.file(QStringLiteral("missing.mp4")), kMediaErrorCannotOpen},
        {writeFile("empty.mp4", {}), kMediaErrorCannotOpen},
        {writeFile("noise.mp4", QByteArray(100000, '\x5a')), kMediaErrorCannotOpen},
        {writeFile("head.mp4", bytes.left(bytes.size() / 3)), kMediaErrorCannotOpen},
        {writeFile("tail.mp4", bytes.mid(bytes.size() / 3)), kMediaErrorCannotOpen},
    };
    for (const auto &[path, code] : inputs) {
        SCOPED_TRACE(path.toStdString());
        for (bool withRange : {false, true}) {
            auto session = zaf::test::makeSession(path, output);
            if (withRange)
                session->setTimeRange(MediaTimeRange{MediaTime::zero(), MediaTime::make(1, 1)});
            expectFailure(session, code);
        }
    }
}

TEST_F(ExportFailureTest, CancelledExportReportsCancelledAndLeavesNoOutput)
{
    const QString longSource = zaf::test::makeFixtureMovie(
        scratch.path(), FixtureSpec{.seconds = 20, .width = 640, .height = 480, .audioTracks = 2});
    ASSERT_FALSE(longSource.isEmpty());
    auto session = zaf::test::makeSession(longSource, output);
    session->setTimeRange(MediaTimeRange{MediaTime::zero(), MediaTime::make(20, 1)});
    zaf::test::ExportWaiter waiter;
    session->exportAsynchronously(waiter.completion(session));
    // Cancel once the export has really started writing.
    for (int i = 0; i < 2000 && session->progress() <= 0.0f && session->status() != ExportStatus::Failed; ++i)
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    session->cancelExport();
    const zaf::test::ExportOutcome outcome = waiter.wait();
    EXPECT_EQ(outcome.completions, 1);
    EXPECT_FALSE(outcome.ranOnMainThread);
    EXPECT_EQ(outcome.statusInCompletion, ExportStatus::Cancelled);
    EXPECT_EQ(int(session->status()), 5);
    ASSERT_TRUE(session->error().has_value());
    EXPECT_EQ(session->error()->code, kMediaErrorCancelled);
    EXPECT_FALSE(QFile::exists(output));
    expectNoPartialFiles();
}

TEST_F(ExportFailureTest, CancelBeforeStartEndsCancelledWithOneCompletion)
{
    auto session = zaf::test::makeSession(source, output);
    session->cancelExport();
    EXPECT_EQ(session->status(), ExportStatus::Cancelled);
    EXPECT_EQ(zaf::test::runToEnd(session), ExportStatus::Cancelled);
    EXPECT_FALSE(QFile::exists(output));

    // A session exports once: a second start completes without exporting.
    zaf::test::ExportWaiter again;
    session->exportAsynchronously(again.completion(session));
    EXPECT_EQ(again.wait().completions, 1);
    EXPECT_EQ(session->status(), ExportStatus::Cancelled);
    EXPECT_FALSE(QFile::exists(output));
}

} // namespace
} // namespace zaf::media
