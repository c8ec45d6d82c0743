// The YouTube share activity: its identity, its capability gate, and its preparation.
#include "platform/dispatch.h"
#include "platform/media/export_session.h"
#include "publishing/activity_items.h"
#include "publishing/youtube_activity.h"
#include "tempstore/temp_store.h"
#include "tests/support/named_cases.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/process_temp_directory.h"
#include "tests/support/scoped_capabilities.h"
#include "tests/support/temp_dir.h"
#include "tests/support/wait_until.h"

#include <QCoreApplication>
#include <QFile>
#include <QFileInfo>
#include <QLocale>
#include <gtest/gtest.h>

namespace zaf::test {
namespace {

ZAF_PRINT_CASES_AS_NAMES

class TempDirectoryEnvironment : public ::testing::Environment {
public:
    void SetUp() override { usePrivateTempDirectoryForProcess(); }
};
const auto *const g_environment = ::testing::AddGlobalTestEnvironment(new TempDirectoryEnvironment);

const QString kCompleteMessage = QStringLiteral("ZafYouTubeActivity: Export Mixed YouTube Video Complete.");
const QString kNoMovieMessage = QStringLiteral("ZafYouTubeActivity: no movie among the activity items");

QUrl fixtureMovie(int audioTracks, double seconds = 2)
{
    return QUrl::fromLocalFile(sharedFixtureMovie({.seconds = seconds, .audioTracks = audioTracks}));
}

// Items written as texts, "@movie" (two audio tracks), "@silent" (none), "@garbage" (a file that is
// no movie) and "@notes" (a text file) standing for files.
QVariantList items(const QStringList &written)
{
    static ScratchDir scratch;
    QVariantList result;
    for (const QString &item : written) {
        if (item == QLatin1String("@movie") || item == QLatin1String("@silent"))
            result << fixtureMovie(item == QLatin1String("@movie") ? 2 : 0);
        else if (item.startsWith(QLatin1Char('@')))
            result << QUrl::fromLocalFile(scratch.write(item.mid(1) + (item == QLatin1String("@notes") ? ".txt" : ".mp4"), 4000));
        else
            result << item;
    }
    return result;
}

// Cancels the copy as the form's Cancel does and waits until it is removed: the copies of one
// second share a name.
void giveUpCopy(ZafYouTubeActivity &activity)
{
    activity.publishingAgentCancelButtonClicked(nullptr);
    dispatch::waitForGlobalQueue(dispatch::Priority::Background); // the export's end, then the removal
    dispatch::waitForGlobalQueue(dispatch::Priority::Background);
}

// Type, title and category.
class YouTubeActivityIdentityTest : public ::testing::TestWithParam<const char *> {};

TEST_P(YouTubeActivityIdentityTest, IsTheSameInEveryLanguage)
{
    const QLocale previous;
    QLocale::setDefault(QLocale(QString::fromLatin1(GetParam())));
    ZafYouTubeActivity activity;
    EXPECT_EQ(activity.activityType(), QStringLiteral("ZafPublishToYouTube"));
    EXPECT_EQ(activity.activityTitle(), QStringLiteral("YouTube"));
    EXPECT_EQ(ZafYouTubeActivity::activityCategory(), 1);
    QLocale::setDefault(previous);
}

INSTANTIATE_TEST_SUITE_P(Languages, YouTubeActivityIdentityTest, ::testing::Values("en_US", "de_DE", "ja_JP"));

// A name the bundle lacks gives none.
TEST(YouTubeActivity, TheImageComesFromTheActivitysBundle)
{
    const QImage image = ZafYouTubeActivity::mediaShelfImageNamed(QStringLiteral("ZafPublishVideo"));
    QImage blank(image.size(), image.format());
    blank.fill(Qt::transparent);
    EXPECT_FALSE(image.isNull() || image == blank) << "nothing drawn";
    EXPECT_TRUE(ZafYouTubeActivity::mediaShelfImageNamed(QStringLiteral("NoSuchImage")).isNull());
    EXPECT_FALSE(ZafYouTubeActivity().activityImage().isNull());
}

// Only the capability decides; the items are not looked at.
class YouTubeActivityCapabilityTest : public ::testing::TestWithParam<bool> {};

TEST_P(YouTubeActivityCapabilityTest, CanPerformFollowsTheCapabilityWhateverTheItems)
{
    ScopedCapabilities capability(GetParam() ? R"({"not-green-tea": true})" : R"({"not-green-tea": false})");
    ZafYouTubeActivity activity;
    EXPECT_EQ(activity.canPerformWithActivityItems({}), GetParam());
    EXPECT_EQ(activity.canPerformWithActivityItems(items({"text", "https://example.invalid/app", "@garbage"})), GetParam());
}

INSTANTIATE_TEST_SUITE_P(Answers, YouTubeActivityCapabilityTest, ::testing::Bool());

struct DescriptionCase {
    const char *name;
    QStringList items;
    QString description;
};

class ActivityDescriptionTest : public ::testing::TestWithParam<DescriptionCase> {};

// No position past the end of a short list is read.
TEST_P(ActivityDescriptionTest, TakesTheLeadingTexts)
{
    EXPECT_EQ(publishing::descriptionForItems(items(GetParam().items)), GetParam().description);
}

INSTANTIATE_TEST_SUITE_P(Items, ActivityDescriptionTest, ::testing::Values(
    DescriptionCase{"UsualList", {"Look at this", "https://example.invalid/app", "@movie"}, "Look at this https://example.invalid/app"},
    DescriptionCase{"EmptyStoreLink", {"Share text", "", "@movie"}, "Share text "},
    DescriptionCase{"HostMessageAndAttachment", {"Host message", "@movie", "@notes"}, "Host message"},
    DescriptionCase{"HostMessageOnly", {"Host message"}, "Host message"},
    DescriptionCase{"MovieFirst", {"@movie", "Text"}, "Text"},
    DescriptionCase{"NoItems", {}, ""}), zaf::test::caseName);

struct SourceCase {
    const char *name;
    QStringList items;
    bool probes;         // a file among the items is opened before anything is copied
    bool copiesTheMovie; // else nothing is copied
    bool editorNamesTheMovie = false;
};

class ActivitySourceTest : public ::testing::TestWithParam<SourceCase> {};

// The movie copied is the editor's when it names one, else the first file of the list when it
// plays: never a later attachment, even a playable one. Without one, nothing is copied (logged).
// Preparation returns before that file is opened: the probe's answer reaches the main thread through
// its event loop, and only then does the copy start.
TEST_P(ActivitySourceTest, CopiesTheRecordingOnly)
{
    const SourceCase &c = GetParam();
    LogCapture logs;
    ZafYouTubeActivity activity;
    activity.setSourceMovieURL(c.editorNamesTheMovie ? fixtureMovie(2) : QUrl());
    activity.prepareWithActivityItems(items(c.items));
    EXPECT_EQ(activity.isProbingMovie(), c.probes);
    EXPECT_EQ(bool(activity.exportSession()), c.copiesTheMovie && !c.probes);
    ASSERT_TRUE(waitUntil([&] { return !activity.isProbingMovie(); }));
    EXPECT_EQ(activity.sourceMovieURL(), c.copiesTheMovie ? fixtureMovie(2) : QUrl());
    EXPECT_EQ(bool(activity.exportSession()), c.copiesTheMovie);
    EXPECT_EQ(logs.count(kNoMovieMessage), c.copiesTheMovie ? 0 : 1);
    giveUpCopy(activity);
}

INSTANTIATE_TEST_SUITE_P(Items, ActivitySourceTest, ::testing::Values(
    SourceCase{"UsualList", {"T", "L", "@movie"}, true, true},
    SourceCase{"HostMessageAndAttachment", {"Host message", "@movie", "@notes"}, true, true},
    SourceCase{"HostMessageAndAMovieAttachment", {"Host message", "@movie", "@silent"}, true, true},
    SourceCase{"UnplayableMovieBeforeAMovieAttachment", {"M", "@garbage", "@silent"}, true, false},
    SourceCase{"TheEditorsMovie", {"M", "@silent", "@silent"}, false, true, true},
    SourceCase{"NoFile", {"a", "b"}, false, false},
    SourceCase{"NoItems", {}, false, false}), zaf::test::caseName);

// The probe's answer starts no export.
TEST(YouTubeActivity, CancelDuringTheProbeStartsNoCopy)
{
    ZafYouTubeActivity activity;
    activity.prepareWithActivityItems(items({"T", "L", "@movie"}));
    giveUpCopy(activity);
    EXPECT_FALSE(activity.isProbingMovie());
    dispatch::waitForGlobalQueue(dispatch::Priority::Default); // the probe, which queues its answer
    QCoreApplication::processEvents();
    EXPECT_FALSE(activity.exportSession());
    EXPECT_TRUE(activity.sourceMovieURL().isEmpty());
    EXPECT_FALSE(QFileInfo::exists(activity.movieURL().toLocalFile()));
}

class ActivityCopyTest : public ::testing::TestWithParam<int> {};

// The copy, in the temporary directory, has the video unchanged and every audio track of the movie
// mixed into one (none for a silent movie); its completion logs.
TEST_P(ActivityCopyTest, MixesEveryAudioTrackIntoOne)
{
    const int audioTracks = GetParam();
    const QUrl movie = fixtureMovie(audioTracks);
    LogCapture logs;
    ZafYouTubeActivity activity;
    activity.prepareWithActivityItems({QStringLiteral("T"), QString(), movie});
    const QString copy = activity.movieURL().toLocalFile();
    EXPECT_TRUE(copy.startsWith(ZafTempStore::defaultStore()._srTempPath() + QStringLiteral("/ZafReplay_YouTube")));
    ASSERT_TRUE(waitUntil([&] { return activity.exportSession() != nullptr; }));
    ASSERT_TRUE(activity.exportSession()->waitUntilFinished(std::chrono::seconds(120)));
    ASSERT_EQ(activity.exportSession()->status(), media::ExportStatus::Completed);
    EXPECT_TRUE(waitUntil([&] { return logs.count(kCompleteMessage) == 1; }, 5000));
    EXPECT_EQ(probeStreams(ffprobe(copy), QStringLiteral("audio")).size(), audioTracks > 0 ? 1 : 0);
    EXPECT_EQ(streamMD5(copy, QStringLiteral("0:v")), streamMD5(movie.toLocalFile(), QStringLiteral("0:v")));
    for (int track = 0; track < audioTracks; ++track)
        EXPECT_GT(toneLevel(copy, 0, fixture::toneFrequency(track)), 0.3) << "track " << track;
    QFile::remove(copy); // the copies of one second share a name
}

INSTANTIATE_TEST_SUITE_P(AudioTracks, ActivityCopyTest, ::testing::Values(2, 0));

// Cancel while the copy is still being written stops its export and removes the copy only after
// it has stopped, so no copy is written again after the removal.
TEST(YouTubeActivity, CancelDuringTheCopysExportLeavesNoCopy)
{
    ZafYouTubeActivity activity;
    activity.setSourceMovieURL(fixtureMovie(2, 30));
    activity.prepareWithActivityItems({});
    const auto session = activity.exportSession();
    ASSERT_TRUE(session);
    giveUpCopy(activity);
    ASSERT_TRUE(session->waitUntilFinished(std::chrono::seconds(60)));
    EXPECT_EQ(session->status(), media::ExportStatus::Cancelled);
    EXPECT_FALSE(QFileInfo::exists(activity.movieURL().toLocalFile()));
}

TEST(YouTubeActivity, TempFileURLNamesTheWholeSecond)
{
    EXPECT_EQ(ZafYouTubeActivity::tempFileURLForTime(1000000000.9).toLocalFile(),
              ZafTempStore::defaultStore()._srTempPath() + QStringLiteral("/ZafReplay_YouTube1000000000.mp4"));
    EXPECT_NE(ZafYouTubeActivity::tempFileURLForTime(7.99), ZafYouTubeActivity::tempFileURLForTime(8.0));
}

} // namespace
} // namespace zaf::test
