#include "tests/support/private_mounts.h"
#include "tests/support/child_process.h"

#include <QCoreApplication>
#include <QFile>
#include <QProcessEnvironment>
#include <QStandardPaths>
#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>
#include <sys/mount.h>

namespace zaf::test {

namespace {

constexpr const char *kInsideVariable = "ZAF_TEST_PRIVATE_MOUNTS";
const QStringList kUnshare{QStringLiteral("--mount"), QStringLiteral("--propagation"), QStringLiteral("private")};

// Runs `unshare` with the arguments; the exit code and the merged output, or -1 when it did not run
// to its end within the bound.
std::pair<int, QString> runUnshare(const QStringList &arguments, const QProcessEnvironment &environment, int timeoutMs)
{
    ChildOptions options;
    options.timeoutMs = timeoutMs;
    options.mergeErrorIntoOutput = true;
    options.environment = environment.toStringList();
    const ChildRun run = runChild(QStringLiteral("unshare"), kUnshare + arguments, options);
    return {run.started && !run.timedOut ? run.exitCode : -1, QString::fromLocal8Bit(run.out) + run.error};
}

void skip(const QString &reason)
{
    GTEST_SKIP() << reason.toStdString();
}

} // namespace

bool insidePrivateMounts()
{
    return qEnvironmentVariableIsSet(kInsideVariable);
}

void runThisTestInPrivateMounts()
{
    if (QStandardPaths::findExecutable(QStringLiteral("unshare")).isEmpty())
        GTEST_SKIP() << "unshare is not installed: no private mount namespace for a file system of the test's own";
    const QProcessEnvironment environment = QProcessEnvironment::systemEnvironment();
    const auto [probe, probeOutput] = runUnshare({QStringLiteral("true")}, environment, 30000);
    if (probe != 0)
        GTEST_SKIP() << "no private mount namespace here (needs root or CAP_SYS_ADMIN): " << probeOutput.trimmed().toStdString();

    const ::testing::TestInfo *test = ::testing::UnitTest::GetInstance()->current_test_info();
    const QString name = QString::fromLatin1(test->test_suite_name()) + QLatin1Char('.') + QString::fromLatin1(test->name());
    QProcessEnvironment inside = environment;
    inside.insert(QString::fromLatin1(kInsideVariable), QStringLiteral("1"));
    inside.remove(QStringLiteral("GTEST_OUTPUT")); // the child's report must not replace this program's
    const auto [code, output] = runUnshare({QCoreApplication::applicationFilePath(), QStringLiteral("--gtest_filter=") + name},
                                           inside, 240000);
    const std::string shown = output.toStdString();
    if (code != 0)
        FAIL() << "the run in a private mount namespace failed (exit " << code << "):\n" << shown;
    if (output.contains(QStringLiteral("[  SKIPPED ]")))
        GTEST_SKIP() << "skipped in the private mount namespace:\n" << shown;
    EXPECT_TRUE(output.contains(QStringLiteral("[  PASSED  ] 1 test"))) << shown;
}

ScopedTmpfs::ScopedTmpfs(const QString &directory, qint64 bytes, bool readOnly)
    : m_directory(directory)
{
    if (!insidePrivateMounts()) {
        ADD_FAILURE() << "a tmpfs is mounted only inside a private mount namespace";
        return;
    }
    const QByteArray options = "size=" + QByteArray::number(bytes) + ",mode=0755";
    const unsigned long flags = MS_NOSUID | MS_NODEV | (readOnly ? MS_RDONLY : 0);
    m_mounted = ::mount("tmpfs", QFile::encodeName(directory).constData(), "tmpfs", flags, options.constData()) == 0;
    if (!m_mounted)
        skip(QStringLiteral("cannot mount a tmpfs at %1: %2").arg(directory, QString::fromLocal8Bit(std::strerror(errno))));
}

ScopedTmpfs::~ScopedTmpfs()
{
    if (m_mounted)
        ::umount2(QFile::encodeName(m_directory).constData(), MNT_DETACH);
}

} // namespace zaf::test
