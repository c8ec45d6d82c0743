// The editor extension over a real socket pair, in this process (the test is the host).
#include "extension/extension_declaration.h"
#include "extension/extension_keys.h"
#include "extension/extension_view_controller.h"
#include "platform/extensionkit/extension_runtime.h"
#include "platform/extensionkit/json_rpc.h"
#include "platform/ui/toolbar.h"
#include "platform/ui/window_host.h"
#include "tempstore/temp_store.h"
#include "tests/platform/extensionkit/socket_pair.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/named_cases.h"
#include "tests/support/process_temp_directory.h"
#include "tests/support/temp_dir.h"

#include <QApplication>
#include <QDir>
#include <QTest>
#include <QFile>
#include <QJsonArray>
#include <gtest/gtest.h>

namespace zaf::test {
namespace {

struct Item {
    QString title;
    QString type;
    QJsonValue value;
};

Item text(const char *key, const QString &value)
{
    return Item{QString::fromLatin1(key), "text/plain", value};
}

class ExtensionTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        usePrivateTempDirectoryForProcess();
        fixture::FixtureSpec oneSecond;
        oneSecond.seconds = 1;
        moviePath = makeFixtureMovie(scratch.path(), oneSecond);
        extensionkit::ExtensionDeclaration declaration = ZafVideoEditorExtensionDeclaration();
        declaration.prepareProcess = {}; // the process-wide preparation happened above
        runtime = std::make_unique<extensionkit::ExtensionRuntime>(host.releaseExtensionFd(), declaration);
        QObject::connect(runtime.get(), &extensionkit::ExtensionRuntime::finished, [this] { finished = true; });
        ASSERT_TRUE(runtime->start());
    }

    QList<Item> requiredItems() const
    {
        return {text(ZafVideoEditorExtensionMoviePathKey, moviePath), text(ZafVideoEditorExtensionAppNameKey, "Recorder"),
                text(ZafVideoEditorExtensionBundleIdentifierKey, "org.example.Recorder")};
    }
    ZafVideoEditorExtensionViewController *principal() const
    {
        return qobject_cast<ZafVideoEditorExtensionViewController *>(runtime->principal());
    }
    ZafVideoEditorViewController *editor() const { return principal()->videoEditorViewController(); }
    // Sends the request (one attachment per item) and handles events until the extension has
    // answered and its item loads have ended (the editor is then built if the required items were there).
    void beginWith(const QList<Item> &items)
    {
        QJsonArray inputItems;
        for (const Item &item : items)
            inputItems.append(QJsonObject{{"title", item.title}, {"attachments", QJsonArray{QJsonObject{{"type", item.type}, {"value", item.value}}}}});
        host.writeMessage(extensionkit::jsonrpc::makeRequest(1, "beginExtensionRequest", QJsonObject{{"inputItems", inputItems}}));
        const QList<QJsonObject> answer = host.readMessages(1);
        ASSERT_EQ(answer.size(), 1);
        EXPECT_EQ(answer[0].value("result").toObject().value("accepted"), QJsonValue(true));
        waitUntil([] { return false; }, 300);
    }
    void removeView() { host.writeMessage(extensionkit::jsonrpc::makeNotification("removeExtensionView")); }
    // The activity types of the next extensionDidFinishWithActivityTypes notification, or nullopt.
    std::optional<QStringList> reportedTypes(int timeoutMs = 5000)
    {
        const QList<QJsonObject> messages = host.readMessages(1, timeoutMs);
        const QJsonArray params = messages.value(0).value("params").toArray();
        if (messages.isEmpty() || messages[0].value("method") != "extensionDidFinishWithActivityTypes" || messages[0].contains("id")
            || params.size() != 1 || !params[0].isArray())
            return std::nullopt;
        return params[0].toVariant().toStringList();
    }
    static QStringList tempEntries()
    {
        return QDir(ZafTempStore::defaultStore()._srTempPath()).entryList(QDir::AllEntries | QDir::Hidden | QDir::NoDotAndDotDot);
    }

    ScratchDir scratch;
    QString moviePath;
    SocketPair host; // outlives the runtime
    bool finished = false;
    std::unique_ptr<extensionkit::ExtensionRuntime> runtime;
};

const QString kColorType = "application/x-zaf-color";

TEST_F(ExtensionTest, ItemsInAnyOrderBuildOneEditorCarryingEveryValue)
{
    const QString attachment = scratch.write("notes.txt", 10);
    beginWith({text(ZafVideoEditorExtensionOverrideShareMessageKey, "Look at this"),
               Item{ZafVideoEditorExtensionOverrideTintColorKey, kColorType, "#FF8000"},
               text(ZafVideoEditorExtensionBundleIdentifierKey, "org.example.Recorder"),
               text(ZafVideoEditorExtensionFileAttachmentKey, attachment), text(ZafVideoEditorExtensionMoviePathKey, moviePath),
               text(ZafVideoEditorExtensionAppNameKey, "Recorder")});
    ASSERT_NE(editor(), nullptr);
    EXPECT_EQ(principal()->childViewControllers().size(), 1);
    EXPECT_EQ(editor()->applicationName(), "Recorder");
    EXPECT_EQ(editor()->bundleIdentifier(), "org.example.Recorder");
    EXPECT_EQ(editor()->videoURL(), QUrl::fromLocalFile(moviePath));
    EXPECT_EQ(editor()->fileAttachmentURL(), QUrl::fromLocalFile(attachment));
    EXPECT_EQ(editor()->overrideShareMessage(), "Look at this");
    EXPECT_EQ(editor()->topToolBar()->tintColor(), QColor(0xff, 0x80, 0x00));
    EXPECT_EQ(editor()->delegate(), principal());
}

