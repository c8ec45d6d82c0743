// Sharing from the editor: the items and text, the publishing offer, the sheet's order and what it records.
#include "tests/editor/editor_test_support.h"

#include "identity/store_info.h"
#include "platform/bundle/bundle.h"
#include "platform/ui/share_activity.h"
#include "platform/ui/share_sheet.h"
#include "platform/media/export_session.h"
#include "publishing/plugin_loader.h"
#include "publishing/youtube_activity.h"

#include <QAbstractButton>

namespace zaf::test {
namespace {

ZafStoreInfo record(const QString &name, const QString &author, const QString &link)
{
    ZafStoreInfo info;
    info.setBundleID(QStringLiteral("org.example.Recorder"));
    info.setAppName(name);
    info.setAuthor(author);
    info.setItemURL(link);
    return info;
}

class EditorShareTest : public EditorTest {
protected:
    void SetUp() override
    {
        EditorTest::SetUp();
        bundle::setPreferredLanguagesForTesting({QStringLiteral("en")});
        // An empty catalogue and no installed extensions: nothing from the machine leaks in.
        qputenv("ZAF_APPSTREAM_CATALOG_DIR", QFile::encodeName(scratch.file(QStringLiteral("catalogue"))));
        QDir().mkpath(scratch.file(QStringLiteral("catalogue")));
        qputenv("XDG_DATA_HOME", QFile::encodeName(scratch.file(QStringLiteral("data"))));
        qputenv("XDG_DATA_DIRS", QFile::encodeName(scratch.file(QStringLiteral("none"))));
        // Publishing can sign in with a client given in the environment; none set up on the machine counts.
        qputenv("XDG_CONFIG_HOME", QFile::encodeName(scratch.file(QStringLiteral("config"))));
        qputenv("ZAF_YOUTUBE_CLIENT_ID", "test-client");
    }
    void TearDown() override
    {
        qunsetenv("ZAF_YOUTUBE_CLIENT_ID");
        qunsetenv("ZAF_YOUTUBE_ACCESS_TOKEN");
    }
    // The built plug-in at its default place.
    void installPlugin() { qunsetenv("ZAF_PUBLISHING_PLUGIN_PATH"); }
    void pluginAt(const QString &path) { qputenv("ZAF_PUBLISHING_PLUGIN_PATH", QFile::encodeName(path)); }
    void installServiceExtension(bool enabled)
    {
        QDir().mkpath(scratch.file(QStringLiteral("data/zafrel/extensions")));
        QFile f(scratch.file(QStringLiteral("data/zafrel/extensions/youtube-share-extension.json")));
        ASSERT_TRUE(f.open(QIODevice::WriteOnly));
        f.write(enabled ? "{}" : "{\"enabled\": false}");
    }
    ui::ShareSheet *presentedSheet(ZafVideoEditorViewController &e)
    {
        waitUntil([&] { return qobject_cast<ui::ShareSheet *>(e.presentedViewController()) != nullptr; }, 10000);
        spin(50);
        return qobject_cast<ui::ShareSheet *>(e.presentedViewController());
    }
};

TEST_F(EditorShareTest, ItemsFollowTheOverrideMessageOrTheStoreRecord)
{
    auto e = makeEditor(noMovie());
    const QUrl movie = QUrl::fromLocalFile(QStringLiteral("/tmp/movie.mp4"));
    const QUrl attachment = QUrl::fromLocalFile(QStringLiteral("/tmp/notes.txt"));
    const ZafStoreInfo store = record(QStringLiteral("Rec"), QStringLiteral("Zafrel"), QStringLiteral("appstream://x"));

    e->setOverrideShareMessage(QStringLiteral("Look"));
    EXPECT_EQ(e->shareItemsForStoreInfo(store, movie), (QVariantList{QStringLiteral("Look"), movie}));

    e->setOverrideShareMessage(QString());
    e->setFileAttachmentURL(attachment);
    EXPECT_EQ(e->shareItemsForStoreInfo(store, movie),
              (QVariantList{QStringLiteral("Recorded with Rec by Zafrel"), QStringLiteral("appstream://x"), movie, attachment}));
    EXPECT_EQ(ZafVideoEditorViewController::shareTextForStoreInfo(record(QStringLiteral("Rec"), QString(""), QString(""))),
              QStringLiteral("Rec"));
    ZafStoreInfo nameless;
    nameless.setAuthor(QStringLiteral(""));
    EXPECT_EQ(ZafVideoEditorViewController::shareTextForStoreInfo(nameless), QStringLiteral(""));
}

// Only a plug-in that loads and has the agent class offers publishing: a file at the plug-in's place
// that is no plug-in (garbage, a library that is no plug-in) is not offered, and asking does not
// stop the process.
TEST_F(EditorShareTest, PublishingIsOfferedOnlyWithALoadablePluginThatCanSignInAndWithoutTheServicesOwnExtension)
{
    const QString builtPlugin = zaf::publishing::defaultPublishingPluginPath();
    const struct {
        const char *name;
        QString path;
    } unusable[] = {
        {"no file", scratch.file(QStringLiteral("no-plugin.so"))},
        {"garbage bytes", scratch.write(QStringLiteral("plugin.so"), 8)},
        {"a library that is no plug-in", QFileInfo(builtPlugin).dir().filePath(QStringLiteral("libzaf_publishing_agent.so"))},
    };
    for (const auto &c : unusable) {
        SCOPED_TRACE(c.name);
        pluginAt(c.path);
        EXPECT_FALSE(ZafVideoEditorViewController::offersPublishingActivity());
    }
    installPlugin();
    EXPECT_TRUE(ZafVideoEditorViewController::offersPublishingActivity());
    qunsetenv("ZAF_YOUTUBE_CLIENT_ID");
    EXPECT_FALSE(ZafVideoEditorViewController::offersPublishingActivity()) << "without a client publishing could only fail";
    QDir().mkpath(scratch.file(QStringLiteral("config/zafrel")));
    QFile settings(scratch.file(QStringLiteral("config/zafrel/youtube-client.ini")));
    ASSERT_TRUE(settings.open(QIODevice::WriteOnly));
    settings.write("[client]\nid=1234-abcd.apps.googleusercontent.com\nsecret=s\n");
    settings.close();
    EXPECT_TRUE(ZafVideoEditorViewController::offersPublishingActivity()) << "a client the user set up";
    QFile::remove(settings.fileName());
    qputenv("ZAF_YOUTUBE_ACCESS_TOKEN", "token");
    EXPECT_TRUE(ZafVideoEditorViewController::offersPublishingActivity()) << "an access token given";
    installServiceExtension(false);
    EXPECT_TRUE(ZafVideoEditorViewController::offersPublishingActivity()) << "a disabled extension does not count";
    installServiceExtension(true);
    EXPECT_FALSE(ZafVideoEditorViewController::offersPublishingActivity());
}

// With the host's message and a movie attachment, the publishing action is handed the editor's
// movie, not the attachment that takes the movie's usual place in the items.
TEST_F(EditorShareTest, PublishingActionIsGivenTheEditorsMovieNotTheAttachment)
{
    installPlugin();
    auto e = makeEditor(movie(1));
    const QUrl attachment = QUrl::fromLocalFile(movie(2));
    e->setOverrideShareMessage(QStringLiteral("Look"));
    e->setFileAttachmentURL(attachment);
    e->shareAction();
    ui::ShareSheet *sheet = presentedSheet(*e);
    ASSERT_NE(sheet, nullptr);
    ZafYouTubeActivity *activity = nullptr;
    for (ui::ShareActivity *candidate : sheet->visibleActivities())
        activity = activity ? activity : qobject_cast<ZafYouTubeActivity *>(candidate);
    ASSERT_NE(activity, nullptr);
    ASSERT_EQ(sheet->activityItems().value(2).toUrl(), attachment);
    activity->prepareWithActivityItems(sheet->activityItems());
    EXPECT_EQ(activity->sourceMovieURL(), e->videoURL());
    if (activity->exportSession())
        activity->exportSession()->cancelExport();
    sheet->cancelButton()->click();
    spin(100);
}

TEST_F(EditorShareTest, SheetOffersPublishingRightAfterMailExcludesCopyAndCancelRecordsNothing)
{
    installPlugin();
    auto e = makeEditor(movie(1));
    RecordingDelegate delegate;
    e->setDelegate(&delegate);
    e->shareAction();
    ui::ShareSheet *sheet = presentedSheet(*e);
    ASSERT_NE(sheet, nullptr);
    EXPECT_TRUE(e->isShareSheetUp());
    const QStringList types = sheet->visibleActivityTypes();
    EXPECT_FALSE(types.contains(QLatin1String(ui::kActivityTypeCopyToPasteboard)));
    ASSERT_GE(types.size(), 2);
    EXPECT_EQ(types.at(0), QLatin1String(ui::kActivityTypeMail));
    EXPECT_EQ(types.at(1), QStringLiteral("ZafPublishToYouTube")) << "the message type has no performer here";
    EXPECT_EQ(itemNames(*e, e->topToolBar()), words("done flex title flex save"));

    // With the sheet up, save and done do nothing.
    e->saveAction();
    e->doneAction();
    spin(300);
    EXPECT_TRUE(delegate.reports.isEmpty());
    sheet->cancelButton()->click();
    spin(100);
    EXPECT_FALSE(e->isShareSheetUp());
    EXPECT_TRUE(e->activityTypes().isEmpty());
}

TEST_F(EditorShareTest, PadLayoutInIntroModeLeavesPlayOutAndSheetWithoutPluginHasNoOrder)
{
    pluginAt(scratch.file(QStringLiteral("no-plugin.so")));
    auto e = makeEditor(movie(1), QRectF(0, 0, 900, 500));
    ASSERT_TRUE(e->isPadMode());
    e->view()->resize(900, 500);
    e->view()->show();
    e->shareAction();
    ui::ShareSheet *sheet = presentedSheet(*e);
    ASSERT_NE(sheet, nullptr);
    EXPECT_EQ(itemNames(*e, e->topToolBar()), words("done flex title flex share fix save"));
    EXPECT_TRUE(sheet->view()->window()->windowFlags().testFlag(Qt::Popup)) << "a popover at the share button";
    EXPECT_FALSE(sheet->visibleActivityTypes().contains(QStringLiteral("ZafPublishToYouTube")));
    sheet->cancelButton()->click();
    spin(100);
}

} // namespace
} // namespace zaf::test
