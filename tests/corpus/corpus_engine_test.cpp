// Every corpus movie through probe, trim, the save's mix and thumbnails: garbage fails with an error
// and leaves no file, valid movies give correct results, and every wait is bounded.
#include "media/audio_mix_utility.h"
#include "platform/media/export_session.h"
#include "platform/media/image_generator.h"
#include "platform/media/media_asset.h"
#include "tests/corpus/hostile_movies.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/media/image_completions.h"
#include "tests/support/temp_dir.h"

#include <QFileInfo>
#include <QUrl>

#include <gtest/gtest.h>

#include <cmath>
#include <condition_variable>
#include <limits>
#include <mutex>

namespace zaf::test::corpus {
namespace {

using namespace zaf::media;

// No command may take longer than this on any corpus movie (sanitizer builds included); one that
// does is reported as a hang.
constexpr int kHangSeconds = 60;

std::string describe(const OptionalError &error)
{
    return error ? error->description().toStdString() : std::string("no error");
}

// An error the engine reports: in its domain, with a code.
void expectMediaError(const OptionalError &error)
{
    ASSERT_TRUE(error) << "a failure without an error";
    EXPECT_EQ(error->domain, QLatin1String(kMediaErrorDomain)) << describe(error);
    EXPECT_GT(error->code, 0) << describe(error);
}

class CorpusEngineTest : public ::testing::TestWithParam<HostileMovie> {
protected:
    void SetUp() override
    {
        if (const QString why = unavailableReason(GetParam()); !why.isEmpty())
            GTEST_SKIP() << qPrintable(why);
        m_path = hostileMoviePath(GetParam());
        ASSERT_FALSE(m_path.isEmpty());
    }

    std::shared_ptr<MediaAsset> asset() const { return MediaAsset::assetWithURL(QUrl::fromLocalFile(m_path)); }

    // Runs the export to its end (bounded); false, with a failure, when it hangs.
    bool run(ExportSession &session)
    {
        std::mutex mutex;
        std::condition_variable_any done;
        bool finished = false;
        session.exportAsynchronously([&] {
            std::lock_guard lock(mutex);
            finished = true;
            done.notify_all();
        });
        std::unique_lock lock(mutex);
        if (done.wait_for(lock, std::chrono::seconds(kHangSeconds), [&] { return finished; }))
            return true;
        ADD_FAILURE() << "HANG: the export of " << GetParam().name << " did not finish within " << kHangSeconds << " s";
        session.cancelExportAndWait();
        done.wait_for(lock, std::chrono::seconds(kHangSeconds), [&] { return finished; });
        return false;
    }

    // Runs the export; true when it made a movie to check further (its streams in m_video and
    // m_audio). A failure must be clean: an engine error, logged, and no output left behind; it is
    // a wrong success when `mustFail`. A damaged movie may fail, and its success must hold a stream.
    bool exportedMovie(ExportSession &session, const QString &output, bool mustFail)
    {
        if (!run(session))
            return false;
        if (mustFail || (GetParam().nature == Nature::Damaged && session.status() != ExportStatus::Completed)) {
            EXPECT_EQ(session.status(), ExportStatus::Failed) << "WRONG SUCCESS: " << GetParam().name;
            expectMediaError(session.error());
            EXPECT_FALSE(QFileInfo::exists(output)) << "a failed export left " << qPrintable(output);
            EXPECT_TRUE(loggedWarning(m_log)) << "the failure was not logged";
            return false;
        }
        EXPECT_EQ(session.status(), ExportStatus::Completed) << describe(session.error());
        m_video = probeStreams(output, QStringLiteral("video"));
        m_audio = probeStreams(output, QStringLiteral("audio"));
        EXPECT_FALSE(m_video.isEmpty() && m_audio.isEmpty()) << "a successful export holds nothing";
        return session.status() == ExportStatus::Completed && GetParam().nature != Nature::Damaged;
    }

