#include "platform/ui/movie_scrubber.h"

#include <QEasingCurve>
#include <QKeyEvent>
#include <QLineF>
#include <QMouseEvent>
#include <QPainter>
#include <QPainterPath>
#include <QTimer>
#include <QVariantAnimation>

#include <algorithm>
#include <cmath>
#include <limits>
#include <map>
#include <set>

namespace zaf::ui {

namespace {

constexpr double kStripVerticalMargin = 2.0; // points above and below the thumbnails
constexpr double kGripWidth = 10.0;          // drawn width of a trim handle
constexpr double kGripSlop = 8.0;            // extra grab width on each side of a grip
constexpr double kPlayheadSlop = 5.0;        // a press this close grabs the playhead where it is
constexpr double kStillDistance = 3.0;       // pointer movement that still counts as holding still
constexpr double kFrameThickness = 2.0;      // top and bottom bars of the range frame
constexpr double kFrameStep = 1.0 / 30.0;    // Left/Right
constexpr double kLongStep = 1.0;            // Shift+Left/Right
constexpr int kMaximumThumbnails = 256;
constexpr int kZoomAnimationMs = 220;
constexpr int kEditingAnimationMs = 180;

bool isValidDuration(double d)
{
    return std::isfinite(d) && d > 0.0;
}

struct Window {
    double start = 0.0;
    double end = 0.0;
    double length() const { return end - start; }
    bool operator==(const Window &other) const = default;
};

// One laid-out strip: `count` slots of `slotFraction` of the strip width each, covering `window`
// from the left edge, and the timestamps the data source gave for them (slot i shows timestamp i).
struct Layout {
    Window window;
    int count = 0;
    double slotFraction = 0.0;
    QList<double> timestamps;
};

QColor mix(const QColor &a, const QColor &b, double t)
{
    return QColor::fromRgbF(float(a.redF() + (b.redF() - a.redF()) * t), float(a.greenF() + (b.greenF() - a.greenF()) * t),
                            float(a.blueF() + (b.blueF() - a.blueF()) * t),
                            float(a.alphaF() + (b.alphaF() - a.alphaF()) * t));
}

// The centred part of an image of `size` that has the aspect ratio of `target` (aspect fill).
QRectF aspectFillSource(const QSize &size, const QSizeF &target)
{
    const double iw = size.width(), ih = size.height();
    if (target.width() <= 0 || target.height() <= 0 || iw <= 0 || ih <= 0)
        return QRectF(0, 0, iw, ih);
    const double targetAspect = target.width() / target.height();
    if (iw / ih > targetAspect) {
        const double w = ih * targetAspect;
        return QRectF((iw - w) / 2.0, 0, w, ih);
    }
    const double h = iw / targetAspect;
    return QRectF(0, (ih - h) / 2.0, iw, h);
}

} // namespace

struct MovieScrubber::Private {
    enum class Drag { None, Playhead, Start, End, Abandoned };

    MovieScrubber *q;
    MovieScrubberDelegate *delegate = nullptr;
    MovieScrubberDataSource *dataSource = nullptr;

    double minimumTrimLength = 1.0;
    bool editable = true;
    double zoomDelay = 0.5;
    double edgeInset = 10.0;

    double duration = std::numeric_limits<double>::quiet_NaN();
    double aspectRatio = 1.0;
    double value = 0.0;
    double start = 0.0;
    double end = 0.0;
    // The duration the range was made for; a reload with another duration resets the range.
    double rangeDuration = std::numeric_limits<double>::quiet_NaN();
    bool rangeFromOwner = false;

    bool editing = false;
    double editingLook = 0.0; // 0 plain handles .. 1 editing handles, animated
    QVariantAnimation *editingAnimation = nullptr;

    bool zoomed = false;
    Window zoomWindow;
    Window display;        // the window drawn right now
    Window animationFrom;  // the zoom animation runs from here to animationTo
    Window animationTo;
    QVariantAnimation *zoomAnimation = nullptr;
    QTimer *zoomTimer = nullptr;
    QPointF stillSince;    // where the pointer was when the zoom timer last (re)started

