#include "tests/overlay/overlay_test_support.h"

#include "overlay/overlay_images.h"
#include "overlay/video_overlay_constants.h"
#include "platform/capability/capability_service.h"

#include <QApplication>
#include <QFile>
#include <QMouseEvent>
#include <QWindow>

namespace zaf::test {

void ActionTarget::playAction(QObject *sender)
{
    ++calls;
    lastSender = sender;
}

TapSurface::TapSurface()
{
    resize(400, 300);
}

void TapSurface::mousePressEvent(QMouseEvent *event)
{
    ++presses;
    event->accept();
}

void TapSurface::mouseReleaseEvent(QMouseEvent *event)
{
    ++releases;
    event->accept();
}

void Pointer::press(QPoint pos, Qt::MouseButton button)
{
    m_buttons |= button;
    send(QEvent::MouseButtonPress, pos, button, m_buttons);
}

void Pointer::move(QPoint pos)
{
    send(QEvent::MouseMove, pos, Qt::NoButton, m_buttons);
}

void Pointer::release(QPoint pos, Qt::MouseButton button)
{
    m_buttons &= ~Qt::MouseButtons(button);
    send(QEvent::MouseButtonRelease, pos, button, m_buttons);
}

void Pointer::tap(QPoint pos)
{
    press(pos);
    release(pos);
}

void Pointer::send(int type, QPoint pos, Qt::MouseButton button, Qt::MouseButtons buttons)
{
    QWindow *window = m_window->windowHandle();
    Q_ASSERT(window);
    QMouseEvent event(QEvent::Type(type), QPointF(pos), window->mapToGlobal(QPointF(pos)), button, buttons,
                      Qt::NoModifier);
    QApplication::sendEvent(window, &event);
}

QPoint centreInWindow(const QWidget *widget)
{
    return widget->mapTo(widget->window(), widget->rect().center());
}

QPoint outsideInWindow(const QWidget *widget)
{
    return widget->mapTo(widget->window(), QPoint(widget->width() + 10, widget->height() + 10));
}

GraphicsQualityLevel::GraphicsQualityLevel(std::optional<int> level)
{
    if (level) {
        QFile file(m_scratch.file(QStringLiteral("capabilities.json")));
        if (file.open(QIODevice::WriteOnly))
            file.write(QByteArray(R"({"graphics-quality-level": )") + QByteArray::number(*level) + "}");
        file.close();
        qputenv("ZAF_CAPABILITIES_FILE", QFile::encodeName(file.fileName()));
    } else {
        qunsetenv("ZAF_CAPABILITIES_FILE");
    }
    CapabilityService::shared().reload();
}

GraphicsQualityLevel::~GraphicsQualityLevel()
{
    qunsetenv("ZAF_CAPABILITIES_FILE");
    CapabilityService::shared().reload();
}

QImage backgroundMask()
{
    return overlay::imageNamed(QLatin1String(ZafVideoOverlayBackgroundMaskImageName));
}

QImage glyphMask()
{
    return overlay::imageNamed(QLatin1String(ZafVideoOverlayGlyphMaskImageName));
}

} // namespace zaf::test
