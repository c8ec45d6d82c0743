#pragma once

// The playback clock and the time sources that drive it.
//
// PlaybackClock is a value: an anchor (media time, host time, rate) from which the media time at any
// later host time follows. It reads no clock of its own; callers feed it the host times, so the
// arithmetic is testable without waiting.
//
// A TimeSource supplies the host time (now(), in seconds) and announces that it has moved on
// (advanced()). The Player re-reads its clock each time the source advances. Three sources exist:
// MonotonicTimeSource (a steady clock that ticks while active), the audio device's clock (private to
// the playback pipeline) and ManualTimeSource, which only moves when its owner advances it.

#include <QElapsedTimer>
#include <QObject>
#include <QTimer>

namespace zaf::media {

class PlaybackClock {
public:
    // From `hostSeconds` on, the media time runs from `mediaSeconds` at `rate` media seconds per
    // host second.
    void setAnchor(double mediaSeconds, double hostSeconds, double rate)
    {
        m_media = mediaSeconds;
        m_host = hostSeconds;
        m_rate = rate;
    }
    double mediaTimeAt(double hostSeconds) const { return m_media + (hostSeconds - m_host) * m_rate; }
    double rate() const { return m_rate; }
    double anchorMediaSeconds() const { return m_media; }
    double anchorHostSeconds() const { return m_host; }

private:
    double m_media = 0;
    double m_host = 0;
    double m_rate = 0;
};

// A source of host time. Created, used and destroyed on the main thread.
class TimeSource : public QObject {
    Q_OBJECT
public:
    using QObject::QObject;
    ~TimeSource() override;

    // Required. The host time in seconds; never decreases. Main thread.
    virtual double now() const = 0;
    // Optional. The Player switches the source on when playback starts and off when it stops; a
    // source that ticks on its own ticks only while on. Main thread.
    virtual void setActive(bool active);
    bool isActive() const { return m_active; }

Q_SIGNALS:
    // Main thread: now() has moved on. Receivers connected directly run before the emitter returns.
    void advanced();

private:
    bool m_active = false;
};

// A steady clock that emits advanced() about every 10 ms while active.
class MonotonicTimeSource : public TimeSource {
    Q_OBJECT
public:
    explicit MonotonicTimeSource(QObject *parent = nullptr);
    double now() const override;
    void setActive(bool active) override;

private:
    QElapsedTimer m_elapsed;
    QTimer m_ticker;
};

// A clock that stands still until advance() moves it; advanced() is emitted inside advance(), so
// whatever the Player does with the new time has happened when advance() returns.
class ManualTimeSource : public TimeSource {
    Q_OBJECT
public:
    explicit ManualTimeSource(double startSeconds = 0, QObject *parent = nullptr);
    double now() const override { return m_now; }
    // Moves the clock forward by `seconds` (negative values are ignored) and emits advanced().
    void advance(double seconds);

private:
    double m_now = 0;
};

} // namespace zaf::media
