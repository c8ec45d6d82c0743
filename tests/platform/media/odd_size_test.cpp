// Tiny and odd picture sizes through every place that converts or scales pictures: each keeps the
// movie's size and colour and never writes past a picture.
#include "platform/media/image_generator.h"
#include "platform/media/player.h"
#include "platform/media/player_layer.h"
#include "tests/platform/media/export_test_support.h"
#include "tests/support/wait_until.h"

#include <QUrl>

#include <gtest/gtest.h>

#include <cmath>

namespace zaf::media {
namespace {

using namespace zaf::test;

// Flat-colour pictures come back within this distance per channel (YUV rounding).
constexpr int kColourTolerance = 12;

struct OddShape {
    QSize size;                 // coded
    int rotation = 0;           // non-zero: written by our fixture writer, which stores rotations
    const char *codec = "libx264";
};

void PrintTo(const OddShape &shape, std::ostream *os)
{
    *os << shape.size.width() << "x" << shape.size.height() << " " << shape.codec << " r" << shape.rotation;
}

class OddSizeMovieTest : public ::testing::TestWithParam<OddShape> {
protected:
    bool flat() const { return GetParam().rotation == 0; }
    QString movie() const
    {
        const OddShape &shape = GetParam();
        if (flat())
            return sharedFlatColourMovie(shape.size, QString::fromLatin1(shape.codec));
        return sharedFixtureMovie({.seconds = 1, .width = shape.size.width(), .height = shape.size.height(), .rotation = shape.rotation});
    }
    std::shared_ptr<MediaAsset> asset(const QString &path) const { return MediaAsset::assetWithURL(QUrl::fromLocalFile(path)); }

    // Runs an export of the movie to its end; the output's path, "" when it did not complete.
    QString exported(const QString &name, const std::function<void(ExportSession &)> &configure)
    {
        auto session = makeSession(movie(), m_scratch.file(name));
        configure(*session);
        EXPECT_EQ(runToEnd(session), ExportStatus::Completed) << (session->error() ? qPrintable(session->error()->description()) : "");
        return session->status() == ExportStatus::Completed ? m_scratch.file(name) : QString();
    }
    // The export keeps the coded size, the rotation, the one audio track and the colour.
    void expectTheMoviesShape(const QString &output)
    {
        const QList<QJsonObject> video = probeStreams(output, QStringLiteral("video"));
        ASSERT_EQ(video.size(), 1);
        EXPECT_EQ(QSize(video[0]["width"].toInt(), video[0]["height"].toInt()), GetParam().size);
        EXPECT_EQ(probeRotation(video[0]), GetParam().rotation);
        EXPECT_EQ(probeStreams(output, QStringLiteral("audio")).size(), 1);
        if (flat()) {
            auto generator = ImageGenerator::imageGeneratorWithAsset(asset(output));
            EXPECT_LE(largestColourDistance(generator->copyImageAtTime(MediaTime::zero(), nullptr, nullptr), kFlatColour), kColourTolerance);
        }
    }

    ScratchDir m_scratch;
};

// Thumbnails keep the upright aspect at every maximum height down to one pixel, never scale up,
// and show the movie's colour; without the transform they come at the coded size.
TEST_P(OddSizeMovieTest, ThumbnailsAtAnyHeightShowTheMovieUpright)
{
    const OddShape &shape = GetParam();
    auto generator = ImageGenerator::imageGeneratorWithAsset(asset(movie()));
    const QSize upright = shape.rotation % 180 ? shape.size.transposed() : shape.size;
    for (int height : {0, 38, 76, 2, 1}) {
        SCOPED_TRACE(height);
        generator->setMaximumSize(QSize(0, height));
        const double scale = height > 0 ? std::min(1.0, double(height) / upright.height()) : 1.0;
        const QSize expected(std::max(1, int(std::lround(upright.width() * scale))), std::max(1, int(std::lround(upright.height() * scale))));
        zaf::OptionalError error;
        const QImage image = generator->copyImageAtTime(MediaTime::make(1, 2), nullptr, &error);
        ASSERT_FALSE(error) << qPrintable(error->description());
        EXPECT_EQ(image.size(), expected);
        if (flat()) {
            EXPECT_LE(largestColourDistance(image, kFlatColour), kColourTolerance);
        }
    }
    generator->setMaximumSize(QSize());
    generator->setAppliesPreferredTrackTransform(false);
    EXPECT_EQ(generator->copyImageAtTime(MediaTime::zero(), nullptr, nullptr).size(), shape.size);
}

// The player shows the first picture at its coded size and colour, and its layer paints it.
TEST_P(OddSizeMovieTest, PlayerAndItsLayerShowTheFirstPicture)
{
    auto item = std::make_shared<PlayerItem>(asset(movie()));
    Player player(item);
    player.setTimeSource(std::make_shared<ManualTimeSource>());
    PlayerLayer layer;
    layer.resize(120, 90);
    layer.setPlayer(&player);
    ASSERT_TRUE(waitUntil([&] { return !player.currentVideoFrame().isNull(); }));
    const QImage picture = player.currentVideoFrame();
    EXPECT_EQ(picture.size(), GetParam().size);
    if (flat()) {
        EXPECT_LE(largestColourDistance(picture, kFlatColour), kColourTolerance);
    }
    EXPECT_FALSE(layer.videoRect().isEmpty());
    const QImage shot = layer.grab().toImage().convertToFormat(QImage::Format_RGB32);
    if (flat()) {
        const QPointF centre = layer.videoRect().center() * shot.devicePixelRatio();
        EXPECT_LE(largestColourDistance(shot.copy(QRect(centre.toPoint(), QSize(1, 1))), kFlatColour), kColourTolerance);
    }
}

// A trim re-encodes the cut frames, converted where the encoder needs another format.
TEST_P(OddSizeMovieTest, TrimKeepsTheMoviesShape)
{
    const QString trimmed = exported(QStringLiteral("trim.mp4"), [](ExportSession &session) {
        session.setTimeRange(MediaTimeRange{MediaTime::make(1, 5), MediaTime::make(3, 5)});
    });
    expectTheMoviesShape(trimmed);
    EXPECT_NEAR(countVideoFrames(trimmed), 18, 1);
}

TEST_P(OddSizeMovieTest, MixKeepsTheMoviesShape)
{
    expectTheMoviesShape(exported(QStringLiteral("mix.mp4"), [&](ExportSession &session) { session.setAudioMix(mixOfAllAudioTracks(movie())); }));
}

INSTANTIATE_TEST_SUITE_P(TinyAndOddSizes, OddSizeMovieTest,
                         ::testing::Values(OddShape{{2, 2}}, OddShape{{3, 3}}, OddShape{{4, 4}}, OddShape{{6, 4}}, OddShape{{14, 14}},
                                           OddShape{{15, 15}}, OddShape{{16, 16}}, OddShape{{641, 361}},
                                           OddShape{{4, 4}, 0, "libx264rgb"}, OddShape{{15, 15}, 0, "libx264rgb"},
                                           OddShape{{4, 4}, 90}, OddShape{{6, 2}, 270}, OddShape{{2, 2}, 90}),
                         [](const auto &info) {
                             const OddShape &shape = info.param;
                             return std::to_string(shape.size.width()) + "x" + std::to_string(shape.size.height()) +
                                    (shape.rotation ? "Turned" + std::to_string(shape.rotation) : "") + (QLatin1String(shape.codec) == "libx264" ? "" : "Rgb");
                         });

} // namespace
} // namespace zaf::media
