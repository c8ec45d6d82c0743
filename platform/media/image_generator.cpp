#include "platform/media/image_generator.h"
#include "platform/media/core/media_log.h"

#include "platform/dispatch.h"
#include "platform/log.h"
#include "platform/media/thumbnails/image_frame_source.h"
#include "platform/media/media_asset.h"
#include "platform/thread_rules.h"

#include <QLoggingCategory>

#include <atomic>
#include <deque>
#include <mutex>

namespace zaf::media {

namespace {

using zaf::media::lcMedia;

// Requests are made with the settings of their moment.
struct Batch {
    QList<MediaTime> times;
    ImageGenerator::Handler handler;
    ImageFrameSource::Request settings;
    std::uint64_t epoch = 0;     // the cancellation epoch when it was queued
};

} // namespace

struct ImageGenerator::Private {
    std::shared_ptr<MediaAsset> asset;
    std::atomic<int> requestedTimes{0};

    mutable std::mutex settingsMutex;
    QSize maximumSize;
    bool appliesTransform = true;
    MediaTime toleranceBefore = MediaTime::positiveInfinity();
    MediaTime toleranceAfter = MediaTime::positiveInfinity();

    std::mutex queueMutex;
    std::deque<Batch> queue;
    bool queueRunning = false;

    // cancelAllImageGeneration() moves the epoch on; work of an older epoch is cancelled. It also
    // cancels `interrupt`, which stops the decode in progress; each request clears it first.
    std::atomic<std::uint64_t> cancelEpoch{0};
    CancelToken interrupt;

    std::mutex decodeMutex;                    // guards source
    std::unique_ptr<ImageFrameSource> source;

    ImageFrameSource::Request currentSettings() const
    {
        std::lock_guard lock(settingsMutex);
        ImageFrameSource::Request request;
        request.maximumSize = maximumSize;
        request.appliesTransform = appliesTransform;
        request.toleranceBefore = toleranceBefore;
        request.toleranceAfter = toleranceAfter;
        return request;
    }

    // Runs one request under the decode lock; opens the source on first use.
    ImageFrameSource::Answer generate(const MediaTime &time, ImageFrameSource::Request request, std::uint64_t epoch)
    {
        std::lock_guard lock(decodeMutex);
        // Cleared before the epoch is read: a cancel after the read sets it again.
        interrupt.reset();
        if (epoch != cancelEpoch.load())
            return cancelledAnswer();
        if (!source) {
            if (!asset->load()) {
                const OptionalError error = asset->loadError();
                const Error reported = error ? *error : makeMediaError(kMediaErrorCannotOpen, QStringLiteral("cannot open the movie"));
                zaf::log::error(lcMedia(), QStringLiteral("ImageGenerator: no pictures from %1: %2")
                                               .arg(asset->url().toString(), reported.message));
                return ImageFrameSource::Answer{{}, MediaTime::invalid(), reported, false};
            }
            const QList<AssetTrack> video = asset->tracksWithMediaType(MediaType::Video);
            if (video.isEmpty()) {
                const Error error = makeMediaError(kMediaErrorNoTracks, QStringLiteral("the movie has no video track"));
                zaf::log::error(lcMedia(), QStringLiteral("ImageGenerator: no pictures from %1: %2").arg(asset->url().toString(), error.message));
                return ImageFrameSource::Answer{{}, MediaTime::invalid(), error, false};
            }
            source = std::make_unique<ImageFrameSource>(asset->url().toLocalFile(), video.first().streamIndex,
                                                        video.first().preferredTransform.rotationDegrees(), interrupt);
        }
        request.time = time;
        return source->imageAt(request);
    }

