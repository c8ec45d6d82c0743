#pragma once

// A tap recognizer attached to a view: a press and release inside the view without dragging
// calls the action with the recognizer as sender. Main thread only.

#include "platform/ui/target_action.h"

#include <QObject>
#include <QPointF>

class QWidget;

namespace zaf::ui {

class TapGestureRecognizer : public QObject {
    Q_OBJECT
public:
    TapGestureRecognizer(QObject *target, const QByteArray &action, QObject *parent = nullptr);
    // Attaches to a view (the view's event filter); the recognizer becomes the view's child.
    void attachToView(QWidget *view);
    QWidget *view() const;
    QPointF locationInView() const;   // of the last tap

protected:
    bool eventFilter(QObject *watched, QEvent *event) override;

private:
    TargetAction m_targetAction;
    QWidget *m_view = nullptr;
    QPointF m_pressPosition, m_location;
    bool m_pressed = false;
};

} // namespace zaf::ui
