// The thumbnail strip of MovieScrubber: what it asks its data source, in which order, for which
// widths and aspect ratios, which images it keeps, and how it draws them.
#include "platform/ui/movie_scrubber.h"

#include <QApplication>
#include <QPainter>
#include <QStringList>
#include <gtest/gtest.h>

#include <cmath>
#include <limits>

namespace zaf::ui {
namespace {

// Logs every data-source and delegate call as a line; answers timestamps evenly spread over the
// window (or a fixed list when one is given).
class Recorder : public MovieScrubberDelegate, public MovieScrubberDataSource {
public:
    double duration = 40.0;
    double aspect = 16.0 / 9.0;
    QList<double> fixedTimestamps;
    QStringList calls;
    QList<double> requested;

    double movieScrubberDuration(MovieScrubber *) override
    {
        log("duration");
        return duration;
    }
    double movieScrubberThumbnailAspectRatio(MovieScrubber *) override
    {
        log("aspect");
        return aspect;
    }
    QList<double> movieScrubberEvenlySpacedTimestampsStartingAtEndingAt(MovieScrubber *, int n, double s,
                                                                         double e) override
    {
        log(QStringLiteral("timestamps %1 %2 %3").arg(n).arg(s).arg(e));
        if (!fixedTimestamps.isEmpty())
            return fixedTimestamps;
        QList<double> out;
        for (int i = 0; i < n; ++i)
            out.append(s + i * (e - s) / n);
        return out;
    }
    void movieScrubberRequestThumbnailImageForTimestamp(MovieScrubber *, double t) override
    {
        requested.append(t);
        log(QStringLiteral("request %1").arg(t));
    }
    void movieScrubberWillBeginRequestingThumbnails(MovieScrubber *) override { log("will"); }
    void movieScrubberDidFinishRequestingThumbnails(MovieScrubber *) override { log("did"); }

private:
    void log(const QString &line) { calls.append(line); }
};

QStringList expectedReload(int count, double start, double end)
{
    QStringList lines{"duration", "aspect", QStringLiteral("timestamps %1 %2 %3").arg(count).arg(start).arg(end), "will"};
    for (int i = 0; i < count; ++i)
        lines.append(QStringLiteral("request %1").arg(start + i * (end - start) / count));
    lines.append("did");
    return lines;
}

QImage solid(QColor color, QSize size = QSize(68, 38))
{
    QImage image(size, QImage::Format_RGB32);
    image.fill(color);
    return image;
}

struct Strip {
    MovieScrubber scrubber;
    Recorder recorder;
    explicit Strip(int width = 420, bool withDelegate = true)
    {
        scrubber.resize(width, 38);
        scrubber.setDataSource(&recorder);
        if (withDelegate)
            scrubber.setDelegate(&recorder);
        scrubber.show(); // a hidden widget gets its resize events only when shown
    }
};

TEST(MovieScrubberThumbnails, ReloadDataAsksInOrderWithOneRequestPerTimestampForSeveralWidthsAndAspects)
{
    // The strip is the width less 10 points each side, 34 high (38 less 2 above and below); the
    // count is the strip width over one thumbnail's width, rounded up.
    struct Case {
        int width;
        double aspect;
        int count;
    };
    const Case cases[] = {
        {420, 16.0 / 9.0, 7},  // 400 / 60.4 = 6.6
        {420, 1.0, 12},        // 400 / 34 = 11.8
        {420, 0.5625, 21},     // 400 / 19.1 = 20.9
        {220, 16.0 / 9.0, 4},  // 200 / 60.4 = 3.3
        {420, 40.0 / 34.0, 10} // exactly ten thumbnails of 40: no eleventh sliver
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(QStringLiteral("width %1 aspect %2").arg(c.width).arg(c.aspect).toStdString());
        Strip strip(c.width);
        strip.recorder.aspect = c.aspect;
        strip.scrubber.reloadData();
        EXPECT_EQ(strip.recorder.calls, expectedReload(c.count, 0, 40));
        EXPECT_EQ(strip.scrubber.thumbnailTimestamps(), strip.recorder.requested);
        EXPECT_EQ(strip.scrubber.thumbnailImageCount(), 0);
    }
}

TEST(MovieScrubberThumbnails, ReloadDataTreatsAnUnusableAspectRatioAsSquare)
{
    for (double aspect : {std::nan(""), 0.0, -2.0, std::numeric_limits<double>::infinity()}) {
        Strip strip;
        strip.recorder.aspect = aspect;
        strip.scrubber.reloadData();
        EXPECT_EQ(strip.scrubber.thumbnailTimestamps().size(), 12) << aspect;
    }
}

TEST(MovieScrubberThumbnails, ReloadDataAsksOnlyForTheDurationWhenItIsUnknownOrNotPositive)
{
    for (double duration : {std::nan(""), 0.0, -3.0}) {
        Strip strip;
        strip.recorder.duration = duration;
        strip.scrubber.reloadData();
        EXPECT_EQ(strip.recorder.calls, QStringList{"duration"}) << duration;
        EXPECT_TRUE(strip.scrubber.thumbnailTimestamps().isEmpty());
        strip.scrubber.resize(600, 38); // a new width asks nothing either
        EXPECT_EQ(strip.recorder.calls, QStringList{"duration"});
        EXPECT_FALSE(strip.scrubber.grab().isNull());
    }
}

TEST(MovieScrubberThumbnails, ReloadDataIsSafeWithoutDataSourceOrDelegate)
{
    MovieScrubber bare;
    bare.resize(420, 38);
    bare.reloadData();
    bare.setThumbnailImageForTimestamp(solid(Qt::red), 0.0);
    EXPECT_TRUE(bare.thumbnailTimestamps().isEmpty());
    EXPECT_EQ(bare.thumbnailImageCount(), 0);
    EXPECT_FALSE(bare.grab().isNull());

    Strip strip(420, false);
    strip.scrubber.reloadData();
    EXPECT_EQ(strip.recorder.requested.size(), 7);
    EXPECT_FALSE(strip.recorder.calls.contains("will"));
}

TEST(MovieScrubberThumbnails, SetThumbnailImageKeepsOnlyNonNullImagesOfAskedTimestamps)
{
    Strip strip;
    strip.scrubber.reloadData();
    const QList<double> asked = strip.scrubber.thumbnailTimestamps();
    ASSERT_EQ(asked.size(), 7);

    strip.scrubber.setThumbnailImageForTimestamp(solid(Qt::red), asked[1] + 1e-9); // near is not equal
    strip.scrubber.setThumbnailImageForTimestamp(solid(Qt::red), 1000.0);
    strip.scrubber.setThumbnailImageForTimestamp(QImage(), asked[2]);
    EXPECT_EQ(strip.scrubber.thumbnailImageCount(), 0);

    strip.scrubber.setThumbnailImageForTimestamp(solid(Qt::red), asked[1]);
    strip.scrubber.setThumbnailImageForTimestamp(solid(Qt::blue), asked[1]); // a second answer replaces
    strip.scrubber.setThumbnailImageForTimestamp(solid(Qt::red), asked[6]);
    EXPECT_EQ(strip.scrubber.thumbnailImageCount(), 2);
}

TEST(MovieScrubberThumbnails, ReloadDataForgetsImagesAndAsksAgainFromTheStart)
{
    Strip strip;
    strip.scrubber.reloadData();
    for (double t : strip.scrubber.thumbnailTimestamps())
        strip.scrubber.setThumbnailImageForTimestamp(solid(Qt::red), t);
    EXPECT_EQ(strip.scrubber.thumbnailImageCount(), 7);

    strip.recorder.calls.clear();
    strip.recorder.duration = 30.0;
    strip.scrubber.reloadData();
    EXPECT_EQ(strip.recorder.calls, expectedReload(7, 0, 30));
    EXPECT_EQ(strip.scrubber.thumbnailImageCount(), 0);
    // An image of the first movie that arrives late is not taken for the second.
    strip.scrubber.setThumbnailImageForTimestamp(solid(Qt::red), 40.0 / 7);
    EXPECT_EQ(strip.scrubber.thumbnailImageCount(), 0);
}

TEST(MovieScrubberThumbnails, ResizeAsksAgainOnlyWhenTheNumberOfThumbnailsChanges)
{
    Strip strip;
    strip.scrubber.reloadData();
    strip.recorder.calls.clear();

    strip.scrubber.resize(430, 38); // 410 / 60.4 is still 7 slots: same timestamps, wider slots
    EXPECT_TRUE(strip.recorder.calls.isEmpty());

    strip.scrubber.resize(720, 38); // 700 / 60.4 = 11.6
    QStringList expected = expectedReload(12, 0, 40);
    expected.removeFirst(); // a new width does not ask for the duration and aspect again
    expected.removeFirst();
    EXPECT_EQ(strip.recorder.calls, expected);
    EXPECT_EQ(strip.scrubber.thumbnailTimestamps().size(), 12);
}

TEST(MovieScrubberThumbnails, ShortTimestampListLeavesTheRemainingSlotsEmpty)
{
    Strip strip;
    strip.recorder.fixedTimestamps = {0.0, 17.5};
    strip.scrubber.reloadData();
    EXPECT_EQ(strip.recorder.requested, (QList<double>{0.0, 17.5}));
    strip.scrubber.setThumbnailImageForTimestamp(solid(Qt::red), 17.5);
    EXPECT_EQ(strip.scrubber.thumbnailImageCount(), 1);
    EXPECT_FALSE(strip.scrubber.grab().isNull());
}

TEST(MovieScrubberThumbnails, PaintDrawsEachThumbnailAspectFilledInItsSlotAtAnyPixelRatio)
{
    Strip strip;
    strip.scrubber.reloadData();
    // A 4:1 image whose outer quarters are blue: filling a 16:9 slot crops them away, while
    // stretching the image would show blue at the slot's edges.
    QImage wide(152, 38, QImage::Format_RGB32);
    wide.fill(Qt::blue);
    QPainter(&wide).fillRect(38, 0, 76, 38, Qt::red);
    for (double t : strip.scrubber.thumbnailTimestamps())
        strip.scrubber.setThumbnailImageForTimestamp(wide, t);

    for (qreal ratio : {1.0, 2.0}) {
        SCOPED_TRACE(ratio);
        QImage canvas(QSize(420, 38) * ratio, QImage::Format_ARGB32_Premultiplied);
        canvas.setDevicePixelRatio(ratio);
        canvas.fill(Qt::transparent);
        strip.scrubber.render(&canvas);
        // The second slot spans x 70.4 .. 130.9 in points.
        for (double x : {73.0, 100.0, 128.0}) {
            const QColor c = canvas.pixelColor(QPoint(int(x * ratio), int(19 * ratio)));
            EXPECT_GT(c.red(), 200) << x;
            EXPECT_LT(c.blue(), 60) << x;
        }
    }
}

TEST(MovieScrubberThumbnails, ScrubberIsNamedAndTakesKeyboardFocus)
{
    MovieScrubber scrubber;
    EXPECT_EQ(scrubber.accessibleName(), QStringLiteral("Timeline"));
    EXPECT_EQ(scrubber.focusPolicy(), Qt::StrongFocus);
}

} // namespace
} // namespace zaf::ui
