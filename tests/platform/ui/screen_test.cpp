// Screen and Device: the primary screen's bounds and scale, and the idiom the capability service answers.
#include "platform/ui/screen.h"

#include "tests/support/named_cases.h"
#include "tests/support/scoped_capabilities.h"

#include <QGuiApplication>
#include <QScreen>
#include <gtest/gtest.h>

namespace zaf::ui {
namespace {

TEST(ScreenTest, BoundsStartAtOriginWithThePrimaryScreensSizeAndScale)
{
    const QScreen *screen = QGuiApplication::primaryScreen();
    ASSERT_NE(screen, nullptr);
    EXPECT_EQ(Screen::mainScreenBounds(), QRectF(QPointF(0, 0), QSizeF(screen->geometry().size())));
    EXPECT_DOUBLE_EQ(Screen::mainScreenScale(), screen->devicePixelRatio());
}

struct Idiom { const char *name, *json; bool canTell; DeviceIdiom idiom; };
class DeviceTest : public ::testing::TestWithParam<Idiom> {};

TEST_P(DeviceTest, IdiomFollowsTheCapabilityServiceAndDefaultsToCannotTell)
{
    test::ScopedCapabilities capabilities(GetParam().json);
    EXPECT_EQ(Device::canTellUserInterfaceIdiom(), GetParam().canTell);
    EXPECT_EQ(Device::userInterfaceIdiom(), GetParam().idiom);
}
INSTANTIATE_TEST_SUITE_P(Answers, DeviceTest, ::testing::Values(
    Idiom{"NoFile", nullptr, false, DeviceIdiom::Unspecified}, Idiom{"Pad", R"({"device-idiom": 1})", true, DeviceIdiom::Pad},
    Idiom{"Phone", R"({"device-idiom": 0})", true, DeviceIdiom::Phone},
    Idiom{"CannotTell", R"({"device-idiom": -1})", false, DeviceIdiom::Unspecified}), test::caseName);

} // namespace
} // namespace zaf::ui
