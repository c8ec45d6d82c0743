#pragma once

// The large play button over the paused video: the protocol both variants conform to, and the
// factory that picks a variant. Main thread only.

#include "platform/ui/target_action.h"

#include <QByteArray>
#include <QObject>
#include <QWidget>

#include <cstdint>

// The protocol of the overlay play buttons, with the state both variants share: the style they
// were created with and the target and action a tap calls.
class ZafVideoOverlayButton {
public:
    explicit ZafVideoOverlayButton(std::int64_t style) : m_style(style) {}
    virtual ~ZafVideoOverlayButton() = default;
    // The style the button was created with.
    std::int64_t style() const { return m_style; }
    // Stores the target (weakly) and the action; a later call replaces both. A tap calls the action
    // (a slot or invokable method name, see platform/ui/target_action.h) on the target with the
    // overlay button's widget as the only argument, if the target is alive and responds to it.
    void setTargetAction(QObject *target, const QByteArray &action) { m_targetAction.set(target, action); }
    QObject *target() const { return m_targetAction.target(); }
    void setTarget(QObject *target) { m_targetAction.set(target, m_targetAction.action()); }
    QByteArray action() const { return m_targetAction.action(); }
    void setAction(const QByteArray &action) { m_targetAction.set(m_targetAction.target(), action); }
    // The button as a widget (its size fitted to its images, at the origin).
    virtual QWidget *widget() = 0;

protected:
    // A completed tap: the action on the target, with the button's widget as the argument.
    void sendAction() { m_targetAction.send(widget()); }

private:
    const std::int64_t m_style;
    zaf::ui::TargetAction m_targetAction;
};

// The factory, a class operation of views. Style 2: flat; style 0: flat when the device's
// graphics-quality level is exactly 10, high-fidelity otherwise; any other style: high-fidelity
// (without backdrop). The caller owns the result (delete the widget).
struct ZafVideoOverlayButtonFactory {
    static ZafVideoOverlayButton *_srVideoOverlayButtonWithStyle(std::int64_t style);
};