    Layout layout;
    Layout backdrop;       // the previous layout, drawn under the current one until it is complete
    std::set<double> asked;
    int requestBatch = 0;
    std::map<double, QImage> images;

    Drag drag = Drag::None;
    double grabOffset = 0.0;
    MovieScrubberHandle hovered = MovieScrubberHandle::Playhead; // Playhead: no handle hovered

    explicit Private(MovieScrubber *owner) : q(owner) {}

    bool hasDuration() const { return isValidDuration(duration); }
    Window fullWindow() const { return Window{0.0, hasDuration() ? duration : 0.0}; }
    Window layoutWindow() const { return zoomed ? zoomWindow : fullWindow(); }

    QRectF strip() const
    {
        const double margin = q->height() >= 4 * kStripVerticalMargin + 8 ? kStripVerticalMargin : 0.0;
        return QRectF(edgeInset, margin, q->width() - 2.0 * edgeInset, q->height() - 2.0 * margin);
    }

    double xForValue(double t) const
    {
        const QRectF s = strip();
        if (display.length() <= 0)
            return s.left();
        return s.left() + (t - display.start) / display.length() * s.width();
    }

    double valueForX(double x) const
    {
        const QRectF s = strip();
        if (s.width() <= 0 || display.length() <= 0)
            return display.start;
        const double fraction = std::clamp((x - s.left()) / s.width(), 0.0, 1.0);
        return std::clamp(display.start + fraction * display.length(), 0.0, duration);
    }

    // Pixel-aligned so thin lines stay crisp at any device pixel ratio.
    double snap(double x) const
    {
        const double dpr = q->devicePixelRatioF();
        return std::round(x * dpr) / dpr;
    }

    // ----- data

    void reload()
    {
        images.clear();
        asked.clear();
        layout = Layout{};
        backdrop = Layout{};
        zoomed = false;
        zoomTimer->stop();
        zoomAnimation->stop();
        duration = std::numeric_limits<double>::quiet_NaN();
        if (dataSource)
            duration = dataSource->movieScrubberDuration(q);
        display = fullWindow();
        if (!hasDuration()) {
            q->update();
            return;
        }
        const double aspect = dataSource->movieScrubberThumbnailAspectRatio(q);
        aspectRatio = std::isfinite(aspect) && aspect > 0.0 ? aspect : 1.0;

        if (!rangeFromOwner && rangeDuration != duration) {
            start = 0.0;
            end = duration;
        }
        rangeFromOwner = false;
        rangeDuration = duration;
        constrainRange();
        value = std::clamp(value, 0.0, duration);
        relayout(true);
    }

