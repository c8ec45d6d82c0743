#pragma once

// The timeline's drawing: the thumbnail strip, the trim frame with its grips, and the playhead.
// Positions are logical coordinates; callers pass lines already aligned to device pixels.
// Main thread only, like every painting onto a widget.

#include "platform/ui/timeline_model.h"

class QColor;
class QPainter;

namespace zaf::ui {

class TimelineThumbnails;

// The strip's dark background, then the backdrop slots and the current slots over it, each image
// filling its slot (centred, cropped to the slot's shape), clipped to the strip's rounded rect.
void paintTimelineThumbnails(QPainter &painter, const TimelineThumbnails &thumbnails, const TimelineScale &scale);

// The trim frame between the handle lines at startX and endX, with a grip outside each line. The
// look runs from 0 (plain) to 1 (editing: highlighted, and the movie outside the range dimmed).
// An active grip (hovered or held) is drawn a little stronger.
struct TrimFrameLook {
    double startX = 0.0;
    double endX = 0.0;
    double editing = 0.0;
    bool startActive = false;
    bool endActive = false;
};
void paintTimelineTrimFrame(QPainter &painter, const QRectF &strip, const TrimFrameLook &look);

// The playhead line with its knob at x; nothing when x lies outside the strip (a zoomed window).
void paintTimelinePlayhead(QPainter &painter, const QRectF &strip, double x);

// A focus ring of `color` just inside `bounds`.
void paintTimelineFocusRing(QPainter &painter, const QRectF &bounds, const QColor &color);

} // namespace zaf::ui
