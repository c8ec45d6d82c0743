#pragma once

// ImageGenerator: still pictures of an asset's first video track at requested times.
//
// Threads. Requests may come from any thread. Asynchronous requests are queued and worked off in
// order by one task at a time on the global default-priority queue (platform/dispatch.h); that task
// decodes and calls the handler, so the handler runs on a global-queue thread, never on the main
// thread, once per requested time, in the order of the times within one call, and calls are
// answered in the order they were made. copyImageAtTime() decodes on the calling thread. One
// decoder, opened on first use and kept open, serves every request of a generator (a lock
// serialises them), and moves between times by seeking or, when cheaper, by decoding on.
//
// Settings are read when a request is made: changing them affects later requests only.
// A generator stays alive (its queue holds it) until its last queued request has been answered.
//
// Times. The image for time T is the frame shown at T: the last frame whose presentation time is at
// or before T (times past the end give the last frame, times before the start the first one). The
// tolerances widen that: any frame shown somewhere in [T - before, T + after] may be returned. The
// default tolerances are infinite, so the answer is the sync frame (keyframe) at or before T, which
// needs one decode; zero tolerances give the exact frame. actualTime is the returned frame's
// presentation time.
//
// A missing, empty, truncated or non-movie file, or one without video, answers every request with
// Result::Failed and an error in the "zaf.media" domain (logged to "zaf.media"); it never crashes
// and never hangs.

#include "platform/error.h"
#include "platform/media/media_time.h"

#include <QImage>
#include <QList>
#include <QSize>

#include <functional>
#include <memory>

namespace zaf::media {

class MediaAsset;

class ImageGenerator : public std::enable_shared_from_this<ImageGenerator> {
public:
    enum class Result { Succeeded = 0, Failed = 1, Cancelled = 2 };
    // requestedTime, image, actualTime, result, error. Runs on a thread of the global
    // default-priority queue, once per requested time, in request order for one call. On failure
    // or cancellation the image is null, actualTime invalid and the error set.
    using Handler = std::function<void(const MediaTime &requestedTime, const QImage &image, const MediaTime &actualTime,
                                       Result result, const OptionalError &error)>;

    static std::shared_ptr<ImageGenerator> imageGeneratorWithAsset(std::shared_ptr<MediaAsset> asset);
    ~ImageGenerator();
    ImageGenerator(const ImageGenerator &) = delete;
    ImageGenerator &operator=(const ImageGenerator &) = delete;

    std::shared_ptr<MediaAsset> asset() const;

    // The largest picture to return, in pixels; 0 in a dimension sets no limit in it. Pictures are
    // scaled down (never up) to fit, keeping their displayed aspect ratio. Default: no limit.
    void setMaximumSize(const QSize &pixels);
    QSize maximumSize() const;
    // Applies the track's preferred transform (its display rotation) so pictures stand upright.
    // Default: true.
    void setAppliesPreferredTrackTransform(bool applies);
    bool appliesPreferredTrackTransform() const;
    // Default: positive infinity for both (fast). Negative values count as zero.
    void setRequestedTimeToleranceBefore(const MediaTime &tolerance);
    void setRequestedTimeToleranceAfter(const MediaTime &tolerance);
    MediaTime requestedTimeToleranceBefore() const;
    MediaTime requestedTimeToleranceAfter() const;

    // Queues one request per time and returns at once; see Handler for where the answers run.
    void generateImagesAsynchronouslyForTimes(const QList<MediaTime> &times, Handler handler);

    // The picture for one time, decoded on the calling thread (meant for worker threads; it may
    // wait for a request in progress). Null image and *error set on failure.
    QImage copyImageAtTime(const MediaTime &time, MediaTime *actualTime, OptionalError *error);

    // Every request not yet answered is answered with Result::Cancelled (on the generator's queue,
    // as usual); a decode in progress is interrupted. Later requests are served normally.
    void cancelAllImageGeneration();

    // How many times have been asked for since the generator was made (any thread): what a
    // caller's cache saved can be seen here.
    int requestedTimeCount() const;

private:
    explicit ImageGenerator(std::shared_ptr<MediaAsset> asset);
    void runQueue();
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::media
