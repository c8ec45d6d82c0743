#pragma once

// TerminationSignals: SIGTERM and SIGINT delivered as a Qt signal on the main thread, so that a
// long-running host (`zaf-host --watch`, which systemd stops with SIGTERM) can end cleanly.
//
// The handlers only write the signal's number into a pipe (async-signal-safe); a QSocketNotifier
// reads it on the owner's thread. At most one TerminationSignals exists at a time; its destructor
// puts the previous handlers back. A child process started later gets the default handlers again
// (exec resets caught signals).
//
// Threads: lives on the thread that created it, which runs a Qt event loop (the main thread);
// received() is emitted there.

#include <QObject>

class QSocketNotifier;

namespace zaf::host::watch {

class TerminationSignals : public QObject {
    Q_OBJECT
public:
    explicit TerminationSignals(QObject *parent = nullptr);
    ~TerminationSignals() override;

    // False when the handlers could not be installed (the pipe could not be made, or another
    // TerminationSignals is alive); the signals then keep their previous handling.
    bool isInstalled() const { return m_installed; }

Q_SIGNALS:
    // The owner's thread: SIGTERM or SIGINT arrived (once per arrival).
    void received(int signalNumber);

private:
    void readPipe();

    bool m_installed = false;
    QSocketNotifier *m_notifier = nullptr;
};

} // namespace zaf::host::watch
