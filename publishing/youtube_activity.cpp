#include "publishing/youtube_activity.h"

#include "media/audio_mix_utility.h"
#include "platform/capability/capability_service.h"
#include "platform/log.h"
#include "platform/media/export_session.h"
#include "platform/media/media_asset.h"
#include "platform/ui/screen.h"
#include "tempstore/temp_directory.h"
#include "tempstore/temp_store.h"

#include <QDateTime>
#include <QFile>
#include <QMetaType>
#include <QPainter>
#include <QPixmap>
#include <QSvgRenderer>
#include <QtMath>

#include <mutex>

namespace {
Q_LOGGING_CATEGORY(lcYouTubeActivity, "zaf.publishing.activity")

constexpr double kSettingsIconPoints = 29.0;

const QString &imageBundlePath()
{
    static const QString path = QStringLiteral(":/zaf/publishing/");
    return path;
}

bool isLocalFileURL(const QVariant &item)
{
    return item.typeId() == QMetaType::QUrl && item.toUrl().isLocalFile();
}

bool isString(const QVariant &item)
{
    return item.typeId() == QMetaType::QString;
}

bool opensAsPlayableMovie(const QUrl &url)
{
    const std::shared_ptr<zaf::media::MediaAsset> asset = zaf::media::MediaAsset::assetWithURL(url);
    return asset && asset->load() && asset->isPlayable();
}

// Renders an SVG so that its `points` rectangle fills an image at the main screen's scale.
QImage renderAtScreenScale(QSvgRenderer &renderer, const QSizeF &points)
{
    const double scale = zaf::ui::Screen::mainScreenScale();
    const QSize pixels(qCeil(points.width() * scale), qCeil(points.height() * scale));
    QImage image(pixels, QImage::Format_ARGB32_Premultiplied);
    image.fill(Qt::transparent);
    {
        QPainter painter(&image);
        painter.setRenderHint(QPainter::Antialiasing);
        renderer.render(&painter, QRectF(QPointF(0, 0), points * scale));
    }
    image.setDevicePixelRatio(scale);
    return image;
}
} // namespace

// The images live in a static library, so the resource is registered by hand before the first
// lookup. The registration routine is a global symbol: this has to be a global-namespace function.
static void registerYouTubeActivityImages()
{
    Q_INIT_RESOURCE(youtube_activity_images);
}

ZafYouTubeActivity::ZafYouTubeActivity(QObject *parent)
    : zaf::ui::ShareActivity(parent)
{
}

ZafYouTubeActivity::~ZafYouTubeActivity() = default;

QString ZafYouTubeActivity::activityType() const
{
    return QStringLiteral("ZafPublishToYouTube");
}

QString ZafYouTubeActivity::activityTitle() const
{
    // A service name: never translated.
    return QStringLiteral("YouTube");
}

QString ZafYouTubeActivity::activityImageName()
{
    return QStringLiteral("ZafPublishVideo");
}

QIcon ZafYouTubeActivity::activityImage() const
{
    const QImage image = mediaShelfImageNamed(activityImageName());
    if (image.isNull())
        return {};
    return QIcon(QPixmap::fromImage(image));
}

QImage ZafYouTubeActivity::_activitySettingsImage() const
{
    const QString bundle = mediaShelfFrameworkBundle();
    if (bundle.isEmpty())
        return {};
    QSvgRenderer renderer(bundle + activityImageName() + QStringLiteral(".svg"));
    if (!renderer.isValid())
        return {};
    return renderAtScreenScale(renderer, QSizeF(kSettingsIconPoints, kSettingsIconPoints));
}

QString ZafYouTubeActivity::mediaShelfFrameworkBundle()
{
    static QString bundle;
    static std::once_flag once;
    std::call_once(once, [] {
        registerYouTubeActivityImages();
        if (QFile::exists(imageBundlePath() + activityImageName() + QStringLiteral(".svg")))
            bundle = imageBundlePath();
        else
            zaf::log::error(lcYouTubeActivity(), QStringLiteral("ZafYouTubeActivity: image bundle missing"));
    });
    return bundle;
}

