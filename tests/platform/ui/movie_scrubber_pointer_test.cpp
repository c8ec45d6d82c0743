// The pointer on MovieScrubber: dragging the playhead, grabbing and dragging the trim handles,
// entering and leaving editing, and Escape.
#include "platform/ui/movie_scrubber.h"

#include <QApplication>
#include <QKeyEvent>
#include <QMouseEvent>
#include <QStringList>
#include <gtest/gtest.h>

#include <functional>

namespace zaf::ui {
namespace {

// Logs every delegate call as a line; a 40 s movie, so on the 400-point strip (x 10 .. 410 of a
// 420-wide scrubber) one point is a tenth of a second.
class Recorder : public MovieScrubberDelegate, public MovieScrubberDataSource {
public:
    double duration = 40.0;
    QStringList calls;
    std::function<void(MovieScrubber *)> onCancel;

    double movieScrubberDuration(MovieScrubber *) override { return duration; }
    double movieScrubberThumbnailAspectRatio(MovieScrubber *) override { return 16.0 / 9.0; }
    QList<double> movieScrubberEvenlySpacedTimestampsStartingAtEndingAt(MovieScrubber *, int n, double s,
                                                                         double e) override
    {
        QList<double> out;
        for (int i = 0; i < n; ++i)
            out.append(s + i * (e - s) / n);
        return out;
    }
    void movieScrubberRequestThumbnailImageForTimestamp(MovieScrubber *, double) override {}

