#include "platform/ui/movie_scrubber.h"

#include "platform/ui/timeline_animations.h"
#include "platform/ui/timeline_model.h"
#include "platform/ui/timeline_painter.h"
#include "platform/ui/timeline_thumbnails.h"
#include "platform/ui/timeline_timer.h"

#include <QKeyEvent>
#include <QMouseEvent>
#include <QPainter>

#include <algorithm>
#include <cmath>
#include <limits>

namespace zaf::ui {

namespace {

constexpr double kPlayheadSlop = 5.0; // a press this close grabs the playhead where it is

} // namespace

struct MovieScrubber::Private {
    enum class Drag { None, Playhead, Handle, Abandoned };

    MovieScrubber *q;
    MovieScrubberDelegate *delegate = nullptr;
    MovieScrubberDataSource *dataSource = nullptr;

    bool editable = true;
    double zoomDelay = 0.5;
    double edgeInset = 10.0;

    TimelineModel model;
    double aspectRatio = 1.0;
    TimelineThumbnails thumbnails;
    int requestBatch = 0;

    bool editing = false;
    TimelineAnimations animations{[this] { q->update(); }, [this] { dropBackdropIfCovered(); }};
    TimelineHold hold{[this] { zoomIn(); }};

    Drag drag = Drag::None;
    MovieScrubberHandle dragged = MovieScrubberHandle::Start; // the handle of a Handle drag
    double grabOffset = 0.0;
    MovieScrubberHandle hovered = MovieScrubberHandle::Playhead; // Playhead: no handle hovered

    explicit Private(MovieScrubber *owner) : q(owner) {}

    QRectF strip() const { return timelineStripRect(q->size(), edgeInset); }
    TimelineScale scale() const { return TimelineScale{strip(), animations.shownWindow()}; }
    double xForValue(double t) const { return scale().xForValue(t); }
    double valueForX(double x) const { return model.clampToMovie(scale().valueForX(x)); }
    bool draggingHandle() const { return drag == Drag::Handle; }

    // Pixel-aligned so thin lines stay crisp at any device pixel ratio.
    double snap(double x) const
    {
        const double dpr = q->devicePixelRatioF();
        return std::round(x * dpr) / dpr;
    }

    void reload()
    {
        thumbnails.clear();
        hold.stop();
        model.load(dataSource ? dataSource->movieScrubberDuration(q) : std::numeric_limits<double>::quiet_NaN());
        animations.showWindow(model.fullWindow(), false);
        if (!model.hasDuration())
            return;
        aspectRatio = dataSource->movieScrubberThumbnailAspectRatio(q);
        relayout(true);
    }

    // Lays the strip out for the current width and window, asking for timestamps and thumbnails
    // when the slots differ from the ones laid out (always when `force`).
    void relayout(bool force)
    {
        if (!dataSource || !model.hasDuration()) {
            thumbnails.clearSlots();
            return;
        }
        const ThumbnailSlots next = ThumbnailSlots::fit(strip(), aspectRatio, model.layoutWindow());
        q->update();
        if (!thumbnails.layOut(next, force))
            return;
        const QList<double> timestamps = dataSource->movieScrubberEvenlySpacedTimestampsStartingAtEndingAt(
            q, next.count, next.window.start, next.window.end);
        thumbnails.setTimestamps(timestamps);
        if (timestamps.isEmpty())
            return;
        const int batch = ++requestBatch;
        if (delegate)
            delegate->movieScrubberWillBeginRequestingThumbnails(q);
        for (double t : timestamps) {
            // A callback that reloaded or laid out again has asked for its own batch already.
            if (!dataSource || batch != requestBatch)
                break;
            dataSource->movieScrubberRequestThumbnailImageForTimestamp(q, t);
        }
        if (delegate)
            delegate->movieScrubberDidFinishRequestingThumbnails(q);
    }

    void dropBackdropIfCovered()
    {
        if (!animations.isSliding())
            thumbnails.dropBackdropIfCovered();
    }

    MovieScrubberHandle handleAt(const QPointF &pos) const
    {
        if (!editable || !model.hasDuration())
            return MovieScrubberHandle::Playhead;
        return timelineGripAt(pos.x(), xForValue(model.start()), xForValue(model.end()));
    }

