// MovieScrubber: what the thumbnail strip asks its data source and which images it keeps and draws,
// the pointer on the playhead and the trim handles, zooming in while a handle is held, and the keys.
#include "platform/ui/movie_scrubber.h"
#include "tests/support/wait_until.h"

#include <QApplication>
#include <QKeyEvent>
#include <QMouseEvent>
#include <QPainter>
#include <QStringList>
#include <QtCore/qtestsupport_core.h>
#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <limits>

namespace zaf::ui {
namespace {

// Logs what the scrubber asks for (`asks`: the data source and the request brackets) apart from what
// it reports (`calls`: playhead and editing changes). Timestamps are spread evenly over the window
// unless a fixed list is given.
class Recorder : public MovieScrubberDelegate, public MovieScrubberDataSource {
public:
    double duration = 40.0;
    double aspect = 16.0 / 9.0;
    QList<double> fixedTimestamps, requested;
    QStringList asks, calls;
    std::function<void(MovieScrubber *)> onCancel;

    double movieScrubberDuration(MovieScrubber *) override { asks << "duration"; return duration; }
    double movieScrubberThumbnailAspectRatio(MovieScrubber *) override { asks << "aspect"; return aspect; }
    QList<double> movieScrubberEvenlySpacedTimestampsStartingAtEndingAt(MovieScrubber *, int n, double s,
                                                                         double e) override
    {
        asks << QStringLiteral("timestamps %1 %2 %3").arg(n).arg(s).arg(e);
        return fixedTimestamps.isEmpty() ? spread(n, s, e) : fixedTimestamps;
    }
    void movieScrubberRequestThumbnailImageForTimestamp(MovieScrubber *, double t) override
    {
        requested << t;
        asks << QStringLiteral("request %1").arg(t);
    }
    void movieScrubberWillBeginRequestingThumbnails(MovieScrubber *) override { asks << "will"; }
    void movieScrubberDidFinishRequestingThumbnails(MovieScrubber *) override { asks << "did"; }

    void movieScrubberValueDidChange(MovieScrubber *, double v) override { log("value", v); }
    void movieScrubberDidBeginScrubbingWithHandle(MovieScrubber *, MovieScrubberHandle h) override { log("beginScrub", int(h)); }
    void movieScrubberDidEndScrubbingWithHandle(MovieScrubber *, MovieScrubberHandle h) override { log("endScrub", int(h)); }
    void movieScrubberEditingStartValueDidChange(MovieScrubber *, double v) override { log("start", v); }
    void movieScrubberEditingEndValueDidChange(MovieScrubber *, double v) override { log("end", v); }
    void movieScrubberDidBeginEditing(MovieScrubber *) override { calls << "beginEditing"; }
    void movieScrubberDidCancelEditing(MovieScrubber *s) override
    {
        calls << "cancel";
        if (onCancel)
            onCancel(s);
    }

    static QList<double> spread(int n, double s, double e)
    {
        QList<double> out;
        for (int i = 0; i < n; ++i)
            out.append(s + i * (e - s) / n);
        return out;
    }

private:
    void log(const char *what, double v) { calls << QStringLiteral("%1 %2").arg(what).arg(v); }
};

// What reloadData asks for `count` thumbnails over start .. end.
QStringList expectedReload(int count, double start, double end)
{
    QStringList lines{"duration", "aspect", QStringLiteral("timestamps %1 %2 %3").arg(count).arg(start).arg(end), "will"};
    for (double t : Recorder::spread(count, start, end))
        lines.append(QStringLiteral("request %1").arg(t));
    return lines << "did";
}

QImage solid(QColor color)
{
    QImage image(68, 38, QImage::Format_RGB32);
    image.fill(color);
    return image;
}

// A shown, loaded scrubber on a 40 s movie: on the 400-point strip (x 10 .. 410 of the 420-wide
// scrubber) one point is a tenth of a second. No zoom unless a test sets a delay. Mouse and key
// events go through the application as the window system delivers them, at the strip's middle.
struct ScrubberTest : ::testing::Test {
    MovieScrubber scrubber;
    Recorder recorder;

