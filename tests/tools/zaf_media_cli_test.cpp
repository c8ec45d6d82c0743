// zaf-media, run as a user runs it: its probe agrees with ffprobe, its jobs write what they say,
// and failures exit non-zero with a message.
#include "tests/support/cli_tools.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QImage>

namespace zaf::test {
namespace {

cli::Run zafMedia(const QStringList &args)
{
    return cli::run(QStringLiteral(ZAF_MEDIA_BIN), args);
}

QJsonObject probeWithZafMedia(const QString &path)
{
    const cli::Run r = zafMedia({QStringLiteral("probe"), path});
    EXPECT_TRUE(r.ok()) << r.err.toStdString();
    return QJsonDocument::fromJson(r.out).object();
}

QList<QJsonObject> tracksOfType(const QJsonObject &probe, const QString &type)
{
    QList<QJsonObject> out;
    for (const QJsonValue &t : probe.value(QStringLiteral("tracks")).toArray())
        if (t.toObject().value(QStringLiteral("type")).toString() == type)
            out << t.toObject();
    return out;
}

TEST(ZafMediaProbe, AgreesWithFFprobeOnEveryFixtureShape)
{
    ScratchDir scratch;
    for (int rotation : {0, 90, 180, 270}) {
        for (int audioTracks : {0, 1, 3}) {
            fixture::FixtureSpec spec;
            spec.seconds = 1;
            spec.width = 192;
            spec.height = 108;
            spec.rotation = rotation;
            spec.audioTracks = audioTracks;
            const QString path = makeFixtureMovie(scratch.path(), spec);
            SCOPED_TRACE(QStringLiteral("rotation %1, %2 audio").arg(rotation).arg(audioTracks).toStdString());

            const QJsonObject ours = probeWithZafMedia(path);
            const QJsonObject theirs = ffprobe(path);
            EXPECT_NEAR(ours.value(QStringLiteral("duration")).toDouble(),
                        theirs.value(QStringLiteral("format")).toObject().value(QStringLiteral("duration")).toString().toDouble(), 0.05);

            const QList<QJsonObject> videoOurs = tracksOfType(ours, QStringLiteral("video"));
            const QList<QJsonObject> videoTheirs = probeStreams(theirs, QStringLiteral("video"));
            ASSERT_EQ(videoOurs.size(), 1);
            ASSERT_EQ(videoTheirs.size(), 1);
            const QJsonArray natural = videoOurs[0].value(QStringLiteral("natural_size")).toArray();
            EXPECT_EQ(natural[0].toInt(), videoTheirs[0].value(QStringLiteral("width")).toInt());
            EXPECT_EQ(natural[1].toInt(), videoTheirs[0].value(QStringLiteral("height")).toInt());
            EXPECT_EQ(videoOurs[0].value(QStringLiteral("rotation")).toInt(), probeRotation(videoTheirs[0]));
            const QJsonArray display = videoOurs[0].value(QStringLiteral("display_size")).toArray();
            const bool quarterTurn = rotation % 180 != 0;
            EXPECT_EQ(display[0].toInt(), quarterTurn ? 108 : 192);
            EXPECT_EQ(display[1].toInt(), quarterTurn ? 192 : 108);
            EXPECT_EQ(videoOurs[0].value(QStringLiteral("codec")).toString(),
                      videoTheirs[0].value(QStringLiteral("codec_name")).toString());

            const QList<QJsonObject> audioOurs = tracksOfType(ours, QStringLiteral("audio"));
            const QList<QJsonObject> audioTheirs = probeStreams(theirs, QStringLiteral("audio"));
            ASSERT_EQ(audioOurs.size(), audioTheirs.size());
            for (int i = 0; i < audioOurs.size(); ++i) {
                EXPECT_EQ(audioOurs[i].value(QStringLiteral("id")).toInt(), audioTheirs[i].value(QStringLiteral("index")).toInt() + 1);
                EXPECT_EQ(audioOurs[i].value(QStringLiteral("sample_rate")).toInt(),
                          audioTheirs[i].value(QStringLiteral("sample_rate")).toString().toInt());
                EXPECT_EQ(audioOurs[i].value(QStringLiteral("channels")).toInt(), audioTheirs[i].value(QStringLiteral("channels")).toInt());
            }
        }
    }
}

TEST(ZafMediaJobs, TrimMixAndThumbnailsWriteWhatTheySay)
{
    ScratchDir scratch;
    fixture::FixtureSpec spec;
    spec.seconds = 4;
    spec.audioTracks = 2;
    const QString source = makeFixtureMovie(scratch.path(), spec);

    const QString trimmed = scratch.file(QStringLiteral("trim.mp4"));
    cli::Run r = zafMedia({QStringLiteral("trim"), source, trimmed, QStringLiteral("--start"), QStringLiteral("1"),
                           QStringLiteral("--end"), QStringLiteral("2.5")});
    ASSERT_TRUE(r.ok()) << r.err.toStdString();
    const QList<int> frames = readFrameNumbers(trimmed);
    ASSERT_EQ(frames.size(), 45);
    EXPECT_EQ(frames.first(), 30);
    EXPECT_EQ(frames.last(), 74);

    const QString mixed = scratch.file(QStringLiteral("mix.mp4"));
    r = zafMedia({QStringLiteral("mix"), source, mixed});
    ASSERT_TRUE(r.ok()) << r.err.toStdString();
    EXPECT_EQ(r.out.trimmed(), mixed.toUtf8());
    EXPECT_EQ(probeStreams(ffprobe(mixed), QStringLiteral("audio")).size(), 1);

    const QString thumbs = scratch.file(QStringLiteral("thumbs"));
    r = zafMedia({QStringLiteral("thumbnails"), source, QStringLiteral("--count"), QStringLiteral("4"),
                  QStringLiteral("--height"), QStringLiteral("60"), QStringLiteral("--out"), thumbs});
    ASSERT_TRUE(r.ok()) << r.err.toStdString();
    const QStringList pngs = QDir(thumbs).entryList({QStringLiteral("*.png")}, QDir::Files, QDir::Name);
    ASSERT_EQ(pngs.size(), 4);
    QList<int> numbers;
    for (const QString &png : pngs) {
        const QImage image(QDir(thumbs).filePath(png));
        EXPECT_EQ(image.height(), 60);
        numbers << readFrameNumber(image);
    }
    // Evenly spaced over 4 s at 30 fps, each at or before its time (fast thumbnails).
    for (int i = 0; i < 4; ++i) {
        EXPECT_LE(numbers[i], i * 30);
        EXPECT_GE(numbers[i], 0);
    }
}

TEST(ZafMediaJobs, FailuresExitNonZeroWithAMessageAndLeaveNoOutput)
{
    ScratchDir scratch;
    const QString garbage = scratch.write(QStringLiteral("garbage.mp4"), 4096);
    const QString out = scratch.file(QStringLiteral("out.mp4"));
    const QList<QStringList> failing = {
        {QStringLiteral("probe"), scratch.file(QStringLiteral("missing.mp4"))},
        {QStringLiteral("probe"), garbage},
        {QStringLiteral("trim"), garbage, out, QStringLiteral("--start"), QStringLiteral("0"), QStringLiteral("--end"), QStringLiteral("1")},
        {QStringLiteral("trim"), garbage, out, QStringLiteral("--start"), QStringLiteral("2"), QStringLiteral("--end"), QStringLiteral("1")},
        {QStringLiteral("mix"), garbage, out},
        {QStringLiteral("thumbnails"), garbage, QStringLiteral("--count"), QStringLiteral("2"), QStringLiteral("--height"),
         QStringLiteral("50"), QStringLiteral("--out"), scratch.file(QStringLiteral("t"))},
        {QStringLiteral("unknown")},
    };
    for (const QStringList &args : failing) {
        const cli::Run r = zafMedia(args);
        EXPECT_NE(r.exitCode, 0) << args.join(u' ').toStdString();
        EXPECT_TRUE(r.err.contains("zaf-media") || r.err.contains("usage")) << r.err.toStdString();
    }
    EXPECT_FALSE(QFile::exists(out));
}

} // namespace
} // namespace zaf::test
