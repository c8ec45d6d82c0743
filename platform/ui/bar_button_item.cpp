#include "platform/ui/bar_button_item.h"

#include "platform/ui/bundled_icons.h"
#include "platform/thread_rules.h"

#include <QAction>
#include <QCoreApplication>
#include <QIcon>
#include <QWidget>

namespace zaf::ui {

namespace {

// Qt's own standard button texts live in the "QPlatformTheme" translation context, so installed
// qtbase translations give them in the user's language. Qt has no "Done" button; the same
// context is asked for it so a translation can still supply one. The icon items' titles are only
// read out and shown as tooltips: Undo is Qt's text-editing "Undo", the others are our own.
QString standardTitle(SystemItem kind)
{
    switch (kind) {
    case SystemItem::Done: return QCoreApplication::translate("QPlatformTheme", "Done");
    case SystemItem::Cancel: return QCoreApplication::translate("QPlatformTheme", "Cancel");
    case SystemItem::Save: return QCoreApplication::translate("QPlatformTheme", "Save");
    case SystemItem::Action: return QCoreApplication::translate("zaf::ui::BarButtonItem", "Share");
    case SystemItem::Play: return QCoreApplication::translate("zaf::ui::BarButtonItem", "Play");
    case SystemItem::Pause: return QCoreApplication::translate("zaf::ui::BarButtonItem", "Pause");
    case SystemItem::Undo: return QCoreApplication::translate("QWidgetTextControl", "&Undo").remove(u'&');
    case SystemItem::FlexibleSpace:
    case SystemItem::FixedSpace: return QString();
    }
    return QString();
}

bool isIconKind(SystemItem kind)
{
    return kind == SystemItem::Action || kind == SystemItem::Play || kind == SystemItem::Pause
        || kind == SystemItem::Undo;
}

// The freedesktop icon names of a kind, best first; each is tried as its monochrome "-symbolic"
// variant (which a toolbar can tint) before the full-colour one.
QStringList themeIconNames(SystemItem kind)
{
    switch (kind) {
    case SystemItem::Action: return {"document-share", "emblem-shared", "send-to"};
    case SystemItem::Play: return {"media-playback-start"};
    case SystemItem::Pause: return {"media-playback-pause"};
    case SystemItem::Undo: return {"edit-undo"};
    default: return {};
    }
}

// The project's own monochrome glyph of a kind, for desktops whose icon theme lacks it.
const char *fallbackIconName(SystemItem kind)
{
    switch (kind) {
    case SystemItem::Action: return "share";
    case SystemItem::Play: return "play";
    case SystemItem::Pause: return "pause";
    case SystemItem::Undo: return "undo";
    default: return "";
    }
}

QIcon systemIcon(SystemItem kind)
{
    for (const QString &name : themeIconNames(kind)) {
        for (const QString &candidate : {name + QStringLiteral("-symbolic"), name}) {
            if (QIcon::hasThemeIcon(candidate))
                return QIcon::fromTheme(candidate);
        }
    }
    return bundledIcon(fallbackIconName(kind));
}

} // namespace

struct BarButtonItem::Private {
    bool system = false;
    SystemItem kind = SystemItem::FlexibleSpace;
    QPointer<QWidget> customView;
    QAction *action = nullptr;
    QPointer<QWidget> placedView;
    QString title;
    QString toolTip;
    QIcon icon;
    double width = 0.0;
    EdgeInsets insets;
    bool enabled = true;
    TargetAction targetAction;
};

BarButtonItem::BarButtonItem(SystemItem kind, QObject *parent) : QObject(parent), d(std::make_unique<Private>())
{
    ZAF_ASSERT_MAIN_THREAD();
    d->system = true;
    d->kind = kind;
    d->title = standardTitle(kind);
    d->toolTip = d->title;
    if (isIconKind(kind))
        d->icon = systemIcon(kind);
    if (!isSpace()) {
        d->action = new QAction(this);
        d->action->setText(d->title);
        d->action->setToolTip(d->toolTip);
        if (!d->icon.isNull())
            d->action->setIcon(d->icon);
    }
}

BarButtonItem::BarButtonItem(SystemItem kind, QObject *target, const QByteArray &action, QObject *parent)
    : BarButtonItem(kind, parent)
{
    d->targetAction.set(target, action);
    if (d->action)
        connect(d->action, &QAction::triggered, this, [this] { d->targetAction.send(this); });
}

BarButtonItem::BarButtonItem(QWidget *customView, QObject *parent) : QObject(parent), d(std::make_unique<Private>())
{
    ZAF_ASSERT_MAIN_THREAD();
    d->customView = customView;
    if (customView)
        d->title = customView->accessibleName();
}

BarButtonItem::~BarButtonItem()
{
    // A custom view that no toolbar holds any more is the item's to delete.
    if (d->customView && !d->customView->parentWidget())
        delete d->customView.data();
}

bool BarButtonItem::isSystemItem() const
{
    return d->system;
}

SystemItem BarButtonItem::systemItem() const
{
    return d->kind;
}

QWidget *BarButtonItem::customView() const
{
    return d->customView;
}

bool BarButtonItem::isSpace() const
{
    return d->system && (d->kind == SystemItem::FlexibleSpace || d->kind == SystemItem::FixedSpace);
}

QString BarButtonItem::title() const
{
    return d->title;
}

QString BarButtonItem::toolTip() const
{
    return d->toolTip;
}

void BarButtonItem::setToolTip(const QString &text)
{
    if (d->toolTip == text)
        return;
    d->toolTip = text;
    if (d->action)
        d->action->setToolTip(text);
    Q_EMIT changed();
}

QIcon BarButtonItem::icon() const
{
    return d->icon;
}

void BarButtonItem::setWidth(double points)
{
    points = std::max(0.0, points);
    if (d->width == points)
        return;
    d->width = points;
    Q_EMIT changed();
}

double BarButtonItem::width() const
{
    return d->width;
}

void BarButtonItem::setImageInsets(const EdgeInsets &insets)
{
    if (d->insets == insets)
        return;
    d->insets = insets;
    Q_EMIT changed();
}

EdgeInsets BarButtonItem::imageInsets() const
{
    return d->insets;
}

void BarButtonItem::setEnabled(bool enabled)
{
    if (d->enabled == enabled)
        return;
    d->enabled = enabled;
    if (d->action)
        d->action->setEnabled(enabled);
    Q_EMIT changed();
}

bool BarButtonItem::isEnabled() const
{
    return d->enabled;
}

TargetAction &BarButtonItem::targetAction()
{
    return d->targetAction;
}

void BarButtonItem::trigger()
{
    if (!d->enabled || isSpace())
        return;
    if (d->action)
        d->action->trigger();
    else
        d->targetAction.send(this);
}

QAction *BarButtonItem::action() const
{
    return d->action;
}

QWidget *BarButtonItem::view() const
{
    if (d->customView)
        return d->customView;
    return d->placedView;
}

void BarButtonItem::setView(QWidget *view)
{
    d->placedView = view;
}

} // namespace zaf::ui
