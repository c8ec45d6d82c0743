#pragma once

// The overlay play button without live effects: a button control whose normal and pressed looks are
// two images rendered once per process from the mask images and shared by every flat button.
//
// The look is a light gray field (ZafVideoOverlayFlatBackgroundWhite at
// ZafVideoOverlayFlatBackgroundAlpha) with the background mask's shape and the glyph's shape cut
// out of it, and the glyph drawn back into the hole at ZafVideoOverlayDefaultGlyphAlpha (normal) or
// ZafVideoOverlayHighlightedGlyphAlpha (pressed). Main thread only, except that the two shared
// images may be asked for from any thread.

#include "overlay/overlay_image_button.h"
#include "overlay/video_overlay_button.h"

#include <QImage>

class ZafFlatVideoOverlayButton : public zaf::overlay::OverlayImageButton, public ZafVideoOverlayButton {
    Q_OBJECT
public:
    // Builds the button; the style is kept but does not change the drawing.
    explicit ZafFlatVideoOverlayButton(std::int64_t style, QWidget *parent = nullptr);
    ~ZafFlatVideoOverlayButton() override;

    // The creation style (hides QWidget::style, the widget style, as the two share a name).
    using ZafVideoOverlayButton::style;
    QWidget *widget() override { return this; }

    // The shared normal and pressed images: rendered on the first call in the process (exactly once,
    // even when first calls race) and the very same object on every call after.
    static const QImage &_normalButtonImage();
    static const QImage &_highlightedButtonImage();
    // Renders a new image: a fill of gray level `white` at `backgroundAlpha`, the background mask and
    // the glyph mask removed from it (destination-out), then the glyph drawn at `glyphAlpha`
    // (source-over). Its size is the background mask's size in points at the main screen's scale.
    static QImage _createOverlayImageWithBackgroundWhiteBackgroundAlphaGlyphAlpha(double white,
                                                                                 double backgroundAlpha,
                                                                                 double glyphAlpha);
    // How many times the shared images have been rendered in this process (at most 2).
    static int sharedImageRenderCount();

public Q_SLOTS:
    // A completed tap: the action on the target with this button as the argument, when the target is
    // alive and has the action. The sender is ignored.
    void _handleTap(QObject *sender);

private:
};
