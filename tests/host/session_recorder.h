#pragma once

// Test helpers for the host session: a recorder of every signal in order, bounded waits on the
// event loop, and the fake extension's path.

#include "host/extension_session.h"

#include <QCoreApplication>
#include <QDeadlineTimer>
#include <QStringList>

#include <gtest/gtest.h>

#include <cerrno>
#include <functional>

#include <sys/wait.h>

namespace zaf::test {

inline QString fakeExtension()
{
    return QStringLiteral(ZAF_FAKE_EXTENSION_BIN);
}

// Runs the event loop until `done` holds or `milliseconds` have passed; returns `done()`.
inline bool waitUntil(const std::function<bool()> &done, int milliseconds = 20000)
{
    QDeadlineTimer deadline(milliseconds);
    while (!done() && !deadline.hasExpired())
        QCoreApplication::processEvents(QEventLoop::WaitForMoreEvents, 20);
    return done();
}

// True when `pid` is no longer a child waiting to be reaped (no zombie left behind).
inline bool isReaped(pid_t pid)
{
    return ::waitpid(pid, nullptr, WNOHANG) == -1 && errno == ECHILD;
}

struct SessionRecorder {
    explicit SessionRecorder(zaf::host::ExtensionSession &session)
    {
        using zaf::host::ExtensionSession;
        QObject::connect(&session, &ExtensionSession::requestAccepted, [this] { events << QStringLiteral("accepted"); });
        QObject::connect(&session, &ExtensionSession::requestRejected, [this](const QString &message) {
            events << QStringLiteral("rejected");
            rejections << message;
        });
        QObject::connect(&session, &ExtensionSession::activityTypesReported, [this](const QStringList &types) {
            events << QStringLiteral("report");
            reports << types;
        });
        QObject::connect(&session, &ExtensionSession::protocolError, [this](const QString &message) {
            events << QStringLiteral("protocolError");
            protocolErrors << message;
        });
        QObject::connect(&session, &ExtensionSession::channelClosed, [this] {
            events << QStringLiteral("closed");
            ++closedCount;
        });
        QObject::connect(&session, &ExtensionSession::finished, [this](int code, bool didCrash) {
            events << QStringLiteral("finished");
            finished = true;
            exitCode = code;
            crashed = didCrash;
        });
    }

    bool waitForFinished(int milliseconds = 20000)
    {
        return waitUntil([this] { return finished; }, milliseconds);
    }

    QStringList events;
    QList<QStringList> reports;
    QStringList protocolErrors;
    QStringList rejections;
    int closedCount = 0;
    bool finished = false;
    int exitCode = -1;
    bool crashed = false;
};

// The items every test sends unless it cares about them.
inline QList<zaf::host::InputItem> requiredItems()
{
    return {zaf::host::makeMoviePathItem(QStringLiteral("/tmp/recording.mp4")), zaf::host::makeAppNameItem(QStringLiteral("Recorder")),
            zaf::host::makeBundleIdentifierItem(QStringLiteral("org.example.Recorder"))};
}

// Starts the fake extension with `steps` and asserts that the start succeeded.
inline void startFake(zaf::host::ExtensionSession &session, const QStringList &steps, const QList<zaf::host::InputItem> &items = requiredItems())
{
    // The fake takes its steps from the environment, since the session passes no arguments.
    qputenv("ZAF_FAKE_STEPS", steps.join(QLatin1Char(' ')).toUtf8());
    QString error;
    const bool started = session.start(fakeExtension(), items, &error);
    qunsetenv("ZAF_FAKE_STEPS");
    ASSERT_TRUE(started) << error.toStdString();
    ASSERT_GT(session.processId(), 0);
}

} // namespace zaf::test
