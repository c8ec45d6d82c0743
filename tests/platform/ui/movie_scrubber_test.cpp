// MovieScrubber: what it asks, keeps, draws and reports; the rules behind it are in timeline_model_test.cpp.
#include "platform/ui/movie_scrubber.h"
#include "platform/ui/timeline_timer.h"
#include "tests/support/wait_until.h"

#include <QApplication>
#include <QKeyEvent>
#include <QMouseEvent>
#include <QPainter>
#include <QStringList>
#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <optional>

namespace zaf::ui {
namespace {

// Runs its timeout when the test fires it; `running` holds the delay of the countdown under way.
struct ManualTimer : TimelineTimer {
    std::optional<std::chrono::milliseconds> running;
    std::function<void()> timeout;
    void start(std::chrono::milliseconds delay, std::function<void()> f) override { running = delay, timeout = std::move(f); }
    void stop() override { running.reset(); }
    void fire() { if (running) running.reset(), timeout(); }
};

// Logs what the scrubber asks for (`asks`: the data source and the request brackets, a run of
// requests as "N requests") apart from what it reports (`calls`: playhead and editing changes).
// Timestamps are spread evenly over the window unless a fixed list is given.
struct Recorder : MovieScrubberDelegate, MovieScrubberDataSource {
    double duration = 40.0;
    QList<double> fixedTimestamps, requested;
    QStringList asks, calls;

    double movieScrubberDuration(MovieScrubber *) override { asks << "duration"; return duration; }
    double movieScrubberThumbnailAspectRatio(MovieScrubber *) override { asks << "aspect"; return 16.0 / 9.0; }
    QList<double> movieScrubberEvenlySpacedTimestampsStartingAtEndingAt(MovieScrubber *, int n, double s, double e) override
    {
        asks << QStringLiteral("timestamps %1 %2 %3").arg(n).arg(s).arg(e);
        QList<double> spread;
        for (int i = 0; i < n; ++i)
            spread.append(s + i * (e - s) / n);
        return fixedTimestamps.isEmpty() ? spread : fixedTimestamps;
    }
    void movieScrubberRequestThumbnailImageForTimestamp(MovieScrubber *, double t) override
    {
        const int run = asks.isEmpty() || !asks.last().endsWith(" requests") ? 0 : asks.takeLast().section(' ', 0, 0).toInt();
        requested << t, asks << QStringLiteral("%1 requests").arg(run + 1);
    }
    void movieScrubberWillBeginRequestingThumbnails(MovieScrubber *) override { asks << "will"; }
    void movieScrubberDidFinishRequestingThumbnails(MovieScrubber *) override { asks << "did"; }

    void movieScrubberValueDidChange(MovieScrubber *, double v) override { log("value", v); }
    void movieScrubberDidBeginScrubbingWithHandle(MovieScrubber *, MovieScrubberHandle h) override { log("beginScrub", int(h)); }
    void movieScrubberDidEndScrubbingWithHandle(MovieScrubber *, MovieScrubberHandle h) override { log("endScrub", int(h)); }
    void movieScrubberEditingStartValueDidChange(MovieScrubber *, double v) override { log("start", v); }
    void movieScrubberEditingEndValueDidChange(MovieScrubber *, double v) override { log("end", v); }
    void movieScrubberDidBeginEditing(MovieScrubber *) override { calls << "beginEditing"; }
    void movieScrubberDidCancelEditing(MovieScrubber *) override { calls << "cancel"; }
    void log(const char *what, double v) { calls << QStringLiteral("%1 %2").arg(what).arg(v); }
};

QImage solid(QColor color, QSize size = {68, 38})
{
    QImage image(size, QImage::Format_RGB32);
    image.fill(color);
    return image;
}

// A shown, loaded scrubber on a 40 s movie: on the 400-point strip (x 10 .. 410 of the 420-wide
// scrubber) one point is a tenth of a second, and 7 thumbnails fit; the second is asked for 40 / 7 s.
// The zoom delay keeps its default; its timer fires only when a test fires it. Mouse and key events
// go through the application as the window system delivers them, at the strip's middle.
struct ScrubberTest : ::testing::Test {
    MovieScrubber scrubber;
    Recorder recorder;
    ManualTimer *timer = new ManualTimer;

