// The runtime driven over a socket pair as a host would drive it: the request, the principal's view
// coming on screen with the items already in its context, the removal (by message or by the end of
// the channel), refusals of bad requests, and the one-way proxy back to the host. Last, the extension
// main routine's refusal of a missing or unusable channel descriptor (it returns before any
// application object is made, so it runs inside this test program).

#include "platform/extensionkit/channel.h"
#include "platform/extensionkit/extension_runtime.h"
#include "platform/extensionkit/json_rpc.h"
#include "platform/ui/view_controller.h"
#include "platform/ui/window_host.h"
#include "tests/platform/extensionkit/socket_pair.h"
#include "tests/support/log_capture.h"

#include <QJsonArray>
#include <QScopeGuard>
#include <QWidget>

#include <gtest/gtest.h>

#include <cerrno>
#include <fcntl.h>
#include <thread>
#include <unistd.h>

using namespace zaf::extensionkit;
using zaf::test::SocketPair;
using zaf::test::waitUntil;
namespace rpc = zaf::extensionkit::jsonrpc;

namespace {

constexpr const char *kReportMethod = "extensionDidFinishWithActivityTypes";

class RecordingPrincipal : public zaf::ui::ViewController {
public:
    QStringList calls;
    qsizetype itemsAtViewDidLoad = -1;

    void viewDidLoad() override
    {
        const ExtensionContext *context = ExtensionContext::contextOfPrincipal(this);
        itemsAtViewDidLoad = context ? context->inputItems().size() : -1;
        calls << "viewDidLoad";
    }
    void viewWillAppear(bool animated) override { ViewController::viewWillAppear(animated); calls << "viewWillAppear"; }
    void viewDidAppear(bool animated) override { ViewController::viewDidAppear(animated); calls << "viewDidAppear"; }
    void viewWillDisappear(bool animated) override { ViewController::viewWillDisappear(animated); calls << "viewWillDisappear"; }
    void viewDidDisappear(bool animated) override { ViewController::viewDidDisappear(animated); calls << "viewDidDisappear"; }
};

class ReportingContext : public ExtensionContext {
public:
    InterfaceDescription auxiliaryHostInterface() const override { return {"TestHostProtocol", {kReportMethod}}; }
};

QJsonObject item(const QJsonValue &title, const QJsonValue &attachments)
{
    return QJsonObject{{"title", title}, {"attachments", attachments}};
}

QJsonObject textItem(const QString &title, const QString &value)
{
    return item(title, QJsonArray{QJsonObject{{"type", "text/plain"}, {"value", value}}});
}

QJsonObject beginRequest(int id, const QJsonArray &items)
{
    return rpc::makeRequest(id, "beginExtensionRequest", QJsonObject{{"inputItems", items}});
}

class RuntimeTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        ExtensionDeclaration declaration;
        declaration.contextClassName = "ReportingContext";
        declaration.principalClassName = "RecordingPrincipal";
        declaration.makeContext = [] { return new ReportingContext; };
        declaration.makePrincipal = [this] { return recorder = new RecordingPrincipal; };
        declaration.windowTitle = "Test Editor";
        declaration.windowSize = QSize(640, 360);
        declaration.onWindowClosed = [this](zaf::ui::ViewController *principal) { closedWith = principal; };
        runtime = std::make_unique<ExtensionRuntime>(pair.releaseExtensionFd(), declaration);
        QObject::connect(runtime.get(), &ExtensionRuntime::finished, [this] { ++finishedCount; recorder->calls << "finished"; });
        QString error;
        ASSERT_TRUE(runtime->start(&error)) << error.toStdString();
    }

    // Sends the request, checks it is accepted and waits for the principal's view to appear.
    void begin(int id = 1, const QJsonArray &items = {textItem("ZafVideoEditorExtensionMovieURLKey", "/tmp/m.mp4"),
                                                       textItem("ZafVideoEditorExtensionAppNameKey", "App"),
                                                       textItem("ZafVideoEditorExtensionBundleIdentifierKey", "org.example.App")})
    {
        pair.writeMessage(beginRequest(id, items));
        const QList<QJsonObject> answers = pair.readMessages(1);
        ASSERT_EQ(answers.size(), 1);
        ASSERT_EQ(answers[0], rpc::makeResult(id, QJsonObject{{"accepted", true}}));
        ASSERT_TRUE(waitUntil([&] { return recorder->calls.contains("viewDidAppear"); }));
    }

    SocketPair pair;
    RecordingPrincipal *recorder = nullptr;
    zaf::ui::ViewController *closedWith = nullptr;
    int finishedCount = 0;
    std::unique_ptr<ExtensionRuntime> runtime;
};

} // namespace

