#pragma once

// ZafYouTubeActivity: the share sheet's action that publishes the recording to YouTube.
//
// Before anything is shown the sheet asks the activity whether it can run (the device's
// "not-green-tea" answer) and then prepares it: preparation names a copy of the movie in the
// temporary directory, starts an export of the movie with all its audio mixed into one track into
// that copy, and composes the text the publishing form's description field starts with. Which items
// are read, and how the movie is told from an attachment: activity_items.h.
//
// Threads: main thread only; every callback below runs there unless its comment says otherwise.
// Nothing here reads the movie on the main thread:
// - canPerformWithActivityItems() answers from the capability alone and looks at no item, so the
//   sheet, which asks it synchronously before it lists the action, never waits for a file.
// - prepareWithActivityItems() returns at once. When the editor named its movie the copy's export
//   starts there. Otherwise the first file among the items is probed (opened, to see that it plays)
//   on a thread of the default-priority global queue, and the answer comes back to the main thread,
//   which then starts the export; until then isProbingMovie() is true and sourceMovieURL() and
//   exportSession() are empty. A probe whose answer comes after Cancel, after the end of
//   publishing or after a new preparation is dropped.
// - The export runs on a pool thread; its completion logs there and hops to the main thread.
// exportSession() gives the running export so that the publishing flow can wait for the copy before
// uploading it.
//
// Publishing: activityViewController() answers with the publishing plug-in's navigation controller
// holding the form (description filled, category "20" pre-selected). The activity is the agent's
// delegate: Cancel ends the action as not completed; publishing covers the form with the progress
// overlay and ends with a result alert; both remove the copy (an export still writing it is
// cancelled, and the copy removed once it has stopped). The Publish button is routed through
// the activity so that an upload never starts before the copy's export has finished: while the
// movie is probed or the export runs the overlay is shown, and a failed export ends with the failure
// alert. The overlay's own Cancel (the form's is under it) cancels through the agent: during the
// wait for the copy, the sign-in and the upload.

#include "platform/error.h"
#include "platform/ui/share_activity.h"
#include "publishing/progress_overlay.h"
#include "publishing/publishing_agent.h"

#include <QIcon>
#include <QImage>
#include <QPointer>
#include <QString>
#include <QUrl>
#include <QVariantList>

#include <cstdint>
#include <memory>
#include <optional>

class QAbstractButton;
class QMessageBox;

namespace zaf::media {
class ExportSession;
}


class ZafYouTubeActivity : public zaf::ui::ShareActivity, public ZafPublishingAgentDelegate {
    Q_OBJECT
public:
    explicit ZafYouTubeActivity(QObject *parent = nullptr);
    ~ZafYouTubeActivity() override;

    // The share category.
    static int activityCategory() { return 1; }

    QString activityType() const override;      // "ZafPublishToYouTube"
    QString activityTitle() const override;     // "YouTube", in every language
    QIcon activityImage() const override;
    // The activity image as a 29 x 29 point icon at the main screen's scale.
    QImage _activitySettingsImage() const;

    // The bundle holding the activity's images: this library's own resource directory
    // (":/zaf/publishing/"), registered once per process. Empty if it cannot be found.
    static QString mediaShelfFrameworkBundle();
    // The image "<name>.svg" of that bundle rendered at the main screen's scale; null when absent.
    static QImage mediaShelfImageNamed(const QString &name);
    // The name of the activity's image in the bundle.
    static QString activityImageName();

    // Answers the device's "not-green-tea" capability; the items are not looked at.
    bool canPerformWithActivityItems(const QVariantList &activityItems) override;
    // Names the copy and composes the description; starts the copy's export, or the probe of the
    // movie among the items that precedes it (see the header comment). Returns at once.
    void prepareWithActivityItems(const QVariantList &activityItems) override;

    // "<temp dir>/ZafReplay_YouTube<seconds since 1970>.mp4" for now; the same within one second.
    static QUrl tempFileURL();
    // The same name for a given time in seconds since 1970 (the fraction is dropped).
    static QUrl tempFileURLForTime(double secondsSince1970);

