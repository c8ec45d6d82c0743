// Save and done: the mixed movie reaches the video library, the report, and no file lost on a fault.
#include "tests/editor/editor_test_support.h"
#include "tests/support/private_mounts.h"

#include <QDir>

#include <optional>

namespace zaf::test {
namespace {

const QString kSave = QString::fromLatin1(ZafActivityTypeSaveToPhotoLibrary);

class EditorSaveTest : public EditorTest {
protected:
    // The video library of this process (read once per process: each test runs in its own).
    void SetUp() override
    {
        EditorTest::SetUp();
        qputenv("ZAF_VIDEO_LIBRARY", QFile::encodeName(libraryPath));
    }
    std::unique_ptr<ZafVideoEditorViewController> open(const QString &path)
    {
        auto e = ready(path);
        e->setDelegate(&delegate);
        return e;
    }
    bool waitForReport() { return waitUntil([&] { return !delegate.reports.isEmpty(); }); }
    QStringList library() const { return QDir(libraryPath).entryList(QDir::Files | QDir::NoDotAndDotDot); }

    QString libraryPath = scratch.file(QStringLiteral("Videos"));
    RecordingDelegate delegate;
};

TEST_F(EditorSaveTest, SavePutsOneMixedPlayableMovieInTheLibraryThenFinishes)
{
    const QString source = movie(2, 320, 240, 0, 2);
    auto e = open(source);
    e->saveButton()->trigger();
    ASSERT_TRUE(waitForReport());
    EXPECT_EQ(delegate.reports.first(), QStringList{kSave});
    ASSERT_EQ(library().size(), 1);
    const QJsonObject probe = ffprobe(QDir(libraryPath).filePath(library().first()));
    EXPECT_EQ(probeStreams(probe, QStringLiteral("audio")).size(), 1);
    EXPECT_EQ(probeStreams(probe, QStringLiteral("video")).size(), 1);
    // The movie before mixing goes once the mixed copy is safely in the library.
    EXPECT_TRUE(waitUntil([&] { return !QFile::exists(source); }, 5000));
}

TEST_F(EditorSaveTest, TrimThenSaveReportsTheSaveTwiceAndSavesTheTrimmedMovie)
{
    auto e = open(movie(4, 320, 240, 0, 1));
    const QUrl original = e->videoURL();
    selectRange(*e, 1, 3);
    ASSERT_TRUE(applyTrim(*e));
    e->saveButton()->trigger();
    ASSERT_TRUE(waitForReport());
    EXPECT_EQ(delegate.reports.first(), (QStringList{kSave, kSave}));
    ASSERT_EQ(library().size(), 1);
    const QList<int> frames = readFrameNumbers(QDir(libraryPath).filePath(library().first()));
    ASSERT_EQ(frames.size(), 60);
    EXPECT_EQ(frames.first(), 30);
    EXPECT_TRUE(QFile::exists(original.toLocalFile())) << "the host's movie was not the one saved";
}

TEST_F(EditorSaveTest, CompletedShareComesBeforeTheSaveInTheReport)
{
    auto e = open(movie(1));
    e->shareSheetDidCompleteWithActivityType(QStringLiteral("com.zafrel.activity.Mail"), true);
    e->saveAction();
    ASSERT_TRUE(waitForReport());
    EXPECT_EQ(delegate.reports.first(), (QStringList{QStringLiteral("com.zafrel.activity.Mail"), kSave}));
}

// Saves that meet a fault: a library that cannot be made (a file where its parent folder should
// be), a library on a read-only volume, a temporary directory that fills up while the mix writes.
// The editor still finishes with the save reported and the error logged; the host's movie is kept
// as it was, and the library holds nothing but whole movies: none after a failed library write,
// the movie as recorded when there was no room to mix it.
enum class SaveFault { LibraryParentIsAFile, ReadOnlyLibrary, TemporaryDirectoryFull };

class EditorSaveFaultTest : public EditorSaveTest, public ::testing::WithParamInterface<SaveFault> {};

TEST_P(EditorSaveFaultTest, StillFinishesLogsTheErrorAndLosesNothing)
{
    const SaveFault fault = GetParam();
    if (fault != SaveFault::LibraryParentIsAFile && !insidePrivateMounts())
        return runThisTestInPrivateMounts();
    std::optional<ScopedTmpfs> volume;
    if (fault == SaveFault::LibraryParentIsAFile) {
        libraryPath = scratch.write(QStringLiteral("not-a-directory"), 1) + QStringLiteral("/Videos");
        qputenv("ZAF_VIDEO_LIBRARY", QFile::encodeName(libraryPath));
    } else if (fault == SaveFault::ReadOnlyLibrary) {
        ASSERT_TRUE(QDir().mkpath(libraryPath));
        volume.emplace(libraryPath, 64 * 1024 * 1024, true);
    } else {
        volume.emplace(ZafTempStore::defaultStore()._srTempPath(), 8192);
    }
    if (volume && !volume->mounted())
        return;
    LogCapture logs;
    const QString source = movie(1, 320, 240, 0, 2);
    const QByteArray recorded = fileDigest(source);
    auto e = open(source);
    e->saveAction();
    ASSERT_TRUE(waitForReport());
    EXPECT_EQ(delegate.reports.first(), QStringList{kSave});
    spin(300); // a removal of the source would have been started by now
    EXPECT_EQ(fileDigest(source), recorded) << "the host's movie is kept as it was";
    if (fault == SaveFault::TemporaryDirectoryFull) {
        EXPECT_EQ(logs.count(QStringLiteral("Error Mixing video Audio tracks")), 1);
        ASSERT_EQ(library().size(), 1);
        EXPECT_EQ(fileDigest(QDir(libraryPath).filePath(library().first())), recorded) << "saved as recorded";
    } else {
        EXPECT_EQ(logs.count(QStringLiteral("Error writing video to camera roll: 4")), 1);
        EXPECT_EQ(QDir(libraryPath).entryList(QDir::AllEntries | QDir::Hidden | QDir::NoDotAndDotDot), QStringList());
    }
}

INSTANTIATE_TEST_SUITE_P(Faults, EditorSaveFaultTest,
                         ::testing::Values(SaveFault::LibraryParentIsAFile, SaveFault::ReadOnlyLibrary,
                                           SaveFault::TemporaryDirectoryFull));

} // namespace
} // namespace zaf::test