    // Tells the delegate of each handle that has moved since the range was oldStart .. oldEnd.
    void reportRangeChanges(double oldStart, double oldEnd)
    {
        q->update();
        if (!delegate)
            return;
        // The delegate may change the range from its callback; each call reports the value it moved to.
        const double start = model.start(), end = model.end();
        if (start != oldStart)
            delegate->movieScrubberEditingStartValueDidChange(q, start);
        if (end != oldEnd)
            delegate->movieScrubberEditingEndValueDidChange(q, end);
    }

    // A pointer move of the playhead, reported when it changes the value.
    void scrubTo(double x)
    {
        const double target = valueForX(x);
        if (target == model.value())
            return;
        setValueQuietly(target);
        if (delegate)
            delegate->movieScrubberValueDidChange(q, model.value());
    }

    // A key step: the same calls as a very short drag.
    void stepTo(double target)
    {
        if (target == model.value())
            return;
        if (delegate)
            delegate->movieScrubberDidBeginScrubbingWithHandle(q, MovieScrubberHandle::Playhead);
        setValueQuietly(target);
        if (delegate)
            delegate->movieScrubberValueDidChange(q, model.value());
        if (delegate)
            delegate->movieScrubberDidEndScrubbingWithHandle(q, MovieScrubberHandle::Playhead);
    }

    void setValueQuietly(double v)
    {
        const double oldValue = model.value();
        model.setValue(v);
        if (model.value() == oldValue)
            return;
        // Only the two narrow columns change; playback moves the playhead 30 times a second.
        for (double x : {xForValue(oldValue), xForValue(model.value())})
            q->update(QRectF(x - 8, 0, 16, q->height()).toAlignedRect());
    }

    void updateHover(const QPointF &pos)
    {
        const MovieScrubberHandle h = handleAt(pos);
        if (h != hovered) {
            hovered = h;
            q->update();
        }
        if (h == MovieScrubberHandle::Playhead)
            q->unsetCursor();
        else
            q->setCursor(Qt::SizeHorCursor);
    }

    // Animated only where it can be seen.
    void setEditingLook(bool on, bool animated) { animations.setEditingLook(on, animated && q->isVisible()); }
    void slideTo(const TimelineWindow &target) { animations.showWindow(target, q->isVisible()); }

    // Once zoomed, holding still zooms no further.
    double holdDelay() const { return model.isZoomed() ? 0.0 : zoomDelay; }

    // Zooms in around the held handle; the handle keeps its place on screen, under the pointer.
    void zoomIn()
    {
        if (!draggingHandle() || !model.zoomIn(model.handleValue(dragged), animations.shownWindow()))
            return;
        slideTo(model.layoutWindow());
        relayout(true);
    }

    void zoomOut()
    {
        hold.stop();
        if (!model.zoomOut())
            return;
        slideTo(model.fullWindow());
        relayout(true);
    }

    // A handle drag lets go of the pointer until the button comes up.
    void abandonHandleDrag()
    {
        if (!draggingHandle())
            return;
        drag = Drag::Abandoned;
        zoomOut();
    }

