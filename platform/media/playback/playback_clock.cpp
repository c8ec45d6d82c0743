#include "platform/media/playback/playback_clock.h"

namespace zaf::media {

TimeSource::~TimeSource() = default;

void TimeSource::setActive(bool active)
{
    m_active = active;
}

MonotonicTimeSource::MonotonicTimeSource(QObject *parent)
    : TimeSource(parent)
{
    m_elapsed.start();
    m_ticker.setTimerType(Qt::PreciseTimer);
    m_ticker.setInterval(10);
    connect(&m_ticker, &QTimer::timeout, this, &TimeSource::advanced);
}

double MonotonicTimeSource::now() const
{
    return double(m_elapsed.nsecsElapsed()) / 1e9;
}

void MonotonicTimeSource::setActive(bool active)
{
    TimeSource::setActive(active);
    if (active)
        m_ticker.start();
    else
        m_ticker.stop();
}

ManualTimeSource::ManualTimeSource(double startSeconds, QObject *parent)
    : TimeSource(parent)
    , m_now(startSeconds)
{
}

void ManualTimeSource::advance(double seconds)
{
    if (seconds > 0)
        m_now += seconds;
    Q_EMIT advanced();
}

} // namespace zaf::media
