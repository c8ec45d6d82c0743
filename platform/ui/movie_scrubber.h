#pragma once

// MovieScrubber: the timeline of the editor. A strip of thumbnails (asked from its data source), a
// draggable playhead, and in editing two trim handles that select a range at least the minimum trim
// length long. Dragging a handle first enters editing; holding a handle still for the zoom delay
// zooms the strip in around it for fine trimming. Keyboard: Left/Right step the playhead one frame
// (1/30 s), Shift with them one second; Home/End jump; Escape asks the delegate to cancel editing.
// Main thread only: every delegate and data-source call below is made on the main thread, from
// within the user's event, a resize, the zoom timer or reloadData(); the widget itself must only
// be used from the main thread.
//
// Order of calls: reloadData() asks the data source for the duration, then the thumbnail aspect
// ratio, then the timestamps for the number of thumbnails that fit, then one thumbnail request per
// timestamp; images arrive later through setThumbnailImageForTimestamp(). A playhead drag:
// DidBeginScrubbing, ValueDidChange for each move, DidEndScrubbing. A handle drag outside editing:
// DidBeginEditing, then EditingStart/EndValueDidChange for each move.

#include "platform/ui/timeline_model.h" // MovieScrubberHandle

#include <QImage>
#include <QList>
#include <QRectF>
#include <QWidget>

#include <memory>

namespace zaf::ui {

class MovieScrubber;
class TimelineTimer;

// Every operation is optional; the defaults do nothing. All are called on the main thread, from
// within the scrubber's own event handling or reloadData(); a delegate may call back into the
// scrubber (setValue, setEditing, reloadData) from any of them.
class MovieScrubberDelegate {
public:
    virtual ~MovieScrubberDelegate() = default;
    // Optional, main thread. The user moved the playhead (drag or key) to the value in seconds.
    virtual void movieScrubberValueDidChange(MovieScrubber *, double) {}
    // Optional, main thread. A playhead drag or key step begins / ends (the handle is Playhead).
    virtual void movieScrubberDidBeginScrubbingWithHandle(MovieScrubber *, MovieScrubberHandle) {}
    virtual void movieScrubberDidEndScrubbingWithHandle(MovieScrubber *, MovieScrubberHandle) {}
    // Optional, main thread. The user moved a trim handle; the value already respects the bounds
    // and the minimum trim length.
    virtual void movieScrubberEditingStartValueDidChange(MovieScrubber *, double) {}
    virtual void movieScrubberEditingEndValueDidChange(MovieScrubber *, double) {}
    // Optional, main thread. The user grabbed a trim handle while not editing; isEditing() is
    // already true.
    virtual void movieScrubberDidBeginEditing(MovieScrubber *) {}
    // Optional, main thread. The user asked to cancel editing (Escape); the delegate decides (it
    // normally calls setEditing(false, true)).
    virtual void movieScrubberDidCancelEditing(MovieScrubber *) {}
    // Optional, main thread. Bracket each batch of thumbnail requests (reloadData, a new width, a
    // zoom in or out); not called when a batch would be empty.
    virtual void movieScrubberWillBeginRequestingThumbnails(MovieScrubber *) {}
    virtual void movieScrubberDidFinishRequestingThumbnails(MovieScrubber *) {}
};

// Every operation is required. All are called on the main thread, from reloadData() or when the
// strip is laid out again (new width, zoom in or out).
class MovieScrubberDataSource {
public:
    virtual ~MovieScrubberDataSource() = default;
    // Required, main thread, first call of reloadData(). Seconds; NaN while unknown (the strip
    // stays empty and nothing more is asked).
    virtual double movieScrubberDuration(MovieScrubber *) = 0;
    // Required, main thread, after the duration. Width / height of a thumbnail; anything not
    // finite and positive counts as 1.
    virtual double movieScrubberThumbnailAspectRatio(MovieScrubber *) = 0;
    // Required, main thread. The timestamps of `count` thumbnails over the visible window
    // start .. end; the list may be shorter than count (the slots left over stay empty).
    virtual QList<double> movieScrubberEvenlySpacedTimestampsStartingAtEndingAt(MovieScrubber *, int count,
                                                                                 double start, double end) = 0;
    // Required, main thread, once per timestamp of the list just returned. The image comes back
    // later, or right away, through setThumbnailImageForTimestamp().
    virtual void movieScrubberRequestThumbnailImageForTimestamp(MovieScrubber *, double timestamp) = 0;
};

class MovieScrubber : public QWidget {
    Q_OBJECT
public:
    explicit MovieScrubber(QWidget *parent = nullptr);
    ~MovieScrubber() override;

