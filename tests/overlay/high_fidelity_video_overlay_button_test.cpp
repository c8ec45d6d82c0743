#include "overlay/high_fidelity_video_overlay_button.h"
#include "overlay/overlay_image_button.h"
#include "overlay/overlay_images.h"
#include "overlay/video_overlay_constants.h"
#include "platform/ui/backdrop_view.h"
#include "tests/overlay/overlay_test_support.h"

#include <QCoreApplication>
#include <QLabel>
#include <gtest/gtest.h>

#include <memory>

namespace zaf::test {
namespace {

using ui::BackdropView;

QList<QWidget *> childViews(const QWidget *widget)
{
    return widget->findChildren<QWidget *>(Qt::FindDirectChildrenOnly);
}

// The overlay button on a surface standing for the video, shown, with a target for `playAction`.
class HighFidelityButtonTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        button = new ZafHighFidelityVideoOverlayButton(0, &surface);
        button->move(100, 60);
        button->setTargetAction(&target, "playAction");
        surface.show();
    }
    double glyphAlpha() const { return button->_button->imageOpacity(); }

    TapSurface surface;
    ActionTarget target;
    ZafHighFidelityVideoOverlayButton *button = nullptr;
    Pointer pointer{&surface};
};

TEST(HighFidelityButtonConstruction, DefaultStyleStacksBackdropButtonAndInvisibleMaskWithTheirFlags)
{
    ZafHighFidelityVideoOverlayButton button(0);
    ASSERT_NE(button._backdropView, nullptr);
    ASSERT_NE(button.maskImageView(), nullptr);

    const QList<QWidget *> backToFront{button._backdropView, button._button, button.maskImageView()};
    EXPECT_EQ(childViews(&button), backToFront);

    EXPECT_EQ(button._backdropView->style(), 2010);
    EXPECT_EQ(button._backdropView->geometry(), button.rect());
    EXPECT_EQ(BackdropView::backdropMaskFlags(button.maskImageView()), 7);
    EXPECT_EQ(BackdropView::backdropMaskFlags(button._button), 3);
    const QList<QWidget *> masks{button.maskImageView(), button._button};
    EXPECT_EQ(button._backdropView->maskViews(), masks);

    EXPECT_EQ(button.maskImageView()->geometry(), QRect(QPoint(0, 0), overlay::sizeInPoints(backgroundMask()).toSize()));
    EXPECT_TRUE(button.maskImageView()->testAttribute(Qt::WA_TransparentForMouseEvents));
    EXPECT_EQ(button.glyphAlpha(), ZafVideoOverlayDefaultGlyphAlpha);
}

class HighFidelityButtonStyle : public ::testing::TestWithParam<std::int64_t> {};

TEST_P(HighFidelityButtonStyle, ConstructionFitsToTheGlyphAndAddsTheBackdropOnlyForStyleZero)
{
    const QSize glyphPoints = overlay::sizeInPoints(glyphMask()).toSize();
    ASSERT_FALSE(glyphPoints.isEmpty());
    ZafHighFidelityVideoOverlayButton button(GetParam());
    EXPECT_EQ(button.style(), GetParam());
    EXPECT_EQ(button.geometry(), QRect(QPoint(0, 0), glyphPoints));
    EXPECT_EQ(button._button->geometry(), QRect(QPoint(0, 0), glyphPoints));
    EXPECT_EQ(button.minimumSize(), glyphPoints); // the owner moves it; the size stays
    EXPECT_EQ(button.maximumSize(), glyphPoints);
    if (GetParam() != 0) {
        EXPECT_EQ(button._backdropView, nullptr);
        EXPECT_EQ(button.maskImageView(), nullptr);
        EXPECT_EQ(childViews(&button), QList<QWidget *>{button._button});
    }
    EXPECT_EQ(button.glyphAlpha(), ZafVideoOverlayDefaultGlyphAlpha);
}

INSTANTIATE_TEST_SUITE_P(Styles, HighFidelityButtonStyle, ::testing::Values(0, 1, 2, 3, 7, -1, INT64_MIN, INT64_MAX));

