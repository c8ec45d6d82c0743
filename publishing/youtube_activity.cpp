#include "publishing/youtube_activity.h"

#include "identity/framework_strings.h"
#include "media/audio_mix_utility.h"
#include "platform/capability/capability_service.h"
#include "platform/log.h"
#include "platform/dispatch.h"
#include "platform/media/export_session.h"
#include "platform/media/media_asset.h"
#include "platform/text/object_format.h"
#include "platform/ui/view_controller.h"
#include "publishing/plugin_loader.h"
#include "platform/ui/screen.h"
#include "tempstore/temp_directory.h"
#include "tempstore/temp_store.h"

#include <QAbstractButton>
#include <QPushButton>
#include <QCoreApplication>
#include <QDateTime>
#include <QDesktopServices>
#include <QMessageBox>
#include <QFile>
#include <QMetaType>
#include <QPixmap>
#include <QSvgRenderer>
#include <QVariantMap>

#include <mutex>

namespace {
Q_LOGGING_CATEGORY(lcYouTubeActivity, "zaf.publishing.activity")

constexpr double kSettingsIconPoints = 29.0;

const QString &imageBundlePath()
{
    static const QString path = QStringLiteral(":/zaf/publishing/");
    return path;
}

bool isLocalFileURL(const QVariant &item)
{
    return item.typeId() == QMetaType::QUrl && item.toUrl().isLocalFile();
}

bool isString(const QVariant &item)
{
    return item.typeId() == QMetaType::QString;
}

bool opensAsPlayableMovie(const QUrl &url)
{
    const std::shared_ptr<zaf::media::MediaAsset> asset = zaf::media::MediaAsset::assetWithURL(url);
    return asset && asset->load() && asset->isPlayable();
}

// The category the form pre-selects.
const QString &defaultCategoryId()
{
    static const QString id = QStringLiteral("20");
    return id;
}

// The key's text from the string tables, or the key itself when the tables are missing.
QString localized(const char *key)
{
    const QString name = QLatin1String(key);
    return ZafLocalizedFrameworkString(name).value_or(name);
}

// The process-wide slot of the agent class. The first use loads the plug-in and looks the class up;
// the plug-in stays loaded and the class stays stored for the life of the process. Either failure
// stops the process: without the plug-in there is nothing to publish with.
struct AgentClassSlot {
    ZafPublishingPluginInterface *plugin = nullptr;
    const QMetaObject *agentClass = nullptr;
};

const AgentClassSlot &agentClassSlot()
{
    static AgentClassSlot slot;
    if (slot.agentClass)
        return slot;
    const QString path = zaf::publishing::defaultPublishingPluginPath();
    const auto plugin = zaf::publishing::loadPublishingPlugin(path);
    if (!plugin.ok())
        qFatal("%s", qPrintable(plugin.errorText));
    const auto agentClass = zaf::publishing::publishingAgentClass(path, QLatin1String(kZafYouTubePublishingAgentClassName));
    if (!agentClass.ok())
        qFatal("Unable to find class %s", kZafYouTubePublishingAgentClassName);
    slot.plugin = plugin.value;
    slot.agentClass = agentClass.value;
    return slot;
}

// Calls `method` on `target` by name, as the plug-in's objects publish it. A call that cannot be
// made (no target, a method renamed or gone, other arguments) is logged, never silent.
template <typename... Arguments>
bool invokeByName(QObject *target, const char *method, Arguments... arguments)
{
    if (target && QMetaObject::invokeMethod(target, method, arguments...))
        return true;
    zaf::log::error(lcYouTubeActivity(), QStringLiteral("the publishing form does not answer %1 on %2")
                                             .arg(QString::fromLatin1(method),
                                                  target ? QString::fromLatin1(target->metaObject()->className()) : QStringLiteral("nothing")));
    return false;
}

// A QObject* the form publishes as a property; logged when it is missing.
QObject *objectProperty(QObject *form, const char *name)
{
    QObject *object = form->property(name).value<QObject *>();
    if (!object)
        zaf::log::error(lcYouTubeActivity(), QStringLiteral("the publishing form has no %1").arg(QString::fromLatin1(name)));
    return object;
}

bool exportHasEnded(zaf::media::ExportStatus status)
{
    return status == zaf::media::ExportStatus::Completed || status == zaf::media::ExportStatus::Failed
        || status == zaf::media::ExportStatus::Cancelled;
}

// What a failed or cancelled export reports, with a stand-in when the session gives no error.
zaf::Error exportFailure(const zaf::media::ExportSession &session)
{
    if (const zaf::OptionalError error = session.error())
        return *error;
    return zaf::Error{QStringLiteral("zaf.media"), -5812, QStringLiteral("The movie could not be copied for publishing.")};
}
} // namespace

