// ExportSession when it cannot or must not finish: one completion, an error and no output file.
#include "tests/platform/media/export_test_support.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/unusable_movies.h"
#include "tests/support/private_mounts.h"

#include <QDir>
#include <QFile>

#include <thread>

namespace zaf::media {
namespace {

using namespace zaf::test;

ZAF_PRINT_CASES_AS_NAMES

class ExportFailureTest : public ::testing::Test {
protected:
    // Runs the session, expects Failed with `code` and a logged error, and no output file at all.
    void expectFailure(const std::shared_ptr<ExportSession> &session, int code)
    {
        LogCapture log;
        ASSERT_EQ(runToEnd(session), ExportStatus::Failed);
        ASSERT_TRUE(session->error().has_value());
        EXPECT_EQ(session->error()->domain, QString::fromLatin1(kMediaErrorDomain));
        EXPECT_EQ(session->error()->code, code) << session->error()->description().toStdString();
        EXPECT_FALSE(log.messages(QStringLiteral("zaf.media.export")).isEmpty());
        EXPECT_FALSE(QFile::exists(output));
        expectNoPartialFiles();
    }
    void expectNoPartialFiles()
    {
        for (const QString &name : entryNames(scratch.path()))
            EXPECT_FALSE(name.contains(QStringLiteral("partial"))) << name.toStdString();
    }
    ScratchDir scratch;
    const QString source = sharedFixtureMovie({.seconds = 2, .audioTracks = 1});
    QString output = scratch.file(QStringLiteral("out.mp4"));
};

// Sessions that do get made carry distinct, increasing ids.
TEST_F(ExportFailureTest, SessionIdsAreDistinctAndIncreasing)
{
    const auto first = makeSession(source, output), second = makeSession(source, output);
    EXPECT_NE(first->sessionID(), 0u);
    EXPECT_GT(second->sessionID(), first->sessionID());
}

TEST_F(ExportFailureTest, NoSessionForANullAssetNorAnUnknownPreset)
{
    EXPECT_EQ(ExportSession::exportSessionWithAsset(nullptr, QString::fromLatin1(kExportPresetHighestQuality)), nullptr);
    EXPECT_EQ(ExportSession::exportSessionWithAsset(MediaAsset::assetWithURL(QUrl::fromLocalFile(source)), QStringLiteral("LowQuality")),
              nullptr);
}

struct BadSetting {
    const char *name;
    std::function<void(ExportSession &)> configure;
};

class ExportBadSettingTest : public ExportFailureTest, public ::testing::WithParamInterface<BadSetting> {};

TEST_P(ExportBadSettingTest, FailsWithInvalidArgument)
{
    auto session = makeSession(source, output);
    GetParam().configure(*session);
    expectFailure(session, kMediaErrorInvalidArgument);
}

INSTANTIATE_TEST_SUITE_P(
    Cases, ExportBadSettingTest,
    ::testing::Values(
        BadSetting{"OtherFileType", [](ExportSession &s) { s.setOutputFileType(QStringLiteral("com.example.matroska")); }},
        BadSetting{"NoOutputURL", [](ExportSession &s) { s.setOutputURL(QUrl()); }},
        BadSetting{"EmptyRange", [](ExportSession &s) { s.setTimeRange({MediaTime::make(1, 1), MediaTime::zero()}); }},
        BadSetting{"NegativeDuration", [](ExportSession &s) { s.setTimeRange({MediaTime::make(1, 1), MediaTime::make(-1, 2)}); }},
        BadSetting{"InvalidStart", [](ExportSession &s) { s.setTimeRange({MediaTime::invalid(), MediaTime::make(1, 1)}); }},
        BadSetting{"NegativeStart", [](ExportSession &s) { s.setTimeRange({MediaTime::make(-1, 1), MediaTime::make(2, 1)}); }},
        BadSetting{"StartsAfterTheEnd", [](ExportSession &s) { s.setTimeRange({MediaTime::make(5, 1), MediaTime::make(1, 1)}); }},
        BadSetting{"MixNamesAVideoTrack", [](ExportSession &s) { s.setAudioMix(AudioMix{{{1}}}); }}),
    caseName);

// An existing output is left as it was.
TEST_F(ExportFailureTest, NeverOverwritesAnExistingOutput)
{
    QFile existing(output);
    ASSERT_TRUE(existing.open(QIODevice::WriteOnly));
    existing.write("keep me");
    existing.close();
    auto session = makeSession(source, output);
    LogCapture log;
    ASSERT_EQ(runToEnd(session), ExportStatus::Failed);
    EXPECT_EQ(session->error()->code, kMediaErrorOutputExists);
    EXPECT_EQ(fileContents(output), QByteArray("keep me"));
    expectNoPartialFiles();
}

TEST_F(ExportFailureTest, MissingOutputDirectoryIsAWriteError)
{
    output = scratch.file(QStringLiteral("no-such-dir/out.mp4"));
    expectFailure(makeSession(source, output), kMediaErrorWriteFailed);
}

// Inputs that are no usable movie fail to open, for a plain copy and for a trim alike.
class ExportBadInputTest : public ExportFailureTest, public ::testing::WithParamInterface<std::tuple<UnusableMovie, bool>> {};

TEST_P(ExportBadInputTest, FailsToOpen)
{
    const auto &[input, withRange] = GetParam();
    auto session = makeSession(input.make(scratch), output);
    if (withRange)
        session->setTimeRange(MediaTimeRange{MediaTime::zero(), MediaTime::make(1, 1)});
    expectFailure(session, kMediaErrorCannotOpen);
}

INSTANTIATE_TEST_SUITE_P(Files, ExportBadInputTest, ::testing::Combine(::testing::ValuesIn(unusableMovies()), ::testing::Bool()),
                         [](const auto &info) { return std::string(std::get<0>(info.param).name) + (std::get<1>(info.param) ? "Trimmed" : ""); });

// Cancelling a running export ends it Cancelled, with one completion off the main thread and no
// output. The wait after the cancel returns within its bound once nothing is written any more, even
// while the completion is held up (as the editor's is by its hop to the main thread). The output's
// name is free again: the next export to it writes the whole movie.
TEST_F(ExportFailureTest, CancelledExportStopsWritingWithinTheWaitAndLeavesNoOutput)
{
    // One group of pictures cut inside: every picture is re-encoded, so the export runs a while.
    auto session = makeSession(sharedFixtureMovie({.seconds = 20, .width = 640, .height = 480, .audioTracks = 2, .gop = 600}), output);
    session->setTimeRange(MediaTimeRange{MediaTime::make(1, 2), MediaTime::make(20, 1)});
    EXPECT_TRUE(session->waitUntilFinished(std::chrono::milliseconds(0))) << "a session not started writes nothing";
    ExportWaiter waiter;
    std::mutex gate;
    std::unique_lock held(gate);
    session->exportAsynchronously([&, completion = waiter.completion(session)] {
        std::lock_guard wait(gate);
        completion();
    });
    // Cancel once the export has really started writing.
    for (int i = 0; i < 2000 && session->progress() <= 0.0f && session->status() != ExportStatus::Failed; ++i)
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    EXPECT_FALSE(session->waitUntilFinished(std::chrono::milliseconds(1))) << "the export is still writing";
    session->cancelExport();
    EXPECT_TRUE(session->waitUntilFinished(std::chrono::seconds(10)));
    EXPECT_EQ(session->status(), ExportStatus::Cancelled);
    EXPECT_FALSE(QFile::exists(output));
    expectNoPartialFiles();
    held.unlock();
    const ExportOutcome outcome = waiter.wait();
    EXPECT_EQ(outcome.completions, 1);
    EXPECT_FALSE(outcome.ranOnMainThread);
    EXPECT_EQ(outcome.statusInCompletion, ExportStatus::Cancelled);
    ASSERT_TRUE(session->error().has_value());
    EXPECT_EQ(session->error()->code, kMediaErrorCancelled);

    EXPECT_EQ(runToEnd(makeSession(source, output)), ExportStatus::Completed);
    EXPECT_EQ(entryNames(scratch.path()), QStringList{"out.mp4"});
}

// A volume that fills up while the export writes: the export fails as disk full with a logged
// error, leaves no output and no partial file, and the source stays as it was.
TEST_F(ExportFailureTest, ExportOntoAVolumeThatFillsUpFailsAsDiskFullLeavingNothing)
{
    if (!insidePrivateMounts())
        return runThisTestInPrivateMounts();
    const QByteArray before = fileDigest(source);
    const QString small = scratch.file(QStringLiteral("small"));
    ASSERT_TRUE(QDir().mkpath(small));
    ASSERT_GT(QFileInfo(source).size(), 2 * 16384);
    const ScopedTmpfs volume(small, 16384);
    if (!volume.mounted())
        return;
    output = QDir(small).filePath(QStringLiteral("out.mp4"));
    expectFailure(makeSession(source, output), kMediaErrorDiskFull);
    EXPECT_EQ(entryNames(small), QStringList());
    EXPECT_EQ(fileDigest(source), before);
}

// Cancelling before the start ends the export Cancelled; a session exports once, so starting it
// again only runs the completion.
TEST_F(ExportFailureTest, CancelBeforeStartEndsCancelledWithOneCompletion)
{
    auto session = makeSession(source, output);
    session->cancelExport();
    EXPECT_EQ(session->status(), ExportStatus::Cancelled);
    EXPECT_TRUE(session->waitUntilFinished(std::chrono::milliseconds(0)));
    EXPECT_EQ(runToEnd(session), ExportStatus::Cancelled);
    EXPECT_EQ(runToEnd(session), ExportStatus::Cancelled);
    EXPECT_FALSE(QFile::exists(output));
}

} // namespace
} // namespace zaf::media
