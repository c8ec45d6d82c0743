// The capability service: desktop defaults, and the override file that replaces them.
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
        s.reload();
    }
    void useFile(const QByteArray &json)
    {
        QFile f(scratch.file("caps.json"));
        ASSERT_TRUE(f.open(QIODevice::WriteOnly) && f.write(json) == json.size());
        f.close();
        qputenv("ZAF_CAPABILITIES_FILE", QFile::encodeName(f.fileName()));
        s.reload();
    }
    test::ScratchDir scratch;
    CapabilityService &s = CapabilityService::shared(); // built (and its file read) before any capture starts
    const QString homeButton = capability::kHomeButtonType;
    void expectDefaults()
    {
        EXPECT_EQ(s.integerAnswer(homeButton, 7), 0);
        EXPECT_TRUE(s.booleanAnswer(capability::kNotGreenTea, false));
        EXPECT_FALSE(s.canTellDeviceIdiom());
        // Tests run on the offscreen platform, where only software rendering exists.
        EXPECT_EQ(s.graphicsQualityLevel(), 10);
    }
};

TEST_F(CapabilityServiceTest, DesktopDefaultsAnswerWithoutAFile)
{
    expectDefaults();
    EXPECT_EQ(s.integerAnswer("unknown-key", 42), 42);
    EXPECT_TRUE(s.booleanAnswer("unknown-key", true));
}

// A malformed or missing file is logged, and the defaults stand.
class CapabilityFileFault : public CapabilityServiceTest, public ::testing::WithParamInterface<bool> {};

TEST_P(CapabilityFileFault, LeavesTheDefaults)
{
    test::LogCapture logs;
    if (GetParam()) {
        useFile("{\"home-button-type\": 2,");
    } else {
        qputenv("ZAF_CAPABILITIES_FILE", "/nonexistent/caps.json");
        s.reload();
    }
    expectDefaults();
    EXPECT_EQ(logs.messages("zaf.capability").size(), 1);
}

INSTANTIATE_TEST_SUITE_P(Files, CapabilityFileFault, ::testing::Bool(), [](const auto &info) { return info.param ? "Malformed" : "Missing"; });

TEST_F(CapabilityServiceTest, FileOverridesTheDefaults)
{
    useFile(R"({"home-button-type": 2, "not-green-tea": false, "graphics-quality-level": 20, "device-idiom": 1})");
    EXPECT_EQ(s.integerAnswer(homeButton, 0), 2);
    EXPECT_FALSE(s.booleanAnswer(capability::kNotGreenTea, true));
    EXPECT_EQ(s.graphicsQualityLevel(), 20);
    EXPECT_TRUE(s.canTellDeviceIdiom());
    EXPECT_EQ(s.deviceIdiom(), DeviceIdiom::Pad);
}

} // namespace
} // namespace zaf