// The images live in a static library, so the resource is registered by hand before the first
// lookup. The registration routine is a global symbol: this has to be a global-namespace function.
static void registerYouTubeActivityImages()
{
    Q_INIT_RESOURCE(youtube_activity_images);
}

ZafYouTubeActivity::ZafYouTubeActivity(QObject *parent)
    : zaf::ui::ShareActivity(parent)
{
}

ZafYouTubeActivity::~ZafYouTubeActivity()
{
    if (m_publishingAgent) {
        m_publishingAgent->setDelegate(nullptr);
        QObject::disconnect(m_progressConnection);
    }
}

QString ZafYouTubeActivity::activityType() const
{
    return QStringLiteral("ZafPublishToYouTube");
}

QString ZafYouTubeActivity::activityTitle() const
{
    // A service name: never translated.
    return QStringLiteral("YouTube");
}

QString ZafYouTubeActivity::activityImageName()
{
    return QStringLiteral("ZafPublishVideo");
}

QIcon ZafYouTubeActivity::activityImage() const
{
    const QImage image = mediaShelfImageNamed(activityImageName());
    if (image.isNull())
        return {};
    return QIcon(QPixmap::fromImage(image));
}

QImage ZafYouTubeActivity::_activitySettingsImage() const
{
    const QString bundle = mediaShelfFrameworkBundle();
    if (bundle.isEmpty())
        return {};
    QSvgRenderer renderer(bundle + activityImageName() + QStringLiteral(".svg"));
    if (!renderer.isValid())
        return {};
    return zaf::ui::Screen::renderAtMainScreenScale(renderer, QSizeF(kSettingsIconPoints, kSettingsIconPoints));
}

QString ZafYouTubeActivity::mediaShelfFrameworkBundle()
{
    static QString bundle;
    static std::once_flag once;
    std::call_once(once, [] {
        registerYouTubeActivityImages();
        if (QFile::exists(imageBundlePath() + activityImageName() + QStringLiteral(".svg")))
            bundle = imageBundlePath();
        else
            zaf::log::error(lcYouTubeActivity(), QStringLiteral("ZafYouTubeActivity: image bundle missing"));
    });
    return bundle;
}

QImage ZafYouTubeActivity::mediaShelfImageNamed(const QString &name)
{
    const QString bundle = mediaShelfFrameworkBundle();
    if (bundle.isEmpty() || name.isEmpty())
        return {};
    const QString path = bundle + name + QStringLiteral(".svg");
    if (!QFile::exists(path))
        return {};
    QSvgRenderer renderer(path);
    const QSize points = renderer.defaultSize();
    if (!renderer.isValid() || points.isEmpty())
        return {};
    return zaf::ui::Screen::renderAtMainScreenScale(renderer, QSizeF(points));
}

bool ZafYouTubeActivity::canPerformWithActivityItems(const QVariantList &activityItems)
{
    Q_UNUSED(activityItems);
    return zaf::CapabilityService::shared().booleanAnswer(QLatin1String(zaf::capability::kNotGreenTea), false);
}

QUrl ZafYouTubeActivity::tempFileURL()
{
    return tempFileURLForTime(double(QDateTime::currentMSecsSinceEpoch()) / 1000.0);
}

QUrl ZafYouTubeActivity::tempFileURLForTime(double secondsSince1970)
{
    // "%@/": the directory already ends in "/", so the path holds "//" (the kernel reads one).
    const QString stem = ZafTempStore::defaultStore()._srTempPath() + QStringLiteral("/ZafReplay_YouTube");
    return QUrl::fromLocalFile(ZafTempMovieFileNameAt(stem, secondsSince1970));
}

