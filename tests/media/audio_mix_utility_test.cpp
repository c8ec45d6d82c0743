// The audio mix utility on generated movies: its output file, the tracks it mixes and its errors.
#include "identity/user_error.h"
#include "media/audio_mix_utility.h"
#include "platform/media/export_session.h"
#include "platform/media/media_asset.h"
#include "tempstore/temp_store.h"
#include "tests/support/log_capture.h"
#include "tests/support/process_temp_directory.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/media/unusable_movies.h"
#include "tests/support/temp_dir.h"

#include <QFileInfo>
#include <QThread>
#include <gtest/gtest.h>

#include <future>

namespace zaf::test {
namespace {

// The whole program shares one temporary directory, as the editor's process does.
class TempDirectoryEnvironment : public ::testing::Environment {
public:
    void SetUp() override { usePrivateTempDirectoryForProcess(); }
};
const auto *const g_environment = ::testing::AddGlobalTestEnvironment(new TempDirectoryEnvironment);

struct MixResult {
    QUrl url;
    OptionalError error;
    bool onCallingThread = false;
};

MixResult mix(const QUrl &movie)
{
    std::promise<MixResult> promise;
    QThread *caller = QThread::currentThread();
    ZafAudioMixUtility::mixAudioForMovieWithCompletionHandler(movie, [&](const QUrl &url, const OptionalError &error) {
        promise.set_value({url, error, QThread::currentThread() == caller});
    });
    auto future = promise.get_future();
    EXPECT_EQ(future.wait_for(std::chrono::seconds(120)), std::future_status::ready);
    return future.get();
}

// Without a movie the completion runs at once, on the calling thread, with the no-movie error.
TEST(AudioMixUtility, AbsentMovieFailsAtOnceWithNoMovieCode)
{
    const MixResult r = mix(QUrl());
    EXPECT_TRUE(r.url.isEmpty());
    ASSERT_TRUE(r.error.has_value());
    EXPECT_EQ(r.error->code, -5818);
    EXPECT_EQ(r.error->domain, QLatin1String(ZafUserErrorDomain));
    EXPECT_TRUE(r.onCallingThread);
}

// Two tracks become one, in the temporary file named at the start (what the mix sounds like is the
// export's, checked in media_export_tests).
TEST(AudioMixUtility, TwoTrackMovieBecomesOneTrackInTheTemporaryFile)
{
    const QString source = sharedFixtureMovie({.seconds = 3, .audioTracks = 2});
    ASSERT_FALSE(source.isEmpty());
    const QUrl expected = ZafAudioMixUtility::tempFileURL();
    const MixResult r = mix(QUrl::fromLocalFile(source));
    ASSERT_FALSE(r.error.has_value()) << r.error->description().toStdString();
    EXPECT_FALSE(r.onCallingThread);
    // The URL named when the export started (allowing for a second boundary in between).
    EXPECT_TRUE(r.url == expected || r.url.toLocalFile().startsWith(ZafTempStore::defaultStore()._srTempPath()));
    const QString out = r.url.toLocalFile();
    EXPECT_TRUE(QFileInfo(out).fileName().startsWith(QStringLiteral("ZafReplay_Final")));
    EXPECT_EQ(probeStreams(out, "audio").size(), 1);
    EXPECT_EQ(probeStreams(out, "video").size(), 1);
}

// The mix lists every audio track in order and nothing else (the video is track 1), without reading
// the movie while the session is made.
class AudioMixTracks : public ::testing::TestWithParam<std::pair<int, QList<std::int32_t>>> {};

TEST_P(AudioMixTracks, MixListsEveryAudioTrackInOrder)
{
    ScratchDir scratch;
    const auto &[tracks, ids] = GetParam();
    const auto session = ZafAudioMixUtility::exportSessionForMixingAudio(QUrl::fromLocalFile(sharedFixtureMovie({.audioTracks = tracks})),
                                                                         QUrl::fromLocalFile(scratch.file(QStringLiteral("o.mp4"))));
    ASSERT_TRUE(session);
    EXPECT_FALSE(session->asset()->isLoaded()) << "making the session reads nothing";
    QList<std::int32_t> listed;
    for (const auto &p : ZafAudioMixUtility::audioMixForAsset(*session->asset()).inputParameters)
        listed << p.trackID;
    EXPECT_EQ(listed, ids);
}

INSTANTIATE_TEST_SUITE_P(Movies, AudioMixTracks, ::testing::Values(std::pair{0, QList<std::int32_t>{}}, std::pair{3, QList<std::int32_t>{2, 3, 4}}),
                         [](const auto &info) { return std::to_string(info.param.first) + "AudioTracks"; });

class AudioMixUnreadable : public ::testing::TestWithParam<UnusableMovie> {};

TEST_P(AudioMixUnreadable, FailsWithTheExportCodeAndLogs)
{
    ScratchDir scratch;
    LogCapture logs;
    const MixResult r = mix(QUrl::fromLocalFile(GetParam().make(scratch)));
    EXPECT_TRUE(r.url.isEmpty());
    EXPECT_EQ(r.error.value_or(Error{}).code, -5812);
    EXPECT_EQ(logs.count(QStringLiteral("ZafAudioMixUtility: MvAssetExportSessionFailed")), 1);
}

INSTANTIATE_TEST_SUITE_P(Files, AudioMixUnreadable, ::testing::ValuesIn(unusableMovies()), caseName);

// The temporary file is named from the directory path (whose trailing "/" gives a double slash)
// and the whole seconds of the time.
TEST(AudioMixUtility, TempFileURLIsTheDirectoryStemAndWholeSeconds)
{
    const QString dir = ZafTempStore::defaultStore()._srTempPath();
    EXPECT_EQ(ZafAudioMixUtility::tempFileURLForTime(1000000000.9).toLocalFile(), dir + QStringLiteral("/ZafReplay_Final1000000000.mp4"));
    EXPECT_TRUE(ZafAudioMixUtility::tempFileURLForTime(1000000000.9).toLocalFile().contains(QStringLiteral("//ZafReplay")));
    EXPECT_EQ(ZafAudioMixUtility::tempFileURLForTime(5.0), ZafAudioMixUtility::tempFileURLForTime(5.99));
}

} // namespace
} // namespace zaf::test
