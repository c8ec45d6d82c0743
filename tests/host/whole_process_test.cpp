// The whole process under Xvfb: zaf-host starts the real extension on a fixture recording, the
// editor is driven with the keyboard, and the host prints the report and exits cleanly, with the
// extension gone and its temporary directory left empty.
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

class ZafHostWholeProcess : public ::testing::Test {
protected:
    void SetUp() override
    {
        for (const char *tool : {"xvfb-run", "Xvfb", "xdotool"}) {
            if (QStandardPaths::findExecutable(tool).isEmpty())
                GTEST_SKIP() << tool << " is not installed; the whole-process run needs an X server and xdotool";
        }
    }
    QString read(const char *name) const
    {
        QFile file(scratch.file(name));
        return file.open(QIODevice::ReadOnly) ? QString::fromUtf8(file.readAll()) : QString();
    }
    // Runs the whole-process script for a scenario and checks what every run must end with: the
    // script ran through, zaf-host printed `report` and exited 0, and the temporary directory is empty.
    void run(const char *scenario, const char *report, const char *movie = "fixture")
    {
        QProcess script;
        script.setProcessChannelMode(QProcess::ForwardedChannels);
        script.start("bash", {ZAF_WHOLE_PROCESS_SCRIPT, ZAF_HOST_BIN, ZAF_EXTENSION_BIN, ZAF_FIXTURE_BIN, scratch.path(), scenario, movie});
        ASSERT_TRUE(script.waitForStarted(10000));
        if (!script.waitForFinished(240000)) {
            script.kill();
            script.waitForFinished(5000);
            FAIL() << "the whole-process script did not finish";
        }
        ASSERT_EQ(script.exitCode(), 0);
        const std::string hostErr = read("host.err").toStdString();
        ASSERT_EQ(read("result").trimmed(), "ok") << "zaf-host stderr:\n" << hostErr;
        EXPECT_EQ(read("host.status").trimmed(), "0") << hostErr;
        EXPECT_EQ(read("host.out"), report);
        const QDir temp(scratch.file("temp"));
        ASSERT_TRUE(temp.exists()) << "the extension made its temporary directory ready";
        EXPECT_EQ(temp.entryList(QDir::AllEntries | QDir::Hidden | QDir::System | QDir::NoDotAndDotDot), QStringList());
    }
    // The library holds one movie: the range 1 s to 2.5 s, its two audio tracks mixed into one.
    void expectTheTrimmedMixedMovieInTheLibrary()
    {
        const QDir library(scratch.file("Videos"));
        const QStringList saved = library.entryList(QDir::Files);
        ASSERT_EQ(saved.size(), 1);
        QProcess probe;
        probe.start("ffprobe", {"-v", "error", "-show_entries", "stream=codec_type:format=duration", "-of", "csv=p=0", library.filePath(saved[0])});
        ASSERT_TRUE(probe.waitForFinished(30000));
        const QStringList lines = QString::fromUtf8(probe.readAllStandardOutput()).split('\n', Qt::SkipEmptyParts);
        EXPECT_EQ(lines.count("audio"), 1);
        EXPECT_EQ(lines.count("video"), 1);
        EXPECT_NEAR(lines.last().toDouble(), 1.5, 0.1);
    }

    ScratchDir scratch;
};

// Escape on a good recording, on a 4x4 movie (small frames once crashed the thumbnails and the
// process with them) and on random bytes (no movie: the editor says so in the video area): the
// window opens, the host hears [] and the extension has gone, leaving no trace.
class ZafHostWholeProcessCancel : public ZafHostWholeProcess, public ::testing::WithParamInterface<const char *> {};

TEST_P(ZafHostWholeProcessCancel, EscapeReportsNothingEndsTheExtensionAndLeavesNoTrace)
{
    ASSERT_NO_FATAL_FAILURE(run("cancel", "[]\n", GetParam()));
    bool ok = false;
    const int extensionPid = read("extension.pid").trimmed().toInt(&ok);
    ASSERT_TRUE(ok && extensionPid > 0) << "the editor window's process is unknown";
    EXPECT_TRUE(::kill(extensionPid, 0) != 0 && errno == ESRCH) << "the extension " << extensionPid << " is still running";
}

INSTANTIATE_TEST_SUITE_P(Movies, ZafHostWholeProcessCancel, ::testing::Values("fixture", "tiny", "garbage"));

const char *const kTwoSaves = "[\"com.zafrel.activity.SaveToPhotoLibrary\",\"com.zafrel.activity.SaveToPhotoLibrary\"]\n";

TEST_F(ZafHostWholeProcess, KeyboardTrimThenSavePutsTheTrimmedMixedMovieInTheLibrary)
{
    ASSERT_NO_FATAL_FAILURE(run("trim-save", kTwoSaves));
    expectTheTrimmedMixedMovieInTheLibrary();
}

// Two editors of one user: the second one's Cancel must not empty the first one's trimmed movie.
TEST_F(ZafHostWholeProcess, CancellingASecondEditorLeavesTheFirstEditorsTrimToSave)
{
    ASSERT_NO_FATAL_FAILURE(run("two-editors", kTwoSaves));
    EXPECT_EQ(read("second.out"), "[]\n");
    EXPECT_EQ(read("second.status").trimmed(), "0") << read("second.err").toStdString();
    expectTheTrimmedMixedMovieInTheLibrary();
}

} // namespace
} // namespace zaf::test
