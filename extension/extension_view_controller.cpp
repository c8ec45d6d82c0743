#include "extension/extension_view_controller.h"

#include "extension/extension_context.h"
#include "extension/extension_keys.h"
#include "platform/dispatch.h"
#include "platform/extensionkit/input_item.h"
#include "platform/log.h"
#include "platform/ui/view_animation.h"

#include <QPointer>

#include <optional>
#include <utility>
#include <QWidget>

using zaf::extensionkit::ExtensionContext;
using zaf::extensionkit::InputItem;
using zaf::extensionkit::ItemAttachment;

namespace {

// The values of one load of the input items. Touched on the main thread only.
struct InputItemSlots {
    QVariant appName, movieURL, bundleIdentifier, fileAttachmentURL, shareMessage, tintColor;
    // The loaded values in the host's item order (title, value); absent for a failed load.
    QList<std::optional<std::pair<QString, QVariant>>> loaded;
    int pendingLoads = 0;
    bool walkFinished = false;
    bool delivered = false;
};

QColor colorFromValue(const QVariant &value)
{
    if (value.canConvert<QColor>() && value.metaType() == QMetaType::fromType<QColor>())
        return value.value<QColor>();
    return zaf::extensionkit::colorFromHexString(value.toString());
}

// Stores a loaded value in the slot its item's title names (exact, case-sensitive, in the keys'
// order); false for a title that names no key.
bool storeValue(InputItemSlots &slots, const QString &title, const QVariant &value)
{
    if (title == QLatin1String(ZafVideoEditorExtensionAppNameKey))
        slots.appName = value;
    else if (title == QLatin1String(ZafVideoEditorExtensionMoviePathKey))
        slots.movieURL = QUrl::fromLocalFile(value.toString());
    else if (title == QLatin1String(ZafVideoEditorExtensionBundleIdentifierKey))
        slots.bundleIdentifier = value;
    else if (title == QLatin1String(ZafVideoEditorExtensionFileAttachmentKey))
        slots.fileAttachmentURL = QUrl::fromLocalFile(value.toString());
    else if (title == QLatin1String(ZafVideoEditorExtensionOverrideShareMessageKey))
        slots.shareMessage = value;
    else if (title == QLatin1String(ZafVideoEditorExtensionOverrideTintColorKey))
        slots.tintColor = value;
    else
        return false;
    return true;
}

} // namespace

ZafVideoEditorExtensionViewController::ZafVideoEditorExtensionViewController(QObject *parent)
    : ViewController(parent)
{
}

ZafVideoEditorExtensionViewController::~ZafVideoEditorExtensionViewController()
{
    tearDownChildViewControllers();
}

void ZafVideoEditorExtensionViewController::viewDidLoad()
{
    ViewController::viewDidLoad();
    m_escapeWithoutEditor = new QShortcut(QKeySequence(Qt::Key_Escape), view());
    m_escapeWithoutEditor->setContext(Qt::WindowShortcut);
    connect(m_escapeWithoutEditor, &QShortcut::activated, this, &ZafVideoEditorExtensionViewController::cancel);
    setupChildViewControllers();
}

void ZafVideoEditorExtensionViewController::cancel()
{
    if (m_videoEditorViewController) {
        m_videoEditorViewController->doneAction();
        return;
    }
    if (m_reportedWithoutEditor)
        return;
    m_reportedWithoutEditor = true;
    zaf::log::notice(lcExtension(), QStringLiteral("cancelled before an editor was built; reporting no activity"));
    videoEditorDidFinishWithActivityTypes(nullptr, {});
}

void ZafVideoEditorExtensionViewController::setupChildViewControllers()
{
    zaf::log::notice(lcExtension(), QStringLiteral("ZafVideoEditorExtensionViewController -setupChildViewControllers"));
    QPointer<ZafVideoEditorExtensionViewController> weakSelf(this);
    inputItemsFromClientWithCompletionHandler([weakSelf](const QString &bundleIdentifier, const QString &appName,
                                                         const QUrl &movieURL, const QUrl &fileAttachmentURL,
                                                         const QString &shareMessage, const QColor &tint) {
        ZafVideoEditorExtensionViewController *self = weakSelf.data();
        if (!self)
            return;
        self->m_bundleIdentifier = bundleIdentifier;
        self->m_appName = appName;
        self->m_movieURL = movieURL;
        self->m_fileAttachmentURL = fileAttachmentURL;
        self->m_overrideShareMessage = shareMessage;
        self->m_overrideTintColor = tint;
        zaf::dispatch::main([weakSelf] {
            if (!weakSelf)
                return;
            zaf::log::notice(lcExtension(), QStringLiteral("loaded input items"));
            weakSelf->setupVideoEditorController();
        });
    });
}

