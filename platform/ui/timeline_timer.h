#pragma once

// The zoom delay of the timeline: TimelineHold notices a handle held still for the delay, measured
// with a TimelineTimer. The default timer runs on a QTimer; tests hand the timeline one they fire
// by hand, so no test waits out a real delay. Main thread only.

#include <QPointF>

#include <chrono>
#include <functional>
#include <memory>

class QTimer;

namespace zaf::ui {

// A single-shot timer.
class TimelineTimer {
public:
    virtual ~TimelineTimer() = default;
    // Main thread. (Re)starts the countdown; `timeout` then runs once, on the main thread, when
    // `delay` has passed, unless stop() or another start() comes first.
    virtual void start(std::chrono::milliseconds delay, std::function<void()> timeout) = 0;
    // Main thread. Nothing runs for the countdown under way, if any.
    virtual void stop() = 0;
};

// The default: a single-shot QTimer on the main thread's event loop.
class QtTimelineTimer final : public TimelineTimer {
public:
    QtTimelineTimer();
    ~QtTimelineTimer() override;
    void start(std::chrono::milliseconds delay, std::function<void()> timeout) override;
    void stop() override;

private:
    std::unique_ptr<QTimer> m_timer;
    std::function<void()> m_timeout;
};

// Runs `held` (main thread) once the pointer has stayed within a few points of one place for the
// delay. The delay is in seconds; zero, less or not finite never runs it.
class TimelineHold {
public:
    explicit TimelineHold(std::function<void()> held);
    // Measures with `timer` from now on; null keeps the current one.
    void setTimer(std::unique_ptr<TimelineTimer> timer);
    // Measures again from pos.
    void restart(const QPointF &pos, double delay);
    // The pointer is at pos: measuring starts again from there when it has left the place.
    void moved(const QPointF &pos, double delay);
    void stop() { m_timer->stop(); }

private:
    std::function<void()> m_held;
    std::unique_ptr<TimelineTimer> m_timer = std::make_unique<QtTimelineTimer>();
    QPointF m_still; // where the pointer was when measuring last (re)started
};

} // namespace zaf::ui
