#include "platform/ui/share_sheet.h"

#include "platform/log.h"
#include "platform/ui/bar_button_item.h"
#include "platform/ui/share_activities.h"
#include "platform/ui/share_activity.h"
#include "platform/thread_rules.h"

#include <QAction>
#include <QGridLayout>
#include <QGuiApplication>
#include <QLabel>
#include <QPushButton>
#include <QScreen>
#include <QTimer>
#include <QToolButton>
#include <QVBoxLayout>
#include <QWidget>

#include <algorithm>
#include <climits>

namespace zaf::ui {
namespace {

constexpr int kColumns = 4;
constexpr int kIconSize = 48;
constexpr int kButtonWidth = 104;
constexpr int kButtonHeight = 96;
constexpr int kPopoverGap = 4;

// The on-screen widget that shows a bar button item: the view a toolbar placed it in, else a
// visible widget its action was added to.
QWidget *widgetOfItem(BarButtonItem *item)
{
    if (!item)
        return nullptr;
    if (QWidget *view = item->view(); view && view->isVisible())
        return view;
    if (QAction *action = item->action()) {
        for (QObject *object : action->associatedObjects()) {
            auto *widget = qobject_cast<QWidget *>(object);
            if (widget && widget->isVisible() && !widget->inherits("QMenu"))
                return widget;
        }
    }
    return nullptr;
}

} // namespace

ShareSheet::ShareSheet(QVariantList activityItems, QList<ShareActivity *> applicationActivities, QObject *parent)
    : ViewController(parent), m_items(std::move(activityItems))
{
    ZAF_ASSERT_MAIN_THREAD();
    for (ShareActivity *activity : applicationActivities) {
        if (activity)
            m_applicationActivities.append(activity);
    }
    m_platformActivities = makePlatformShareActivities(this);
}

ShareSheet::~ShareSheet() = default;

void ShareSheet::setExcludedActivityTypes(const QStringList &types)
{
    m_excluded = types;
    if (isViewLoaded())
        rebuild();
}

void ShareSheet::setActivityTypeOrder(const QStringList &types)
{
    m_order = types;
    if (isViewLoaded())
        rebuild();
}

void ShareSheet::setPopoverSourceItem(BarButtonItem *item)
{
    m_popoverSourceItem = item;
}

BarButtonItem *ShareSheet::popoverSourceItem() const
{
    return m_popoverSourceItem.data();
}

QList<ShareActivity *> ShareSheet::visibleActivities()
{
    view();
    QList<ShareActivity *> activities;
    for (const QPointer<ShareActivity> &activity : m_visible) {
        if (activity)
            activities.append(activity.data());
    }
    return activities;
}

QStringList ShareSheet::visibleActivityTypes()
{
    QStringList types;
    for (ShareActivity *activity : visibleActivities())
        types.append(activity->activityType());
    return types;
}

QAbstractButton *ShareSheet::buttonForActivityType(const QString &type)
{
    view();
    return m_list ? m_list->findChild<QAbstractButton *>(type) : nullptr;
}

QAbstractButton *ShareSheet::cancelButton()
{
    view();
    return m_cancelButton.data();
}

void ShareSheet::loadView()
{
    auto *panel = new QWidget;
    panel->setWindowTitle(tr("Share"));
    auto *layout = new QVBoxLayout(panel);
    layout->setContentsMargins(16, 16, 16, 16);
    layout->setSpacing(12);
    auto *title = new QLabel(tr("Share"), panel);
    QFont font = title->font();
    font.setBold(true);
    title->setFont(font);
    title->setAlignment(Qt::AlignHCenter);
    layout->addWidget(title);

    m_list = new QWidget(panel);
    m_list->setObjectName(QStringLiteral("activities"));
    auto *grid = new QGridLayout(m_list);
    grid->setContentsMargins(0, 0, 0, 0);
    grid->setSpacing(8);
    layout->addWidget(m_list);

    auto *cancel = new QPushButton(tr("Cancel"), panel);
    cancel->setObjectName(QStringLiteral("cancel"));
    cancel->setMinimumHeight(36);
    connect(cancel, &QPushButton::clicked, this, &ShareSheet::cancel);
    layout->addWidget(cancel);
    m_cancelButton = cancel;

    setView(panel);
    rebuild();
}

void ShareSheet::rebuild()
{
    // The candidates: the platform's, then the application's, that can perform and are not excluded.
    QList<ShareActivity *> candidates = m_platformActivities;
    for (const QPointer<ShareActivity> &activity : m_applicationActivities) {
        if (activity)
            candidates.append(activity.data());
    }
    QList<ShareActivity *> shown;
    for (ShareActivity *activity : candidates) {
        if (m_excluded.contains(activity->activityType()))
            continue;
        if (!activity->canPerformWithActivityItems(m_items))
            continue;
        shown.append(activity);
    }
    const auto rank = [this](ShareActivity *activity) {
        const qsizetype index = m_order.indexOf(activity->activityType());
        return index < 0 ? LLONG_MAX : static_cast<long long>(index);
    };
    std::stable_sort(shown.begin(), shown.end(), [&](ShareActivity *a, ShareActivity *b) { return rank(a) < rank(b); });
    m_visible.clear();
    for (ShareActivity *activity : shown)
        m_visible.append(activity);

    if (!m_list)
        return;
    auto *grid = static_cast<QGridLayout *>(m_list->layout());
    const QList<QAbstractButton *> old = m_list->findChildren<QAbstractButton *>(Qt::FindDirectChildrenOnly);
    for (QAbstractButton *button : old) {
        grid->removeWidget(button);
        delete button;
    }
    int position = 0;
    for (ShareActivity *activity : shown) {
        auto *button = new QToolButton(m_list);
        button->setObjectName(activity->activityType());
        button->setText(activity->activityTitle());
        button->setAccessibleName(activity->activityTitle());
        button->setIcon(activity->activityImage());
        button->setIconSize(QSize(kIconSize, kIconSize));
        button->setToolButtonStyle(Qt::ToolButtonTextUnderIcon);
        button->setAutoRaise(true);
        button->setFixedSize(kButtonWidth, kButtonHeight);
        QPointer<ShareActivity> guarded(activity);
        connect(button, &QToolButton::clicked, this, [this, guarded] {
            if (guarded)
                chooseActivity(guarded.data());
        });
        grid->addWidget(button, position / kColumns, position % kColumns);
        ++position;
    }
}

void ShareSheet::viewWillAppear(bool animated)
{
    ViewController::viewWillAppear(animated);
    m_done = false;
    m_chosen = nullptr;
    m_activityController = nullptr;
    rebuild();
    if (m_popoverSourceItem)
        placeAsPopover();
}

void ShareSheet::placeAsPopover()
{
    QWidget *window = view()->window();
    QWidget *anchor = widgetOfItem(m_popoverSourceItem.data());
    if (window == view() || !anchor) {
        log::info(lcShare(), QStringLiteral("No widget for the popover source item; showing the sheet centred"));
        return;
    }
    const QSize size = window->size().expandedTo(window->sizeHint());
    window->setWindowFlags(Qt::Popup);
    window->resize(size);

    const QPoint anchorTop = anchor->mapToGlobal(QPoint(0, 0));
    const QRect anchorRect(anchorTop, anchor->size());
    QScreen *screen = anchor->screen() ? anchor->screen() : QGuiApplication::primaryScreen();
    const QRect available = screen ? screen->availableGeometry() : QRect(QPoint(0, 0), QSize(INT_MAX / 2, INT_MAX / 2));
    // Below the item when it fits, else above it (a bottom toolbar), centred on it horizontally.
    int y = anchorRect.bottom() + 1 + kPopoverGap;
    if (y + size.height() > available.bottom() + 1)
        y = anchorRect.top() - kPopoverGap - size.height();
    int x = anchorRect.center().x() - size.width() / 2;
    x = std::clamp(x, available.left(), std::max(available.left(), available.right() + 1 - size.width()));
    y = std::max(y, available.top());
    window->move(x, y);
}

void ShareSheet::viewDidDisappear(bool animated)
{
    ViewController::viewDidDisappear(animated);
    // Gone without a choice: Cancel, Escape, or a click outside the popup.
    if (!m_done && !m_chosen)
        complete(QString(), false, std::nullopt);
}

void ShareSheet::cancel()
{
    if (m_done || m_chosen)
        return;
    if (presentingViewController())
        dismissViewController(true);   // viewDidDisappear completes
    else
        complete(QString(), false, std::nullopt);
}

void ShareSheet::chooseActivity(ShareActivity *activity)
{
    ZAF_ASSERT_MAIN_THREAD();
    if (!activity || m_done || m_chosen) {
        log::info(lcShare(), QStringLiteral("Activity choice ignored: the sheet is not waiting for one"));
        return;
    }
    m_chosen = activity;
    m_presenter = presentingViewController();
    activity->beginRun();
    activity->setPresentationWidget(m_presenter && m_presenter->isViewLoaded() ? m_presenter->view()->window() : nullptr);
    m_chosenType = activity->activityType();
    connect(activity, &ShareActivity::activityFinished, this, [this, activity](bool completed) {
        activityFinished(activity, completed);
    });
    // An activity destroyed before it finished ends the run, not completed.
    connect(activity, &QObject::destroyed, this, [this] {
        if (m_chosen || m_done)
            return;
        if (m_activityController && m_presenter && m_presenter->presentedViewController() == m_activityController)
            m_presenter->dismissViewController(true);
        m_activityController = nullptr;
        complete(m_chosenType, false, Error{QString::fromLatin1(kShareErrorDomain), kShareErrorNoItems,
                                            QStringLiteral("The activity went away before it finished")});
    });
    log::info(lcShare(), QStringLiteral("Chose activity %1").arg(activity->activityType()));
    if (presentingViewController())
        dismissViewController(true);

    // The activity starts once the sheet is gone.
    QPointer<ShareActivity> guarded(activity);
    QTimer::singleShot(0, this, [this, guarded] {
        if (!guarded || guarded != m_chosen)
            return;
        guarded->prepareWithActivityItems(m_items);
        if (guarded->isFinished() || guarded != m_chosen)
            return;
        ViewController *controller = guarded->activityViewController();
        if (!controller) {
            guarded->performActivity();
            return;
        }
        if (!m_presenter || m_presenter->presentedViewController()) {
            guarded->setActivityError(Error{QString::fromLatin1(kShareErrorDomain), kShareErrorNoItems,
                                            QStringLiteral("Nowhere to present the activity's view")});
            guarded->activityDidFinish(false);
            return;
        }
        m_activityController = controller;
        m_presenter->presentViewController(controller, true);
    });
}

void ShareSheet::activityFinished(ShareActivity *activity, bool completed)
{
    ZAF_ASSERT_MAIN_THREAD();
    disconnect(activity, nullptr, this, nullptr);
    if (activity != m_chosen)
        return;
    const QString type = activity->activityType();
    const OptionalError error = activity->activityError();
    m_chosen = nullptr;
    if (m_activityController && m_presenter && m_presenter->presentedViewController() == m_activityController)
        m_presenter->dismissViewController(true);
    m_activityController = nullptr;
    complete(type, completed, error);
}

void ShareSheet::complete(const QString &type, bool completed, const std::optional<zaf::Error> &error)
{
    if (m_done)
        return;
    m_done = true;
    log::info(lcShare(), QStringLiteral("Share sheet done: type \"%1\", completed %2").arg(type).arg(completed));
    CompletionWithItemsHandler handler = m_completion;
    if (!handler)
        return;
    QTimer::singleShot(0, this, [handler, type, completed, error] { handler(type, completed, QVariantList(), error); });
}

} // namespace zaf::ui
