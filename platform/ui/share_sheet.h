#pragma once

// ShareSheet: the panel that offers what can be done with the items being shared.
//
// The sheet lists, as large buttons with an icon and a title, the platform activities
// (share_activities.h) followed by the application's own activities, keeping those that can perform
// with the items and are not excluded, sorted by the type order when one is given (types missing
// from the order keep their place after the listed ones); a Cancel button ends the list.
//
// It is shown with the presenting controller's presentViewController(sheet, animated, completion):
// a centred panel, or, with a popover source item (the large-screen layout), a popup anchored at
// that item's widget. Choosing an activity dismisses the sheet, prepares the activity and then
// presents its activityViewController() from the controller that presented the sheet, or calls its
// performActivity() when it has none. When the activity calls activityDidFinish, its controller is
// dismissed and the completion runs with the activity's type, the completed flag and its error.
// Cancel, Escape or a click outside the popup runs the completion with an empty type, not
// completed. The completion runs exactly once per presentation, on a later pass of the event loop.
//
// Ownership: the sheet owns the platform activities; application activities stay their owner's.
// Threads: main thread only.

#include "platform/error.h"
#include "platform/ui/view_controller.h"

#include <QList>
#include <QPointer>
#include <QString>
#include <QStringList>
#include <QVariantList>

#include <functional>
#include <optional>

class QAbstractButton;

namespace zaf::ui {

class BarButtonItem;
class ShareActivity;

class ShareSheet : public ViewController {
    Q_OBJECT
public:
    using CompletionWithItemsHandler = std::function<void(const QString &activityType, bool completed,
                                                          const QVariantList &returnedItems,
                                                          const std::optional<zaf::Error> &error)>;

    ShareSheet(QVariantList activityItems, QList<ShareActivity *> applicationActivities, QObject *parent = nullptr);
    ~ShareSheet() override;

    QVariantList activityItems() const { return m_items; }
    void setExcludedActivityTypes(const QStringList &types);
    QStringList excludedActivityTypes() const { return m_excluded; }
    void setActivityTypeOrder(const QStringList &types);
    QStringList activityTypeOrder() const { return m_order; }
    void setCompletionWithItemsHandler(CompletionWithItemsHandler handler) { m_completion = std::move(handler); }
    // The large-screen layout: anchor the sheet at this item's widget as a popup.
    void setPopoverSourceItem(BarButtonItem *item);
    BarButtonItem *popoverSourceItem() const;

    // The activities offered, in the order shown.
    QList<ShareActivity *> visibleActivities();
    QStringList visibleActivityTypes();
    // The button of a listed activity (object name = its type), or the Cancel button ("cancel").
    QAbstractButton *buttonForActivityType(const QString &type);
    QAbstractButton *cancelButton();

    // What the user's choice does (also used by the buttons).
    void chooseActivity(ShareActivity *activity);
    void cancel();

    void loadView() override;
    void viewWillAppear(bool animated) override;
    void viewDidDisappear(bool animated) override;

private:
    void rebuild();
    void activityFinished(ShareActivity *activity, bool completed);
    void complete(const QString &type, bool completed, const std::optional<zaf::Error> &error);
    void placeAsPopover();

    QVariantList m_items;
    QList<QPointer<ShareActivity>> m_applicationActivities;
    QList<ShareActivity *> m_platformActivities;
    QList<QPointer<ShareActivity>> m_visible;
    QStringList m_excluded;
    QStringList m_order;
    CompletionWithItemsHandler m_completion;
    QPointer<BarButtonItem> m_popoverSourceItem;
    QPointer<QWidget> m_list;
    QPointer<QAbstractButton> m_cancelButton;

    // The run in progress.
    QPointer<ShareActivity> m_chosen;
    QString m_chosenType;
    QPointer<ViewController> m_presenter;
    QPointer<ViewController> m_activityController;
    bool m_done = true;   // the completion ran (or nothing is presented)
};

} // namespace zaf::ui
