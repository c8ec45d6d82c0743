#include "platform/capability/capability_service.h"
#include "tests/support/log_capture.h"
#include "tests/support/temp_dir.h"

#include <QFile>
#include <gtest/gtest.h>

namespace zaf {
namespace {

class CapabilityServiceTest : public ::testing::Test {
protected:
    void TearDown() override
    {
        qunsetenv("ZAF_CAPABILITIES_FILE");
        CapabilityService::shared().reload();
    }
    void useFile(const QByteArray &json)
    {
        QFile f(scratch.file(QStringLiteral("caps.json")));
        ASSERT_TRUE(f.open(QIODevice::WriteOnly));
        f.write(json);
        f.close();
        qputenv("ZAF_CAPABILITIES_FILE", QFile::encodeName(f.fileName()));
        CapabilityService::shared().reload();
    }
    test::ScratchDir scratch;
};

TEST_F(CapabilityServiceTest, DesktopDefaultsAnswerWithoutAFile)
{
    CapabilityService &s = CapabilityService::shared();
    EXPECT_EQ(s.integerAnswer(QLatin1String(capability::kHomeButtonType), 7), 0);
    EXPECT_TRUE(s.booleanAnswer(QLatin1String(capability::kNotGreenTea), false));
    EXPECT_FALSE(s.canTellDeviceIdiom());
    EXPECT_EQ(s.integerAnswer(QStringLiteral("unknown-key"), 42), 42);
    EXPECT_TRUE(s.booleanAnswer(QStringLiteral("unknown-key"), true));
    // Tests run on the offscreen platform, where only software rendering exists.
    EXPECT_EQ(s.graphicsQualityLevel(), 10);
}

TEST_F(CapabilityServiceTest, FileOverridesTheDefaults)
{
    useFile(R"({"home-button-type": 2, "not-green-tea": false, "graphics-quality-level": 20, "device-idiom": 1})");
    CapabilityService &s = CapabilityService::shared();
    EXPECT_EQ(s.integerAnswer(QLatin1String(capability::kHomeButtonType), 0), 2);
    EXPECT_FALSE(s.booleanAnswer(QLatin1String(capability::kNotGreenTea), true));
    EXPECT_EQ(s.graphicsQualityLevel(), 20);
    EXPECT_TRUE(s.canTellDeviceIdiom());
    EXPECT_EQ(s.deviceIdiom(), DeviceIdiom::Pad);
}

TEST_F(CapabilityServiceTest, MalformedOrMissingFileIsLoggedAndDefaultsStand)
{
    CapabilityService::shared(); // built (and its file read) before the capture starts
    test::LogCapture logs;
    useFile("{\"home-button-type\": 2,");
    EXPECT_EQ(CapabilityService::shared().integerAnswer(QLatin1String(capability::kHomeButtonType), 0), 0);
    qputenv("ZAF_CAPABILITIES_FILE", "/nonexistent/caps.json");
    CapabilityService::shared().reload();
    EXPECT_TRUE(CapabilityService::shared().booleanAnswer(QLatin1String(capability::kNotGreenTea), false));
    EXPECT_EQ(logs.messages(QStringLiteral("zaf.capability")).size(), 2);
}

} // namespace
} // namespace zaf
