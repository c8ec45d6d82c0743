// Zooming in while a trim handle is held still, and the keyboard steps of the playhead.
#include "platform/ui/movie_scrubber.h"

#include <QApplication>
#include <QElapsedTimer>
#include <QKeyEvent>
#include <QMouseEvent>
#include <QStringList>
#include <QtCore/qtestsupport_core.h>
#include <gtest/gtest.h>

#include <cmath>
#include <functional>

namespace zaf::ui {
namespace {

// A 40 s movie on the 400-point strip (x 10 .. 410 of a 420-wide scrubber). Logs timestamp asks
// and the delegate's value calls.
class Recorder : public MovieScrubberDelegate, public MovieScrubberDataSource {
public:
    double duration = 40.0;
    QStringList calls;

    double movieScrubberDuration(MovieScrubber *) override { return duration; }
    double movieScrubberThumbnailAspectRatio(MovieScrubber *) override { return 16.0 / 9.0; }
    QList<double> movieScrubberEvenlySpacedTimestampsStartingAtEndingAt(MovieScrubber *, int n, double s,
                                                                         double e) override
    {
        calls.append(QStringLiteral("timestamps %1 %2 %3").arg(n).arg(s).arg(e));
        QList<double> out;
        for (int i = 0; i < n; ++i)
            out.append(s + i * (e - s) / n);
        return out;
    }
    void movieScrubberRequestThumbnailImageForTimestamp(MovieScrubber *, double) override {}