    // Not owned; cleared automatically by nobody: the owner clears them before it goes away.
    void setDelegate(MovieScrubberDelegate *delegate);
    MovieScrubberDelegate *delegate() const;
    void setDataSource(MovieScrubberDataSource *dataSource);
    MovieScrubberDataSource *dataSource() const;

    // Defaults: minimum trim length 1 s, editable, zoom delay 0.5 s, edge inset 10 points.
    // A zoom delay of zero or less turns zooming off. The edge inset leaves room for the grips of
    // handles that sit at the very start or end.
    void setMinimumTrimLength(double seconds);
    double minimumTrimLength() const;
    void setEditable(bool editable);
    bool isEditable() const;
    void setZoomDelay(double seconds);
    double zoomDelay() const;
    // The timer that measures the zoom delay (a QTimer unless replaced; tests pass one they fire by
    // hand). Null keeps the current one.
    void setZoomTimer(std::unique_ptr<TimelineTimer> timer);
    void setEdgeInset(double points);
    double edgeInset() const;

    // The playhead, in seconds, kept within 0 .. duration. Setting it never calls the delegate.
    void setValue(double seconds);
    double value() const;
    // The trim range, in seconds. It becomes 0 .. duration when reloadData() finds a duration
    // different from the one the range was made for (the first movie, a trimmed movie), and is
    // otherwise kept, clamped to 0 .. duration and at least the minimum trim length long.
    // setEditingRange() applies the same rules and never calls the delegate.
    double editingStartValue() const;
    double editingEndValue() const;
    void setEditingRange(double start, double end);
    // Puts one trim handle at a time as the user would (the keyboard's trim keys): the other
    // handle makes way when the minimum trim length needs it, and the delegate hears of every
    // handle that moved, the start's change before the end's. Nothing before the duration is
    // known, for the playhead, or for NaN.
    void moveEditingHandleTo(MovieScrubberHandle handle, double seconds);
    // Editing shows the handles highlighted and dims the movie outside the range. Entering or
    // leaving it through these calls never calls the delegate; leaving keeps the range.
    bool isEditing() const;
    void setEditing(bool editing, bool animated);
    // True while a held handle has zoomed the strip in.
    bool isZoomed() const;

    // Steps the playhead for Left/Right (Shift: one second), Home or End as a short scrub, as the
    // keyboard does when the timeline has focus; false (nothing done) for other keys, while a drag
    // runs or before the duration is known. Lets a window's shortcuts drive the timeline.
    bool stepPlayheadForKey(int key, Qt::KeyboardModifiers modifiers);

    // Forgets the thumbnails and asks the data source again from the start.
    void reloadData();
    // A thumbnail for a timestamp the scrubber asked for; a null image is ignored.
    void setThumbnailImageForTimestamp(const QImage &image, double timestamp);
    // Timestamps currently laid out in the strip, and the ones that have an image (tests).
    QList<double> thumbnailTimestamps() const;
    int thumbnailImageCount() const;

    // The part of the movie the strip shows right now, in seconds: 0 .. duration, or the zoomed
    // window (values in between while the zoom animates).
    double visibleStartValue() const;
    double visibleEndValue() const;
    // Where the thumbnails are drawn, in logical coordinates: the widget inset by edgeInset() on
    // the left and right and by a small margin at the top and bottom. Its left edge is 0 s of the
    // visible window, its right edge the end of it.
    QRectF thumbnailStripRect() const;

    QSize sizeHint() const override;
    QSize minimumSizeHint() const override;

protected:
    void paintEvent(QPaintEvent *event) override;
    void resizeEvent(QResizeEvent *event) override;
    void mousePressEvent(QMouseEvent *event) override;
    void mouseMoveEvent(QMouseEvent *event) override;
    void mouseReleaseEvent(QMouseEvent *event) override;
    void keyPressEvent(QKeyEvent *event) override;
    void leaveEvent(QEvent *event) override;
    void hideEvent(QHideEvent *event) override;
    void focusInEvent(QFocusEvent *event) override;
    void focusOutEvent(QFocusEvent *event) override;

Q_SIGNALS:
    // Main thread: an image for a timestamp the scrubber asked for was accepted.
    void thumbnailImageReceived(double timestamp);

private:
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::ui
