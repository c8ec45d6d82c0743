// What both overlay button variants share: the factory that picks one, the pressed look following
// the pointer, and the tap that calls the target's action.
#include "overlay/overlay_images.h"
#include "tests/overlay/overlay_test_support.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <memory>
#include <optional>

namespace zaf::test {
namespace {

TEST(OverlayButtonFactory, StyleAndGraphicsQualityLevelPickTheVariant)
{
    enum Variant { Flat, WithBackdrop, WithoutBackdrop };
    const struct {
        std::int64_t style;
        std::optional<int> level;   // none: the offscreen desktop's own answer (10)
        Variant expected;
    } cases[] = {
        {0, 10, Flat},           {0, std::nullopt, Flat},    {2, 10, Flat},           {2, 100, Flat},
        {0, 100, WithBackdrop},  {0, 11, WithBackdrop},      {0, 9, WithBackdrop},    {0, 0, WithBackdrop},
        {1, 10, WithoutBackdrop}, {1, 100, WithoutBackdrop}, {7, 10, WithoutBackdrop}, {3, 100, WithoutBackdrop},
        {-1, 10, WithoutBackdrop}, {INT64_MAX, 10, WithoutBackdrop}, {INT64_MIN, 100, WithoutBackdrop},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(testing::Message() << "style " << c.style << " level " << c.level.value_or(-1));
        GraphicsQualityLevel device(c.level);
        std::unique_ptr<ZafVideoOverlayButton> button(ZafVideoOverlayButtonFactory::_srVideoOverlayButtonWithStyle(c.style));
        ASSERT_NE(button, nullptr);
        EXPECT_EQ(button->style(), c.style);
        QWidget *widget = button->widget();
        EXPECT_EQ(widget->parentWidget(), nullptr);
        EXPECT_EQ(widget->geometry(), QRect(QPoint(0, 0), overlay::sizeInPoints(glyphMask()).toSize()));
        auto *highFidelity = dynamic_cast<ZafHighFidelityVideoOverlayButton *>(button.get());
        if (c.expected == Flat) {
            EXPECT_EQ(dynamic_cast<ZafFlatVideoOverlayButton *>(button.get()), widget);
        } else {
            ASSERT_EQ(highFidelity, widget);
            EXPECT_EQ(highFidelity->_backdropView != nullptr, c.expected == WithBackdrop);
        }
    }
}

using Variants = ::testing::Types<ZafFlatVideoOverlayButton, ZafHighFidelityVideoOverlayButton>;
TYPED_TEST_SUITE(ButtonOnSurface, Variants);

// Each pointer step and the look and number of taps it leaves behind.
TYPED_TEST(ButtonOnSurface, PressedLookFollowsThePointerAndOnlyAReleaseInsideTaps)
{
    enum Kind { Press, Move, Release };
    const struct {
        const char *event;
        Kind kind;
        bool inside;
        bool pressedAfter;
        int callsAfter;
    } steps[] = {
        {"touch down", Press, true, true, 0},          {"drag inside", Move, true, true, 0},
        {"drag outside", Move, false, false, 0},       {"drag outside again", Move, false, false, 0},
        {"drag back inside", Move, true, true, 0},     {"drag outside", Move, false, false, 0},
        {"touch up outside", Release, false, false, 0}, {"next touch down", Press, true, true, 0},
        {"touch up inside", Release, true, false, 1},
    };
    EXPECT_FALSE(looksPressed(this->button));
    for (const auto &step : steps) {
        SCOPED_TRACE(step.event);
        const QPoint pos = step.inside ? this->centre() : this->outside();
        step.kind == Press ? this->pointer.press(pos) : step.kind == Move ? this->pointer.move(pos) : this->pointer.release(pos);
        EXPECT_EQ(looksPressed(this->button), step.pressedAfter);
        EXPECT_EQ(this->target.calls, step.callsAfter);
    }
    EXPECT_EQ(this->target.lastSender, static_cast<QObject *>(this->button));   // the overlay button itself
}

TYPED_TEST(ButtonOnSurface, PointerEventsOnTheButtonNeverReachTheSurfaceBehind)
{
    this->pointer.tap(this->centre());
    // The corner lies on the button's bounds even where the round background is transparent.
    this->pointer.tap(this->button->mapTo(&this->surface, QPoint(1, 1)));
    this->pointer.press(this->centre());
    this->pointer.release(this->outside());
    EXPECT_EQ(this->surface.presses, 0);
    EXPECT_EQ(this->surface.releases, 0);
    EXPECT_EQ(this->target.calls, 2);

    this->pointer.tap(this->outside());
    EXPECT_EQ(this->surface.presses, 1);
    EXPECT_EQ(this->target.calls, 2);
}

TYPED_TEST(ButtonOnSurface, TapGoesToTheLastTargetAndActionSetAndNowhereWhenEitherIsMissing)
{
    ZafVideoOverlayButton *button = this->button;
    ActionTarget second;
    button->setTargetAction(&second, "playAction");
    this->pointer.tap(this->centre());
    EXPECT_EQ(this->target.calls, 0);
    EXPECT_EQ(second.calls, 1);

    // The separate accessors replace one half each.
    button->setTarget(&this->target);
    this->pointer.tap(this->centre());
    EXPECT_EQ(this->target.calls, 1);
    button->setAction("pauseAction");   // the target lacks it
    this->pointer.tap(this->centre());
    EXPECT_EQ(this->target.calls, 1);
    EXPECT_EQ(second.calls, 1);

    // A target that went away is forgotten; a tap then only ends the pressed look.
    auto transient = std::make_unique<ActionTarget>();
    button->setTargetAction(transient.get(), "playAction");
    transient.reset();
    EXPECT_EQ(button->target(), nullptr);
    this->pointer.tap(this->centre());
    EXPECT_FALSE(looksPressed(this->button));
}

} // namespace
} // namespace zaf::test