    static ImageFrameSource::Answer cancelledAnswer()
    {
        return ImageFrameSource::Answer{{}, MediaTime::invalid(),
                                        makeMediaError(kMediaErrorCancelled, QStringLiteral("image generation was cancelled")), true};
    }
};

ImageGenerator::ImageGenerator(std::shared_ptr<MediaAsset> asset) : d(std::make_unique<Private>())
{
    d->asset = std::move(asset);
}

ImageGenerator::~ImageGenerator() = default;

std::shared_ptr<ImageGenerator> ImageGenerator::imageGeneratorWithAsset(std::shared_ptr<MediaAsset> asset)
{
    if (!asset) {
        zaf::log::error(lcMedia(), QStringLiteral("ImageGenerator: no asset"));
        asset = MediaAsset::assetWithURL(QUrl());
    }
    return std::shared_ptr<ImageGenerator>(new ImageGenerator(std::move(asset)));
}

std::shared_ptr<MediaAsset> ImageGenerator::asset() const
{
    return d->asset;
}

void ImageGenerator::setMaximumSize(const QSize &pixels)
{
    std::lock_guard lock(d->settingsMutex);
    d->maximumSize = QSize(std::max(0, pixels.width()), std::max(0, pixels.height()));
}

QSize ImageGenerator::maximumSize() const
{
    std::lock_guard lock(d->settingsMutex);
    return d->maximumSize;
}

void ImageGenerator::setAppliesPreferredTrackTransform(bool applies)
{
    std::lock_guard lock(d->settingsMutex);
    d->appliesTransform = applies;
}

bool ImageGenerator::appliesPreferredTrackTransform() const
{
    std::lock_guard lock(d->settingsMutex);
    return d->appliesTransform;
}

void ImageGenerator::setRequestedTimeToleranceBefore(const MediaTime &tolerance)
{
    std::lock_guard lock(d->settingsMutex);
    d->toleranceBefore = tolerance;
}

void ImageGenerator::setRequestedTimeToleranceAfter(const MediaTime &tolerance)
{
    std::lock_guard lock(d->settingsMutex);
    d->toleranceAfter = tolerance;
}

MediaTime ImageGenerator::requestedTimeToleranceBefore() const
{
    std::lock_guard lock(d->settingsMutex);
    return d->toleranceBefore;
}

MediaTime ImageGenerator::requestedTimeToleranceAfter() const
{
    std::lock_guard lock(d->settingsMutex);
    return d->toleranceAfter;
}

int ImageGenerator::requestedTimeCount() const
{
    return d->requestedTimes.load();
}

void ImageGenerator::generateImagesAsynchronouslyForTimes(const QList<MediaTime> &times, Handler handler)
{
    if (times.isEmpty() || !handler)
        return;
    d->requestedTimes += int(times.size());
    Batch batch;
    batch.times = times;
    batch.handler = std::move(handler);
    batch.settings = d->currentSettings();
    std::lock_guard lock(d->queueMutex);
    batch.epoch = d->cancelEpoch.load();
    d->queue.push_back(std::move(batch));
    if (d->queueRunning)
        return;
    d->queueRunning = true;
    // The task holds the generator: it lives until every queued request has been answered.
    dispatch::async(dispatch::Priority::Default, [self = shared_from_this()] { self->runQueue(); });
}

void ImageGenerator::runQueue()
{
    for (;;) {
        Batch batch;
        {
            std::lock_guard lock(d->queueMutex);
            if (d->queue.empty()) {
                d->queueRunning = false;
                return;
            }
            batch = std::move(d->queue.front());
            d->queue.pop_front();
        }
        for (const MediaTime &time : std::as_const(batch.times)) {
            const ImageFrameSource::Answer answer = batch.epoch == d->cancelEpoch.load()
                                                        ? d->generate(time, batch.settings, batch.epoch)
                                                        : Private::cancelledAnswer();
            const Result result = answer.cancelled ? Result::Cancelled : answer.image.isNull() ? Result::Failed : Result::Succeeded;
            OptionalError error = answer.error;
            if (result == Result::Failed && !error)
                error = makeMediaError(kMediaErrorDecodeFailed, QStringLiteral("no picture"));
            ZAF_ASSERT_WORKER_THREAD();
            batch.handler(time, answer.image, result == Result::Succeeded ? answer.actualTime : MediaTime::invalid(), result,
                          result == Result::Succeeded ? OptionalError() : error);
        }
    }
}

QImage ImageGenerator::copyImageAtTime(const MediaTime &time, MediaTime *actualTime, OptionalError *error)
{
    const ImageFrameSource::Answer answer = d->generate(time, d->currentSettings(), d->cancelEpoch.load());
    if (actualTime)
        *actualTime = answer.image.isNull() ? MediaTime::invalid() : answer.actualTime;
    if (error)
        *error = answer.image.isNull() ? (answer.error ? answer.error : makeMediaError(kMediaErrorDecodeFailed, QStringLiteral("no picture")))
                                       : OptionalError();
    return answer.image;
}

void ImageGenerator::cancelAllImageGeneration()
{
    // Queued requests see the new epoch when their turn comes; a decode in progress sees it
    // through the source's interrupt check.
    d->cancelEpoch.fetch_add(1);
    d->interrupt.cancel();
    zaf::log::info(lcMedia(), QStringLiteral("ImageGenerator: cancelled pending requests for %1").arg(d->asset->url().toString()));
}

} // namespace zaf::media
