#include "platform/media/export_session.h"

#include "platform/dispatch.h"
#include "platform/log.h"
#include "platform/media/export/export_common.h"
#include "platform/media/export/export_output_file.h"
#include "platform/media/export/export_pipeline.h"
#include "platform/thread_rules.h"

#include <algorithm>
#include <atomic>
#include <condition_variable>
#include <mutex>

namespace zaf::media {

using namespace exportpipe;

namespace {
std::atomic<std::uint64_t> g_lastSessionID{0};
} // namespace

struct ExportSession::Private {
    const std::uint64_t id = g_lastSessionID.fetch_add(1) + 1;
    std::shared_ptr<MediaAsset> asset;
    QString preset;

    mutable std::mutex mutex; // guards the settings and the error
    QUrl outputURL;
    QString fileType;
    std::optional<MediaTimeRange> timeRange;
    std::optional<AudioMix> audioMix;
    ExportSession::AudioMixBuilder audioMixBuilder;
    OptionalError error;

    std::atomic<int> status{int(ExportStatus::Unknown)};
    std::atomic<float> progress{0.0f};
    std::atomic<bool> started{false};
    CancelToken cancel;

    // Whether an export is queued or writing; waitUntilFinished() waits for it to turn false.
    mutable std::mutex runningMutex;
    mutable std::condition_variable_any stoppedRunning; // _any: its timed wait is visible to ThreadSanitizer
    bool running = false;

    void setRunning(bool value)
    {
        {
            std::lock_guard lock(runningMutex);
            running = value;
        }
        if (!value)
            stoppedRunning.notify_all();
    }