    // The activity's own copy of the movie (set by preparation).
    QUrl movieURL() const { return m_movieURL; }
    // The initial text of the publishing form's description field (set by preparation).
    QString descriptionText() const { return m_descriptionText; }
    // The export writing the copy; null before preparation, while the movie is probed, or when no
    // movie was among the items.
    std::shared_ptr<zaf::media::ExportSession> exportSession() const { return m_exportSession; }
    // The movie the copy is made from; empty while the movie is probed, or when no movie was among
    // the items.
    QUrl sourceMovieURL() const { return m_sourceMovieURL; }
    // True from a preparation that probes the movie among the items until the probe's answer has
    // arrived (or the copy was given up).
    bool isProbingMovie() const { return m_probingMovie; }
    // The editor's movie: when set (before preparation), preparation copies this movie whatever the
    // items hold.
    void setSourceMovieURL(const QUrl &movie) { m_editorMovieURL = movie; }

    // Filled by the publishing flow.
    std::shared_ptr<ZafPublishingAgent> publishingAgent() const { return m_publishingAgent; }
    void setPublishingAgent(std::shared_ptr<ZafPublishingAgent> agent) { m_publishingAgent = std::move(agent); }
    QPointer<ZafYouTubeActivityProgressOverlay> progressOverlay() const { return m_progressOverlay; }
    void setProgressOverlay(const QPointer<ZafYouTubeActivityProgressOverlay> &overlay) { m_progressOverlay = overlay; }

    // The plug-in's navigation controller with the prepared form. Loads the plug-in on the first call
    // of the process; a plug-in that cannot be loaded or lacks the agent class stops the process.
    zaf::ui::ViewController *activityViewController() override;

    // The form's default-category routine while the activity flow is installed (main thread, as the
    // form's view loads): selects the category whose id, lower-cased, is "20"; leaves the form
    // untouched when there is none.
    static void selectDefaultCategoryOfForm(QObject *form);

    // ZafPublishingAgentDelegate: the agent calls these on the main thread.
    void publishingAgentWillBeDisplayed(ZafPublishingAgent *agent) override;
    void publishingAgentDoneButtonClicked(ZafPublishingAgent *agent) override;
    void publishingAgentCancelButtonClicked(ZafPublishingAgent *agent) override;
    // Publish pressed: upload now when the copy is ready, else wait for its export.
    void publishingAgentWillBeginPublishing(ZafPublishingAgent *agent, std::function<void()> proceed) override;
    void publishingAgentDidBeginPublishing(ZafPublishingAgent *agent) override;
    void publishingAgentDidEndPublishingError(ZafPublishingAgent *agent, const std::optional<zaf::Error> &error) override;

    // Stops the overlay's indicator and shows the success alert (no error) or the failure alert.
    void showAlertWithError(const std::optional<zaf::Error> &error);
    // The result alert while it exists (non-modal, over the navigation view).
    QPointer<QMessageBox> resultAlert() const { return m_resultAlert; }
    // True while a press of Publish waits for the copy (its probe or its export).
    bool isWaitingForExport() const { return m_waitingForExport; }

private:
    // Starts the export of the copy from m_sourceMovieURL (logged when there is nothing to copy).
    void startCopy();
    // Main thread, once the probe started by preparation `preparation` has its answer: `movie` is
    // the movie to copy, empty when the candidate does not play. A stale preparation is ignored.
    void movieProbeDidEnd(std::uint64_t preparation, const QUrl &movie);
    // Main thread, once the copy's export has ended. sessionID names the export that ended; an
    // export other than the current one is ignored.
    void exportDidEnd(std::uint64_t sessionID);
    void startPublishing();
    void showProgressOverlay();
    // The overlay's Cancel (main thread): cancels through the agent, as the form's Cancel does.
    void cancelFromOverlay();
    // Gives the copy up: drops a probe still running, cancels the export and removes the file.
    void removeMovieCopy();

    QUrl m_movieURL;
    QUrl m_sourceMovieURL;
    QUrl m_editorMovieURL;
    QString m_descriptionText;
    std::shared_ptr<zaf::media::ExportSession> m_exportSession;
    std::shared_ptr<ZafPublishingAgent> m_publishingAgent;
    QPointer<ZafYouTubeActivityProgressOverlay> m_progressOverlay;
    QPointer<QMessageBox> m_resultAlert;
    // Lets the agent begin publishing once the copy is complete.
    std::function<void()> m_proceedWithPublishing;
    QMetaObject::Connection m_progressConnection;
    // Counts preparations; a probe's answer carries the count of the preparation that started it.
    std::uint64_t m_preparation = 0;
    bool m_probingMovie = false;
    bool m_waitingForExport = false;
};
