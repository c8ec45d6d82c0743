#include "platform/ui/timeline_model.h"

#include <algorithm>
#include <cmath>

namespace zaf::ui {

namespace {

constexpr double kStripVerticalMargin = 2.0; // points above and below the thumbnails
constexpr double kGripSlop = 8.0;            // extra grab width on each side of a grip
constexpr int kMaximumThumbnails = 256;
constexpr double kZoomFraction = 0.1;        // a zoom shows this much of the movie
constexpr double kMinimumZoomLength = 2.0;   // seconds, however short the movie
constexpr double kFrameStep = 1.0 / 30.0;    // Left/Right
constexpr double kLongStep = 1.0;            // Shift+Left/Right

bool isValidDuration(double d)
{
    return std::isfinite(d) && d > 0.0;
}

} // namespace

QRectF timelineStripRect(const QSizeF &size, double edgeInset)
{
    const double margin = size.height() >= 4 * kStripVerticalMargin + 8 ? kStripVerticalMargin : 0.0;
    return QRectF(edgeInset, margin, size.width() - 2.0 * edgeInset, size.height() - 2.0 * margin);
}

double TimelineScale::xForValue(double seconds) const
{
    if (window.length() <= 0)
        return strip.left();
    return strip.left() + (seconds - window.start) / window.length() * strip.width();
}

double TimelineScale::valueForX(double x) const
{
    if (strip.width() <= 0 || window.length() <= 0)
        return window.start;
    const double fraction = std::clamp((x - strip.left()) / strip.width(), 0.0, 1.0);
    return window.start + fraction * window.length();
}

MovieScrubberHandle timelineGripAt(double x, double startX, double endX)
{
    const bool onStart = x >= startX - kTimelineGripWidth - kGripSlop && x <= startX + kGripSlop;
    const bool onEnd = x >= endX - kGripSlop && x <= endX + kTimelineGripWidth + kGripSlop;
    if (onStart && onEnd)
        return x < (startX + endX) / 2.0 ? MovieScrubberHandle::Start : MovieScrubberHandle::End;
    if (onStart)
        return MovieScrubberHandle::Start;
    if (onEnd)
        return MovieScrubberHandle::End;
    return MovieScrubberHandle::Playhead;
}

ThumbnailSlots ThumbnailSlots::fit(const QRectF &strip, double aspectRatio, const TimelineWindow &window)
{
    ThumbnailSlots slots;
    slots.window = window;
    if (strip.width() <= 0 || strip.height() <= 0)
        return slots;
    const double aspect = std::isfinite(aspectRatio) && aspectRatio > 0.0 ? aspectRatio : 1.0;
    const double thumbWidth = strip.height() * aspect;
    // A hair of tolerance so an exact fit does not become one extra slot through rounding.
    slots.count = std::clamp(int(std::ceil(strip.width() / thumbWidth - 1e-9)), 1, kMaximumThumbnails);
    slots.slotFraction = thumbWidth / strip.width();
    return slots;
}

QRectF ThumbnailSlots::slotRect(int i, const TimelineScale &scale) const
{
    const double slotLength = slotFraction * window.length();
    const double t0 = window.start + i * slotLength;
    const double x0 = scale.xForValue(t0), x1 = scale.xForValue(t0 + slotLength);
    return QRectF(x0, scale.strip.top(), x1 - x0, scale.strip.height());
}

bool TimelineModel::hasDuration() const
{
    return isValidDuration(m_duration);
}

TimelineWindow TimelineModel::fullWindow() const
{
    return TimelineWindow{0.0, hasDuration() ? m_duration : 0.0};
}

void TimelineModel::load(double duration)
{
    m_duration = duration;
    m_zoomed = false;
    if (!hasDuration())
        return;
    if (!m_rangeFromOwner && m_rangeDuration != duration) {
        m_start = 0.0;
        m_end = duration;
    }
    m_rangeFromOwner = false;
    m_rangeDuration = duration;
    constrainRange();
    m_value = std::clamp(m_value, 0.0, duration);
}

void TimelineModel::setMinimumTrimLength(double seconds)
{
    m_minimumTrimLength = std::isfinite(seconds) ? std::max(0.0, seconds) : 0.0;
    constrainRange();
}

void TimelineModel::setValue(double seconds)
{
    if (!std::isnan(seconds))
        m_value = hasDuration() ? std::clamp(seconds, 0.0, m_duration) : std::max(0.0, seconds);
}

double TimelineModel::clampToMovie(double seconds) const
{
    return std::clamp(seconds, 0.0, fullWindow().end);
}

std::optional<double> TimelineModel::keyStepTarget(int key, Qt::KeyboardModifiers modifiers) const
{
    if (!hasDuration())
        return std::nullopt;
    const double step = (modifiers & Qt::ShiftModifier) ? kLongStep : kFrameStep;
    switch (key) {
    case Qt::Key_Left:
        return clampToMovie(m_value - step);
    case Qt::Key_Right:
        return clampToMovie(m_value + step);
    case Qt::Key_Home:
        return 0.0;
    case Qt::Key_End:
        return m_duration;
    default:
        return std::nullopt;
    }
}

double TimelineModel::handleValue(MovieScrubberHandle handle) const
{
    return handle == MovieScrubberHandle::Start ? m_start : m_end;
}

void TimelineModel::setRange(double start, double end)
{
    if (std::isnan(start) || std::isnan(end))
        return;
    m_start = std::min(start, end);
    m_end = std::max(start, end);
    if (hasDuration()) {
        constrainRange();
        m_rangeDuration = m_duration;
    } else {
        m_rangeFromOwner = true; // the next load keeps it (held to the movie) rather than resetting it
    }
}

void TimelineModel::moveHandleTo(MovieScrubberHandle handle, double seconds)
{
    if (!hasDuration() || handle == MovieScrubberHandle::Playhead || std::isnan(seconds))
        return;
    const double minimum = std::min(m_minimumTrimLength, m_duration);
    const double t = std::clamp(seconds, 0.0, m_duration);
    if (handle == MovieScrubberHandle::Start) {
        m_start = std::min(t, m_duration - minimum);
        m_end = std::max(m_end, m_start + minimum);
    } else {
        m_end = std::max(t, minimum);
        m_start = std::min(m_start, m_end - minimum);
    }
    constrainRange();
}

bool TimelineModel::dragHandleTo(MovieScrubberHandle handle, double seconds)
{
    if (!hasDuration() || handle == MovieScrubberHandle::Playhead || std::isnan(seconds))
        return false;
    const double t = clampToMovie(seconds);
    const double minimum = std::min(m_minimumTrimLength, m_duration);
    double &moved = handle == MovieScrubberHandle::Start ? m_start : m_end;
    const double next = handle == MovieScrubberHandle::Start
                            ? std::clamp(t, 0.0, std::max(0.0, m_end - minimum))
                            : std::clamp(t, std::min(m_duration, m_start + minimum), m_duration);
    if (next == moved)
        return false;
    moved = next;
    return true;
}

std::optional<TimelineWindow> TimelineModel::zoomWindowAround(double seconds, const TimelineWindow &shown) const
{
    if (!hasDuration())
        return std::nullopt;
    const double length = std::max(m_duration * kZoomFraction, kMinimumZoomLength);
    if (length >= m_duration)
        return std::nullopt; // the whole movie already fits that window
    const double fraction = shown.length() > 0 ? (seconds - shown.start) / shown.length() : 0.0;
    const double start = std::clamp(seconds - fraction * length, 0.0, m_duration - length);
    return TimelineWindow{start, start + length};
}

bool TimelineModel::zoomIn(double seconds, const TimelineWindow &shown)
{
    if (m_zoomed)
        return false;
    const std::optional<TimelineWindow> window = zoomWindowAround(seconds, shown);
    if (!window)
        return false;
    m_zoomWindow = *window;
    m_zoomed = true;
    return true;
}

bool TimelineModel::zoomOut()
{
    const bool was = m_zoomed;
    m_zoomed = false;
    return was;
}

void TimelineModel::constrainRange()
{
    if (!hasDuration())
        return;
    const double minimum = std::min(m_minimumTrimLength, m_duration);
    m_start = std::clamp(m_start, 0.0, m_duration);
    m_end = std::clamp(m_end, 0.0, m_duration);
    if (m_end - m_start < minimum) {
        m_end = std::min(m_duration, m_start + minimum);
        m_start = std::max(0.0, m_end - minimum);
    }
}

} // namespace zaf::ui
