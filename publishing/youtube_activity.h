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
// attachment; the activity then takes the first item that opens as a playable movie. No position
// past the end of the list is ever read.
//
// Threads: main thread only. prepareWithActivityItems() returns at once; the export runs on its own
// worker thread and its completion only logs. exportSession() gives the running export so that the
// publishing flow can wait for the copy before uploading it.

#include "platform/ui/share_activity.h"
#include "publishing/progress_overlay.h"

#include <QIcon>
#include <QImage>
#include <QPointer>
#include <QString>
#include <QUrl>
#include <QVariantList>

#include <memory>

namespace zaf::media {
class ExportSession;
}

class ZafPublishingAgent;


class ZafYouTubeActivity : public zaf::ui::ShareActivity {
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

    // Filled by the publishing flow.
    std::shared_ptr<ZafPublishingAgent> publishingAgent() const { return m_publishingAgent; }
    void setPublishingAgent(std::shared_ptr<ZafPublishingAgent> agent) { m_publishingAgent = std::move(agent); }
    QPointer<ZafYouTubeActivityProgressOverlay> progressOverlay() const { return m_progressOverlay; }
    void setProgressOverlay(const QPointer<ZafYouTubeActivityProgressOverlay> &overlay) { m_progressOverlay = overlay; }

private:
    // The movie among the items (see the header comment), or an empty URL.
    static QUrl movieInItems(const QVariantList &activityItems);
    static QString descriptionForItems(const QVariantList &activityItems);

    QUrl m_movieURL;
    QUrl m_sourceMovieURL;
    QString m_descriptionText;
    std::shared_ptr<zaf::media::ExportSession> m_exportSession;
    std::shared_ptr<ZafPublishingAgent> m_publishingAgent;
    QPointer<ZafYouTubeActivityProgressOverlay> m_progressOverlay;
};