    // Sets the final status; the error first, so that a reader that sees the status sees the error.
    // Called once the output is committed or discarded: the export writes nothing after it.
    void finish(ExportStatus final, OptionalError finalError)
    {
        {
            std::lock_guard lock(mutex);
            error = std::move(finalError);
        }
        if (final == ExportStatus::Completed)
            progress.store(1.0f);
        status.store(int(final));
        setRunning(false);
    }
};

std::shared_ptr<ExportSession> ExportSession::exportSessionWithAsset(std::shared_ptr<MediaAsset> asset, const QString &preset)
{
    if (!asset) {
        zaf::log::error(lcExport(), QStringLiteral("no asset"));
        return nullptr;
    }
    if (preset != QLatin1String(kExportPresetHighestQuality)) {
        zaf::log::error(lcExport(), QStringLiteral("unknown preset \"%1\"").arg(preset));
        return nullptr;
    }
    return std::shared_ptr<ExportSession>(new ExportSession(std::move(asset), preset));
}

ExportSession::ExportSession(std::shared_ptr<MediaAsset> asset, const QString &preset)
    : d(std::make_unique<Private>())
{
    d->asset = std::move(asset);
    d->preset = preset;
}

ExportSession::~ExportSession() = default;

std::shared_ptr<MediaAsset> ExportSession::asset() const { return d->asset; }
QString ExportSession::presetName() const { return d->preset; }

void ExportSession::setOutputURL(const QUrl &url)
{
    std::lock_guard lock(d->mutex);
    d->outputURL = url;
}

QUrl ExportSession::outputURL() const
{
    std::lock_guard lock(d->mutex);
    return d->outputURL;
}

void ExportSession::setOutputFileType(const QString &type)
{
    std::lock_guard lock(d->mutex);
    d->fileType = type;
}

QString ExportSession::outputFileType() const
{
    std::lock_guard lock(d->mutex);
    return d->fileType;
}

void ExportSession::setTimeRange(const MediaTimeRange &range)
{
    std::lock_guard lock(d->mutex);
    d->timeRange = range;
}

std::optional<MediaTimeRange> ExportSession::timeRange() const
{
    std::lock_guard lock(d->mutex);
    return d->timeRange;
}

void ExportSession::setAudioMix(std::optional<AudioMix> mix)
{
    std::lock_guard lock(d->mutex);
    d->audioMix = std::move(mix);
    d->audioMixBuilder = nullptr;
}

void ExportSession::setAudioMixBuilder(AudioMixBuilder builder)
{
    std::lock_guard lock(d->mutex);
    d->audioMixBuilder = std::move(builder);
    d->audioMix.reset();
}

std::optional<AudioMix> ExportSession::audioMix() const
{
    std::lock_guard lock(d->mutex);
    return d->audioMix;
}

ExportStatus ExportSession::status() const
{
    return ExportStatus(d->status.load());
}

OptionalError ExportSession::error() const
{
    std::lock_guard lock(d->mutex);
    return d->error;
}

float ExportSession::progress() const
{
    return d->progress.load();
}

std::uint64_t ExportSession::sessionID() const
{
    return d->id;
}

void ExportSession::cancelExport()
{
    d->cancel.cancel();
    // An export that has not started, or waits for a pool thread, ends here: it will write nothing
    // (its run ends at once, with the completion). A running one notices the flag in its loops.
    for (ExportStatus before : {ExportStatus::Unknown, ExportStatus::Waiting}) {
        int expected = int(before);
        if (d->status.compare_exchange_strong(expected, int(ExportStatus::Cancelled))) {
            {
                std::lock_guard lock(d->mutex);
                d->error = makeMediaError(kMediaErrorCancelled, QStringLiteral("the export was cancelled"));
            }
            d->setRunning(false);
            return;
        }
    }
}

bool ExportSession::waitUntilFinished(std::chrono::milliseconds timeout) const
{
    std::unique_lock lock(d->runningMutex);
    return d->stoppedRunning.wait_for(lock, timeout, [this] { return !d->running; });
}

bool ExportSession::cancelExportAndWait(std::chrono::milliseconds timeout)
{
    cancelExport();
    if (waitUntilFinished(timeout))
        return true;
    zaf::log::error(lcExport(), QStringLiteral("export to %1 still writing %2 ms after its cancel")
                                    .arg(outputURL().toLocalFile())
                                    .arg(qint64(timeout.count())));
    return false;
}

void ExportSession::exportAsynchronously(std::function<void()> completion)
{
    if (d->started.exchange(true)) {
        zaf::log::error(lcExport(), QStringLiteral("the session has already exported; nothing new starts"));
        zaf::dispatch::async(zaf::dispatch::Priority::Default, [completion = std::move(completion)] {
            if (completion)
                completion();
        });
        return;
    }
    // Running before Waiting: a cancel that sees Waiting is the one that clears it.
    d->setRunning(true);
    int expected = int(ExportStatus::Unknown);
    if (!d->status.compare_exchange_strong(expected, int(ExportStatus::Waiting)))
        d->setRunning(false); // cancelled before the start: nothing will be written
    // The task holds the session until the completion has run.
    zaf::dispatch::async(zaf::dispatch::Priority::Default, [self = shared_from_this(), completion = std::move(completion)]() mutable {
        self->run(std::move(completion));
    });
}

namespace {

// The checks that need no file I/O beyond the asset's header; the job on success.
std::optional<ExportJob> prepareJob(const MediaAsset &asset, const QUrl &outputURL, const QString &fileType,
                                    const std::optional<MediaTimeRange> &timeRange,
                                    const std::optional<AudioMix> &audioMix, Error *error)
{
    if (fileType != QLatin1String(kFileTypeMPEG4)) {
        *error = makeMediaError(kMediaErrorInvalidArgument, QStringLiteral("unsupported output file type \"%1\"").arg(fileType));
        return std::nullopt;
    }
    if (outputURL.isEmpty() || !outputURL.isLocalFile() || outputURL.toLocalFile().isEmpty()) {
        *error = makeMediaError(kMediaErrorInvalidArgument, QStringLiteral("no output file URL (\"%1\")").arg(outputURL.toString()));
        return std::nullopt;
    }
    if (!asset.load()) {
        *error = asset.loadError().value_or(makeMediaError(kMediaErrorCannotOpen, QStringLiteral("the source cannot be read")));
        return std::nullopt;
    }
    ExportJob job;
    job.sourcePath = asset.url().toLocalFile();
    const MediaTime duration = asset.duration();
    job.durationSeconds = duration.isNumeric() ? duration.seconds() : 0.0;

    if (timeRange) {
        const MediaTime zero = MediaTime::zero();
        if (!timeRange->isValid() || timeRange->start < zero || timeRange->duration <= zero
            || (duration.isNumeric() && timeRange->start >= duration)) {
            *error = makeMediaError(kMediaErrorInvalidArgument, QStringLiteral("invalid time range: start %1, duration %2")
                                                                    .arg(timeRange->start.debugDescription(), timeRange->duration.debugDescription()));
            return std::nullopt;
        }
        MediaTime end = timeRange->end();
        if (duration.isNumeric() && end > duration)
            end = duration;
        job.cut = ExportJob::Cut{timeRange->start.convertScale(1000000).value, end.convertScale(1000000).value};
        if (job.cut->endMicros <= job.cut->startMicros) {
            *error = makeMediaError(kMediaErrorInvalidArgument, QStringLiteral("the time range is shorter than a microsecond"));
            return std::nullopt;
        }
    }
    if (audioMix) {
        QList<int> streams;
        const QList<AssetTrack> audioTracks = asset.tracksWithMediaType(MediaType::Audio);
        for (const AudioMixInputParameters &input : audioMix->inputParameters) {
            auto it = std::find_if(audioTracks.begin(), audioTracks.end(),
                                   [&](const AssetTrack &t) { return t.trackID == input.trackID; });
            if (it == audioTracks.end()) {
                *error = makeMediaError(kMediaErrorInvalidArgument, QStringLiteral("the audio mix names track %1, which is not an audio track").arg(input.trackID));
                return std::nullopt;
            }
            if (!streams.contains(it->streamIndex))
                streams.append(it->streamIndex);
        }
        job.mixStreamIndices = streams;
    }
    return job;
}

} // namespace

void ExportSession::run(std::function<void()> completion)
{
    ZAF_ASSERT_WORKER_THREAD();
    auto end = [&](ExportStatus final, OptionalError error) {
        if (error && final == ExportStatus::Failed)
            zaf::log::error(lcExport(), QStringLiteral("export to %1 failed: %2")
                                            .arg(outputURL().toLocalFile(), error->message));
        else if (final == ExportStatus::Cancelled)
            zaf::log::notice(lcExport(), QStringLiteral("export to %1 cancelled").arg(outputURL().toLocalFile()));
        d->finish(final, std::move(error));
        if (completion)
            completion();
    };
    const Error cancelled = makeMediaError(kMediaErrorCancelled, QStringLiteral("the export was cancelled"));
    int expected = int(ExportStatus::Waiting);
    if (d->cancel.isCancelled() || !d->status.compare_exchange_strong(expected, int(ExportStatus::Exporting)))
        return end(ExportStatus::Cancelled, cancelled);

    QUrl url;
    QString fileType;
    std::optional<MediaTimeRange> range;
    std::optional<AudioMix> mix;
    AudioMixBuilder buildMix;
    {
        std::lock_guard lock(d->mutex);
        url = d->outputURL;
        fileType = d->fileType;
        range = d->timeRange;
        mix = d->audioMix;
        buildMix = d->audioMixBuilder;
    }
    // A mix built from the tracks: loading here reads the header on this thread (a movie that
    // cannot be read fails in prepareJob below, with its load error).
    if (buildMix && d->asset->load()) {
        mix = buildMix(*d->asset);
        std::lock_guard lock(d->mutex);
        d->audioMix = mix;
    }
    Error error;
    std::optional<ExportJob> job = prepareJob(*d->asset, url, fileType, range, mix, &error);
    if (!job)
        return end(ExportStatus::Failed, error);
    std::unique_ptr<ExportOutputFile> output = ExportOutputFile::create(url.toLocalFile(), &error);
    if (!output)
        return end(ExportStatus::Failed, error);
    job->outputPath = output->temporaryPath();

    const std::function<void(float)> progress = [this](float value) { d->progress.store(value); };
    OptionalError result = runExport(*job, d->cancel, progress);
    if (d->cancel.isCancelled()) {
        output->discard();
        return end(ExportStatus::Cancelled, cancelled);
    }
    if (result) {
        output->discard();
        return end(ExportStatus::Failed, result);
    }
    if (OptionalError commitError = output->commit()) {
        output->discard();
        return end(ExportStatus::Failed, commitError);
    }
    zaf::log::info(lcExport(), QStringLiteral("wrote %1").arg(url.toLocalFile()));
    end(ExportStatus::Completed, std::nullopt);
}

} // namespace zaf::media