    // Lays the strip out for the current width and window, asking for timestamps and thumbnails
    // when the slots differ from the ones laid out (always when `force`).
    void relayout(bool force)
    {
        if (!dataSource || !hasDuration()) {
            layout = Layout{};
            return;
        }
        const QRectF s = strip();
        int count = 0;
        double slotFraction = 0.0;
        if (s.width() > 0 && s.height() > 0) {
            const double thumbWidth = s.height() * aspectRatio;
            // A hair of tolerance so an exact fit does not become one extra slot through rounding.
            count = int(std::ceil(s.width() / thumbWidth - 1e-9));
            count = std::clamp(count, 1, kMaximumThumbnails);
            slotFraction = thumbWidth / s.width();
        }
        const Window window = layoutWindow();
        if (!force && count == layout.count && window == layout.window) {
            layout.slotFraction = slotFraction; // same timestamps, wider or narrower slots
            return;
        }
        if (layout.count > 0)
            backdrop = layout;
        layout = Layout{window, count, slotFraction, {}};
        if (count == 0) {
            q->update();
            return;
        }
        const QList<double> timestamps =
            dataSource->movieScrubberEvenlySpacedTimestampsStartingAtEndingAt(q, count, window.start, window.end);
        layout.timestamps = timestamps;
        for (double t : timestamps) {
            if (!std::isnan(t))
                asked.insert(t);
        }
        q->update();
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

    bool layoutComplete(const Layout &l) const
    {
        return std::all_of(l.timestamps.begin(), l.timestamps.end(),
                           [this](double t) { return images.count(t) > 0; });
    }

    void dropBackdropIfCovered()
    {
        if (backdrop.count > 0 && zoomAnimation->state() != QAbstractAnimation::Running && layoutComplete(layout))
            backdrop = Layout{};
    }

    // ----- range

    void constrainRange()
    {
        if (!hasDuration())
            return;
        const double minimum = std::min(minimumTrimLength, duration);
        start = std::clamp(start, 0.0, duration);
        end = std::clamp(end, 0.0, duration);
        if (end - start < minimum) {
            end = std::min(duration, start + minimum);
            start = std::max(0.0, end - minimum);
        }
    }

    double handleValue(MovieScrubberHandle h) const { return h == MovieScrubberHandle::Start ? start : end; }

    // The handle whose grip (widened by the slop) holds the point; between two overlapping grips,
    // the one on the pointer's side of the range's middle.
    MovieScrubberHandle handleAt(const QPointF &pos) const
    {
        if (!editable || !hasDuration())
            return MovieScrubberHandle::Playhead;
        const double xs = xForValue(start), xe = xForValue(end);
        const bool onStart = pos.x() >= xs - kGripWidth - kGripSlop && pos.x() <= xs + kGripSlop;
        const bool onEnd = pos.x() >= xe - kGripSlop && pos.x() <= xe + kGripWidth + kGripSlop;
        if (onStart && onEnd)
            return pos.x() < (xs + xe) / 2.0 ? MovieScrubberHandle::Start : MovieScrubberHandle::End;
        if (onStart)
            return MovieScrubberHandle::Start;
        if (onEnd)
            return MovieScrubberHandle::End;
        return MovieScrubberHandle::Playhead;
    }

    void moveHandle(MovieScrubberHandle h, double x)
    {
        const double t = valueForX(x);
        const double minimum = std::min(minimumTrimLength, duration);
        if (h == MovieScrubberHandle::Start) {
            const double next = std::clamp(t, 0.0, std::max(0.0, end - minimum));
            if (next == start)
                return;
            start = next;
            q->update();
            if (delegate)
                delegate->movieScrubberEditingStartValueDidChange(q, start);
        } else {
            const double next = std::clamp(t, std::min(duration, start + minimum), duration);
            if (next == end)
                return;
            end = next;
            q->update();
            if (delegate)
                delegate->movieScrubberEditingEndValueDidChange(q, end);
        }
    }

    // ----- editing and zoom

    void setEditingLook(bool on, bool animated)
    {
        editingAnimation->stop();
        const double target = on ? 1.0 : 0.0;
        if (!animated || !q->isVisible()) {
            editingLook = target;
            q->update();
            return;
        }
        editingAnimation->setStartValue(editingLook);
        editingAnimation->setEndValue(target);
        editingAnimation->start();
    }

    void animateDisplayTo(const Window &target, bool animated)
    {
        zoomAnimation->stop();
        if (!animated || !q->isVisible()) {
            display = target;
            dropBackdropIfCovered();
            q->update();
            return;
        }
        animationFrom = display;
        animationTo = target;
        zoomAnimation->start();
    }

    void restartZoomTimer(const QPointF &pos)
    {
        stillSince = pos;
        if (zoomed || zoomDelay <= 0.0 || !std::isfinite(zoomDelay)) {
            zoomTimer->stop();
            return;
        }
        zoomTimer->start(std::max(1, int(std::lround(zoomDelay * 1000.0))));
    }

    // Zooms in around the held handle: a window a tenth of the movie long (at least 2 s) placed
    // so that the handle keeps its place on screen, which keeps it under the pointer.
    void zoomIn()
    {
        if (zoomed || !hasDuration() || (drag != Drag::Start && drag != Drag::End))
            return;
        const double length = std::max(duration / 10.0, 2.0);
        if (length >= duration)
            return; // the whole movie already fits that window
        const double t = drag == Drag::Start ? start : end;
        const double fraction = display.length() > 0 ? (t - display.start) / display.length() : 0.0;
        const double windowStart = std::clamp(t - fraction * length, 0.0, duration - length);
        zoomWindow = Window{windowStart, windowStart + length};
        zoomed = true;
        animateDisplayTo(zoomWindow, true);
        relayout(true);
    }

    void zoomOut()
    {
        zoomTimer->stop();
        if (!zoomed)
            return;
        zoomed = false;
        animateDisplayTo(fullWindow(), true);
        relayout(true);
    }

    // Ends whatever the pointer was doing, with the calls that close it.
    void finishDrag()
    {
        const Drag was = drag;
        drag = Drag::None;
        zoomTimer->stop();
        if (was == Drag::Playhead) {
            if (delegate)
                delegate->movieScrubberDidEndScrubbingWithHandle(q, MovieScrubberHandle::Playhead);
        } else if (was != Drag::None) {
            zoomOut();
        }
    }

    // A key step: the same calls as a very short drag.
    void stepTo(double target)
    {
        target = std::clamp(target, 0.0, duration);
        if (target == value)
            return;
        if (delegate)
            delegate->movieScrubberDidBeginScrubbingWithHandle(q, MovieScrubberHandle::Playhead);
        setValueQuietly(target);
        if (delegate)
            delegate->movieScrubberValueDidChange(q, value);
        if (delegate)
            delegate->movieScrubberDidEndScrubbingWithHandle(q, MovieScrubberHandle::Playhead);
    }

    void setValueQuietly(double v)
    {
        if (v == value)
            return;
        const double oldX = xForValue(value);
        value = v;
        const double newX = xForValue(value);
        // Only the two narrow columns change; playback moves the playhead 30 times a second.
        q->update(QRectF(oldX - 8, 0, 16, q->height()).toAlignedRect());
        q->update(QRectF(newX - 8, 0, 16, q->height()).toAlignedRect());
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

    // ----- drawing

    void drawLayout(QPainter &p, const Layout &l, const QRectF &s) const
    {
        const double length = l.window.length();
        for (int i = 0; i < l.count && i < l.timestamps.size(); ++i) {
            const auto found = images.find(l.timestamps[i]);
            if (found == images.end())
                continue;
            const double t0 = l.window.start + i * l.slotFraction * length;
            const double t1 = t0 + l.slotFraction * length;
            const double x0 = xForValue(t0), x1 = xForValue(t1);
            if (x1 <= s.left() || x0 >= s.right())
                continue;
            const QRectF slot(x0, s.top(), x1 - x0, s.height());
            p.drawImage(slot, found->second, aspectFillSource(found->second.size(), slot.size()));
        }
    }

    void drawHandles(QPainter &p, const QRectF &s) const
    {
        const double xs = snap(xForValue(start)), xe = snap(xForValue(end));
        const QRectF frame(xs - kGripWidth, s.top(), (xe + kGripWidth) - (xs - kGripWidth), s.height());

        // Dim the movie outside the range, more the more editing shows.
        if (editingLook > 0.0) {
            const QColor dim(0, 0, 0, int(140 * editingLook));
            if (xs > s.left())
                p.fillRect(QRectF(s.left(), s.top(), xs - s.left(), s.height()), dim);
            if (xe < s.right())
                p.fillRect(QRectF(xe, s.top(), s.right() - xe, s.height()), dim);
        }

        const QColor plain(255, 255, 255, 150);
        const QColor edit(255, 204, 0);
        QPainterPath path;
        path.setFillRule(Qt::OddEvenFill);
        path.addRoundedRect(frame, 4, 4);
        const double thickness = kFrameThickness * (0.5 + 0.5 * editingLook);
        path.addRect(QRectF(xs, s.top() + thickness, std::max(0.0, xe - xs), s.height() - 2 * thickness));
        p.fillPath(path, mix(plain, edit, editingLook));

        // Grip marks; the hovered or held grip is drawn a little stronger.
        for (MovieScrubberHandle h : {MovieScrubberHandle::Start, MovieScrubberHandle::End}) {
            const bool active = hovered == h || (h == MovieScrubberHandle::Start ? drag == Drag::Start : drag == Drag::End);
            const double cx = h == MovieScrubberHandle::Start ? xs - kGripWidth / 2.0 : xe + kGripWidth / 2.0;
            const double markHeight = std::min(14.0, s.height() * 0.4);
            const QRectF mark(cx - 1.0, s.center().y() - markHeight / 2.0, 2.0, markHeight);
            p.fillRect(mark, QColor(0, 0, 0, active ? 200 : 110));
        }
    }

    void drawPlayhead(QPainter &p, const QRectF &s) const
    {
        const double x = snap(xForValue(value));
        if (x < s.left() - 1 || x > s.right() + 1)
            return; // outside the zoomed window
        p.fillRect(QRectF(x - 1.5, s.top(), 3.0, s.height()), QColor(0, 0, 0, 90)); // contrast edge
        p.fillRect(QRectF(x - 1.0, s.top(), 2.0, s.height()), Qt::white);
        p.setPen(QPen(QColor(0, 0, 0, 90), 1.0));
        p.setBrush(Qt::white);
        p.drawEllipse(QPointF(x, s.top() + 2.5), 3.5, 3.5);
    }
};

MovieScrubber::MovieScrubber(QWidget *parent) : QWidget(parent), d(new Private(this))
{
    setFocusPolicy(Qt::StrongFocus);
    setMouseTracking(true);
    setSizePolicy(QSizePolicy::Expanding, QSizePolicy::Fixed);
    setAccessibleName(tr("Timeline"));

    d->zoomTimer = new QTimer(this);
    d->zoomTimer->setSingleShot(true);
    connect(d->zoomTimer, &QTimer::timeout, this, [this] { d->zoomIn(); });

    d->zoomAnimation = new QVariantAnimation(this);
    d->zoomAnimation->setDuration(kZoomAnimationMs);
    d->zoomAnimation->setStartValue(0.0);
    d->zoomAnimation->setEndValue(1.0);
    d->zoomAnimation->setEasingCurve(QEasingCurve::OutCubic);
    connect(d->zoomAnimation, &QVariantAnimation::valueChanged, this, [this](const QVariant &v) {
        const double t = v.toDouble();
        d->display.start = d->animationFrom.start + (d->animationTo.start - d->animationFrom.start) * t;
        d->display.end = d->animationFrom.end + (d->animationTo.end - d->animationFrom.end) * t;
        update();
    });
    connect(d->zoomAnimation, &QVariantAnimation::finished, this, [this] {
        d->display = d->animationTo;
        d->dropBackdropIfCovered();
        update();
    });

    d->editingAnimation = new QVariantAnimation(this);
    d->editingAnimation->setDuration(kEditingAnimationMs);
    d->editingAnimation->setEasingCurve(QEasingCurve::InOutQuad);
    connect(d->editingAnimation, &QVariantAnimation::valueChanged, this, [this](const QVariant &v) {
        d->editingLook = v.toDouble();
        update();
    });
}

MovieScrubber::~MovieScrubber()
{
    delete d;
}

void MovieScrubber::setDelegate(MovieScrubberDelegate *delegate) { d->delegate = delegate; }
MovieScrubberDelegate *MovieScrubber::delegate() const { return d->delegate; }
void MovieScrubber::setDataSource(MovieScrubberDataSource *dataSource) { d->dataSource = dataSource; }
MovieScrubberDataSource *MovieScrubber::dataSource() const { return d->dataSource; }

void MovieScrubber::setMinimumTrimLength(double seconds)
{
    d->minimumTrimLength = std::isfinite(seconds) ? std::max(0.0, seconds) : 0.0;
    d->constrainRange();
    update();
}
double MovieScrubber::minimumTrimLength() const { return d->minimumTrimLength; }

void MovieScrubber::setEditable(bool editable)
{
    if (d->editable == editable)
        return;
    d->editable = editable;
    if (!editable) {
        if (d->drag == Private::Drag::Start || d->drag == Private::Drag::End) {
            d->drag = Private::Drag::Abandoned;
            d->zoomOut();
        }
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

void MovieScrubber::setEdgeInset(double points)
{
    d->edgeInset = std::isfinite(points) ? std::max(0.0, points) : 0.0;
    d->relayout(false);
    update();
}
double MovieScrubber::edgeInset() const { return d->edgeInset; }

void MovieScrubber::setValue(double seconds)
{
    if (std::isnan(seconds))
        return;
    d->setValueQuietly(d->hasDuration() ? std::clamp(seconds, 0.0, d->duration) : std::max(0.0, seconds));
}
double MovieScrubber::value() const { return d->value; }

double MovieScrubber::editingStartValue() const { return d->start; }
double MovieScrubber::editingEndValue() const { return d->end; }

void MovieScrubber::setEditingRange(double start, double end)
{
    if (std::isnan(start) || std::isnan(end))
        return;
    d->start = std::min(start, end);
    d->end = std::max(start, end);
    if (d->hasDuration()) {
        d->constrainRange();
        d->rangeDuration = d->duration;
    } else {
        d->rangeFromOwner = true; // the next reload keeps it (clamped) rather than resetting it
    }
    update();
}

void MovieScrubber::moveEditingHandleTo(MovieScrubberHandle handle, double seconds)
{
    if (!d->hasDuration() || handle == MovieScrubberHandle::Playhead || std::isnan(seconds))
        return;
    const double oldStart = d->start, oldEnd = d->end;
    const double minimum = std::min(d->minimumTrimLength, d->duration);
    const double t = std::clamp(seconds, 0.0, d->duration);
    if (handle == MovieScrubberHandle::Start) {
        d->start = std::min(t, d->duration - minimum);
        d->end = std::max(d->end, d->start + minimum);
    } else {
        d->end = std::max(t, minimum);
        d->start = std::min(d->start, d->end - minimum);
    }
    d->constrainRange();
    update();
    if (!d->delegate)
        return;
    // The delegate may change the range from its callback; each call reports the value it moved to.
    const double start = d->start, end = d->end;
    if (start != oldStart)
        d->delegate->movieScrubberEditingStartValueDidChange(this, start);
    if (end != oldEnd)
        d->delegate->movieScrubberEditingEndValueDidChange(this, end);
}

bool MovieScrubber::isEditing() const { return d->editing; }

void MovieScrubber::setEditing(bool editing, bool animated)
{
    if (editing && !d->editable)
        return;
    if (editing == d->editing)
        return;
    d->editing = editing;
    if (!editing && (d->drag == Private::Drag::Start || d->drag == Private::Drag::End)) {
        // The handle being dragged lets go of the pointer until the button comes up.
        d->drag = Private::Drag::Abandoned;
        d->zoomOut();
    }
    d->setEditingLook(editing, animated);
}

bool MovieScrubber::isZoomed() const { return d->zoomed; }

void MovieScrubber::reloadData() { d->reload(); }

void MovieScrubber::setThumbnailImageForTimestamp(const QImage &image, double timestamp)
{
    if (image.isNull() || d->asked.count(timestamp) == 0)
        return;
    // Drawing converts any other format on every paint; convert once here.
    d->images[timestamp] = image.convertToFormat(image.hasAlphaChannel() ? QImage::Format_ARGB32_Premultiplied
                                                                         : QImage::Format_RGB32);
    d->dropBackdropIfCovered();
    update();
    Q_EMIT thumbnailImageReceived(timestamp);
}

QList<double> MovieScrubber::thumbnailTimestamps() const { return d->layout.timestamps; }

int MovieScrubber::thumbnailImageCount() const
{
    return int(std::count_if(d->layout.timestamps.begin(), d->layout.timestamps.end(),
                             [this](double t) { return d->images.count(t) > 0; }));
}

double MovieScrubber::visibleStartValue() const { return d->display.start; }
double MovieScrubber::visibleEndValue() const { return d->display.end; }
QRectF MovieScrubber::thumbnailStripRect() const { return d->strip(); }

QSize MovieScrubber::sizeHint() const { return QSize(320, 38); }
QSize MovieScrubber::minimumSizeHint() const { return QSize(int(2 * d->edgeInset) + 40, 24); }

void MovieScrubber::paintEvent(QPaintEvent *)
{
    QPainter p(this);
    p.setRenderHint(QPainter::Antialiasing);
    p.setRenderHint(QPainter::SmoothPixmapTransform);
    const QRectF s = d->strip();

    if (s.width() > 0 && s.height() > 0) {
        p.save();
        QPainterPath clip;
        clip.addRoundedRect(s, 3, 3);
        p.setClipPath(clip);
        p.fillRect(s, QColor(28, 28, 30));
        if (d->backdrop.count > 0)
            d->drawLayout(p, d->backdrop, s);
        d->drawLayout(p, d->layout, s);
        p.restore();
    }

    if (d->hasDuration()) {
        if (d->editable)
            d->drawHandles(p, s);
        d->drawPlayhead(p, s);
    }

    if (hasFocus()) {
        QColor ring = palette().color(QPalette::Highlight);
        p.setPen(QPen(ring, 1.5));
        p.setBrush(Qt::NoBrush);
        p.drawRoundedRect(QRectF(rect()).adjusted(0.75, 0.75, -0.75, -0.75), 4, 4);
    }
}

void MovieScrubber::resizeEvent(QResizeEvent *event)
{
    QWidget::resizeEvent(event);
    d->relayout(false);
}

void MovieScrubber::mousePressEvent(QMouseEvent *event)
{
    if (event->button() != Qt::LeftButton || !d->hasDuration() || d->drag != Private::Drag::None) {
        event->ignore();
        return;
    }
    event->accept();
    const QPointF pos = event->position();
    const MovieScrubberHandle handle = d->handleAt(pos);
    if (handle != MovieScrubberHandle::Playhead) {
        d->drag = handle == MovieScrubberHandle::Start ? Private::Drag::Start : Private::Drag::End;
        d->grabOffset = pos.x() - d->xForValue(d->handleValue(handle));
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
        d->restartZoomTimer(pos);
        update();
        return;
    }

    d->drag = Private::Drag::Playhead;
    const double playheadX = d->xForValue(d->value);
    d->grabOffset = std::abs(pos.x() - playheadX) <= kPlayheadSlop ? pos.x() - playheadX : 0.0;
    if (d->delegate)
        d->delegate->movieScrubberDidBeginScrubbingWithHandle(this, MovieScrubberHandle::Playhead);
    const double target = d->valueForX(pos.x() - d->grabOffset);
    if (d->drag == Private::Drag::Playhead && target != d->value) {
        d->setValueQuietly(target);
        if (d->delegate)
            d->delegate->movieScrubberValueDidChange(this, d->value);
    }
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
    case Private::Drag::Playhead: {
        const double target = d->valueForX(pos.x() - d->grabOffset);
        if (target != d->value) {
            d->setValueQuietly(target);
            if (d->delegate)
                d->delegate->movieScrubberValueDidChange(this, d->value);
        }
        return;
    }
    case Private::Drag::Start:
    case Private::Drag::End:
        if (QLineF(pos, d->stillSince).length() > kStillDistance)
            d->restartZoomTimer(pos);
        d->moveHandle(d->drag == Private::Drag::Start ? MovieScrubberHandle::Start : MovieScrubberHandle::End,
                      pos.x() - d->grabOffset);
        return;
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
    if (!d->hasDuration() || d->drag != Private::Drag::None)
        return false;
    const double step = (modifiers & Qt::ShiftModifier) ? kLongStep : kFrameStep;
    switch (key) {
    case Qt::Key_Left:
        d->stepTo(d->value - step);
        return true;
    case Qt::Key_Right:
        d->stepTo(d->value + step);
        return true;
    case Qt::Key_Home:
        d->stepTo(0.0);
        return true;
    case Qt::Key_End:
        d->stepTo(d->duration);
        return true;
    default:
        return false;
    }
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
