#pragma once

// The overlay play button for capable devices: a plain widget holding the inner button that shows
// the play glyph and, for the default style 0, a live blurred backdrop shaped by the mask images.
//
// Children, back to front: the backdrop (style 0 only), the inner button, the invisible mask image
// view that gives the backdrop its shape (style 0 only). The glyph's alpha is the inner button's
// opacity: ZafVideoOverlayDefaultGlyphAlpha at rest, ZafVideoOverlayHighlightedGlyphAlpha while
// pressed. The widget keeps the glyph image's size. Main thread only.

#include "overlay/video_overlay_button.h"

#include <QWidget>

class QLabel;

namespace zaf::overlay {
class OverlayImageButton;
}
namespace zaf::ui {
class BackdropView;
}

class ZafHighFidelityVideoOverlayButton : public QWidget, public ZafVideoOverlayButton {
    Q_OBJECT
public:
    // Builds the button for `style`; the backdrop exists only for style 0.
    explicit ZafHighFidelityVideoOverlayButton(std::int64_t style, QWidget *parent = nullptr);
    ~ZafHighFidelityVideoOverlayButton() override;

    // The creation style (hides QWidget::style, the widget style, as the two share a name).
    using ZafVideoOverlayButton::style;
    QWidget *widget() override { return this; }

    // The invisible image view showing the background mask (style 0), or null.
    QLabel *maskImageView() const { return m_maskImageView; }
    // The glyph's current alpha (the inner button's opacity).
    double glyphAlpha() const;

public Q_SLOTS:
    // Pressed look: glyph alpha 0.5. The sender is ignored.
    void _playButtonActivate(QObject *sender);
    // Rest look: glyph alpha 0.3. The sender is ignored.
    void _playButtonDeactivate(QObject *sender);
    // A completed tap: back to the rest look, then the action on the target with this overlay button
    // as the argument, when the target is alive and has the action. The sender is ignored.
    void _playButtonTapped(QObject *sender);

public:
    // The inner button, which receives the presses; owned by this widget.
    zaf::overlay::OverlayImageButton *const _button;
    // The blurred backdrop behind the glyph for style 0; null for any other style.
    zaf::ui::BackdropView *_backdropView = nullptr;

protected:
    // Presses on the widget itself (outside the inner button's shape) stay here too.
    void mousePressEvent(QMouseEvent *event) override;
    void mouseMoveEvent(QMouseEvent *event) override;
    void mouseReleaseEvent(QMouseEvent *event) override;

private:
    void setGlyphAlpha(double alpha);

    QLabel *m_maskImageView = nullptr;
};
