#include "platform/ui/window_host.h"

#include "platform/ui/transition_coordinator.h"
#include "platform/ui/view_controller.h"
#include "platform/thread_rules.h"

#include <QApplication>
#include <QCloseEvent>
#include <QKeyEvent>
#include <QPointer>

namespace zaf::ui {

struct WindowHost::Private {
    QPointer<ViewController> root;
    std::function<void()> closeHandler;
};

WindowHost::WindowHost(ViewController *root, QWidget *parent) : QWidget(parent, Qt::Window), d(std::make_unique<Private>())
{
    ZAF_ASSERT_MAIN_THREAD();
    d->root = root;
    if (root) {
        QWidget *view = root->view();
        view->setParent(this);
        view->setGeometry(rect());
        view->show();
    }
    // Key presses anywhere in the window pass the application's filter first, so the shake reaches
    // the first responder whichever widget has the focus.
    qApp->installEventFilter(this);
}

WindowHost::~WindowHost()
{
    qApp->removeEventFilter(this);
    if (isVisible())
        hide();
    // The root controller owns its view: take it back out before this window deletes its children.
    if (d->root && d->root->isViewLoaded() && d->root->view()->parentWidget() == this) {
        d->root->view()->hide();
        d->root->view()->setParent(nullptr);
    }
}

ViewController *WindowHost::rootViewController() const
{
    return d->root;
}

void WindowHost::setCloseHandler(std::function<void()> handler)
{
    d->closeHandler = std::move(handler);
}

void WindowHost::setVisible(bool visible)
{
    if (visible == isVisible()) {
        QWidget::setVisible(visible);
        return;
    }
    if (d->root)
        d->root->beginAppearanceTransition(visible, false);
    // showEvent / hideEvent end the transition once the window has changed.
    QWidget::setVisible(visible);
    if (d->root)
        d->root->endAppearanceTransition();
}

void WindowHost::showEvent(QShowEvent *event)
{
    QWidget::showEvent(event);
    if (d->root && d->root->isViewLoaded())
        d->root->view()->setGeometry(rect());
}

void WindowHost::hideEvent(QHideEvent *event)
{
    QWidget::hideEvent(event);
}

void WindowHost::resizeEvent(QResizeEvent *event)
{
    QWidget::resizeEvent(event);
    if (!d->root)
        return;
    QWidget *view = d->root->view();
    if (view->parentWidget() != this || view->size() == size())
        return;
    if (!isVisible()) {
        view->setGeometry(rect());
        return;
    }
    // Before: the controller learns the new size; then the view takes it (a layout pass with
    // viewDidLayoutSubviews follows from the view's resize); then the transition ends.
    TransitionCoordinator coordinator{QSizeF(size())};
    d->root->viewWillTransitionToSize(QSizeF(size()), coordinator);
    view->setGeometry(rect());
    coordinator.complete();
}

void WindowHost::closeEvent(QCloseEvent *event)
{
    if (!d->closeHandler) {
        QWidget::closeEvent(event);
        return;
    }
    // The handler decides: the window stays unless the handler hides it or deletes it later.
    event->ignore();
    d->closeHandler();
}

bool WindowHost::eventFilter(QObject *watched, QEvent *event)
{
    if (event->type() != QEvent::KeyPress || !watched->isWidgetType())
        return QWidget::eventFilter(watched, event);
    auto *key = static_cast<QKeyEvent *>(event);
    auto *widget = static_cast<QWidget *>(watched);
    if (widget->window() != this || !key->matches(QKeySequence::Undo))
        return QWidget::eventFilter(watched, event);
    ViewController *responder = ViewController::firstResponder();
    if (!responder || !belongsToThisWindow(responder))
        return QWidget::eventFilter(watched, event);
    key->accept();
    MotionEvent motion;
    motion.subtype = MotionSubtype::Shake;
    responder->motionEnded(MotionSubtype::Shake, motion);
    return true;
}

bool WindowHost::belongsToThisWindow(ViewController *controller) const
{
    if (controller->isViewLoaded() && controller->view()->window() == this)
        return true;
    for (ViewController *c = controller; c; c = c->parentViewController()) {
        if (c == d->root)
            return true;
    }
    return false;
}

} // namespace zaf::ui