QUrl ZafYouTubeActivity::movieInItems(const QVariantList &activityItems)
{
    // The share flow puts the movie before any attachment, in both of its lists (position 2 of the
    // usual one, position 1 of a list led by the host's message). A later file is the attachment:
    // it is never taken instead, even when the movie does not play.
    for (const QVariant &item : activityItems) {
        if (!isLocalFileURL(item))
            continue;
        const QUrl url = item.toUrl();
        return opensAsPlayableMovie(url) ? url : QUrl();
    }
    return {};
}

QString ZafYouTubeActivity::descriptionForItems(const QVariantList &activityItems)
{
    const bool textFirst = !activityItems.isEmpty() && isString(activityItems.at(0));
    const bool textSecond = activityItems.size() > 1 && isString(activityItems.at(1));
    if (textFirst && textSecond)
        return activityItems.at(0).toString() + QLatin1Char(' ') + activityItems.at(1).toString();
    if (textFirst)
        return activityItems.at(0).toString();
    if (textSecond)
        return activityItems.at(1).toString();
    return {};
}

void ZafYouTubeActivity::prepareWithActivityItems(const QVariantList &activityItems)
{
    zaf::ui::ShareActivity::prepareWithActivityItems(activityItems);

    m_movieURL = tempFileURL();
    // The editor names its movie; the items are only searched when it did not.
    m_sourceMovieURL = m_editorMovieURL.isEmpty() ? movieInItems(activityItems) : m_editorMovieURL;
    m_exportSession.reset();

    if (m_sourceMovieURL.isEmpty()) {
        zaf::log::notice(lcYouTubeActivity(), QStringLiteral("ZafYouTubeActivity: no movie among the activity items"));
    } else {
        m_exportSession = ZafAudioMixUtility::exportSessionForMixingAudio(m_sourceMovieURL, m_movieURL);
        if (!m_exportSession) {
            zaf::log::notice(lcYouTubeActivity(), QStringLiteral("ZafYouTubeActivity: no export session for the movie"));
        } else {
            // The session keeps itself alive until its completion has run; the completion must not
            // keep it alive beyond that, so it looks at the session through a weak reference.
            // The end of the export also hops to the main thread, where a press of Publish may be
            // waiting for the copy; the session's id tells a stale export from the current one.
            const std::weak_ptr<zaf::media::ExportSession> weakSession = m_exportSession;
            const std::uint64_t sessionID = m_exportSession->sessionID();
            const QPointer<ZafYouTubeActivity> self(this);
            m_exportSession->exportAsynchronously([weakSession, sessionID, self] {
                zaf::dispatch::onThreadOf(QCoreApplication::instance(), [self, sessionID] {
                    if (self)
                        self->exportDidEnd(sessionID);
                });
                const std::shared_ptr<zaf::media::ExportSession> session = weakSession.lock();
                if (!session)
                    return;
                const zaf::media::ExportStatus status = session->status();
                if (status == zaf::media::ExportStatus::Failed || status == zaf::media::ExportStatus::Cancelled)
                    return;
                zaf::log::info(lcYouTubeActivity(),
                               QStringLiteral("ZafYouTubeActivity: Export Mixed YouTube Video Complete."));
            });
        }
    }

    m_descriptionText = descriptionForItems(activityItems);
}

zaf::ui::ViewController *ZafYouTubeActivity::activityViewController()
{
    const AgentClassSlot &slot = agentClassSlot();

    if (m_publishingAgent) {
        m_publishingAgent->setDelegate(nullptr);
        QObject::disconnect(m_progressConnection);
    }
    QObject *instance = slot.agentClass->newInstance();
    auto *agent = qobject_cast<ZafPublishingAgent *>(instance);
    if (!agent) {
        delete instance;
        qFatal("Unable to find class %s", kZafYouTubePublishingAgentClassName);
    }
    m_publishingAgent.reset(agent);
    agent->setDelegate(this);
    agent->setMediaPath(m_movieURL.toLocalFile());
    m_progressConnection = connect(agent, &ZafPublishingAgent::uploadProgress, this, [this](qint64 sent, qint64 total) {
        if (m_progressOverlay)
            m_progressOverlay->setProgress(total > 0 ? double(sent) / double(total) : -1.0);
    });

    zaf::ui::ViewController *navigation = agent->navigationController();
    const QList<zaf::ui::ViewController *> children = navigation->childViewControllers();
    zaf::ui::ViewController *form = children.isEmpty() ? nullptr : children.first();

    // Every form of the process picks its category with our routine from now on. It is installed
    // before the form's view loads, because the form runs the routine as its view loads.
    slot.plugin->setFormDefaultCategoryRoutine(&ZafYouTubeActivity::selectDefaultCategoryOfForm);

    if (form) {
        form->view();
        QObject *cell = nullptr;
        if (QObject *table = objectProperty(form, kZafFormTableProperty))
            invokeByName(table, kZafTableCellMethod, Q_RETURN_ARG(QObject *, cell), Q_ARG(int, 1), Q_ARG(int, 0));
        if (cell) {
            invokeByName(cell, kZafCellSetValueMethod, Q_ARG(QString, m_descriptionText));
            invokeByName(cell, kZafCellSetPlaceholderMethod, Q_ARG(QString, QString()));
        }
    }

    m_waitingForExport = false;
    return navigation;
}