    void SetUp() override
    {
        scrubber.setZoomTimer(std::unique_ptr<TimelineTimer>(timer));
        scrubber.resize(420, 38);
        scrubber.setDataSource(&recorder);
        scrubber.setDelegate(&recorder);
        scrubber.show(); // a hidden widget gets its resize events only when shown
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
    void key(int key)
    {
        QKeyEvent event(QEvent::KeyPress, key, Qt::NoModifier);
        QApplication::sendEvent(&scrubber, &event);
    }
    void reload(double duration) { recorder.duration = duration, scrubber.reloadData(), recorder.asks.clear(); }
    // Waits (bounded) until the strip shows start .. end, at the end of a zoom animation.
    void settle(double start, double end)
    {
        test::waitUntil([&] { return std::abs(scrubber.visibleStartValue() - start) + std::abs(scrubber.visibleEndValue() - end) < 1e-9; }, 5000);
    }
    // The colour drawn at x in the second thumbnail slot (x 70.4 .. 130.9).
    QColor secondSlotColor(qreal ratio = 1.0, double x = 100)
    {
        QImage canvas(QSize(420, 38) * ratio, QImage::Format_ARGB32_Premultiplied);
        canvas.setDevicePixelRatio(ratio);
        canvas.fill(Qt::transparent);
        scrubber.render(&canvas);
        return canvas.pixelColor(QPoint(int(x * ratio), int(19 * ratio)));
    }
};

using Act = void (*)(ScrubberTest &);
struct Case { const char *name; Act act; QStringList expected; };
const auto caseName = [](const auto &info) { return std::string(info.param.name); };

// What the data source is asked (and the delegate's request brackets) after each act.
struct AskTest : ScrubberTest, ::testing::WithParamInterface<Case> {};

TEST_P(AskTest, Asks)
{
    GetParam().act(*this);
    EXPECT_EQ(recorder.asks, GetParam().expected);
}
INSTANTIATE_TEST_SUITE_P(Strip, AskTest, ::testing::Values(
    Case{"ReloadAsksEverythingInOrder", [](ScrubberTest &t) { t.scrubber.reloadData(); },
         {"duration", "aspect", "timestamps 7 0 40", "will", "7 requests", "did"}},
    Case{"ReloadWithNaNDurationAsksNoMore", [](ScrubberTest &t) { t.recorder.duration = NAN, t.scrubber.reloadData(); }, {"duration"}},
    Case{"ReloadWithZeroDurationAsksNoMore", [](ScrubberTest &t) { t.recorder.duration = 0, t.scrubber.reloadData(); }, {"duration"}},
    Case{"ReloadWithNegativeDurationAsksNoMore", [](ScrubberTest &t) { t.recorder.duration = -3, t.scrubber.reloadData(); }, {"duration"}},
    Case{"NewWidthWithoutDurationAsksNothing", [](ScrubberTest &t) { t.reload(NAN), t.scrubber.resize(600, 38); }, {}},
    Case{"NewWidthOfAsManyThumbnailsAsksNothing", [](ScrubberTest &t) { t.scrubber.resize(430, 38); }, {}},
    Case{"NewWidthOfFewerThumbnailsAsksForThem", [](ScrubberTest &t) { t.scrubber.resize(220, 38); },
         {"timestamps 4 0 40", "will", "4 requests", "did"}},
    Case{"ReloadWithoutDelegateHasNoBrackets", [](ScrubberTest &t) { t.scrubber.setDelegate(nullptr), t.scrubber.reloadData(); },
         {"duration", "aspect", "timestamps 7 0 40", "7 requests"}},
    Case{"HeldEndHandleZoomsToATenthOfTheMovie", [](ScrubberTest &t) { t.press(415), t.timer->fire(); },
         {"timestamps 7 36 40", "will", "7 requests", "did"}},
    Case{"HeldStartHandleZoomsAroundIt", [](ScrubberTest &t) { t.scrubber.setEditingRange(20, 30), t.press(205), t.timer->fire(); },
         {"timestamps 7 18 22", "will", "7 requests", "did"}},
    Case{"ReleaseZoomsOut", [](ScrubberTest &t) { t.press(415), t.timer->fire(), t.recorder.asks.clear(), t.release(415); },
         {"timestamps 7 0 40", "will", "7 requests", "did"}},
    Case{"NewWidthWhileZoomedAsksForTheZoomedWindow",
         [](ScrubberTest &t) { t.press(415), t.timer->fire(), t.recorder.asks.clear(), t.scrubber.resize(720, 38); },
         {"timestamps 12 36 40", "will", "12 requests", "did"}},
    Case{"NoZoomForAHandleReleasedBeforeTheDelay", [](ScrubberTest &t) { t.press(415), t.release(415), t.timer->fire(); }, {}},
    Case{"NoZoomForThePlayhead", [](ScrubberTest &t) { t.press(210), t.timer->fire(); }, {}},
    Case{"NoZoomWithZoomDelayZero", [](ScrubberTest &t) { t.scrubber.setZoomDelay(0), t.press(415), t.timer->fire(); }, {}},
    Case{"NoZoomForAMovieShorterThanTheZoomWindow", [](ScrubberTest &t) { t.reload(1.5), t.press(415), t.timer->fire(); }, {}}),
    caseName);

// What the delegate hears after each act.
struct ReportTest : ScrubberTest, ::testing::WithParamInterface<Case> {};

TEST_P(ReportTest, Reports)
{
    GetParam().act(*this);
    EXPECT_EQ(recorder.calls, GetParam().expected);
}
INSTANTIATE_TEST_SUITE_P(Input, ReportTest, ::testing::Values(
    Case{"PlayheadDragBeginsReportsEachNewValueThenEnds",
         [](ScrubberTest &t) { t.press(110), t.move(210), t.move(-50), t.move(500), t.move(500), t.release(500); },
         {"beginScrub 0", "value 10", "value 20", "value 0", "value 40", "endScrub 0"}},
    Case{"PressNearThePlayheadGrabsItWhereItIs", [](ScrubberTest &t) { t.scrubber.setValue(20), t.drag(213, 223); },
         {"beginScrub 0", "value 21", "endScrub 0"}},
    Case{"SetValueReportsNothing", [](ScrubberTest &t) { t.scrubber.setValue(20); }, {}},
    Case{"HandleDragsReportEditingOnceBeforeTheirValues",
         [](ScrubberTest &t) { t.press(5), t.move(105), t.move(205), t.release(205), t.drag(415, 315); },
         {"beginEditing", "start 10", "start 20", "end 30"}},
    Case{"HandleThatCannotMoveReportsNothing", [](ScrubberTest &t) { t.scrubber.setEditingRange(39, 40), t.drag(415, 0); }, {"beginEditing"}},
    Case{"GrabAfterLeavingEditingEntersItAgain",
         [](ScrubberTest &t) { t.drag(5, 105), t.scrubber.setEditing(false, false), t.recorder.calls.clear(), t.drag(105, 115); },
         {"beginEditing", "start 11"}},
    Case{"LeavingEditingLetsGoOfTheHeldHandle",
         [](ScrubberTest &t) { t.press(5), t.scrubber.setEditing(false, true), t.move(105), t.release(105); }, {"beginEditing"}},
    Case{"WithoutEditingAllowedAGripScrubsThePlayhead",
         [](ScrubberTest &t) { t.scrubber.setEditable(false), t.scrubber.setValue(20), t.drag(5, 110); },
         {"beginScrub 0", "value 0", "value 10", "endScrub 0"}},
    Case{"ZoomedStripMovesTheHandleInFineSteps", // 40 points: a tenth of the 4 s window
         [](ScrubberTest &t) { t.press(415), t.timer->fire(), t.settle(36, 40), t.move(375); }, {"beginEditing", "end 39.6"}},
    Case{"AfterZoomOutTheStripShowsTheWholeMovie",
         [](ScrubberTest &t) { t.press(415), t.timer->fire(), t.release(415), t.settle(0, 40), t.drag(110, 110); },
         {"beginEditing", "beginScrub 0", "value 10", "endScrub 0"}},
    Case{"EscapeOutsideEditingReportsNothing", [](ScrubberTest &t) { t.key(Qt::Key_Escape); }, {}},
    Case{"EscapeWhileEditingAsksTheDelegate", [](ScrubberTest &t) { t.drag(5, 5), t.key(Qt::Key_Escape); }, {"beginEditing", "cancel"}},
    Case{"ReloadOfATrimmedMovieReportsNothing", [](ScrubberTest &t) { t.scrubber.setValue(35), t.reload(30); }, {}},
    Case{"KeyStepIsAShortScrub", [](ScrubberTest &t) { t.key(Qt::Key_End); }, {"beginScrub 0", "value 40", "endScrub 0"}},
    Case{"KeyStepThatMovesNothingReportsNothing", [](ScrubberTest &t) { t.key(Qt::Key_Home); }, {}},
    Case{"InputWithoutDurationReportsNothing", [](ScrubberTest &t) { t.reload(NAN), t.key(Qt::Key_End), t.drag(200, 300); }, {}}),
    caseName);

TEST_F(ScrubberTest, WorksWithoutADelegate)
{
    scrubber.setDelegate(nullptr);
    drag(5, 105);
    key(Qt::Key_End);
    EXPECT_DOUBLE_EQ(scrubber.editingStartValue(), 10.0);
    EXPECT_DOUBLE_EQ(scrubber.value(), 40.0);
}

TEST_F(ScrubberTest, LeavingEditingKeepsTheRange)
{
    drag(5, 105);
    scrubber.setEditing(false, true);
    EXPECT_DOUBLE_EQ(scrubber.editingStartValue(), 10.0);
}

TEST_F(ScrubberTest, WithoutEditingAllowedSetEditingIsRefused)
{
    scrubber.setEditable(false);
    scrubber.setEditing(true, false);
    EXPECT_FALSE(scrubber.isEditing());
}

TEST_F(ScrubberTest, HoverOverAGripShowsAResizeCursor)
{
    hover(16);
    EXPECT_EQ(scrubber.cursor().shape(), Qt::SizeHorCursor);
    hover(200);
    EXPECT_EQ(scrubber.cursor().shape(), Qt::ArrowCursor);
}

TEST_F(ScrubberTest, TakesFocusAsTheTimeline)
{
    EXPECT_EQ(scrubber.focusPolicy(), Qt::StrongFocus);
    EXPECT_EQ(scrubber.accessibleName(), QStringLiteral("Timeline"));
}

struct Offer { const char *name; double timestamp; bool null; int count; };
struct OfferTest : ScrubberTest, ::testing::WithParamInterface<Offer> {};

TEST_P(OfferTest, KeepsOnlyNonNullImagesOfAskedTimestamps)
{
    scrubber.setThumbnailImageForTimestamp(GetParam().null ? QImage() : solid(Qt::red), GetParam().timestamp);
    EXPECT_EQ(scrubber.thumbnailImageCount(), GetParam().count);
}
INSTANTIATE_TEST_SUITE_P(Images, OfferTest, ::testing::Values(
    Offer{"Asked", 40.0 / 7, false, 1}, Offer{"NearIsNotEqual", 40.0 / 7 + 1e-9, false, 0},
    Offer{"NotAsked", 1000, false, 0}, Offer{"Null", 40.0 / 7, true, 0}), caseName);

TEST_F(ScrubberTest, LaterImageReplacesTheEarlier)
{
    scrubber.setThumbnailImageForTimestamp(solid(Qt::red), 40.0 / 7);
    scrubber.setThumbnailImageForTimestamp(solid(Qt::blue), 40.0 / 7);
    EXPECT_EQ(scrubber.thumbnailImageCount(), 1);
    EXPECT_GT(secondSlotColor().blue(), 200);
}

TEST_F(ScrubberTest, ReloadForgetsTheTimestampsOfTheMovieBefore)
{
    scrubber.setThumbnailImageForTimestamp(solid(Qt::red), 40.0 / 7);
    reload(30);
    EXPECT_EQ(scrubber.thumbnailImageCount(), 0);
    scrubber.setThumbnailImageForTimestamp(solid(Qt::red), 40.0 / 7); // a late image of the first movie
    EXPECT_EQ(scrubber.thumbnailImageCount(), 0);
}

TEST_F(ScrubberTest, ShortTimestampListLeavesTheOtherSlotsEmpty)
{
    recorder.fixedTimestamps = {0.0, 17.5};
    scrubber.reloadData();
    EXPECT_EQ(recorder.requested, (QList<double>{0.0, 17.5}));
    EXPECT_EQ(scrubber.thumbnailTimestamps(), recorder.requested);
    scrubber.setThumbnailImageForTimestamp(solid(Qt::red), 17.5);
    EXPECT_EQ(scrubber.thumbnailImageCount(), 1);
    EXPECT_FALSE(scrubber.grab().isNull());
}

TEST_F(ScrubberTest, WithoutDataSourceNothingIsKept)
{
    scrubber.setDataSource(nullptr);
    scrubber.reloadData();
    scrubber.setThumbnailImageForTimestamp(solid(Qt::red), 0.0);
    EXPECT_EQ(scrubber.thumbnailImageCount(), 0);
    EXPECT_FALSE(scrubber.grab().isNull());
}

// A 4:1 image whose outer quarters are blue: filling a 16:9 slot crops them away, while stretching
// the image would show blue at the slot's edges.
struct PaintTest : ScrubberTest, ::testing::WithParamInterface<qreal> {};

TEST_P(PaintTest, EachThumbnailFillsItsSlotCropped)
{
    QImage wide = solid(Qt::blue, {152, 38});
    QPainter(&wide).fillRect(38, 0, 76, 38, Qt::red);
    for (double t : scrubber.thumbnailTimestamps())
        scrubber.setThumbnailImageForTimestamp(wide, t);
    for (double x : {73.0, 100.0, 128.0}) {
        const QColor c = secondSlotColor(GetParam(), x);
        EXPECT_GT(c.red(), 200) << x;
        EXPECT_LT(c.blue(), 60) << x;
    }
}
INSTANTIATE_TEST_SUITE_P(PixelRatios, PaintTest, ::testing::Values(1.0, 2.0),
                         [](const auto &info) { return std::string(info.index ? "Double" : "Single"); });

} // namespace
} // namespace zaf::ui
