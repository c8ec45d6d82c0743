#pragma once

// The main screen and the device: bounds in points, scale (pixels per point), the user-interface
// idiom. Main thread only (reads QScreen).

#include "platform/capability/capability_service.h"

#include <QImage>
#include <QRectF>

class QSvgRenderer;

namespace zaf::ui {

struct Screen {
    // The primary screen's bounds in points (origin 0, 0); a 1280 x 800 stand-in without a screen.
    static QRectF mainScreenBounds();
    // The primary screen's device pixel ratio (1 without a screen).
    static double mainScreenScale();
    // Renders an SVG so that its `points` rectangle fills a transparent image at the main screen's
    // scale (the image's device pixel ratio is that scale).
    static QImage renderAtMainScreenScale(QSvgRenderer &renderer, const QSizeF &points);
};

struct Device {
    // Whether the device can tell its idiom, and the idiom (the capability service's answer).
    static bool canTellUserInterfaceIdiom();
    static DeviceIdiom userInterfaceIdiom();
};

} // namespace zaf::ui
