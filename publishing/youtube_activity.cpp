#include "publishing/youtube_activity.h"

#include "identity/framework_strings.h"
#include "media/audio_mix_utility.h"
#include "platform/capability/capability_service.h"
#include "platform/dispatch.h"
#include "platform/log.h"
#include "platform/media/export_session.h"
#include "platform/media/media_asset.h"
#include "platform/text/object_format.h"
#include "platform/ui/screen.h"
#include "platform/ui/view_controller.h"
#include "publishing/activity_items.h"
#include "publishing/agent_class_slot.h"
#include "publishing/form_reflection.h"
#include "tempstore/temp_directory.h"
#include "tempstore/temp_store.h"

#include <QAbstractButton>
#include <QCoreApplication>
#include <QDateTime>
#include <QDesktopServices>
#include <QFile>
#include <QMessageBox>
#include <QPixmap>
#include <QPushButton>
#include <QSvgRenderer>

#include <mutex>

using namespace zaf::publishing;

namespace {
Q_LOGGING_CATEGORY(lcYouTubeActivity, "zaf.publishing.activity")

constexpr double kSettingsIconPoints = 29.0;

const QString &imageBundlePath()
{
    static const QString path = QStringLiteral(":/zaf/publishing/");
    return path;
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

void ZafYouTubeActivity::prepareWithActivityItems(const QVariantList &activityItems)
{
    zaf::ui::ShareActivity::prepareWithActivityItems(activityItems);

    const std::uint64_t preparation = ++m_preparation;
    m_movieURL = tempFileURL();
    m_descriptionText = descriptionForItems(activityItems);
    m_exportSession.reset();
    m_probingMovie = false;
    // The editor names its movie; the items are only searched when it did not.
    m_sourceMovieURL = m_editorMovieURL;
    const QUrl candidate = m_sourceMovieURL.isEmpty() ? movieCandidateInItems(activityItems) : QUrl();
    const std::shared_ptr<zaf::media::MediaAsset> asset = candidate.isEmpty() ? nullptr : zaf::media::MediaAsset::assetWithURL(candidate);
    if (!asset) {
        startCopy();
        return;
    }
    // Whether the candidate plays is only known once it has been opened and read, which the main
    // thread must not wait for: the asset loads on the global queue, and the answer hops back.
    m_probingMovie = true;
    const QPointer<ZafYouTubeActivity> self(this);
    asset->loadAsynchronously([asset, candidate, self, preparation] {
        // A thread of the default-priority global queue.
        const QUrl movie = asset->isPlayable() ? candidate : QUrl();
        zaf::dispatch::onThreadOf(QCoreApplication::instance(), [self, preparation, movie] {
            if (self)
                self->movieProbeDidEnd(preparation, movie);
        });
    });
}

void ZafYouTubeActivity::movieProbeDidEnd(std::uint64_t preparation, const QUrl &movie)
{
    if (preparation != m_preparation || !m_probingMovie)
        return;
    m_probingMovie = false;
    m_sourceMovieURL = movie;
    startCopy();
    // A press of Publish waited for the probe; without an export there is nothing more to wait for.
    if (m_waitingForExport && !m_exportSession)
        startPublishing();
}

void ZafYouTubeActivity::startCopy()
{
    if (m_sourceMovieURL.isEmpty()) {
        zaf::log::notice(lcYouTubeActivity(), QStringLiteral("ZafYouTubeActivity: no movie among the activity items"));
        return;
    }
    m_exportSession = ZafAudioMixUtility::exportSessionForMixingAudio(m_sourceMovieURL, m_movieURL);
    if (!m_exportSession) {
        zaf::log::notice(lcYouTubeActivity(), QStringLiteral("ZafYouTubeActivity: no export session for the movie"));
        return;
    }
    // The session keeps itself alive until its completion has run; the completion must not keep it
    // alive beyond that, so it looks at the session through a weak reference. The end of the export
    // also hops to the main thread, where a press of Publish may be waiting for the copy; the
    // session's id tells a stale export from the current one.
    const std::weak_ptr<zaf::media::ExportSession> weakSession = m_exportSession;
    const std::uint64_t sessionID = m_exportSession->sessionID();
    const QPointer<ZafYouTubeActivity> self(this);
    m_exportSession->exportAsynchronously([weakSession, sessionID, self] {
        // The export's thread.
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
        zaf::log::info(lcYouTubeActivity(), QStringLiteral("ZafYouTubeActivity: Export Mixed YouTube Video Complete."));
    });
}

zaf::ui::ViewController *ZafYouTubeActivity::activityViewController()
{
    const AgentClassSlot &slot = agentClassSlot();

    if (m_publishingAgent) {
        m_publishingAgent->setDelegate(nullptr);
        QObject::disconnect(m_progressConnection);
    }
    m_publishingAgent = newPublishingAgent();
    ZafPublishingAgent *agent = m_publishingAgent.get();
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
        fillDescriptionOfForm(form, m_descriptionText);
    }

    m_waitingForExport = false;
    return navigation;
}

void ZafYouTubeActivity::selectDefaultCategoryOfForm(QObject *form)
{
    if (form)
        selectCategoryOfForm(form, defaultCategoryId());
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
    if (m_probingMovie) {
        // The movie is still being probed: cover the form and publish once its copy is complete.
        m_waitingForExport = true;
        showProgressOverlay();
        return;
    }
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

void ZafYouTubeActivity::removeMovieCopy()
{
    // A probe still running would start the export after the removal: its answer is dropped.
    m_probingMovie = false;
    ++m_preparation;
    if (m_movieURL.isEmpty())
        return;
    // The copy's export may still be writing it (Cancel while it runs): it is cancelled, and the
    // copy removed only once the export has stopped, or it would be written again after the
    // removal. The wait runs off the main thread.
    const std::shared_ptr<zaf::media::ExportSession> session = m_exportSession;
    const QUrl copy = m_movieURL;
    zaf::dispatch::async(zaf::dispatch::Priority::Background, [session, copy] {
        // A thread of the background global queue.
        if (session)
            session->cancelExportAndWait();
        ZafTempStore::defaultStore()._srRemoveFile(copy);
    });
}