// Pointer steps on the inner button and the glyph alpha each leaves behind.
enum class Where { Inside, Outside };
struct TouchStep {
    const char *event;
    enum { Press, Move, Release } kind;
    Where where;
    double alphaAfter;
    int callsAfter;
};

TEST_F(HighFidelityButtonTest, TouchEventsSwitchTheGlyphAlphaBetweenRestAndPressed)
{
    const double rest = ZafVideoOverlayDefaultGlyphAlpha;
    const double pressed = ZafVideoOverlayHighlightedGlyphAlpha;
    const TouchStep steps[] = {
        {"touch down", TouchStep::Press, Where::Inside, pressed, 0},
        {"drag inside", TouchStep::Move, Where::Inside, pressed, 0},
        {"drag outside", TouchStep::Move, Where::Outside, rest, 0},
        {"drag outside again", TouchStep::Move, Where::Outside, rest, 0},
        {"drag back inside", TouchStep::Move, Where::Inside, pressed, 0},
        {"drag outside", TouchStep::Move, Where::Outside, rest, 0},
        {"touch up outside", TouchStep::Release, Where::Outside, rest, 0},
        {"next touch down", TouchStep::Press, Where::Inside, pressed, 0},
        {"touch up inside", TouchStep::Release, Where::Inside, rest, 1},
    };
    EXPECT_EQ(glyphAlpha(), rest);
    for (const TouchStep &step : steps) {
        SCOPED_TRACE(step.event);
        const QPoint pos = step.where == Where::Inside ? centreInWindow(button) : outsideInWindow(button);
        switch (step.kind) {
        case TouchStep::Press:
            pointer.press(pos);
            break;
        case TouchStep::Move:
            pointer.move(pos);
            break;
        case TouchStep::Release:
            pointer.release(pos);
            break;
        }
        EXPECT_EQ(glyphAlpha(), step.alphaAfter);
        EXPECT_EQ(target.calls, step.callsAfter);
    }
}

TEST_F(HighFidelityButtonTest, TapCallsTheActionOnceWithTheOverlayButtonAndEndsAtRest)
{
    pointer.tap(centreInWindow(button));
    EXPECT_EQ(target.calls, 1);
    EXPECT_EQ(target.lastSender, static_cast<QObject *>(button));
    EXPECT_NE(target.lastSender, static_cast<QObject *>(button->_button));
    EXPECT_EQ(glyphAlpha(), ZafVideoOverlayDefaultGlyphAlpha);
}

TEST_F(HighFidelityButtonTest, TapOnlyResetsTheAlphaWhenTheTargetIsGoneOrLacksTheAction)
{
    auto transient = std::make_unique<ActionTarget>();
    button->setTargetAction(transient.get(), "playAction");
    transient.reset();
    EXPECT_EQ(button->target(), nullptr);

    pointer.press(centreInWindow(button));
    pointer.release(centreInWindow(button));
    EXPECT_EQ(glyphAlpha(), ZafVideoOverlayDefaultGlyphAlpha);

    // A target without the action.
    button->setTargetAction(&target, "pauseAction");
    pointer.tap(centreInWindow(button));
    EXPECT_EQ(target.calls, 0);
    EXPECT_EQ(glyphAlpha(), ZafVideoOverlayDefaultGlyphAlpha);
}

TEST_F(HighFidelityButtonTest, SetTargetActionTwiceKeepsOnlyTheSecondPair)
{
    ActionTarget second;
    button->setTargetAction(&second, "playAction");
    EXPECT_EQ(button->target(), &second);
    EXPECT_EQ(button->action(), QByteArray("playAction"));
    pointer.tap(centreInWindow(button));
    EXPECT_EQ(target.calls, 0);
    EXPECT_EQ(second.calls, 1);

    // The separate accessors replace one half each.
    button->setTarget(&target);
    pointer.tap(centreInWindow(button));
    EXPECT_EQ(target.calls, 1);
    button->setAction("pauseAction");
    pointer.tap(centreInWindow(button));
    EXPECT_EQ(target.calls, 1);
    EXPECT_EQ(second.calls, 1);
}

