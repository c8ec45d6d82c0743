#include "platform/media/media_asset.h"
#include "platform/media/core/media_log.h"

#include "platform/dispatch.h"
#include "platform/log.h"
#include "platform/media/core/ffmpeg_ptr.h"
#include "platform/media/core/media_input.h"

extern "C" {
#include <libavutil/display.h>
}

#include <QFileInfo>
#include <QLoggingCategory>

#include <chrono>
#include <cmath>
#include <mutex>

namespace zaf::media {

namespace {

using zaf::media::lcMedia;

// Opening a file and reading its header never takes longer than this: a file on a stalled network
// mount fails instead of blocking its caller for ever.
constexpr auto kOpenTimeBound = std::chrono::seconds(20);

int normalizedQuarterTurns(double degrees)
{
    if (!std::isfinite(degrees))
        return 0;
    const long quarters = std::lround(degrees / 90.0);
    return int(((quarters % 4) + 4) % 4);
}

// A stream time in the stream's own time base, as a MediaTime whose timescale is that base's
// denominator (rescaled when the base's numerator is not 1).
MediaTime streamTime(std::int64_t value, AVRational timeBase)
{
    if (value == AV_NOPTS_VALUE || timeBase.num <= 0 || timeBase.den <= 0)
        return MediaTime::invalid();
    if (timeBase.num == 1)
        return MediaTime::make(value, timeBase.den);
    return MediaTime::make(av_rescale_q(value, timeBase, AVRational{1, timeBase.den}), timeBase.den);
}

// Clockwise display rotation of a stream, from its display matrix side data (0 without one).
int streamRotationClockwise(const AVStream *stream)
{
    size_t size = 0;
    const uint8_t *data = av_stream_get_side_data(stream, AV_PKT_DATA_DISPLAYMATRIX, &size);
    if (!data || size < 9 * sizeof(int32_t))
        return 0;
    // av_display_rotation_get answers in degrees counter-clockwise.
    const double counterClockwise = av_display_rotation_get(reinterpret_cast<const int32_t *>(data));
    return normalizedQuarterTurns(-counterClockwise) * 90;
}

} // namespace

Error makeMediaError(int code, const QString &message)
{
    return Error{QString::fromLatin1(kMediaErrorDomain), code, message};
}

AffineTransform AffineTransform::rotation(int degreesClockwise, double w, double h)
{
    switch (normalizedQuarterTurns(degreesClockwise)) {
    case 1:
        return AffineTransform{0, 1, -1, 0, h, 0};
    case 2:
        return AffineTransform{-1, 0, 0, -1, w, h};
    case 3:
        return AffineTransform{0, -1, 1, 0, 0, w};
    default:
        return identity();
    }
}

QSizeF AffineTransform::mapSize(const QSizeF &size) const
{
    const double w = size.width(), h = size.height();
    return QSizeF(std::abs(a * w + c * h), std::abs(b * w + d * h));
}

int AffineTransform::rotationDegrees() const
{
    if (a == 0 && b == 0)
        return 0;
    return normalizedQuarterTurns(std::atan2(b, a) * 180.0 / M_PI) * 90;
}

// The answers of one load, shared with queued asynchronous loads so that they stay valid when the
// asset is released before the queue gets to them.
struct AssetState {
    QUrl url;
    std::mutex mutex;
    bool loaded = false;
    bool playable = false;
    OptionalError error;
    QList<AssetTrack> tracks;
    MediaTime duration;
    QString containerName;

