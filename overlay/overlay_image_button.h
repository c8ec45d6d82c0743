#pragma once

// The button control under both overlay play buttons: it shows an image for its normal state (and
// optionally another while pressed) and reports the touch-style control events of a press:
//
//   touchDown          the left button went down on the control;
//   touchDragInside    the pointer moved inside the control while the press lasts;
//   touchDragOutside   the pointer moved outside the control while the press lasts;
//   touchUpInside      the press ended inside the control (a tap); a programmatic click() too;
//   touchUpOutside     the press ended outside the control.
//
// Every mouse press, move and release that reaches the control is accepted and never propagates to
// the widgets that contain it, so a tap on the control is not also taken by a tap recognizer on the
// video behind it. Main thread only.

#include <QAbstractButton>
#include <QImage>

namespace zaf::overlay {

class OverlayImageButton : public QAbstractButton {
    Q_OBJECT
public:
    explicit OverlayImageButton(QWidget *parent = nullptr);

    // The image for the normal state, and the one shown while pressed inside (a null image: the
    // normal image stays). Images with a devicePixelRatio are drawn at their size in points.
    void setNormalImage(const QImage &image);
    void setHighlightedImage(const QImage &image);
    // The alpha the image is painted with (1 by default). Kept in the button rather than in a
    // graphics effect, so the button can also be a backdrop's mask view, which owns that slot.
    void setImageOpacity(double opacity);
    double imageOpacity() const { return m_imageOpacity; }
    const QImage &normalImage() const { return m_normalImage; }
    const QImage &highlightedImage() const { return m_highlightedImage; }
    // The image the control shows now.
    const QImage &currentImage() const;

    // Resizes the control, at the origin, to the normal image's size in points and keeps that size.
    void sizeToFit();
    QSize sizeHint() const override;

    // Whether a press is being tracked (between touchDown and the matching touch up).
    bool isTracking() const { return m_tracking; }

Q_SIGNALS:
    void touchDown(QObject *sender);
    void touchDragInside(QObject *sender);
    void touchDragOutside(QObject *sender);
    void touchUpInside(QObject *sender);
    void touchUpOutside(QObject *sender);

protected:
    void paintEvent(QPaintEvent *event) override;
    void mousePressEvent(QMouseEvent *event) override;
    void mouseMoveEvent(QMouseEvent *event) override;
    void mouseReleaseEvent(QMouseEvent *event) override;
    void hideEvent(QHideEvent *event) override;

private:
    double m_imageOpacity = 1.0;
    // Ends a press without a control event (the press was taken away, e.g. the control was hidden).
    void cancelTracking();

    QImage m_normalImage;
    QImage m_highlightedImage;
    bool m_tracking = false;
};

} // namespace zaf::overlay
