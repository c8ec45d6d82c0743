// The YouTube share activity: its identity, its capability gate, and its preparation (the copy with
// mixed audio and the description text) for every shape of item list.
#include "platform/capability/capability_service.h"
#include "platform/dispatch.h"
#include "platform/media/export_session.h"
#include "publishing/youtube_activity.h"
#include "tempstore/temp_store.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/process_temp_directory.h"
#include "tests/support/temp_dir.h"

#include <QFile>
#include <QFileInfo>
#include <QLocale>
#include <QThread>
#include <gtest/gtest.h>

#include <chrono>

namespace zaf::test {
namespace {

class TempDirectoryEnvironment : public ::testing::Environment {
public:
    void SetUp() override { usePrivateTempDirectoryForProcess(); }
};
const auto *const g_environment = ::testing::AddGlobalTestEnvironment(new TempDirectoryEnvironment);

const QString kCompleteMessage = QStringLiteral("ZafYouTubeActivity: Export Mixed YouTube Video Complete.");

// Waits until the copy's export has ended and, when it completed, until its completion has logged.
media::ExportStatus waitForExport(const ZafYouTubeActivity &activity, const LogCapture &logs)
{
    const auto session = activity.exportSession();
    if (!session) {
        ADD_FAILURE() << "no export session";
        return media::ExportStatus::Unknown;
    }
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(120);
    const auto ended = [&] {
        const media::ExportStatus status = session->status();
        return status == media::ExportStatus::Failed || status == media::ExportStatus::Cancelled
            || (status == media::ExportStatus::Completed && logs.count(kCompleteMessage) > 0);
    };
    while (!ended() && std::chrono::steady_clock::now() < deadline)
        QThread::msleep(20);
    return session->status();
}

int audioStreams(const QString &path)
{
    return int(probeStreams(ffprobe(path), QStringLiteral("audio")).size());
}

QString movieWithAudioTracks(const ScratchDir &scratch, int audioTracks)
{
    fixture::FixtureSpec spec;
    spec.seconds = 2;
    spec.audioTracks = audioTracks;
    return makeFixtureMovie(scratch.path(), spec);
}

// Points the capability service at a file answering "not-green-tea" with `allowed`.
class CapabilityOverride {
public:
    explicit CapabilityOverride(bool allowed)
    {
        const QString path = m_scratch.file(QStringLiteral("capabilities.json"));
        QFile file(path);
        EXPECT_TRUE(file.open(QIODevice::WriteOnly));
        file.write(allowed ? R"({"not-green-tea": true})" : R"({"not-green-tea": false})");
        file.close();
        qputenv("ZAF_CAPABILITIES_FILE", QFile::encodeName(path));
        CapabilityService::shared().reload();
    }
    ~CapabilityOverride()
    {
        qunsetenv("ZAF_CAPABILITIES_FILE");
        CapabilityService::shared().reload();
    }

private:
    ScratchDir m_scratch;
};

// Type and title do not change with the language; the image is drawn from the activity's own bundle.
TEST(YouTubeActivity, IdentityIsTheSameInEveryLanguage)
{
    const QLocale previous;
    for (const char *name : {"en_US", "de_DE", "ja_JP"}) {
        QLocale::setDefault(QLocale(QString::fromLatin1(name)));
        ZafYouTubeActivity activity;
        EXPECT_EQ(activity.activityType(), QStringLiteral("ZafPublishToYouTube")) << name;
        EXPECT_EQ(activity.activityTitle(), QStringLiteral("YouTube")) << name;
    }
    QLocale::setDefault(previous);
    EXPECT_EQ(ZafYouTubeActivity::activityCategory(), 1);

    const QImage image = ZafYouTubeActivity::mediaShelfImageNamed(QStringLiteral("ZafPublishVideo"));
    QImage blank(image.size(), image.format());
    blank.fill(Qt::transparent);
    EXPECT_FALSE(image.isNull() || image == blank) << "nothing drawn";
    EXPECT_TRUE(ZafYouTubeActivity::mediaShelfImageNamed(QStringLiteral("NoSuchImage")).isNull());
    EXPECT_FALSE(ZafYouTubeActivity().activityImage().isNull());
}

// Only the capability decides; the items are not looked at.
TEST(YouTubeActivity, CanPerformFollowsTheCapabilityWhateverTheItems)
{
    const QVariantList full{QStringLiteral("text"), QStringLiteral("https://example.invalid/app"),
                            QUrl::fromLocalFile(QStringLiteral("/nowhere/movie.mp4"))};
    ZafYouTubeActivity activity;
    for (bool allowed : {true, false}) {
        CapabilityOverride capability(allowed);
        EXPECT_EQ(activity.canPerformWithActivityItems({}), allowed);
        EXPECT_EQ(activity.canPerformWithActivityItems(full), allowed);
    }
}

// Preparation for every shape of item list: the description takes the leading texts; the movie is
// the editor's when it names one, else the first file of the list (never a later attachment, even a
// playable one), and is copied into the temporary
// directory with its audio tracks mixed into one and the video unchanged; no position past the end
// of a short list is read.
TEST(YouTubeActivity, PrepareHandlesEveryShapeOfItemList)
{
    ScratchDir scratch;
    const QUrl movie = QUrl::fromLocalFile(movieWithAudioTracks(scratch, 2));
    const QUrl silent = QUrl::fromLocalFile(movieWithAudioTracks(scratch, 0));
    ASSERT_FALSE(movie.isEmpty() || silent.isEmpty());
    const QUrl attachment = QUrl::fromLocalFile(scratch.write(QStringLiteral("notes.txt"), 300));
    const QUrl garbage = QUrl::fromLocalFile(scratch.write(QStringLiteral("garbage.mp4"), 4000));
    const struct {
        const char *name;
        QVariantList items;
        QString description;
        QUrl source; // empty: nothing to export
        int audioStreams;
        QUrl editorMovie = {};
    } cases[] = {
        {"usual list", {QStringLiteral("Look at this"), QStringLiteral("https://example.invalid/app"), movie},
         QStringLiteral("Look at this https://example.invalid/app"), movie, 1},
        {"empty store link", {QStringLiteral("Share text"), QString(), movie}, QStringLiteral("Share text "), movie, 1},
        {"host message and attachment", {QStringLiteral("Host message"), movie, attachment}, QStringLiteral("Host message"), movie, 1},
        {"host message only", {QStringLiteral("Host message"), movie}, QStringLiteral("Host message"), movie, 1},
        {"host message and a movie attachment", {QStringLiteral("Host message"), movie, silent}, QStringLiteral("Host message"), movie, 1},
        {"usual list and a movie attachment", {QStringLiteral("T"), QStringLiteral("L"), movie, silent}, QStringLiteral("T L"), movie, 1},
        {"unplayable movie before a movie attachment", {QStringLiteral("M"), garbage, silent}, QStringLiteral("M"), QUrl(), 0},
        {"the editor's movie", {QStringLiteral("M"), silent, silent}, QStringLiteral("M"), movie, 1, movie},
        {"movie without audio", {QStringLiteral("T"), QStringLiteral("L"), silent}, QStringLiteral("T L"), silent, 0},
        {"no movie", {QStringLiteral("a"), QStringLiteral("b"), garbage}, QStringLiteral("a b"), QUrl(), 0},
        {"no items", {}, QString(), QUrl(), 0},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.name);
        LogCapture logs;
        ZafYouTubeActivity activity;
        activity.setSourceMovieURL(c.editorMovie);
        activity.prepareWithActivityItems(c.items);
        EXPECT_EQ(activity.descriptionText(), c.description);
        const QString copy = activity.movieURL().toLocalFile();
        EXPECT_TRUE(copy.startsWith(ZafTempStore::defaultStore()._srTempPath() + QStringLiteral("/ZafReplay_YouTube")));
        EXPECT_EQ(activity.sourceMovieURL(), c.source);
        if (c.source.isEmpty()) {
            EXPECT_FALSE(activity.exportSession());
            EXPECT_FALSE(QFileInfo::exists(copy));
            EXPECT_EQ(logs.count(QStringLiteral("ZafYouTubeActivity: no movie among the activity items")), 1);
            continue;
        }
        ASSERT_EQ(waitForExport(activity, logs), media::ExportStatus::Completed);
        EXPECT_EQ(logs.count(kCompleteMessage), 1);
        EXPECT_EQ(audioStreams(copy), c.audioStreams);
        EXPECT_EQ(streamMD5(copy, QStringLiteral("0:v")), streamMD5(c.source.toLocalFile(), QStringLiteral("0:v")));
        for (int track = 0; track < 2 * c.audioStreams; ++track) // both source tracks in the mixed one
            EXPECT_GT(toneLevel(copy, 0, fixture::toneFrequency(track)), 0.3) << "track " << track;
        QFile::remove(copy); // the copies of one second share a name
    }
}

// Cancel while the copy is still being written stops its export and removes the copy only after
// it has stopped, so no copy is written again after the removal.
TEST(YouTubeActivity, CancelDuringTheCopysExportStopsItAndLeavesNoCopy)
{
    ScratchDir scratch;
    const QString movie = makeFixtureMovie(scratch.path(), {.seconds = 30, .audioTracks = 2});
    ZafYouTubeActivity activity;
    activity.prepareWithActivityItems({QStringLiteral("T"), QString(), QUrl::fromLocalFile(movie)});
    const auto session = activity.exportSession();
    ASSERT_TRUE(session);
    const QString copy = activity.movieURL().toLocalFile();
    activity.publishingAgentCancelButtonClicked(nullptr);
    ASSERT_TRUE(session->waitUntilFinished(std::chrono::seconds(60)));
    EXPECT_EQ(session->status(), media::ExportStatus::Cancelled);
    dispatch::waitForGlobalQueue(dispatch::Priority::Background); // the wait, then the removal it queues
    dispatch::waitForGlobalQueue(dispatch::Priority::Background);
    EXPECT_FALSE(QFileInfo::exists(copy));
}

// The copy's name is the temporary directory, the stem and the whole seconds.
TEST(YouTubeActivity, TempFileURLIsTheDirectoryStemAndWholeSeconds)
{
    EXPECT_EQ(ZafYouTubeActivity::tempFileURLForTime(1000000000.9).toLocalFile(),
              ZafTempStore::defaultStore()._srTempPath() + QStringLiteral("/ZafReplay_YouTube1000000000.mp4"));
    EXPECT_NE(ZafYouTubeActivity::tempFileURLForTime(7.99), ZafYouTubeActivity::tempFileURLForTime(8.0));
}

} // namespace
} // namespace zaf::test
