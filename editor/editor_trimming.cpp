// Trimming: the timeline's callbacks, the trim export and its completion, the trimmed file's name,
// cancelling a trim (button, Escape or the shake).
#include "editor/editor.h"

#include "platform/dispatch.h"
#include "platform/log.h"
#include "platform/media/export_session.h"
#include "platform/media/media_asset.h"
#include "platform/media/player_item.h"
#include "tempstore/temp_directory.h"
#include "tempstore/temp_store.h"

#include <QFileInfo>

using namespace zaf::media;
using namespace zaf::ui;

QUrl ZafVideoEditorViewController::trimFileURL() const
{
    const QString stem = ZafTempStore::defaultStore()._srTempPath() + QLatin1Char('/') + m_applicationName + QLatin1Char('_');
    return QUrl::fromLocalFile(ZafTempMovieFileName(stem));
}

QUrl ZafVideoEditorViewController::freeTrimFileURL() const
{
    // Names have a resolution of one second, so a trim applied within the second of the previous
    // one gets the name of the movie it reads, and an export never overwrites a file: it would
    // fail. A name that is taken gets a counter: "Recorder_1000000000-2.mp4".
    const QUrl url = trimFileURL();
    const QString path = url.toLocalFile();
    auto taken = [this](const QString &candidate) {
        return QUrl::fromLocalFile(candidate) == m_videoURL || QFileInfo::exists(candidate);
    };
    if (!taken(path))
        return url;
    const QString stem = path.chopped(4); // ".mp4"
    for (int counter = 2;; ++counter) {
        const QString candidate = stem + QLatin1Char('-') + QString::number(counter) + QStringLiteral(".mp4");
        if (!taken(candidate))
            return QUrl::fromLocalFile(candidate);
    }
}

void ZafVideoEditorViewController::trimVideo()
{
    // One export at a time: a second apply while one runs is ignored.
    if (m_exporting)
        return;
    // The file of the previous trim is the movie being trimmed now; it is retired only once the
    // new export has finished, so the export never reads a file that is being removed.
    const QUrl previousTrimFile = m_trimFilePath;
    m_exporting = true;
    const std::shared_ptr<MediaAsset> asset = MediaAsset::assetWithURL(m_videoURL);
    m_exportSession = ExportSession::exportSessionWithAsset(asset, QLatin1String(kExportPresetHighestQuality));
    m_trimFilePath = freeTrimFileURL();
    if (!m_exportSession) {
        zaf::log::notice(lcEditor(), QStringLiteral("ZavVideoEditorViewController: Export Trim Video Failed, due to error: %1")
                                         .arg(int(kMediaErrorInvalidArgument)));
        m_exporting = false;
        return;
    }
    m_exportSession->setOutputURL(m_trimFilePath);
    m_exportSession->setOutputFileType(QLatin1String(kFileTypeMPEG4));
    const MediaTime start = mediaTimeFromSeconds(m_editStartTime);
    const MediaTime end = mediaTimeFromSeconds(m_editEndTime);
    m_exportSession->setTimeRange(MediaTimeRange::fromStartEnd(start, end));

    const std::shared_ptr<ExportSession> session = m_exportSession;
    const std::uint64_t sessionID = session->sessionID();
    const std::shared_ptr<zaf::dispatch::MainGate> gate = m_mainGate;
    QPointer<ZafVideoEditorViewController> weakSelf(this);
    // Runs on the export's thread.
    session->exportAsynchronously([session, sessionID, gate, weakSelf, previousTrimFile] {
        // The editor lets the user cancel the trim or try again after a failed or cancelled export.
        auto endExporting = [weakSelf, sessionID] {
            if (weakSelf && weakSelf->isCurrentTrimExport(sessionID))
                weakSelf->m_exporting = false;
        };
        switch (session->status()) {
        case ExportStatus::Failed: {
            const zaf::OptionalError error = session->error();
            zaf::log::notice(lcEditor(), QStringLiteral("ZavVideoEditorViewController: Export Trim Video Failed, due to error: %1")
                                             .arg(error ? error->code : 0));
            zaf::dispatch::main(endExporting);
            break;
        }
        case ExportStatus::Cancelled:
            zaf::log::notice(lcEditor(), QStringLiteral("ZavVideoEditorViewController: Export Trim Video Cancelled"));
            zaf::dispatch::main(endExporting);
            break;
        default:
            // The export's thread waits until the new movie is loaded, unless the editor goes away
            // first (it closes the gate, and nothing is loaded).
            gate->runSync([weakSelf, session, sessionID, previousTrimFile] {
                ZafVideoEditorViewController *self = weakSelf.data();
                if (!self || !self->isCurrentTrimExport(sessionID))
                    return;
                self->m_exporting = false;
                self->removeAllNotificationRegistrations();
                self->reloadMvLayerWithURL(session->outputURL());
                self->registerForEndOfPlayback();
                if (previousTrimFile != session->outputURL())
                    ZafTempStore::defaultStore()._srRemoveFile(previousTrimFile);
            });
            break;
        }
    });
}

