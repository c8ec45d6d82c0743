#pragma once

// The overlay library's images by name.
//
// An image named N is the SVG resource ":/zaf/overlay/N.svg", rendered at the main screen's scale:
// the result's devicePixelRatio is that scale and its size in points is the SVG's own size.
// Main thread only (reads the main screen).

#include <QImage>
#include <QString>

namespace zaf::overlay {

// The image named `name`, or a null image (and a logged error) when there is no such resource or it
// cannot be read.
QImage imageNamed(const QString &name);

// An image's size in points (its pixel size over its devicePixelRatio).
QSizeF sizeInPoints(const QImage &image);

} // namespace zaf::overlay
