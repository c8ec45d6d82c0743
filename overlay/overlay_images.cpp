#include "overlay/overlay_images.h"

#include "platform/log.h"
#include "platform/ui/screen.h"

#include <QFile>
#include <QSvgRenderer>

#include <mutex>

Q_LOGGING_CATEGORY(lcOverlay, "zaf.overlay")

// The resources live in a static library: register them once before the first lookup. This has to
// be a global-namespace function because the registration routine is a global symbol.
static void registerOverlayResources()
{
    Q_INIT_RESOURCE(overlay_resources);
}

namespace zaf::overlay {

QImage imageNamed(const QString &name)
{
    static std::once_flag registered;
    std::call_once(registered, registerOverlayResources);

    const QString path = QStringLiteral(":/zaf/overlay/%1.svg").arg(name);
    if (!QFile::exists(path)) {
        log::error(lcOverlay(), QStringLiteral("no image named %1").arg(name));
        return {};
    }
    QSvgRenderer renderer(path);
    const QSize points = renderer.defaultSize();
    if (!renderer.isValid() || points.isEmpty()) {
        log::error(lcOverlay(), QStringLiteral("cannot read the image %1").arg(name));
        return {};
    }

    return zaf::ui::Screen::renderAtMainScreenScale(renderer, QSizeF(points));
}

QSizeF sizeInPoints(const QImage &image)
{
    return image.deviceIndependentSize();
}

} // namespace zaf::overlay
