// What the notification says after an editor, and a notifier without a session bus: it answers
// "not shown" and goes on. (A real notification service is in the whole-process run.)
#include "host/watch/desktop_notifier.h"
#include "tests/support/log_capture.h"
#include "tests/support/named_cases.h"
#include "tests/support/wait_until.h"

#include <gtest/gtest.h>

namespace zaf::host::watch {
namespace {

ZAF_PRINT_CASES_AS_NAMES

struct SummaryCase {
    const char *name;
    QStringList activityTypes;
    const char *summary;
};

class NotificationSummary : public ::testing::TestWithParam<SummaryCase> {};

TEST_P(NotificationSummary, SaysWhatTheEditorDid)
{
    EXPECT_EQ(summarizeActivityTypes(GetParam().activityTypes), QLatin1String(GetParam().summary));
}

const QString kSave = QStringLiteral("com.zafrel.activity.SaveToPhotoLibrary");
const QString kPublish = QStringLiteral("ZafPublishToYouTube");
const QString kMail = QStringLiteral("com.zafrel.activity.Mail");

INSTANTIATE_TEST_SUITE_P(
    Reports, NotificationSummary,
    ::testing::Values(SummaryCase{"Nothing", {}, "Nothing was changed"},
                      SummaryCase{"SavedTwice", {kSave, kSave}, "Saved to your Videos"},
                      SummaryCase{"Published", {kPublish}, "Published to YouTube"},
                      SummaryCase{"Mailed", {kMail}, "Shared"},
                      SummaryCase{"SharedSavedInAnyOrder", {kMail, kSave}, "Saved to your Videos and shared"},
                      SummaryCase{"AllThree", {kPublish, kMail, kSave, QStringLiteral("org.example.Other")},
                                  "Saved to your Videos, published to YouTube and shared"}),
    test::caseName);

TEST(DesktopNotifier, WithoutASessionBusLogsTheNotificationAndGoesOn)
{
    test::LogCapture log;
    DesktopNotifier notifier(QDBusConnection::connectToBus(QStringLiteral("unix:path=/nonexistent/bus"), QStringLiteral("no-bus")));
    std::optional<bool> shown;
    QObject::connect(&notifier, &DesktopNotifier::answered, [&](const QString &, bool delivered) { shown = delivered; });
    notifier.notify(QStringLiteral("Saved to your Videos"), QStringLiteral("recording.mp4"));
    ASSERT_TRUE(test::waitUntil([&] { return shown.has_value(); }, 10000));
    EXPECT_FALSE(*shown);
    const QStringList messages = log.messages(QStringLiteral("zaf.host"));
    ASSERT_EQ(messages.size(), 1);
    EXPECT_TRUE(messages[0].startsWith(QLatin1String("no desktop notification"))) << messages[0].toStdString();
    EXPECT_TRUE(messages[0].endsWith(QLatin1String("Saved to your Videos - recording.mp4"))) << messages[0].toStdString();
    QDBusConnection::disconnectFromBus(QStringLiteral("no-bus"));
}

} // namespace
} // namespace zaf::host::watch