bool ZafVideoEditorViewController::isCurrentTrimExport(std::uint64_t sessionID) const
{
    return m_exportSession && m_exportSession->sessionID() == sessionID;
}

void ZafVideoEditorViewController::undoAction()
{
    if (m_exporting)
        return;
    if (MovieScrubberDelegate *delegate = m_mvTrimmer->delegate())
        delegate->movieScrubberDidCancelEditing(m_mvTrimmer);
}

void ZafVideoEditorViewController::motionEnded(MotionSubtype subtype, const MotionEvent &event)
{
    if (subtype == MotionSubtype::Shake && m_trimming && !m_exporting)
        undoAction();
    ViewController::motionEnded(subtype, event);
}

void ZafVideoEditorViewController::movieScrubberValueDidChange(MovieScrubber *, double value)
{
    m_mvPlayer->seekToTime(mediaTimeFromSeconds(value));
}

void ZafVideoEditorViewController::movieScrubberDidBeginScrubbingWithHandle(MovieScrubber *, MovieScrubberHandle)
{
    m_scrubbing = true;
    pauseAction();
}

void ZafVideoEditorViewController::movieScrubberDidEndScrubbingWithHandle(MovieScrubber *scrubber, MovieScrubberHandle)
{
    m_mvPlayer->seekToTime(mediaTimeFromSeconds(scrubber->value()));
    m_scrubbing = false;
}

void ZafVideoEditorViewController::movieScrubberDidBeginEditing(MovieScrubber *)
{
    editMode();
    m_trimming = true;
}

void ZafVideoEditorViewController::movieScrubberEditingStartValueDidChange(MovieScrubber *, double value)
{
    m_mvPlayer->pause();
    m_editStartTime = value;
    QPointer<ZafVideoEditorViewController> weakSelf(this);
    // The frame under the handle is shown once this callback has returned.
    zaf::dispatch::main([weakSelf, value] {
        if (weakSelf && weakSelf->m_mvPlayer)
            weakSelf->m_mvPlayer->seekToTime(weakSelf->mediaTimeFromSeconds(value));
    });
    m_trimming = true;
}

void ZafVideoEditorViewController::movieScrubberEditingEndValueDidChange(MovieScrubber *, double value)
{
    m_mvPlayer->pause();
    m_editEndTime = value;
    QPointer<ZafVideoEditorViewController> weakSelf(this);
    zaf::dispatch::main([weakSelf, value] {
        if (weakSelf && weakSelf->m_mvPlayer)
            weakSelf->m_mvPlayer->seekToTime(weakSelf->mediaTimeFromSeconds(value));
    });
    m_trimming = true;
}

void ZafVideoEditorViewController::movieScrubberDidCancelEditing(MovieScrubber *scrubber)
{
    scrubber->setEditing(false, true);
    previewMode();
    m_trimming = false;
}