TEST_F(RuntimeTest, StartWiresContextAndPrincipalButShowsNothingBeforeTheRequest)
{
    ASSERT_NE(runtime->context(), nullptr);
    EXPECT_EQ(runtime->principal(), recorder);
    EXPECT_EQ(runtime->context()->principalObject(), recorder);
    EXPECT_EQ(ExtensionContext::contextOfPrincipal(recorder), runtime->context());
    EXPECT_TRUE(runtime->context()->inputItems().isEmpty());
    EXPECT_FALSE(runtime->hasRequest());

    // The channel closing before any request finishes the runtime without ever loading the view.
    pair.closeHost();
    ASSERT_TRUE(waitUntil([&] { return finishedCount > 0; }));
    EXPECT_EQ(recorder->calls, QStringList{"finished"});
    EXPECT_FALSE(recorder->isViewLoaded());
    EXPECT_EQ(runtime->window(), nullptr);
}

TEST_F(RuntimeTest, RequestSetsTheItemsBeforeThePrincipalsViewLoadsAndShows)
{
    zaf::test::LogCapture logs;
    const QJsonArray items{
        textItem("ZafVideoEditorExtensionMovieURLKey", "/tmp/m.mp4"),
        item(42, QJsonArray{QJsonObject{{"type", "text/plain"}, {"value", "title is a number"}}}),
        item("NoAttachmentsArray", QJsonObject{}),
        QJsonValue("an item that is a string"),
        item("ZafVideoEditorExtensionAppNameKey", QJsonArray{QJsonObject{{"value", "untyped"}}, QJsonValue(7)}),
        item("ZafVideoEditorExtensionOverrideTintColorKey", QJsonArray{QJsonObject{{"type", kTypeIdentifierColor}, {"value", "#FF000080"}}}),
    };
    begin(17, items);

    const QList<InputItem> kept = runtime->context()->inputItems();
    ASSERT_EQ(kept.size(), 3);
    EXPECT_EQ(kept[0].attributedTitlePlainString(), "ZafVideoEditorExtensionMovieURLKey");
    EXPECT_TRUE(kept[0].attachments().first()->hasItemConformingToTypeIdentifier(kTypeIdentifierData));
    // Attachments without a MIME type (or that are not even objects) are kept but conform to nothing.
    ASSERT_EQ(kept[1].attachments().size(), 2);
    EXPECT_FALSE(kept[1].attachments()[0]->hasItemConformingToTypeIdentifier(kTypeIdentifierData));
    EXPECT_FALSE(kept[1].attachments()[1]->hasItemConformingToTypeIdentifier(kTypeIdentifierData));
    EXPECT_TRUE(kept[2].attachments().first()->hasItemConformingToTypeIdentifier(kTypeIdentifierColor));

    EXPECT_EQ(recorder->itemsAtViewDidLoad, 3);
    EXPECT_EQ(recorder->calls, (QStringList{"viewDidLoad", "viewWillAppear", "viewDidAppear"}));
    ASSERT_NE(runtime->window(), nullptr);
    EXPECT_TRUE(runtime->window()->isVisible());
    EXPECT_EQ(runtime->window()->windowTitle(), "Test Editor");
    EXPECT_EQ(runtime->window()->size(), QSize(640, 360));
    EXPECT_EQ(logs.messages("zaf.extensionkit").filter("skipped").size(), 3);
}

TEST_F(RuntimeTest, ClosingTheWindowOnlyCallsTheHandlerAndRemovalMakesTheViewDisappearThenFinishesOnce)
{
    begin();
    runtime->window()->close();
    EXPECT_EQ(closedWith, recorder);
    EXPECT_TRUE(runtime->window()->isVisible());
    EXPECT_EQ(finishedCount, 0);

    recorder->calls.clear();
    pair.writeMessage(rpc::makeNotification("removeExtensionView"));
    ASSERT_TRUE(waitUntil([&] { return finishedCount > 0; }));
    EXPECT_EQ(recorder->calls, (QStringList{"viewWillDisappear", "viewDidDisappear", "finished"}));
    EXPECT_FALSE(runtime->window()->isVisible());

    // The host then closing the channel is the same removal: nothing happens a second time.
    pair.closeHost();
    waitUntil([] { return false; }, 50);
    EXPECT_EQ(finishedCount, 1);
    EXPECT_EQ(recorder->calls.count("viewDidDisappear"), 1);
}

