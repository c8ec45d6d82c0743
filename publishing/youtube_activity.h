#pragma once

// ZafYouTubeActivity: the share sheet's action that publishes the recording to YouTube.
//
// Before anything is shown the sheet asks the activity whether it can run (the device's
// "not-green-tea" answer) and then prepares it: preparation names a copy of the movie in the
// temporary directory, starts an export of the movie with all its audio mixed into one track into
// that copy, and composes the text the publishing form's description field starts with.
//
// Activity items, by position, as the editor's share flow supplies them:
//   0  the share text          1  the store link (a string, possibly empty)      2  the movie's file URL
// With a host-supplied share message the flow passes only the message, the movie and perhaps an
// attachment. The movie always comes before the attachment, so without a movie set by the editor
// (setSourceMovieURL) the activity takes the first local file of the list, and only when it plays:
// an attachment is never published in the recording's place, even when it is a movie itself. No
// position past the end of the list is ever read.
//
// Threads: main thread only. prepareWithActivityItems() returns at once; the export runs on a pool
// thread and its completion only logs. exportSession() gives the running export so that the
// publishing flow can wait for the copy before uploading it.
//
// Publishing: activityViewController() answers with the publishing plug-in's navigation controller
// holding the form (description filled, category "20" pre-selected). The activity is the agent's
// delegate: Cancel ends the action as not completed; publishing covers the form with the progress
// overlay and ends with a result alert; both remove the copy (an export still writing it is
// cancelled, and the copy removed once it has stopped). The Publish button is routed through
// the activity so that an upload never starts before the copy's export has finished: while the
// export runs the overlay is shown, and a failed export ends with the failure alert. The overlay's
// own Cancel (the form's is under it) cancels through the agent: during the wait for the copy, the
// sign-in and the upload.

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
    // Names the copy, starts its export and composes the description; returns at once.
    void prepareWithActivityItems(const QVariantList &activityItems) override;

    // "<temp dir>/ZafReplay_YouTube<seconds since 1970>.mp4" for now; the same within one second.
    static QUrl tempFileURL();
    // The same name for a given time in seconds since 1970 (the fraction is dropped).
    static QUrl tempFileURLForTime(double secondsSince1970);

    // The activity's own copy of the movie (set by preparation).
    QUrl movieURL() const { return m_movieURL; }
    // The initial text of the publishing form's description field (set by preparation).
    QString descriptionText() const { return m_descriptionText; }
    // The export writing the copy; null before preparation or when no movie was among the items.
    std::shared_ptr<zaf::media::ExportSession> exportSession() const { return m_exportSession; }
    // The movie the copy is made from; empty when no movie was among the items.
    QUrl sourceMovieURL() const { return m_sourceMovieURL; }
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

    // The form's default-category routine while the activity flow is installed: selects the category
    // whose id, lower-cased, is "20"; leaves the form untouched when there is none.
    static void selectDefaultCategoryOfForm(QObject *form);

    // ZafPublishingAgentDelegate (main thread).
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
    // True while a press of Publish waits for the copy's export.
    bool isWaitingForExport() const { return m_waitingForExport; }

private:
    // Runs on the main thread once the copy's export has ended.
    // sessionID names the export that ended; an export other than the current one is ignored.
    void exportDidEnd(std::uint64_t sessionID);
    void startPublishing();
    void showProgressOverlay();
    // The overlay's Cancel: cancels through the agent, as the form's Cancel does.
    void cancelFromOverlay();
    void removeMovieCopy() const;

    // The movie among the items (see the header comment), or an empty URL.
    static QUrl movieInItems(const QVariantList &activityItems);
    static QString descriptionForItems(const QVariantList &activityItems);

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
    bool m_waitingForExport = false;
};
