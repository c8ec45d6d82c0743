// A sign-in kept from an earlier publish, through the real secret store: the test runs on a session
// bus of its own with gnome-keyring's Secret Service (unlocked) and the loopback server's token
// endpoint. A kept refresh token signs in without the browser; one the service refuses is forgotten
// and the browser takes over.
#include "publishing/plugin/signin/refresh_token_store.h"
#include "tests/publishing/agent_test_support.h"
#include "tests/publishing/upload_test_server.h"
#include "tests/support/named_cases.h"
#include "tests/support/temp_dir.h"
#include "tests/support/wait_until.h"

#include <QFile>
#include <QProcess>
#include <QStandardPaths>

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>

namespace zaf::test {
namespace {

ZAF_PRINT_CASES_AS_NAMES

// A session bus with an unlocked keyring for the whole program: set up before anything in the
// process speaks D-Bus, as the bus address is read on first use.
class PrivateSecretStore : public ::testing::Environment {
public:
    static bool ready() { return !s_skipReason || s_skipReason->isEmpty(); }
    static QString skipReason() { return s_skipReason ? *s_skipReason : QString(); }

    void SetUp() override
    {
        s_skipReason = std::make_unique<QString>();
        for (const char *tool : {"dbus-daemon", "gnome-keyring-daemon"}) {
            if (QStandardPaths::findExecutable(QLatin1String(tool)).isEmpty()) {
                *s_skipReason = QStringLiteral("%1 is not installed").arg(QLatin1String(tool));
                return;
            }
        }
        m_home = std::make_unique<ScratchDir>();
        qputenv("HOME", QFile::encodeName(m_home->path()));
        qputenv("XDG_DATA_HOME", QFile::encodeName(m_home->file(QStringLiteral("data"))));
        qputenv("XDG_RUNTIME_DIR", QFile::encodeName(m_home->path()));
        m_bus.start(QStringLiteral("dbus-daemon"), {QStringLiteral("--session"), QStringLiteral("--nofork"), QStringLiteral("--print-address=1")});
        if (!m_bus.waitForReadyRead(10000)) {
            *s_skipReason = QStringLiteral("the session bus did not start");
            return;
        }
        qputenv("DBUS_SESSION_BUS_ADDRESS", m_bus.readLine().trimmed());
        m_keyring.start(QStringLiteral("gnome-keyring-daemon"), {QStringLiteral("--foreground"), QStringLiteral("--unlock"),
                                                                 QStringLiteral("--components=secrets")});
        m_keyring.write("test-password");
        m_keyring.closeWriteChannel();
        if (!m_keyring.waitForStarted(10000))
            *s_skipReason = QStringLiteral("gnome-keyring-daemon did not start");
    }
    void TearDown() override
    {
        for (QProcess *process : {&m_keyring, &m_bus}) {
            process->terminate();
            if (!process->waitForFinished(5000)) {
                process->kill();
                process->waitForFinished(5000);
            }
        }
    }

private:
    static inline std::unique_ptr<QString> s_skipReason;
    std::unique_ptr<ScratchDir> m_home;
    QProcess m_bus;
    QProcess m_keyring;
};

const auto *const kStore = ::testing::AddGlobalTestEnvironment(new PrivateSecretStore);

// Keeps `token` for the test client in the store, and reads it back.
QString keep(const QString &token)
{
    std::optional<OptionalError> stored;
    publishing::storeRefreshToken(QStringLiteral("test-client"), token, [&](OptionalError e) { stored = e; });
    waitUntil([&] { return stored.has_value(); }, 10000);
    return stored && !*stored ? token : QString();
}

QString kept()
{
    std::optional<QString> token;
    publishing::readRefreshToken(QStringLiteral("test-client"), [&](const QString &t) { token = t; });
    waitUntil([&] { return token.has_value(); }, 10000);
    return token.value_or(QStringLiteral("(no answer)"));
}

struct KeptSignIn {
    const char *name;
    const char *keptToken;     // in the store before Publish
    bool serviceAcceptsIt;     // the token endpoint refreshes it
    int browserOpenings;       // then
    const char *keptAfterwards;
    bool serviceUnreachable = false; // the token endpoint is a closed port
};

class KeptSignInTest : public ::testing::TestWithParam<KeptSignIn> {};

TEST_P(KeptSignInTest, IsRefreshedOrGivesWayToTheBrowser)
{
    if (!PrivateSecretStore::ready())
        GTEST_SKIP() << PrivateSecretStore::skipReason().toStdString();
    const KeptSignIn &c = GetParam();
    ScratchDir scratch;
    qputenv("XDG_CONFIG_HOME", QFile::encodeName(scratch.file(QStringLiteral("config"))));
    UploadTestServer server(60, std::chrono::seconds(60));
    ASSERT_TRUE(server.listen());
    if (c.serviceAcceptsIt)
        server.setRefreshToken(c.keptToken);
    qputenv("ZAF_YOUTUBE_API_BASE", server.baseUrl().toString().toUtf8());
    qputenv("ZAF_YOUTUBE_TOKEN_URL", c.serviceUnreachable ? "http://127.0.0.1:9/token" : server.tokenUrl().toString().toUtf8());
    SignInEnvironment signIn;
    ASSERT_EQ(keep(QLatin1String(c.keptToken)), QLatin1String(c.keptToken)) << "the keyring keeps a token";

    std::unique_ptr<ZafPublishingAgent> agent = makeAgent();
    ASSERT_NE(agent, nullptr);
    RecordingDelegate delegate;
    agent->setDelegate(&delegate);
    ui::ViewController *form = formOf(agent.get());
    ASSERT_NE(form, nullptr);
    QMetaObject::invokeMethod(form, "setTitle", Q_ARG(QString, QStringLiteral("Kept sign-in")));
    QFile movie(scratch.file(QStringLiteral("movie.mp4")));
    ASSERT_TRUE(movie.open(QIODevice::WriteOnly) && movie.write(QByteArray(200 * 1024, 'v')) > 0);
    movie.close();
    agent->setMediaPath(movie.fileName());
    ASSERT_TRUE(agent->setProperty("signInTimeoutMs", 2000));
    ASSERT_TRUE(QMetaObject::invokeMethod(agent.get(), "publishAction"));

    ASSERT_TRUE(waitUntil([&] { return delegate.events.contains(QStringLiteral("end")); }, 20000));
    EXPECT_EQ(signIn.browser.opened.size(), c.browserOpenings);
    EXPECT_EQ(delegate.error.has_value(), !c.serviceAcceptsIt) << (delegate.error ? delegate.error->message.toStdString() : "");
    const auto tokenRequests = std::count_if(server.requests().begin(), server.requests().end(),
                                             [](const UploadTestServer::Request &r) { return r.path.endsWith(QLatin1String("/token")); });
    EXPECT_EQ(tokenRequests, c.serviceUnreachable ? 0 : 1) << "one refresh at the token endpoint";
    EXPECT_EQ(kept(), QLatin1String(c.keptAfterwards));
    qunsetenv("ZAF_YOUTUBE_API_BASE");
    qunsetenv("ZAF_YOUTUBE_TOKEN_URL");
}

INSTANTIATE_TEST_SUITE_P(SignIns, KeptSignInTest, ::testing::Values(
    // Refreshed at the token endpoint: the upload goes out with the new access token, no browser.
    KeptSignIn{"Accepted", "kept-refresh-token", true, 0, "kept-refresh-token"},
    // Revoked: forgotten, and the browser opens (the test's browser never comes back, so the
    // sign-in runs out of time).
    KeptSignIn{"Revoked", "revoked-refresh-token", false, 1, ""},
    // The service out of reach: publishing ends with that error and the sign-in stays kept.
    KeptSignIn{"ServiceUnreachable", "kept-while-offline", false, 0, "kept-while-offline", true}),
    caseName);

} // namespace
} // namespace zaf::test
