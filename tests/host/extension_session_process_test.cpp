// The host session's process handling, against the fake extension: failed starts, crashes and
// exits without a report, reaping, the destructor's termination steps, and writes to a dead peer.
#include "tests/host/session_recorder.h"
#include "tests/support/log_capture.h"
#include "tests/support/temp_dir.h"

#include <QDeadlineTimer>
#include <QFile>
#include <QThread>

#include <csignal>

#include <signal.h>
#include <sys/wait.h>

namespace zaf::test {
namespace {

using zaf::host::ExtensionSession;

bool processExists(pid_t pid)
{
    return ::kill(pid, 0) == 0 || errno != ESRCH;
}

TEST(ExtensionSessionStart, FailsWithAReasonWhenTheProgramCannotRun)
{
    ScratchDir scratch;
    const QString notExecutable = scratch.write(QStringLiteral("not-a-program"), 10);
    for (const QString &program : {scratch.file(QStringLiteral("missing")), notExecutable}) {
        SCOPED_TRACE(program.toStdString());
        LogCapture log;
        ExtensionSession session;
        SessionRecorder recorder(session);
        QString error;
        EXPECT_FALSE(session.start(program, requiredItems(), &error));
        EXPECT_TRUE(error.contains(program)) << error.toStdString();
        EXPECT_TRUE(log.messages(QStringLiteral("zaf.host")).contains(error));
        EXPECT_FALSE(session.isRunning());
        EXPECT_FALSE(session.isChannelOpen());
        QCoreApplication::processEvents();
        EXPECT_TRUE(recorder.events.isEmpty());
    }
}

TEST(ExtensionSessionStart, RefusesASecondStartAndARequestOverTheCap)
{
    ExtensionSession session;
    startFake(session, {QStringLiteral("accept"), QStringLiteral("exit"), QStringLiteral("0")});
    QString error;
    EXPECT_FALSE(session.start(fakeExtension(), requiredItems(), &error));
    EXPECT_FALSE(error.isEmpty());

    ExtensionSession big;
    const QList<host::InputItem> items{host::makeShareMessageItem(QString(host::kMaxMessageLength, QLatin1Char('m')))};
    EXPECT_FALSE(big.start(fakeExtension(), items, &error));
    EXPECT_TRUE(error.contains(QStringLiteral("too large"))) << error.toStdString();
    EXPECT_EQ(big.processId(), 0);
}

TEST(ExtensionSessionExit, CrashIsReportedWithTheSignalAndTheProcessIsReaped)
{
    ExtensionSession session;
    SessionRecorder recorder(session);
    startFake(session, {QStringLiteral("accept"), QStringLiteral("crash")});
    ASSERT_TRUE(recorder.waitForFinished());
    EXPECT_TRUE(recorder.crashed);
    EXPECT_EQ(recorder.exitCode, 128 + SIGABRT);
    EXPECT_EQ(recorder.closedCount, 1);
    EXPECT_TRUE(recorder.reports.isEmpty());
    EXPECT_TRUE(isReaped(session.processId()));
    EXPECT_FALSE(session.isRunning());
}

TEST(ExtensionSessionExit, NonZeroExitWithoutAReportCountsAsCrashed)
{
    ExtensionSession session;
    SessionRecorder recorder(session);
    startFake(session, {QStringLiteral("accept"), QStringLiteral("exit"), QStringLiteral("7")});
    ASSERT_TRUE(recorder.waitForFinished());
    EXPECT_TRUE(recorder.crashed);
    EXPECT_EQ(recorder.exitCode, 7);
    EXPECT_TRUE(recorder.reports.isEmpty());
    EXPECT_TRUE(isReaped(session.processId()));
}

TEST(ExtensionSessionExit, ClosedChannelIsReportedWhileTheProcessStillRuns)
{
    ExtensionSession session;
    SessionRecorder recorder(session);
    startFake(session, {QStringLiteral("accept"), QStringLiteral("close"), QStringLiteral("hang")});
    ASSERT_TRUE(waitUntil([&] { return recorder.closedCount == 1; }));
    EXPECT_FALSE(recorder.finished);
    EXPECT_TRUE(session.isRunning());
    EXPECT_FALSE(session.isChannelOpen());
    // Removing the view now has nowhere to go: logged, nothing else.
    LogCapture log;
    session.removeView();
    EXPECT_EQ(log.messages(QStringLiteral("zaf.host")).size(), 1);
    session.setTerminationGracePeriod(100);
}

TEST(ExtensionSessionTermination, DestructorLetsAnExtensionThatTakesTheClosedChannelAsRemovalExit)
{
    LogCapture log;
    pid_t pid = 0;
    {
        ExtensionSession session;
        SessionRecorder recorder(session);
        startFake(session, {QStringLiteral("accept"), QStringLiteral("await-eof")});
        ASSERT_TRUE(waitUntil([&] { return recorder.events.contains(QStringLiteral("accepted")); }));
        pid = session.processId();
    }
    EXPECT_TRUE(isReaped(pid));
    EXPECT_FALSE(processExists(pid));
    for (const QString &message : log.messages(QStringLiteral("zaf.host")))
        EXPECT_FALSE(message.contains(QStringLiteral("SIGTERM"))) << message.toStdString();
}

TEST(ExtensionSessionTermination, DestructorEscalatesToSigtermThenSigkill)
{
    for (const bool ignoresTerm : {false, true}) {
        SCOPED_TRACE(ignoresTerm ? "ignores SIGTERM" : "obeys SIGTERM");
        LogCapture log;
        pid_t pid = 0;
        {
            ExtensionSession session;
            session.setTerminationGracePeriod(300);
            SessionRecorder recorder(session);
            QStringList steps{QStringLiteral("accept")};
            if (ignoresTerm)
                steps << QStringLiteral("ignore-term");
            steps << QStringLiteral("hang");
            startFake(session, steps);
            ASSERT_TRUE(waitUntil([&] { return recorder.events.contains(QStringLiteral("accepted")); }));
            pid = session.processId();
        }
        EXPECT_TRUE(isReaped(pid));
        EXPECT_FALSE(processExists(pid));
        const QString all = log.messages(QStringLiteral("zaf.host")).join(QLatin1Char('\n'));
        EXPECT_TRUE(all.contains(QStringLiteral("SIGTERM")));
        EXPECT_EQ(all.contains(QStringLiteral("SIGKILL")), ignoresTerm) << all.toStdString();
    }
}

TEST(ExtensionSessionDeadPeer, WritingToAnExtensionThatHasDiedDoesNotKillTheHost)
{
    // The test process keeps SIGPIPE at its default: a write that raised it would end the test run.
    struct sigaction current {};
    ASSERT_EQ(::sigaction(SIGPIPE, nullptr, &current), 0);
    ASSERT_EQ(current.sa_handler, SIG_DFL);

    LogCapture log;
    ExtensionSession session;
    SessionRecorder recorder(session);
    startFake(session, {QStringLiteral("accept"), QStringLiteral("exit"), QStringLiteral("0")});
    // Wait, without running the event loop, until the process has exited (not reaped: WNOWAIT), so
    // the session still believes the channel is open.
    siginfo_t info{};
    QDeadlineTimer deadline(20000);
    while (!deadline.hasExpired()) {
        info.si_pid = 0;
        ASSERT_EQ(::waitid(P_PID, id_t(session.processId()), &info, WEXITED | WNOHANG | WNOWAIT), 0);
        if (info.si_pid == session.processId())
            break;
        QThread::msleep(5);
    }
    ASSERT_EQ(info.si_pid, session.processId());
    ASSERT_TRUE(session.isChannelOpen());

    session.removeView();
    session.removeView();
    EXPECT_GE(log.messages(QStringLiteral("zaf.host")).filter(QStringLiteral("cannot write to the extension")).size(), 1);

    ASSERT_TRUE(recorder.waitForFinished());
    EXPECT_EQ(recorder.exitCode, 0);
    EXPECT_TRUE(isReaped(session.processId()));
}

} // namespace
} // namespace zaf::test