TEST_F(ExtensionTest, OnlyTheRequiredItemsGiveAnEditorWithoutOptions)
{
    beginWith(requiredItems());
    ASSERT_NE(editor(), nullptr);
    EXPECT_TRUE(editor()->fileAttachmentURL().isEmpty());
    EXPECT_TRUE(editor()->overrideShareMessage().isNull());
    EXPECT_FALSE(editor()->topToolBar()->tintColor().isValid());
}

TEST_F(ExtensionTest, MovieTitledWithTheConstantsNameIsIgnored)
{
    QList<Item> items = requiredItems();
    items[0].title = "ZafVideoEditorExtensionMoviePathKey";
    beginWith(items);
    EXPECT_EQ(editor(), nullptr);
    EXPECT_TRUE(principal()->movieURL().isEmpty());
}

TEST_F(ExtensionTest, RepeatedTitleTakesTheHostsLastValueAndUnusableOptionalItemsAreSkipped)
{
    // An attachment whose type is no MIME type is passed over silently; a colour that is no colour
    // fails to load, which is logged, and the editor is still built.
    LogCapture logs;
    beginWith(requiredItems() << text(ZafVideoEditorExtensionAppNameKey, "Second Name")
                              << Item{ZafVideoEditorExtensionOverrideShareMessageKey, "not a type", "ignored"}
                              << Item{ZafVideoEditorExtensionOverrideTintColorKey, kColorType, 42});
    ASSERT_NE(editor(), nullptr);
    EXPECT_EQ(editor()->applicationName(), "Second Name");
    EXPECT_TRUE(editor()->overrideShareMessage().isNull());
    EXPECT_FALSE(editor()->topToolBar()->tintColor().isValid());
    EXPECT_EQ(logs.count("Error loading input item for type"), 1);
}

TEST_F(ExtensionTest, CancelAtOnceReportsAnEmptyArray)
{
    beginWith(requiredItems());
    ASSERT_NE(editor(), nullptr);
    editor()->doneAction();
    EXPECT_EQ(reportedTypes(), QStringList());
}

TEST_F(ExtensionTest, CompletedActivitiesThenDoneAreReportedInOrder)
{
    beginWith(requiredItems());
    ASSERT_NE(editor(), nullptr);
    editor()->shareSheetDidCompleteWithActivityType("com.zafrel.activity.Mail", true);
    editor()->shareSheetDidCompleteWithActivityType("com.zafrel.activity.CopyToClipboard", false);
    editor()->shareSheetDidCompleteWithActivityType("ZafPublishToYouTube", true);
    editor()->doneAction();
    EXPECT_EQ(reportedTypes(), (QStringList{"com.zafrel.activity.Mail", "ZafPublishToYouTube"}));
}

// The host removes the view before the user finished (with or without an editor), or the host dies
// (its end of the channel closes): the extension tears down without a report and keeps the host's
// movie as it was; the editor's end empties the temporary directory.
struct Removal { const char *name; bool hostDies, withEditor; };
class ExtensionRemovalTest : public ExtensionTest, public ::testing::WithParamInterface<Removal> {};

TEST_P(ExtensionRemovalTest, TearsDownWithoutReportEmptiesTheDirectoryAndKeepsTheMovie)
{
    const bool hostDies = GetParam().hostDies;
    const QByteArray movieBefore = fileDigest(moviePath);
    LogCapture logs;
    beginWith(GetParam().withEditor ? requiredItems() : QList<Item>{text(ZafVideoEditorExtensionAppNameKey, "Recorder")});
    ASSERT_EQ(editor() != nullptr, GetParam().withEditor);
    QFile leftover(ZafTempStore::defaultStore()._srTempPath() + "Recorder_1.mp4");
    ASSERT_TRUE(leftover.open(QIODevice::WriteOnly));
    leftover.close();

    if (hostDies)
        host.closeHost();
    else
        removeView();
    ASSERT_TRUE(waitUntil([&] { return finished; }, 5000));
    EXPECT_EQ(editor(), nullptr);
    if (GetParam().withEditor)
        EXPECT_TRUE(tempEntries().isEmpty());
    EXPECT_EQ(fileDigest(moviePath), movieBefore);
    if (hostDies)
        EXPECT_EQ(logs.count("channel closed: the host closed the connection"), 1);
    else
        EXPECT_FALSE(reportedTypes(300).has_value());
}

INSTANTIATE_TEST_SUITE_P(Endings, ExtensionRemovalTest, ::testing::Values(Removal{"Removed", false, true},
    Removal{"HostGone", true, true}, Removal{"RemovedWithoutEditor", false, false}), caseName);

// The host's items made no editor: the window must still close. Closing it, or Escape, is Cancel:
// one empty report, so that the host removes the view.
class ExtensionWithoutEditorTest : public ExtensionTest, public ::testing::WithParamInterface<bool> {};

TEST_P(ExtensionWithoutEditorTest, ClosingTheWindowOrEscapeReportsAnEmptyArrayOnce)
{
    beginWith({text(ZafVideoEditorExtensionAppNameKey, "Recorder")});
    ASSERT_EQ(editor(), nullptr);
    ui::WindowHost *window = runtime->window();
    ASSERT_NE(window, nullptr);
    QApplication::setActiveWindow(window);
    ASSERT_TRUE(QTest::qWaitForWindowActive(window));
    for (int i = 0; i < 2; ++i) {
        if (GetParam())
            window->close();
        else
            QTest::keyClick(window, Qt::Key_Escape);
    }
    EXPECT_EQ(reportedTypes(), QStringList());
    EXPECT_FALSE(reportedTypes(300).has_value()) << "reported once";
}

INSTANTIATE_TEST_SUITE_P(CloseOrEscape, ExtensionWithoutEditorTest, ::testing::Bool());

} // namespace
} // namespace zaf::test
