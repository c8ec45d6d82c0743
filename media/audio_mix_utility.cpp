#include "media/audio_mix_utility.h"

#include "identity/user_error.h"
#include "platform/log.h"
#include "platform/media/export_session.h"
#include "platform/media/media_asset.h"
#include "tempstore/temp_directory.h"
#include "tempstore/temp_store.h"

#include <QDateTime>


Q_LOGGING_CATEGORY(lcAudioMix, "zaf.audiomix")

using namespace zaf::media;

std::shared_ptr<ExportSession> ZafAudioMixUtility::mixAudioForMovieWithCompletionHandler(const QUrl &movieURL,
                                                                                         CompletionHandler completion)
{
    if (movieURL.isEmpty()) {
        completion(QUrl(), ZafUserError::_zafUserErrorForCode(ZafUserErrorCodeNoMovie));
        return nullptr;
    }

    const std::shared_ptr<ExportSession> session = exportSessionForMixingAudio(movieURL, tempFileURL());
    if (!session) {
        // Without a session no export can start; the caller's flow must still end, so this is
        // reported like a failed export (from the calling thread, as nothing else runs).
        zaf::log::notice(lcAudioMix(), QStringLiteral("ZafAudioMixUtility: MvAssetExportSessionFailed"));
        completion(QUrl(), ZafUserError::_zafUserErrorForCode(ZafUserErrorCodeExportFailed));
        return nullptr;
    }

    // The completion holds the session and the caller's completion until the export ends.
    session->exportAsynchronously([session, completion] {
        switch (session->status()) {
        case ExportStatus::Failed:
            zaf::log::notice(lcAudioMix(), QStringLiteral("ZafAudioMixUtility: MvAssetExportSessionFailed"));
            completion(QUrl(), ZafUserError::_zafUserErrorForCode(ZafUserErrorCodeExportFailed));
            break;
        case ExportStatus::Cancelled:
            zaf::log::notice(lcAudioMix(), QStringLiteral("ZafAudioMixUtility: MvAssetExportSessionStatusCancelled"));
            completion(QUrl(), ZafUserError::_zafUserErrorForCode(ZafUserErrorCodeExportFailed));
            break;
        default:
            completion(session->outputURL(), std::nullopt);
            break;
        }
    });
    return session;
}

std::shared_ptr<ExportSession> ZafAudioMixUtility::exportSessionForMixingAudio(const QUrl &movieURL,
                                                                              const QUrl &outputURL)
{
    const std::shared_ptr<MediaAsset> asset = MediaAsset::assetWithURL(movieURL);
    std::shared_ptr<ExportSession> session =
        ExportSession::exportSessionWithAsset(asset, QLatin1String(kExportPresetHighestQuality));
    if (!session)
        return nullptr;
    session->setOutputURL(outputURL);
    session->setOutputFileType(QLatin1String(kFileTypeMPEG4));
    // Listing the tracks reads the movie, so it happens on the export's thread, not the caller's.
    session->setAudioMixBuilder(&audioMixForAsset);
    return session;
}

AudioMix ZafAudioMixUtility::audioMixForAsset(const MediaAsset &asset)
{
    // Every audio track enters the mix at the default (unity) level: no volumes, no ramps. A movie
    // without audio gets an empty mix, and so an output without audio.
    AudioMix mix;
    for (const AssetTrack &track : asset.tracksWithMediaType(MediaType::Audio))
        mix.inputParameters.append(AudioMixInputParameters{track.trackID});
    return mix;
}

QUrl ZafAudioMixUtility::tempFileURL()
{
    return tempFileURLForTime(double(QDateTime::currentMSecsSinceEpoch()) / 1000.0);
}

QUrl ZafAudioMixUtility::tempFileURLForTime(double secondsSince1970)
{
    const QString stem = ZafTempStore::defaultStore()._srTempPath() + QStringLiteral("/ZafReplay_Final");
    return QUrl::fromLocalFile(ZafTempMovieFileNameAt(stem, secondsSince1970));
}