void ZafYouTubeActivity::selectDefaultCategoryOfForm(QObject *form)
{
    if (!form)
        return;
    const QVariantList categories = form->property(kZafFormCategoriesProperty).toList();
    if (categories.isEmpty()) {
        zaf::log::error(lcYouTubeActivity(), QStringLiteral("the publishing form lists no categories"));
        return;
    }
    QObject *picker = objectProperty(form, kZafFormPickerProperty);
    for (int row = 0; row < categories.size(); ++row) {
        const QVariantMap entry = categories.at(row).toMap();
        const QString categoryId = entry.value(QLatin1String(kZafPublishingCategoryIdKey)).toString();
        if (categoryId.toLower() != defaultCategoryId())
            continue;
        const QString label = entry.value(QLatin1String(kZafPublishingCategoryLabelKey)).toString();
        QObject *cell = nullptr;
        if (invokeByName(form, kZafFormCategoryCellMethod, Q_RETURN_ARG(QObject *, cell)) && cell)
            invokeByName(cell, kZafCategoryCellSetLabelMethod, Q_ARG(QString, label));
        form->setProperty(kZafFormDefaultCategoryProperty, categoryId);
        if (picker)
            invokeByName(picker, kZafPickerSelectRowMethod, Q_ARG(int, row), Q_ARG(int, 0), Q_ARG(bool, false));
        return;
    }
}

void ZafYouTubeActivity::publishingAgentWillBeDisplayed(ZafPublishingAgent *agent)
{
    Q_UNUSED(agent);
}

void ZafYouTubeActivity::publishingAgentDoneButtonClicked(ZafPublishingAgent *agent)
{
    // Ends editing: the keyboard focus leaves every field of the navigation view.
    QWidget *view = agent ? agent->navigationController()->view() : nullptr;
    if (!view)
        return;
    if (QWidget *focus = view->focusWidget())
        focus->clearFocus();
    view->clearFocus();
}

void ZafYouTubeActivity::publishingAgentCancelButtonClicked(ZafPublishingAgent *agent)
{
    Q_UNUSED(agent);
    m_waitingForExport = false;
    activityDidFinish(false);
    removeMovieCopy();
}

void ZafYouTubeActivity::publishingAgentDidBeginPublishing(ZafPublishingAgent *agent)
{
    Q_UNUSED(agent);
    showProgressOverlay();
}

void ZafYouTubeActivity::publishingAgentDidEndPublishingError(ZafPublishingAgent *agent, const std::optional<zaf::Error> &error)
{
    Q_UNUSED(agent);
    showAlertWithError(error);
    removeMovieCopy();
}

