// The timeline model without a widget. The strip of the 420 x 38 scrubber is x 10 .. 410, so on a
// 40 s movie one point is a tenth of a second.
#include "platform/ui/timeline_model.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <functional>
#include <limits>
#include <optional>

namespace zaf::ui {
namespace {

const double nan = std::nan(""), inf = std::numeric_limits<double>::infinity();
const QRectF strip(10, 2, 400, 34);
const auto rowName = [](const auto &info) { return std::string(info.param.name); };

struct Slots { const char *name; double width, aspect; int count; };
struct SlotsTest : ::testing::TestWithParam<Slots> {};

TEST_P(SlotsTest, CountCoversTheStripWidth)
{
    const Slots &c = GetParam();
    EXPECT_EQ(ThumbnailSlots::fit(QRectF(10, 2, c.width, 34), c.aspect, {0, 40}).count, c.count);
}
INSTANTIATE_TEST_SUITE_P(Fit, SlotsTest, ::testing::Values(
    Slots{"Wide", 400, 16.0 / 9.0, 7}, Slots{"Square", 400, 1.0, 12}, Slots{"Tall", 400, 0.5625, 21},
    Slots{"Narrow", 200, 16.0 / 9.0, 4}, Slots{"ExactFitAddsNoSliver", 400, 400.0 / 29 / 34, 29},
    Slots{"AtMost256", 400, 0.001, 256}, Slots{"EmptyStrip", 0, 1.0, 0}, Slots{"NaNAspectIsSquare", 400, nan, 12},
    Slots{"ZeroAspectIsSquare", 400, 0.0, 12}, Slots{"NegativeAspectIsSquare", 400, -2.0, 12},
    Slots{"InfiniteAspectIsSquare", 400, inf, 12}), rowName);

// Slots laid out for 0 .. 40 s; drawn on the full strip, or stretched while the strip shows 0 .. 20 s.
TEST(ThumbnailSlotsTest, SlotRectFollowsTheShownWindow)
{
    const ThumbnailSlots slots = ThumbnailSlots::fit(strip, 16.0 / 9.0, {0, 40});
    const QRectF second = slots.slotRect(1, TimelineScale{strip, {0, 40}});
    EXPECT_NEAR(second.left(), 70.44, 0.01);
    EXPECT_NEAR(second.width(), 60.44, 0.01);
    EXPECT_NEAR(slots.slotRect(1, TimelineScale{strip, {0, 20}}).left(), 130.89, 0.01);
}

struct Strip { const char *name; QSizeF size; double inset; QRectF rect; };
struct StripTest : ::testing::TestWithParam<Strip> {};

TEST_P(StripTest, InsetByEdgeAndMargin)
{
    EXPECT_EQ(timelineStripRect(GetParam().size, GetParam().inset), GetParam().rect);
}
INSTANTIATE_TEST_SUITE_P(Rect, StripTest, ::testing::Values(
    Strip{"Default", {420, 38}, 10, strip}, Strip{"NoInset", {420, 38}, 0, {0, 2, 420, 34}},
    Strip{"LowestWithMargin", {420, 16}, 10, {10, 2, 400, 12}}, Strip{"TooLowForMargin", {420, 15}, 10, {10, 0, 400, 15}}), rowName);

struct Mapping { const char *name; TimelineWindow window; double x, seconds; };
struct MappingTest : ::testing::TestWithParam<Mapping> {};

TEST_P(MappingTest, TimeUnderX)
{
    EXPECT_NEAR(TimelineScale({strip, GetParam().window}).valueForX(GetParam().x), GetParam().seconds, 1e-9);
}
TEST_P(MappingTest, XOfTimeIsWithinTheStripForTimesInTheWindow)
{
    const double x = std::clamp(GetParam().x, strip.left(), strip.right());
    EXPECT_NEAR(TimelineScale({strip, GetParam().window}).xForValue(GetParam().seconds), x, 1e-9);
}
INSTANTIATE_TEST_SUITE_P(Strip, MappingTest, ::testing::Values(
    Mapping{"Start", {0, 40}, 10, 0}, Mapping{"Inside", {0, 40}, 110, 10}, Mapping{"End", {0, 40}, 410, 40},
    Mapping{"LeftOfTheStripIsTheStart", {0, 40}, -50, 0}, Mapping{"RightOfTheStripIsTheEnd", {0, 40}, 500, 40},
    Mapping{"Zoomed", {36, 40}, 370, 39.6}, Mapping{"ZoomedLeftOfTheStrip", {18, 22}, 0, 18}), rowName);

// Trim lines at x 10 and 410, or close together at 210 and 220.
struct Grip { const char *name; double x, startX, endX; MovieScrubberHandle handle; };
struct GripTest : ::testing::TestWithParam<Grip> {};

TEST_P(GripTest, HandleUnderX)
{
    EXPECT_EQ(timelineGripAt(GetParam().x, GetParam().startX, GetParam().endX), GetParam().handle);
}
using H = MovieScrubberHandle;
INSTANTIATE_TEST_SUITE_P(Grips, GripTest, ::testing::Values(
    Grip{"StartGripLeftOfItsLine", 5, 10, 410, H::Start}, Grip{"StartSlopInsideTheRange", 16, 10, 410, H::Start},
    Grip{"PastTheStartSlop", 19, 10, 410, H::Playhead}, Grip{"Middle", 200, 10, 410, H::Playhead},
    Grip{"EndGripRightOfItsLine", 415, 10, 410, H::End}, Grip{"PastTheEndSlop", 429, 10, 410, H::Playhead},
    Grip{"OverlapLeftOfMiddleIsStart", 214, 210, 220, H::Start}, Grip{"OverlapRightOfMiddleIsEnd", 216, 210, 220, H::End}), rowName);

// A model on a 40 s movie, range 0 .. 40, minimum trim length 1 s; each row acts on it.
struct Act { const char *name; std::function<void(TimelineModel &)> act; double start, end, value = 0; };
struct RangeTest : ::testing::TestWithParam<Act> {};

TEST_P(RangeTest, Outcome)
{
    TimelineModel m;
    m.load(40);
    GetParam().act(m);
    EXPECT_NEAR(m.start(), GetParam().start, 1e-9);
    EXPECT_NEAR(m.end(), GetParam().end, 1e-9);
    EXPECT_NEAR(m.value(), GetParam().value, 1e-9);
}
INSTANTIATE_TEST_SUITE_P(Rules, RangeTest, ::testing::Values(
    Act{"DragStartStopsAMinimumBeforeTheEnd", [](TimelineModel &m) { m.setMinimumTrimLength(5), m.dragHandleTo(H::Start, 900); }, 35, 40},
    Act{"DragEndIsHeldByTheStart", [](TimelineModel &m) { m.setMinimumTrimLength(5), m.setRange(35, 40), m.dragHandleTo(H::End, -400); }, 35, 40},
    Act{"DragEndFollowsDownToTheMinimum", [](TimelineModel &m) { m.setMinimumTrimLength(5), m.dragHandleTo(H::End, -400); }, 0, 5},
    Act{"DragStartStopsAtZero", [](TimelineModel &m) { m.setRange(20, 30), m.dragHandleTo(H::Start, -9); }, 0, 30},
    Act{"MoveStartPushesTheEnd", [](TimelineModel &m) { m.setRange(10, 12), m.moveHandleTo(H::Start, 11.5); }, 11.5, 12.5},
    Act{"MoveEndPushesTheStart", [](TimelineModel &m) { m.setRange(10, 12), m.moveHandleTo(H::End, 10.2); }, 9.2, 10.2},
    Act{"MoveStartStopsAMinimumBeforeTheMovieEnd", [](TimelineModel &m) { m.moveHandleTo(H::Start, 39.8); }, 39, 40},
    Act{"MoveEndStopsAMinimumAfterTheMovieStart", [](TimelineModel &m) { m.moveHandleTo(H::End, 0.3); }, 0, 1},
    Act{"MoveIgnoresThePlayhead", [](TimelineModel &m) { m.moveHandleTo(H::Playhead, 5); }, 0, 40},
    Act{"MoveIgnoresNaN", [](TimelineModel &m) { m.moveHandleTo(H::End, nan); }, 0, 40},
    Act{"SetRangeOutsideTheMovieKeepsTheMinimum", [](TimelineModel &m) { m.setMinimumTrimLength(5), m.setRange(-3, 1); }, 0, 5},
    Act{"SetRangeTakesEitherOrder", [](TimelineModel &m) { m.setRange(30, 20); }, 20, 30},
    Act{"SetRangeIgnoresNaN", [](TimelineModel &m) { m.setRange(nan, 20); }, 0, 40},
    Act{"LongerMinimumWidensTheRange", [](TimelineModel &m) { m.setRange(10, 12), m.setMinimumTrimLength(5); }, 10, 15},
    Act{"MinimumLongerThanTheMovieIsTheMovie", [](TimelineModel &m) { m.setRange(10, 12), m.setMinimumTrimLength(50); }, 0, 40},
    Act{"PlayheadIsHeldToTheEnd", [](TimelineModel &m) { m.setValue(99); }, 0, 40, 40},
    Act{"PlayheadIsHeldToTheStart", [](TimelineModel &m) { m.setValue(9), m.setValue(-1); }, 0, 40, 0},
    Act{"PlayheadIgnoresNaN", [](TimelineModel &m) { m.setValue(9), m.setValue(nan); }, 0, 40, 9},
    Act{"ReloadOfTheSameDurationKeepsTheRange", [](TimelineModel &m) { m.dragHandleTo(H::Start, 10), m.load(40); }, 10, 40},
    Act{"ReloadOfAnotherDurationResetsTheRange", [](TimelineModel &m) { m.setRange(10, 20), m.setValue(35), m.load(30); }, 0, 30, 30},
    Act{"ReloadWithoutDurationKeepsEverything", [](TimelineModel &m) { m.setRange(10, 20), m.setValue(35), m.load(nan); }, 10, 20, 35},
    Act{"OwnerRangeBeforeLoadIsKept", [](TimelineModel &m) { m = {}, m.setRange(5, 50), m.setValue(99), m.load(40); }, 5, 40, 40}), rowName);

struct Zoom { const char *name; double duration, seconds; TimelineWindow shown; std::optional<TimelineWindow> window; };
struct ZoomTest : ::testing::TestWithParam<Zoom> {};

TEST_P(ZoomTest, WindowKeepsTheHandlesPlace)
{
    TimelineModel m;
    m.load(GetParam().duration);
    EXPECT_EQ(m.zoomWindowAround(GetParam().seconds, GetParam().shown), GetParam().window);
}
INSTANTIATE_TEST_SUITE_P(Windows, ZoomTest, ::testing::Values(
    Zoom{"EndOfTheMovie", 40, 40, {0, 40}, TimelineWindow{36, 40}}, Zoom{"Middle", 40, 20, {0, 40}, TimelineWindow{18, 22}},
    Zoom{"StartOfTheMovie", 40, 0, {0, 40}, TimelineWindow{0, 4}}, Zoom{"AtLeastTwoSeconds", 10, 5, {0, 10}, TimelineWindow{4, 6}},
    Zoom{"WholeMovieFits", 1.5, 1.5, {0, 1.5}, std::nullopt}, Zoom{"UnknownDuration", nan, 0, {0, 0}, std::nullopt}), rowName);

TEST(TimelineModelTest, LayoutWindowIsTheZoomWindowUntilZoomOut)
{
    TimelineModel m;
    m.load(40);
    ASSERT_TRUE(m.zoomIn(40, {0, 40}));
    EXPECT_EQ(m.layoutWindow(), (TimelineWindow{36, 40}));
    EXPECT_FALSE(m.zoomIn(20, {36, 40}));   // once zoomed, no deeper
    EXPECT_TRUE(m.zoomOut());
    EXPECT_EQ(m.layoutWindow(), (TimelineWindow{0, 40}));
}

struct Key { const char *name; double value; int key; Qt::KeyboardModifiers modifiers; std::optional<double> target; double duration = 40; };
struct KeyTest : ::testing::TestWithParam<Key> {};

TEST_P(KeyTest, PlayheadTarget)
{
    TimelineModel m;
    m.load(GetParam().duration);
    m.setValue(GetParam().value);
    EXPECT_EQ(m.keyStepTarget(GetParam().key, GetParam().modifiers), GetParam().target);
}
INSTANTIATE_TEST_SUITE_P(Keys, KeyTest, ::testing::Values(
    Key{"RightIsAFrame", 1, Qt::Key_Right, {}, 1 + 1.0 / 30}, Key{"LeftIsAFrame", 1, Qt::Key_Left, {}, 1 - 1.0 / 30},
    Key{"ShiftRightIsASecond", 1, Qt::Key_Right, Qt::ShiftModifier, 2.0}, Key{"ShiftLeftStopsAtZero", 0.5, Qt::Key_Left, Qt::ShiftModifier, 0.0},
    Key{"RightStopsAtTheEnd", 40, Qt::Key_Right, {}, 40.0}, Key{"Home", 12, Qt::Key_Home, {}, 0.0}, Key{"End", 12, Qt::Key_End, {}, 40.0},
    Key{"OtherKey", 12, Qt::Key_Up, {}, std::nullopt}, Key{"NoDuration", 12, Qt::Key_End, {}, std::nullopt, nan}), rowName);

} // namespace
} // namespace zaf::ui
