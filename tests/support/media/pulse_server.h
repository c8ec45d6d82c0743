#pragma once

// A private PulseAudio sound server with one null sink, for tests and benchmarks that play through
// a real audio device, and a recording of what that sink plays, stamped in host time.
//
// PulseServer starts `pulseaudio` as a child of this process with its runtime and home directories
// in a scratch directory of its own (no user's configuration is read, no user's server is touched),
// loads only a null sink and the native protocol, waits until its socket answers and points
// PULSE_SERVER at it for the rest of the process. Qt's audio devices bind to the server the first
// time they are asked for, so the server has to be up before the first QMediaDevices call.
// The null sink is loaded without rewinds: otherwise, while idle, it renders two seconds of silence
// ahead and, unlike a sound card's sink, does not take them back when a stream starts, so the first
// stream of the server would be heard two seconds late. Without rewinds it renders at most 50 ms
// ahead, like a card with a fixed period. The destructor stops the daemon and reaps it. Needs no test framework: the benchmarks use it too.
//
// SinkRecording records the null sink's monitor with `parec` into memory. Both sides of a timing
// check are host monotonic time (std::chrono::steady_clock, the clock QElapsedTimer reads). The
// recording relates its sample positions to host time by how its data arrives: a block of samples
// can only reach us after the sink has played it, so for every block read, (arrival time) minus
// (position of the block's end / rate) is the time of sample 0 plus a delay that is never negative;
// the smallest such value over the whole recording is taken as the time of sample 0. The recorder
// asks for 5 ms blocks, and the null sink then renders in blocks of that size, so the estimate is
// within a few milliseconds of when the sink played each sample.
//
// Everything runs on the thread that created the object, except the recorder's reader thread,
// which is joined by stop() and the destructor.

#include <QByteArray>
#include <QList>
#include <QString>

#include <memory>

namespace zaf::test {

class PulseServer {
public:
    // Starts the daemon and waits (at most 10 s) until it answers; see ok() and error().
    PulseServer();
    ~PulseServer();
    PulseServer(const PulseServer &) = delete;
    PulseServer &operator=(const PulseServer &) = delete;

    bool ok() const;
    // Why the daemon is not running (its own last words when it ended by itself).
    QString error() const;
    // The null sink's name; its monitor is sinkName() + ".monitor".
    static QString sinkName();
    // The address the clients use ("unix:/…/native").
    QString address() const;
    // The daemon's process id while it runs, else 0.
    qint64 pid() const;
    // Kills the daemon at once (SIGKILL) and reaps it: a server that dies under its clients.
    void kill();

private:
    struct Private;
    std::unique_ptr<Private> d;
};

class SinkRecording {
public:
    static constexpr int kRate = 48000;

    // Starts `parec` on the server's null sink monitor (mono, 32-bit float) and waits (at most 5 s)
    // until the first samples arrive; see ok() and error().
    explicit SinkRecording(const PulseServer &server);
    ~SinkRecording();
    SinkRecording(const SinkRecording &) = delete;
    SinkRecording &operator=(const SinkRecording &) = delete;

    bool ok() const;
    QString error() const;
    // Ends the recording and waits for the recorder and its reader.
    void stop();

    // After stop(): the host time (steady clock, seconds) at which the sink played sample 0.
    double hostTimeOfFirstSample() const;
    // After stop(): the host times of the starts of the clicks heard (|sample| above `threshold`
    // after at least `gapSeconds` below it), in order.
    QList<double> clickHostTimes(float threshold = 0.3f, double gapSeconds = 0.1) const;
    qsizetype sampleCount() const;

private:
    struct Private;
    std::unique_ptr<Private> d;
};

// The steady clock in seconds: the host time both sides of a timing check use.
double hostSeconds();

} // namespace zaf::test
