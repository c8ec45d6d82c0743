// The runtime driven over a socket pair as a host would drive it, and the extension main routine's
// check of its channel descriptor.

#include "platform/extensionkit/channel.h"
#include "platform/extensionkit/extension_runtime.h"
#include "platform/extensionkit/json_rpc.h"
#include "platform/ui/view_controller.h"
#include "platform/ui/window_host.h"
#include "tests/platform/extensionkit/socket_pair.h"
#include "tests/support/named_cases.h"

#include <QJsonArray>
#include <QScopeGuard>
#include <QWidget>

#include <gtest/gtest.h>

#include <cerrno>
#include <fcntl.h>
#include <optional>
#include <thread>

using namespace zaf::extensionkit;
using zaf::test::SocketPair;
using zaf::test::caseName;
using zaf::test::waitUntil;
namespace rpc = zaf::extensionkit::jsonrpc;

ZAF_PRINT_CASES_AS_NAMES

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

// A request in `version` (undefined: a host from before the version existed, which sends none).
QJsonObject beginRequest(int id, const QJsonArray &items, const QJsonValue &version = QJsonValue::Undefined)
{
    QJsonObject params{{"inputItems", items}};
    if (!version.isUndefined())
        params.insert("protocolVersion", version);
    return rpc::makeRequest(id, "beginExtensionRequest", params);
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
                                                       textItem("ZafVideoEditorExtensionBundleIdentifierKey", "org.example.App")},
               const QJsonValue &version = "1.0")
    {
        pair.writeMessage(beginRequest(id, items, version));
        const QList<QJsonObject> answers = pair.readMessages(1);
        ASSERT_EQ(answers.size(), 1);
        ASSERT_EQ(answers[0], rpc::makeResult(id, QJsonObject{{"accepted", true}, {"protocolVersion", "1.0"}}));
        ASSERT_TRUE(waitUntil([&] { return recorder->calls.contains("viewDidAppear"); }));
    }

    // A proxy to the host whose errors go to `errors`.
    auto recordingProxy()
    {
        return runtime->context()->remoteObjectProxyWithErrorHandler([this](const zaf::Error &error) { errors.append(error); });
    }

    SocketPair pair;
    QList<zaf::Error> errors;
    RecordingPrincipal *recorder = nullptr;
    zaf::ui::ViewController *closedWith = nullptr;
    int finishedCount = 0;
    std::unique_ptr<ExtensionRuntime> runtime;
};

} // namespace

TEST_F(RuntimeTest, RequestKeepsTheItemsWithATitleString)
{
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
}

TEST_F(RuntimeTest, RequestShowsThePrincipalsViewWithTheItemsAlreadyInTheContext)
{
    begin();
    EXPECT_EQ(recorder->itemsAtViewDidLoad, 3);
    EXPECT_EQ(recorder->calls, (QStringList{"viewDidLoad", "viewWillAppear", "viewDidAppear"}));
    ASSERT_NE(runtime->window(), nullptr);
    EXPECT_TRUE(runtime->window()->isVisible());
    EXPECT_EQ(runtime->window()->windowTitle(), "Test Editor");
    EXPECT_EQ(runtime->window()->size(), QSize(640, 360));
}

TEST_F(RuntimeTest, ClosingTheWindowOnlyCallsTheHandler)
{
    begin();
    runtime->window()->close();
    EXPECT_EQ(closedWith, recorder);
    EXPECT_TRUE(runtime->window()->isVisible());
    EXPECT_EQ(finishedCount, 0);
}

// The host removes the view by message, by closing the channel or by making it unusable (an
// oversized frame): a shown view disappears, then the runtime finishes; one never shown stays
// unloaded.
struct Removal { const char *name; bool shown; QByteArray bytes; }; // no bytes: the host closes the channel

class RuntimeRemovalTest : public RuntimeTest, public ::testing::WithParamInterface<Removal> {};

