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

bool toolsMissing(QString *which)
{
    for (const char *tool : {"xvfb-run", "Xvfb", "xdotool"}) {
        if (QStandardPaths::findExecutable(QString::fromLatin1(tool)).isEmpty()) {
            *which = QString::fromLatin1(tool);
            return true;
        }
    }
    return false;
}

// Runs the whole-process script for a scenario; false (with a failure) when it did not run through.
bool runScenario(const ScratchDir &scratch, const QString &scenario)
{
    QProcess script;
    script.setProcessChannelMode(QProcess::ForwardedChannels);
    script.start(QStringLiteral("bash"), {QStringLiteral(ZAF_WHOLE_PROCESS_SCRIPT), QStringLiteral(ZAF_HOST_BIN),
                                          QStringLiteral(ZAF_EXTENSION_BIN), QStringLiteral(ZAF_FIXTURE_BIN), scratch.path(),
                                          scenario});
    if (!script.waitForStarted(10000)) {
        ADD_FAILURE() << "the whole-process script did not start";
        return false;
    }
    if (!script.waitForFinished(240000)) {
        script.kill();
        script.waitForFinished(5000);
        ADD_FAILURE() << "the whole-process script did not finish";
        return false;
    }
    EXPECT_EQ(script.exitCode(), 0);
    return script.exitCode() == 0;
}

TEST(ZafHostWholeProcess, EscapeInTheEditorReportsNothingAndLeavesNoTrace)
{
    QString missing;
    if (toolsMissing(&missing))
        GTEST_SKIP() << missing.toStdString() << " is not installed; the whole-process run needs an X server and xdotool";
    ScratchDir scratch;
    ASSERT_TRUE(runScenario(scratch, QStringLiteral("cancel")));

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

TEST(ZafHostWholeProcess, KeyboardTrimThenSavePutsTheTrimmedMixedMovieInTheLibrary)
{
    QString missing;
    if (toolsMissing(&missing))
        GTEST_SKIP() << missing.toStdString() << " is not installed; the whole-process run needs an X server and xdotool";
    ScratchDir scratch;
    ASSERT_TRUE(runScenario(scratch, QStringLiteral("trim-save")));
    const QString hostErr = readText(scratch.file(QStringLiteral("host.err")));
    ASSERT_EQ(readText(scratch.file(QStringLiteral("result"))).trimmed(), QStringLiteral("ok")) << hostErr.toStdString();
    EXPECT_EQ(readText(scratch.file(QStringLiteral("host.status"))).trimmed(), QStringLiteral("0")) << hostErr.toStdString();
    EXPECT_EQ(readText(scratch.file(QStringLiteral("host.out"))),
              QStringLiteral("[\"com.zafrel.activity.SaveToPhotoLibrary\",\"com.zafrel.activity.SaveToPhotoLibrary\"]\n"));

    // The library holds one movie: the range 1 s to 2.5 s, its two audio tracks mixed into one.
    const QDir library(scratch.file(QStringLiteral("Videos")));
    const QStringList saved = library.entryList(QDir::Files | QDir::NoDotAndDotDot);
    ASSERT_EQ(saved.size(), 1);
    QProcess probe;
    probe.start(QStringLiteral("ffprobe"), {QStringLiteral("-v"), QStringLiteral("error"), QStringLiteral("-show_entries"),
                                            QStringLiteral("stream=codec_type:format=duration"), QStringLiteral("-of"),
                                            QStringLiteral("csv=p=0"), library.filePath(saved.first())});
    ASSERT_TRUE(probe.waitForFinished(30000));
    const QStringList lines = QString::fromUtf8(probe.readAllStandardOutput()).split(u'\n', Qt::SkipEmptyParts);
    EXPECT_EQ(lines.count(QStringLiteral("audio")), 1);
    EXPECT_EQ(lines.count(QStringLiteral("video")), 1);
    EXPECT_NEAR(lines.last().toDouble(), 1.5, 0.1);

    const QDir temp(scratch.file(QStringLiteral("temp")));
    EXPECT_TRUE(temp.entryList(QDir::AllEntries | QDir::Hidden | QDir::System | QDir::NoDotAndDotDot).isEmpty());
}

} // namespace
} // namespace zaf::test
