// ImageGenerator on files that are not usable movies: every request completes with Failed and an
// error, nothing crashes or hangs, and the failure is logged.

#include "platform/media/image_generator.h"
#include "platform/media/media_asset.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/media/image_completions.h"
#include "tests/support/temp_dir.h"

#include <QFile>
#include <QProcess>
#include <QUrl>

#include <gtest/gtest.h>

using zaf::media::ImageGenerator;
using zaf::media::MediaAsset;
using zaf::media::MediaTime;

namespace {

std::shared_ptr<ImageGenerator> generatorFor(const QString &path)
{
    return ImageGenerator::imageGeneratorWithAsset(MediaAsset::assetWithURL(QUrl::fromLocalFile(path)));
}

QString writeBytes(const zaf::test::ScratchDir &dir, const QString &name, const QByteArray &bytes)
{
    QFile file(dir.file(name));
    EXPECT_TRUE(file.open(QIODevice::WriteOnly));
    file.write(bytes);
    return file.fileName();
}

// Every time gets exactly one Failed completion with a "zaf.media" error and no picture.
void expectAllFail(const QString &path)
{
    zaf::test::LogCapture log;
    auto generator = generatorFor(path);
    const QList<MediaTime> times = {MediaTime::zero(), MediaTime::make(1, 2), MediaTime::make(5, 1)};
    zaf::test::ImageCompletions completions;
    generator->generateImagesAsynchronouslyForTimes(times, completions.handler());
    ASSERT_TRUE(completions.waitFor(times.size())) << qPrintable(path);
    const auto all = completions.all();
    ASSERT_EQ(all.size(), times.size());
    for (int i = 0; i < all.size(); ++i) {
        EXPECT_EQ(all[i].requestedTime, times[i]);
        EXPECT_EQ(all[i].result, ImageGenerator::Result::Failed) << qPrintable(path);
        EXPECT_TRUE(all[i].image.isNull());
        EXPECT_FALSE(all[i].actualTime.isValid());
        ASSERT_TRUE(all[i].error);
        EXPECT_EQ(all[i].error->domain, "zaf.media");
    }
    EXPECT_FALSE(log.messages(QStringLiteral("zaf.media")).isEmpty()) << "no logged error for " << qPrintable(path);

    MediaTime actual = MediaTime::zero();
    zaf::OptionalError error;
    EXPECT_TRUE(generator->copyImageAtTime(MediaTime::zero(), &actual, &error).isNull());
    EXPECT_TRUE(error);
    EXPECT_FALSE(actual.isValid());
}

} // namespace

TEST(ImageGeneratorFailureTest, MissingFileFailsEveryRequest)
{
    zaf::test::ScratchDir dir;
    expectAllFail(dir.file(QStringLiteral("nothing-here.mp4")));
}

TEST(ImageGeneratorFailureTest, EmptyFileFailsEveryRequest)
{
    zaf::test::ScratchDir dir;
    expectAllFail(writeBytes(dir, QStringLiteral("empty.mp4"), {}));
}

TEST(ImageGeneratorFailureTest, NonMovieFileFailsEveryRequest)
{
    zaf::test::ScratchDir dir;
    QByteArray text;
    for (int i = 0; i < 2000; ++i)
        text += "this is a text file, not a movie\n";
    expectAllFail(writeBytes(dir, QStringLiteral("notes.mp4"), text));
}

TEST(ImageGeneratorFailureTest, TruncatedMovieFailsEveryRequest)
{
    zaf::test::ScratchDir dir;
    const QString movie = zaf::test::makeFixtureMovie(dir.path(), zaf::fixture::FixtureSpec{});
    ASSERT_FALSE(movie.isEmpty());
    QFile file(movie);
    ASSERT_TRUE(file.open(QIODevice::ReadOnly));
    const QByteArray bytes = file.readAll();
    expectAllFail(writeBytes(dir, QStringLiteral("truncated.mp4"), bytes.left(bytes.size() / 2)));
}

TEST(ImageGeneratorFailureTest, AudioOnlyMovieFailsEveryRequest)
{
    zaf::test::ScratchDir dir;
    const QString path = dir.file(QStringLiteral("tone.m4a"));
    QProcess ffmpeg;
    ffmpeg.start(QStringLiteral("ffmpeg"), {"-nostdin", "-v", "error", "-f", "lavfi", "-i", "sine=frequency=440:duration=1",
                                            "-c:a", "aac", path});
    ASSERT_TRUE(ffmpeg.waitForFinished(60000));
    ASSERT_EQ(ffmpeg.exitCode(), 0) << ffmpeg.readAllStandardError().constData();
    expectAllFail(path);
}

TEST(ImageGeneratorFailureTest, InvalidRequestedTimeFailsThatRequestOnly)
{
    zaf::test::ScratchDir dir;
    const QString movie = zaf::test::makeFixtureMovie(dir.path(), zaf::fixture::FixtureSpec{});
    ASSERT_FALSE(movie.isEmpty());
    auto generator = generatorFor(movie);
    zaf::test::ImageCompletions completions;
    generator->generateImagesAsynchronouslyForTimes({MediaTime::invalid(), MediaTime::make(1, 1)}, completions.handler());
    ASSERT_TRUE(completions.waitFor(2));
    const auto all = completions.all();
    EXPECT_EQ(all[0].result, ImageGenerator::Result::Failed);
    ASSERT_TRUE(all[0].error);
    EXPECT_EQ(all[0].error->code, zaf::media::kMediaErrorInvalidArgument);
    EXPECT_EQ(all[1].result, ImageGenerator::Result::Succeeded);
    EXPECT_EQ(zaf::test::readFrameNumber(all[1].image), 30);
}
