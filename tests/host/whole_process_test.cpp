// The whole process: zaf-host starts the real extension on a fixture recording under Xvfb, the
// editor window is cancelled with Escape, and the host prints an empty report and exits cleanly,
// with the extension gone and its temporary directory left empty.
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>
#include <QProcess>
#include <QStandardPaths>

#include <gtest/gtest.h>

#include <cerrno>
#include <csignal>

namespace zaf::test {
namespace {

QString readText(const QString &path)
{
    QFile file(path);
    return file.open(QIODevice::ReadOnly) ? QString::fromUtf8(file.readAll()) : QString();
}

TEST(ZafHostWholeProcess, EscapeInTheEditorReportsNothingAndLeavesNoTrace)
{
    for (const char *tool : {"xvfb-run", "Xvfb", "xdotool"}) {
        if (QStandardPaths::findExecutable(QString::fromLatin1(tool)).isEmpty())
            GTEST_SKIP() << tool << " is not installed; the whole-process run needs an X server and xdotool";
    }
    ScratchDir scratch;
    QProcess script;
    script.setProcessChannelMode(QProcess::ForwardedChannels);
    script.start(QStringLiteral("bash"), {QStringLiteral(ZAF_WHOLE_PROCESS_SCRIPT), QStringLiteral(ZAF_HOST_BIN),
                                          QStringLiteral(ZAF_EXTENSION_BIN), QStringLiteral(ZAF_FIXTURE_BIN), scratch.path()});
    ASSERT_TRUE(script.waitForStarted(10000));
    if (!script.waitForFinished(240000)) {
        script.kill();
        script.waitForFinished(5000);
        FAIL() << "the whole-process script did not finish";
    }
    ASSERT_EQ(script.exitCode(), 0);

    const QString result = readText(scratch.file(QStringLiteral("result"))).trimmed();
    const QString hostErr = readText(scratch.file(QStringLiteral("host.err")));
    ASSERT_EQ(result, QStringLiteral("ok")) << "zaf-host stderr:\n" << hostErr.toStdString();
    EXPECT_EQ(readText(scratch.file(QStringLiteral("host.status"))).trimmed(), QStringLiteral("0")) << hostErr.toStdString();
    EXPECT_EQ(readText(scratch.file(QStringLiteral("host.out"))), QStringLiteral("[]\n"));

    // The process that owned the editor window has gone.
    bool ok = false;
    const int extensionPid = readText(scratch.file(QStringLiteral("extension.pid"))).trimmed().toInt(&ok);
    ASSERT_TRUE(ok && extensionPid > 0) << "the editor window's process is unknown";
    EXPECT_TRUE(::kill(extensionPid, 0) != 0 && errno == ESRCH) << "the extension " << extensionPid << " is still running";

    // The extension's temporary directory exists (it made it ready) and is empty.
    const QDir temp(scratch.file(QStringLiteral("temp")));
    ASSERT_TRUE(temp.exists());
    EXPECT_TRUE(temp.entryList(QDir::AllEntries | QDir::Hidden | QDir::System | QDir::NoDotAndDotDot).isEmpty())
        << temp.entryList(QDir::AllEntries | QDir::Hidden | QDir::NoDotAndDotDot).join(u' ').toStdString();
}

} // namespace
} // namespace zaf::test
