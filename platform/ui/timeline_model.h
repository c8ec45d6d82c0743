#pragma once

// The timeline's geometry and rules, without a widget: where a time lies on the thumbnail strip and
// back, the playhead and the trim range with their bounds and minimum length, the window a zoom
// around a held handle shows, and the thumbnail slots that fit a strip. MovieScrubber draws and
// drives it; everything here is plain values and can be used from any one thread at a time.

#include <QList>
#include <QRectF>
#include <QSizeF>

#include <limits>
#include <optional>

namespace zaf::ui {

// What the pointer holds or a call names: the playhead or one of the two trim handles.
enum class MovieScrubberHandle { Playhead = 0, Start = 1, End = 2 };

// Drawn width of a trim handle's grip, beside the handle's line (left of the start, right of the end).
inline constexpr double kTimelineGripWidth = 10.0;

// A stretch of the movie in seconds.
struct TimelineWindow {
    double start = 0.0;
    double end = 0.0;
    double length() const { return end - start; }
    bool operator==(const TimelineWindow &other) const = default;
};

// Where the thumbnails are drawn in a widget of `size`: inset by `edgeInset` on the left and right
// and by a small margin at the top and bottom when the height leaves room for it.
QRectF timelineStripRect(const QSizeF &size, double edgeInset);

// Maps seconds of `window` onto `strip`: its left edge is the window's start, its right edge the end.
struct TimelineScale {
    QRectF strip;
    TimelineWindow window;

    double xForValue(double seconds) const;
    // The time under x, with x held to the strip (so the time to the window).
    double valueForX(double x) const;
};

// The handle whose grip, widened by a few points of slop, holds x, for handle lines at startX and
// endX; between two overlapping grips the one on x's side of the range's middle. Playhead: none.
MovieScrubberHandle timelineGripAt(double x, double startX, double endX);

// One laid-out strip: `count` slots of `slotFraction` of the strip width each, covering `window`
// from the left edge, and the timestamps the data source gave for them (slot i shows timestamp i).
struct ThumbnailSlots {
    TimelineWindow window;
    int count = 0;
    double slotFraction = 0.0;
    QList<double> timestamps;

    // The slots of thumbnails `aspectRatio` wide per unit of height for `strip` over `window`: as
    // many as it takes to cover the strip (the last may be cut off), none for an empty strip. An
    // aspect ratio that is not finite and positive counts as square.
    static ThumbnailSlots fit(const QRectF &strip, double aspectRatio, const TimelineWindow &window);
    // Where slot i is drawn when the strip shows `scale` (the slot's own window may differ while
    // a zoom animates).
    QRectF slotRect(int i, const TimelineScale &scale) const;
};

// The state of a timeline: the movie's duration, the playhead, the trim range and the zoom.
class TimelineModel {
public:
    double duration() const { return m_duration; }
    bool hasDuration() const;
    // 0 .. duration (empty while the duration is unknown).
    TimelineWindow fullWindow() const;
    // The window the thumbnails are laid out for: the zoom window while zoomed, else the full one.
    TimelineWindow layoutWindow() const { return m_zoomed ? m_zoomWindow : fullWindow(); }

    // The duration a reload found (NaN, zero or less while unknown). For a usable duration the range
    // becomes 0 .. duration unless it was made for that same duration or set by the owner since
    // the last load; either way it and the playhead are then held within the movie. Ends the zoom.
    void load(double duration);

    // Not finite counts as 0; below 0 counts as 0. The range is held to the new length at once.
    void setMinimumTrimLength(double seconds);
    double minimumTrimLength() const { return m_minimumTrimLength; }

    double value() const { return m_value; }
    // The playhead, held within 0 .. duration (at least 0 while the duration is unknown); NaN
    // is ignored.
    void setValue(double seconds);
    // t held within 0 .. duration.
    double clampToMovie(double seconds) const;

    // Where a key puts the playhead: Left/Right one frame (1/30 s), with Shift one second, Home
    // the start, End the end, held within the movie; none for other keys or before the duration
    // is known.
    std::optional<double> keyStepTarget(int key, Qt::KeyboardModifiers modifiers) const;

    double start() const { return m_start; }
    double end() const { return m_end; }
    double handleValue(MovieScrubberHandle handle) const;
    // The owner's range, either way round, held within the movie and at least the minimum trim
    // length long; kept by the next load when the duration is not known yet. NaN is ignored.
    void setRange(double start, double end);
    // A handle put somewhere as the trim keys do: the other handle makes way when the minimum
    // length needs it. Nothing for the playhead, NaN or before the duration is known.
    void moveHandleTo(MovieScrubberHandle handle, double seconds);
    // A handle dragged to `seconds` as the pointer does: it stops the minimum length short of the
    // other handle, which stays. True when the handle moved.
    bool dragHandleTo(MovieScrubberHandle handle, double seconds);

    bool isZoomed() const { return m_zoomed; }
    // The window a zoom around a handle at `seconds` shows, with `shown` on screen now: a tenth of
    // the movie (at least 2 s) placed so the handle keeps its place on the strip; none when the
    // whole movie fits that length or the duration is unknown.
    std::optional<TimelineWindow> zoomWindowAround(double seconds, const TimelineWindow &shown) const;
    // Zooms in to zoomWindowAround(); false (nothing changed) when already zoomed or there is none.
    bool zoomIn(double seconds, const TimelineWindow &shown);
    // False when not zoomed.
    bool zoomOut();

private:
    void constrainRange();

    double m_duration = std::numeric_limits<double>::quiet_NaN();
    double m_minimumTrimLength = 1.0;
    double m_value = 0.0;
    double m_start = 0.0;
    double m_end = 0.0;
    // The duration the range was made for; a load with another duration resets the range.
    double m_rangeDuration = std::numeric_limits<double>::quiet_NaN();
    bool m_rangeFromOwner = false;
    bool m_zoomed = false;
    TimelineWindow m_zoomWindow;
};

} // namespace zaf::ui
