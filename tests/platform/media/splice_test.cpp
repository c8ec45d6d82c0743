// What a smart cut rests on: H.264 parameter sets, sample descriptions, and the splice check.
#include "platform/media/core/cancel_token.h"
#include "platform/media/export/export_pipeline.h"
#include "platform/media/export/h264_bitstream.h"
#include "platform/media/export/splice_check.h"
#include "tests/platform/media/export_test_support.h"

#include <QFile>

#include <gtest/gtest.h>

namespace zaf::media {
namespace {

using zaf::test::ffmpeg;
using zaf::test::ScratchDir;
using zaf::test::words;

ZAF_PRINT_CASES_AS_NAMES

const uint8_t *bytes(const QByteArray &data)
{
    return reinterpret_cast<const uint8_t *>(data.constData());
}

// The SPS and PPS an encoder writes under `id`, read back from its Annex B stream.
QList<QByteArray> parameterSetsUnderId(int id)
{
    const QString path = zaf::test::sharedGeneratedFile(QStringLiteral("sets-%1.h264").arg(id), [&](const QString &out) {
        return ffmpeg(words("-f lavfi -i testsrc2=s=64x48:d=0.1 -frames:v 1 -c:v libx264 -f h264")
                      << QStringLiteral("-x264-params") << QStringLiteral("sps-id=%1").arg(id) << out);
    });
    const QByteArray stream = zaf::test::fileContents(path);
    QList<QByteArray> sets;
    for (const QByteArray &unit : h264::annexBNalUnits(bytes(stream), int(stream.size()))) {
        const int type = unit[0] & 0x1f;
        if (type == h264::kNalSps || type == h264::kNalPps)
            sets.append(unit);
    }
    return sets;
}

// A sample description holding the parameter sets written under the ids 0 and 31 (the ends of the
// SPS range) and 3; ids over 15 take a longer code.
class H264ParameterSets : public ::testing::Test {
protected:
    void SetUp() override
    {
        config.profile = 100;
        config.level = 30;
        config.trailer = QByteArray::fromHex("fdf8f800");
        for (int id : kIds) {
            const QList<QByteArray> sets = parameterSetsUnderId(id);
            ASSERT_EQ(sets.size(), 2) << id;
            config.sps.append(sets[0]);
            config.pps.append(sets[1]);
        }
        written = config.serialize();
    }
    static constexpr int kIds[] = {0, 3, 31};
    h264::DecoderConfiguration config;
    QByteArray written;
};

TEST_F(H264ParameterSets, EachDeclaresTheIdItWasWrittenUnder)
{
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(h264::parameterSetId(config.sps[i]), kIds[i]);
        EXPECT_EQ(h264::parameterSetId(config.pps[i]), kIds[i]);
    }
}

TEST_F(H264ParameterSets, SurviveASampleDescription)
{
    const auto read = h264::DecoderConfiguration::parse(bytes(written), int(written.size()));
    ASSERT_TRUE(read);
    EXPECT_EQ(read->sps, config.sps);
    EXPECT_EQ(read->pps, config.pps);
    EXPECT_EQ(read->trailer, config.trailer);
    EXPECT_EQ(read->usedIds(), (QList<int>{0, 3, 31, 0, 3, 31}));
}

// Every truncation is refused rather than read past its end.
TEST_F(H264ParameterSets, TruncatedSampleDescriptionIsRefused)
{
    for (qsizetype size = 0; size < written.size() - config.trailer.size(); ++size)
        EXPECT_FALSE(h264::DecoderConfiguration::parse(bytes(written), int(size))) << size;
}

// An encoder's Annex B sample becomes length-prefixed units, for each length size that holds them.
class H264LengthPrefixed : public H264ParameterSets, public ::testing::WithParamInterface<int> {
protected:
    std::optional<QByteArray> sample()
    {
        QByteArray annexB;
        for (const QByteArray &set : config.sps + config.pps)
            annexB += QByteArray::fromHex("00000001") + set;
        return h264::annexBToLengthPrefixed(bytes(annexB), int(annexB.size()), GetParam());
    }
};

TEST_P(H264LengthPrefixed, SampleHoldsTheAnnexBUnits)
{
    const auto converted = sample();
    ASSERT_TRUE(converted);
    QList<QByteArray> units;
    EXPECT_TRUE(h264::forEachLengthPrefixedNal(bytes(*converted), int(converted->size()), GetParam(), [&](const uint8_t *nal, int size) {
        units.append(QByteArray(reinterpret_cast<const char *>(nal), size));
    }));
    EXPECT_EQ(units, config.sps + config.pps);
}

TEST_P(H264LengthPrefixed, SampleCutShortIsRefused)
{
    const auto converted = sample();
    ASSERT_TRUE(converted);
    EXPECT_FALSE(h264::forEachLengthPrefixedNal(bytes(*converted), int(converted->size()) - 1, GetParam(), [](const uint8_t *, int) {}));
}

INSTANTIATE_TEST_SUITE_P(LengthSizes, H264LengthPrefixed, ::testing::Values(1, 2, 4),
                         [](const auto &info) { return "Bytes" + std::to_string(info.param); });

// A movie cut from the middle of a B-frame source with 1 s groups: a re-encoded head, two copied
// groups, a re-encoded tail.
struct SplicedMovie {
    QString path;
    QList<std::int64_t> splices;             // microseconds
    QList<qint64> packetPositions, packetSizes; // video packets in file order
    QList<double> packetTimes;
};

SplicedMovie splicedMovie(const ScratchDir &dir)
{
    SplicedMovie movie;
    const QString source = sharedReencodedFixture({.seconds = 4}, "-map 0 -c:v libx264 -preset veryfast -bf 3 -g 30 -sc_threshold 0 -c:a copy");
    movie.path = dir.file(QStringLiteral("cut.mp4"));
    exportpipe::ExportJob job{source, movie.path, exportpipe::ExportJob::Cut{500000, 3500000}, std::nullopt, 4.0};
    CancelToken cancel;
    EXPECT_FALSE(exportpipe::runExport(job, cancel, {}));
    movie.splices = {500000, 2500000}; // the 1 s and 3 s keyframes, less the cut's start
    const QByteArray probe = zaf::test::runTool(QStringLiteral("ffprobe"), words("-v error -select_streams v:0 -show_entries packet=pos,size,pts_time -of csv=p=0") << movie.path).out;
    for (const QByteArray &line : probe.split('\n')) {
        const QList<QByteArray> fields = line.trimmed().split(',');
        if (fields.size() == 3) {
            movie.packetTimes.append(fields[0].toDouble());
            movie.packetSizes.append(fields[1].toLongLong());
            movie.packetPositions.append(fields[2].toLongLong());
        }
    }
    return movie;
}

struct DamageCase {
    const char *name;
    double near;        // the packet shown closest to this output time is damaged; < 0: none
    bool passes;
};

class SpliceCheckTest : public ::testing::TestWithParam<DamageCase> {};

TEST_P(SpliceCheckTest, FailsWhenAPictureBesideASpliceDoesNotDecode)
{
    ScratchDir dir;
    const SplicedMovie movie = splicedMovie(dir);
    ASSERT_FALSE(movie.packetTimes.isEmpty());
    if (GetParam().near >= 0) {
        int closest = 0;
        for (int i = 1; i < movie.packetTimes.size(); ++i) {
            if (std::abs(movie.packetTimes[i] - GetParam().near) < std::abs(movie.packetTimes[closest] - GetParam().near))
                closest = i;
        }
        QFile file(movie.path);
        ASSERT_TRUE(file.open(QIODevice::ReadWrite));
        const qint64 size = movie.packetSizes[closest];
        ASSERT_GT(size, 16);
        ASSERT_TRUE(file.seek(movie.packetPositions[closest] + 8));
        file.write(QByteArray(int(size - 8), '\x5a')); // keeps the length prefix and slice header start
    }
    CancelToken cancel;
    const std::optional<QString> why = exportpipe::checkSplices(movie.path, movie.splices, cancel);
    EXPECT_EQ(!why.has_value(), GetParam().passes) << (why ? qPrintable(*why) : "passes");
}

INSTANTIATE_TEST_SUITE_P(Damage, SpliceCheckTest, ::testing::Values(
    DamageCase{"Intact", -1, true},
    DamageCase{"LastReencodedPictureBeforeTheCopy", 0.5 - 1.0 / 30, false},
    DamageCase{"FirstCopiedPicture", 0.5, false},
    DamageCase{"FirstPictureOfTheReencodedTail", 2.5, false},
    DamageCase{"LastCopiedPicture", 2.5 - 1.0 / 30, false},
    DamageCase{"FarFromEverySplice", 1.2, true}),
    zaf::test::caseName);

} // namespace
} // namespace zaf::media
