#include "overlay/flat_video_overlay_button.h"

#include "overlay/overlay_images.h"
#include "overlay/video_overlay_constants.h"
#include "platform/ui/screen.h"

#include <QColor>
#include <QCoreApplication>
#include <QPainter>
#include <QtMath>

#include <atomic>

namespace {

std::atomic<int> g_sharedImageRenderCount{0};

QImage renderSharedImage(double glyphAlpha)
{
    g_sharedImageRenderCount.fetch_add(1);
    return ZafFlatVideoOverlayButton::_createOverlayImageWithBackgroundWhiteBackgroundAlphaGlyphAlpha(
        ZafVideoOverlayFlatBackgroundWhite, ZafVideoOverlayFlatBackgroundAlpha, glyphAlpha);
}

} // namespace

ZafFlatVideoOverlayButton::ZafFlatVideoOverlayButton(std::int64_t style, QWidget *parent)
    : zaf::overlay::OverlayImageButton(parent)
    , ZafVideoOverlayButton(style)
{
    setNormalImage(_normalButtonImage());
    setHighlightedImage(_highlightedButtonImage());
    sizeToFit();
    setAccessibleName(QCoreApplication::translate("ZafVideoOverlayButton", "Play"));
    connect(this, &zaf::overlay::OverlayImageButton::touchUpInside, this, &ZafFlatVideoOverlayButton::_handleTap);
}

ZafFlatVideoOverlayButton::~ZafFlatVideoOverlayButton() = default;

void ZafFlatVideoOverlayButton::_handleTap(QObject *)
{
    sendAction();
}

const QImage &ZafFlatVideoOverlayButton::_normalButtonImage()
{
    // A function-local static: initialised exactly once, and concurrent first callers wait for it.
    static const QImage image = renderSharedImage(ZafVideoOverlayDefaultGlyphAlpha);
    return image;
}

const QImage &ZafFlatVideoOverlayButton::_highlightedButtonImage()
{
    static const QImage image = renderSharedImage(ZafVideoOverlayHighlightedGlyphAlpha);
    return image;
}

int ZafFlatVideoOverlayButton::sharedImageRenderCount()
{
    return g_sharedImageRenderCount.load();
}

QImage ZafFlatVideoOverlayButton::_createOverlayImageWithBackgroundWhiteBackgroundAlphaGlyphAlpha(
    double white, double backgroundAlpha, double glyphAlpha)
{
    const QImage backgroundMask = zaf::overlay::imageNamed(QLatin1String(ZafVideoOverlayBackgroundMaskImageName));
    const QImage glyphMask = zaf::overlay::imageNamed(QLatin1String(ZafVideoOverlayGlyphMaskImageName));

    // A transparent canvas of the background mask's size in points, at the main screen's scale.
    const double scale = zaf::ui::Screen::mainScreenScale();
    const QSizeF points = zaf::overlay::sizeInPoints(backgroundMask);
    QImage canvas(QSize(qCeil(points.width() * scale), qCeil(points.height() * scale)),
                  QImage::Format_ARGB32_Premultiplied);
    canvas.setDevicePixelRatio(scale);
    canvas.fill(Qt::transparent);
    if (canvas.isNull())
        return canvas;

    QPainter painter(&canvas);
    // Every step draws at the origin, unscaled; the masks carry the same scale as the canvas.
    painter.fillRect(QRectF(QPointF(0, 0), points), QColor::fromRgbF(white, white, white, backgroundAlpha));
    painter.setCompositionMode(QPainter::CompositionMode_DestinationOut);
    painter.setOpacity(1.0);
    painter.drawImage(QPointF(0, 0), backgroundMask);
    painter.drawImage(QPointF(0, 0), glyphMask);
    painter.setCompositionMode(QPainter::CompositionMode_SourceOver);
    painter.setOpacity(glyphAlpha);
    painter.drawImage(QPointF(0, 0), glyphMask);
    painter.end();
    return canvas;
}
