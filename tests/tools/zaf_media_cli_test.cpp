// zaf-media, run as a user runs it: its probe agrees with ffprobe, its jobs write what they say,
// and failures exit non-zero with a message.
#include "tests/support/media/fixture_movies.h"
#include "tests/support/named_cases.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFileInfo>
#include <QImage>
#include <QJsonArray>
#include <QJsonDocument>

#include <gtest/gtest.h>

namespace zaf::test {
namespace {

ZAF_PRINT_CASES_AS_NAMES

ToolRun zafMedia(const QStringList &args)
{
    return runTool(QStringLiteral(ZAF_MEDIA_BIN), args);
}

QList<QJsonObject> tracksOfType(const QJsonObject &probe, const QString &type)
{
    QList<QJsonObject> out;
    for (const QJsonValue &t : probe["tracks"].toArray())
        if (t.toObject()["type"].toString() == type)
            out << t.toObject();
    return out;
}

// For every rotation and number of audio tracks, the probe reports what ffprobe reads.
class ZafMediaProbe : public ::testing::TestWithParam<std::tuple<int, int>> {};

TEST_P(ZafMediaProbe, AgreesWithFFprobe)
{
    const auto [rotation, audioTracks] = GetParam();
    const QString path = sharedFixtureMovie({.seconds = 1, .width = 192, .height = 108, .audioTracks = audioTracks, .rotation = rotation});
    const ToolRun r = zafMedia({QStringLiteral("probe"), path});
    ASSERT_TRUE(r.ok()) << r.err.toStdString();
    const QJsonObject ours = QJsonDocument::fromJson(r.out).object();
    const QJsonObject theirs = ffprobe(path);
    EXPECT_NEAR(ours["duration"].toDouble(), theirs["format"].toObject()["duration"].toString().toDouble(), 0.05);

    const QList<QJsonObject> videoOurs = tracksOfType(ours, QStringLiteral("video"));
    const QList<QJsonObject> videoTheirs = probeStreams(theirs, QStringLiteral("video"));
    ASSERT_EQ(videoOurs.size(), 1);
    ASSERT_EQ(videoTheirs.size(), 1);
    const QJsonArray natural = videoOurs[0]["natural_size"].toArray();
    EXPECT_EQ(natural[0].toInt(), videoTheirs[0]["width"].toInt());
    EXPECT_EQ(natural[1].toInt(), videoTheirs[0]["height"].toInt());
    EXPECT_EQ(videoOurs[0]["rotation"].toInt(), probeRotation(videoTheirs[0]));
    const QJsonArray display = videoOurs[0]["display_size"].toArray();
    EXPECT_EQ(display[0].toInt(), rotation % 180 ? 108 : 192);
    EXPECT_EQ(display[1].toInt(), rotation % 180 ? 192 : 108);
    EXPECT_EQ(videoOurs[0]["codec"].toString(), videoTheirs[0]["codec_name"].toString());

    const QList<QJsonObject> audioOurs = tracksOfType(ours, QStringLiteral("audio"));
    const QList<QJsonObject> audioTheirs = probeStreams(theirs, QStringLiteral("audio"));
    ASSERT_EQ(audioOurs.size(), audioTheirs.size());
    for (int i = 0; i < audioOurs.size(); ++i) {
        EXPECT_EQ(audioOurs[i]["id"].toInt(), audioTheirs[i]["index"].toInt() + 1);
        EXPECT_EQ(audioOurs[i]["sample_rate"].toInt(), audioTheirs[i]["sample_rate"].toString().toInt());
        EXPECT_EQ(audioOurs[i]["channels"].toInt(), audioTheirs[i]["channels"].toInt());
    }
}

INSTANTIATE_TEST_SUITE_P(Shapes, ZafMediaProbe, ::testing::Combine(::testing::Values(0, 90, 180, 270), ::testing::Values(0, 1, 3)),
                         [](const auto &info) {
                             return "Turned" + std::to_string(std::get<0>(info.param)) + "With" + std::to_string(std::get<1>(info.param)) + "AudioTracks";
                         });

class ZafMediaJobs : public ::testing::Test {
protected:
    ScratchDir scratch;
    const QString source = sharedFixtureMovie({.seconds = 4, .audioTracks = 2});
};

TEST_F(ZafMediaJobs, TrimWritesTheFramesOfItsRange)
{
    const QString trimmed = scratch.file(QStringLiteral("trim.mp4"));
    const ToolRun r = zafMedia(QStringList{QStringLiteral("trim"), source, trimmed} + words("--start 1 --end 2.5"));
    ASSERT_TRUE(r.ok()) << r.err.toStdString();
    QList<int> expected;
    for (int n = 30; n < 75; ++n)
        expected << n;
    EXPECT_EQ(readFrameNumbers(trimmed), expected);
}

TEST_F(ZafMediaJobs, MixWritesOneAudioTrackAndPrintsItsPath)
{
    const QString mixed = scratch.file(QStringLiteral("mix.mp4"));
    const ToolRun r = zafMedia({QStringLiteral("mix"), source, mixed});
    ASSERT_TRUE(r.ok()) << r.err.toStdString();
    EXPECT_EQ(r.out.trimmed(), mixed.toUtf8());
    EXPECT_EQ(probeStreams(mixed, "audio").size(), 1);
}

// thumbnails writes evenly spaced pictures of the asked height, each at or before its time.
TEST_F(ZafMediaJobs, ThumbnailsWriteEvenlySpacedPictures)
{
    const QDir thumbs(scratch.file(QStringLiteral("thumbs")));
    const ToolRun r = zafMedia(QStringList{QStringLiteral("thumbnails"), source} + words("--count 4 --height 60 --out") << thumbs.path());
    ASSERT_TRUE(r.ok()) << r.err.toStdString();
    const QStringList pngs = thumbs.entryList({QStringLiteral("*.png")}, QDir::Files, QDir::Name);
    ASSERT_EQ(pngs.size(), 4);
    for (int i = 0; i < 4; ++i) {
        const QImage image(thumbs.filePath(pngs[i]));
        EXPECT_EQ(image.height(), 60);
        const int number = readFrameNumber(image);
        EXPECT_TRUE(number >= 0 && number <= i * 30) << i << ": " << number;
    }
}

// A failed command exits non-zero with a message and leaves no output.
struct FailingCommand {
    const char *name;
    const char *arguments; // GARBAGE, MISSING and OUT stand for files in the scratch directory
};

class ZafMediaFailure : public ::testing::TestWithParam<FailingCommand> {};

TEST_P(ZafMediaFailure, ExitsNonZeroWithAMessageAndNoOutput)
{
    ScratchDir scratch;
    scratch.write(QStringLiteral("garbage.mp4"), 4096);
    QStringList args = words(GetParam().arguments);
    args.replaceInStrings(QStringLiteral("GARBAGE"), scratch.file(QStringLiteral("garbage.mp4")));
    args.replaceInStrings(QStringLiteral("MISSING"), scratch.file(QStringLiteral("missing.mp4")));
    args.replaceInStrings(QStringLiteral("OUT"), scratch.file(QStringLiteral("out")));
    const ToolRun r = zafMedia(args);
    EXPECT_NE(r.exitCode, 0);
    EXPECT_TRUE(r.err.contains("zaf-media") || r.err.contains("usage")) << r.err.toStdString();
    EXPECT_FALSE(QFileInfo(scratch.file(QStringLiteral("out"))).isFile());
    EXPECT_TRUE(entryNames(scratch.file(QStringLiteral("out"))).isEmpty()) << "no pictures written";
}

INSTANTIATE_TEST_SUITE_P(Commands, ZafMediaFailure,
                         ::testing::Values(FailingCommand{"ProbeOfNothing", "probe MISSING"}, FailingCommand{"ProbeOfGarbage", "probe GARBAGE"},
                                           FailingCommand{"TrimOfGarbage", "trim GARBAGE OUT --start 0 --end 1"},
                                           FailingCommand{"TrimEndingBeforeItsStart", "trim GARBAGE OUT --start 2 --end 1"},
                                           FailingCommand{"MixOfGarbage", "mix GARBAGE OUT"},
                                           FailingCommand{"ThumbnailsOfGarbage", "thumbnails GARBAGE --count 2 --height 50 --out OUT"},
                                           FailingCommand{"UnknownCommand", "unknown"}),
                         caseName);

} // namespace
} // namespace zaf::test