    void loadLocked();
    void ensureLoaded()
    {
        std::lock_guard lock(mutex);
        if (!loaded) {
            loadLocked();
            loaded = true;
        }
    }
    void fail(int code, const QString &message)
    {
        error = makeMediaError(code, message);
        zaf::log::error(lcMedia(), QStringLiteral("MediaAsset: %1").arg(message));
    }
};

void AssetState::loadLocked()
{
    if (!url.isLocalFile()) {
        fail(kMediaErrorCannotOpen, QStringLiteral("not a local file URL: %1").arg(url.toString()));
        return;
    }
    const QString path = url.toLocalFile();
    const QFileInfo info(path);
    if (!info.exists()) {
        fail(kMediaErrorCannotOpen, QStringLiteral("no such file: %1").arg(path));
        return;
    }
    if (!info.isFile() || info.size() == 0) {
        fail(kMediaErrorCannotOpen, QStringLiteral("not a movie file (empty or not a regular file): %1").arg(path));
        return;
    }

    CancelToken openBound;
    openBound.setDeadlineAfter(kOpenTimeBound);
    QString error;
    const ff::InputFormatContextPtr format = openInput(path, openBound, &error);
    if (!format) {
        fail(kMediaErrorCannotOpen, error);
        return;
    }
    containerName = QString::fromLatin1(format->iformat->name);

    MediaTime longest;
    for (unsigned i = 0; i < format->nb_streams; ++i) {
        const AVStream *stream = format->streams[i];
        const AVCodecParameters *par = stream->codecpar;
        AssetTrack track;
        track.trackID = std::int32_t(i) + 1;
        track.streamIndex = int(i);
        track.codecName = QString::fromLatin1(avcodec_get_name(par->codec_id));
        track.bitRate = par->bit_rate;
        track.duration = streamTime(stream->duration, stream->time_base);
        if (par->codec_type == AVMEDIA_TYPE_VIDEO && !(stream->disposition & AV_DISPOSITION_ATTACHED_PIC)) {
            track.mediaType = MediaType::Video;
            track.naturalSize = QSizeF(par->width, par->height);
            track.preferredTransform = AffineTransform::rotation(streamRotationClockwise(stream), par->width, par->height);
            AVRational rate = stream->avg_frame_rate;
            if (rate.num <= 0 || rate.den <= 0)
                rate = stream->r_frame_rate;
            track.nominalFrameRate = (rate.num > 0 && rate.den > 0) ? av_q2d(rate) : 0.0;
        } else if (par->codec_type == AVMEDIA_TYPE_AUDIO) {
            track.mediaType = MediaType::Audio;
            track.sampleRate = par->sample_rate;
            track.channelCount = par->ch_layout.nb_channels;
        }
        if (track.mediaType != MediaType::Other) {
            playable = true;
            if (track.duration.isNumeric() && (!longest.isValid() || track.duration > longest))
                longest = track.duration;
        }
        tracks.append(track);
    }
    if (!longest.isValid() && format->duration != AV_NOPTS_VALUE && format->duration > 0)
        longest = MediaTime::make(format->duration, AV_TIME_BASE);
    duration = longest;

    if (!playable)
        fail(kMediaErrorNoTracks, QStringLiteral("no audio or video track in %1").arg(path));
}

struct MediaAsset::Private {
    std::shared_ptr<AssetState> state;
};

MediaAsset::MediaAsset(const QUrl &url)
    : d(std::make_unique<Private>())
{
    d->state = std::make_shared<AssetState>();
    d->state->url = url;
}

MediaAsset::~MediaAsset() = default;

std::shared_ptr<MediaAsset> MediaAsset::assetWithURL(const QUrl &url)
{
    ensureFFmpegLogging();
    return std::shared_ptr<MediaAsset>(new MediaAsset(url));
}

QUrl MediaAsset::url() const
{
    return d->state->url;
}

bool MediaAsset::load() const
{
    d->state->ensureLoaded();
    std::lock_guard lock(d->state->mutex);
    return d->state->playable;
}

void MediaAsset::loadAsynchronously(std::function<void()> completion) const
{
    std::shared_ptr<AssetState> state = d->state;
    dispatch::async(dispatch::Priority::Default, [state, completion = std::move(completion)] {
        state->ensureLoaded();
        if (completion)
            completion();
    });
}

bool MediaAsset::isLoaded() const
{
    std::lock_guard lock(d->state->mutex);
    return d->state->loaded;
}

OptionalError MediaAsset::loadError() const
{
    d->state->ensureLoaded();
    std::lock_guard lock(d->state->mutex);
    return d->state->error;
}

QList<AssetTrack> MediaAsset::tracks() const
{
    d->state->ensureLoaded();
    std::lock_guard lock(d->state->mutex);
    return d->state->tracks;
}

QList<AssetTrack> MediaAsset::tracksWithMediaType(MediaType type) const
{
    QList<AssetTrack> result;
    for (const AssetTrack &track : tracks()) {
        if (track.mediaType == type)
            result.append(track);
    }
    return result;
}

MediaTime MediaAsset::duration() const
{
    d->state->ensureLoaded();
    std::lock_guard lock(d->state->mutex);
    return d->state->duration;
}

bool MediaAsset::isPlayable() const
{
    return load();
}

QString MediaAsset::containerName() const
{
    d->state->ensureLoaded();
    std::lock_guard lock(d->state->mutex);
    return d->state->containerName;
}

} // namespace zaf::media
