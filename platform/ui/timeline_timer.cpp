#include "platform/ui/timeline_timer.h"

#include <QLineF>
#include <QTimer>

#include <algorithm>
#include <cmath>

namespace zaf::ui {

namespace {

constexpr double kStillDistance = 3.0; // pointer movement that still counts as holding still

} // namespace

QtTimelineTimer::QtTimelineTimer() : m_timer(std::make_unique<QTimer>())
{
    m_timer->setSingleShot(true);
    QObject::connect(m_timer.get(), &QTimer::timeout, m_timer.get(), [this] {
        // A copy: the callback may start the timer again, which replaces m_timeout.
        if (const std::function<void()> timeout = m_timeout)
            timeout();
    });
}

QtTimelineTimer::~QtTimelineTimer() = default;

void QtTimelineTimer::start(std::chrono::milliseconds delay, std::function<void()> timeout)
{
    m_timeout = std::move(timeout);
    m_timer->start(delay);
}

void QtTimelineTimer::stop()
{
    m_timer->stop();
}

TimelineHold::TimelineHold(std::function<void()> held) : m_held(std::move(held)) {}

void TimelineHold::setTimer(std::unique_ptr<TimelineTimer> timer)
{
    if (!timer)
        return;
    m_timer->stop();
    m_timer = std::move(timer);
}

void TimelineHold::restart(const QPointF &pos, double delay)
{
    m_still = pos;
    if (!(delay > 0.0) || !std::isfinite(delay)) {
        m_timer->stop();
        return;
    }
    m_timer->start(std::chrono::milliseconds(std::max(1L, std::lround(delay * 1000.0))), m_held);
}

void TimelineHold::moved(const QPointF &pos, double delay)
{
    if (QLineF(pos, m_still).length() > kStillDistance)
        restart(pos, delay);
}

} // namespace zaf::ui
