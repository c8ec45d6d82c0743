// zaf-host, run as a host application runs it, with the fake extension behind it: argument
// errors, the printed reports, and the exit status for each way the extension can end.
#include "tests/support/temp_dir.h"

#include <QProcess>
#include <QProcessEnvironment>

#include <gtest/gtest.h>

namespace zaf::test {
namespace {

struct HostRun {
    int exitCode = -1;
    QString out;
    QString err;
};

HostRun runHost(const QStringList &args, const QStringList &fakeSteps = {}, const QString &extensionPathVariable = {})
{
    QProcess process;
    QProcessEnvironment environment = QProcessEnvironment::systemEnvironment();
    environment.insert(QStringLiteral("ZAF_FAKE_STEPS"), fakeSteps.join(QLatin1Char(' ')));
    environment.remove(QStringLiteral("ZAF_EXTENSION_PATH"));
    if (!extensionPathVariable.isEmpty())
        environment.insert(QStringLiteral("ZAF_EXTENSION_PATH"), extensionPathVariable);
    process.setProcessEnvironment(environment);
    process.start(QStringLiteral(ZAF_HOST_BIN), args);
    HostRun run;
    if (!process.waitForStarted(10000) || !process.waitForFinished(60000)) {
        process.kill();
        process.waitForFinished(5000);
        ADD_FAILURE() << "zaf-host did not run to its end: " << args.join(u' ').toStdString();
        return run;
    }
    run.exitCode = process.exitStatus() == QProcess::NormalExit ? process.exitCode() : -1;
    run.out = QString::fromUtf8(process.readAllStandardOutput());
    run.err = QString::fromUtf8(process.readAllStandardError());
    return run;
}

class ZafHostCli : public ::testing::Test {
protected:
    QStringList baseArgs() const
    {
        return {QStringLiteral("--movie"), m_movie, QStringLiteral("--app-name"), QStringLiteral("Recorder"), QStringLiteral("--bundle-id"),
                QStringLiteral("org.example.Recorder")};
    }
    QStringList withFake(QStringList args) const
    {
        return args << QStringLiteral("--extension") << QStringLiteral(ZAF_FAKE_EXTENSION_BIN);
    }

    ScratchDir m_scratch;
    QString m_movie = m_scratch.write(QStringLiteral("movie.mp4"), 100);
};

TEST_F(ZafHostCli, ArgumentErrorsExitWithStatusTwoAndSayWhatIsWrong)
{
    const QStringList base = baseArgs();
    const struct {
        QStringList args;
        const char *expected;
    } cases[] = {
        {{QStringLiteral("--app-name"), QStringLiteral("A"), QStringLiteral("--bundle-id"), QStringLiteral("b.c")}, "--movie is required"},
        {base.mid(0, 4), "--bundle-id is required"},
        {base + QStringList{QStringLiteral("--tint"), QStringLiteral("blue")}, "blue"},
        {base + QStringList{QStringLiteral("--frobnicate")}, "frobnicate"},
        {base + QStringList{QStringLiteral("stray")}, "unexpected argument: stray"},
        {base + QStringList{QStringLiteral("--movie"), m_movie}, "--movie is given more than once"},
        {{QStringLiteral("--movie"), m_scratch.file(QStringLiteral("absent.mp4")), QStringLiteral("--app-name"), QStringLiteral("A"),
          QStringLiteral("--bundle-id"), QStringLiteral("b.c")},
         "is not a file"},
        {base + QStringList{QStringLiteral("--attachment"), m_scratch.file(QStringLiteral("absent.txt"))}, "is not a file"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.args.join(u' ').toStdString());
        const HostRun run = runHost(c.args);
        EXPECT_EQ(run.exitCode, 2);
        EXPECT_TRUE(run.err.contains(QString::fromUtf8(c.expected))) << run.err.toStdString();
        EXPECT_TRUE(run.out.isEmpty());
    }
}

TEST_F(ZafHostCli, ExtensionThatCannotBeFoundOrStartedExitsNonZero)
{
    const HostRun notExecutable = runHost(baseArgs() << QStringLiteral("--extension") << m_movie);
    EXPECT_EQ(notExecutable.exitCode, 1);
    EXPECT_TRUE(notExecutable.err.contains(QStringLiteral("not an executable file"))) << notExecutable.err.toStdString();

    const HostRun badVariable = runHost(baseArgs(), {}, m_scratch.file(QStringLiteral("nowhere")));
    EXPECT_EQ(badVariable.exitCode, 1);
    EXPECT_TRUE(badVariable.err.contains(QStringLiteral("ZAF_EXTENSION_PATH"))) << badVariable.err.toStdString();
}

TEST_F(ZafHostCli, PrintsTheReportRemovesTheViewAndExitsZero)
{
    // The fake reports, then exits 0 only once it receives removeExtensionView.
    const HostRun run = runHost(withFake(baseArgs() << QStringLiteral("--tint") << QStringLiteral("#102030")),
                                {QStringLiteral("accept"), QStringLiteral("report"), QStringLiteral("com.zafrel.activity.SaveToPhotoLibrary,Mail"),
                                 QStringLiteral("await-remove")});
    EXPECT_EQ(run.exitCode, 0) << run.err.toStdString();
    EXPECT_EQ(run.out, QStringLiteral("[\"com.zafrel.activity.SaveToPhotoLibrary\",\"Mail\"]\n"));
}

TEST_F(ZafHostCli, FindsTheExtensionThroughTheEnvironmentVariable)
{
    const HostRun run = runHost(baseArgs(), {QStringLiteral("accept"), QStringLiteral("report"), QStringLiteral("-"), QStringLiteral("await-remove")},
                                QStringLiteral(ZAF_FAKE_EXTENSION_BIN));
    EXPECT_EQ(run.exitCode, 0) << run.err.toStdString();
    EXPECT_EQ(run.out, QStringLiteral("[]\n"));
}

TEST_F(ZafHostCli, ExtensionEndingWithoutAReportOrDyingExitsNonZero)
{
    const struct {
        QStringList steps;
        const char *expected;
    } cases[] = {
        {{QStringLiteral("accept"), QStringLiteral("exit"), QStringLiteral("0")}, "without reporting"},
        {{QStringLiteral("accept"), QStringLiteral("close"), QStringLiteral("exit"), QStringLiteral("0")}, "without reporting"},
        {{QStringLiteral("accept"), QStringLiteral("crash")}, "died (signal 6)"},
        {{QStringLiteral("accept"), QStringLiteral("exit"), QStringLiteral("5")}, "exit status 5"},
        // A report followed by a crash is still a failure: the extension did not end cleanly.
        {{QStringLiteral("accept"), QStringLiteral("report"), QStringLiteral("-"), QStringLiteral("crash")}, "died"},
        {{QStringLiteral("reject"), QStringLiteral("await-remove")}, "refused the request"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.steps.join(u' ').toStdString());
        const HostRun run = runHost(withFake(baseArgs()), c.steps);
        EXPECT_EQ(run.exitCode, 1);
        EXPECT_TRUE(run.err.contains(QString::fromUtf8(c.expected))) << run.err.toStdString();
    }
}

} // namespace
} // namespace zaf::test
