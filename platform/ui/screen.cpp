#include "platform/ui/screen.h"

#include <QGuiApplication>
#include <QPainter>
#include <QSvgRenderer>
#include <QtMath>
#include <QScreen>

namespace zaf::ui {

namespace {
// What a laptop panel offers, for the rare process that runs without any screen.
constexpr double kStandInWidth = 1280;
constexpr double kStandInHeight = 800;
} // namespace

QRectF Screen::mainScreenBounds()
{
    // QScreen's geometry is in device-independent pixels, which are our points.
    const QScreen *screen = QGuiApplication::primaryScreen();
    if (!screen)
        return QRectF(0, 0, kStandInWidth, kStandInHeight);
    return QRectF(QPointF(0, 0), QSizeF(screen->geometry().size()));
}

double Screen::mainScreenScale()
{
    const QScreen *screen = QGuiApplication::primaryScreen();
    return screen ? screen->devicePixelRatio() : 1.0;
}

bool Device::canTellUserInterfaceIdiom()
{
    return CapabilityService::shared().canTellDeviceIdiom();
}

DeviceIdiom Device::userInterfaceIdiom()
{
    return CapabilityService::shared().deviceIdiom();
}

QImage Screen::renderAtMainScreenScale(QSvgRenderer &renderer, const QSizeF &points)
{
    const double scale = mainScreenScale();
    const QSize pixels(qCeil(points.width() * scale), qCeil(points.height() * scale));
    QImage image(pixels, QImage::Format_ARGB32_Premultiplied);
    image.fill(Qt::transparent);
    {
        QPainter painter(&image);
        painter.setRenderHint(QPainter::Antialiasing);
        renderer.render(&painter, QRectF(QPointF(0, 0), points * scale));
    }
    image.setDevicePixelRatio(scale);
    return image;
}

} // namespace zaf::ui
