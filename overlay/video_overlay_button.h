#pragma once

// The large play button over the paused video: the protocol both variants conform to, and the
// factory that picks a variant. Main thread only.

#include <QByteArray>
#include <QObject>

#include <cstdint>

class QWidget;

// The protocol of the overlay play buttons.
class ZafVideoOverlayButton {
public:
    virtual ~ZafVideoOverlayButton() = default;
    // The style the button was created with.
    virtual std::int64_t style() const = 0;
    // Stores the target (weakly) and the action; a later call replaces both. A tap calls the action
    // (a slot or invokable method name, see platform/ui/target_action.h) on the target with the
    // overlay button's widget as the only argument, if the target is alive and responds to it.
    virtual void setTargetAction(QObject *target, const QByteArray &action) = 0;
    // The button as a widget (its size fitted to its images, at the origin).
    virtual QWidget *widget() = 0;
};

// The factory, a class operation of views. Style 2: flat; style 0: flat when the device's
// graphics-quality level is exactly 10, high-fidelity otherwise; any other style: high-fidelity
// (without backdrop). The caller owns the result (delete the widget).
struct ZafVideoOverlayButtonFactory {
    static ZafVideoOverlayButton *_srVideoOverlayButtonWithStyle(std::int64_t style);
};
