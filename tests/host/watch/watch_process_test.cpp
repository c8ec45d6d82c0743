// zaf-host --watch as a whole process (watch_process.sh): a recorder writing slowly into the watched
// folder, a movie renamed into place, two at once, partial and garbage files, a notification service
// that is missing and then there, and SIGTERM with an editor open.
#include "tests/support/child_process.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>
#include <QRegularExpression>
#include <QStandardPaths>

#include <gtest/gtest.h>

namespace zaf::test {
namespace {

class ZafHostWatch : public ::testing::Test {
protected:
    void SetUp() override
    {
        for (const char *tool : {"xvfb-run", "Xvfb", "xdotool", "dbus-run-session", "dbus-monitor", "dbus-send", "dunst"}) {
            if (QStandardPaths::findExecutable(tool).isEmpty())
                GTEST_SKIP() << tool << " is not installed; the watch run needs an X server, xdotool, a session bus and dunst";
        }
        ChildOptions options;
        options.timeoutMs = 180000;
        options.forwardOutput = true;
        const ChildRun script = runChild("bash", {ZAF_WATCH_PROCESS_SCRIPT, ZAF_HOST_BIN, ZAF_EXTENSION_BIN, ZAF_FIXTURE_BIN, scratch.path()}, options);
        ASSERT_TRUE(script.started && !script.timedOut) << script.error.toStdString();
        ASSERT_EQ(script.exitCode, 0);
        ASSERT_EQ(read("result").trimmed(), "ok") << "zaf-host's log:\n" << read("watch.err").toStdString();
        for (const QString &line : read("watch.err").split(QLatin1Char('\n'))) {
            if (line.startsWith(QLatin1String("zaf.host: ")))
                hostLog << line.mid(10).replace(scratch.file(QStringLiteral("watched/")), QString());
        }
    }
    QString read(const char *name) const
    {
        QFile file(scratch.file(QLatin1String(name)));
        return file.open(QIODevice::ReadOnly) ? QString::fromUtf8(file.readAll()) : QString();
    }
    // zaf-host's log lines (the watched folder's path taken out) that start with `start`.
    QStringList logged(const QString &start) const
    {
        QStringList lines;
        for (const QString &line : hostLog) {
            if (line.startsWith(start))
                lines << line;
        }
        return lines;
    }
    // The summary and body of each Notify call dbus-monitor recorded, as "summary - body".
    QStringList notifications() const
    {
        QStringList calls;
        for (const QString &call : read("notify.log").split(QStringLiteral("method call "), Qt::SkipEmptyParts).mid(1)) {
            static const QRegularExpression string(QStringLiteral("^\\s*string \"(.*)\"$"), QRegularExpression::MultilineOption);
            QStringList strings;
            for (auto match = string.globalMatch(call); match.hasNext();)
                strings << match.next().captured(1);
            calls << (strings.size() >= 4 ? strings[2] + QStringLiteral(" - ") + strings[3] : call);
        }
        return calls;
    }

    ScratchDir scratch;
    QStringList hostLog;
};

TEST_F(ZafHostWatch, OffersEachFinishedMovieOnceOneEditorAtATimeAndLeavesTheRecordingsAlone)
{
    EXPECT_EQ(read("watch.status").trimmed(), "0") << "SIGTERM is a clean end";
    for (const char *movie : {"slow.mp4", "moved.mp4", "together.mp4", "last.mp4"})
        EXPECT_EQ(logged(QStringLiteral("offered %1 ").arg(QLatin1String(movie))).size(), 1) << movie;
    EXPECT_EQ(logged(QStringLiteral("offered ")).size(), 4) << hostLog.join('\n').toStdString();
    EXPECT_EQ(logged(QStringLiteral("ignored slow.mp4: offered already")).size(), 1);
    EXPECT_EQ(logged(QStringLiteral("ignored garbage.mp4: not an MPEG-4 movie")).size(), 1);
    EXPECT_EQ(logged(QStringLiteral("ignored .slow.mp4.part: its name")).size(), 1);
    EXPECT_EQ(logged(QStringLiteral("ignored moved.mp4.part: its name")).size(), 1);
    EXPECT_EQ(logged(QStringLiteral("queued together.mp4 (1 waiting)")).size(), 1);
    EXPECT_EQ(logged(QStringLiteral("queued waiting.mp4 (1 waiting)")).size(), 1);
    EXPECT_EQ(logged(QStringLiteral("stopping: 1 recording(s) waiting for the editor dropped")).size(), 1);
    EXPECT_EQ(logged(QStringLiteral("stopping: ending the editor open on last.mp4")).size(), 1);

    // No service for the first: logged, not shown. The service's answers are logged too.
    const QStringList unshown = logged(QStringLiteral("no desktop notification"));
    ASSERT_EQ(unshown.size(), 1);
    EXPECT_TRUE(unshown[0].endsWith(QLatin1String("Nothing was changed - slow.mp4"))) << unshown[0].toStdString();
    EXPECT_EQ(notifications(), (QStringList{"Saved to your Videos - moved.mp4", "Nothing was changed - together.mp4"}));
    EXPECT_EQ(logged(QStringLiteral("notified (notification ")).size(), 2);

    // Every recording as the recorder wrote it; one save in the library; no clone or temporary left.
    const QByteArray source = fileDigest(scratch.file(QStringLiteral("source.mp4")));
    for (const char *movie : {"slow.mp4", "moved.mp4", "together.mp4", "last.mp4", "waiting.mp4"})
        EXPECT_EQ(fileDigest(scratch.file(QStringLiteral("watched/%1").arg(QLatin1String(movie)))), source) << movie;
    EXPECT_EQ(QDir(scratch.file(QStringLiteral("Videos"))).entryList(QDir::Files).size(), 1);
    EXPECT_EQ(entryNames(scratch.file(QStringLiteral("cache"))), QStringList());
    EXPECT_EQ(entryNames(scratch.file(QStringLiteral("temp"))), QStringList());
}

} // namespace
} // namespace zaf::test
