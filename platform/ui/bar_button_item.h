#pragma once

// BarButtonItem: one item of a toolbar, made from a system kind (with the desktop's themed icon and
// Qt's own translated standard texts), from a custom widget, or a flexible/fixed space.
//
// A system item that is not a space carries a QAction; its action is a member function connected
// to that QAction's triggered() signal, checked by the compiler. The by-name target-action form of
// target_action.h stays as an adapter for callers that only know a method's name (a plug-in's
// object reached across the plug-in boundary). Main thread only.

#include "platform/ui/target_action.h"

#include <QAction>
#include <QObject>
#include <QPointer>
#include <QString>

#include <memory>

class QIcon;
class QWidget;

namespace zaf::ui {

enum class SystemItem {
    Done, Cancel, Save, Action, Play, Pause, Undo, FlexibleSpace, FixedSpace,
};

// Image insets, in points (negative values move the image the other way).
struct EdgeInsets {
    double top = 0, left = 0, bottom = 0, right = 0;
    bool operator==(const EdgeInsets &) const = default;
};

class BarButtonItem : public QObject {
    Q_OBJECT
public:
    // A system item with nothing to call (spaces, or an item whose action() is connected later).
    explicit BarButtonItem(SystemItem kind, QObject *parent = nullptr);
    // A system item that calls receiver->method() on the main thread each time it is triggered.
    // The connection ends when the receiver is destroyed; the item never keeps it alive.
    template <typename Receiver>
    BarButtonItem(SystemItem kind, Receiver *receiver, void (Receiver::*method)(), QObject *parent = nullptr)
        : BarButtonItem(kind, parent)
    {
        if (QAction *triggering = action())
            QObject::connect(triggering, &QAction::triggered, receiver, method);
    }
    // Target-action adapter: calls the method named `action` on `target` (held weakly), as in
    // target_action.h.
    BarButtonItem(SystemItem kind, QObject *target, const QByteArray &action, QObject *parent = nullptr);
    // An item showing a custom widget (the item does not own it until it is placed on a toolbar).
    BarButtonItem(QWidget *customView, QObject *parent = nullptr);
    ~BarButtonItem() override;

    bool isSystemItem() const;
    SystemItem systemItem() const;
    QWidget *customView() const;
    bool isSpace() const;

    // The text shown or read out (tooltip and accessible name); the standard text of the kind.
    QString title() const;
    QString toolTip() const;
    void setToolTip(const QString &text);
    QIcon icon() const;

    void setWidth(double points);   // fixed spaces
    double width() const;
    void setImageInsets(const EdgeInsets &insets);
    EdgeInsets imageInsets() const;
    void setEnabled(bool enabled);
    bool isEnabled() const;

    TargetAction &targetAction();
    // Performs the item's action as a click would (tests, keyboard shortcuts).
    void trigger();

    // The QAction of a system item that is not a space (nullptr otherwise).
    QAction *action() const;

    // The widget that shows the item on screen: the custom view, or the button a toolbar made for
    // it most recently (toolbars call setView when they place the item). Null while not placed.
    QWidget *view() const;
    void setView(QWidget *view);

Q_SIGNALS:
    // Main thread: width, insets, enabled state or tooltip changed; toolbars showing the item update.
    void changed();

private:
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::ui