QImage ZafYouTubeActivity::mediaShelfImageNamed(const QString &name)
{
    const QString bundle = mediaShelfFrameworkBundle();
    if (bundle.isEmpty() || name.isEmpty())
        return {};
    const QString path = bundle + name + QStringLiteral(".svg");
    if (!QFile::exists(path))
        return {};
    QSvgRenderer renderer(path);
    const QSize points = renderer.defaultSize();
    if (!renderer.isValid() || points.isEmpty())
        return {};
    return renderAtScreenScale(renderer, QSizeF(points));
}

bool ZafYouTubeActivity::canPerformWithActivityItems(const QVariantList &activityItems)
{
    Q_UNUSED(activityItems);
    return zaf::CapabilityService::shared().booleanAnswer(QLatin1String(zaf::capability::kNotGreenTea), false);
}

QUrl ZafYouTubeActivity::tempFileURL()
{
    return tempFileURLForTime(double(QDateTime::currentMSecsSinceEpoch()) / 1000.0);
}

QUrl ZafYouTubeActivity::tempFileURLForTime(double secondsSince1970)
{
    // "%@/": the directory already ends in "/", so the path holds "//" (the kernel reads one).
    const QString stem = ZafTempStore::defaultStore()._srTempPath() + QStringLiteral("/ZafReplay_YouTube");
    return QUrl::fromLocalFile(ZafTempMovieFileNameAt(stem, secondsSince1970));
}

QUrl ZafYouTubeActivity::movieInItems(const QVariantList &activityItems)
{
    // The usual list carries the movie at position 2.
    if (activityItems.size() > 2 && isLocalFileURL(activityItems.at(2))) {
        const QUrl url = activityItems.at(2).toUrl();
        if (opensAsPlayableMovie(url))
            return url;
    }
    // A list led by the host's own message: the first local file that plays.
    for (const QVariant &item : activityItems) {
        if (!isLocalFileURL(item))
            continue;
        const QUrl url = item.toUrl();
        if (opensAsPlayableMovie(url))
            return url;
    }
    return {};
}

QString ZafYouTubeActivity::descriptionForItems(const QVariantList &activityItems)
{
    const bool textFirst = !activityItems.isEmpty() && isString(activityItems.at(0));
    const bool textSecond = activityItems.size() > 1 && isString(activityItems.at(1));
    if (textFirst && textSecond)
        return activityItems.at(0).toString() + QLatin1Char(' ') + activityItems.at(1).toString();
    if (textFirst)
        return activityItems.at(0).toString();
    if (textSecond)
        return activityItems.at(1).toString();
    return {};
}

void ZafYouTubeActivity::prepareWithActivityItems(const QVariantList &activityItems)
{
    zaf::ui::ShareActivity::prepareWithActivityItems(activityItems);

    m_movieURL = tempFileURL();
    m_sourceMovieURL = movieInItems(activityItems);
    m_exportSession.reset();

    if (m_sourceMovieURL.isEmpty()) {
        zaf::log::notice(lcYouTubeActivity(), QStringLiteral("ZafYouTubeActivity: no movie among the activity items"));
    } else {
        m_exportSession = ZafAudioMixUtility::exportSessionForMixingAudio(m_sourceMovieURL, m_movieURL);
        if (!m_exportSession) {
            zaf::log::notice(lcYouTubeActivity(), QStringLiteral("ZafYouTubeActivity: no export session for the movie"));
        } else {
            // The session keeps itself alive until its completion has run; the completion must not
            // keep it alive beyond that, so it looks at the session through a weak reference.
            const std::weak_ptr<zaf::media::ExportSession> weakSession = m_exportSession;
            m_exportSession->exportAsynchronously([weakSession] {
                const std::shared_ptr<zaf::media::ExportSession> session = weakSession.lock();
                if (!session)
                    return;
                const zaf::media::ExportStatus status = session->status();
                if (status == zaf::media::ExportStatus::Failed || status == zaf::media::ExportStatus::Cancelled)
                    return;
                zaf::log::info(lcYouTubeActivity(),
                               QStringLiteral("ZafYouTubeActivity: Export Mixed YouTube Video Complete."));
            });
        }
    }

    m_descriptionText = descriptionForItems(activityItems);
}