TEST_P(RuntimeRemovalTest, MakesTheViewDisappearThenFinishes)
{
    if (GetParam().shown)
        begin();
    recorder->calls.clear();
    GetParam().bytes.isEmpty() ? pair.closeHost() : pair.writeRaw(GetParam().bytes);
    ASSERT_TRUE(waitUntil([&] { return finishedCount > 0; }));
    EXPECT_TRUE(runtime->isFinished());
    if (!GetParam().shown) {
        EXPECT_EQ(recorder->calls, QStringList{"finished"});
        EXPECT_FALSE(recorder->isViewLoaded());
        EXPECT_EQ(runtime->window(), nullptr);
        return;
    }
    EXPECT_EQ(recorder->calls, (QStringList{"viewWillDisappear", "viewDidDisappear", "finished"}));
    EXPECT_FALSE(runtime->window()->isVisible());
}

INSTANTIATE_TEST_SUITE_P(Ways, RuntimeRemovalTest, ::testing::Values(
    Removal{"Message", true, zaf::extensionkit::encodeFrame(rpc::serialize(rpc::makeNotification("removeExtensionView")))},
    Removal{"ChannelEnd", true, {}},
    Removal{"OversizedFrame", true, QByteArray::fromHex("ffffffff") + QByteArray(1000, 'x')},
    Removal{"ChannelEndBeforeTheRequest", false, {}}), caseName);

TEST_F(RuntimeTest, ChannelClosingAfterTheRemovalChangesNothing)
{
    begin();
    pair.writeMessage(rpc::makeNotification("removeExtensionView"));
    ASSERT_TRUE(waitUntil([&] { return finishedCount > 0; }));
    pair.closeHost();
    waitUntil([] { return false; }, 50);
    EXPECT_EQ(finishedCount, 1);
    EXPECT_EQ(recorder->calls.count("viewDidDisappear"), 1);
}

// A bad or unknown message before the request: answered as JSON-RPC asks (notifications never)
// or logged, and the request that follows still goes through. Frames that are no JSON-RPC at all
// are channel_test.cpp's.
struct BadMessage {
    const char *name;
    QByteArray payload;
    std::optional<std::pair<QJsonValue, int>> answer; // id and code; none: not answered
};

class RuntimeBadMessageTest : public RuntimeTest, public ::testing::WithParamInterface<BadMessage> {};

TEST_P(RuntimeBadMessageTest, IsRefusedWhileTheRuntimeCarriesOn)
{
    pair.writeFrame(GetParam().payload);
    if (GetParam().answer) {
        EXPECT_EQ(pair.readErrorAnswer(), GetParam().answer);
    }
    EXPECT_TRUE(pair.nothingToRead());
    EXPECT_FALSE(runtime->hasRequest());
    EXPECT_FALSE(runtime->isFinished());
    begin();
}

INSTANTIATE_TEST_SUITE_P(Messages, RuntimeBadMessageTest, ::testing::Values(
    BadMessage{"ParamsAnArray", rpc::serialize(rpc::makeRequest(1, "beginExtensionRequest", QJsonArray{})), {{1, rpc::InvalidParams}}},
    BadMessage{"ItemsNotAnArray", rpc::serialize(rpc::makeRequest(2, "beginExtensionRequest", QJsonObject{{"inputItems", "nope"}})), {{2, rpc::InvalidParams}}},
    BadMessage{"NoParams", rpc::serialize(rpc::makeRequest(3, "beginExtensionRequest")), {{3, rpc::InvalidParams}}},
    BadMessage{"NewerMajorVersion", rpc::serialize(beginRequest(10, {}, "2.0")), {{10, rpc::UnsupportedProtocolVersion}}},
    BadMessage{"OlderMajorVersion", rpc::serialize(beginRequest(11, {}, "0.9")), {{11, rpc::UnsupportedProtocolVersion}}},
    BadMessage{"VersionWithoutMinor", rpc::serialize(beginRequest(12, {}, "1")), {{12, rpc::InvalidParams}}},
    BadMessage{"VersionWithThreeParts", rpc::serialize(beginRequest(13, {}, "1.0.1")), {{13, rpc::InvalidParams}}},
    BadMessage{"VersionANumber", rpc::serialize(beginRequest(14, {}, 1.0)), {{14, rpc::InvalidParams}}},
    BadMessage{"UnknownMethod", rpc::serialize(rpc::makeRequest(4, "doSomethingElse", QJsonObject{})), {{4, rpc::MethodNotFound}}},
    BadMessage{"RemovalAsARequest", rpc::serialize(rpc::makeRequest(5, "removeExtensionView")), {{5, rpc::InvalidRequest}}},
    BadMessage{"UnknownNotification", rpc::serialize(rpc::makeNotification("unknownNotification")), std::nullopt},
    BadMessage{"RequestAsANotification", rpc::serialize(rpc::makeNotification("beginExtensionRequest", QJsonObject{{"inputItems", QJsonArray{}}})), std::nullopt}),
    caseName);

