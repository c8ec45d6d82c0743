// Screen and Device: the primary screen's bounds and scale, and the idiom the capability service
// answers.
#include "platform/ui/screen.h"

#include "tests/support/temp_dir.h"

#include <QFile>
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

TEST(DeviceTest, IdiomFollowsTheCapabilityServiceAndDefaultsToCannotTell)
{
    const struct {
        const char *json;
        bool canTell;
        DeviceIdiom idiom;
    } cases[] = {
        {nullptr, false, DeviceIdiom::Unspecified},
        {R"({"device-idiom": 1})", true, DeviceIdiom::Pad},
        {R"({"device-idiom": 0})", true, DeviceIdiom::Phone},
        {R"({"device-idiom": -1})", false, DeviceIdiom::Unspecified},
    };
    const QByteArray saved = qgetenv("ZAF_CAPABILITIES_FILE");
    zaf::test::ScratchDir dir;
    for (const auto &c : cases) {
        SCOPED_TRACE(c.json ? c.json : "no file");
        if (c.json) {
            QFile file(dir.file("capabilities.json"));
            ASSERT_TRUE(file.open(QIODevice::WriteOnly | QIODevice::Truncate) && file.write(c.json) > 0);
            file.close();
            qputenv("ZAF_CAPABILITIES_FILE", QFile::encodeName(file.fileName()));
        } else {
            qunsetenv("ZAF_CAPABILITIES_FILE");
        }
        CapabilityService::shared().reload();
        EXPECT_EQ(Device::canTellUserInterfaceIdiom(), c.canTell);
        EXPECT_EQ(Device::userInterfaceIdiom(), c.idiom);
    }
    if (saved.isNull())
        qunsetenv("ZAF_CAPABILITIES_FILE");
    else
        qputenv("ZAF_CAPABILITIES_FILE", saved);
    CapabilityService::shared().reload();
}

} // namespace
} // namespace zaf::ui
