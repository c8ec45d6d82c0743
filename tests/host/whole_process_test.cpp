// The whole process under Xvfb: zaf-host starts the real extension on a fixture recording and the
// editor is driven with the keyboard.
#include "tests/host/process_state.h"
#include "tests/support/child_process.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>
#include <QStandardPaths>

#include <gtest/gtest.h>

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
    // Runs the script's scenario: it runs through, zaf-host prints `report` and exits with
    // `hostStatus`, and the extension's temporary directory is left empty.
    void run(const char *scenario, const char *report, const char *movie = "fixture", const char *hostStatus = "0",
             const char *host = ZAF_HOST_BIN)
    {
        zaf::test::ChildOptions options;
        options.timeoutMs = 240000;
        options.forwardOutput = true;
        const zaf::test::ChildRun script = zaf::test::runChild(
            "bash", {ZAF_WHOLE_PROCESS_SCRIPT, host, ZAF_EXTENSION_BIN, ZAF_FIXTURE_BIN, scratch.path(), scenario, movie}, options);
        ASSERT_TRUE(script.started && !script.timedOut) << script.error.toStdString();
        ASSERT_EQ(script.exitCode, 0);
        const std::string hostErr = read("host.err").toStdString();
        ASSERT_EQ(read("result").trimmed(), "ok") << "zaf-host stderr:\n" << hostErr;
        EXPECT_EQ(read("host.status").trimmed(), hostStatus) << hostErr;
        EXPECT_EQ(read("host.out"), report);
        const QDir temp(scratch.file("temp"));
        ASSERT_TRUE(temp.exists()) << "the extension made its temporary directory ready";
        EXPECT_EQ(temp.entryList(QDir::AllEntries | QDir::Hidden | QDir::System | QDir::NoDotAndDotDot), QStringList());
    }
    // A run that saved nothing: the recording as it was and no file, not even a hidden partial one.
    void expectTheRecordingKeptAndNothingInTheLibrary()
    {
        const QString digest = QString::fromLatin1(fileDigest(scratch.file("movie.mp4")).toHex());
        EXPECT_EQ(digest, read("movie.sha256").trimmed()) << "the host's recording changed or went";
        EXPECT_EQ(QDir(scratch.file("Videos")).entryList(QDir::AllEntries | QDir::Hidden | QDir::System | QDir::NoDotAndDotDot),
                  QStringList());
    }
    void expectTheExtensionGone()
    {
        const int pid = read("extension.pid").trimmed().toInt();
        EXPECT_TRUE(pid > 0 && !processExists(pid)) << "the extension " << pid << " is unknown or still running";
    }

    // The library holds one movie: the range 1 s to 2.5 s, its two audio tracks mixed into one.
    void expectTheTrimmedMixedMovieInTheLibrary()
    {
        const QDir library(scratch.file("Videos"));
        const QStringList saved = library.entryList(QDir::Files);
        ASSERT_EQ(saved.size(), 1);
        const zaf::test::ChildRun probe = zaf::test::runChild(
            "ffprobe", {"-v", "error", "-show_entries", "stream=codec_type:format=duration", "-of", "csv=p=0", library.filePath(saved[0])});
        ASSERT_TRUE(probe.ok()) << probe.error.toStdString();
        const QStringList lines = QString::fromUtf8(probe.out).split('\n', Qt::SkipEmptyParts);
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
    expectTheExtensionGone();
}

INSTANTIATE_TEST_SUITE_P(Movies, ZafHostWholeProcessCancel, ::testing::Values("fixture", "tiny", "garbage"));

const char *const kTwoSaves = "[\"com.zafrel.activity.SaveToPhotoLibrary\",\"com.zafrel.activity.SaveToPhotoLibrary\"]\n";

// The same run from zaf-host and from the host in Python that examples/python-host holds, written
// from the README's protocol text alone: both present, trim, save and read the report alike.
struct Host {
    const char *name;
    const char *program;
};

void PrintTo(const Host &host, std::ostream *out)
{
    *out << host.name;
}

class WholeProcessHostTest : public ZafHostWholeProcess, public ::testing::WithParamInterface<Host> {};

TEST_P(WholeProcessHostTest, KeyboardTrimThenSavePutsTheTrimmedMixedMovieInTheLibrary)
{
    if (QStandardPaths::findExecutable("python3").isEmpty())
        GTEST_SKIP() << "python3 is not installed";
    ASSERT_NO_FATAL_FAILURE(run("trim-save", kTwoSaves, "fixture", "0", GetParam().program));
    expectTheTrimmedMixedMovieInTheLibrary();
}

INSTANTIATE_TEST_SUITE_P(Hosts, WholeProcessHostTest,
                         ::testing::Values(Host{"ZafHost", ZAF_HOST_BIN}, Host{"PythonHost", ZAF_PYTHON_HOST}),
                         [](const auto &info) { return std::string(info.param.name); });

// A movie the user opens as their own: the editor works on a private clone, so after a trim and a
// save the user's file is there, byte for byte, and the clone's folder has gone with zaf-host.
TEST_F(ZafHostWholeProcess, OpeningAUsersMovieLeavesItUntouchedAfterASave)
{
    ASSERT_NO_FATAL_FAILURE(run("open-trim-save", kTwoSaves));
    expectTheTrimmedMixedMovieInTheLibrary();
    EXPECT_EQ(QString::fromLatin1(fileDigest(scratch.file("movie.mp4")).toHex()), read("movie.sha256").trimmed());
    EXPECT_EQ(QDir(scratch.file("cache")).entryList({QStringLiteral("zafrel-open-*")}, QDir::AllEntries | QDir::Hidden), QStringList());
}

// Two editors of one user: the second one's Cancel must not empty the first one's trimmed movie.
TEST_F(ZafHostWholeProcess, CancellingASecondEditorLeavesTheFirstEditorsTrimToSave)
{
    ASSERT_NO_FATAL_FAILURE(run("two-editors", kTwoSaves));
    EXPECT_EQ(read("second.out"), "[]\n");
    EXPECT_EQ(read("second.status").trimmed(), "0") << read("second.err").toStdString();
    expectTheTrimmedMixedMovieInTheLibrary();
}

// The extension killed (SIGKILL) while its trim writes: zaf-host says so and fails, and the next
// editor's start removes what the killed one left in the temporary directory. Nothing is saved and
// the recording is kept.
TEST_F(ZafHostWholeProcess, AnExtensionKilledMidTrimLeavesNothingOnceTheNextEditorStarts)
{
    ASSERT_NO_FATAL_FAILURE(run("kill-mid-trim", "", "fixture", "1"));
    EXPECT_TRUE(read("host.err").contains("the extension died (signal 9)")) << read("host.err").toStdString();
    EXPECT_FALSE(read("killed.files").trimmed().isEmpty()) << "the killed editor had left nothing to sweep";
    EXPECT_EQ(read("second.out"), "[]\n");
    EXPECT_EQ(read("second.status").trimmed(), "0") << read("second.err").toStdString();
    expectTheRecordingKeptAndNothingInTheLibrary();
}

// zaf-host killed (SIGKILL) while the editor is open with a trim: the extension notices the closed
// channel, empties its temporary directory and exits; the recording is kept.
TEST_F(ZafHostWholeProcess, AHostThatDiesLeavesTheExtensionToEmptyItsDirectoryAndExit)
{
    ASSERT_NO_FATAL_FAILURE(run("host-dies", "", "fixture", "137"));
    expectTheExtensionGone();
    expectTheRecordingKeptAndNothingInTheLibrary();
}

} // namespace
} // namespace zaf::test
