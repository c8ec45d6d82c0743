// zaf-host, run as a host application runs it, with the fake extension behind it: argument
// errors, the printed reports, and the exit status for each way the extension can end.
#include "tests/support/child_process.h"
#include "tests/support/temp_dir.h"

#include <QProcessEnvironment>

#include <gtest/gtest.h>

namespace zaf::test {
namespace {

struct HostRun { int exitCode = -1; QString out; QString err; };

// Runs zaf-host with `args`, the fake's steps and (when not empty) $ZAF_EXTENSION_PATH.
HostRun runHost(const QStringList &args, const QString &fakeSteps = {}, const QString &extensionPath = {})
{
    QProcessEnvironment environment = QProcessEnvironment::systemEnvironment();
    environment.insert("ZAF_FAKE_STEPS", fakeSteps);
    environment.remove("ZAF_EXTENSION_PATH");
    if (!extensionPath.isEmpty())
        environment.insert("ZAF_EXTENSION_PATH", extensionPath);
    zaf::test::ChildOptions options;
    options.timeoutMs = 60000;
    options.environment = environment.toStringList();
    const zaf::test::ChildRun run = zaf::test::runChild(ZAF_HOST_BIN, args, options);
    if (!run.started || run.timedOut) {
        ADD_FAILURE() << "zaf-host did not run to its end: " << args.join(' ').toStdString() << ": " << run.error.toStdString();
        return {};
    }
    return {run.exitCode, QString::fromUtf8(run.out), QString::fromUtf8(run.err)};
}

class ZafHostCli : public ::testing::Test {
protected:
    ScratchDir m_scratch;
    QString m_movie = m_scratch.write("movie.mp4", 100);
    QStringList m_base{"--movie", m_movie, "--app-name", "Recorder", "--bundle-id", "org.example.Recorder"};
    QStringList m_withFake = m_base + QStringList{"--extension", ZAF_FAKE_EXTENSION_BIN};
};

TEST_F(ZafHostCli, FailuresExitNonZeroAndSayWhatWentWrong)
{
    // Status 2 for argument errors, 1 when the extension cannot run or ends without a clean report.
    const struct {
        QStringList args;
        const char *steps;
        const char *extensionPath;
        int exitCode;
        const char *expected;
    } cases[] = {
        {{"--app-name", "A", "--bundle-id", "b.c"}, "", "", 2, "--movie is required"},
        {m_base.mid(0, 4), "", "", 2, "--bundle-id is required"},
        {m_base + QStringList{"--tint", "blue"}, "", "", 2, "blue"},
        {m_base + QStringList{"--frobnicate"}, "", "", 2, "frobnicate"},
        {m_base + QStringList{"stray"}, "", "", 2, "unexpected argument: stray"},
        {m_base + QStringList{"--movie", m_movie}, "", "", 2, "--movie is given more than once"},
        {{"--movie", m_scratch.file("absent.mp4"), "--app-name", "A", "--bundle-id", "b.c"}, "", "", 2, "is not a file"},
        {m_base + QStringList{"--attachment", m_scratch.file("absent.txt")}, "", "", 2, "is not a file"},
        {m_base + QStringList{"--extension", m_movie}, "", "", 1, "not an executable file"},
        {m_base, "", "/nowhere/zaf-extension", 1, "ZAF_EXTENSION_PATH"},
        {m_withFake, "accept exit 0", "", 1, "without reporting"},
        {m_withFake, "accept close exit 0", "", 1, "without reporting"},
        {m_withFake, "accept crash", "", 1, "died (signal 6)"},
        {m_withFake, "accept exit 5", "", 1, "exit status 5"},
        // A report followed by a crash is still a failure: the extension did not end cleanly.
        {m_withFake, "accept report - crash", "", 1, "died"},
        {m_withFake, "reject await-remove", "", 1, "refused the request"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE((c.args.join(' ') + " / " + c.steps).toStdString());
        const HostRun run = runHost(c.args, c.steps, c.extensionPath);
        EXPECT_EQ(run.exitCode, c.exitCode);
        EXPECT_TRUE(run.err.contains(c.expected)) << run.err.toStdString();
        if (!QString(c.steps).contains("report")) {
            EXPECT_TRUE(run.out.isEmpty()) << run.out.toStdString();
        }
    }
}

TEST_F(ZafHostCli, PrintsTheReportRemovesTheViewAndExitsZero)
{
    // The fake exits 0 only once it receives removeExtensionView. The extension is given on the
    // command line or found through $ZAF_EXTENSION_PATH.
    HostRun run = runHost(m_withFake + QStringList{"--tint", "#102030"}, "accept report com.zafrel.activity.SaveToPhotoLibrary,Mail await-remove");
    EXPECT_EQ(run.exitCode, 0) << run.err.toStdString();
    EXPECT_EQ(run.out, "[\"com.zafrel.activity.SaveToPhotoLibrary\",\"Mail\"]\n");

    run = runHost(m_base, "accept report - await-remove", ZAF_FAKE_EXTENSION_BIN);
    EXPECT_EQ(run.exitCode, 0) << run.err.toStdString();
    EXPECT_EQ(run.out, "[]\n");
}

} // namespace
} // namespace zaf::test
