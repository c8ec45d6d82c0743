#include "platform/ui/timeline_painter.h"

#include "platform/ui/timeline_thumbnails.h"

#include <QPainter>
#include <QPainterPath>

#include <algorithm>

namespace zaf::ui {

namespace {

constexpr double kFrameThickness = 2.0; // top and bottom bars of the range frame

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

void paintSlots(QPainter &p, const ThumbnailSlots &slots, const TimelineThumbnails &thumbnails, const TimelineScale &scale)
{
    const QRectF &s = scale.strip;
    for (int i = 0; i < slots.count && i < slots.timestamps.size(); ++i) {
        const QImage *image = thumbnails.imageFor(slots.timestamps[i]);
        if (!image)
            continue;
        const QRectF slot = slots.slotRect(i, scale);
        if (slot.right() <= s.left() || slot.left() >= s.right())
            continue;
        p.drawImage(slot, *image, aspectFillSource(image->size(), slot.size()));
    }
}

} // namespace

void paintTimelineThumbnails(QPainter &p, const TimelineThumbnails &thumbnails, const TimelineScale &scale)
{
    const QRectF &s = scale.strip;
    if (s.width() <= 0 || s.height() <= 0)
        return;
    p.save();
    QPainterPath clip;
    clip.addRoundedRect(s, 3, 3);
    p.setClipPath(clip);
    p.fillRect(s, QColor(28, 28, 30));
    if (thumbnails.backdrop().count > 0)
        paintSlots(p, thumbnails.backdrop(), thumbnails, scale);
    paintSlots(p, thumbnails.slots(), thumbnails, scale);
    p.restore();
}

void paintTimelineTrimFrame(QPainter &p, const QRectF &s, const TrimFrameLook &look)
{
    const double xs = look.startX, xe = look.endX;
    const QRectF frame(xs - kTimelineGripWidth, s.top(), (xe + kTimelineGripWidth) - (xs - kTimelineGripWidth), s.height());

    // Dim the movie outside the range, more the more editing shows.
    if (look.editing > 0.0) {
        const QColor dim(0, 0, 0, int(140 * look.editing));
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
    const double thickness = kFrameThickness * (0.5 + 0.5 * look.editing);
    path.addRect(QRectF(xs, s.top() + thickness, std::max(0.0, xe - xs), s.height() - 2 * thickness));
    p.fillPath(path, mix(plain, edit, look.editing));

    // Grip marks, centred on each grip.
    const double markHeight = std::min(14.0, s.height() * 0.4);
    for (const auto &[cx, active] : {std::pair{xs - kTimelineGripWidth / 2.0, look.startActive},
                                     std::pair{xe + kTimelineGripWidth / 2.0, look.endActive}}) {
        const QRectF mark(cx - 1.0, s.center().y() - markHeight / 2.0, 2.0, markHeight);
        p.fillRect(mark, QColor(0, 0, 0, active ? 200 : 110));
    }
}

void paintTimelinePlayhead(QPainter &p, const QRectF &s, double x)
{
    if (x < s.left() - 1 || x > s.right() + 1)
        return; // outside the zoomed window
    p.fillRect(QRectF(x - 1.5, s.top(), 3.0, s.height()), QColor(0, 0, 0, 90)); // contrast edge
    p.fillRect(QRectF(x - 1.0, s.top(), 2.0, s.height()), Qt::white);
    p.setPen(QPen(QColor(0, 0, 0, 90), 1.0));
    p.setBrush(Qt::white);
    p.drawEllipse(QPointF(x, s.top() + 2.5), 3.5, 3.5);
}

void paintTimelineFocusRing(QPainter &p, const QRectF &bounds, const QColor &color)
{
    p.setPen(QPen(color, 1.5));
    p.setBrush(Qt::NoBrush);
    p.drawRoundedRect(bounds.adjusted(0.75, 0.75, -0.75, -0.75), 4, 4);
}

} // namespace zaf::ui