TEST_F(HighFidelityButtonTest, PointerEventsOnTheButtonNeverReachTheSurfaceBehind)
{
    pointer.tap(centreInWindow(button));
    // The corner lies on the button's bounds even where the round background is transparent.
    pointer.tap(button->mapTo(&surface, QPoint(1, 1)));
    EXPECT_EQ(surface.presses, 0);
    EXPECT_EQ(surface.releases, 0);
    EXPECT_EQ(target.calls, 2);

    pointer.tap(outsideInWindow(button));
    EXPECT_EQ(surface.presses, 1);
    EXPECT_EQ(target.calls, 2);
}

TEST_F(HighFidelityButtonTest, PressTakenAwayByHidingLeavesThePressedLookAndNoTap)
{
    const QPoint centre = centreInWindow(button);
    pointer.press(centre);
    button->hide();
    pointer.release(centre);
    EXPECT_EQ(glyphAlpha(), ZafVideoOverlayHighlightedGlyphAlpha);
    EXPECT_EQ(target.calls, 0);

    button->show();
    pointer.tap(centre);
    EXPECT_EQ(target.calls, 1);
    EXPECT_EQ(glyphAlpha(), ZafVideoOverlayDefaultGlyphAlpha);
}

// The overlay button over a solid blue surface standing for the video, as the window shows it.
TEST(HighFidelityButtonLook, BackdropFrostsTheVideoInsideTheBackgroundShapeAndTheGlyphFollowsItsAlpha)
{
    const QColor video(0, 0, 200);
    TapSurface surface;
    QPalette palette = surface.palette();
    palette.setColor(QPalette::Window, video);
    surface.setPalette(palette);
    surface.setAutoFillBackground(true);
    auto *button = new ZafHighFidelityVideoOverlayButton(0, &surface);
    button->move(100, 60);
    surface.show();
    // The backdrop renders what lies behind it on the next turn of the event loop.
    for (int i = 0; i < 3; ++i) {
        surface.grab();
        QCoreApplication::processEvents();
    }
    ASSERT_FALSE(button->_backdropView->lastRenderedBackground().isNull());

    const QSize size = button->size();
    const QPoint corner(1, 1);                            // outside the round background
    const QPoint background(size.width() / 10, size.height() / 2); // inside it, left of the glyph
    const QPoint glyph(size.width() / 2, size.height() / 2);
    // The background mask is opaque around the round button and clear inside it.
    ASSERT_EQ(qAlpha(backgroundMask().pixel(corner)), 255);
    ASSERT_EQ(qAlpha(backgroundMask().pixel(background)), 0);
    ASSERT_EQ(qAlpha(glyphMask().pixel(background)), 0);
    ASSERT_EQ(qAlpha(glyphMask().pixel(glyph)), 255);

    auto shown = [&](QPoint inButton) { return surface.grab().toImage().pixelColor(button->mapTo(&surface, inButton)); };
    // Outside the background shape the video shows untouched.
    EXPECT_EQ(shown(corner), video);
    // Inside it, a light frost; the invisible mask view's white shape is not drawn over it.
    const QColor frost = shown(background);
    EXPECT_GT(frost.red(), video.red() + 50);
    EXPECT_LT(frost.red(), 250);
    // The glyph cuts into the frost, deeper while pressed.
    const QColor glyphAtRest = shown(glyph);
    EXPECT_LT(glyphAtRest.red(), frost.red());
    Pointer pointer(&surface);
    pointer.press(centreInWindow(button));
    const QColor glyphPressed = shown(glyph);
    EXPECT_LT(glyphPressed.red(), glyphAtRest.red());
    pointer.release(centreInWindow(button));
    EXPECT_EQ(shown(glyph), glyphAtRest);
}

} // namespace
} // namespace zaf::test
