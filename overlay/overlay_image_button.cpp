#include "overlay/overlay_image_button.h"

#include "overlay/overlay_images.h"

#include <QMouseEvent>
#include <QPainter>

namespace zaf::overlay {

OverlayImageButton::OverlayImageButton(QWidget *parent)
    : QAbstractButton(parent)
{
    // A pointer control over the video: it takes no keyboard focus away from the editor, and its
    // mouse events stay with it.
    setFocusPolicy(Qt::NoFocus);
    setAttribute(Qt::WA_NoMousePropagation);
    // It paints its image only: no background, also when rendered off screen (a backdrop reads the
    // control's pixels as a mask shape).
    setAttribute(Qt::WA_NoSystemBackground);
    // Accessibility's press action and other programmatic clicks count as a tap.
    connect(this, &QAbstractButton::clicked, this, [this] { Q_EMIT touchUpInside(this); });
}

void OverlayImageButton::setNormalImage(const QImage &image)
{
    m_normalImage = image;
    updateGeometry();
    update();
}

void OverlayImageButton::setHighlightedImage(const QImage &image)
{
    m_highlightedImage = image;
    update();
}

const QImage &OverlayImageButton::currentImage() const
{
    return isDown() && !m_highlightedImage.isNull() ? m_highlightedImage : m_normalImage;
}

QSize OverlayImageButton::sizeHint() const
{
    return sizeInPoints(m_normalImage).toSize();
}

void OverlayImageButton::sizeToFit()
{
    setGeometry(QRect(QPoint(0, 0), sizeHint()));
    setFixedSize(sizeHint());
}

void OverlayImageButton::paintEvent(QPaintEvent *)
{
    const QImage &image = currentImage();
    if (image.isNull())
        return;
    QPainter painter(this);
    painter.setOpacity(m_imageOpacity);
    painter.drawImage(QPointF(0, 0), image);
}

void OverlayImageButton::setImageOpacity(double opacity)
{
    if (m_imageOpacity == opacity)
        return;
    m_imageOpacity = opacity;
    update();
}

void OverlayImageButton::mousePressEvent(QMouseEvent *event)
{
    event->accept();
    if (event->button() != Qt::LeftButton || m_tracking)
        return;
    m_tracking = true;
    setDown(true);
    Q_EMIT touchDown(this);
}

void OverlayImageButton::mouseMoveEvent(QMouseEvent *event)
{
    event->accept();
    if (!m_tracking)
        return;
    const bool inside = hitButton(event->position().toPoint());
    setDown(inside);
    if (inside)
        Q_EMIT touchDragInside(this);
    else
        Q_EMIT touchDragOutside(this);
}

void OverlayImageButton::mouseReleaseEvent(QMouseEvent *event)
{
    event->accept();
    if (!m_tracking || event->button() != Qt::LeftButton)
        return;
    const bool inside = hitButton(event->position().toPoint());
    m_tracking = false;
    setDown(false);
    // A receiver may delete the control (the editor drops the overlay button on its first play).
    if (inside)
        Q_EMIT touchUpInside(this);
    else
        Q_EMIT touchUpOutside(this);
}

void OverlayImageButton::hideEvent(QHideEvent *event)
{
    cancelTracking();
    QAbstractButton::hideEvent(event);
}

void OverlayImageButton::cancelTracking()
{
    if (!m_tracking)
        return;
    m_tracking = false;
    setDown(false);
}

} // namespace zaf::overlay