TEST_F(RuntimeTest, GarbageAndBadRequestsAreLoggedOrAnsweredAndTheRuntimeCarriesOn)
{
    zaf::test::LogCapture logs;
    pair.writeFrame("\xff\xfe garbage");
    pair.writeFrame("{\"jsonrpc\":\"2.0\",\"id\":1,\"method\":\"beginExtensionRequest\",\"params\":");
    pair.writeFrame(R"({"jsonrpc":"2.0","id":{"x":1},"method":"beginExtensionRequest","params":{"inputItems":[]}})");
    pair.writeMessage(rpc::makeRequest(1, "beginExtensionRequest", QJsonArray{}));
    pair.writeMessage(rpc::makeRequest(2, "beginExtensionRequest", QJsonObject{{"inputItems", "nope"}}));
    pair.writeMessage(rpc::makeRequest(3, "beginExtensionRequest"));
    pair.writeMessage(rpc::makeRequest(4, "doSomethingElse", QJsonObject{}));
    pair.writeMessage(rpc::makeRequest(5, "removeExtensionView"));
    pair.writeMessage(rpc::makeNotification("unknownNotification"));
    pair.writeMessage(rpc::makeNotification("beginExtensionRequest", QJsonObject{{"inputItems", QJsonArray{}}}));
    const QList<QJsonObject> answers = pair.readMessages(8);
    ASSERT_EQ(answers.size(), 8);
    // Frames whose id cannot be read are answered with a null id; notifications are not answered.
    const QList<std::pair<QJsonValue, int>> expected{{QJsonValue::Null, rpc::ParseError},     {QJsonValue::Null, rpc::ParseError},
                                                     {QJsonValue::Null, rpc::InvalidRequest}, {1, rpc::InvalidParams},
                                                     {2, rpc::InvalidParams},                 {3, rpc::InvalidParams},
                                                     {4, rpc::MethodNotFound},                {5, rpc::InvalidRequest}};
    for (qsizetype i = 0; i < answers.size(); ++i) {
        EXPECT_EQ(answers[i].value("id"), expected[i].first) << i;
        EXPECT_EQ(answers[i].value("error").toObject().value("code"), QJsonValue(expected[i].second)) << i;
    }
    EXPECT_TRUE(pair.nothingToRead());
    EXPECT_FALSE(runtime->hasRequest());
    EXPECT_FALSE(runtime->isFinished());
    EXPECT_GE(logs.messages("zaf.extensionkit").filter("protocol error").size(), 3);
    EXPECT_EQ(logs.messages("zaf.extensionkit").filter("unknown notification unknownNotification").size(), 1);

    // A valid request still goes through afterwards; a second one is refused.
    begin();
    pair.writeMessage(beginRequest(9, QJsonArray{}));
    const QList<QJsonObject> second = pair.readMessages(1);
    ASSERT_EQ(second.size(), 1);
    EXPECT_EQ(second[0], rpc::makeError(9, rpc::InvalidRequest, "request already begun"));
    EXPECT_EQ(runtime->context()->inputItems().size(), 3);
    EXPECT_EQ(finishedCount, 0);
}

TEST_F(RuntimeTest, OversizedFrameClosesTheChannelWhichRemovesTheView)
{
    zaf::test::LogCapture logs;
    begin();
    recorder->calls.clear();
    pair.writeRaw(QByteArray::fromHex("ffffffff") + QByteArray(1000, 'x'));
    ASSERT_TRUE(waitUntil([&] { return finishedCount > 0; }));
    EXPECT_EQ(recorder->calls, (QStringList{"viewWillDisappear", "viewDidDisappear", "finished"}));
    EXPECT_TRUE(runtime->isFinished());
    EXPECT_FALSE(logs.messages("zaf.extensionkit").filter("exceeds the limit").isEmpty());
}

