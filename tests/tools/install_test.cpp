// The installed application: `cmake --install` into a scratch prefix lays out what the programs need,
// and the installed programs find it from their own place, with no ZAF_* variable set.
#include "platform/install_layout.h"
#include "tests/support/child_process.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/named_cases.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QProcessEnvironment>
#include <QStandardPaths>

#include <gtest/gtest.h>

#include <vector>

namespace zaf::test {
namespace {

ZAF_PRINT_CASES_AS_NAMES

// Installs the build once per process into a scratch prefix.
const QString &installedPrefix()
{
    static ScratchDir scratch;
    static const QString prefix = [] {
        const QString into = scratch.file(QStringLiteral("prefix"));
        const ChildRun install = runChild(QStringLiteral("cmake"), {QStringLiteral("--install"), QStringLiteral(ZAF_BINARY_DIR),
                                                                    QStringLiteral("--prefix"), into});
        EXPECT_TRUE(install.ok()) << install.error.toStdString() << install.err.toStdString();
        return install.ok() ? into : QString();
    }();
    return prefix;
}

// The environment of a user's session: the test's own without any ZAF_* variable.
QStringList userEnvironment()
{
    QStringList environment;
    for (const QString &entry : QProcessEnvironment::systemEnvironment().toStringList()) {
        if (!entry.startsWith(QLatin1String("ZAF_")))
            environment.append(entry);
    }
    return environment;
}

struct InstalledFile {
    const char *name;
    const char *path; // under the prefix
    bool executable;
};

class InstalledFileTest : public ::testing::TestWithParam<InstalledFile> {};

TEST_P(InstalledFileTest, IsInItsPlace)
{
    const InstalledFile &c = GetParam();
    ASSERT_FALSE(installedPrefix().isEmpty());
    const QFileInfo file(QDir(installedPrefix()).filePath(QLatin1String(c.path)));
    EXPECT_TRUE(file.isFile()) << c.path;
    EXPECT_EQ(file.isExecutable(), c.executable) << c.path;
}

INSTANTIATE_TEST_SUITE_P(
    Layout, InstalledFileTest,
    ::testing::Values(InstalledFile{"Host", "bin/zaf-host", true}, InstalledFile{"MediaTool", "bin/zaf-media", true},
                      InstalledFile{"TempStoreTool", "bin/zaf-tempstore", true}, InstalledFile{"IdentityTool", "bin/zaf-identity", true},
                      InstalledFile{"YouTubeSetupTool", "bin/zaf-youtube-setup", true},
                      InstalledFile{"Extension", "libexec/zafrel/zaf-video-editor-extension", true},
                      InstalledFile{"AgentLibrary", "lib/zafrel/libzaf_publishing_agent.so", false},
                      InstalledFile{"UploaderPlugIn", "lib/zafrel/plugins/libzaf_publishing_plugin.so", false},
                      InstalledFile{"FrameworkStrings", "share/zafrel/Zafrel/en.lproj/Localizable.mo", false},
                      InstalledFile{"PhotoLibraryStrings", "share/zafrel/ZafPhotoLibrary/de.lproj/PhotoLibrary.mo", false},
                      InstalledFile{"DesktopEntry", "share/applications/com.zafrel.VideoEditor.desktop", false},
                      InstalledFile{"Metainfo", "share/metainfo/com.zafrel.VideoEditor.metainfo.xml", false},
                      InstalledFile{"Icon", "share/icons/hicolor/scalable/apps/com.zafrel.VideoEditor.svg", false},
                      InstalledFile{"HostLibrary", "lib/libzafrel-host.so.1", false},
                      InstalledFile{"HostLibraryHeader", "include/zafrel/host.h", false},
                      InstalledFile{"HostLibraryPkgConfig", "lib/pkgconfig/zafrel-host.pc", false},
                      InstalledFile{"WatchService", "lib/systemd/user/zafrel-watch.service", false}),
    caseName);

struct PrefixCase {
    const char *name;
    const char *executable; // under a scratch folder
    bool withData;          // the folder holds share/zafrel
    const char *prefix;     // expected, under the scratch folder; nullptr: none
};

class InstallPrefixTest : public ::testing::TestWithParam<PrefixCase> {};

// A program finds the prefix it is installed under from its own place, and a build tree is none.
TEST_P(InstallPrefixTest, ComesFromTheProgramsPlace)
{
    const PrefixCase &c = GetParam();
    ScratchDir scratch;
    const QString executable = scratch.file(QLatin1String(c.executable));
    QDir().mkpath(QFileInfo(executable).absolutePath());
    QFile file(executable);
    ASSERT_TRUE(file.open(QIODevice::WriteOnly));
    file.close();
    if (c.withData)
        QDir().mkpath(scratch.file(QStringLiteral("usr/share/zafrel")));
    const QString expected = c.prefix ? QFileInfo(scratch.file(QLatin1String(c.prefix))).canonicalFilePath() : QString();
    EXPECT_EQ(zaf::install::installPrefixOf(executable), expected);
}

INSTANTIATE_TEST_SUITE_P(Places, InstallPrefixTest,
                         ::testing::Values(PrefixCase{"ProgramInBin", "usr/bin/zaf-host", true, "usr"},
                                           PrefixCase{"ExtensionInLibexec", "usr/libexec/zafrel/zaf-video-editor-extension", true, "usr"},
                                           PrefixCase{"BinWithoutOurData", "usr/bin/zaf-host", false, nullptr},
                                           PrefixCase{"BuildTree", "usr/host/zaf-host", true, nullptr}),
                         caseName);

struct ValidatorCase {
    const char *name;
    const char *program;
    std::vector<const char *> options;
    const char *path; // under the prefix
    bool silent = false; // warnings (on standard error) fail it too
};

class InstalledDescriptionTest : public ::testing::TestWithParam<ValidatorCase> {};

// The desktop entry, the metainfo and the user service pass the desktop's own validators.
TEST_P(InstalledDescriptionTest, PassesItsValidator)
{
    const ValidatorCase &c = GetParam();
    if (QStandardPaths::findExecutable(QLatin1String(c.program)).isEmpty())
        GTEST_SKIP() << c.program << " is not installed";
    ASSERT_FALSE(installedPrefix().isEmpty());
    QStringList args;
    for (const char *option : c.options)
        args << QLatin1String(option);
    const QString path = QDir(installedPrefix()).filePath(QLatin1String(c.path));
    // A runtime folder of its own: the service manager's checker needs one (mode 0700).
    ScratchDir runtime;
    QFile::setPermissions(runtime.path(), QFileDevice::ReadOwner | QFileDevice::WriteOwner | QFileDevice::ExeOwner);
    ChildOptions options;
    options.environment = QProcessEnvironment::systemEnvironment().toStringList() << QStringLiteral("XDG_RUNTIME_DIR=") + runtime.path();
    const ChildRun check = runChild(QLatin1String(c.program), args << path, options);
    EXPECT_TRUE(check.ok()) << check.out.toStdString() << check.err.toStdString();
    if (c.silent) {
        EXPECT_EQ(check.err.toStdString(), "");
    }
}

INSTANTIATE_TEST_SUITE_P(Validators, InstalledDescriptionTest,
                         ::testing::Values(ValidatorCase{"DesktopEntry", "desktop-file-validate", {}, "share/applications/com.zafrel.VideoEditor.desktop"},
                                           ValidatorCase{"Metainfo", "appstreamcli", {"validate", "--no-net"}, "share/metainfo/com.zafrel.VideoEditor.metainfo.xml"},
                                           ValidatorCase{"UserService", "systemd-analyze", {"verify", "--user"}, "lib/systemd/user/zafrel-watch.service", true}),
                         caseName);

TEST(InstalledPrograms, DesktopEntryOpensMoviesWithTheInstalledHost)
{
    ASSERT_FALSE(installedPrefix().isEmpty());
    QFile entry(QDir(installedPrefix()).filePath(QStringLiteral("share/applications/com.zafrel.VideoEditor.desktop")));
    ASSERT_TRUE(entry.open(QIODevice::ReadOnly));
    const QString text = QString::fromUtf8(entry.readAll());
    EXPECT_TRUE(text.contains(QStringLiteral("\nExec=") + QDir(installedPrefix()).filePath(QStringLiteral("bin/zaf-host")) + QStringLiteral(" --open %f\n")))
        << text.toStdString();
    EXPECT_TRUE(text.contains(QStringLiteral("\nMimeType=video/mp4;video/quicktime;\n"))) << text.toStdString();
}

// The setup tool writes the OAuth client into the user's settings, readable by the user alone,
// replaces it when run again, refuses a malformed id without losing the one set up, and says what
// is set up.
TEST(InstalledPrograms, YouTubeSetupKeepsTheClientInTheUsersSettings)
{
    ASSERT_FALSE(installedPrefix().isEmpty());
    ScratchDir config;
    ChildOptions options;
    options.environment = userEnvironment() << QStringLiteral("XDG_CONFIG_HOME=") + config.path();
    const QString tool = QDir(installedPrefix()).filePath(QStringLiteral("bin/zaf-youtube-setup"));
    const QString settings = config.file(QStringLiteral("zafrel/youtube-client.ini"));
    auto setup = [&](const QStringList &args) { return runChild(tool, args, options); };

    EXPECT_TRUE(setup({QStringLiteral("--client-id"), QStringLiteral("old.apps.googleusercontent.com")}).ok());
    const ChildRun written = setup({QStringLiteral("--client-id"), QStringLiteral("1234-abcd.apps.googleusercontent.com"),
                                    QStringLiteral("--client-secret"), QStringLiteral("GOCSPX-secret")});
    ASSERT_TRUE(written.ok()) << written.err.toStdString();
    EXPECT_EQ(QFileInfo(settings).permissions() & (QFileDevice::ReadGroup | QFileDevice::ReadOther | QFileDevice::WriteGroup | QFileDevice::WriteOther),
              QFileDevice::Permissions());
    const ChildRun refused = setup({QStringLiteral("--client-id"), QStringLiteral("not an id")});
    EXPECT_EQ(refused.exitCode, 1);
    const ChildRun shown = setup({});
    ASSERT_TRUE(shown.ok()) << shown.err.toStdString();
    EXPECT_TRUE(shown.out.contains("1234-abcd.apps.googleusercontent.com (with a secret)")) << shown.out.toStdString();
    EXPECT_EQ(QDir(config.file(QStringLiteral("zafrel"))).entryList(QDir::Files | QDir::Hidden), QStringList{QStringLiteral("youtube-client.ini")})
        << "no temporary is left";
}

struct SecretStoreCase {
    const char *name;
    bool withKeyring; // a session bus with gnome-keyring's Secret Service, unlocked
    int status;
    const char *says;
};

class SecretStoreTest : public ::testing::TestWithParam<SecretStoreCase> {};

// A sign-in is kept, read back and forgotten through the desktop's secret store when there is one,
// and without one the setup tool says so rather than pretending.
TEST_P(SecretStoreTest, SetupToolTellsWhetherSignInsCanBeKept)
{
    const SecretStoreCase &c = GetParam();
    if (c.withKeyring) {
        for (const char *tool : {"dbus-run-session", "gnome-keyring-daemon"}) {
            if (QStandardPaths::findExecutable(QLatin1String(tool)).isEmpty())
                GTEST_SKIP() << tool << " is not installed";
        }
    }
    ASSERT_FALSE(installedPrefix().isEmpty());
    ScratchDir home;
    ChildOptions options;
    QStringList environment;
    for (const QString &entry : userEnvironment()) {
        if (!entry.startsWith(QLatin1String("DBUS_SESSION_BUS_ADDRESS=")) && !entry.startsWith(QLatin1String("DISPLAY="))
            && !entry.startsWith(QLatin1String("HOME=")) && !entry.startsWith(QLatin1String("XDG_")))
            environment << entry;
    }
    options.environment = environment << QStringLiteral("HOME=") + home.path();
    const QString tool = QDir(installedPrefix()).filePath(QStringLiteral("bin/zaf-youtube-setup"));
    const ChildRun check = c.withKeyring
        ? runChild(QStringLiteral("dbus-run-session"), {QStringLiteral("--"), QStringLiteral("sh"), QStringLiteral("-c"),
                   QStringLiteral("echo -n pw | gnome-keyring-daemon --unlock --components=secrets >/dev/null 2>&1; exec \"$0\" --check-secret-store"),
                   tool}, options)
        : runChild(tool, {QStringLiteral("--check-secret-store")}, options);
    EXPECT_EQ(check.exitCode, c.status) << check.out.toStdString() << check.err.toStdString();
    EXPECT_TRUE((check.out + check.err).contains(c.says)) << check.out.toStdString() << check.err.toStdString();
}

INSTANTIATE_TEST_SUITE_P(Stores, SecretStoreTest,
                         ::testing::Values(SecretStoreCase{"NoSecretService", false, 1, "cannot keep sign-ins"},
                                           SecretStoreCase{"GnomeKeyring", true, 0, "The secret store keeps sign-ins."}),
                         caseName);

// The installed media tool reads a movie from any folder, with nothing set.
TEST(InstalledPrograms, MediaToolProbesAMovie)
{
    ASSERT_FALSE(installedPrefix().isEmpty());
    const QString movie = sharedFixtureMovie({.seconds = 1});
    ChildOptions options;
    options.environment = userEnvironment();
    const ChildRun probe = runChild(QDir(installedPrefix()).filePath(QStringLiteral("bin/zaf-media")),
                                    {QStringLiteral("probe"), movie}, options);
    ASSERT_TRUE(probe.ok()) << probe.err.toStdString();
    EXPECT_TRUE(probe.out.contains("\"display_size\"")) << probe.out.toStdString();
}

// The example host in C++, built from examples/cpp-host with the installed library found by pkg-config
// alone (an rpath to its folder, since a scratch prefix is not on the loader's path). Empty, with
// the reason in `error`, when it cannot be built.
QString buildExampleHost(const ScratchDir &scratch, QString *error)
{
    const QString prefix = installedPrefix();
    const QString source = QStringLiteral(ZAF_SOURCE_DIR "/examples/cpp-host");
    const QString into = scratch.file(QStringLiteral("cpp-host"));
    QDir().mkpath(into);
    for (const QString &name : QDir(source).entryList(QDir::Files))
        QFile::copy(QDir(source).filePath(name), QDir(into).filePath(name));
    QStringList environment = QProcessEnvironment::systemEnvironment().toStringList();
    environment << QStringLiteral("PKG_CONFIG_PATH=%1/lib/pkgconfig").arg(prefix);
    ChildOptions options;
    options.environment = environment;
    options.mergeErrorIntoOutput = true;
    const ChildRun make = runChild(QStringLiteral("make"), {QStringLiteral("-C"), into, QStringLiteral("LDFLAGS=-Wl,-rpath,%1/lib").arg(prefix)}, options);
    if (!make.ok()) {
        *error = QString::fromUtf8(make.out) + make.error;
        return {};
    }
    return QDir(into).filePath(QStringLiteral("zafrel_example_host"));
}

// An installed host finds the installed extension and presents the editor on a recording under
// Xvfb; Escape cancels it, the host reads the empty report, and the temporary root is left empty.
// Both the installed zaf-host and the example host built against the installed library.
class InstalledHostTest : public ::testing::TestWithParam<const char *> {};

TEST_P(InstalledHostTest, PresentsTheEditorAndReadsTheReportWhenTheUserCancels)
{
    for (const char *tool : {"xvfb-run", "Xvfb", "xdotool", "make", "c++", "pkg-config"}) {
        if (QStandardPaths::findExecutable(QLatin1String(tool)).isEmpty())
            GTEST_SKIP() << tool << " is not installed; the installed run needs an X server, xdotool and a C++ toolchain";
    }
    ASSERT_FALSE(installedPrefix().isEmpty());
    ScratchDir scratch;
    QString host = QDir(installedPrefix()).filePath(QStringLiteral("bin/zaf-host"));
    if (QLatin1String(GetParam()) == QLatin1String("ExampleHostBuiltWithPkgConfig")) {
        QString error;
        host = buildExampleHost(scratch, &error);
        ASSERT_FALSE(host.isEmpty()) << error.toStdString();
    }
    ChildOptions options;
    options.timeoutMs = 240000;
    options.forwardOutput = true;
    const ChildRun script = runChild(QStringLiteral("bash"), {QStringLiteral(ZAF_WHOLE_PROCESS_SCRIPT), host, QStringLiteral("installed"),
                                                              QStringLiteral(ZAF_FIXTURE_BIN), scratch.path(), QStringLiteral("cancel")}, options);
    ASSERT_TRUE(script.ok()) << script.error.toStdString();
    auto read = [&](const char *name) {
        QFile file(scratch.file(QLatin1String(name)));
        return file.open(QIODevice::ReadOnly) ? QString::fromUtf8(file.readAll()) : QString();
    };
    ASSERT_EQ(read("result").trimmed(), QStringLiteral("ok")) << read("host.err").toStdString();
    EXPECT_EQ(read("host.status").trimmed(), QStringLiteral("0")) << read("host.err").toStdString();
    EXPECT_EQ(read("host.out"), QStringLiteral("[]\n"));
    const QDir temporaryRoot(scratch.file(QStringLiteral("home/.cache/Zafrel")));
    EXPECT_TRUE(temporaryRoot.exists()) << "the installed extension made its temporary root in the user's cache";
    EXPECT_EQ(temporaryRoot.entryList(QDir::Files | QDir::Hidden | QDir::System), QStringList());
}

INSTANTIATE_TEST_SUITE_P(Hosts, InstalledHostTest, ::testing::Values("InstalledZafHost", "ExampleHostBuiltWithPkgConfig"),
                         [](const auto &info) { return std::string(info.param); });

} // namespace
} // namespace zaf::test
