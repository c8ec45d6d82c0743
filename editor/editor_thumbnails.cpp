// The timeline's data source: duration, thumbnail aspect ratio, evenly spaced timestamps and
// thumbnails, generated in the background and cached by timestamp.
#include "editor/editor.h"

#include "editor/editor_constants.h"
#include "platform/dispatch.h"
#include "platform/media/image_generator.h"
#include "platform/media/media_asset.h"
#include "platform/media/player_item.h"
#include "platform/ui/screen.h"

#include <cmath>

using namespace zaf::media;
using namespace zaf::ui;

namespace {
// Timestamps are handed to the generator in nanoseconds: the same instant for every practical value.
constexpr std::int32_t kThumbnailTimescale = 1000000000;
} // namespace

double ZafVideoEditorViewController::movieScrubberDuration(MovieScrubber *)
{
    return getPlayerDuration();
}

double ZafVideoEditorViewController::movieScrubberThumbnailAspectRatio(MovieScrubber *)
{
    double w = 0, h = 0, a = 0, b = 0, c = 0, d = 0;
    const std::shared_ptr<PlayerItem> item = m_mvPlayer ? m_mvPlayer->currentItem() : nullptr;
    if (item) {
        const QList<AssetTrack> tracks = item->asset()->tracksWithMediaType(MediaType::Video);
        if (!tracks.isEmpty()) {
            const AssetTrack &track = tracks.first();
            w = track.naturalSize.width();
            h = track.naturalSize.height();
            a = track.preferredTransform.a;
            b = track.preferredTransform.b;
            c = track.preferredTransform.c;
            d = track.preferredTransform.d;
        }
    }
    const double width = std::fabs(a * w + c * h);
    const double height = std::fabs(b * w + d * h);
    return height > 0 && width > 0 ? width / height : 1.0;
}

QList<double> ZafVideoEditorViewController::movieScrubberEvenlySpacedTimestampsStartingAtEndingAt(MovieScrubber *,
                                                                                                   int count,
                                                                                                   double start,
                                                                                                   double end)
{
    if (end == 0.0)
        return {0.0};
    QList<double> timestamps;
    if (count > 0)
        timestamps.reserve(count);
    const double duration = getPlayerDuration();
    if (count < 1)
        return timestamps;
    // The values are accumulated by repeated addition, not computed as start + i * step.
    const double step = (end - start) / count;
    double t = start;
    int i = 1;
    for (;;) {
        timestamps.append(t);
        t = t + step;
        if (!(t <= duration && i < count))
            break;
        ++i;
    }
    return timestamps;
}

QSizeF ZafVideoEditorViewController::getThumbnailSize() const
{
    return thumbnailSizeForVideoSize(getVideoSize(), Screen::mainScreenScale());
}

QSizeF ZafVideoEditorViewController::thumbnailSizeForVideoSize(const QSizeF &video, double scale)
{
    // The ratio is taken in single precision, and the width rounded in single precision with ties to
    // even; the scale enters the width twice and the height once.
    const float ratio = float(video.width() / video.height());
    const double height = scale * zaf::editor::kTimelineHeight;
    const float points = float(scale * zaf::editor::kTimelineHeight * double(ratio));
    const double width = scale * double(std::rint(points)); // ties to even in the default rounding mode
    return QSizeF(width, height);
}

void ZafVideoEditorViewController::movieScrubberRequestThumbnailImageForTimestamp(MovieScrubber *, double timestamp)
{
    if (!m_thumbnailGenerator) {
        const std::shared_ptr<PlayerItem> item = m_mvPlayer->currentItem();
        m_thumbnailGenerator = ImageGenerator::imageGeneratorWithAsset(item->asset());
        const QSizeF size = getThumbnailSize();
        // Without a video track the width is not a number: the height alone limits the images.
        const int width = std::isfinite(size.width()) ? int(size.width()) : 0;
        m_thumbnailGenerator->setMaximumSize(QSize(width, int(size.height())));
    }
    if (!m_cachedTimeStamps)
        m_cachedTimeStamps.emplace();
    if (m_cachedTimeStamps->contains(timestamp)) {
        setThumbnailFromCacheWithTimeStamp(timestamp);
        return;
    }
    QPointer<ZafVideoEditorViewController> weakSelf(this);
    // Runs on a thread of the generator; the cache is written on the main thread only.
    m_thumbnailGenerator->generateImagesAsynchronouslyForTimes(
        {MediaTime::fromSeconds(timestamp, kThumbnailTimescale)},
        [weakSelf, timestamp](const MediaTime &, const QImage &image, const MediaTime &, ImageGenerator::Result,
                              const zaf::OptionalError &error) {
            if (error || image.isNull())
                return;
            zaf::dispatch::main([weakSelf, timestamp, image] {
                ZafVideoEditorViewController *self = weakSelf.data();
                if (!self)
                    return;
                // Stored in the cache that exists now; an answer that arrives after a discard and
                // before a new cache exists is stored nowhere.
                if (self->m_cachedTimeStamps)
                    self->m_cachedTimeStamps->insert(timestamp, image);
                self->setThumbnailFromCacheWithTimeStamp(timestamp);
            });
        });
}

void ZafVideoEditorViewController::setThumbnailFromCacheWithTimeStamp(double timestamp)
{
    QPointer<ZafVideoEditorViewController> weakSelf(this);
    zaf::dispatch::main([weakSelf, timestamp] {
        ZafVideoEditorViewController *self = weakSelf.data();
        if (!self)
            return;
        const QImage image = self->m_cachedTimeStamps ? self->m_cachedTimeStamps->value(timestamp) : QImage();
        self->m_mvTrimmer->setThumbnailImageForTimestamp(image, timestamp);
    });
}
