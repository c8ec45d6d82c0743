// The host session against the fake extension, a real process over a real socket pair.
#include "host/extension_session.h"
#include "tests/host/process_state.h"
#include "tests/support/log_capture.h"
#include "tests/support/named_cases.h"
#include "tests/support/temp_dir.h"
#include "tests/support/wait_until.h"

#include <QCoreApplication>
#include <QFile>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

#include <gtest/gtest.h>

#include <csignal>
#include <functional>

namespace zaf::test {
namespace {

ZAF_PRINT_CASES_AS_NAMES

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
        QObject::connect(&session, &ExtensionSession::activityTypesReported, [this](const QStringList &types) {
            events << "report:" + types.join(',');
            reports << types;
        });
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
    bool start(const QString &steps, const QList<host::InputItem> &items = requiredItems())
    {
        qputenv("ZAF_FAKE_STEPS", steps.toUtf8());
        QString error;
        const bool started = session.start(ZAF_FAKE_EXTENSION_BIN, items, &error);
        qunsetenv("ZAF_FAKE_STEPS");
        EXPECT_TRUE(started && session.processId() > 0) << error.toStdString();
        return started;
    }
    bool waitFor(const std::function<bool()> &condition) { return waitUntil(condition, 20000); }
    // Starts the fake and waits until its process has ended.
    bool run(const QString &steps, const QList<host::InputItem> &items = requiredItems())
    {
        return start(steps, items) && waitFor([this] { return finished; });
    }

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

TEST(ExtensionSessionRequest, CarriesEveryItemOverTheChannelNamedInTheEnvironment)
{
    ScratchDir scratch;
    qputenv("ZAF_FAKE_DUMP", scratch.file("request.json").toUtf8());
    qputenv("ZAF_EXTENSION_CHANNEL_FD", "9"); // a stale value in the host's environment must not reach the extension
    QString error;
    const auto items = host::makeInputItems({"/tmp/rec.mp4", "My Recorder", "org.example.Recorder", "/tmp/notes.txt", "Look at this", "#11aa33cc"}, &error);
    ASSERT_TRUE(items) << error.toStdString();
    RecordedSession s;
    const bool ran = s.run("accept exit 0", *items);
    qunsetenv("ZAF_FAKE_DUMP");
    qunsetenv("ZAF_EXTENSION_CHANNEL_FD");
    ASSERT_TRUE(ran);
    EXPECT_EQ(s.events.first(), "accepted");

    QFile file(scratch.file("request.json"));
    ASSERT_TRUE(file.open(QIODevice::ReadOnly));
    const QJsonObject dump = QJsonDocument::fromJson(file.readAll()).object();
    EXPECT_EQ(dump.value("channelVariable"), "3");
    EXPECT_EQ(dump.value("fd3IsSocket"), true);
    const QJsonObject request = dump.value("request").toObject();
    EXPECT_EQ(request.value("jsonrpc"), "2.0");
    EXPECT_EQ(request.value("method"), "beginExtensionRequest");
    EXPECT_EQ(request.value("params").toObject().value("protocolVersion"), "1.0");
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

TEST(InputItems, TintColourCarriesAlphaOnlyWhenNotOpaque)
{
    EXPECT_EQ(host::makeTintColorItem(255, 0, 16).attachments[0].value, "#FF0010");
    EXPECT_EQ(host::makeTintColorItem(255, 0, 16, 128).attachments[0].value, "#FF001080");
}

class InputItemsBadTintTest : public ::testing::TestWithParam<const char *> {};

TEST_P(InputItemsBadTintTest, IsRefusedNamingTheValue)
{
    QString error;
    EXPECT_FALSE(host::makeInputItems({"/m.mp4", "A", "b.c", {}, {}, GetParam()}, &error));
    EXPECT_TRUE(error.contains(GetParam())) << error.toStdString();
}

INSTANTIATE_TEST_SUITE_P(Colours, InputItemsBadTintTest, ::testing::Values("red", "#12345", "#1234567", "123456", "#12345G", "#123456789"));

TEST(InputItems, NothingOptionalGivenMakesOnlyTheThreeRequiredItems)
{
    EXPECT_EQ(host::makeInputItems({"/m.mp4", "A", "b.c", {}, {}, {}}).value_or(QList<host::InputItem>{}).size(), 3);
}

TEST(ExtensionSessionReports, EveryReportArrivesWholeInOrderBeforeFinished)
{
    // A report just under the size cap (9000 types of 100 characters, about 930 KB) arrives whole;
    // everything written before the exit comes before finished(). Frames split across reads are
    // framed_socket_test.cpp's.
    RecordedSession s;
    ASSERT_TRUE(s.run("accept report com.zafrel.activity.SaveToPhotoLibrary,ZafPublishToYouTube report-big 9000 report - exit 0"));
    ASSERT_EQ(s.reports.size(), 3);
    EXPECT_EQ(s.reports[0], (QStringList{"com.zafrel.activity.SaveToPhotoLibrary", "ZafPublishToYouTube"}));
    EXPECT_EQ(s.reports[1].size(), 9000);
    EXPECT_EQ(s.reports[1].last(), QString("%1").arg(8999, 100, 10, QLatin1Char('0')));
    EXPECT_TRUE(s.reports[2].isEmpty());
    EXPECT_EQ(s.events.filter("report:").size(), 3);
    EXPECT_EQ(s.events.mid(4), (QStringList{"closed", "finished"}));
    EXPECT_FALSE(s.crashed);
    EXPECT_TRUE(s.protocolErrors.isEmpty());
    EXPECT_TRUE(isReaped(s.session.processId()));
}

TEST(ExtensionSessionRemoveView, ReachesTheExtensionAsANotification)
{
    // The fake exits 0 on removeExtensionView sent as a notification, 10 when it carried an id.
    RecordedSession s;
    QObject::connect(&s.session, &host::ExtensionSession::requestAccepted, [&] { s.session.removeView(); });
    ASSERT_TRUE(s.run("accept await-remove"));
    EXPECT_EQ(s.exitCode, 0);
}

// A run of the fake to its end: the signals in order, the exit status, and the one protocol error
// (logged under zaf.host) or rejection holding `text`. A malformed message leaves the channel
// usable: a call is answered with an error (the fake's expect-error exits 4 otherwise) and the
// report that follows still arrives. A bad frame closes the channel before the report after it.
struct Run { const char *name; QString steps; const char *text; const char *events; int exitCode = 0; bool crashed = false; };

// The fake accepts, sends `message`, does `then` and reports; the report still arrives.
Run malformed(const char *name, const char *message, const char *text, const char *then = "")
{
    return {name, QString("accept send %1 %2 report after.errors exit 0").arg(message, then), text,
            "accepted protocolError report:after.errors closed finished"};
}

class ExtensionSessionRunTest : public ::testing::TestWithParam<Run> {};

TEST_P(ExtensionSessionRunTest, EndsWithTheseSignals)
{
    LogCapture log;
    RecordedSession s;
    ASSERT_TRUE(s.run(GetParam().steps));
    EXPECT_EQ(s.events.join(' ').toStdString(), GetParam().events);
    EXPECT_EQ(std::pair(s.exitCode, s.crashed), std::pair(GetParam().exitCode, GetParam().crashed));
    const QStringList problems = s.protocolErrors + s.rejections;
    ASSERT_EQ(problems.size(), *GetParam().text ? 1 : 0);
    EXPECT_TRUE(problems.join("").contains(GetParam().text)) << problems.join("").toStdString();
    for (const QString &error : s.protocolErrors)
        EXPECT_TRUE(log.messages("zaf.host").contains(error));
    EXPECT_TRUE(isReaped(s.session.processId()));
    EXPECT_FALSE(s.session.isRunning());
}

INSTANTIATE_TEST_SUITE_P(Runs, ExtensionSessionRunTest, ::testing::Values(
    malformed("NotJson", "not-json{", "invalid JSON"),
    malformed("ReportParamsNotNested", R"({"jsonrpc":"2.0","method":"extensionDidFinishWithActivityTypes","params":["x"]})", "params must be a one-element array"),
    malformed("ActivityTypeNotAString", R"({"jsonrpc":"2.0","method":"extensionDidFinishWithActivityTypes","params":[[1]]})", "not a string"),
    malformed("UnknownNotification", R"({"jsonrpc":"2.0","method":"openTheDoor"})", "unknown notification openTheDoor"),
    malformed("UnknownMethod", R"({"jsonrpc":"2.0","id":7,"method":"openTheDoor"})", "unknown method openTheDoor", "expect-error"),
    malformed("InvalidRequest", R"({"jsonrpc":"1.0","id":7,"method":"m"})", "\"jsonrpc\" must be", "expect-error"),
    malformed("AnswerToNoRequest", R"({"jsonrpc":"2.0","id":9,"result":{}})", "not pending"),
    Run{"AcceptanceNotABoolean", R"(take send {"jsonrpc":"2.0","id":1,"result":{"accepted":"yes"}} report after.errors exit 0)", "must be {\"accepted\"",
        "protocolError report:after.errors closed finished"},
    Run{"LengthAboveTheCap", "accept oversized report too.late await-eof", "1048577", "accepted protocolError closed finished"},
    Run{"ErrorAnswer", "reject exit 0", "no movie", "rejected closed finished"},
    Run{"NotAccepted", R"(take send {"jsonrpc":"2.0","id":1,"result":{"accepted":false}} exit 0)", "did not accept", "rejected closed finished"},
    Run{"AbortWithoutAReport", "accept crash", "", "accepted closed finished", 128 + SIGABRT, true}), caseName);

// A start that fails says why, in the log too, and leaves no process, channel or signal; a session
// that ran is not started again.
struct StartFailure { const char *name; bool ranBefore; const char *program; QList<host::InputItem> items; const char *reason; };

class ExtensionSessionStartFailureTest : public ::testing::TestWithParam<StartFailure> {};

TEST_P(ExtensionSessionStartFailureTest, GivesAReasonAndNoSignal)
{
    LogCapture log;
    RecordedSession s;
    if (GetParam().ranBefore) {
        ASSERT_TRUE(s.run("accept exit 0"));
        s.events.clear();
    }
    QString error;
    EXPECT_FALSE(s.session.start(GetParam().program, GetParam().items, &error));
    EXPECT_TRUE(error.contains(GetParam().reason)) << error.toStdString();
    EXPECT_TRUE(log.messages("zaf.host").contains(error));
    EXPECT_EQ(s.session.processId() == 0, !GetParam().ranBefore);
    EXPECT_FALSE(s.session.isRunning());
    EXPECT_FALSE(s.session.isChannelOpen());
    QCoreApplication::processEvents();
    EXPECT_TRUE(s.events.isEmpty());
}

INSTANTIATE_TEST_SUITE_P(Starts, ExtensionSessionStartFailureTest, ::testing::Values(
    StartFailure{"ProgramCannotRun", false, "/nonexistent/zaf-extension", requiredItems(), "/nonexistent/zaf-extension"},
    StartFailure{"RequestAboveTheCap", false, ZAF_FAKE_EXTENSION_BIN, {host::makeShareMessageItem(QString(host::kMaxMessageLength, 'm'))}, "too large"},
    StartFailure{"SecondStart", true, ZAF_FAKE_EXTENSION_BIN, requiredItems(), "already started"}), caseName);

TEST(ExtensionSessionExit, ClosedChannelIsReportedWhileTheProcessRuns)
{
    RecordedSession s;
    s.session.setTerminationGracePeriod(100);
    ASSERT_TRUE(s.start("accept close hang"));
    ASSERT_TRUE(s.waitFor([&] { return s.closedCount == 1; }));
    EXPECT_FALSE(s.finished);
    EXPECT_TRUE(s.session.isRunning());
    EXPECT_FALSE(s.session.isChannelOpen());
}

TEST(ExtensionSessionRemoveView, AfterTheChannelClosedIsOnlyLogged)
{
    RecordedSession s;
    ASSERT_TRUE(s.run("accept close exit 0"));
    LogCapture log;
    s.session.removeView();
    EXPECT_EQ(log.messages("zaf.host"), QStringList{"cannot remove the extension's view: the channel is closed"});
}

TEST(ExtensionSessionTermination, DestructorLeavesTheExtensionToExitOnTheClosedChannel)
{
    // The closed channel is the removal of the view: the fake exits by itself, without SIGTERM.
    LogCapture log;
    pid_t pid = 0;
    {
        RecordedSession s;
        ASSERT_TRUE(s.start("accept await-eof"));
        ASSERT_TRUE(s.waitFor([&] { return s.events.contains("accepted"); }));
        pid = s.session.processId();
    }
    EXPECT_TRUE(isReaped(pid));
    EXPECT_FALSE(processExists(pid));
    EXPECT_TRUE(log.messages("zaf.host").filter("SIGTERM").isEmpty());
}

} // namespace
} // namespace zaf::test
