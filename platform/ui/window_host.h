#pragma once

// WindowHost: a top-level window that shows a root ViewController's view filling it, delivers its
// appearance callbacks when the window is shown and closed, its size transitions when the window is
// resized, and the shake motion (the desktop's Undo key sequence, Ctrl+Z) to the first responder.
// Closing the window calls the close handler (the editor treats it as Cancel). Main thread only.
//
// Order: show() runs the root's viewWillAppear, shows the window (the view takes the window's size:
// viewDidLayoutSubviews), then viewDidAppear; hide() or close() runs viewWillDisappear and
// viewDidDisappear around the hiding. A resize of the shown window runs
// viewWillTransitionToSize(new size, coordinator), then the view takes the size
// (viewDidLayoutSubviews), then the coordinator's completions. Ctrl+Z pressed on any widget of the
// window delivers motionEnded(Shake) to the first responder when it belongs to this window (its view
// is in it, or it is the root or a descendant of the root); otherwise the key goes on as usual.
// The root controller keeps its view: destroying the host gives the view back unparented.

#include <QWidget>

#include <functional>
#include <memory>

namespace zaf::ui {

class ViewController;

class WindowHost : public QWidget {
    Q_OBJECT
public:
    explicit WindowHost(ViewController *root, QWidget *parent = nullptr);
    ~WindowHost() override;

    ViewController *rootViewController() const;
    // Called (main thread) when the user closes the window (or close() is called); the window stays
    // open unless the handler hides it or deletes it later (deleteLater). A close() from inside the
    // handler does nothing, as Qt ignores a close while one is in progress.
    void setCloseHandler(std::function<void()> handler);

    void setVisible(bool visible) override;

protected:
    bool eventFilter(QObject *watched, QEvent *event) override;
    void showEvent(QShowEvent *event) override;
    void hideEvent(QHideEvent *event) override;
    void resizeEvent(QResizeEvent *event) override;
    void closeEvent(QCloseEvent *event) override;

private:
    bool belongsToThisWindow(ViewController *controller) const;
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::ui
