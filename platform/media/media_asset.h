#pragma once

// MediaAsset: a movie file opened for reading.
//
// Creating an asset does no I/O. The first call that needs the file's contents (load(), tracks(),
// duration(), ...) opens it and reads its header on the calling thread, once; later calls return the
// stored answers at once. loadAsynchronously() does the same on a global queue, so the main thread
// never waits for a slow disk. All methods are thread-safe. A missing, empty, truncated or
// non-movie file loads as a failure with an error (code kMediaErrorCannotOpen or kMediaErrorNoTracks
// in the "zaf.media" domain): it never crashes and never hangs.

#include "platform/error.h"
#include "platform/media/media_time.h"

#include <QList>
#include <QSizeF>
#include <QString>
#include <QUrl>

#include <functional>
#include <memory>

namespace zaf::media {

inline constexpr const char *kMediaErrorDomain = "zaf.media";
// Error codes of the media engine (the "zaf.media" domain).
enum MediaErrorCode : int {
    kMediaErrorUnknown = 1,
    kMediaErrorCannotOpen = 2,        // missing, unreadable, or not a movie
    kMediaErrorNoTracks = 3,          // opened, but holds no audio or video
    kMediaErrorDecodeFailed = 4,
    kMediaErrorEncodeFailed = 5,
    kMediaErrorWriteFailed = 6,       // the output cannot be created or written
    kMediaErrorDiskFull = 7,
    kMediaErrorOutputExists = 8,      // never overwritten
    kMediaErrorInvalidArgument = 9,   // bad time range, unknown track, no output URL, ...
    kMediaErrorCancelled = 10,
};

Error makeMediaError(int code, const QString &message);

enum class MediaType { Video, Audio, Other };

// The 2-D affine transform [a b 0; c d 0; tx ty 1]: a point (x, y) maps to
// (a*x + c*y + tx, b*x + d*y + ty).
struct AffineTransform {
    double a = 1, b = 0, c = 0, d = 1, tx = 0, ty = 0;

    static AffineTransform identity() { return {}; }
    // The transform that shows a w x h picture rotated clockwise by 0, 90, 180 or 270 degrees,
    // translated back into the positive quadrant (90: (0, 1, -1, 0, h, 0)).
    static AffineTransform rotation(int degreesClockwise, double w, double h);
    // The size a w x h picture takes after the linear part: |a*w + c*h| x |b*w + d*h|.
    QSizeF mapSize(const QSizeF &size) const;
    // Clockwise rotation in degrees (0, 90, 180, 270) that this transform stands for.
    int rotationDegrees() const;
    bool operator==(const AffineTransform &o) const = default;
};

struct AssetTrack {
    std::int32_t trackID = 0;          // 1-based, in file order (the container's stream order + 1)
    MediaType mediaType = MediaType::Other;
    int streamIndex = -1;              // index in the container
    QString codecName;                 // FFmpeg's short name: "h264", "aac", ...
    QSizeF naturalSize;                // coded picture size (video), before the transform
    AffineTransform preferredTransform;
    MediaTime duration;                // the track's own duration, invalid when unknown
    double nominalFrameRate = 0;       // frames per second (video)
    int sampleRate = 0;                // audio
    int channelCount = 0;              // audio
    std::int64_t bitRate = 0;
};

class MediaAsset {
public:
    // An asset for a file URL; no I/O happens here.
    static std::shared_ptr<MediaAsset> assetWithURL(const QUrl &url);
    ~MediaAsset();

    QUrl url() const;

    // Opens the file and reads its header if that has not happened yet. True when the asset is
    // playable; otherwise false with the reason in loadError().
    bool load() const;
    // load() on the global default-priority queue; the completion runs there afterwards.
    void loadAsynchronously(std::function<void()> completion) const;
    bool isLoaded() const;
    OptionalError loadError() const;

    // After loading (these load on first use):
    QList<AssetTrack> tracks() const;
    QList<AssetTrack> tracksWithMediaType(MediaType type) const;
    MediaTime duration() const;        // the longest track; invalid when the file cannot be read
    bool isPlayable() const;           // opened, with at least one audio or video track
    QString containerName() const;

private:
    explicit MediaAsset(const QUrl &url);
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::media
