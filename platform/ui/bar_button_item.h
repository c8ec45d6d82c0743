#pragma once

// BarButtonItem: one item of a toolbar, made from a system kind (with the desktop's themed icon and
// Qt's own translated standard texts), from a custom widget, or a flexible/fixed space.
// Target-action as in target_action.h. Main thread only.

#include "platform/ui/target_action.h"

#include <QObject>
#include <QPointer>
#include <QString>

class QAction;
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
    // A system item; target and action may be null/empty (spaces have none).
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
    Private *d;
};

} // namespace zaf::ui
