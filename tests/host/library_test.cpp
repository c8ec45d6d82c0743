// The C host library, through its installed interface only, against the fake extension: a real
// process over a real socket pair, driven by poll() and dispatch as a program's own loop drives it.
#include "tests/support/named_cases.h"
#include "tests/support/temp_dir.h"

#include "zafrel/host.h"

#include <QByteArray>
#include <QFile>
#include <QJsonArray>
#include <QJsonDocument>
#include <QJsonObject>
#include <QStringList>

#include <gtest/gtest.h>

#include <cerrno>
#include <memory>

#include <poll.h>
#include <sys/wait.h>

namespace zaf::test {
namespace {

ZAF_PRINT_CASES_AS_NAMES

using Session = std::unique_ptr<zafrel_host_session, decltype(&zafrel_host_session_free)>;

Session newSession()
{
    return Session(zafrel_host_session_new(), &zafrel_host_session_free);
}

void addRequiredItems(zafrel_host_session *session)
{
    ASSERT_EQ(zafrel_host_session_add_item(session, ZAFREL_HOST_MOVIE_KEY, "/tmp/recording.mp4"), 0);
    ASSERT_EQ(zafrel_host_session_add_item(session, ZAFREL_HOST_APP_NAME_KEY, "Recorder"), 0);
    ASSERT_EQ(zafrel_host_session_add_item(session, ZAFREL_HOST_BUNDLE_IDENTIFIER_KEY, "org.example.Recorder"), 0);
}

// What the callbacks saw, as "accepted:1.0 reported:A,B finished:0".
struct Events {
    QStringList seen;
    static zafrel_host_callbacks callbacks()
    {
        return {[](void *self, const char *version) { static_cast<Events *>(self)->seen << QStringLiteral("accepted:%1").arg(version); },
                [](void *self, int code, const char *) { static_cast<Events *>(self)->seen << QStringLiteral("refused:%1").arg(code); },
                [](void *self, const char *const *types, size_t count) {
                    QStringList all;
                    for (size_t i = 0; i < count; ++i)
                        all << QString::fromUtf8(types[i]);
                    static_cast<Events *>(self)->seen << QStringLiteral("reported:%1").arg(all.join(','));
                },
                [](void *self, int status) { static_cast<Events *>(self)->seen << QStringLiteral("finished:%1").arg(status); }};
    }
};

// Starts the fake with `steps` (it reads them from the environment: a session passes no arguments).
int start(zafrel_host_session *session, const char *steps, Events *events)
{
    qputenv("ZAF_FAKE_STEPS", steps);
    const zafrel_host_callbacks callbacks = Events::callbacks();
    const int started = zafrel_host_session_start(session, ZAF_FAKE_EXTENSION_BIN, &callbacks, events);
    qunsetenv("ZAF_FAKE_STEPS");
    return started;
}

// True when this process has no child left, reaped or not.
bool noChildLeft()
{
    int status = 0;
    return ::waitpid(-1, &status, WNOHANG) < 0 && errno == ECHILD;
}

// A run to the end with zafrel_host_session_run (which removes the view after a report or a
// refusal): the callbacks in order and run's result. The fake's await-remove exits 3 when the
// channel ends without the removal, so a 0 there says the removal arrived.
struct Run {
    const char *name;
    const char *steps;
    const char *events;
    int status;
    int shareMessageBytes = 0; // a share message this long: a request far above a socket buffer
};

class HostLibraryRunTest : public ::testing::TestWithParam<Run> {};

TEST_P(HostLibraryRunTest, CallsBackInOrderAndReapsTheExtension)
{
    Session session = newSession();
    addRequiredItems(session.get());
    if (GetParam().shareMessageBytes > 0) {
        const QByteArray message(GetParam().shareMessageBytes, 'm');
        ASSERT_EQ(zafrel_host_session_add_item(session.get(), ZAFREL_HOST_SHARE_MESSAGE_KEY, message.constData()), 0);
    }
    Events events;
    ASSERT_EQ(start(session.get(), GetParam().steps, &events), 0) << zafrel_host_session_error(session.get());
    EXPECT_EQ(zafrel_host_session_run(session.get()), GetParam().status);
    EXPECT_EQ(events.seen.join(' ').toStdString(), GetParam().events);
    EXPECT_EQ(zafrel_host_session_dispatch(session.get()), 0) << "a finished session stays finished";
    EXPECT_TRUE(noChildLeft());
}

INSTANTIATE_TEST_SUITE_P(Runs, HostLibraryRunTest, ::testing::Values(
    Run{"ReportThenRemoval", "accept report A,B await-remove", "accepted:1.0 reported:A,B finished:0", 0},
    Run{"NothingDone", "accept report - await-remove", "accepted:1.0 reported: finished:0", 0},
    Run{"ReportRightBeforeExit", "accept report A exit 0", "accepted:1.0 reported:A finished:0", 0},
    Run{"Refused", "reject await-remove", "refused:-32602 finished:0", 0},
    Run{"GarbageIsSkipped", "accept send not-json{ report x await-remove", "accepted:1.0 reported:x finished:0", 0},
    Run{"ACallIsAnswered", R"(accept send {"jsonrpc":"2.0","id":7,"method":"m"} expect-error report x await-remove)",
        "accepted:1.0 reported:x finished:0", 0},
    Run{"LengthAboveTheCapEndsTheChannel", "accept oversized report too.late await-eof", "accepted:1.0 finished:0", 0},
    Run{"Crash", "accept crash", "accepted:1.0 finished:134", 134},
    Run{"RequestLargerThanTheSocketTakes", "accept report A await-remove", "accepted:1.0 reported:A finished:0", 0, 900 * 1024}),
    caseName);

TEST(HostLibraryRequest, CarriesTheItemsAndOurProtocolVersion)
{
    ScratchDir scratch;
    qputenv("ZAF_FAKE_DUMP", scratch.file("request.json").toUtf8());
    Session session = newSession();
    addRequiredItems(session.get());
    ASSERT_EQ(zafrel_host_session_add_item(session.get(), ZAFREL_HOST_TINT_COLOR_KEY, "#11aa33"), 0);
    ASSERT_EQ(zafrel_host_session_add_item(session.get(), ZAFREL_HOST_APP_NAME_KEY, "Renamed"), 0); // the last value wins
    Events events;
    ASSERT_EQ(start(session.get(), "accept exit 0", &events), 0);
    EXPECT_EQ(zafrel_host_session_run(session.get()), 0);
    qunsetenv("ZAF_FAKE_DUMP");

    QFile file(scratch.file("request.json"));
    ASSERT_TRUE(file.open(QIODevice::ReadOnly));
    const QJsonObject params = QJsonDocument::fromJson(file.readAll()).object().value("request").toObject().value("params").toObject();
    EXPECT_EQ(params.value("protocolVersion"), ZAFREL_HOST_PROTOCOL_VERSION);
    QStringList titles;
    for (const QJsonValue &item : params.value("inputItems").toArray())
        titles << item.toObject().value("title").toString() + '=' + item.toObject().value("attachments").toArray().at(0).toObject().value("value").toString();
    EXPECT_EQ(titles, (QStringList{"ZafVideoEditorExtensionMovieURLKey=/tmp/recording.mp4",
                                   "ZafVideoEditorExtensionBundleIdentifierKey=org.example.Recorder",
                                   "ZafVideoEditorExtensionOverrideTintColorKey=#11AA33", "ZafVideoEditorExtensionAppNameKey=Renamed"}));
}

// What a program can get wrong is refused with a reason, and nothing is started.
struct Misuse {
    const char *name;
    bool requiredItems;
    const char *key;   // an extra item; nullptr: none
    const char *value;
    const char *extension;
    const char *reason;
};

class HostLibraryMisuseTest : public ::testing::TestWithParam<Misuse> {};

TEST_P(HostLibraryMisuseTest, IsRefusedWithAReason)
{
    const Misuse &c = GetParam();
    Session session = newSession();
    if (c.requiredItems)
        addRequiredItems(session.get());
    int result = c.key ? zafrel_host_session_add_item(session.get(), c.key, c.value) : 0;
    if (result == 0)
        result = zafrel_host_session_start(session.get(), c.extension, nullptr, nullptr);
    EXPECT_EQ(result, -1);
    EXPECT_TRUE(QString::fromUtf8(zafrel_host_session_error(session.get())).contains(c.reason)) << zafrel_host_session_error(session.get());
    EXPECT_EQ(zafrel_host_session_fd(session.get()), -1);
    EXPECT_EQ(zafrel_host_session_run(session.get()), -1);
    EXPECT_TRUE(noChildLeft());
}

INSTANTIATE_TEST_SUITE_P(Misuses, HostLibraryMisuseTest, ::testing::Values(
    Misuse{"NoMovie", false, ZAFREL_HOST_APP_NAME_KEY, "Recorder", ZAF_FAKE_EXTENSION_BIN, "ZafVideoEditorExtensionMovieURLKey is required"},
    Misuse{"TintNoColour", true, ZAFREL_HOST_TINT_COLOR_KEY, "teal", ZAF_FAKE_EXTENSION_BIN, "no colour"},
    Misuse{"EmptyKey", true, "", "x", ZAF_FAKE_EXTENSION_BIN, "needs a key"},
    Misuse{"ProgramCannotRun", true, nullptr, nullptr, "/nonexistent/zaf-extension", "/nonexistent/zaf-extension"}),
    caseName);

TEST(HostLibraryFree, EndsAnExtensionThatWillNotExitAndReapsIt)
{
    Session session = newSession();
    addRequiredItems(session.get());
    Events events;
    ASSERT_EQ(start(session.get(), "accept hang", &events), 0);
    while (events.seen.isEmpty()) {
        ASSERT_EQ(zafrel_host_session_dispatch(session.get()), 1);
        pollfd ready{zafrel_host_session_fd(session.get()), POLLIN, 0};
        ASSERT_GE(::poll(&ready, 1, 20000), 0);
    }
    EXPECT_EQ(events.seen, QStringList{"accepted:1.0"});
    EXPECT_EQ(zafrel_host_session_start(session.get(), ZAF_FAKE_EXTENSION_BIN, nullptr, nullptr), -1) << "a session starts once";
    session.reset();
    EXPECT_TRUE(noChildLeft());
    EXPECT_EQ(events.seen, QStringList{"accepted:1.0"}) << "freeing calls nothing back";
}

} // namespace
} // namespace zaf::test
