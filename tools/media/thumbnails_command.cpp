// zaf-media thumbnails IN --count N --height H --out DIR: N evenly spaced, upright PNG thumbnails.
#include "platform/media/image_generator.h"
#include "platform/media/media_asset.h"
#include "tools/media/commands.h"

#include <QDir>
#include <QImage>
#include <QUrl>

#include <condition_variable>
#include <cstdio>
#include <mutex>

namespace zaf::tools {

int thumbnailsCommand(const QStringList &args)
{
    using namespace zaf::media;
    const QString usage = QStringLiteral("usage: zaf-media thumbnails IN --count N --height H --out DIR");
    if (args.size() != 7 || args[1] != QLatin1String("--count") || args[3] != QLatin1String("--height")
        || args[5] != QLatin1String("--out"))
        return fail(usage);
    bool okCount = false, okHeight = false;
    const int count = args[2].toInt(&okCount), height = args[4].toInt(&okHeight);
    if (!okCount || !okHeight || count < 1 || count > 10000 || height < 1 || height > 8192)
        return fail(QStringLiteral("count must be 1..10000 and height 1..8192; ") + usage);
    const QString outDir = args[6];
    if (!QDir().mkpath(outDir))
        return fail(QStringLiteral("cannot create %1").arg(outDir));

    const std::shared_ptr<MediaAsset> asset = MediaAsset::assetWithURL(QUrl::fromLocalFile(args[0]));
    if (!asset->load()) {
        const OptionalError error = asset->loadError();
        return fail(QStringLiteral("cannot read %1: %2").arg(args[0], error ? error->message : QString()));
    }
    if (asset->tracksWithMediaType(MediaType::Video).isEmpty())
        return fail(QStringLiteral("%1 has no video").arg(args[0]));

    const double duration = asset->duration().seconds();
    QList<MediaTime> times;
    for (int i = 0; i < count; ++i)
        times.append(MediaTime::fromSeconds(duration * i / count, 600));

    const std::shared_ptr<ImageGenerator> generator = ImageGenerator::imageGeneratorWithAsset(asset);
    generator->setMaximumSize(QSize(0, height));

    std::mutex mutex;
    std::condition_variable allDone;
    int remaining = count, failures = 0, index = 0;
    generator->generateImagesAsynchronouslyForTimes(
        times, [&](const MediaTime &requested, const QImage &image, const MediaTime &, ImageGenerator::Result result,
                   const OptionalError &error) {
            std::lock_guard lock(mutex);
            const int n = ++index;
            const QString path = QDir(outDir).filePath(QStringLiteral("thumb-%1.png").arg(n, 3, 10, QLatin1Char('0')));
            if (result != ImageGenerator::Result::Succeeded || image.isNull() || !image.save(path)) {
                ++failures;
                std::fprintf(stderr, "zaf-media: no thumbnail at %.3fs: %s\n", requested.seconds(),
                             error ? qPrintable(error->message) : "cannot write the image");
            } else {
                std::printf("%s\n", qPrintable(path));
            }
            if (--remaining == 0)
                allDone.notify_one();
        });
    std::unique_lock lock(mutex);
    allDone.wait(lock, [&] { return remaining == 0; });
    return failures == 0 ? 0 : 1;
}

} // namespace zaf::tools
