// The YouTube share activity: its identity, its capability gate, its preparation (the mixed copy in
// the temporary directory and the description text) and the item lists of the override message.
#include "platform/capability/capability_service.h"
#include "platform/media/export_session.h"
#include "publishing/youtube_activity.h"
#include "tempstore/temp_store.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/process_temp_directory.h"
#include "tests/support/temp_dir.h"

#include <QCoreApplication>
#include <QFile>
#include <QFileInfo>
#include <QJsonArray>
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

bool isFinal(media::ExportStatus status)
{
    return status == media::ExportStatus::Completed || status == media::ExportStatus::Failed
        || status == media::ExportStatus::Cancelled;
}

// Waits until the copy's export has ended and, when it completed, until its completion has logged.
media::ExportStatus waitForExport(const ZafYouTubeActivity &activity, const LogCapture &logs)
{
    const auto session = activity.exportSession();
    if (!session) {
        ADD_FAILURE() << "no export session";
        return media::ExportStatus::Unknown;
    }
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(120);
    while (!isFinal(session->status()) && std::chrono::steady_clock::now() < deadline)
        QThread::msleep(20);
    if (session->status() == media::ExportStatus::Completed) {
        while (logs.count(kCompleteMessage) == 0 && std::chrono::steady_clock::now() < deadline)
            QThread::msleep(20);
    }
    return session->status();
}

int audioStreamCount(const QString &path)
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
}

TEST(YouTubeActivity, ImagesComeFromTheOwnBundle)
{
    EXPECT_EQ(ZafYouTubeActivity::mediaShelfFrameworkBundle(), QStringLiteral(":/zaf/publishing/"));
    EXPECT_TRUE(ZafYouTubeActivity::mediaShelfImageNamed(QStringLiteral("NoSuchImage")).isNull());

    const QImage image = ZafYouTubeActivity::mediaShelfImageNamed(QStringLiteral("ZafPublishVideo"));
    ASSERT_FALSE(image.isNull());
    // Something is drawn: not every pixel transparent.
    bool drawn = false;
    for (int y = 0; y < image.height() && !drawn; ++y)
        for (int x = 0; x < image.width() && !drawn; ++x)
            drawn = qAlpha(image.pixel(x, y)) > 0;
    EXPECT_TRUE(drawn);

    ZafYouTubeActivity activity;
    EXPECT_FALSE(activity.activityImage().isNull());
    const QImage settings = activity._activitySettingsImage();
    ASSERT_FALSE(settings.isNull());
    EXPECT_NEAR(settings.deviceIndependentSize().width(), 29.0, 0.5);
    EXPECT_NEAR(settings.deviceIndependentSize().height(), 29.0, 0.5);
}

TEST(YouTubeActivity, CanPerformFollowsTheCapabilityWhateverTheItems)
{
    const QVariantList full{QStringLiteral("text"), QStringLiteral("https://example.invalid/app"),
                            QUrl::fromLocalFile(QStringLiteral("/nowhere/movie.mp4"))};
    ZafYouTubeActivity activity;
    {
        CapabilityOverride allowed(true);
        EXPECT_TRUE(activity.canPerformWithActivityItems({}));
        EXPECT_TRUE(activity.canPerformWithActivityItems(full));
    }
    {
        CapabilityOverride forbidden(false);
        EXPECT_FALSE(activity.canPerformWithActivityItems({}));
        EXPECT_FALSE(activity.canPerformWithActivityItems(full));
    }
}

TEST(YouTubeActivity, PrepareComposesTheDescriptionAndCopiesTheMovieWithMixedAudio)
{
    ScratchDir scratch;
    const QString source = movieWithAudioTracks(scratch, 2);
    ASSERT_FALSE(source.isEmpty());

    LogCapture logs;
    ZafYouTubeActivity activity;
    const QUrl before = ZafYouTubeActivity::tempFileURL();
    activity.prepareWithActivityItems({QStringLiteral("Look at this"), QStringLiteral("https://example.invalid/app"),
                                       QUrl::fromLocalFile(source)});

    EXPECT_EQ(activity.descriptionText(), QStringLiteral("Look at this https://example.invalid/app"));
    EXPECT_EQ(activity.sourceMovieURL(), QUrl::fromLocalFile(source));
    const QString copy = activity.movieURL().toLocalFile();
    EXPECT_TRUE(activity.movieURL() == before || QFileInfo(copy).fileName().startsWith(QStringLiteral("ZafReplay_YouTube")));
    EXPECT_TRUE(copy.startsWith(ZafTempStore::defaultStore()._srTempPath()));

    ASSERT_EQ(waitForExport(activity, logs), media::ExportStatus::Completed);
    EXPECT_EQ(logs.count(kCompleteMessage), 1);
    ASSERT_TRUE(QFileInfo::exists(copy));
    EXPECT_EQ(audioStreamCount(copy), 1);
    EXPECT_GT(toneLevel(copy, 0, fixture::toneFrequency(0)), 0.3);
    EXPECT_GT(toneLevel(copy, 0, fixture::toneFrequency(1)), 0.3);
    EXPECT_EQ(streamMD5(copy, QStringLiteral("0:v")), streamMD5(source, QStringLiteral("0:v")));
    QFile::remove(copy);
}

