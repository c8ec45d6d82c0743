// ViewController and WindowHost on real windows.
#include "platform/ui/transition_coordinator.h"
#include "platform/ui/view_controller.h"
#include "platform/ui/window_host.h"

#include <QApplication>
#include <QKeyEvent>
#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

namespace zaf::ui {
namespace {

using Log = std::vector<std::string>;

class Recorder : public ViewController {
public:
    Recorder(std::string name, Log *log, bool responder = false) : m_name(std::move(name)), m_log(log), m_responder(responder) {}
    void viewDidLoad() override { note("didLoad"); }
    void viewWillAppear(bool) override { note("willAppear"); }
    void viewDidAppear(bool) override { note("didAppear"); }
    void viewWillDisappear(bool) override { note("willDisappear"); }
    void viewDidDisappear(bool) override { note("didDisappear"); }
    void viewDidLayoutSubviews() override { note("didLayout " + sizeText(view()->size())); }
    void viewWillTransitionToSize(const QSizeF &size, TransitionCoordinator &coordinator) override
    {
        note("willTransition " + sizeText(size.toSize()) + " from " + sizeText(view()->size()));
        coordinator.animateAlongsideTransition([this] { note("alongside"); }, [this] { note("completion"); });
        ViewController::viewWillTransitionToSize(size, coordinator);
    }
    void willMoveToParentViewController(ViewController *parent) override { note(parent ? "willMove" : "willMove null"); }
    void didMoveToParentViewController(ViewController *parent) override { note(parent ? "didMove" : "didMove null"); }
    bool canBecomeFirstResponder() const override { return m_responder; }
    void motionEnded(MotionSubtype subtype, const MotionEvent &event) override
    {
        if (m_handlesMotion)
            note("motion " + std::to_string(int(subtype)) + " " + std::to_string(int(event.subtype)));
        else
            ViewController::motionEnded(subtype, event);
    }

    bool m_handlesMotion = true;

private:
    void note(const std::string &what) { m_log->push_back(m_name + " " + what); }
    static std::string sizeText(QSize s) { return std::to_string(s.width()) + "x" + std::to_string(s.height()); }
    std::string m_name;
    Log *m_log;
    bool m_responder;
};

// Whether the entries appear in the log in this order, others possibly between them.
::testing::AssertionResult inOrder(const Log &log, std::initializer_list<std::string> entries)
{
    auto at = log.begin();
    for (const std::string &entry : entries) {
        at = std::find(at, log.end(), entry);
        if (at == log.end())
            return ::testing::AssertionFailure() << "\"" << entry << "\" missing or out of order";
    }
    return ::testing::AssertionSuccess();
}

void sendKey(QWidget *to, int key, Qt::KeyboardModifiers modifiers)
{
    QKeyEvent press(QEvent::KeyPress, key, modifiers);
    QApplication::sendEvent(to, &press);
}

struct HostFixture : ::testing::Test {
    Log log;
    Recorder root{"root", &log, true};
    Recorder child{"child", &log, true};