// Any request of our major version is served, whatever its minor, and so is one without a version;
// the answer states our own.
class RuntimeVersionTest : public RuntimeTest, public ::testing::WithParamInterface<const char *> {};

TEST_P(RuntimeVersionTest, IsAcceptedWithOurVersionInTheAnswer)
{
    const QJsonValue version = *GetParam() ? QJsonValue(GetParam()) : QJsonValue(QJsonValue::Undefined);
    begin(1, {textItem("ZafVideoEditorExtensionMovieURLKey", "/tmp/m.mp4")}, version);
}

INSTANTIATE_TEST_SUITE_P(Versions, RuntimeVersionTest, ::testing::Values("", "1.0", "1.7", "01.0"));

// A refusal for the version leaves the request to be asked again: the same message in our version
// then goes through.
TEST_F(RuntimeTest, ARefusedVersionTellsOursInTheErrorsData)
{
    pair.writeMessage(beginRequest(3, {}, "2.1"));
    const QList<QJsonObject> answers = pair.readMessages(1);
    ASSERT_EQ(answers.size(), 1);
    EXPECT_EQ(answers[0]["error"].toObject()["data"].toObject(), (QJsonObject{{"protocolVersion", "1.0"}}));
    EXPECT_TRUE(answers[0]["error"].toObject()["message"].toString().contains("2.1"));
    begin(4);
}

TEST_F(RuntimeTest, SecondRequestIsRefused)
{
    begin();
    pair.writeMessage(beginRequest(9, QJsonArray{}));
    EXPECT_EQ(pair.readMessages(1), QList<QJsonObject>{rpc::makeError(9, rpc::InvalidRequest, "request already begun")});
    EXPECT_EQ(runtime->context()->inputItems().size(), 3);
    EXPECT_EQ(finishedCount, 0);
}

TEST_F(RuntimeTest, ProxyDeliversOneWayMessagesFromAnyThread)
{
    begin();
    const auto proxy = recordingProxy();
    proxy->sendOneWay(kReportMethod, QJsonArray{QJsonArray{"save", "save"}});
    std::thread worker([proxy] { proxy->sendOneWay(kReportMethod, QJsonArray{QJsonArray{}}); });
    worker.join();
    EXPECT_EQ(pair.readMessages(2), (QList<QJsonObject>{rpc::makeNotification(kReportMethod, QJsonArray{QJsonArray{"save", "save"}}),
                                                        rpc::makeNotification(kReportMethod, QJsonArray{QJsonArray{}})}));
    EXPECT_TRUE(errors.isEmpty());
    // Each call makes a new proxy.
    EXPECT_NE(runtime->context()->remoteObjectProxyWithErrorHandler({}), proxy);
}