void ZafVideoEditorExtensionViewController::inputItemsFromClientWithCompletionHandler(InputItemsHandler handler)
{
    zaf::log::notice(lcExtension(),
                     QStringLiteral("ZafVideoEditorExtensionViewController -inputItemsFromClientWithCompletionHandler:"));
    auto slots = std::make_shared<InputItemSlots>();
    const QString dataType = QLatin1String(zaf::extensionkit::kTypeIdentifierData);

    // Called on the main thread after each load and after the walk: once nothing is pending, the
    // handler gets every value the host sent, exactly once, if the required three are in.
    auto finishIfDone = [slots, handler] {
        if (!slots->walkFinished || slots->pendingLoads > 0 || slots->delivered)
            return;
        // The values are applied in the host's item order once every load has ended, so for a
        // repeated title the host's last item wins whatever order the loads ended in.
        for (const auto &entry : std::as_const(slots->loaded)) {
            if (entry)
                storeValue(*slots, entry->first, entry->second);
        }
        if (slots->appName.isNull() || slots->movieURL.isNull() || slots->bundleIdentifier.isNull()) {
            zaf::log::error(lcExtension(), QStringLiteral("the host's input items lack the movie, the application name "
                                                          "or its identifier; no editor is built"));
            return;
        }
        slots->delivered = true;
        handler(slots->bundleIdentifier.toString(), slots->appName.toString(), slots->movieURL.toUrl(),
                slots->fileAttachmentURL.toUrl(),
                slots->shareMessage.isNull() ? QString() : slots->shareMessage.toString(), colorFromValue(slots->tintColor));
    };

    const ExtensionContext *context = ExtensionContext::contextOfPrincipal(this);
    const QList<InputItem> items = context ? context->inputItems() : QList<InputItem>();
    for (const InputItem &item : items) {
        if (item.attachments().isEmpty())
            continue;
        const std::shared_ptr<ItemAttachment> attachment = item.attachments().first();
        if (!attachment || !attachment->hasItemConformingToTypeIdentifier(dataType))
            continue;
        ++slots->pendingLoads;
        const qsizetype index = slots->loaded.size();
        slots->loaded.append(std::nullopt);
        const QString title = item.attributedTitlePlainString();
        // The load completes on a worker thread; its value is handled on the main thread.
        attachment->loadItemForTypeIdentifier(dataType, {}, [slots, index, title, finishIfDone](const QVariant &value,
                                                                                                 const zaf::OptionalError &error) {
            zaf::dispatch::main([slots, index, title, value, error, finishIfDone] {
                --slots->pendingLoads;
                if (error)
                    zaf::log::error(lcExtension(), QStringLiteral("Error loading input item for type"));
                else
                    slots->loaded[index] = std::make_pair(title, value);
                finishIfDone();
            });
        });
    }
    slots->walkFinished = true;
    finishIfDone();
}

bool ZafVideoEditorExtensionViewController::hasRequiredValues() const
{
    return !m_bundleIdentifier.isNull() && !m_appName.isNull() && !m_movieURL.isEmpty();
}

void ZafVideoEditorExtensionViewController::setupVideoEditorController()
{
    // One editor at a time, and never one on values that have not arrived.
    if (m_videoEditorViewController)
        return;
    if (!hasRequiredValues()) {
        zaf::log::notice(lcExtension(), QStringLiteral("the input items are not loaded yet; the editor waits for them"));
        return;
    }
    m_videoEditorViewController = std::make_unique<ZafVideoEditorViewController>(
        m_bundleIdentifier, m_movieURL, m_appName, m_overrideTintColor, viewBounds());
    ZafVideoEditorViewController *editor = m_videoEditorViewController.get();
    editor->setFileAttachmentURL(m_fileAttachmentURL);
    editor->setOverrideShareMessage(m_overrideShareMessage);
    editor->setDelegate(this);
    addChildViewController(editor);
    zaf::ui::addSubview(view(), editor->view());
    editor->didMoveToParentViewController(this);
    // Two Escape shortcuts in one window would cancel each other out as ambiguous.
    if (m_escapeWithoutEditor)
        m_escapeWithoutEditor->setEnabled(false);
}

void ZafVideoEditorExtensionViewController::viewWillAppear(bool animated)
{
    ViewController::viewWillAppear(animated);
    if (!m_videoEditorViewController)
        setupVideoEditorController();
}

void ZafVideoEditorExtensionViewController::viewDidLayoutSubviews()
{
    ViewController::viewDidLayoutSubviews();
    if (m_videoEditorViewController)
        m_videoEditorViewController->view()->setGeometry(QRect(QPoint(0, 0), view()->size()));
}

void ZafVideoEditorExtensionViewController::videoEditorDidFinishWithActivityTypes(ZafVideoEditorViewController *,
                                                                                  const QStringList &activityTypes)
{
    zaf::log::notice(lcExtension(), QStringLiteral("ZafVideoEditorExtensionViewController -videoEditorViewDidFinishWithActivityTypes:"));
    auto *context = qobject_cast<ZafVideoEditorExtensionContext *>(ExtensionContext::contextOfPrincipal(this));
    if (!context) {
        zaf::log::error(lcExtension(), QStringLiteral("no extension context: the report cannot reach the host"));
        return;
    }
    context->extensionObjectProxy()->extensionDidFinishWithActivityTypes(activityTypes);
}

void ZafVideoEditorExtensionViewController::viewDidDisappear(bool animated)
{
    ViewController::viewDidDisappear(animated);
    zaf::log::notice(lcExtension(), QStringLiteral("ZafVideoEditorExtensionViewController -viewDidDisappear:"));
    tearDownChildViewControllers();
}

void ZafVideoEditorExtensionViewController::tearDownChildViewControllers()
{
    if (!m_videoEditorViewController)
        return;
    ZafVideoEditorViewController *editor = m_videoEditorViewController.get();
    editor->willMoveToParentViewController(nullptr);
    zaf::ui::removeFromSuperview(editor->view());
    editor->removeFromParentViewController();
    // Dropping the editor removes its observers and empties the temporary directory.
    m_videoEditorViewController.reset();
    if (m_escapeWithoutEditor)
        m_escapeWithoutEditor->setEnabled(true);
}