    // Ends whatever the pointer was doing, with the calls that close it.
    void finishDrag()
    {
        const Drag was = drag;
        drag = Drag::None;
        hold.stop();
        if (was == Drag::Playhead) {
            if (delegate)
                delegate->movieScrubberDidEndScrubbingWithHandle(q, MovieScrubberHandle::Playhead);
        } else if (was != Drag::None) {
            zoomOut();
        }
    }
};

MovieScrubber::MovieScrubber(QWidget *parent) : QWidget(parent), d(std::make_unique<Private>(this))
{
    setFocusPolicy(Qt::StrongFocus);
    setMouseTracking(true);
    setSizePolicy(QSizePolicy::Expanding, QSizePolicy::Fixed);
    setAccessibleName(tr("Timeline"));
}

MovieScrubber::~MovieScrubber() = default;

void MovieScrubber::setDelegate(MovieScrubberDelegate *delegate) { d->delegate = delegate; }
MovieScrubberDelegate *MovieScrubber::delegate() const { return d->delegate; }
void MovieScrubber::setDataSource(MovieScrubberDataSource *dataSource) { d->dataSource = dataSource; }
MovieScrubberDataSource *MovieScrubber::dataSource() const { return d->dataSource; }

void MovieScrubber::setMinimumTrimLength(double seconds)
{
    d->model.setMinimumTrimLength(seconds);
    update();
}
double MovieScrubber::minimumTrimLength() const { return d->model.minimumTrimLength(); }

void MovieScrubber::setEditable(bool editable)
{
    if (d->editable == editable)
        return;
    d->editable = editable;
    if (!editable) {
        d->abandonHandleDrag();
        d->editing = false;
        d->setEditingLook(false, false);
        d->hovered = MovieScrubberHandle::Playhead;
        unsetCursor();
    }
    update();
}
bool MovieScrubber::isEditable() const { return d->editable; }

void MovieScrubber::setZoomDelay(double seconds) { d->zoomDelay = seconds; }
double MovieScrubber::zoomDelay() const { return d->zoomDelay; }

void MovieScrubber::setZoomTimer(std::unique_ptr<TimelineTimer> timer) { d->hold.setTimer(std::move(timer)); }

void MovieScrubber::setEdgeInset(double points)
{
    d->edgeInset = std::isfinite(points) ? std::max(0.0, points) : 0.0;
    d->relayout(false);
    update();
}
double MovieScrubber::edgeInset() const { return d->edgeInset; }

void MovieScrubber::setValue(double seconds) { d->setValueQuietly(seconds); }
double MovieScrubber::value() const { return d->model.value(); }

double MovieScrubber::editingStartValue() const { return d->model.start(); }
double MovieScrubber::editingEndValue() const { return d->model.end(); }

void MovieScrubber::setEditingRange(double start, double end)
{
    d->model.setRange(start, end);
    update();
}

void MovieScrubber::moveEditingHandleTo(MovieScrubberHandle handle, double seconds)
{
    const double oldStart = d->model.start(), oldEnd = d->model.end();
    d->model.moveHandleTo(handle, seconds);
    d->reportRangeChanges(oldStart, oldEnd);
}

bool MovieScrubber::isEditing() const { return d->editing; }

void MovieScrubber::setEditing(bool editing, bool animated)
{
    if ((editing && !d->editable) || editing == d->editing)
        return;
    d->editing = editing;
    if (!editing)
        d->abandonHandleDrag();
    d->setEditingLook(editing, animated);
}

bool MovieScrubber::isZoomed() const { return d->model.isZoomed(); }

void MovieScrubber::reloadData() { d->reload(); }

void MovieScrubber::setThumbnailImageForTimestamp(const QImage &image, double timestamp)
{
    if (!d->thumbnails.accept(image, timestamp))
        return;
    d->dropBackdropIfCovered();
    update();
    Q_EMIT thumbnailImageReceived(timestamp);
}

QList<double> MovieScrubber::thumbnailTimestamps() const { return d->thumbnails.slots().timestamps; }
int MovieScrubber::thumbnailImageCount() const { return d->thumbnails.imageCount(); }

double MovieScrubber::visibleStartValue() const { return d->animations.shownWindow().start; }
double MovieScrubber::visibleEndValue() const { return d->animations.shownWindow().end; }
QRectF MovieScrubber::thumbnailStripRect() const { return d->strip(); }

QSize MovieScrubber::sizeHint() const { return QSize(320, 38); }
QSize MovieScrubber::minimumSizeHint() const { return QSize(int(2 * d->edgeInset) + 40, 24); }

void MovieScrubber::paintEvent(QPaintEvent *)
{
    QPainter p(this);
    p.setRenderHint(QPainter::Antialiasing);
    p.setRenderHint(QPainter::SmoothPixmapTransform);
    const TimelineScale scale = d->scale();
    paintTimelineThumbnails(p, d->thumbnails, scale);

    if (d->model.hasDuration()) {
        if (d->editable) {
            const auto active = [this](MovieScrubberHandle h) {
                return d->hovered == h || (d->draggingHandle() && d->dragged == h);
            };
            paintTimelineTrimFrame(p, scale.strip,
                                   TrimFrameLook{d->snap(scale.xForValue(d->model.start())),
                                                 d->snap(scale.xForValue(d->model.end())), d->animations.editingLook(),
                                                 active(MovieScrubberHandle::Start), active(MovieScrubberHandle::End)});
        }
        paintTimelinePlayhead(p, scale.strip, d->snap(scale.xForValue(d->model.value())));
    }

    if (hasFocus())
        paintTimelineFocusRing(p, rect(), palette().color(QPalette::Highlight));
}

void MovieScrubber::resizeEvent(QResizeEvent *event)
{
    QWidget::resizeEvent(event);
    d->relayout(false);
}

void MovieScrubber::mousePressEvent(QMouseEvent *event)
{
    if (event->button() != Qt::LeftButton || !d->model.hasDuration() || d->drag != Private::Drag::None) {
        event->ignore();
        return;
    }
    event->accept();
    const QPointF pos = event->position();
    const MovieScrubberHandle handle = d->handleAt(pos);
    if (handle != MovieScrubberHandle::Playhead) {
        d->drag = Private::Drag::Handle;
        d->dragged = handle;
        d->grabOffset = pos.x() - d->xForValue(d->model.handleValue(handle));
        setCursor(Qt::SizeHorCursor);
        if (!d->editing) {
            d->editing = true;
            d->setEditingLook(true, true);
            if (d->delegate)
                d->delegate->movieScrubberDidBeginEditing(this);
            if (!d->editing) { // the delegate declined
                d->drag = Private::Drag::Abandoned;
                return;
            }
        }
        d->hold.restart(pos, d->holdDelay());
        update();
        return;
    }

    d->drag = Private::Drag::Playhead;
    const double playheadX = d->xForValue(d->model.value());
    d->grabOffset = std::abs(pos.x() - playheadX) <= kPlayheadSlop ? pos.x() - playheadX : 0.0;
    if (d->delegate)
        d->delegate->movieScrubberDidBeginScrubbingWithHandle(this, MovieScrubberHandle::Playhead);
    if (d->drag == Private::Drag::Playhead)
        d->scrubTo(pos.x() - d->grabOffset);
}

void MovieScrubber::mouseMoveEvent(QMouseEvent *event)
{
    const QPointF pos = event->position();
    switch (d->drag) {
    case Private::Drag::None:
        d->updateHover(pos);
        return;
    case Private::Drag::Abandoned:
        return;
    case Private::Drag::Playhead:
        d->scrubTo(pos.x() - d->grabOffset);
        return;
    case Private::Drag::Handle: {
        d->hold.moved(pos, d->holdDelay());
        const double oldStart = d->model.start(), oldEnd = d->model.end();
        if (d->model.dragHandleTo(d->dragged, d->valueForX(pos.x() - d->grabOffset)))
            d->reportRangeChanges(oldStart, oldEnd);
        return;
    }
    }
}

void MovieScrubber::mouseReleaseEvent(QMouseEvent *event)
{
    if (event->button() != Qt::LeftButton || d->drag == Private::Drag::None) {
        event->ignore();
        return;
    }
    event->accept();
    d->finishDrag();
    d->updateHover(event->position());
    update();
}

void MovieScrubber::keyPressEvent(QKeyEvent *event)
{
    if (event->key() == Qt::Key_Escape) {
        if (!d->editing) {
            event->ignore();
            return;
        }
        event->accept();
        if (d->delegate)
            d->delegate->movieScrubberDidCancelEditing(this);
        return;
    }
    if (stepPlayheadForKey(event->key(), event->modifiers()))
        event->accept();
    else
        QWidget::keyPressEvent(event);
}

bool MovieScrubber::stepPlayheadForKey(int key, Qt::KeyboardModifiers modifiers)
{
    const std::optional<double> target = d->model.keyStepTarget(key, modifiers);
    if (!target || d->drag != Private::Drag::None)
        return false;
    d->stepTo(*target);
    return true;
}

void MovieScrubber::leaveEvent(QEvent *event)
{
    QWidget::leaveEvent(event);
    if (d->drag == Private::Drag::None && d->hovered != MovieScrubberHandle::Playhead) {
        d->hovered = MovieScrubberHandle::Playhead;
        unsetCursor();
        update();
    }
}

void MovieScrubber::hideEvent(QHideEvent *event)
{
    QWidget::hideEvent(event);
    // A hidden widget gets no button release; close the gesture so the owner is not left scrubbing.
    if (d->drag != Private::Drag::None)
        d->finishDrag();
}

void MovieScrubber::focusInEvent(QFocusEvent *event)
{
    QWidget::focusInEvent(event);
    update();
}

void MovieScrubber::focusOutEvent(QFocusEvent *event)
{
    QWidget::focusOutEvent(event);
    update();
}

} // namespace zaf::ui