TEST_F(RuntimeTest, ProxyRefusesAMethodTheHostDoesNotDeclare)
{
    begin();
    recordingProxy()->sendOneWay("somethingUndeclared", QJsonArray{});
    ASSERT_EQ(errors.size(), 1);
    EXPECT_EQ(errors[0].code, EINVAL);
    EXPECT_TRUE(pair.nothingToRead());
}

TEST_F(RuntimeTest, ProxyReportsTheWriteErrorOnceTheHostHasGone)
{
    begin();
    const auto proxy = recordingProxy();
    pair.closeHost();
    proxy->sendOneWay(kReportMethod, QJsonArray{QJsonArray{"late"}});
    ASSERT_EQ(errors.size(), 1);
    EXPECT_TRUE(errors[0].code == EPIPE || errors[0].code == ECONNRESET) << errors[0].code;
}

TEST(RuntimeStart, FailsWithoutAPrincipal)
{
    SocketPair pair;
    ExtensionDeclaration noPrincipal;
    noPrincipal.principalClassName = "Missing";
    ExtensionRuntime runtime(pair.releaseExtensionFd(), noPrincipal);
    QString error;
    EXPECT_FALSE(runtime.start(&error));
    EXPECT_TRUE(error.contains("Missing"));
}

TEST(RuntimeStart, FailsWithoutADescriptor)
{
    ExtensionDeclaration declaration;
    declaration.makePrincipal = [] { return new zaf::ui::ViewController; };
    ExtensionRuntime runtime(-1, declaration);
    EXPECT_FALSE(runtime.start());
    EXPECT_EQ(runtime.principal(), nullptr);
}

// The extension main routine refuses a missing or unusable channel descriptor: it returns before
// any application object is made, so it runs inside this test program.
struct ChannelVariable { const char *name; std::optional<QByteArray> value; const char *reason; };

class ExtensionMainTest : public ::testing::TestWithParam<ChannelVariable> {};

TEST_P(ExtensionMainTest, ExitsWithCodeTwoWhenTheDescriptorIsUnusable)
{
    const auto unset = qScopeGuard([] { qunsetenv(kChannelFdEnvironmentVariable); });
    const std::optional<QByteArray> &value = GetParam().value;
    value ? qputenv(kChannelFdEnvironmentVariable, *value) : qunsetenv(kChannelFdEnvironmentVariable);
    QString error;
    EXPECT_EQ(channelFdFromEnvironment(&error), -1);
    EXPECT_TRUE(error.contains(GetParam().reason)) << error.toStdString();
    char name[] = "zaf-test-extension";
    char *argv[] = {name, nullptr};
    EXPECT_EQ(extensionMain(1, argv, ExtensionDeclaration{}), kExitCodeNoChannel);
}

// A descriptor of /dev/null, open for the whole program.
QByteArray devNull()
{
    static const int fd = ::open("/dev/null", O_RDONLY | O_CLOEXEC);
    return QByteArray::number(fd);
}

INSTANTIATE_TEST_SUITE_P(Values, ExtensionMainTest, ::testing::Values(
    ChannelVariable{"Unset", std::nullopt, "is not set"},
    ChannelVariable{"Empty", "", "is not set"},
    ChannelVariable{"AWord", "three", "not a descriptor number"},
    ChannelVariable{"Negative", "-1", "not a descriptor number"},
    ChannelVariable{"TrailingLetter", "3x", "not a descriptor number"},
    ChannelVariable{"NoOpenDescriptor", "1048576", "names no open descriptor"},
    ChannelVariable{"NotASocket", devNull(), "is not a socket"}), caseName);

TEST(ExtensionMain, ChannelDescriptorNamingASocketIsTaken)
{
    const auto unset = qScopeGuard([] { qunsetenv(kChannelFdEnvironmentVariable); });
    SocketPair pair;
    qputenv(kChannelFdEnvironmentVariable, QByteArray::number(pair.extensionFd()));
    QString error;
    EXPECT_EQ(channelFdFromEnvironment(&error), pair.extensionFd()) << error.toStdString();
}