    void SetUp() override
    {
        root.addChildViewController(&child);
        child.view()->setParent(root.view());
        child.view()->setGeometry(0, 0, 100, 30);
        child.didMoveToParentViewController(&root);
        log.clear();
    }
    void TearDown() override { root.resignFirstResponder(), child.resignFirstResponder(); }
};

TEST_F(HostFixture, ShowAndHideDeliverAppearanceInOrderToRootAndChildren)
{
    WindowHost host(&root);
    host.resize(320, 240);
    host.show();
    EXPECT_EQ(root.view()->size(), QSize(320, 240));
    EXPECT_TRUE(inOrder(log, {"root willAppear", "child willAppear", "root didLayout 320x240", "root didAppear", "child didAppear"}));
    EXPECT_TRUE(root.isViewVisible());
    EXPECT_TRUE(child.isViewVisible());

    {   // a child added to the shown view gets its own callbacks
        Recorder late("late", &log);
        root.addChildViewController(&late);
        log.clear();
        late.view()->setParent(root.view());
        late.view()->setGeometry(10, 10, 100, 30);
        late.view()->show();
        EXPECT_EQ(log, (Log{"late didLoad", "late willAppear", "late didLayout 100x30", "late didAppear"}));
    }
    log.clear();
    host.hide();
    EXPECT_EQ(log, (Log{"root willDisappear", "child willDisappear", "root didDisappear", "child didDisappear"}));
    EXPECT_FALSE(root.isViewVisible());
}

TEST_F(HostFixture, ResizeRunsTransitionBeforeTheNewSizeThenLayoutThenCompletion)
{
    WindowHost host(&root);
    host.resize(400, 300);
    host.show();
    log.clear();
    host.resize(300, 500);
    // The child hears of the transition through the base implementation; its view keeps its size.
    EXPECT_EQ(log, (Log{"root willTransition 300x500 from 400x300", "root alongside",
                        "child willTransition 300x500 from 100x30", "child alongside",
                        "root didLayout 300x500", "root completion", "child completion"}));
    EXPECT_EQ(root.viewBounds(), QRectF(0, 0, 300, 500));
}

TEST_F(HostFixture, ContainmentListsChildrenAndCallsTheMoveHooks)
{
    EXPECT_EQ(child.parentViewController(), &root);
    EXPECT_EQ(root.childViewControllers(), QList<ViewController *>{&child});

    Recorder other("other", &log);
    other.addChildViewController(&child);   // moves it
    EXPECT_EQ(log, (Log{"child didMove null", "child willMove"}));
    EXPECT_TRUE(root.childViewControllers().isEmpty());
    EXPECT_EQ(child.parentViewController(), &other);

    log.clear();
    child.removeFromParentViewController();
    EXPECT_EQ(log, Log{"child didMove null"});
    EXPECT_EQ(child.parentViewController(), nullptr);
    {
        Recorder shortLived("short", &log);
        root.addChildViewController(&shortLived);
        EXPECT_EQ(root.childViewControllers().size(), 1);
    }
    EXPECT_TRUE(root.childViewControllers().isEmpty());
}

TEST_F(HostFixture, FirstResponderIsOnePerProcessAndRefusedToNonResponders)
{
    Recorder plain("plain", &log, false);
    EXPECT_FALSE(plain.becomeFirstResponder());
    EXPECT_TRUE(root.becomeFirstResponder());
    EXPECT_EQ(ViewController::firstResponder(), &root);
    EXPECT_TRUE(child.becomeFirstResponder());
    EXPECT_FALSE(root.isFirstResponder());
    EXPECT_TRUE(child.isFirstResponder());
    EXPECT_TRUE(root.resignFirstResponder());   // not the responder: nothing changes
    EXPECT_EQ(ViewController::firstResponder(), &child);
    {
        Recorder temporary("temporary", &log, true);
        EXPECT_TRUE(temporary.becomeFirstResponder());
    }
    EXPECT_EQ(ViewController::firstResponder(), nullptr);
}

TEST_F(HostFixture, CtrlZAnywhereInTheWindowShakesTheFirstResponder)
{
    WindowHost host(&root);
    auto *field = new QWidget(child.view());
    host.show();
    ASSERT_TRUE(child.becomeFirstResponder());
    child.m_handlesMotion = false;   // the default passes it on to the parent
    log.clear();

    sendKey(field, Qt::Key_Z, Qt::ControlModifier);
    EXPECT_EQ(log, Log{"root motion 1 1"});

    // Other keys and keys of another window are no shake.
    sendKey(field, Qt::Key_Z, Qt::NoModifier);
    sendKey(field, Qt::Key_Y, Qt::ControlModifier);
    QWidget otherWindow;
    otherWindow.show();
    sendKey(&otherWindow, Qt::Key_Z, Qt::ControlModifier);
    EXPECT_EQ(log.size(), 1u);

    // Without a first responder nothing is delivered.
    child.resignFirstResponder();
    sendKey(&host, Qt::Key_Z, Qt::ControlModifier);
    EXPECT_EQ(log.size(), 1u);
}

TEST_F(HostFixture, CloseCallsTheHandlerInsteadOfClosingAndDestroyingTheHostGivesTheViewBack)
{
    QWidget *view = root.view();
    auto owner = std::make_unique<WindowHost>(&root);
    WindowHost &host = *owner;
    host.show();
    int calls = 0;
    host.setCloseHandler([&] { ++calls; });
    EXPECT_FALSE(host.close());
    EXPECT_EQ(calls, 1);
    EXPECT_TRUE(host.isVisible());

    // A handler that hides the window ends it.
    host.setCloseHandler([&] {
        ++calls;
        host.hide();
    });
    log.clear();
    host.close();
    EXPECT_EQ(calls, 2);
    EXPECT_FALSE(host.isVisible());
    EXPECT_EQ(log.front(), "root willDisappear");

    owner.reset();
    EXPECT_EQ(root.view(), view);
    EXPECT_EQ(view->parentWidget(), nullptr);
}

TEST_F(HostFixture, PresentationShowsAWindowModalDialogAndDismissalOrClosingEndsIt)
{
    WindowHost host(&root);
    host.show();
    Recorder sheet("sheet", &log);
    sheet.view()->resize(200, 150);
    log.clear();
    bool presented = false;
    root.presentViewController(&sheet, true, [&] { presented = true; });
    EXPECT_FALSE(presented);   // completion comes once the view is up, on a later pass
    QWidget *dialog = root.presentationWindow();
    ASSERT_NE(dialog, nullptr);
    EXPECT_TRUE(dialog->isVisible());
    EXPECT_EQ(dialog->windowModality(), Qt::WindowModal);
    EXPECT_EQ(dialog->parentWidget(), &host);
    EXPECT_EQ(sheet.view()->window(), dialog);
    EXPECT_EQ(root.presentedViewController(), &sheet);
    EXPECT_EQ(sheet.presentingViewController(), &root);
    EXPECT_TRUE(inOrder(log, {"sheet willAppear", "sheet didAppear"}));
    QApplication::processEvents();
    EXPECT_TRUE(presented);

    // A second presentation while one is up is refused.
    Recorder second("second", &log);
    root.presentViewController(&second, false);
    EXPECT_EQ(root.presentedViewController(), &sheet);

    log.clear();
    bool dismissed = false;
    sheet.dismissViewController(true, [&] { dismissed = true; });   // the presented one asks
    EXPECT_EQ(log, (Log{"sheet willDisappear", "sheet didDisappear"}));
    EXPECT_EQ(root.presentedViewController(), nullptr);
    EXPECT_EQ(sheet.presentingViewController(), nullptr);
    EXPECT_FALSE(sheet.view()->isVisible());
    EXPECT_FALSE(dismissed);
    QApplication::processEvents();
    EXPECT_TRUE(dismissed);
    EXPECT_TRUE(root.isViewVisible());   // the root's own view never disappeared

    // The user closing the dialog dismisses it as well.
    root.presentViewController(&sheet, false);
    log.clear();
    root.presentationWindow()->close();
    EXPECT_EQ(root.presentedViewController(), nullptr);
    EXPECT_EQ(log, (Log{"sheet willDisappear", "sheet didDisappear"}));
}

} // namespace
} // namespace zaf::ui
