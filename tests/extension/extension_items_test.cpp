// The input items: decoded by title, whatever their order, into exactly one editor.
#include "tests/extension/extension_test_support.h"

#include "platform/ui/toolbar.h"

namespace zaf::test {
namespace {

TEST_F(ExtensionTest, ItemsInAnyOrderBuildOneEditorCarryingEveryValue)
{
    const QString attachment = scratch.write(QStringLiteral("notes.txt"), 10);
    QList<Item> items = {
        text(ZafVideoEditorExtensionOverrideShareMessageKey, QStringLiteral("Look at this")),
        Item{QString::fromLatin1(ZafVideoEditorExtensionOverrideTintColorKey), QStringLiteral("application/x-zaf-color"),
             QStringLiteral("#FF8000")},
        text(ZafVideoEditorExtensionBundleIdentifierKey, QStringLiteral("org.example.Recorder")),
        text(ZafVideoEditorExtensionFileAttachmentKey, attachment),
        text(ZafVideoEditorExtensionMoviePathKey, moviePath),
        text(ZafVideoEditorExtensionAppNameKey, QStringLiteral("Recorder")),
    };
    beginWith(items);
    ZafVideoEditorViewController *editor = principal()->videoEditorViewController();
    ASSERT_NE(editor, nullptr);
    EXPECT_EQ(principal()->childViewControllers().size(), 1);
    EXPECT_EQ(editor->applicationName(), QStringLiteral("Recorder"));
    EXPECT_EQ(editor->bundleIdentifier(), QStringLiteral("org.example.Recorder"));
    EXPECT_EQ(editor->videoURL(), QUrl::fromLocalFile(moviePath));
    EXPECT_EQ(editor->fileAttachmentURL(), QUrl::fromLocalFile(attachment));
    EXPECT_EQ(editor->overrideShareMessage(), QStringLiteral("Look at this"));
    EXPECT_EQ(editor->topToolBar()->tintColor(), QColor(0xff, 0x80, 0x00));
    EXPECT_EQ(editor->delegate(), principal());
}

TEST_F(ExtensionTest, OnlyTheRequiredItemsGiveAnEditorWithoutOptions)
{
    beginWith(requiredItems());
    ZafVideoEditorViewController *editor = principal()->videoEditorViewController();
    ASSERT_NE(editor, nullptr);
    EXPECT_TRUE(editor->fileAttachmentURL().isEmpty());
    EXPECT_TRUE(editor->overrideShareMessage().isNull());
    EXPECT_FALSE(editor->topToolBar()->tintColor().isValid());
}

TEST_F(ExtensionTest, MovieTitledWithTheConstantsNameIsIgnored)
{
    LogCapture logs;
    beginWith({Item{QStringLiteral("ZafVideoEditorExtensionMoviePathKey"), QStringLiteral("text/plain"), moviePath},
               text(ZafVideoEditorExtensionAppNameKey, QStringLiteral("Recorder")),
               text(ZafVideoEditorExtensionBundleIdentifierKey, QStringLiteral("org.example.Recorder"))});
    EXPECT_EQ(principal()->videoEditorViewController(), nullptr);
    EXPECT_TRUE(principal()->movieURL().isEmpty());
}

TEST_F(ExtensionTest, AttachmentThatIsNotGenericDataIsPassedOverSilently)
{
    LogCapture logs;
    QList<Item> items = requiredItems();
    items << Item{QString::fromLatin1(ZafVideoEditorExtensionOverrideShareMessageKey), QStringLiteral("not a type"),
                  QStringLiteral("ignored")};
    beginWith(items);
    ASSERT_NE(principal()->videoEditorViewController(), nullptr);
    EXPECT_TRUE(principal()->videoEditorViewController()->overrideShareMessage().isNull());
    EXPECT_EQ(logs.count(QStringLiteral("Error loading input item for type")), 0);
}

TEST_F(ExtensionTest, RepeatedTitleTakesTheHostsLastValue)
{
    QList<Item> items = requiredItems();
    items << text(ZafVideoEditorExtensionAppNameKey, QStringLiteral("Second Name"));
    beginWith(items);
    ASSERT_NE(principal()->videoEditorViewController(), nullptr);
    EXPECT_EQ(principal()->videoEditorViewController()->applicationName(), QStringLiteral("Second Name"));
}

TEST_F(ExtensionTest, FailedOptionalItemIsLoggedAndTheEditorStillBuilt)
{
    LogCapture logs;
    QList<Item> items = requiredItems();
    // A colour that is no colour cannot be loaded as one.
    items << Item{QString::fromLatin1(ZafVideoEditorExtensionOverrideTintColorKey), QStringLiteral("application/x-zaf-color"),
                  QJsonValue(42)};
    beginWith(items);
    ASSERT_NE(principal()->videoEditorViewController(), nullptr);
    EXPECT_FALSE(principal()->videoEditorViewController()->topToolBar()->tintColor().isValid());
    EXPECT_EQ(logs.count(QStringLiteral("Error loading input item for type")), 1);
}

} // namespace
} // namespace zaf::test
