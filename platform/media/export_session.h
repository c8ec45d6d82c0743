#pragma once

// ExportSession: writes an MPEG-4 copy of a MediaAsset, whole or cut to a time range, with its
// audio tracks kept one by one or mixed into one track.
//
// Threads: the session is configured on any thread (normally the main thread) before
// exportAsynchronously(). The export then runs on a thread of the default-priority global queue;
// status(), progress(), error(), cancelExport() and waitUntilFinished() may be called from any
// thread at any time.
// Callbacks, in order: exactly one completion, on the export's pool thread (never the main thread),
// after status() holds its final value (Completed, Failed or Cancelled) and the export has stopped
// writing. Nothing runs after it.
//
// Owners that must know the export no longer writes (before they empty its output's directory)
// cancel it and then call waitUntilFinished(): it returns once the output is committed or removed,
// without waiting for the completion, so an owner on the main thread can wait even when the
// completion is about to hop to the main thread. Each session has a process-unique sessionID(),
// by which a completion tells its own export from a newer one (addresses of ended sessions are
// reused).
//
// Output rules: the file is written under a temporary name in the output's directory and renamed
// into place without replacing anything; a failed or cancelled export leaves no file behind.
// Without a time range or an audio mix every stream is copied bit-exact. An audio mix replaces the
// audio with one track holding the listed tracks: several are summed into AAC at 48 kHz stereo,
// and one AAC track, having nothing to sum, is copied as it is (its rate and channels kept). The
// video is still copied when no time range is set. A time range cuts frame-accurately and
// sample-accurately, both starting at time 0 in the output: H.264 video copies the groups of
// pictures inside the range and re-encodes only the pictures at the cuts (other video is
// re-encoded whole with H.264), and AAC audio copies its packets with an edit list for the exact
// start and end (other audio is re-encoded as AAC).

#include "platform/error.h"
#include "platform/media/audio_mix.h"
#include "platform/media/media_asset.h"
#include "platform/media/media_time.h"

#include <QString>
#include <QUrl>

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>

namespace zaf::media {

enum class ExportStatus { Unknown = 0, Waiting = 1, Exporting = 2, Completed = 3, Failed = 4, Cancelled = 5 };

// The preset that never lowers quality: copies what needs no change, re-encodes video at visually
// lossless quality, audio as AAC at 48 kHz.
inline constexpr const char *kExportPresetHighestQuality = "HighestQuality";
inline constexpr const char *kFileTypeMPEG4 = "public.mpeg-4";
// How long an owner waits for a cancelled export to stop writing. A cancel is seen within one
// packet or one blocked read, so this bound is only reached when the file system hangs.
inline constexpr std::chrono::milliseconds kExportStopTimeout{10000};

class ExportSession : public std::enable_shared_from_this<ExportSession> {
public:
    // nullptr when the asset is null or the preset unknown (callers handle "no session").
    static std::shared_ptr<ExportSession> exportSessionWithAsset(std::shared_ptr<MediaAsset> asset, const QString &preset);
    ~ExportSession();

    std::shared_ptr<MediaAsset> asset() const;
    QString presetName() const;

    void setOutputURL(const QUrl &url);
    QUrl outputURL() const;
    void setOutputFileType(const QString &type);   // kFileTypeMPEG4 is the only type written
    QString outputFileType() const;
    // Default: the whole movie. A range ending past the movie's end is cut at the end.
    void setTimeRange(const MediaTimeRange &range);
    std::optional<MediaTimeRange> timeRange() const;
    void setAudioMix(std::optional<AudioMix> mix);
    std::optional<AudioMix> audioMix() const;
    // A mix that depends on the movie's tracks, built on the export's thread from the loaded asset
    // just before the export starts, so that a caller on the main thread never reads the file to
    // list them. It takes the place of any mix set with setAudioMix (and a later setAudioMix, or
    // a null builder, takes its place). audioMix() answers what the builder made once the export
    // has started.
    using AudioMixBuilder = std::function<AudioMix(const MediaAsset &loadedAsset)>;
    void setAudioMixBuilder(AudioMixBuilder builder);

    // Process-unique, increasing with each session made; never 0.
    std::uint64_t sessionID() const;

    // Starts the export on a pool thread and returns at once. The completion runs exactly once,
    // on that thread (never the main thread), after status() has its final value. The session
    // keeps itself alive until then. A session exports once: a second call runs its completion on a
    // pool thread without exporting again.
    void exportAsynchronously(std::function<void()> completion);
    // Any thread, including the main thread while the completion waits for it. Blocks until the
    // export has stopped writing (its output is in place or removed, status() is final) or the
    // timeout has passed; true when it has stopped. True at once for a session that was never
    // started or whose waiting export was cancelled before it began. The completion may still be
    // running or about to run when this returns.
    bool waitUntilFinished(std::chrono::milliseconds timeout) const;
    // Any thread: cancelExport(), then waitUntilFinished(timeout); an export still writing after the
    // timeout is logged as an error. True when it has stopped writing.
    bool cancelExportAndWait(std::chrono::milliseconds timeout = kExportStopTimeout);

    ExportStatus status() const;
    OptionalError error() const;   // domain "zaf.media", code from MediaErrorCode
    float progress() const;        // 0..1
    // Any thread. A running or waiting export ends in Cancelled and leaves no output file.
    void cancelExport();

private:
    ExportSession(std::shared_ptr<MediaAsset> asset, const QString &preset);
    void run(std::function<void()> completion);
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::media
