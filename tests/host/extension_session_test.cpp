// The host session against the fake extension, a real process over a real socket pair: what the
// request carries, how reports arrive, what malformed or oversized messages do, failed starts,
// crashes and exits without a report, reaping, the destructor's termination steps, and writes to a
// dead peer.
#include "host/extension_session.h"
#include "tests/support/log_capture.h"
#include "tests/support/temp_dir.h"
#include "tests/support/wait_until.h"

#include <QCoreApplication>
#include <QDeadlineTimer>
#include <QFile>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QThread>

#include <gtest/gtest.h>

#include <cerrno>
#include <csignal>

#include <sys/wait.h>

namespace zaf::test {
namespace {

QString fakeExtension()
{
    return ZAF_FAKE_EXTENSION_BIN;
}

// True when `pid` is no longer a child waiting to be reaped (no zombie left behind).
bool isReaped(pid_t pid)
{
    return ::waitpid(pid, nullptr, WNOHANG) == -1 && errno == ECHILD;
}

// The items every test sends unless it cares about them.
QList<host::InputItem> requiredItems()
{
    return {host::makeMoviePathItem("/tmp/recording.mp4"), host::makeAppNameItem("Recorder"),
            host::makeBundleIdentifierItem("org.example.Recorder")};
}

struct RecordedSession {
    RecordedSession()
    {
        using host::ExtensionSession;
        QObject::connect(&session, &ExtensionSession::requestAccepted, [this] { events << "accepted"; });
        QObject::connect(&session, &ExtensionSession::requestRejected, [this](const QString &text) { events << "rejected"; rejections << text; });
        QObject::connect(&session, &ExtensionSession::activityTypesReported, [this](const QStringList &types) { events << "report"; reports << types; });
        QObject::connect(&session, &ExtensionSession::protocolError, [this](const QString &text) { events << "protocolError"; protocolErrors << text; });
        QObject::connect(&session, &ExtensionSession::channelClosed, [this] { events << "closed"; ++closedCount; });
        QObject::connect(&session, &ExtensionSession::finished, [this](int code, bool didCrash) {
            events << "finished";
            finished = true;
            exitCode = code;
            crashed = didCrash;
        });
    }

    // Starts the fake extension with `steps`, space-separated (the session passes no arguments, so
    // the fake reads them from the environment); false, with a failure, when it did not start.
    bool start(const char *steps, const QList<host::InputItem> &items = requiredItems())
    {
        qputenv("ZAF_FAKE_STEPS", steps);
        QString error;
        const bool started = session.start(fakeExtension(), items, &error);
        qunsetenv("ZAF_FAKE_STEPS");
        EXPECT_TRUE(started && session.processId() > 0) << error.toStdString();
        return started;
    }
    bool waitFor(const std::function<bool()> &condition) { return waitUntil(condition, 20000); }
    bool waitForFinished() { return waitFor([this] { return finished; }); }
    // Starts the fake and waits until its process has ended.
    bool run(const char *steps, const QList<host::InputItem> &items = requiredItems()) { return start(steps, items) && waitForFinished(); }

