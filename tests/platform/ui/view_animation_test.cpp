// Alpha, fades and the subview operations, and the tap recognizer, on real widgets.
#include "platform/ui/tap_gesture_recognizer.h"
#include "platform/ui/view_animation.h"

#include <QApplication>
#include <QMouseEvent>
#include <QSignalMapper>
#include <QWidget>
#include <QtCore/qtestsupport_core.h>
#include <gtest/gtest.h>

namespace zaf::ui {
namespace {

TEST(ViewAnimationTest, AlphaOutsideAnimationAppliesAtOnceAndHidesFromClicks)
{
    QWidget view;
    EXPECT_DOUBLE_EQ(alpha(&view), 1.0);
    setAlpha(&view, 0.0);
    EXPECT_DOUBLE_EQ(alpha(&view), 0.0);
    EXPECT_DOUBLE_EQ(presentationAlpha(&view), 0.0);
    EXPECT_TRUE(view.testAttribute(Qt::WA_TransparentForMouseEvents));
    setAlpha(&view, 0.5);
    EXPECT_DOUBLE_EQ(presentationAlpha(&view), 0.5);
    EXPECT_FALSE(view.testAttribute(Qt::WA_TransparentForMouseEvents));
    setAlpha(&view, 7.0);
    EXPECT_DOUBLE_EQ(alpha(&view), 1.0);
}

TEST(ViewAnimationTest, FadeReportsTargetAtOnceAndQuickOppositeFadesEndAtTheLastTarget)
{
    QWidget view;
    view.show();
    animate(0.1, [&] { setAlpha(&view, 0.0); });
    EXPECT_DOUBLE_EQ(alpha(&view), 0.0);
    EXPECT_GT(presentationAlpha(&view), 0.5);   // still showing
    QTest::qWait(250);
    EXPECT_DOUBLE_EQ(presentationAlpha(&view), 0.0);

    for (const double last : {1.0, 0.0}) {
        SCOPED_TRACE(last);
        animate(0.25, [&] { setAlpha(&view, last); });
        animate(0.25, [&] { setAlpha(&view, 1.0 - last); });
        animate(0.1, [&] { setAlpha(&view, last); });
        EXPECT_DOUBLE_EQ(alpha(&view), last);
        QTest::qWait(350);
        EXPECT_DOUBLE_EQ(presentationAlpha(&view), last);
        EXPECT_DOUBLE_EQ(alpha(&view), last);
    }
    // Outside a block the change is immediate again.
    setAlpha(&view, 1.0);
    EXPECT_DOUBLE_EQ(presentationAlpha(&view), 1.0);
}

TEST(ViewAnimationTest, RemoveFromSuperviewHidesAndAddSubviewRestoresOnTop)
{
    QWidget parent;
    QWidget *a = new QWidget(&parent);
    QWidget *b = new QWidget(&parent);
    parent.show();
    EXPECT_EQ(superview(a), &parent);
    removeFromSuperview(a);
    EXPECT_EQ(superview(a), nullptr);
    EXPECT_FALSE(a->isVisible());
    EXPECT_EQ(a->parentWidget(), &parent);   // still owned

    addSubview(&parent, a);
    EXPECT_EQ(superview(a), &parent);
    EXPECT_TRUE(a->isVisible());
    EXPECT_EQ(parent.children().last(), a);   // in front of b
    addSubview(&parent, b);
    EXPECT_EQ(parent.children().last(), b);

    QWidget *loose = new QWidget;
    addSubview(&parent, loose);
    EXPECT_EQ(loose->parentWidget(), &parent);
    EXPECT_TRUE(loose->isVisible());
    EXPECT_EQ(superview(&parent), nullptr);   // a window has no superview
}

TEST(TapGestureRecognizerTest, ClickFiresWithItsLocationButDragsAndStrayReleasesDoNot)
{
    QWidget view;
    view.resize(200, 100);
    QSignalMapper target;
    auto *recognizer = new TapGestureRecognizer(&target, "map");
    recognizer->attachToView(&view);
    EXPECT_EQ(recognizer->view(), &view);
    EXPECT_EQ(recognizer->parent(), &view);
    target.setMapping(recognizer, recognizer);
    int taps = 0;
    QObject::connect(&target, &QSignalMapper::mappedObject, [&](QObject *sender) {
        EXPECT_EQ(sender, recognizer);
        ++taps;
    });
    auto mouse = [&](QEvent::Type type, QPointF at, Qt::MouseButton button = Qt::LeftButton) {
        const Qt::MouseButtons buttons = type == QEvent::MouseButtonRelease ? Qt::NoButton : Qt::MouseButtons(button);
        QMouseEvent event(type, at, view.mapToGlobal(at), type == QEvent::MouseMove ? Qt::NoButton : button, buttons,
                          Qt::NoModifier);
        QApplication::sendEvent(&view, &event);
    };

    mouse(QEvent::MouseButtonPress, {50, 40});
    mouse(QEvent::MouseButtonRelease, {51, 40});
    EXPECT_EQ(taps, 1);
    EXPECT_EQ(recognizer->locationInView(), QPointF(51, 40));

    // A drag (beyond the drag distance) is not a tap, even when it comes back.
    mouse(QEvent::MouseButtonPress, {50, 40});
    mouse(QEvent::MouseMove, {50 + 3.0 * QApplication::startDragDistance(), 40});
    mouse(QEvent::MouseMove, {50, 40});
    mouse(QEvent::MouseButtonRelease, {50, 40});
    EXPECT_EQ(taps, 1);

    // A release without a press, and the right button, are no taps either.
    mouse(QEvent::MouseButtonRelease, {50, 40});
    mouse(QEvent::MouseButtonPress, {50, 40}, Qt::RightButton);
    mouse(QEvent::MouseButtonRelease, {50, 40}, Qt::RightButton);
    EXPECT_EQ(taps, 1);

    mouse(QEvent::MouseButtonPress, {10, 10});
    mouse(QEvent::MouseButtonRelease, {10, 10});
    EXPECT_EQ(taps, 2);
}

} // namespace
} // namespace zaf::ui
