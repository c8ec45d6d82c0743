// What both overlay button variants share: the factory, the pressed look and the tap's action.
#include "overlay/overlay_images.h"
#include "tests/overlay/overlay_test_support.h"
#include "tests/support/scoped_capabilities.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <memory>
#include <optional>

namespace zaf::test {
namespace {

enum Variant { Flat, WithBackdrop, WithoutBackdrop };

struct FactoryCase {
    std::int64_t style;
    std::optional<int> level; // none: the offscreen desktop's own answer (10)
    Variant expected;
};

class OverlayButtonFactory : public ::testing::TestWithParam<FactoryCase> {};

TEST_P(OverlayButtonFactory, StyleAndGraphicsQualityLevelPickTheVariant)
{
    const FactoryCase &c = GetParam();
    ScopedCapabilities device(c.level ? "{\"graphics-quality-level\": " + QByteArray::number(*c.level) + "}" : QByteArray());
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

INSTANTIATE_TEST_SUITE_P(
    Cases, OverlayButtonFactory,
    ::testing::Values(FactoryCase{0, 10, Flat}, FactoryCase{0, std::nullopt, Flat}, FactoryCase{2, 10, Flat}, FactoryCase{2, 100, Flat},
                      FactoryCase{0, 100, WithBackdrop}, FactoryCase{0, 11, WithBackdrop}, FactoryCase{0, 9, WithBackdrop},
                      FactoryCase{0, 0, WithBackdrop}, FactoryCase{1, 10, WithoutBackdrop}, FactoryCase{1, 100, WithoutBackdrop},
                      FactoryCase{7, 10, WithoutBackdrop}, FactoryCase{3, 100, WithoutBackdrop}, FactoryCase{-1, 10, WithoutBackdrop},
                      FactoryCase{INT64_MAX, 10, WithoutBackdrop}, FactoryCase{INT64_MIN, 100, WithoutBackdrop}),
    [](const auto &info) {
        const FactoryCase &c = info.param;
        return styleName(c.style) + "Level" + (c.level ? std::to_string(*c.level) : "Default");
    });

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

// The separate accessors replace one half each of the last target and action set.
TYPED_TEST(ButtonOnSurface, TapGoesToTheLastTargetActionPairSet)
{
    ZafVideoOverlayButton *button = this->button;
    ActionTarget second;
    button->setTargetAction(&second, "playAction");
    this->pointer.tap(this->centre());
    EXPECT_EQ(this->target.calls, 0);
    EXPECT_EQ(second.calls, 1);
    button->setTarget(&this->target);
    this->pointer.tap(this->centre());
    EXPECT_EQ(this->target.calls, 1);
    EXPECT_EQ(second.calls, 1);
}

TYPED_TEST(ButtonOnSurface, TapWithAnActionTheTargetLacksGoesNowhere)
{
    this->button->setAction("pauseAction");
    this->pointer.tap(this->centre());
    EXPECT_EQ(this->target.calls, 0);
}

// A target that went away is forgotten; a tap then only ends the pressed look.
TYPED_TEST(ButtonOnSurface, TargetThatWentAwayIsForgotten)
{
    auto transient = std::make_unique<ActionTarget>();
    this->button->setTargetAction(transient.get(), "playAction");
    transient.reset();
    EXPECT_EQ(this->button->target(), nullptr);
    this->pointer.tap(this->centre());
    EXPECT_FALSE(looksPressed(this->button));
}

} // namespace
} // namespace zaf::test