void ZafYouTubeActivity::showAlertWithError(const std::optional<zaf::Error> &error)
{
    if (m_progressOverlay)
        m_progressOverlay->stopActivity();

    QWidget *host = m_publishingAgent ? m_publishingAgent->navigationController()->view() : presentationWidget();
    const bool completed = !error.has_value();
    const QString title = localized(completed ? "PUBLISHED_VIDEO" : "FAILED_PUBLISH_VIDEO");

    auto *alert = new QMessageBox(host);
    alert->setAttribute(Qt::WA_DeleteOnClose);
    alert->setWindowModality(Qt::NonModal);
    alert->setWindowTitle(title);
    alert->setText(title);

    if (completed) {
        const QString viewTitle = zaf::text::formatWithObjects(localized("VIEW_BUTTON_TITLE_FORMAT"), {activityTitle()});
        QAbstractButton *viewButton = alert->addButton(viewTitle, QMessageBox::AcceptRole);
        connect(viewButton, &QAbstractButton::clicked, this, [this] {
            const QUrl url(m_publishingAgent ? m_publishingAgent->mediaURL() : QString());
            activityDidFinish(true);
            QDesktopServices::openUrl(url);
        });
    }
    QAbstractButton *closeButton = alert->addButton(localized("CLOSE"), QMessageBox::RejectRole);
    connect(closeButton, &QAbstractButton::clicked, this, [this, completed] { activityDidFinish(completed); });
    alert->setEscapeButton(closeButton);

    m_resultAlert = alert;
    alert->show();
}

void ZafYouTubeActivity::publishingAgentWillBeginPublishing(ZafPublishingAgent *, std::function<void()> proceed)
{
    // Nothing is uploaded before the copy is complete.
    m_proceedWithPublishing = std::move(proceed);
    if (m_waitingForExport || !m_publishingAgent)
        return;
    const std::shared_ptr<zaf::media::ExportSession> session = m_exportSession;
    if (session) {
        const zaf::media::ExportStatus status = session->status();
        if (!exportHasEnded(status)) {
            // The copy is still being written: cover the form and publish when the export ends.
            m_waitingForExport = true;
            showProgressOverlay();
            return;
        }
        if (status != zaf::media::ExportStatus::Completed) {
            showProgressOverlay();
            showAlertWithError(exportFailure(*session));
            removeMovieCopy();
            return;
        }
    }
    startPublishing();
}

void ZafYouTubeActivity::exportDidEnd(std::uint64_t sessionID)
{
    if (!m_waitingForExport || !m_exportSession || m_exportSession->sessionID() != sessionID)
        return;
    m_waitingForExport = false;
    if (m_exportSession->status() == zaf::media::ExportStatus::Completed) {
        startPublishing();
        return;
    }
    showAlertWithError(exportFailure(*m_exportSession));
    removeMovieCopy();
}

void ZafYouTubeActivity::startPublishing()
{
    m_waitingForExport = false;
    if (std::function<void()> proceed = std::exchange(m_proceedWithPublishing, {}))
        proceed();
}

void ZafYouTubeActivity::showProgressOverlay()
{
    if (!m_publishingAgent)
        return;
    QWidget *host = m_publishingAgent->navigationController()->view();
    if (m_progressOverlay && m_progressOverlay->parentWidget() == host) {
        m_progressOverlay->raise();
        m_progressOverlay->setShowingAnimated(true, true);
        return;
    }
    auto *overlay = new ZafYouTubeActivityProgressOverlay(host->rect(), host);
    // The overlay covers the form's Cancel: its own Cancel does the same.
    connect(overlay, &ZafYouTubeActivityProgressOverlay::cancelRequested, this, &ZafYouTubeActivity::cancelFromOverlay);
    overlay->raise();
    overlay->show();
    m_progressOverlay = overlay;
    overlay->setShowingAnimated(true, true);
}

void ZafYouTubeActivity::cancelFromOverlay()
{
    ZafPublishingAgent *agent = m_publishingAgent.get();
    if (!agent)
        return;
    // The agent's Cancel stops its sign-in or upload and then reports the Cancel to us.
    if (!invokeByName(agent, kZafAgentCancelMethod))
        publishingAgentCancelButtonClicked(agent);
}

void ZafYouTubeActivity::removeMovieCopy() const
{
    if (m_movieURL.isEmpty())
        return;
    // The copy's export may still be writing it (Cancel while it runs): it is cancelled, and the
    // copy removed only once the export has stopped, or it would be written again after the
    // removal. The wait runs off the main thread.
    const std::shared_ptr<zaf::media::ExportSession> session = m_exportSession;
    const QUrl copy = m_movieURL;
    zaf::dispatch::async(zaf::dispatch::Priority::Background, [session, copy] {
        if (session)
            session->cancelExportAndWait();
        ZafTempStore::defaultStore()._srRemoveFile(copy);
    });
}
