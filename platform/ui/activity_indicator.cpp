#include "platform/ui/activity_indicator.h"
#include "platform/thread_rules.h"

#include <QPaintEvent>
#include <QPainter>
#include <QPainterPath>
#include <QPen>

#include <algorithm>
#include <cmath>

namespace zaf::ui {

ActivityIndicator::ActivityIndicator(int style, QWidget *parent)
    : QWidget(parent), m_style(style)
{
    ZAF_ASSERT_MAIN_THREAD();
    if (m_style < LargeWhite || m_style > Gray)
        m_style = LargeWhite;
    setAttribute(Qt::WA_TranslucentBackground);
    setAttribute(Qt::WA_TransparentForMouseEvents);
    setFocusPolicy(Qt::NoFocus);
    resize(sizeForStyle(m_style));
    m_timer.setTimerType(Qt::PreciseTimer);
    m_timer.setInterval(kFrameIntervalMs);
    connect(&m_timer, &QTimer::timeout, this, &ActivityIndicator::advance);
}

ActivityIndicator::~ActivityIndicator() = default;

QSize ActivityIndicator::sizeForStyle(int style)
{
    return style == LargeWhite ? QSize(37, 37) : QSize(20, 20);
}

QColor ActivityIndicator::colorForStyle(int style)
{
    return style == Gray ? QColor(128, 128, 128) : QColor(Qt::white);
}

QSize ActivityIndicator::sizeHint() const
{
    return sizeForStyle(m_style);
}

QSize ActivityIndicator::minimumSizeHint() const
{
    return sizeForStyle(m_style);
}

void ActivityIndicator::startAnimating()
{
    ZAF_ASSERT_MAIN_THREAD();
    if (m_animating)
        return;
    m_animating = true;
    updateTimer();
    update();
}

void ActivityIndicator::stopAnimating()
{
    if (!m_animating)
        return;
    m_animating = false;
    updateTimer();
    update();
}

void ActivityIndicator::setCenter(const QPointF &center)
{
    const QSize size = sizeForStyle(m_style);
    // Round the top-left corner so an odd size stays on whole points around the centre.
    const QPoint topLeft(int(std::lround(center.x() - size.width() / 2.0)),
                         int(std::lround(center.y() - size.height() / 2.0)));
    setGeometry(QRect(topLeft, size));
}

QPointF ActivityIndicator::center() const
{
    const QRect g = geometry();
    return QPointF(g.x() + g.width() / 2.0, g.y() + g.height() / 2.0);
}

void ActivityIndicator::showEvent(QShowEvent *event)
{
    QWidget::showEvent(event);
    updateTimer();
}

void ActivityIndicator::hideEvent(QHideEvent *event)
{
    QWidget::hideEvent(event);
    updateTimer();
}

void ActivityIndicator::updateTimer()
{
    const bool run = m_animating && isVisible();
    if (run && !m_timer.isActive()) {
        m_clock.start();
        m_timer.start();
    } else if (!run && m_timer.isActive()) {
        m_timer.stop();
    }
}

void ActivityIndicator::advance()
{
    // Advance by the time that really passed, so a busy event loop slows the frames, not the turn.
    const qint64 elapsed = m_clock.restart();
    m_rotation = std::fmod(m_rotation + 360.0 * double(elapsed) / kRevolutionMs, 360.0);
    update();
}

void ActivityIndicator::paintEvent(QPaintEvent *)
{
    if (!m_animating)
        return;
    QPainter painter(this);
    painter.setRenderHint(QPainter::Antialiasing);

    // Work in points; QPainter maps them to device pixels, and the widths below are chosen so that
    // the arcs stay crisp at fractional scales too (at least one device pixel wide).
    const double dpr = std::max(1.0, devicePixelRatioF());
    const double side = std::min(width(), height());
    const double lineWidth = std::max(side * 0.11, 1.0 / dpr);
    const double radius = side / 2.0 - lineWidth / 2.0 - 0.5;
    const QRectF ring(width() / 2.0 - radius, height() / 2.0 - radius, 2 * radius, 2 * radius);

    const QColor base = colorForStyle(m_style);
    const double step = 360.0 / kArcCount;
    const double gap = std::min(step * 0.35, 16.0);
    for (int i = 0; i < kArcCount; ++i) {
        // The leading arc is opaque; the ones behind it fade out, which reads as a turning ring.
        QColor color = base;
        color.setAlphaF(float(0.25 + 0.75 * double(kArcCount - i) / kArcCount));
        QPen pen(color, lineWidth, Qt::SolidLine, Qt::RoundCap);
        painter.setPen(pen);
        // Qt's angles turn counter-clockwise in 1/16 degrees; the ring turns clockwise.
        const double start = -m_rotation + i * step + gap / 2.0;
        painter.drawArc(ring, int(std::lround(start * 16.0)), int(std::lround((step - gap) * 16.0)));
    }
}

} // namespace zaf::ui