    QStringList events;
    QList<QStringList> reports;
    QStringList protocolErrors;
    QStringList rejections;
    int closedCount = 0;
    bool finished = false;
    int exitCode = -1;
    bool crashed = false;
    host::ExtensionSession session; // last: destroyed before the fields its signals write to
};

TEST(ExtensionSessionRequest, CarriesEveryItemAndTheChannelEnvironment)
{
    ScratchDir scratch;
    qputenv("ZAF_FAKE_DUMP", scratch.file("request.json").toUtf8());
    qputenv("ZAF_FAKE_MARKER", "inherited");
    qputenv("ZAF_EXTENSION_CHANNEL_FD", "9"); // a stale value in the host's environment must not reach the extension
    QString error;
    const auto items = host::makeInputItems({"/tmp/rec.mp4", "My Recorder", "org.example.Recorder", "/tmp/notes.txt", "Look at this", "#11aa33cc"}, &error);
    ASSERT_TRUE(items) << error.toStdString();
    RecordedSession s;
    const bool ran = s.run("accept exit 0", *items);
    for (const char *name : {"ZAF_FAKE_DUMP", "ZAF_FAKE_MARKER", "ZAF_EXTENSION_CHANNEL_FD"})
        qunsetenv(name);
    ASSERT_TRUE(ran);
    EXPECT_FALSE(s.crashed);
    EXPECT_EQ(s.events.first(), "accepted");

    QFile file(scratch.file("request.json"));
    ASSERT_TRUE(file.open(QIODevice::ReadOnly));
    const QJsonObject dump = QJsonDocument::fromJson(file.readAll()).object();
    EXPECT_EQ(dump.value("channelVariable"), "3");
    EXPECT_EQ(dump.value("marker"), "inherited");
    EXPECT_EQ(dump.value("fd3IsSocket"), true);
    EXPECT_EQ(dump.value("sigpipeDefault"), true);
    const QJsonObject request = dump.value("request").toObject();
    EXPECT_EQ(request.value("jsonrpc"), "2.0");
    EXPECT_EQ(request.value("method"), "beginExtensionRequest");
    auto item = [](const char *title, const char *type, const char *value) {
        return QJsonObject{{"title", title}, {"attachments", QJsonArray{QJsonObject{{"type", type}, {"value", value}}}}};
    };
    const QJsonArray expected{item("ZafVideoEditorExtensionMovieURLKey", "text/plain", "/tmp/rec.mp4"),
                              item("ZafVideoEditorExtensionAppNameKey", "text/plain", "My Recorder"),
                              item("ZafVideoEditorExtensionBundleIdentifierKey", "text/plain", "org.example.Recorder"),
                              item("ZafVideoEditorExtensionFileAttachmentKey", "text/plain", "/tmp/notes.txt"),
                              item("ZafVideoEditorExtensionOverrideShareMessageKey", "text/plain", "Look at this"),
                              item("ZafVideoEditorExtensionOverrideTintColorKey", "application/x-zaf-color", "#11AA33CC")};
    EXPECT_EQ(request.value("params").toObject().value("inputItems"), expected);
}

TEST(InputItems, TintColourIsSentOpaqueAsSixDigitsAndRejectedWhenNotAColour)
{
    EXPECT_EQ(host::makeTintColorItem(255, 0, 16).attachments[0].value, "#FF0010");
    EXPECT_EQ(host::makeTintColorItem(255, 0, 16, 128).attachments[0].value, "#FF001080");
    for (const char *bad : {"red", "#12345", "#1234567", "123456", "#12345G", "#123456789"}) {
        SCOPED_TRACE(bad);
        EXPECT_FALSE(host::makeTintColorItem(bad));
        QString error;
        EXPECT_FALSE(host::makeInputItems({"/m.mp4", "A", "b.c", {}, {}, bad}, &error));
        EXPECT_TRUE(error.contains(bad));
    }
    // Only the three required items when nothing optional is set.
    EXPECT_EQ(host::makeInputItems({"/m.mp4", "A", "b.c", {}, {}, {}}).value_or(QList<host::InputItem>{}).size(), 3);
}

TEST(ExtensionSessionReports, DeliversEveryReportInOrderThenRemovesTheViewAsANotification)
{
    // Reports written one byte at a time and just under the size cap (9000 types of 100 characters,
    // about 930 KB) arrive whole. The fake exits 0 only on removeExtensionView sent as a notification.
    RecordedSession s;
    QObject::connect(&s.session, &host::ExtensionSession::activityTypesReported, [&](const QStringList &types) {
        if (types.isEmpty())
            s.session.removeView();
    });
    ASSERT_TRUE(s.run("accept report com.zafrel.activity.SaveToPhotoLibrary,ZafPublishToYouTube report-slowly slow.type "
                      "report-big 9000 report - await-remove"));
    ASSERT_EQ(s.reports.size(), 4);
    EXPECT_EQ(s.reports[0], (QStringList{"com.zafrel.activity.SaveToPhotoLibrary", "ZafPublishToYouTube"}));
    EXPECT_EQ(s.reports[1], QStringList{"slow.type"});
    EXPECT_EQ(s.reports[2].size(), 9000);
    EXPECT_EQ(s.reports[2].last(), QString("%1").arg(8999, 100, 10, QLatin1Char('0')));
    EXPECT_TRUE(s.reports[3].isEmpty());
    // Everything the process wrote before it exited comes before finished(), which is last.
    EXPECT_EQ(s.events, (QStringList{"accepted", "report", "report", "report", "report", "closed", "finished"}));
    EXPECT_EQ(s.exitCode, 0);
    EXPECT_FALSE(s.crashed);
    EXPECT_TRUE(s.protocolErrors.isEmpty());
    EXPECT_TRUE(isReaped(s.session.processId()));
}

TEST(ExtensionSessionProtocol, MalformedMessagesAndUnknownCallsAreLoggedAndTheChannelStaysUsable)
{
    // The fake exits 4 unless the host answers its request (id 7) with a JSON-RPC error.
    LogCapture log;
    RecordedSession s;
    ASSERT_TRUE(s.run("accept garbage bad-params call-unknown expect-error report after.errors exit 0"));
    EXPECT_EQ(s.exitCode, 0);
    ASSERT_EQ(s.protocolErrors.size(), 3);
    EXPECT_TRUE(s.protocolErrors[0].contains("invalid JSON")) << s.protocolErrors[0].toStdString();
    EXPECT_TRUE(s.protocolErrors[1].contains("extensionDidFinishWithActivityTypes"));
    EXPECT_TRUE(s.protocolErrors[2].contains("openTheDoor"));
    EXPECT_EQ(s.reports, QList<QStringList>{{"after.errors"}});
    for (const QString &error : s.protocolErrors)
        EXPECT_TRUE(log.messages("zaf.host").contains(error)) << error.toStdString();
}

TEST(ExtensionSessionProtocol, OversizedOrTruncatedMessageIsOneProtocolErrorThenTheChannelCloses)
{
    // After the bad length the fake still sends a report; the host must have closed the channel by
    // then, which the fake sees as its end (await-eof exits 0).
    const std::pair<const char *, const char *> cases[] = {{"accept oversized report too.late await-eof", "1048577"},
                                                           {"accept partial exit 0", "inside a frame"}};
    for (const auto &[steps, error] : cases) {
        SCOPED_TRACE(steps);
        RecordedSession s;
        ASSERT_TRUE(s.run(steps));
        ASSERT_EQ(s.protocolErrors.size(), 1);
        EXPECT_TRUE(s.protocolErrors[0].contains(error)) << s.protocolErrors[0].toStdString();
        EXPECT_TRUE(s.reports.isEmpty());
        EXPECT_EQ(s.closedCount, 1);
        EXPECT_FALSE(s.crashed);
        EXPECT_LT(s.events.indexOf("protocolError"), s.events.indexOf("closed"));
    }
}

TEST(ExtensionSessionProtocol, ErrorAnswerToTheRequestIsARejection)
{
    RecordedSession s;
    ASSERT_TRUE(s.run("reject exit 0"));
    EXPECT_FALSE(s.events.contains("accepted"));
    ASSERT_EQ(s.rejections.size(), 1);
    EXPECT_TRUE(s.rejections[0].contains("no movie"));
}

bool processExists(pid_t pid)
{
    return ::kill(pid, 0) == 0 || errno != ESRCH;
}

TEST(ExtensionSessionStart, FailsWithAReasonWhenTheProgramCannotRunOrTheRequestIsTooLarge)
{
    ScratchDir scratch;
    for (const QString &program : {scratch.file("missing"), scratch.write("not-a-program", 10)}) {
        SCOPED_TRACE(program.toStdString());
        LogCapture log;
        RecordedSession s;
        QString error;
        EXPECT_FALSE(s.session.start(program, requiredItems(), &error));
        EXPECT_TRUE(error.contains(program)) << error.toStdString();
        EXPECT_TRUE(log.messages("zaf.host").contains(error));
        EXPECT_FALSE(s.session.isRunning());
        EXPECT_FALSE(s.session.isChannelOpen());
        QCoreApplication::processEvents();
        EXPECT_TRUE(s.events.isEmpty());
    }
    host::ExtensionSession big;
    QString error;
    EXPECT_FALSE(big.start(fakeExtension(), {host::makeShareMessageItem(QString(host::kMaxMessageLength, 'm'))}, &error));
    EXPECT_TRUE(error.contains("too large")) << error.toStdString();
    EXPECT_EQ(big.processId(), 0);
}

TEST(ExtensionSessionExit, CrashOrNonZeroExitWithoutAReportIsACrashAndTheProcessIsReaped)
{
    const std::pair<const char *, int> cases[] = {{"accept crash", 128 + SIGABRT}, {"accept exit 7", 7}};
    for (const auto &[steps, exitCode] : cases) {
        SCOPED_TRACE(steps);
        RecordedSession s;
        ASSERT_TRUE(s.run(steps));
        EXPECT_TRUE(s.crashed);
        EXPECT_EQ(s.exitCode, exitCode);
        EXPECT_EQ(s.closedCount, 1);
        EXPECT_TRUE(s.reports.isEmpty());
        EXPECT_TRUE(isReaped(s.session.processId()));
        EXPECT_FALSE(s.session.isRunning());
    }
}

TEST(ExtensionSessionExit, ClosedChannelIsReportedWhileTheProcessStillRunsAndASecondStartIsRefused)
{
    RecordedSession s;
    ASSERT_TRUE(s.start("accept close hang"));
    QString error;
    EXPECT_FALSE(s.session.start(fakeExtension(), requiredItems(), &error));
    EXPECT_FALSE(error.isEmpty());
    ASSERT_TRUE(s.waitFor([&] { return s.closedCount == 1; }));
    EXPECT_FALSE(s.finished);
    EXPECT_TRUE(s.session.isRunning());
    EXPECT_FALSE(s.session.isChannelOpen());
    // Removing the view now has nowhere to go: logged, nothing else.
    LogCapture log;
    s.session.removeView();
    EXPECT_EQ(log.messages("zaf.host").size(), 1);
    s.session.setTerminationGracePeriod(100);
}

TEST(ExtensionSessionTermination, DestructorClosesTheChannelThenEscalatesToSigtermThenSigkill)
{
    // An extension that takes the closed channel as removal exits by itself; one that hangs gets
    // SIGTERM, and one that ignores SIGTERM gets SIGKILL. None is left behind.
    const struct {
        const char *steps;
        bool term;
        bool kill;
    } cases[] = {{"accept await-eof", false, false}, {"accept hang", true, false}, {"accept ignore-term hang", true, true}};
    for (const auto &c : cases) {
        SCOPED_TRACE(c.steps);
        LogCapture log;
        pid_t pid = 0;
        {
            RecordedSession s;
            if (c.term)
                s.session.setTerminationGracePeriod(300); // the default leaves 3 s for a clean exit
            ASSERT_TRUE(s.start(c.steps));
            ASSERT_TRUE(s.waitFor([&] { return s.events.contains("accepted"); }));
            pid = s.session.processId();
        }
        EXPECT_TRUE(isReaped(pid));
        EXPECT_FALSE(processExists(pid));
        const QString all = log.messages("zaf.host").join('\n');
        EXPECT_EQ(all.contains("SIGTERM"), c.term) << all.toStdString();
        EXPECT_EQ(all.contains("SIGKILL"), c.kill) << all.toStdString();
    }
}

TEST(ExtensionSessionDeadPeer, WritingToAnExtensionThatHasDiedDoesNotKillTheHost)
{
    // The test process keeps SIGPIPE at its default: a write that raised it would end the test run.
    struct sigaction current {};
    ASSERT_EQ(::sigaction(SIGPIPE, nullptr, &current), 0);
    ASSERT_EQ(current.sa_handler, SIG_DFL);

    LogCapture log;
    RecordedSession s;
    ASSERT_TRUE(s.start("accept exit 0"));
    const pid_t pid = s.session.processId();
    // Wait, without running the event loop, until the process has exited (not reaped: WNOWAIT), so
    // the session still believes the channel is open.
    siginfo_t info{};
    for (QDeadlineTimer deadline(20000); !deadline.hasExpired() && info.si_pid != pid; QThread::msleep(5))
        ASSERT_EQ(::waitid(P_PID, id_t(pid), &info, WEXITED | WNOHANG | WNOWAIT), 0);
    ASSERT_EQ(info.si_pid, pid);
    ASSERT_TRUE(s.session.isChannelOpen());

    s.session.removeView();
    s.session.removeView();
    EXPECT_GE(log.messages("zaf.host").filter("cannot write to the extension").size(), 1);
    ASSERT_TRUE(s.waitForFinished());
    EXPECT_EQ(s.exitCode, 0);
    EXPECT_TRUE(isReaped(pid));
}

} // namespace
} // namespace zaf::test