    void SetUp() override
    {
        scrubber.resize(420, 38);
        scrubber.setDataSource(&recorder);
        scrubber.setDelegate(&recorder);
        scrubber.setZoomDelay(0);
        scrubber.show();   // a hidden widget gets its resize events only when shown
        scrubber.reloadData();
        recorder.asks.clear();
        recorder.requested.clear();
    }
    void mouse(QEvent::Type type, double x, Qt::MouseButtons buttons)
    {
        const QPointF pos(x, 19);
        const Qt::MouseButton button = type == QEvent::MouseMove ? Qt::NoButton : Qt::LeftButton;
        QMouseEvent event(type, pos, scrubber.mapToGlobal(pos), button, buttons, Qt::NoModifier);
        QApplication::sendEvent(&scrubber, &event);
    }
    void press(double x) { mouse(QEvent::MouseButtonPress, x, Qt::LeftButton); }
    void move(double x) { mouse(QEvent::MouseMove, x, Qt::LeftButton); }
    void hover(double x) { mouse(QEvent::MouseMove, x, Qt::NoButton); }
    void release(double x) { mouse(QEvent::MouseButtonRelease, x, Qt::NoButton); }
    void drag(double from, double to) { press(from), move(to), release(to); }
    void key(int key, Qt::KeyboardModifiers modifiers = Qt::NoModifier)
    {
        QKeyEvent down(QEvent::KeyPress, key, modifiers);
        QApplication::sendEvent(&scrubber, &down);
        QKeyEvent up(QEvent::KeyRelease, key, modifiers);
        QApplication::sendEvent(&scrubber, &up);
    }
    // The trim range as "start end", in seconds.
    QString range() const { return QStringLiteral("%1 %2").arg(scrubber.editingStartValue()).arg(scrubber.editingEndValue()); }
    QStringList windowsAsked() const { return recorder.asks.filter(QStringLiteral("timestamps")); }
    bool showsWindow(double start, double end) const
    {
        return qFuzzyCompare(scrubber.visibleStartValue() + 1, start + 1) && qFuzzyCompare(scrubber.visibleEndValue(), end);
    }
};

// --- The thumbnail strip ---

TEST_F(ScrubberTest, ReloadAsksInOrderWithOneRequestPerSlotForTheWidthAndAspect)
{
    // The strip is the width less 10 points each side and 34 high; the count is the strip width
    // over one thumbnail's width, rounded up. An unusable aspect ratio counts as square.
    const double nan = std::nan(""), inf = std::numeric_limits<double>::infinity();
    const struct {
        int width;
        double aspect;
        int count;
    } cases[] = {
        {420, 16.0 / 9.0, 7}, {420, 1.0, 12}, {420, 0.5625, 21}, {220, 16.0 / 9.0, 4},
        {420, 40.0 / 34.0, 10},   // exactly ten thumbnails of 40: no eleventh sliver
        {420, nan, 12}, {420, 0.0, 12}, {420, -2.0, 12}, {420, inf, 12},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(QStringLiteral("width %1 aspect %2").arg(c.width).arg(c.aspect).toStdString());
        scrubber.resize(c.width, 38);
        recorder.aspect = c.aspect;
        recorder.asks.clear();
        recorder.requested.clear();
        scrubber.reloadData();
        EXPECT_EQ(recorder.asks, expectedReload(c.count, 0, 40));
        EXPECT_EQ(scrubber.thumbnailTimestamps(), recorder.requested);
        EXPECT_EQ(scrubber.thumbnailImageCount(), 0);
    }
}

TEST_F(ScrubberTest, UnknownOrNonPositiveDurationAsksNothingMoreAndIgnoresInput)
{
    for (double duration : {std::nan(""), 0.0, -3.0}) {
        SCOPED_TRACE(duration);
        recorder.duration = duration;
        recorder.asks.clear();
        scrubber.resize(420, 38);
        scrubber.reloadData();
        EXPECT_EQ(recorder.asks, QStringList{"duration"});
        EXPECT_TRUE(scrubber.thumbnailTimestamps().isEmpty());
        scrubber.resize(600, 38);   // a new width asks nothing either
        EXPECT_EQ(recorder.asks, QStringList{"duration"});
        EXPECT_FALSE(scrubber.grab().isNull());
        key(Qt::Key_Right);
        key(Qt::Key_End);
        drag(200, 200);
        EXPECT_TRUE(recorder.calls.isEmpty());
        EXPECT_DOUBLE_EQ(scrubber.value(), 0.0);
    }
}

TEST_F(ScrubberTest, ReloadPointerAndKeysAreSafeWithoutDataSourceOrDelegate)
{
    scrubber.setDelegate(nullptr);
    scrubber.reloadData();
    EXPECT_EQ(recorder.requested.size(), 7);
    EXPECT_FALSE(recorder.asks.contains("will"));
    drag(5, 105);
    drag(300, 210);
    key(Qt::Key_Escape);
    key(Qt::Key_End);
    EXPECT_TRUE(scrubber.isEditing());
    EXPECT_DOUBLE_EQ(scrubber.editingStartValue(), 10.0);
    EXPECT_DOUBLE_EQ(scrubber.value(), 40.0);

    MovieScrubber bare;
    bare.resize(420, 38);
    bare.reloadData();
    bare.setThumbnailImageForTimestamp(solid(Qt::red), 0.0);
    EXPECT_TRUE(bare.thumbnailTimestamps().isEmpty());
    EXPECT_EQ(bare.thumbnailImageCount(), 0);
    EXPECT_FALSE(bare.grab().isNull());
}

TEST_F(ScrubberTest, KeepsOnlyNonNullImagesOfTimestampsAskedSinceTheLastReload)
{
    const QList<double> asked = scrubber.thumbnailTimestamps();
    ASSERT_EQ(asked.size(), 7);
    scrubber.setThumbnailImageForTimestamp(solid(Qt::red), asked[1] + 1e-9);   // near is not equal
    scrubber.setThumbnailImageForTimestamp(solid(Qt::red), 1000.0);
    scrubber.setThumbnailImageForTimestamp(QImage(), asked[2]);
    EXPECT_EQ(scrubber.thumbnailImageCount(), 0);
    scrubber.setThumbnailImageForTimestamp(solid(Qt::red), asked[1]);
    scrubber.setThumbnailImageForTimestamp(solid(Qt::blue), asked[1]);   // a second answer replaces
    scrubber.setThumbnailImageForTimestamp(solid(Qt::red), asked[6]);
    EXPECT_EQ(scrubber.thumbnailImageCount(), 2);

    // Another movie: the images are forgotten, and a late image of the first is not taken for it.
    recorder.duration = 30.0;
    scrubber.reloadData();
    EXPECT_EQ(recorder.asks, expectedReload(7, 0, 30));
    EXPECT_EQ(scrubber.thumbnailImageCount(), 0);
    scrubber.setThumbnailImageForTimestamp(solid(Qt::red), asked[1]);
    EXPECT_EQ(scrubber.thumbnailImageCount(), 0);

    // A short timestamp list leaves the remaining slots empty.
    recorder.fixedTimestamps = {0.0, 17.5};
    recorder.requested.clear();
    scrubber.reloadData();
    EXPECT_EQ(recorder.requested, (QList<double>{0.0, 17.5}));
    scrubber.setThumbnailImageForTimestamp(solid(Qt::red), 17.5);
    EXPECT_EQ(scrubber.thumbnailImageCount(), 1);
    EXPECT_FALSE(scrubber.grab().isNull());
}

TEST_F(ScrubberTest, ResizeAsksAgainOnlyWhenTheNumberOfThumbnailsChanges)
{
    scrubber.resize(430, 38);   // 410 / 60.4 is still 7 slots: same timestamps, wider slots
    EXPECT_TRUE(recorder.asks.isEmpty());
    scrubber.resize(720, 38);   // 700 / 60.4 = 11.6; duration and aspect are not asked again
    EXPECT_EQ(recorder.asks, expectedReload(12, 0, 40).mid(2));
    EXPECT_EQ(scrubber.thumbnailTimestamps().size(), 12);
}

TEST_F(ScrubberTest, PaintDrawsEachThumbnailAspectFilledInItsSlotAtAnyPixelRatio)
{
    // A 4:1 image whose outer quarters are blue: filling a 16:9 slot crops them away, while
    // stretching the image would show blue at the slot's edges.
    QImage wide(152, 38, QImage::Format_RGB32);
    wide.fill(Qt::blue);
    QPainter(&wide).fillRect(38, 0, 76, 38, Qt::red);
    for (double t : scrubber.thumbnailTimestamps())
        scrubber.setThumbnailImageForTimestamp(wide, t);
    for (qreal ratio : {1.0, 2.0}) {
        SCOPED_TRACE(ratio);
        QImage canvas(QSize(420, 38) * ratio, QImage::Format_ARGB32_Premultiplied);
        canvas.setDevicePixelRatio(ratio);
        canvas.fill(Qt::transparent);
        scrubber.render(&canvas);
        for (double x : {73.0, 100.0, 128.0}) {   // the second slot spans x 70.4 .. 130.9
            const QColor c = canvas.pixelColor(QPoint(int(x * ratio), int(19 * ratio)));
            EXPECT_GT(c.red(), 200) << x;
            EXPECT_LT(c.blue(), 60) << x;
        }
    }
}

// --- The playhead and the trim handles ---

TEST_F(ScrubberTest, PlayheadDragReportsBeginValuesAndEndMappedPastTheEdgeInset)
{
    press(110);   // 100 points into the strip
    move(210);
    move(-50);    // left of the strip
    move(500);    // right of the strip
    move(500);    // no movement, no call
    release(500);
    EXPECT_EQ(recorder.calls, (QStringList{"beginScrub 0", "value 10", "value 20", "value 0", "value 40", "endScrub 0"}));
    EXPECT_DOUBLE_EQ(scrubber.value(), 40.0);
    EXPECT_FALSE(scrubber.isEditing());

    // A press on the playhead grabs it where it is; setValue reports nothing and stays in the movie.
    recorder.calls.clear();
    scrubber.setValue(20.0);   // x = 210
    drag(213, 223);
    EXPECT_EQ(recorder.calls, (QStringList{"beginScrub 0", "value 21", "endScrub 0"}));
    recorder.calls.clear();
    scrubber.setValue(99.0);
    EXPECT_DOUBLE_EQ(scrubber.value(), 40.0);
    scrubber.setValue(-1.0);
    EXPECT_DOUBLE_EQ(scrubber.value(), 0.0);
    EXPECT_TRUE(recorder.calls.isEmpty());
}

TEST_F(ScrubberTest, FirstHandleDragEntersEditingOnceThenReportsValuesAndLeavingKeepsTheRange)
{
    EXPECT_EQ(range(), "0 40");
    press(5);   // the start grip lies left of its line at x 10
    EXPECT_TRUE(scrubber.isEditing());
    move(105);
    move(205);
    release(205);
    drag(415, 315);   // the end grip lies right of its line at x 410
    EXPECT_EQ(recorder.calls, (QStringList{"beginEditing", "start 10", "start 20", "end 30"}));
    EXPECT_DOUBLE_EQ(scrubber.value(), 0.0);   // the playhead stays

    scrubber.setEditing(false, true);
    EXPECT_FALSE(scrubber.isEditing());
    EXPECT_EQ(range(), "20 30");
    recorder.calls.clear();
    drag(205, 215);   // the next grab enters editing again
    EXPECT_EQ(recorder.calls, (QStringList{"beginEditing", "start 21"}));
}

TEST_F(ScrubberTest, HandlesKeepTheMinimumLengthAndTheMovieBounds)
{
    scrubber.setMinimumTrimLength(5.0);
    drag(5, 900);   // start far past the end handle
    EXPECT_EQ(range(), "35 40");
    drag(415, -400);   // end far left: held by the start handle
    EXPECT_DOUBLE_EQ(scrubber.editingEndValue(), 40.0);
    drag(355, -400);   // start grip at x 350 .. 360, far left
    EXPECT_DOUBLE_EQ(scrubber.editingStartValue(), 0.0);
    drag(415, -400);   // now the end can follow down to 5 s
    EXPECT_DOUBLE_EQ(scrubber.editingEndValue(), 5.0);
    EXPECT_EQ(recorder.calls, (QStringList{"beginEditing", "start 35", "start 0", "end 5"}));

    scrubber.setEditingRange(-3.0, 1.0);   // the owner's range obeys the same rules
    EXPECT_EQ(range(), "0 5");
}

TEST_F(ScrubberTest, GripsAreGrabbedBesideTheirDrawnWidthAndShowAResizeCursor)
{
    hover(16);   // 6 points inside the range, still the start grip's grab area
    EXPECT_EQ(scrubber.cursor().shape(), Qt::SizeHorCursor);
    hover(200);
    EXPECT_EQ(scrubber.cursor().shape(), Qt::ArrowCursor);
    drag(16, 16);
    EXPECT_EQ(recorder.calls, QStringList{"beginEditing"});

    // Close together, the grip on the pointer's side of the range's middle wins.
    scrubber.setEditingRange(20.0, 21.0);   // lines at x 210 and 220
    drag(214, 204);
    drag(216, 236);
    EXPECT_EQ(range(), "19 23");
}

TEST_F(ScrubberTest, WithoutEditingAllowedAPressOnAGripScrubsThePlayhead)
{
    scrubber.setEditable(false);
    scrubber.setValue(20.0);
    drag(5, 110);   // where the start grip would be
    EXPECT_EQ(recorder.calls, (QStringList{"beginScrub 0", "value 0", "value 10", "endScrub 0"}));
    scrubber.setEditing(true, false);
    EXPECT_FALSE(scrubber.isEditing());
}

TEST_F(ScrubberTest, EscapeWhileEditingLeavesTheDecisionToTheDelegate)
{
    key(Qt::Key_Escape);   // not editing: nothing to cancel
    drag(5, 25);
    key(Qt::Key_Escape);
    EXPECT_TRUE(scrubber.isEditing());   // this delegate does not leave

    recorder.onCancel = [](MovieScrubber *s) { s->setEditing(false, true); };
    press(25);   // a handle is held while Escape comes
    key(Qt::Key_Escape);
    move(125);   // the abandoned drag moves nothing
    release(125);
    EXPECT_FALSE(scrubber.isEditing());
    EXPECT_DOUBLE_EQ(scrubber.editingStartValue(), 2.0);
    EXPECT_EQ(recorder.calls, (QStringList{"beginEditing", "start 2", "cancel", "cancel"}));
}

TEST_F(ScrubberTest, ReloadResetsTheRangeOnlyForAMovieOfAnotherDuration)
{
    drag(5, 105);
    recorder.calls.clear();
    scrubber.reloadData();   // same movie, e.g. after a rotation
    EXPECT_DOUBLE_EQ(scrubber.editingStartValue(), 10.0);

    recorder.duration = 30.0;   // the trimmed movie
    scrubber.setValue(35.0);
    scrubber.reloadData();
    EXPECT_EQ(range(), "0 30");
    EXPECT_DOUBLE_EQ(scrubber.value(), 30.0);
    EXPECT_TRUE(recorder.calls.isEmpty());
}

// --- Zooming in while a handle is held still ---

TEST_F(ScrubberTest, HeldEndHandleZoomsToATenthOfTheMovieAndZoomsOutOnRelease)
{
    scrubber.setZoomDelay(0.05);
    press(415);   // the end grip, at 40 s
    ASSERT_TRUE(test::waitUntil([&] { return scrubber.isZoomed(); }, 5000));
    // A tenth of 40 s is 4 s, placed so the handle keeps its place at the right end.
    EXPECT_EQ(windowsAsked(), QStringList{"timestamps 7 36 40"});
    for (double ts : scrubber.thumbnailTimestamps()) {
        EXPECT_GE(ts, 36.0);
        EXPECT_LT(ts, 40.0);
    }
    ASSERT_TRUE(test::waitUntil([&] { return showsWindow(36, 40); }, 5000));
    move(375);   // 40 points: a tenth of the 4 s window
    EXPECT_NEAR(scrubber.editingEndValue(), 39.6, 1e-9);

    recorder.asks.clear();
    release(375);
    EXPECT_FALSE(scrubber.isZoomed());
    EXPECT_EQ(windowsAsked(), QStringList{"timestamps 7 0 40"});
    ASSERT_TRUE(test::waitUntil([&] { return showsWindow(0, 40); }, 5000));
    EXPECT_NEAR(scrubber.editingEndValue(), 39.6, 1e-9);
}

TEST_F(ScrubberTest, ZoomWindowKeepsAHandleInTheMiddleUnderThePointer)
{
    scrubber.setZoomDelay(0.05);
    scrubber.setEditingRange(20.0, 30.0);   // start line at x 210
    press(205);
    ASSERT_TRUE(test::waitUntil([&] { return scrubber.isZoomed(); }, 5000));
    EXPECT_EQ(windowsAsked(), QStringList{"timestamps 7 18 22"});
    ASSERT_TRUE(test::waitUntil([&] { return showsWindow(18, 22); }, 5000));
    move(215);   // ten points: a tenth of a second
    EXPECT_NEAR(scrubber.editingStartValue(), 20.1, 1e-9);
    scrubber.resize(720, 38);   // a new width while zoomed asks for the zoomed window
    EXPECT_EQ(windowsAsked().last(), QStringLiteral("timestamps 12 18 22"));
    release(215);
    EXPECT_EQ(windowsAsked().last(), QStringLiteral("timestamps 12 0 40"));
}

TEST_F(ScrubberTest, NoZoomWithoutAHoldOnAHandleOrWhenZoomIsOffOrTheMovieIsShort)
{
    scrubber.setZoomDelay(0.05);
    press(415);   // released before the delay
    release(415);
    QTest::qWait(200);
    press(210);   // a playhead drag never zooms
    QTest::qWait(200);
    EXPECT_FALSE(scrubber.isZoomed());
    EXPECT_TRUE(recorder.asks.isEmpty());
    release(210);

    scrubber.setZoomDelay(0);
    press(415);
    QTest::qWait(200);
    EXPECT_FALSE(scrubber.isZoomed());
    release(415);

    scrubber.setZoomDelay(0.05);
    recorder.duration = 1.5;   // the whole movie fits the smallest window
    scrubber.reloadData();
    recorder.asks.clear();
    press(415);
    QTest::qWait(200);
    EXPECT_FALSE(scrubber.isZoomed());
    release(415);
    EXPECT_TRUE(recorder.asks.isEmpty());
}

// --- Keys ---

TEST_F(ScrubberTest, ArrowsHomeAndEndStepThePlayheadAsShortScrubs)
{
    EXPECT_EQ(scrubber.focusPolicy(), Qt::StrongFocus);
    EXPECT_EQ(scrubber.accessibleName(), QStringLiteral("Timeline"));
    key(Qt::Key_Right);
    EXPECT_EQ(recorder.calls, (QStringList{"beginScrub 0", QStringLiteral("value %1").arg(1.0 / 30.0), "endScrub 0"}));
    EXPECT_DOUBLE_EQ(scrubber.value(), 1.0 / 30.0);
    key(Qt::Key_Right, Qt::ShiftModifier);
    EXPECT_DOUBLE_EQ(scrubber.value(), 1.0 + 1.0 / 30.0);
    key(Qt::Key_Left);
    EXPECT_DOUBLE_EQ(scrubber.value(), 1.0);
    key(Qt::Key_Left, Qt::ShiftModifier);
    EXPECT_DOUBLE_EQ(scrubber.value(), 0.0);
    key(Qt::Key_End);
    EXPECT_DOUBLE_EQ(scrubber.value(), 40.0);

    recorder.calls.clear();
    key(Qt::Key_Right);   // already at the end: nothing to report
    EXPECT_TRUE(recorder.calls.isEmpty());
    key(Qt::Key_Home);
    EXPECT_EQ(recorder.calls, (QStringList{"beginScrub 0", "value 0", "endScrub 0"}));
}

} // namespace
} // namespace zaf::ui
