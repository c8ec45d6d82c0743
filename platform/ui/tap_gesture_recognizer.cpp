#include "platform/ui/tap_gesture_recognizer.h"
#include "platform/thread_rules.h"

#include <QApplication>
#include <QMouseEvent>
#include <QWidget>

namespace zaf::ui {

TapGestureRecognizer::TapGestureRecognizer(QObject *target, const QByteArray &action, QObject *parent)
    : QObject(parent), m_targetAction(target, action)
{
    ZAF_ASSERT_MAIN_THREAD();
}

void TapGestureRecognizer::attachToView(QWidget *view)
{
    if (m_view == view)
        return;
    if (m_view)
        m_view->removeEventFilter(this);
    m_view = view;
    m_pressed = false;
    if (!view)
        return;
    setParent(view);
    view->installEventFilter(this);
}

QWidget *TapGestureRecognizer::view() const
{
    return m_view;
}

QPointF TapGestureRecognizer::locationInView() const
{
    return m_location;
}

bool TapGestureRecognizer::eventFilter(QObject *watched, QEvent *event)
{
    if (watched != m_view)
        return QObject::eventFilter(watched, event);
    switch (event->type()) {
    case QEvent::MouseButtonPress: {
        auto *mouse = static_cast<QMouseEvent *>(event);
        if (mouse->button() == Qt::LeftButton) {
            m_pressed = true;
            m_pressPosition = mouse->position();
        }
        break;
    }
    case QEvent::MouseMove: {
        // Moving farther than the desktop's drag distance turns the press into a drag: no tap.
        auto *mouse = static_cast<QMouseEvent *>(event);
        if (m_pressed
            && (mouse->position() - m_pressPosition).manhattanLength() >= QApplication::startDragDistance())
            m_pressed = false;
        break;
    }
    case QEvent::MouseButtonRelease: {
        auto *mouse = static_cast<QMouseEvent *>(event);
        if (mouse->button() != Qt::LeftButton || !m_pressed)
            break;
        m_pressed = false;
        const bool inside = QRectF(m_view->rect()).contains(mouse->position());
        const bool still
            = (mouse->position() - m_pressPosition).manhattanLength() < QApplication::startDragDistance();
        if (inside && still) {
            m_location = mouse->position();
            m_targetAction.send(this);
        }
        break;
    }
    case QEvent::Hide:
        m_pressed = false;
        break;
    default:
        break;
    }
    return QObject::eventFilter(watched, event);
}

} // namespace zaf::ui
