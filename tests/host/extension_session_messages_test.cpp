// The host session's messages, against the fake extension over a real socket pair: what the
// request carries, how reports arrive, and what malformed or oversized messages do.
#include "tests/host/session_recorder.h"
#include "tests/support/log_capture.h"
#include "tests/support/temp_dir.h"

#include <QFile>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>

namespace zaf::test {
namespace {

using zaf::host::ExtensionSession;

QJsonObject readJsonFile(const QString &path)
{
    QFile file(path);
    if (!file.open(QIODevice::ReadOnly))
        return {};
    return QJsonDocument::fromJson(file.readAll()).object();
}

TEST(ExtensionSessionRequest, CarriesEveryItemAndTheChannelEnvironment)
{
    ScratchDir scratch;
    const QString dumpPath = scratch.file(QStringLiteral("request.json"));
    qputenv("ZAF_FAKE_DUMP", dumpPath.toUtf8());
    qputenv("ZAF_FAKE_MARKER", "inherited");
    // A stale channel variable in the host's environment must not reach the extension.
    qputenv("ZAF_EXTENSION_CHANNEL_FD", "9");

    QString error;
    host::RecordingDetails details{QStringLiteral("/tmp/rec.mp4"), QStringLiteral("My Recorder"), QStringLiteral("org.example.Recorder"),
                                   QStringLiteral("/tmp/notes.txt"), QStringLiteral("Look at this"), QStringLiteral("#11aa33cc")};
    const auto items = host::makeInputItems(details, &error);
    ASSERT_TRUE(items) << error.toStdString();

    ExtensionSession session;
    SessionRecorder recorder(session);
    startFake(session, {QStringLiteral("accept"), QStringLiteral("exit"), QStringLiteral("0")}, *items);
    qunsetenv("ZAF_FAKE_DUMP");
    qunsetenv("ZAF_FAKE_MARKER");
    qunsetenv("ZAF_EXTENSION_CHANNEL_FD");
    ASSERT_TRUE(recorder.waitForFinished());
    EXPECT_FALSE(recorder.crashed);
    EXPECT_EQ(recorder.events.first(), QStringLiteral("accepted"));

    const QJsonObject dump = readJsonFile(dumpPath);
    EXPECT_EQ(dump.value(QStringLiteral("channelVariable")).toString(), QStringLiteral("3"));
    EXPECT_EQ(dump.value(QStringLiteral("marker")).toString(), QStringLiteral("inherited"));
    EXPECT_TRUE(dump.value(QStringLiteral("fd3IsSocket")).toBool());
    EXPECT_TRUE(dump.value(QStringLiteral("sigpipeDefault")).toBool());

    const QJsonObject request = dump.value(QStringLiteral("request")).toObject();
    EXPECT_EQ(request.value(QStringLiteral("jsonrpc")).toString(), QStringLiteral("2.0"));
    EXPECT_EQ(request.value(QStringLiteral("method")).toString(), QStringLiteral("beginExtensionRequest"));
    const QJsonArray sent = request.value(QStringLiteral("params")).toObject().value(QStringLiteral("inputItems")).toArray();
    const QList<std::tuple<QString, QString, QString>> expected{
        {QStringLiteral("ZafVideoEditorExtensionMovieURLKey"), QStringLiteral("text/plain"), QStringLiteral("/tmp/rec.mp4")},
        {QStringLiteral("ZafVideoEditorExtensionAppNameKey"), QStringLiteral("text/plain"), QStringLiteral("My Recorder")},
        {QStringLiteral("ZafVideoEditorExtensionBundleIdentifierKey"), QStringLiteral("text/plain"), QStringLiteral("org.example.Recorder")},
        {QStringLiteral("ZafVideoEditorExtensionFileAttachmentKey"), QStringLiteral("text/plain"), QStringLiteral("/tmp/notes.txt")},
        {QStringLiteral("ZafVideoEditorExtensionOverrideShareMessageKey"), QStringLiteral("text/plain"), QStringLiteral("Look at this")},
        {QStringLiteral("ZafVideoEditorExtensionOverrideTintColorKey"), QStringLiteral("application/x-zaf-color"), QStringLiteral("#11AA33CC")},
    };
    ASSERT_EQ(sent.size(), expected.size());
    for (int i = 0; i < sent.size(); ++i) {
        const QJsonObject item = sent[i].toObject();
        EXPECT_EQ(item.value(QStringLiteral("title")).toString(), std::get<0>(expected[i]));
        const QJsonArray attachments = item.value(QStringLiteral("attachments")).toArray();
        ASSERT_EQ(attachments.size(), 1);
        EXPECT_EQ(attachments[0].toObject().value(QStringLiteral("type")).toString(), std::get<1>(expected[i]));
        EXPECT_EQ(attachments[0].toObject().value(QStringLiteral("value")).toString(), std::get<2>(expected[i]));
    }
}

TEST(InputItems, TintColourIsSentOpaqueAsSixDigitsAndRejectedWhenNotAColour)
{
    EXPECT_EQ(host::makeTintColorItem(255, 0, 16).attachments[0].value.toString(), QStringLiteral("#FF0010"));
    EXPECT_EQ(host::makeTintColorItem(255, 0, 16, 128).attachments[0].value.toString(), QStringLiteral("#FF001080"));
    for (const char *bad : {"red", "#12345", "#1234567", "123456", "#12345G", "#123456789"}) {
        SCOPED_TRACE(bad);
        EXPECT_FALSE(host::makeTintColorItem(QString::fromLatin1(bad)));
        QString error;
        host::RecordingDetails details{QStringLiteral("/m.mp4"), QStringLiteral("A"), QStringLiteral("b.c"), {}, {}, QString::fromLatin1(bad)};
        EXPECT_FALSE(host::makeInputItems(details, &error));
        EXPECT_TRUE(error.contains(QString::fromLatin1(bad)));
    }
    // Only the three required items when nothing optional is set.
    const auto items = host::makeInputItems({QStringLiteral("/m.mp4"), QStringLiteral("A"), QStringLiteral("b.c"), {}, {}, {}});
    ASSERT_TRUE(items);
    EXPECT_EQ(items->size(), 3);
}

TEST(ExtensionSessionReports, DeliversEveryReportInOrderBeforeTheEnd)
{
    ExtensionSession session;
    SessionRecorder recorder(session);
    startFake(session, {QStringLiteral("accept"), QStringLiteral("report"), QStringLiteral("com.zafrel.activity.SaveToPhotoLibrary,ZafPublishToYouTube"),
                        QStringLiteral("report"), QStringLiteral("-"), QStringLiteral("exit"), QStringLiteral("0")});
    ASSERT_TRUE(recorder.waitForFinished());

    const QList<QStringList> expected{{QStringLiteral("com.zafrel.activity.SaveToPhotoLibrary"), QStringLiteral("ZafPublishToYouTube")}, {}};
    EXPECT_EQ(recorder.reports, expected);
    // Everything the process wrote before it exited comes before finished(), which is last.
    EXPECT_EQ(recorder.events, (QStringList{QStringLiteral("accepted"), QStringLiteral("report"), QStringLiteral("report"),
                                            QStringLiteral("closed"), QStringLiteral("finished")}));
    EXPECT_EQ(recorder.exitCode, 0);
    EXPECT_FALSE(recorder.crashed);
    EXPECT_TRUE(recorder.protocolErrors.isEmpty());
}

TEST(ExtensionSessionReports, AssemblesAMessageWrittenOneByteAtATime)
{
    ExtensionSession session;
    SessionRecorder recorder(session);
    startFake(session, {QStringLiteral("accept"), QStringLiteral("report-slowly"), QStringLiteral("slow.type"), QStringLiteral("await-eof")});
    ASSERT_TRUE(waitUntil([&] { return !recorder.reports.isEmpty(); }));
    EXPECT_EQ(recorder.reports, QList<QStringList>{{QStringLiteral("slow.type")}});
    EXPECT_TRUE(session.isRunning());
}

TEST(ExtensionSessionReports, AcceptsAReportJustUnderTheSizeCap)
{
    ExtensionSession session;
    SessionRecorder recorder(session);
    // 9000 types of 100 characters, quoted and separated: about 930 KB, under 1 MiB.
    startFake(session, {QStringLiteral("accept"), QStringLiteral("report-big"), QStringLiteral("9000"), QStringLiteral("exit"), QStringLiteral("0")});
    ASSERT_TRUE(recorder.waitForFinished());
    ASSERT_EQ(recorder.reports.size(), 1);
    EXPECT_EQ(recorder.reports[0].size(), 9000);
    EXPECT_EQ(recorder.reports[0].last(), QStringLiteral("%1").arg(8999, 100, 10, QLatin1Char('0')));
    EXPECT_TRUE(recorder.protocolErrors.isEmpty());
}

TEST(ExtensionSessionRemoveView, SendsTheNotificationThatMakesTheExtensionExitNormally)
{
    ExtensionSession session;
    SessionRecorder recorder(session);
    QObject::connect(&session, &ExtensionSession::activityTypesReported, &session, &ExtensionSession::removeView);
    // The fake exits 0 only on removeExtensionView sent as a notification, 3 if the channel just ends.
    startFake(session, {QStringLiteral("accept"), QStringLiteral("report"), QStringLiteral("-"), QStringLiteral("await-remove")});
    ASSERT_TRUE(recorder.waitForFinished());
    EXPECT_EQ(recorder.exitCode, 0);
    EXPECT_FALSE(recorder.crashed);
    EXPECT_TRUE(isReaped(session.processId()));
}

TEST(ExtensionSessionProtocol, MalformedMessagesAreLoggedAndTheChannelStaysUsable)
{
    LogCapture log;
    ExtensionSession session;
    SessionRecorder recorder(session);
    startFake(session, {QStringLiteral("accept"), QStringLiteral("garbage"), QStringLiteral("bad-params"), QStringLiteral("report"),
                        QStringLiteral("after.errors"), QStringLiteral("exit"), QStringLiteral("0")});
    ASSERT_TRUE(recorder.waitForFinished());

    ASSERT_EQ(recorder.protocolErrors.size(), 2);
    EXPECT_TRUE(recorder.protocolErrors[0].contains(QStringLiteral("not JSON"))) << recorder.protocolErrors[0].toStdString();
    EXPECT_TRUE(recorder.protocolErrors[1].contains(QStringLiteral("extensionDidFinishWithActivityTypes")));
    EXPECT_EQ(recorder.reports, QList<QStringList>{{QStringLiteral("after.errors")}});
    const QStringList logged = log.messages(QStringLiteral("zaf.host"));
    for (const QString &error : recorder.protocolErrors)
        EXPECT_TRUE(logged.contains(error)) << error.toStdString();
}

TEST(ExtensionSessionProtocol, OversizedLengthClosesTheChannelAndDropsWhatFollows)
{
    ExtensionSession session;
    SessionRecorder recorder(session);
    // After the bad length the fake still sends a report; the host must have closed the channel by
    // then, which the fake sees as its end (await-eof exits 0).
    startFake(session, {QStringLiteral("accept"), QStringLiteral("oversized"), QStringLiteral("report"), QStringLiteral("too.late"),
                        QStringLiteral("await-eof")});
    ASSERT_TRUE(recorder.waitForFinished());
    ASSERT_EQ(recorder.protocolErrors.size(), 1);
    EXPECT_TRUE(recorder.reports.isEmpty());
    EXPECT_EQ(recorder.closedCount, 1);
    EXPECT_FALSE(recorder.crashed);
    EXPECT_LT(recorder.events.indexOf(QStringLiteral("protocolError")), recorder.events.indexOf(QStringLiteral("closed")));
}

TEST(ExtensionSessionProtocol, ChannelEndingInsideAMessageIsAProtocolError)
{
    ExtensionSession session;
    SessionRecorder recorder(session);
    startFake(session, {QStringLiteral("accept"), QStringLiteral("partial"), QStringLiteral("exit"), QStringLiteral("0")});
    ASSERT_TRUE(recorder.waitForFinished());
    ASSERT_EQ(recorder.protocolErrors.size(), 1);
    EXPECT_TRUE(recorder.protocolErrors[0].contains(QStringLiteral("middle of a message")));
    EXPECT_EQ(recorder.closedCount, 1);
}

TEST(ExtensionSessionProtocol, RequestFromTheExtensionIsAnsweredWithMethodNotFound)
{
    ExtensionSession session;
    SessionRecorder recorder(session);
    // The fake exits 4 unless the host answers its request id 7 with a JSON-RPC error.
    startFake(session, {QStringLiteral("accept"), QStringLiteral("call-unknown"), QStringLiteral("expect-error"), QStringLiteral("exit"),
                        QStringLiteral("0")});
    ASSERT_TRUE(recorder.waitForFinished());
    EXPECT_EQ(recorder.exitCode, 0);
    ASSERT_EQ(recorder.protocolErrors.size(), 1);
    EXPECT_TRUE(recorder.protocolErrors[0].contains(QStringLiteral("openTheDoor")));
}

TEST(ExtensionSessionProtocol, ErrorAnswerToTheRequestIsARejection)
{
    ExtensionSession session;
    SessionRecorder recorder(session);
    startFake(session, {QStringLiteral("reject"), QStringLiteral("exit"), QStringLiteral("0")});
    ASSERT_TRUE(recorder.waitForFinished());
    EXPECT_FALSE(recorder.events.contains(QStringLiteral("accepted")));
    ASSERT_EQ(recorder.rejections.size(), 1);
    EXPECT_TRUE(recorder.rejections[0].contains(QStringLiteral("no movie")));
}

} // namespace
} // namespace zaf::test
