// The report to the host and the tear-down when the host removes the view.
#include "tests/extension/extension_test_support.h"

#include <QFile>

namespace zaf::test {
namespace {

TEST_F(ExtensionTest, CancelAtOnceReportsAnEmptyArray)
{
    beginWith(requiredItems());
    ASSERT_NE(principal()->videoEditorViewController(), nullptr);
    principal()->videoEditorViewController()->doneAction();
    const std::optional<QStringList> types = reportedTypes(host->receive());
    ASSERT_TRUE(types.has_value());
    EXPECT_TRUE(types->isEmpty());
}

TEST_F(ExtensionTest, CompletedActivitiesThenDoneAreReportedInOrder)
{
    beginWith(requiredItems());
    ZafVideoEditorViewController *editor = principal()->videoEditorViewController();
    ASSERT_NE(editor, nullptr);
    editor->shareSheetDidCompleteWithActivityType(QStringLiteral("com.zafrel.activity.Mail"), true);
    editor->shareSheetDidCompleteWithActivityType(QStringLiteral("com.zafrel.activity.CopyToClipboard"), false);
    editor->shareSheetDidCompleteWithActivityType(QStringLiteral("ZafPublishToYouTube"), true);
    editor->doneAction();
    const std::optional<QStringList> types = reportedTypes(host->receive());
    ASSERT_TRUE(types.has_value());
    EXPECT_EQ(*types, (QStringList{QStringLiteral("com.zafrel.activity.Mail"), QStringLiteral("ZafPublishToYouTube")}));
}

TEST_F(ExtensionTest, RemovalBeforeTheUserFinishedTearsDownWithoutReportAndEmptiesTheDirectory)
{
    beginWith(requiredItems());
    ASSERT_NE(principal()->videoEditorViewController(), nullptr);
    QFile leftover(ZafTempStore::defaultStore()._srTempPath() + QStringLiteral("Recorder_1.mp4"));
    ASSERT_TRUE(leftover.open(QIODevice::WriteOnly));
    leftover.close();

    host->send(removeView());
    ASSERT_TRUE(waitFinished());
    EXPECT_EQ(principal()->videoEditorViewController(), nullptr);
    EXPECT_TRUE(tempEntries().isEmpty());
    EXPECT_FALSE(reportedTypes(host->receive(300)).has_value());
}

TEST_F(ExtensionTest, ClosedChannelCountsAsRemoval)
{
    beginWith(requiredItems());
    ASSERT_NE(principal()->videoEditorViewController(), nullptr);
    host->closeChannel();
    ASSERT_TRUE(waitFinished());
    EXPECT_EQ(principal()->videoEditorViewController(), nullptr);
}

TEST_F(ExtensionTest, RemovalWithNoEditorOnlyLogs)
{
    LogCapture logs;
    beginWith({text(ZafVideoEditorExtensionAppNameKey, QStringLiteral("Recorder"))});
    ASSERT_EQ(principal()->videoEditorViewController(), nullptr);
    host->send(removeView());
    ASSERT_TRUE(waitFinished());
    EXPECT_EQ(logs.count(QStringLiteral("ZafVideoEditorExtensionViewController -viewDidDisappear:")), 1);
}

} // namespace
} // namespace zaf::test
