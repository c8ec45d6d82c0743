#include "platform/ui/backdrop_view.h"
#include "platform/thread_rules.h"

#include <QEvent>
#include <QGraphicsEffect>
#include <QPainter>
#include <QPointer>
#include <QTimer>

#include <algorithm>
#include <cmath>
#include <vector>

namespace zaf::ui {

namespace {

constexpr const char *kMaskFlagsProperty = "_zaf_backdropMaskFlags";
constexpr int kBackgroundMaskFlags = 1 | 2 | 4;
constexpr int kGlyphFlags = 1 | 2;
// About 15 refreshes a second while shown.
constexpr int kRefreshIntervalMs = 66;

struct Look {
    int downscale;     // the content is rendered at 1/downscale of its size
    int blurRadius;    // box radius, in rendered (downscaled) pixels
    QColor tint;
};

Look lookForStyle(int)
{
    // 2010, and every style without a look of its own: a light, translucent white frost.
    return Look{4, 3, QColor(255, 255, 255, 150)};
}

bool isBackgroundMask(int flags)
{
    return (flags & kBackgroundMaskFlags) == kBackgroundMaskFlags;
}

bool isGlyphMask(int flags)
{
    return (flags & kGlyphFlags) == kGlyphFlags && !(flags & 4);
}

// One pass of a box blur along rows (horizontal) or columns, clamping at the edges, on
// premultiplied ARGB. Three passes each way come close to a Gaussian.
void boxBlurPass(QImage &image, int radius, bool horizontal)
{
    const int width = image.width(), height = image.height();
    const int lines = horizontal ? height : width;
    const int length = horizontal ? width : height;
    if (length == 0 || radius <= 0)
        return;
    const int window = 2 * radius + 1;
    std::vector<QRgb> source(size_t(length), 0);
    for (int line = 0; line < lines; ++line) {
        auto pixel = [&](int i) -> QRgb & {
            return horizontal ? reinterpret_cast<QRgb *>(image.scanLine(line))[i]
                              : reinterpret_cast<QRgb *>(image.scanLine(i))[line];
        };
        for (int i = 0; i < length; ++i)
            source[size_t(i)] = pixel(i);
        auto at = [&](int i) { return source[size_t(std::clamp(i, 0, length - 1))]; };
        int a = 0, r = 0, g = 0, b = 0;
        for (int i = -radius; i <= radius; ++i) {
            const QRgb p = at(i);
            a += qAlpha(p), r += qRed(p), g += qGreen(p), b += qBlue(p);
        }
        for (int i = 0; i < length; ++i) {
            pixel(i) = qRgba(r / window, g / window, b / window, a / window);
            const QRgb out = at(i - radius), in = at(i + radius + 1);
            a += qAlpha(in) - qAlpha(out);
            r += qRed(in) - qRed(out);
            g += qGreen(in) - qGreen(out);
            b += qBlue(in) - qBlue(out);
        }
    }
}

void boxBlur(QImage &image, int radius)
{
    for (int pass = 0; pass < 3; ++pass) {
        boxBlurPass(image, radius, true);
        boxBlurPass(image, radius, false);
    }
}

// Keeps a mask view off the screen while it has mask flags: it is drawn only into the masks the
// backdrop grabs from it. Its place, size and visibility stay as they are.
class MaskViewEffect : public QGraphicsEffect {
public:
    MaskViewEffect(QWidget *view, const bool *drawingMasks) : QGraphicsEffect(view), m_view(view), m_drawingMasks(drawingMasks)
    {
    }

protected:
    void draw(QPainter *painter) override
    {
        if (*m_drawingMasks || BackdropView::backdropMaskFlags(m_view) == 0)
            drawSource(painter);
    }

private:
    QWidget *m_view;
    const bool *m_drawingMasks;
};

} // namespace

struct BackdropView::Private {
    int style = 2010;
    QList<QPointer<QWidget>> maskViews;
    QImage blurred;             // the last blurred copy of what lies behind, downscaled
    QRect blurredArea;          // the area it covers, in this view's coordinates
    QTimer refreshTimer;
    bool refreshQueued = false;
    bool drawingMasks = false;  // mask views paint only into the masks, never on screen
};

BackdropView::BackdropView(int style, QWidget *parent) : QWidget(parent), d(std::make_unique<Private>())
{
    ZAF_ASSERT_MAIN_THREAD();
    d->style = style;
    setAttribute(Qt::WA_NoSystemBackground);
    d->refreshTimer.setInterval(kRefreshIntervalMs);
    connect(&d->refreshTimer, &QTimer::timeout, this, &BackdropView::refresh);
}

BackdropView::~BackdropView()
{
    for (const QPointer<QWidget> &view : std::as_const(d->maskViews)) {
        if (!view)
            continue;
        view->removeEventFilter(this);
        if (dynamic_cast<MaskViewEffect *>(view->graphicsEffect()))
            view->setGraphicsEffect(nullptr);
    }
}

int BackdropView::style() const
{
    return d->style;
}

void BackdropView::setBackdropMaskFlags(QWidget *view, int flags)
{
    if (!view)
        return;
    view->setProperty(kMaskFlagsProperty, flags);
    view->update();
}

int BackdropView::backdropMaskFlags(const QWidget *view)
{
    return view ? view->property(kMaskFlagsProperty).toInt() : 0;
}

void BackdropView::addMaskView(QWidget *view)
{
    if (!view || d->maskViews.contains(view))
        return;
    d->maskViews.append(view);
    view->installEventFilter(this);
    view->setGraphicsEffect(new MaskViewEffect(view, &d->drawingMasks));
    update();
}

QList<QWidget *> BackdropView::maskViews() const
{
    QList<QWidget *> views;
    for (const QPointer<QWidget> &view : d->maskViews) {
        if (view)
            views.append(view);
    }
    return views;
}

QImage BackdropView::lastRenderedBackground() const
{
    return d->blurred;
}

void BackdropView::refresh()
{
    d->refreshQueued = false;
    if (!isVisible() || width() <= 0 || height() <= 0)
        return;
    const Look look = lookForStyle(d->style);
    // A margin of one blur radius around the view, so its edges blur with what lies next to them.
    const int margin = look.blurRadius * look.downscale;
    const QRect windowArea(-mapTo(window(), QPoint(0, 0)), window()->size());
    const QRect area = rect().adjusted(-margin, -margin, margin, margin).intersected(windowArea);
    if (area.isEmpty())
        return;
    const QSize scaled((area.width() + look.downscale - 1) / look.downscale,
                       (area.height() + look.downscale - 1) / look.downscale);
    QImage image(scaled, QImage::Format_ARGB32_Premultiplied);
    image.fill(Qt::transparent);
    {
        QPainter painter(&image);
        painter.scale(1.0 / look.downscale, 1.0 / look.downscale);
        painter.translate(-area.topLeft());
        renderBehind(painter, area);
    }
    boxBlur(image, look.blurRadius);
    if (image == d->blurred && area == d->blurredArea)
        return;   // nothing behind changed: no repaint
    d->blurred = image;
    d->blurredArea = area;
    update();
}

// Paints, into `painter` (in this view's coordinates), everything of the window that lies behind
// this view within `area`: from the window down to this view's parent, each ancestor's own
// background and then its children stacked below the next ancestor (or below this view). Neither
// this view nor its children, nor anything stacked above, are part of it.
void BackdropView::renderBehind(QPainter &painter, const QRect &area)
{
    QList<QWidget *> chain;
    for (QWidget *w = this; w; w = w->parentWidget()) {
        chain.prepend(w);
        if (w->isWindow())
            break;
    }
    QWidget *top = chain.first();
    const QPoint origin = mapTo(top, QPoint(0, 0));
    auto renderOne = [&](QWidget *widget, QWidget::RenderFlags flags) {
        const QPoint offset = widget == top ? -origin : widget->mapTo(top, QPoint(0, 0)) - origin;
        const QRect source = area.translated(-offset).intersected(widget->rect());
        if (source.isEmpty())
            return;
        widget->render(&painter, offset + source.topLeft(), QRegion(source), flags);
    };
    for (qsizetype i = 0; i + 1 < chain.size(); ++i) {
        QWidget *ancestor = chain[i];
        QWidget *next = chain[i + 1];
        renderOne(ancestor, QWidget::DrawWindowBackground);
        for (QObject *object : ancestor->children()) {
            if (object == next)
                break;   // children after it are stacked above
            auto *child = qobject_cast<QWidget *>(object);
            if (!child || child->isWindow() || !child->isVisible())
                continue;
            renderOne(child, QWidget::DrawWindowBackground | QWidget::DrawChildren);
        }
    }
}

void BackdropView::scheduleRefresh()
{
    if (d->refreshQueued)
        return;
    d->refreshQueued = true;
    QTimer::singleShot(0, this, [this] {
        if (d->refreshQueued)
            refresh();
    });
}

void BackdropView::paintEvent(QPaintEvent *)
{
    if (d->blurred.isNull()) {
        scheduleRefresh();
        return;
    }
    const Look look = lookForStyle(d->style);
    const qreal ratio = devicePixelRatioF();
    QImage composed(size() * ratio, QImage::Format_ARGB32_Premultiplied);
    composed.setDevicePixelRatio(ratio);
    composed.fill(Qt::transparent);

    QList<QWidget *> backgroundMasks, glyphMasks;
    for (const QPointer<QWidget> &view : std::as_const(d->maskViews)) {
        if (!view || !view->isVisible() || view->window() != window())
            continue;
        const int flags = backdropMaskFlags(view);
        if (isBackgroundMask(flags))
            backgroundMasks.append(view);
        else if (isGlyphMask(flags))
            glyphMasks.append(view);
    }

    QPainter painter(&composed);
    painter.setRenderHint(QPainter::SmoothPixmapTransform);
    painter.drawImage(QRectF(d->blurredArea), d->blurred);

    // The tint, with the glyphs cut out of it so they show the blurred content untinted.
    QImage tint(composed.size(), QImage::Format_ARGB32_Premultiplied);
    tint.setDevicePixelRatio(ratio);
    tint.fill(look.tint);
    if (!glyphMasks.isEmpty()) {
        QPainter tintPainter(&tint);
        tintPainter.setCompositionMode(QPainter::CompositionMode_DestinationOut);
        for (QWidget *view : std::as_const(glyphMasks))
            tintPainter.drawPixmap(positionOf(view), grabMask(view));
    }
    painter.drawImage(QPoint(0, 0), tint);

    // Background masks cut the backdrop to its shape: it is cleared where they are opaque (the
    // same mask image draws the flat button, whose fill is removed there too).
    if (!backgroundMasks.isEmpty()) {
        QImage mask(composed.size(), QImage::Format_ARGB32_Premultiplied);
        mask.setDevicePixelRatio(ratio);
        mask.fill(Qt::transparent);
        QPainter maskPainter(&mask);
        for (QWidget *view : std::as_const(backgroundMasks))
            maskPainter.drawPixmap(positionOf(view), grabMask(view));
        maskPainter.end();
        painter.setCompositionMode(QPainter::CompositionMode_DestinationOut);
        painter.drawImage(QPoint(0, 0), mask);
    }
    painter.end();

    QPainter screen(this);
    screen.drawImage(QPoint(0, 0), composed);
}

QPoint BackdropView::positionOf(const QWidget *view) const
{
    return view->mapTo(window(), QPoint(0, 0)) - mapTo(window(), QPoint(0, 0));
}

QPixmap BackdropView::grabMask(QWidget *view)
{
    d->drawingMasks = true;
    QPixmap pixmap = view->grab();
    d->drawingMasks = false;
    return pixmap;
}

bool BackdropView::eventFilter(QObject *watched, QEvent *event)
{
    if (event->type() == QEvent::Resize || event->type() == QEvent::Move || event->type() == QEvent::Show
        || event->type() == QEvent::Hide) {
        if (qobject_cast<QWidget *>(watched) && d->maskViews.contains(static_cast<QWidget *>(watched)))
            update();
    }
    return QWidget::eventFilter(watched, event);
}

void BackdropView::showEvent(QShowEvent *event)
{
    QWidget::showEvent(event);
    d->refreshTimer.start();
    scheduleRefresh();
}

void BackdropView::hideEvent(QHideEvent *event)
{
    QWidget::hideEvent(event);
    d->refreshTimer.stop();
}

void BackdropView::resizeEvent(QResizeEvent *event)
{
    QWidget::resizeEvent(event);
    scheduleRefresh();
}

void BackdropView::moveEvent(QMoveEvent *event)
{
    QWidget::moveEvent(event);
    scheduleRefresh();
}

} // namespace zaf::ui
