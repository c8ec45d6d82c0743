#pragma once

// The overlay button tests' action target, surface, pointer, masks, pressed look and fixture.

#include "overlay/flat_video_overlay_button.h"
#include "overlay/high_fidelity_video_overlay_button.h"
#include "overlay/overlay_images.h"
#include "overlay/video_overlay_constants.h"
#include <QApplication>
#include <QMouseEvent>
#include <QWindow>
#include <gtest/gtest.h>

#include <cstdint>
#include <string>

namespace zaf::test {

// A target with the action `playAction(QObject *sender)`; counts calls and keeps the last sender.
class ActionTarget : public QObject {
    Q_OBJECT
public:
    int calls = 0;
    QObject *lastSender = nullptr;

public Q_SLOTS:
    void playAction(QObject *sender) { ++calls, lastSender = sender; }
};

// A top-level widget standing for the video: counts the mouse presses and releases that reach it.
class TapSurface : public QWidget {
    Q_OBJECT
public:
    TapSurface() { resize(400, 300); }
    int presses = 0;
    int releases = 0;

protected:
    void mousePressEvent(QMouseEvent *event) override { ++presses, event->accept(); }
    void mouseReleaseEvent(QMouseEvent *event) override { ++releases, event->accept(); }
};

// Sends left-button mouse events to a shown top-level widget's window at window coordinates, so the
// window picks the receiving child, grabs it on press and propagates ignored events.
class Pointer {
public:
    explicit Pointer(QWidget *window) : m_window(window) {}
    void press(QPoint pos) { send(QEvent::MouseButtonPress, pos, Qt::LeftButton, Qt::LeftButton); }
    void move(QPoint pos) { send(QEvent::MouseMove, pos, Qt::NoButton, m_buttons); }
    void release(QPoint pos) { send(QEvent::MouseButtonRelease, pos, Qt::LeftButton, Qt::NoButton); }
    void tap(QPoint pos) { press(pos), release(pos); }

private:
    void send(QEvent::Type type, QPoint pos, Qt::MouseButton button, Qt::MouseButtons buttons)
    {
        m_buttons = buttons;
        QWindow *window = m_window->windowHandle();
        QMouseEvent event(type, QPointF(pos), window->mapToGlobal(QPointF(pos)), button, buttons, Qt::NoModifier);
        QApplication::sendEvent(window, &event);
    }
    QWidget *m_window;
    Qt::MouseButtons m_buttons;
};

// A widget's centre, and a point outside it (but inside the window), in the window's coordinates.
inline QPoint centreInWindow(const QWidget *widget)
{
    return widget->mapTo(widget->window(), widget->rect().center());
}
inline QPoint outsideInWindow(const QWidget *widget)
{
    return widget->mapTo(widget->window(), QPoint(widget->width() + 10, widget->height() + 10));
}

// A style as a test case's name: "Style0", "StyleMinus1", "StyleMax".
inline std::string styleName(std::int64_t style)
{
    return "Style" + (style == INT64_MAX ? std::string("Max") : style == INT64_MIN ? std::string("Min")
                      : style < 0 ? "Minus" + std::to_string(-style) : std::to_string(style));
}

// The mask images as the buttons load them.
inline QImage backgroundMask()
{
    return overlay::imageNamed(QLatin1String(ZafVideoOverlayBackgroundMaskImageName));
}
inline QImage glyphMask()
{
    return overlay::imageNamed(QLatin1String(ZafVideoOverlayGlyphMaskImageName));
}

// Whether the button shows its pressed look: it paints the highlighted shared image (flat), or its
// glyph has the pressed alpha (high fidelity). Any third look fails the test.
inline bool looksPressed(ZafFlatVideoOverlayButton *button)
{
    const QImage &highlighted = ZafFlatVideoOverlayButton::_highlightedButtonImage();
    QImage painted(highlighted.size(), QImage::Format_ARGB32_Premultiplied);
    painted.setDevicePixelRatio(highlighted.devicePixelRatio());
    painted.fill(Qt::transparent);
    button->render(&painted, QPoint(), QRegion(), QWidget::DrawChildren);
    EXPECT_TRUE(painted == highlighted || painted == ZafFlatVideoOverlayButton::_normalButtonImage());
    return painted == highlighted;
}
inline bool looksPressed(ZafHighFidelityVideoOverlayButton *button)
{
    const double alpha = button->glyphAlpha();
    EXPECT_TRUE(alpha == ZafVideoOverlayDefaultGlyphAlpha || alpha == ZafVideoOverlayHighlightedGlyphAlpha) << alpha;
    return alpha == ZafVideoOverlayHighlightedGlyphAlpha;
}

// A style-0 button of the variant `Button` on a shown surface standing for the video, its tap aimed
// at target.playAction.
template <class Button>
class ButtonOnSurface : public ::testing::Test {
protected:
    void SetUp() override
    {
        button = new Button(0, &surface);
        button->move(80, 60);
        button->setTargetAction(&target, "playAction");
        surface.show();
    }
    QPoint centre() const { return centreInWindow(button); }
    QPoint outside() const { return outsideInWindow(button); }

    TapSurface surface;
    ActionTarget target;
    Button *button = nullptr;
    Pointer pointer{&surface};
};

} // namespace zaf::test
