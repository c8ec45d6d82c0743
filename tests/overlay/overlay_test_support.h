#pragma once

// Support for the overlay button tests: action targets, a surface standing for the video behind the
// button, a pointer that delivers mouse events through a window as the windowing system does, and
// the capability file that picks the device's graphics-quality level.

#include "tests/support/temp_dir.h"

#include <QImage>
#include <QObject>
#include <QPoint>
#include <QWidget>

#include <optional>

namespace zaf::test {

// A target with the action `playAction(QObject *sender)`; counts calls and keeps the last sender.
class ActionTarget : public QObject {
    Q_OBJECT
public:
    int calls = 0;
    QObject *lastSender = nullptr;

public Q_SLOTS:
    void playAction(QObject *sender);
};

// A top-level widget standing for the video: counts the mouse presses and releases that reach it.
class TapSurface : public QWidget {
    Q_OBJECT
public:
    TapSurface();
    int presses = 0;
    int releases = 0;

protected:
    void mousePressEvent(QMouseEvent *event) override;
    void mouseReleaseEvent(QMouseEvent *event) override;
};

// Sends left-button mouse events to a shown top-level widget's window at window coordinates, so the
// window picks the receiving child, grabs it on press and propagates ignored events.
class Pointer {
public:
    explicit Pointer(QWidget *window) : m_window(window) {}
    void press(QPoint pos, Qt::MouseButton button = Qt::LeftButton);
    void move(QPoint pos);
    void release(QPoint pos, Qt::MouseButton button = Qt::LeftButton);
    // press then release at the same point.
    void tap(QPoint pos);

private:
    void send(int type, QPoint pos, Qt::MouseButton button, Qt::MouseButtons buttons);
    QWidget *m_window;
    Qt::MouseButtons m_buttons;
};

// A widget's centre, and a point outside it (but inside the window), in the window's coordinates.
QPoint centreInWindow(const QWidget *widget);
QPoint outsideInWindow(const QWidget *widget);

// Points the capability service at a file answering `level` as graphics-quality level (no file when
// empty); the destructor restores the defaults.
class GraphicsQualityLevel {
public:
    explicit GraphicsQualityLevel(std::optional<int> level);
    ~GraphicsQualityLevel();

private:
    ScratchDir m_scratch;
};

// The mask images as the buttons load them.
QImage backgroundMask();
QImage glyphMask();

} // namespace zaf::test
