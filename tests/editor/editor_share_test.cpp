// Sharing from the editor: the items and text, the offer of the publishing action, the sheet's order
// and exclusion, and what its completion records.
#include "tests/editor/editor_test_support.h"

#include "identity/store_info.h"
#include "platform/bundle/bundle.h"
#include "platform/ui/share_activity.h"
#include "platform/ui/share_sheet.h"

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
    }
    void installPlugin() { qputenv("ZAF_PUBLISHING_PLUGIN_PATH", QFile::encodeName(scratch.write(QStringLiteral("plugin.so"), 8))); }
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

TEST_F(EditorShareTest, PublishingIsOfferedOnlyWithThePluginAndWithoutTheServicesOwnExtension)
{
    qputenv("ZAF_PUBLISHING_PLUGIN_PATH", QFile::encodeName(scratch.file(QStringLiteral("no-plugin.so"))));
    EXPECT_FALSE(ZafVideoEditorViewController::offersPublishingActivity()) << "no plug-in";
    installPlugin();
    EXPECT_TRUE(ZafVideoEditorViewController::offersPublishingActivity());
    installServiceExtension(false);
    EXPECT_TRUE(ZafVideoEditorViewController::offersPublishingActivity()) << "a disabled extension does not count";
    installServiceExtension(true);
    EXPECT_FALSE(ZafVideoEditorViewController::offersPublishingActivity());
}

TEST_F(EditorShareTest, SheetOffersPublishingRightAfterMailExcludesCopyAndCancelRecordsNothing)
{
    installPlugin();
    auto e = makeEditor(movie(1));
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

    e->saveAction();
    e->doneAction();
    sheet->cancelButton()->click();
    spin(100);
    EXPECT_FALSE(e->isShareSheetUp());
    EXPECT_TRUE(e->activityTypes().isEmpty());
}

TEST_F(EditorShareTest, PadLayoutInIntroModeLeavesPlayOutAndSheetWithoutPluginHasNoOrder)
{
    qputenv("ZAF_PUBLISHING_PLUGIN_PATH", QFile::encodeName(scratch.file(QStringLiteral("no-plugin.so"))));
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
    EXPECT_FALSE(sheet->visibleActivityTypes().contains(QLatin1String(ui::kActivityTypeCopyToPasteboard)));
    sheet->cancelButton()->click();
    spin(100);
}

} // namespace
} // namespace zaf::test