    void movieScrubberValueDidChange(MovieScrubber *, double v) override { log("value", v); }
    void movieScrubberDidBeginScrubbingWithHandle(MovieScrubber *, MovieScrubberHandle h) override
    {
        log("beginScrub", int(h));
    }
    void movieScrubberDidEndScrubbingWithHandle(MovieScrubber *, MovieScrubberHandle h) override
    {
        log("endScrub", int(h));
    }
    void movieScrubberEditingStartValueDidChange(MovieScrubber *, double v) override { log("start", v); }
    void movieScrubberEditingEndValueDidChange(MovieScrubber *, double v) override { log("end", v); }
    void movieScrubberDidBeginEditing(MovieScrubber *) override { calls.append("beginEditing"); }
    void movieScrubberDidCancelEditing(MovieScrubber *s) override
    {
        calls.append("cancel");
        if (onCancel)
            onCancel(s);
    }

private:
    void log(const char *what, double v) { calls.append(QStringLiteral("%1 %2").arg(what).arg(v)); }
};

// Mouse and key events delivered to the widget through the application, as the window system
// delivers them; y is the middle of the strip.
struct Pointer {
    QWidget *w;
    void send(QEvent::Type type, double x, Qt::MouseButton button, Qt::MouseButtons buttons)
    {
        const QPointF pos(x, 19);
        QMouseEvent event(type, pos, w->mapToGlobal(pos), button, buttons, Qt::NoModifier);
        QApplication::sendEvent(w, &event);
    }
    void press(double x) { send(QEvent::MouseButtonPress, x, Qt::LeftButton, Qt::LeftButton); }
    void move(double x) { send(QEvent::MouseMove, x, Qt::NoButton, Qt::LeftButton); }
    void hover(double x) { send(QEvent::MouseMove, x, Qt::NoButton, Qt::NoButton); }
    void release(double x) { send(QEvent::MouseButtonRelease, x, Qt::LeftButton, Qt::NoButton); }
    void drag(double from, double to)
    {
        press(from);
        move(to);
        release(to);
    }
    void key(int key)
    {
        QKeyEvent down(QEvent::KeyPress, key, Qt::NoModifier);
        QApplication::sendEvent(w, &down);
        QKeyEvent up(QEvent::KeyRelease, key, Qt::NoModifier);
        QApplication::sendEvent(w, &up);
    }
};

struct Timeline {
    MovieScrubber scrubber;
    Recorder recorder;
    Pointer pointer{&scrubber};
    Timeline()
    {
        scrubber.resize(420, 38);
        scrubber.setDataSource(&recorder);
        scrubber.setDelegate(&recorder);
        scrubber.setZoomDelay(0); // these tests hold nothing long enough to zoom
        scrubber.show();
        scrubber.reloadData();
    }
};

TEST(MovieScrubberPlayhead, DragReportsBeginEachValueAndEndWithValuesMappedPastTheEdgeInset)
{
    Timeline t;
    t.pointer.press(110);  // 100 points into the strip
    t.pointer.move(210);
    t.pointer.move(-50);   // left of the strip
    t.pointer.move(500);   // right of the strip
    t.pointer.move(500);   // no movement, no call
    t.pointer.release(500);
    EXPECT_EQ(t.recorder.calls, (QStringList{"beginScrub 0", "value 10", "value 20", "value 0", "value 40",
                                             "endScrub 0"}));
    EXPECT_DOUBLE_EQ(t.scrubber.value(), 40.0);
    EXPECT_FALSE(t.scrubber.isEditing());
}

TEST(MovieScrubberPlayhead, PressOnThePlayheadGrabsItWithoutMovingIt)
{
    Timeline t;
    t.scrubber.setValue(20.0); // x = 210
    t.pointer.press(213);
    t.pointer.move(223); // ten points right of the press: one second
    t.pointer.release(223);
    EXPECT_EQ(t.recorder.calls, (QStringList{"beginScrub 0", "value 21", "endScrub 0"}));
}

TEST(MovieScrubberPlayhead, SetValueCallsNothingAndStaysWithinTheMovie)
{
    Timeline t;
    t.scrubber.setValue(12.5);
    EXPECT_DOUBLE_EQ(t.scrubber.value(), 12.5);
    t.scrubber.setValue(99.0);
    EXPECT_DOUBLE_EQ(t.scrubber.value(), 40.0);
    t.scrubber.setValue(-1.0);
    EXPECT_DOUBLE_EQ(t.scrubber.value(), 0.0);
    EXPECT_TRUE(t.recorder.calls.isEmpty());
}

TEST(MovieScrubberHandles, FirstHandleDragEntersEditingOnceThenReportsValues)
{
    Timeline t;
    EXPECT_DOUBLE_EQ(t.scrubber.editingStartValue(), 0.0);
    EXPECT_DOUBLE_EQ(t.scrubber.editingEndValue(), 40.0);

    t.pointer.press(5); // the start grip lies left of its line at x 10
    EXPECT_TRUE(t.scrubber.isEditing());
    t.pointer.move(105);
    t.pointer.move(205);
    t.pointer.release(205);
    t.pointer.drag(415, 315); // the end grip lies right of its line at x 410
    EXPECT_EQ(t.recorder.calls, (QStringList{"beginEditing", "start 10", "start 20", "end 30"}));
    EXPECT_DOUBLE_EQ(t.scrubber.editingStartValue(), 20.0);
    EXPECT_DOUBLE_EQ(t.scrubber.editingEndValue(), 30.0);
    EXPECT_DOUBLE_EQ(t.scrubber.value(), 0.0); // the playhead stays
}

TEST(MovieScrubberHandles, DraggingHandlesIntoEachOtherKeepsTheMinimumLengthAndTheMovieBounds)
{
    Timeline t;
    t.scrubber.setMinimumTrimLength(5.0);
    t.pointer.drag(5, 900); // start far past the end handle
    EXPECT_DOUBLE_EQ(t.scrubber.editingStartValue(), 35.0);
    EXPECT_DOUBLE_EQ(t.scrubber.editingEndValue(), 40.0);

    t.pointer.drag(415, -400); // end far left: held by the start handle
    EXPECT_DOUBLE_EQ(t.scrubber.editingEndValue(), 40.0);

    t.pointer.drag(355, -400); // start grip at x 350 .. 360, far left
    EXPECT_DOUBLE_EQ(t.scrubber.editingStartValue(), 0.0);
    t.pointer.drag(415, -400); // now the end can follow down to 5 s
    EXPECT_DOUBLE_EQ(t.scrubber.editingEndValue(), 5.0);
    EXPECT_EQ(t.recorder.calls, (QStringList{"beginEditing", "start 35", "start 0", "end 5"}));

    t.scrubber.setEditingRange(-3.0, 1.0); // the owner's range obeys the same rules
    EXPECT_DOUBLE_EQ(t.scrubber.editingStartValue(), 0.0);
    EXPECT_DOUBLE_EQ(t.scrubber.editingEndValue(), 5.0);
}

TEST(MovieScrubberHandles, GripsAreGrabbedBesideTheirDrawnWidthAndShowAResizeCursor)
{
    Timeline t;
    t.pointer.hover(16); // 6 points inside the range, still the start grip's grab area
    EXPECT_EQ(t.scrubber.cursor().shape(), Qt::SizeHorCursor);
    t.pointer.hover(200);
    EXPECT_EQ(t.scrubber.cursor().shape(), Qt::ArrowCursor);
    t.pointer.press(16);
    t.pointer.release(16);
    EXPECT_EQ(t.recorder.calls, QStringList{"beginEditing"});

    // Close together, the grip on the pointer's side of the range's middle wins.
    t.scrubber.setEditingRange(20.0, 21.0); // lines at x 210 and 220
    t.pointer.drag(214, 204);
    t.pointer.drag(216, 236);
    EXPECT_DOUBLE_EQ(t.scrubber.editingStartValue(), 19.0);
    EXPECT_DOUBLE_EQ(t.scrubber.editingEndValue(), 23.0);
}

TEST(MovieScrubberHandles, WithoutEditingAllowedAPressOnAGripScrubsThePlayhead)
{
    Timeline t;
    t.scrubber.setEditable(false);
    t.scrubber.setValue(20.0);
    t.pointer.drag(5, 110); // where the start grip would be
    EXPECT_EQ(t.recorder.calls, (QStringList{"beginScrub 0", "value 0", "value 10", "endScrub 0"}));
    t.scrubber.setEditing(true, false);
    EXPECT_FALSE(t.scrubber.isEditing());
}

TEST(MovieScrubberHandles, SetEditingFalseKeepsTheRangeAndTheNextGrabEntersEditingAgain)
{
    Timeline t;
    t.pointer.drag(5, 55);
    t.scrubber.setEditing(false, true);
    EXPECT_FALSE(t.scrubber.isEditing());
    EXPECT_DOUBLE_EQ(t.scrubber.editingStartValue(), 5.0);
    EXPECT_DOUBLE_EQ(t.scrubber.editingEndValue(), 40.0);
    t.pointer.drag(55, 65);
    EXPECT_EQ(t.recorder.calls, (QStringList{"beginEditing", "start 5", "beginEditing", "start 6"}));
}

TEST(MovieScrubberHandles, EscapeWhileEditingLeavesTheDecisionToTheDelegate)
{
    Timeline t;
    t.pointer.key(Qt::Key_Escape); // not editing: nothing to cancel
    t.pointer.drag(5, 25);
    t.pointer.key(Qt::Key_Escape);
    EXPECT_TRUE(t.scrubber.isEditing()); // this delegate does not leave

    t.recorder.onCancel = [](MovieScrubber *s) { s->setEditing(false, true); };
    t.pointer.press(25); // a handle is held while Escape comes
    t.pointer.key(Qt::Key_Escape);
    t.pointer.move(125); // the abandoned drag moves nothing
    t.pointer.release(125);
    EXPECT_FALSE(t.scrubber.isEditing());
    EXPECT_DOUBLE_EQ(t.scrubber.editingStartValue(), 2.0);
    EXPECT_EQ(t.recorder.calls, (QStringList{"beginEditing", "start 2", "cancel", "cancel"}));
}

TEST(MovieScrubberHandles, ReloadResetsTheRangeOnlyForAMovieOfAnotherDuration)
{
    Timeline t;
    t.pointer.drag(5, 105);
    t.recorder.calls.clear();
    t.scrubber.reloadData(); // same movie, e.g. after a rotation
    EXPECT_DOUBLE_EQ(t.scrubber.editingStartValue(), 10.0);

    t.recorder.duration = 30.0; // the trimmed movie
    t.scrubber.setValue(35.0);
    t.scrubber.reloadData();
    EXPECT_DOUBLE_EQ(t.scrubber.editingStartValue(), 0.0);
    EXPECT_DOUBLE_EQ(t.scrubber.editingEndValue(), 30.0);
    EXPECT_DOUBLE_EQ(t.scrubber.value(), 30.0);
    EXPECT_TRUE(t.recorder.calls.isEmpty());
}

TEST(MovieScrubberHandles, PointerAndKeysAreSafeWithoutADelegate)
{
    Timeline t;
    t.scrubber.setDelegate(nullptr);
    t.pointer.drag(5, 105);
    t.pointer.drag(300, 210);
    t.pointer.key(Qt::Key_Escape);
    t.pointer.key(Qt::Key_End);
    EXPECT_TRUE(t.scrubber.isEditing());
    EXPECT_DOUBLE_EQ(t.scrubber.editingStartValue(), 10.0);
    EXPECT_DOUBLE_EQ(t.scrubber.value(), 40.0);
}

} // namespace
} // namespace zaf::ui