    void movieScrubberValueDidChange(MovieScrubber *, double v) override
    {
        calls.append(QStringLiteral("value %1").arg(v));
    }
    void movieScrubberDidBeginScrubbingWithHandle(MovieScrubber *, MovieScrubberHandle h) override
    {
        calls.append(QStringLiteral("beginScrub %1").arg(int(h)));
    }
    void movieScrubberDidEndScrubbingWithHandle(MovieScrubber *, MovieScrubberHandle h) override
    {
        calls.append(QStringLiteral("endScrub %1").arg(int(h)));
    }
    void movieScrubberEditingStartValueDidChange(MovieScrubber *, double v) override
    {
        calls.append(QStringLiteral("start %1").arg(v));
    }
    void movieScrubberEditingEndValueDidChange(MovieScrubber *, double v) override
    {
        calls.append(QStringLiteral("end %1").arg(v));
    }
};

void sendMouse(QWidget *w, QEvent::Type type, double x, Qt::MouseButtons buttons)
{
    const QPointF pos(x, 19);
    const Qt::MouseButton button = type == QEvent::MouseMove ? Qt::NoButton : Qt::LeftButton;
    QMouseEvent event(type, pos, w->mapToGlobal(pos), button, buttons, Qt::NoModifier);
    QApplication::sendEvent(w, &event);
}
void press(QWidget *w, double x) { sendMouse(w, QEvent::MouseButtonPress, x, Qt::LeftButton); }
void move(QWidget *w, double x) { sendMouse(w, QEvent::MouseMove, x, Qt::LeftButton); }
void release(QWidget *w, double x) { sendMouse(w, QEvent::MouseButtonRelease, x, Qt::NoButton); }

void keyClick(QWidget *w, int key, Qt::KeyboardModifiers modifiers = Qt::NoModifier)
{
    QKeyEvent down(QEvent::KeyPress, key, modifiers);
    QApplication::sendEvent(w, &down);
    QKeyEvent up(QEvent::KeyRelease, key, modifiers);
    QApplication::sendEvent(w, &up);
}

// Runs the event loop until the condition holds; false after five seconds.
bool waitUntil(const std::function<bool()> &condition)
{
    QElapsedTimer timer;
    timer.start();
    while (!condition()) {
        if (timer.hasExpired(5000))
            return false;
        QTest::qWait(5);
    }
    return true;
}

struct Timeline {
    MovieScrubber scrubber;
    Recorder recorder;
    explicit Timeline(double zoomDelay = 0.05)
    {
        scrubber.resize(420, 38);
        scrubber.setDataSource(&recorder);
        scrubber.setDelegate(&recorder);
        scrubber.setZoomDelay(zoomDelay);
        scrubber.show();
        scrubber.reloadData();
        recorder.calls.clear();
    }
    bool showsWindow(double start, double end) const
    {
        return qFuzzyCompare(scrubber.visibleStartValue() + 1, start + 1)
            && qFuzzyCompare(scrubber.visibleEndValue(), end);
    }
};

TEST(MovieScrubberZoom, HeldHandleZoomsToANarrowWindowForFineTrimmingAndZoomsOutOnRelease)
{
    Timeline t;
    press(&t.scrubber, 415); // the end grip, at 40 s
    ASSERT_TRUE(waitUntil([&] { return t.scrubber.isZoomed(); }));
    // A tenth of 40 s is 4 s, placed so the handle keeps its place at the right end.
    EXPECT_EQ(t.recorder.calls, QStringList{"timestamps 7 36 40"});
    for (double ts : t.scrubber.thumbnailTimestamps()) {
        EXPECT_GE(ts, 36.0);
        EXPECT_LT(ts, 40.0);
    }
    ASSERT_TRUE(waitUntil([&] { return t.showsWindow(36, 40); }));

    move(&t.scrubber, 375); // 40 points: a tenth of the 4 s window
    EXPECT_NEAR(t.scrubber.editingEndValue(), 39.6, 1e-9);

    t.recorder.calls.clear();
    release(&t.scrubber, 375);
    EXPECT_FALSE(t.scrubber.isZoomed());
    EXPECT_EQ(t.recorder.calls, QStringList{"timestamps 7 0 40"});
    ASSERT_TRUE(waitUntil([&] { return t.showsWindow(0, 40); }));
    EXPECT_NEAR(t.scrubber.editingEndValue(), 39.6, 1e-9);
}

TEST(MovieScrubberZoom, ZoomWindowKeepsAHandleInTheMiddleUnderThePointer)
{
    Timeline t;
    t.scrubber.setEditingRange(20.0, 30.0); // start line at x 210
    press(&t.scrubber, 205);
    ASSERT_TRUE(waitUntil([&] { return t.scrubber.isZoomed(); }));
    EXPECT_EQ(t.recorder.calls, QStringList{"timestamps 7 18 22"});
    ASSERT_TRUE(waitUntil([&] { return t.showsWindow(18, 22); }));

    move(&t.scrubber, 215); // ten points: a tenth of a second
    EXPECT_NEAR(t.scrubber.editingStartValue(), 20.1, 1e-9);
    t.scrubber.resize(720, 38); // a new width while zoomed asks for the zoomed window
    EXPECT_EQ(t.recorder.calls.last(), QStringLiteral("timestamps 12 18 22"));
    release(&t.scrubber, 215);
    EXPECT_EQ(t.recorder.calls.last(), QStringLiteral("timestamps 12 0 40"));
}

TEST(MovieScrubberZoom, NoZoomWithoutAHoldOrWhenTheMovieIsShortOrZoomIsOff)
{
    {
        Timeline t; // released before the delay
        press(&t.scrubber, 415);
        release(&t.scrubber, 415);
        QTest::qWait(200);
        EXPECT_FALSE(t.scrubber.isZoomed());
        EXPECT_TRUE(t.recorder.calls.isEmpty());
    }
    {
        Timeline t(0.0); // zoom off
        press(&t.scrubber, 415);
        QTest::qWait(200);
        EXPECT_FALSE(t.scrubber.isZoomed());
        release(&t.scrubber, 415);
    }
    {
        Timeline t;
        t.recorder.duration = 1.5; // the whole movie fits the smallest window
        t.scrubber.reloadData();
        t.recorder.calls.clear();
        press(&t.scrubber, 415);
        QTest::qWait(200);
        EXPECT_FALSE(t.scrubber.isZoomed());
        EXPECT_TRUE(t.recorder.calls.isEmpty());
        release(&t.scrubber, 415);
    }
    {
        Timeline t; // a playhead drag never zooms
        press(&t.scrubber, 210);
        QTest::qWait(200);
        EXPECT_FALSE(t.scrubber.isZoomed());
        release(&t.scrubber, 210);
    }
}

TEST(MovieScrubberKeys, ArrowsHomeAndEndStepThePlayheadAsShortScrubs)
{
    Timeline t;
    keyClick(&t.scrubber, Qt::Key_Right);
    EXPECT_EQ(t.recorder.calls, (QStringList{"beginScrub 0", QStringLiteral("value %1").arg(1.0 / 30.0), "endScrub 0"}));
    EXPECT_DOUBLE_EQ(t.scrubber.value(), 1.0 / 30.0);

    keyClick(&t.scrubber, Qt::Key_Right, Qt::ShiftModifier);
    EXPECT_DOUBLE_EQ(t.scrubber.value(), 1.0 + 1.0 / 30.0);
    keyClick(&t.scrubber, Qt::Key_Left);
    EXPECT_DOUBLE_EQ(t.scrubber.value(), 1.0);
    keyClick(&t.scrubber, Qt::Key_Left, Qt::ShiftModifier);
    EXPECT_DOUBLE_EQ(t.scrubber.value(), 0.0);
    keyClick(&t.scrubber, Qt::Key_End);
    EXPECT_DOUBLE_EQ(t.scrubber.value(), 40.0);

    t.recorder.calls.clear();
    keyClick(&t.scrubber, Qt::Key_Right); // already at the end: nothing to report
    EXPECT_TRUE(t.recorder.calls.isEmpty());
    keyClick(&t.scrubber, Qt::Key_Home);
    EXPECT_EQ(t.recorder.calls, (QStringList{"beginScrub 0", "value 0", "endScrub 0"}));
}

TEST(MovieScrubberKeys, KeysDoNothingWithoutAMovie)
{
    Timeline t;
    t.recorder.duration = std::nan("");
    t.scrubber.reloadData();
    t.recorder.calls.clear();
    keyClick(&t.scrubber, Qt::Key_Right);
    keyClick(&t.scrubber, Qt::Key_End);
    press(&t.scrubber, 200);
    release(&t.scrubber, 200);
    EXPECT_TRUE(t.recorder.calls.isEmpty());
    EXPECT_DOUBLE_EQ(t.scrubber.value(), 0.0);
}

} // namespace
} // namespace zaf::ui
