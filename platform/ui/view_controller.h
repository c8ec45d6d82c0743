#pragma once

// ViewController: a QObject that owns a view (a QWidget made on first use) and receives the
// appearance and layout callbacks the editor's lifecycle is written in, with child containment,
// first-responder status and modal presentation.
//
// Threads: main thread only; every callback below runs on the main thread. Callback order for a
// controller whose view comes on screen: loadView, viewDidLoad (on first use of view()),
// viewWillAppear, viewDidLayoutSubviews (once before viewDidAppear, and after each resize of the
// view while it is shown; a hidden view's resizes are laid out when it appears), viewDidAppear;
// going away: viewWillDisappear, viewDidDisappear. A size change of a view
// on screen runs viewWillTransitionToSize before the new size is applied and viewDidLayoutSubviews
// after it. Children added with addChildViewController whose views lie inside the parent's view get
// the same callbacks as their parent's view appears and disappears. A view that is shown or hidden
// outside such a transition (added to a window already on screen, removeFromSuperview) gets its
// will/did callbacks right then.
//
// Ownership: the controller owns its view and deletes it. A child controller is listed by its
// parent, not owned: its owner (a QObject parent, a smart pointer) keeps it alive.

#include <QList>
#include <QObject>
#include <QPointer>
#include <QRectF>
#include <QSizeF>

#include <functional>
#include <memory>

class QWidget;

namespace zaf::ui {

class TransitionCoordinator;

enum class MotionSubtype { None = 0, Shake = 1 };

struct MotionEvent {
    MotionSubtype subtype = MotionSubtype::None;
};

class ViewController : public QObject {
    Q_OBJECT
public:
    explicit ViewController(QObject *parent = nullptr);
    ~ViewController() override;

    // The view, created by loadView() and followed by viewDidLoad() on the first call.
    QWidget *view();
    bool isViewLoaded() const;
    // Sets the view; loadView overrides call it with the view they make.
    void setView(QWidget *view);
    // The view's bounds (origin 0, 0) and frame (in its parent), in points.
    QRectF viewBounds();
    QRectF viewFrame();

    // Overridable callbacks (main thread).
    virtual void loadView();           // default: a plain QWidget
    virtual void viewDidLoad() {}
    virtual void viewWillAppear(bool animated);
    virtual void viewDidAppear(bool animated);
    virtual void viewWillDisappear(bool animated);
    virtual void viewDidDisappear(bool animated);
    virtual void viewDidLayoutSubviews() {}
    // Before the view takes `size`; the coordinator runs alongside blocks at once. The base version
    // passes the call on to the child controllers whose views are loaded; overrides call it.
    virtual void viewWillTransitionToSize(const QSizeF &size, TransitionCoordinator &coordinator);

    // Child containment: the parent lists the child; the child's view is the caller's to place.
    // addChildViewController calls the child's willMoveToParentViewController(parent) and the
    // caller calls didMoveToParentViewController(parent) once the view is placed;
    // removeFromParentViewController calls didMoveToParentViewController(nullptr) and the caller
    // calls willMoveToParentViewController(nullptr) before it. The base versions do nothing.
    void addChildViewController(ViewController *child);
    void removeFromParentViewController();
    virtual void willMoveToParentViewController(ViewController *parent);
    virtual void didMoveToParentViewController(ViewController *parent);
    ViewController *parentViewController() const;
    QList<ViewController *> childViewControllers() const;
    // Whether the view is loaded and visible (in a window that is shown).
    bool isViewVisible() const;

    // First responder: the one controller of the process that receives motion events (the shake).
    // Becoming first responder takes the status from the previous holder; a controller that cannot
    // become first responder is refused.
    virtual bool canBecomeFirstResponder() const { return false; }
    bool becomeFirstResponder();
    bool resignFirstResponder();
    bool isFirstResponder() const;
    static ViewController *firstResponder();
    // Motion handling; the default passes the event on to the parent controller, if any.
    virtual void motionEnded(MotionSubtype subtype, const MotionEvent &event);

    // Modal presentation over this controller's window: the presented controller's view is shown in
    // a window-modal dialog (sized to the view's size when it was given one, else its size hint) with
    // its appearance callbacks; completion runs on a later pass of the event loop, once the view is
    // up. One presentation at a time: presenting while one is up is refused with a logged warning.
    // The user closing the dialog dismisses it.
    void presentViewController(ViewController *controller, bool animated, std::function<void()> completion = {});
    // Dismisses what this controller presented (or itself, when it was presented): the dialog hides,
    // the presented controller gets its disappearance callbacks and keeps its view; completion runs
    // on a later pass of the event loop (also when nothing was presented). Completions are dropped
    // when this controller is destroyed first.
    void dismissViewController(bool animated, std::function<void()> completion = {});
    ViewController *presentedViewController() const;
    ViewController *presentingViewController() const;
    // The dialog that shows the presented controller's view (null when nothing is presented).
    QWidget *presentationWindow() const;

    // Delivers appearance callbacks for the view and its children; used by the window host and
    // the presentation machinery.
    void beginAppearanceTransition(bool appearing, bool animated);
    void endAppearanceTransition();
    // A layout pass: the view's layout rules, then viewDidLayoutSubviews.
    void layoutView();

protected:
    bool eventFilter(QObject *watched, QEvent *event) override;

private:
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::ui
