#include "platform/ui/view_controller.h"

#include "platform/ui/layout_rules.h"
#include "platform/ui/transition_coordinator.h"
#include "platform/thread_rules.h"

#include <QDialog>
#include <QEvent>
#include <QLoggingCategory>
#include <QTimer>
#include <QVBoxLayout>
#include <QWidget>

namespace zaf::ui {

Q_LOGGING_CATEGORY(lcViewController, "zaf.ui")

namespace {

enum class Appearance { Disappeared, Appearing, Appeared, Disappearing };

// The one first responder of the process.
QPointer<ViewController> &firstResponderSlot()
{
    static QPointer<ViewController> slot;
    return slot;
}

// The size a presented view gets when nobody gave it one.
constexpr QSize kDefaultPresentedSize(480, 360);

} // namespace

struct ViewController::Private {
    QPointer<QWidget> view;
    bool loading = false;
    Appearance appearance = Appearance::Disappeared;
    bool animatedTransition = false;
    bool needsLayout = false;
    QPointer<ViewController> parent;
    QList<QPointer<ViewController>> children;
    QPointer<ViewController> presented;
    QPointer<ViewController> presenting;
    QPointer<QDialog> presentationWindow;
};

ViewController::ViewController(QObject *parent) : QObject(parent), d(std::make_unique<Private>())
{
    ZAF_ASSERT_MAIN_THREAD();
}

ViewController::~ViewController()
{
    if (firstResponderSlot() == this)
        firstResponderSlot() = nullptr;
    if (d->presented)
        d->presented->d->presenting = nullptr;
    if (d->presentationWindow) {
        // The window shows somebody else's view; give it back before the window goes.
        if (d->presented && d->presented->d->view)
            d->presented->d->view->setParent(nullptr);
        delete d->presentationWindow.data();
    }
    if (d->presenting && d->presenting->d->presented == this) {
        d->presenting->d->presented = nullptr;
        if (d->presenting->d->presentationWindow) {
            d->presenting->d->presentationWindow->deleteLater();
            d->presenting->d->presentationWindow = nullptr;
        }
    }
    if (d->parent)
        d->parent->d->children.removeAll(this);
    for (const QPointer<ViewController> &child : std::as_const(d->children)) {
        if (child)
            child->d->parent = nullptr;
    }
    // The controller owns its view (and with it the view's subviews).
    delete d->view.data();
}

QWidget *ViewController::view()
{
    ZAF_ASSERT_MAIN_THREAD();
    if (!d->view && !d->loading) {
        d->loading = true;
        loadView();
        d->loading = false;
        if (!d->view)
            d->view = new QWidget;
        d->view->installEventFilter(this);
        viewDidLoad();
    }
    return d->view;
}

void ViewController::setView(QWidget *view)
{
    if (d->view == view)
        return;
    if (d->view)
        d->view->removeEventFilter(this);
    d->view = view;
    if (view && !d->loading)
        view->installEventFilter(this);
}

bool ViewController::isViewLoaded() const
{
    return !d->view.isNull();
}

QRectF ViewController::viewBounds()
{
    return QRectF(QPointF(0, 0), QSizeF(view()->size()));
}

QRectF ViewController::viewFrame()
{
    return QRectF(view()->geometry());
}

void ViewController::loadView()
{
    setView(new QWidget);
}

void ViewController::viewWillAppear(bool)
{
}

void ViewController::viewDidAppear(bool)
{
}

void ViewController::viewWillDisappear(bool)
{
}

void ViewController::viewDidDisappear(bool)
{
}

void ViewController::viewWillTransitionToSize(const QSizeF &size, TransitionCoordinator &coordinator)
{
    for (const QPointer<ViewController> &child : std::as_const(d->children)) {
        if (child && child->isViewLoaded())
            child->viewWillTransitionToSize(size, coordinator);
    }
}

void ViewController::layoutView()
{
    if (!d->view)
        return;
    d->needsLayout = false;
    if (LayoutRules *rules = LayoutRules::existingForView(d->view))
        rules->layoutIfNeeded();
    viewDidLayoutSubviews();
}

void ViewController::addChildViewController(ViewController *child)
{
    ZAF_ASSERT_MAIN_THREAD();
    if (!child || child == this || child->d->parent == this)
        return;
    if (child->d->parent)
        child->removeFromParentViewController();
    child->willMoveToParentViewController(this);
    child->d->parent = this;
    d->children.append(child);
}

void ViewController::removeFromParentViewController()
{
    if (!d->parent)
        return;
    d->parent->d->children.removeAll(this);
    d->parent = nullptr;
    didMoveToParentViewController(nullptr);
}

void ViewController::willMoveToParentViewController(ViewController *)
{
}

void ViewController::didMoveToParentViewController(ViewController *)
{
}

ViewController *ViewController::parentViewController() const
{
    return d->parent;
}

QList<ViewController *> ViewController::childViewControllers() const
{
    QList<ViewController *> children;
    for (const QPointer<ViewController> &child : d->children) {
        if (child)
            children.append(child);
    }
    return children;
}

bool ViewController::isViewVisible() const
{
    return d->view && d->view->isVisible();
}

bool ViewController::becomeFirstResponder()
{
    if (!canBecomeFirstResponder())
        return false;
    QPointer<ViewController> &slot = firstResponderSlot();
    if (slot == this)
        return true;
    if (slot && !slot->resignFirstResponder())
        return false;
    slot = this;
    return true;
}

bool ViewController::resignFirstResponder()
{
    if (firstResponderSlot() == this)
        firstResponderSlot() = nullptr;
    return true;
}

bool ViewController::isFirstResponder() const
{
    return firstResponderSlot() == this;
}

ViewController *ViewController::firstResponder()
{
    return firstResponderSlot();
}

void ViewController::motionEnded(MotionSubtype subtype, const MotionEvent &event)
{
    if (d->parent)
        d->parent->motionEnded(subtype, event);
}

void ViewController::presentViewController(ViewController *controller, bool animated,
                                           std::function<void()> completion)
{
    ZAF_ASSERT_MAIN_THREAD();
    if (!controller || controller == this)
        return;
    if (d->presented) {
        qCWarning(lcViewController, "Cannot present a view controller while another one is presented");
        return;
    }
    if (controller->d->presenting) {
        qCWarning(lcViewController, "Cannot present a view controller that is already presented");
        return;
    }
    QWidget *presentedView = controller->view();
    QWidget *anchor = view()->window();
    // A window-modal dialog over the presenting view's window holds the presented view.
    auto *window = new QDialog(anchor);
    window->setWindowModality(Qt::WindowModal);
    window->setWindowTitle(presentedView->windowTitle());
    auto *layout = new QVBoxLayout(window);
    layout->setContentsMargins(0, 0, 0, 0);
    const QSize size = presentedView->testAttribute(Qt::WA_Resized) ? presentedView->size()
                     : presentedView->sizeHint().isValid()          ? presentedView->sizeHint().expandedTo(QSize(1, 1))
                                                                    : kDefaultPresentedSize;
    layout->addWidget(presentedView);
    presentedView->show();
    window->resize(size.expandedTo(presentedView->minimumSizeHint()));

    d->presented = controller;
    d->presentationWindow = window;
    controller->d->presenting = this;
    // The user closing the dialog (Escape, the window's close button) dismisses it.
    connect(window, &QDialog::finished, this, [this, window] {
        if (d->presentationWindow == window)
            dismissViewController(false);
    });

    controller->beginAppearanceTransition(true, animated);
    window->show();
    controller->endAppearanceTransition();
    if (completion)
        QTimer::singleShot(0, this, std::move(completion));
}

void ViewController::dismissViewController(bool animated, std::function<void()> completion)
{
    ZAF_ASSERT_MAIN_THREAD();
    if (!d->presented) {
        if (d->presenting) {
            d->presenting->dismissViewController(animated, std::move(completion));
            return;
        }
        if (completion)
            QTimer::singleShot(0, this, std::move(completion));
        return;
    }
    QPointer<ViewController> controller = d->presented;
    QPointer<QDialog> window = d->presentationWindow;
    d->presented = nullptr;
    d->presentationWindow = nullptr;

    controller->beginAppearanceTransition(false, animated);
    if (window) {
        disconnect(window, nullptr, this, nullptr);
        window->hide();
    }
    if (controller)
        controller->endAppearanceTransition();
    if (controller) {
        controller->d->presenting = nullptr;
        // The presented controller keeps its view for another presentation.
        if (controller->d->view && window && controller->d->view->window() == window) {
            controller->d->view->hide();
            controller->d->view->setParent(nullptr);
        }
    }
    if (window)
        window->deleteLater();
    if (completion)
        QTimer::singleShot(0, this, std::move(completion));
}

ViewController *ViewController::presentedViewController() const
{
    return d->presented;
}

ViewController *ViewController::presentingViewController() const
{
    return d->presenting;
}

QWidget *ViewController::presentationWindow() const
{
    return d->presentationWindow;
}

void ViewController::beginAppearanceTransition(bool appearing, bool animated)
{
    const Appearance target = appearing ? Appearance::Appearing : Appearance::Disappearing;
    if (d->appearance == target)
        return;
    if (appearing && d->appearance == Appearance::Appeared)
        return;
    if (!appearing && d->appearance == Appearance::Disappeared)
        return;
    d->appearance = target;
    d->animatedTransition = animated;
    if (appearing) {
        view();   // loads it, as the view is about to be shown
        d->needsLayout = true;
        viewWillAppear(animated);
    } else {
        viewWillDisappear(animated);
    }
    for (ViewController *child : childViewControllers()) {
        if (child->isViewLoaded() && d->view && d->view->isAncestorOf(child->d->view))
            child->beginAppearanceTransition(appearing, animated);
    }
}

void ViewController::endAppearanceTransition()
{
    if (d->appearance == Appearance::Appearing) {
        if (d->needsLayout)
            layoutView();
        d->appearance = Appearance::Appeared;
        viewDidAppear(d->animatedTransition);
    } else if (d->appearance == Appearance::Disappearing) {
        d->appearance = Appearance::Disappeared;
        viewDidDisappear(d->animatedTransition);
    } else {
        return;
    }
    for (ViewController *child : childViewControllers())
        child->endAppearanceTransition();
}

bool ViewController::eventFilter(QObject *watched, QEvent *event)
{
    if (watched != d->view)
        return QObject::eventFilter(watched, event);
    switch (event->type()) {
    case QEvent::Resize:
        // A hidden view is laid out when it appears (Qt delivers its resizes only at show anyway).
        if (d->view->isVisible())
            layoutView();
        else
            d->needsLayout = true;
        break;
    case QEvent::Show:
        // A view that comes on screen outside a transition (added to a shown parent, say) gets its
        // appearance callbacks now; transitions in progress already sent them.
        if (!event->spontaneous() && d->appearance == Appearance::Disappeared) {
            beginAppearanceTransition(true, false);
            endAppearanceTransition();
        }
        break;
    case QEvent::Hide:
        if (!event->spontaneous() && d->appearance == Appearance::Appeared) {
            beginAppearanceTransition(false, false);
            endAppearanceTransition();
        }
        break;
    default:
        break;
    }
    return QObject::eventFilter(watched, event);
}

} // namespace zaf::ui
