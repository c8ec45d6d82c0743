#pragma once

// Target-action: a control keeps its target weakly and calls an action on it by name.
//
// The action is the name of a slot or Q_INVOKABLE method of the target taking either no argument or
// one QObject* (the sender), e.g. "playAction". A call does nothing when the target is gone or has
// no such method ("does not respond to the action"). Main thread only.

#include <QByteArray>
#include <QObject>
#include <QPointer>

namespace zaf::ui {

class TargetAction {
public:
    TargetAction() = default;
    TargetAction(QObject *target, QByteArray action) : m_target(target), m_action(std::move(action)) {}

    void set(QObject *target, QByteArray action)
    {
        m_target = target;
        m_action = std::move(action);
    }
    QObject *target() const { return m_target.data(); }
    QByteArray action() const { return m_action; }

    // True when the target is alive and has the action, with one QObject* argument or none.
    bool targetRespondsToAction() const;
    // Calls the action with the sender when the target responds to it; returns whether it was called.
    bool send(QObject *sender) const;

private:
    QPointer<QObject> m_target;
    QByteArray m_action;
};

} // namespace zaf::ui