TEST_F(RuntimeTest, ProxyDeliversOneWayMessagesFromAnyThreadAndReportsFailures)
{
    begin();
    QList<zaf::Error> errors;
    const auto proxy = runtime->context()->remoteObjectProxyWithErrorHandler([&](const zaf::Error &error) { errors.append(error); });
    proxy->sendOneWay(kReportMethod, QJsonArray{QJsonArray{"save", "save"}});
    std::thread worker([proxy] { proxy->sendOneWay(kReportMethod, QJsonArray{QJsonArray{}}); });
    worker.join();
    const QList<QJsonObject> messages = pair.readMessages(2);
    ASSERT_EQ(messages.size(), 2);
    EXPECT_EQ(messages[0], rpc::makeNotification(kReportMethod, QJsonArray{QJsonArray{"save", "save"}}));
    EXPECT_EQ(messages[1], rpc::makeNotification(kReportMethod, QJsonArray{QJsonArray{}}));
    EXPECT_TRUE(errors.isEmpty());

    // A method the host's interface does not declare never reaches the wire.
    proxy->sendOneWay("somethingUndeclared", QJsonArray{});
    ASSERT_EQ(errors.size(), 1);
    EXPECT_EQ(errors[0].code, EINVAL);
    EXPECT_TRUE(pair.nothingToRead());

    // Each call makes a new proxy; after the host went away, a send reports the write's errno.
    EXPECT_NE(runtime->context()->remoteObjectProxyWithErrorHandler({}), proxy);
    pair.closeHost();
    proxy->sendOneWay(kReportMethod, QJsonArray{QJsonArray{"late"}});
    ASSERT_EQ(errors.size(), 2);
    EXPECT_TRUE(errors[1].code == EPIPE || errors[1].code == ECONNRESET) << errors[1].code;
}

TEST(RuntimeStart, FailsWithoutAPrincipalOrAUsableDescriptor)
{
    SocketPair pair;
    ExtensionDeclaration noPrincipal;
    noPrincipal.principalClassName = "Missing";
    ExtensionRuntime withoutPrincipal(pair.releaseExtensionFd(), noPrincipal);
    QString error;
    EXPECT_FALSE(withoutPrincipal.start(&error));
    EXPECT_TRUE(error.contains("Missing"));

    ExtensionDeclaration declaration;
    declaration.makePrincipal = [] { return new zaf::ui::ViewController; };
    ExtensionRuntime badFd(-1, declaration);
    EXPECT_FALSE(badFd.start(&error));
    EXPECT_EQ(badFd.principal(), nullptr);
}

TEST(ExtensionMain, ChannelDescriptorMustNameAnOpenSocketElseMainExitsWithCodeTwo)
{
    const auto unset = qScopeGuard([] { qunsetenv(kChannelFdEnvironmentVariable); });
    const int devNull = ::open("/dev/null", O_RDONLY | O_CLOEXEC);
    ASSERT_GE(devNull, 0);
    int closed[2];
    ASSERT_EQ(::pipe(closed), 0);
    ::close(closed[0]);
    ::close(closed[1]);
    const QList<std::pair<std::optional<QByteArray>, QString>> cases{
        {std::nullopt, "is not set"},
        {QByteArray(""), "is not set"},
        {QByteArray("three"), "not a descriptor number"},
        {QByteArray("-1"), "not a descriptor number"},
        {QByteArray("3x"), "not a descriptor number"},
        {QByteArray::number(closed[0]), "names no open descriptor"},
        {QByteArray::number(devNull), "is not a socket"},
    };
    char name[] = "zaf-test-extension";
    char *argv[] = {name, nullptr};
    for (const auto &[value, reason] : cases) {
        SCOPED_TRACE(value ? value->toStdString() : std::string("(unset)"));
        value ? qputenv(kChannelFdEnvironmentVariable, *value) : qunsetenv(kChannelFdEnvironmentVariable);
        QString error;
        EXPECT_EQ(channelFdFromEnvironment(&error), -1);
        EXPECT_TRUE(error.contains(reason)) << error.toStdString();
        EXPECT_EQ(extensionMain(1, argv, ExtensionDeclaration{}), kExitCodeNoChannel);
    }
    ::close(devNull);

    zaf::test::SocketPair pair;
    qputenv(kChannelFdEnvironmentVariable, QByteArray::number(pair.extensionFd()));
    QString error;
    EXPECT_EQ(channelFdFromEnvironment(&error), pair.extensionFd()) << error.toStdString();
}