TEST(YouTubeActivity, EmptyStoreLinkLeavesOneTrailingSpace)
{
    ScratchDir scratch;
    const QString source = movieWithAudioTracks(scratch, 1);
    ASSERT_FALSE(source.isEmpty());
    LogCapture logs;
    ZafYouTubeActivity activity;
    activity.prepareWithActivityItems({QStringLiteral("Share text"), QString(), QUrl::fromLocalFile(source)});
    EXPECT_EQ(activity.descriptionText(), QStringLiteral("Share text "));
    EXPECT_EQ(waitForExport(activity, logs), media::ExportStatus::Completed);
    QFile::remove(activity.movieURL().toLocalFile());
}

TEST(YouTubeActivity, MovieWithoutAudioIsCopiedWithoutAudio)
{
    ScratchDir scratch;
    const QString source = movieWithAudioTracks(scratch, 0);
    ASSERT_FALSE(source.isEmpty());
    LogCapture logs;
    ZafYouTubeActivity activity;
    activity.prepareWithActivityItems({QStringLiteral("T"), QStringLiteral("L"), QUrl::fromLocalFile(source)});
    ASSERT_TRUE(activity.exportSession());
    const std::optional<media::AudioMix> mix = activity.exportSession()->audioMix();
    ASSERT_TRUE(mix.has_value());
    EXPECT_TRUE(mix->inputParameters.isEmpty());

    ASSERT_EQ(waitForExport(activity, logs), media::ExportStatus::Completed);
    const QString copy = activity.movieURL().toLocalFile();
    EXPECT_EQ(audioStreamCount(copy), 0);
    EXPECT_EQ(probeStreams(ffprobe(copy), QStringLiteral("video")).size(), 1);
    QFile::remove(copy);
}

TEST(YouTubeActivity, OverrideMessageListStillExportsTheMovie)
{
    ScratchDir scratch;
    const QString source = movieWithAudioTracks(scratch, 2);
    ASSERT_FALSE(source.isEmpty());
    // An attachment that is a file but no movie sits where the movie usually is.
    const QString attachment = scratch.write(QStringLiteral("notes.txt"), 300);

    LogCapture logs;
    ZafYouTubeActivity activity;
    activity.prepareWithActivityItems({QStringLiteral("Host message"), QUrl::fromLocalFile(source),
                                       QUrl::fromLocalFile(attachment)});
    EXPECT_EQ(activity.descriptionText(), QStringLiteral("Host message"));
    EXPECT_EQ(activity.sourceMovieURL(), QUrl::fromLocalFile(source));
    ASSERT_EQ(waitForExport(activity, logs), media::ExportStatus::Completed);
    const QString copy = activity.movieURL().toLocalFile();
    EXPECT_EQ(audioStreamCount(copy), 1);
    EXPECT_GT(toneLevel(copy, 0, fixture::toneFrequency(1)), 0.3);
    QFile::remove(copy);
}

TEST(YouTubeActivity, ShortListsAreNeverReadPastTheEnd)
{
    ScratchDir scratch;
    const QString source = movieWithAudioTracks(scratch, 1);
    ASSERT_FALSE(source.isEmpty());
    {
        // Two items: the message and the movie.
        LogCapture logs;
        ZafYouTubeActivity activity;
        activity.prepareWithActivityItems({QStringLiteral("Host message"), QUrl::fromLocalFile(source)});
        EXPECT_EQ(activity.descriptionText(), QStringLiteral("Host message"));
        EXPECT_EQ(waitForExport(activity, logs), media::ExportStatus::Completed);
        QFile::remove(activity.movieURL().toLocalFile());
    }
    {
        // No items: a fresh name, no export, no description.
        LogCapture logs;
        ZafYouTubeActivity activity;
        activity.prepareWithActivityItems({});
        EXPECT_TRUE(activity.descriptionText().isEmpty());
        EXPECT_FALSE(activity.exportSession());
        EXPECT_TRUE(activity.sourceMovieURL().isEmpty());
        EXPECT_TRUE(QFileInfo(activity.movieURL().toLocalFile()).fileName().startsWith(QStringLiteral("ZafReplay_YouTube")));
        EXPECT_FALSE(QFileInfo::exists(activity.movieURL().toLocalFile()));
        EXPECT_EQ(logs.count(QStringLiteral("ZafYouTubeActivity: no movie among the activity items")), 1);
    }
    {
        // Texts only, and a file that is no movie: nothing to export.
        ScratchDir other;
        const QString garbage = other.write(QStringLiteral("garbage.mp4"), 4000);
        ZafYouTubeActivity activity;
        activity.prepareWithActivityItems({QStringLiteral("a"), QStringLiteral("b"), QUrl::fromLocalFile(garbage)});
        EXPECT_EQ(activity.descriptionText(), QStringLiteral("a b"));
        EXPECT_FALSE(activity.exportSession());
    }
}

TEST(YouTubeActivity, TempFileURLIsTheDirectoryStemAndWholeSeconds)
{
    const QString dir = ZafTempStore::defaultStore()._srTempPath();
    EXPECT_EQ(ZafYouTubeActivity::tempFileURLForTime(1000000000.9).toLocalFile(),
              dir + QStringLiteral("/ZafReplay_YouTube1000000000.mp4"));
    EXPECT_TRUE(ZafYouTubeActivity::tempFileURLForTime(42).toLocalFile().contains(QStringLiteral("//ZafReplay_YouTube42.mp4")));
    EXPECT_EQ(ZafYouTubeActivity::tempFileURLForTime(7.0), ZafYouTubeActivity::tempFileURLForTime(7.99));
    EXPECT_NE(ZafYouTubeActivity::tempFileURLForTime(7.0), ZafYouTubeActivity::tempFileURLForTime(8.0));
    EXPECT_TRUE(ZafYouTubeActivity::tempFileURL().isLocalFile());
}

} // namespace
} // namespace zaf::test
