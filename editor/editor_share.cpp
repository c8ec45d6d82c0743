// Sharing: the share item asks the store about the recording application, builds the shared items
// and text, offers the editor's own publishing action when it can run, and presents the share sheet.
#include "editor/editor.h"

#include "identity/bundle_extensions.h"
#include "identity/store_manager.h"
#include "platform/dispatch.h"
#include "platform/extensionkit/extension_registry.h"
#include "platform/log.h"
#include "platform/text/object_format.h"
#include "platform/ui/bar_button_item.h"
#include "platform/ui/share_activity.h"
#include "platform/ui/share_sheet.h"
#include "platform/ui/toolbar.h"
#include "publishing/plugin_loader.h"
#include "publishing/youtube_activity.h"

using namespace zaf::ui;

namespace {

// The video service's own share extension: when it is installed and enabled, the editor does not
// offer its own publishing action.
constexpr const char *kVideoServiceShareExtensionIdentifier = "youtube-share-extension";

} // namespace

QString ZafVideoEditorViewController::shareTextForStoreInfo(const ZafStoreInfo &info)
{
    const QString appName = info.appName().value_or(QString());
    if (!info.author() || info.author()->isEmpty())
        return appName.isNull() ? QStringLiteral("") : appName;
    const std::optional<QString> format =
        ZafBundleExtensions::_zafLocalizedStringFromFrameworkBundleWithKey(QStringLiteral("SHARE_TEXT_FORMAT"));
    return zaf::text::formatWithObjects(format.value_or(QStringLiteral("%1$@ %2$@")), {appName, *info.author()});
}

void ZafVideoEditorViewController::shareAction()
{
    QPointer<ZafVideoEditorViewController> weakSelf(this);
    zaf::dispatch::main([weakSelf] {
        ZafVideoEditorViewController *self = weakSelf.data();
        if (!self)
            return;
        self->displayShareSheetWithVideoURL(self->m_videoURL);
        if (self->m_padMode) {
            QList<BarButtonItem *> items{self->m_doneButton, self->m_flexSpace, self->m_titleButton, self->m_flexSpace};
            if (!self->m_introMode)
                items << self->m_playButton << self->m_fixSpace;
            items << self->m_shareButton << self->m_fixSpace << self->m_saveButton;
            self->setToolbarItems(self->m_topToolBar, items);
        } else {
            self->setToolbarItems(self->m_topToolBar, {self->m_doneButton, self->m_flexSpace, self->m_titleButton,
                                                       self->m_flexSpace, self->m_saveButton});
        }
    });
}

void ZafVideoEditorViewController::displayShareSheetWithVideoURL(const QUrl &url)
{
    zaf::log::notice(lcEditor(), QStringLiteral("displayShareSheetWithVideoURL"));
    QPointer<ZafVideoEditorViewController> weakSelf(this);
    // The completion runs on the main thread.
    ZafStoreManager::sharedManager().loadItemDetailsForBundleIdentifier(m_bundleIdentifier, [weakSelf, url](const ZafStoreInfo &info) {
        ZafVideoEditorViewController *self = weakSelf.data();
        if (!self)
            return;
        self->presentShareSheet(self->shareItemsForStoreInfo(info, url), url);
    });
}

QVariantList ZafVideoEditorViewController::shareItemsForStoreInfo(const ZafStoreInfo &info, const QUrl &movieURL) const
{
    QVariantList items;
    if (!m_overrideShareMessage.isNull()) {
        items << m_overrideShareMessage;
    } else {
        items << shareTextForStoreInfo(info) << info.itemURL().value_or(QStringLiteral(""));
    }
    items << movieURL;
    if (!m_fileAttachmentURL.isEmpty())
        items << m_fileAttachmentURL;
    return items;
}

bool ZafVideoEditorViewController::offersPublishingActivity()
{
    const bool serviceExtensionInstalled = static_cast<bool>(
        zaf::extensionkit::ExtensionRegistry::extensionWithIdentifier(QLatin1String(kVideoServiceShareExtensionIdentifier)));
    if (serviceExtensionInstalled)
        return false;
    // Only a plug-in that loads, has our API version and has the agent class counts: a mere file at
    // the plug-in's place would offer an action that cannot run. The plug-in is loaded once per
    // process (see publishingAgentClass), at the first share. And only a plug-in that can sign in:
    // without an OAuth client set up, publishing could only fail.
    const QString path = zaf::publishing::defaultPublishingPluginPath();
    const auto plugin = zaf::publishing::loadPublishingPlugin(path);
    return plugin.ok() && zaf::publishing::publishingAgentClass(path, QLatin1String(kZafYouTubePublishingAgentClassName)).ok()
        && plugin.value->canSignIn();
}

void ZafVideoEditorViewController::presentShareSheet(const QVariantList &items, const QUrl &movieURL)
{
    QStringList order{QLatin1String(kActivityTypeMail), QLatin1String(kActivityTypeMessage),
                      QLatin1String(kActivityTypeCopyToPasteboard), QLatin1String(kActivityTypePostToSocial)};
    QList<ShareActivity *> applicationActivities;
    if (offersPublishingActivity()) {
        auto *activity = new ZafYouTubeActivity;
        // The recording is published, never the host's attachment, whatever the items' order.
        activity->setSourceMovieURL(movieURL);
        applicationActivities << activity;
        order.insert(2, activity->activityType());
    }
    auto *sheet = new ShareSheet(items, applicationActivities, this);
    for (ShareActivity *activity : std::as_const(applicationActivities))
        activity->setParent(sheet);
    sheet->setExcludedActivityTypes({QLatin1String(kActivityTypeCopyToPasteboard)});
    if (!applicationActivities.isEmpty())
        sheet->setActivityTypeOrder(order);
    QPointer<ZafVideoEditorViewController> weakSelf(this);
    QPointer<ShareSheet> weakSheet(sheet);
    sheet->setCompletionWithItemsHandler(
        [weakSelf, weakSheet](const QString &type, bool completed, const QVariantList &, const std::optional<zaf::Error> &) {
            if (weakSelf)
                weakSelf->shareSheetDidCompleteWithActivityType(type, completed);
            if (weakSheet)
                weakSheet->deleteLater();
        });
    if (m_padMode)
        sheet->setPopoverSourceItem(m_shareButton);
    presentViewController(sheet, true, [weakSelf] {
        if (weakSelf)
            weakSelf->m_shareSheetUp = true;
    });
}

void ZafVideoEditorViewController::shareSheetDidCompleteWithActivityType(const QString &activityType, bool completed)
{
    m_shareSheetUp = false;
    if (completed && !activityType.isEmpty())
        m_activityTypes.append(activityType);
}