    QString m_path;
    QList<QJsonObject> m_video, m_audio;
    ScratchDir m_scratch;
    LogCapture m_log;
};

double seconds(const QJsonObject &stream)
{
    return stream.value(QLatin1String("duration")).toString().toDouble();
}

// The longest stream of a movie as ffprobe reads it (edit lists applied).
double longestStream(const QString &path)
{
    double longest = 0;
    for (const char *type : {"video", "audio"}) {
        for (const QJsonObject &stream : probeStreams(path, QLatin1String(type)))
            longest = std::max(longest, seconds(stream));
    }
    return longest;
}

TEST_P(CorpusEngineTest, ProbeEndsCleanlyWithTheRightTracks)
{
    const HostileMovie &k = GetParam();
    auto a = asset();
    const bool loaded = a->load();
    if (k.nature == Nature::Garbage || (k.nature == Nature::Damaged && !loaded)) {
        EXPECT_FALSE(loaded) << "WRONG SUCCESS: " << k.name << " loads as a movie";
        expectMediaError(a->loadError());
        EXPECT_FALSE(a->isPlayable());
        EXPECT_TRUE(a->tracks().isEmpty());
        EXPECT_TRUE(loggedWarning(m_log)) << "the failure was not logged";
        return;
    }
    ASSERT_TRUE(loaded) << describe(a->loadError());
    EXPECT_TRUE(a->isPlayable());
    if (k.nature == Nature::Damaged)
        return;
    const QList<AssetTrack> video = a->tracksWithMediaType(MediaType::Video);
    ASSERT_EQ(video.size(), k.hasVideo() ? 1 : 0);
    EXPECT_EQ(a->tracksWithMediaType(MediaType::Audio).size(), k.audioTracks);
    if (k.hasVideo()) {
        EXPECT_EQ(video[0].naturalSize.toSize(), k.videoSize);
        EXPECT_EQ(video[0].preferredTransform.rotationDegrees(), k.rotation);
        EXPECT_EQ(video[0].preferredTransform.mapSize(video[0].naturalSize).toSize(), k.displaySize());
    }
    EXPECT_NEAR(a->duration().seconds(), longestStream(m_path), 0.05);
}

// The number of pictures a cut of [start, end) holds: every picture shown somewhere in it.
int picturesShownIn(const QList<double> &times, double start, double end)
{
    int count = 0;
    for (qsizetype i = 0; i < times.size(); ++i) {
        const double shownUntil = i + 1 < times.size() ? times[i + 1] : std::numeric_limits<double>::infinity();
        if (times[i] < end && shownUntil > start)
            ++count;
    }
    return count;
}

TEST_P(CorpusEngineTest, TrimEndsCleanlyWithTheRange)
{
    const HostileMovie &k = GetParam();
    auto a = asset();
    const QString output = m_scratch.file(QStringLiteral("trim.mp4"));
    auto session = ExportSession::exportSessionWithAsset(a, QLatin1String(kExportPresetHighestQuality));
    ASSERT_TRUE(session);
    session->setOutputURL(QUrl::fromLocalFile(output));
    session->setOutputFileType(QLatin1String(kFileTypeMPEG4));
    // The middle half, in the editor's timescale; garbage has no duration, so it gets one second.
    const double duration = a->load() ? a->duration().seconds() : 1;
    const double start = duration / 4, end = duration * 3 / 4;
    constexpr std::int32_t kTimescale = 1000000000;
    session->setTimeRange(MediaTimeRange::fromStartEnd(MediaTime::fromSeconds(start, kTimescale), MediaTime::fromSeconds(end, kTimescale)));
    if (!exportedMovie(*session, output, k.nature == Nature::Garbage || k.nature == Nature::TooLarge))
        return;
    const QList<QJsonObject> &video = m_video, &audio = m_audio;
    ASSERT_EQ(video.size(), k.hasVideo() ? 1 : 0);
    EXPECT_EQ(audio.size(), k.audioTracks) << "a cut keeps every audio track";
    if (k.hasVideo()) {
        EXPECT_EQ(QSize(video[0]["width"].toInt(), video[0]["height"].toInt()), k.videoSize);
        EXPECT_EQ(probeRotation(video[0]), k.rotation);
        EXPECT_NEAR(countVideoFrames(output), picturesShownIn(presentationTimes(m_path), start, end), 1);
        // A video shorter than the audio ends where it ends.
        const double videoEnd = std::min(end, seconds(probeStreams(m_path, QStringLiteral("video")).value(0)));
        EXPECT_NEAR(seconds(video[0]), videoEnd - start, 0.07);
    }
    for (const QJsonObject &track : audio)
        EXPECT_NEAR(seconds(track), end - start, 0.05);
}

TEST_P(CorpusEngineTest, MixEndsCleanlyWithOneAudioTrack)
{
    const HostileMovie &k = GetParam();
    const QString output = m_scratch.file(QStringLiteral("mix.mp4"));
    auto session = ZafAudioMixUtility::exportSessionForMixingAudio(QUrl::fromLocalFile(m_path), QUrl::fromLocalFile(output));
    if (k.nature == Nature::Garbage && !session) {
        EXPECT_TRUE(loggedWarning(m_log));
        return;
    }
    ASSERT_TRUE(session);
    // A mix copies the video as it is, so a movie too large to decode mixes like any other.
    if (!exportedMovie(*session, output, k.nature == Nature::Garbage))
        return;
    const QList<QJsonObject> &video = m_video, &audio = m_audio;
    ASSERT_EQ(video.size(), k.hasVideo() ? 1 : 0);
    if (k.hasVideo()) {
        EXPECT_EQ(streamMD5(output, QStringLiteral("0:v:0")), streamMD5(m_path, QStringLiteral("0:v:0"))) << "the video is copied";
        EXPECT_EQ(probeRotation(video[0]), k.rotation);
    }
    ASSERT_EQ(audio.size(), std::min(k.audioTracks, 1)) << "the mix holds one audio track";
    if (k.audioTracks == 1) {
        EXPECT_EQ(streamMD5(output, QStringLiteral("0:a:0")), streamMD5(m_path, QStringLiteral("0:a:0")))
            << "one AAC track mixes into itself unchanged";
    } else if (k.audioTracks > 1) {
        EXPECT_EQ(audio[0]["sample_rate"].toString(), QLatin1String("48000"));
        EXPECT_EQ(audio[0]["channels"].toInt(), 2);
        EXPECT_NEAR(seconds(audio[0]), longestStream(m_path), 0.05);
    }
}

TEST_P(CorpusEngineTest, ThumbnailsEndCleanlyWithUprightPictures)
{
    const HostileMovie &k = GetParam();
    auto a = asset();
    auto generator = ImageGenerator::imageGeneratorWithAsset(a);
    constexpr int kHeight = 76, kCount = 5;
    generator->setMaximumSize(QSize(0, kHeight));
    const double duration = a->load() ? a->duration().seconds() : 1;
    QList<MediaTime> times;
    for (int i = 0; i < kCount; ++i)
        times.append(MediaTime::fromSeconds(duration * i / kCount, 600));
    ImageCompletions completions;
    generator->generateImagesAsynchronouslyForTimes(times, completions.handler());
    if (!completions.waitFor(kCount, kHangSeconds * 1000)) {
        ADD_FAILURE() << "HANG: " << completions.all().size() << " of " << kCount << " thumbnails of " << k.name << " within "
                      << kHangSeconds << " s";
        generator->cancelAllImageGeneration();
        completions.waitFor(kCount, kHangSeconds * 1000);
        return;
    }
    const QList<ImageCompletion> all = completions.all();
    ASSERT_EQ(all.size(), kCount);
    const bool pictures = k.hasVideo() && (k.nature == Nature::Valid || k.nature == Nature::Damaged);
    const QSize upright = k.displaySize();
    const double scale = std::min(1.0, double(kHeight) / std::max(1, upright.height()));
    const QSize expected(std::max(1, int(std::lround(upright.width() * scale))), std::max(1, int(std::lround(upright.height() * scale))));
    for (const ImageCompletion &c : all) {
        SCOPED_TRACE(c.requestedTime.seconds());
        EXPECT_FALSE(c.onMainThread);
        if (!pictures || (k.nature == Nature::Damaged && c.result == ImageGenerator::Result::Failed)) {
            EXPECT_EQ(c.result, ImageGenerator::Result::Failed) << "WRONG SUCCESS: a thumbnail of " << k.name;
            EXPECT_TRUE(c.image.isNull());
            expectMediaError(c.error);
            continue;
        }
        ASSERT_EQ(c.result, ImageGenerator::Result::Succeeded) << describe(c.error);
        EXPECT_EQ(c.image.size(), expected);
        EXPECT_TRUE(c.actualTime.isValid());
    }
    if (!pictures) {
        EXPECT_TRUE(loggedWarning(m_log)) << "the failure was not logged";
    }
}

INSTANTIATE_TEST_SUITE_P(Corpus, CorpusEngineTest, ::testing::ValuesIn(hostileMovies()), caseName);

} // namespace
} // namespace zaf::test::corpus
