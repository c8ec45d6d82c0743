#pragma once

// The audio mix utility: re-exports a movie into a new MPEG-4 file of the temporary directory with
// every audio track mixed into one, at the highest-quality preset (the video is copied as it is).
//
// Threads: callable from any thread. The completion runs on the export's worker thread (never the
// main thread), except for a missing movie, where it runs at once on the calling thread.

#include "platform/error.h"

#include <QLoggingCategory>
#include <QUrl>

#include <functional>
#include <memory>

namespace zaf::media {
class ExportSession;
class MediaAsset;
struct AudioMix;
}

Q_DECLARE_LOGGING_CATEGORY(lcAudioMix)

class ZafAudioMixUtility {
public:
    // Receives the mixed file's URL and no error, or no URL (empty) and an error: -5818 when no movie
    // was given, -5812 when the export failed, was cancelled or could not be set up.
    using CompletionHandler = std::function<void(const QUrl &outputURL, const zaf::OptionalError &error)>;

    // Mixes the movie at movieURL (may be empty) and calls completion exactly once. Returns the
    // running export, so that an owner that goes away can cancel it and wait until it has stopped
    // writing; none when no export started (the completion has then run already).
    static std::shared_ptr<zaf::media::ExportSession> mixAudioForMovieWithCompletionHandler(const QUrl &movieURL,
                                                                                           CompletionHandler completion);

    // "<temp dir>/ZafReplay_Final<seconds since 1970>.mp4" for now; the same URL within one second.
    static QUrl tempFileURL();
    // The same name for a given time in seconds since 1970 (the fraction is dropped).
    static QUrl tempFileURLForTime(double secondsSince1970);

    // The export that the mix runs: the whole movie at the highest-quality preset into an MPEG-4
    // file at outputURL, with the mix of audioMixForAsset. None when no session can be made for the
    // movie. Reads nothing: the tracks are listed on the export's thread when it starts.
    static std::shared_ptr<zaf::media::ExportSession> exportSessionForMixingAudio(const QUrl &movieURL,
                                                                                 const QUrl &outputURL);
    // One audio-mix input per audio track of the movie, in track order. Reads the movie's header
    // when the asset is not loaded yet, so it belongs on a worker thread.
    static zaf::media::AudioMix audioMixForAsset(const zaf::media::MediaAsset &asset);

    ZafAudioMixUtility() = delete;
};
