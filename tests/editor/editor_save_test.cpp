// Save and done: the mixed movie reaches the video library, the report holds the save, and no file
// is lost when the library fails.
#include "tests/editor/editor_test_support.h"

#include "platform/media/playback_clock.h"
#include "platform/ui/movie_scrubber.h"

#include <QDir>

namespace zaf::test {
namespace {

const QString kSave = QString::fromLatin1(ZafActivityTypeSaveToPhotoLibrary);

class EditorSaveTest : public EditorTest {
protected:
    // The video library of this process (read once per process: each test runs in its own).
    void useLibrary(const QString &dir) { qputenv("ZAF_VIDEO_LIBRARY", QFile::encodeName(dir)); }

    std::unique_ptr<ZafVideoEditorViewController> ready(const QString &path)
    {
        auto e = makeEditor(path, QRectF(0, 0, 400, 700));
        EXPECT_TRUE(waitUntilReady(*e));
        e->mvPlayer()->setTimeSource(std::make_shared<media::ManualTimeSource>());
        e->setDelegate(&delegate);
        return e;
    }
    bool waitForReport(int ms = 60000)
    {
        QElapsedTimer timer;
        timer.start();
        while (timer.elapsed() < ms && delegate.reports.isEmpty())
            spin(20);
        return !delegate.reports.isEmpty();
    }
    QStringList library() const
    {
        return QDir(scratch.file(QStringLiteral("Videos"))).entryList(QDir::Files | QDir::NoDotAndDotDot);
    }

    RecordingDelegate delegate;
};

TEST_F(EditorSaveTest, SavePutsOneMixedPlayableMovieInTheLibraryThenFinishes)
{
    useLibrary(scratch.file(QStringLiteral("Videos")));
    const QString source = movie(2, 320, 240, 0, 2);
    auto e = ready(source);
    e->saveButton()->trigger();
    ASSERT_TRUE(waitForReport());
    EXPECT_EQ(delegate.reports.first(), QStringList{kSave});
    const QStringList saved = library();
    ASSERT_EQ(saved.size(), 1);
    const QJsonObject probe = ffprobe(QDir(scratch.file(QStringLiteral("Videos"))).filePath(saved.first()));
    EXPECT_EQ(probeStreams(probe, QStringLiteral("audio")).size(), 1);
    EXPECT_EQ(probeStreams(probe, QStringLiteral("video")).size(), 1);
    // The movie before mixing goes once the mixed copy is safely in the library.
    QElapsedTimer timer;
    timer.start();
    while (timer.elapsed() < 5000 && QFile::exists(source))
        spin(20);
    EXPECT_FALSE(QFile::exists(source));
}

TEST_F(EditorSaveTest, TrimThenSaveReportsTheSaveTwiceAndSavesTheTrimmedMovie)
{
    useLibrary(scratch.file(QStringLiteral("Videos")));
    auto e = ready(movie(4, 320, 240, 0, 1));
    ui::MovieScrubber *s = e->mvTrimmer();
    s->setEditing(true, false);
    e->movieScrubberDidBeginEditing(s);
    e->movieScrubberEditingStartValueDidChange(s, 1);
    e->movieScrubberEditingEndValueDidChange(s, 3);
    const QUrl before = e->videoURL();
    e->trimButton()->trigger();
    QElapsedTimer timer;
    timer.start();
    while (timer.elapsed() < 60000 && e->videoURL() == before)
        spin(20);
    ASSERT_NE(e->videoURL(), before);
    e->saveButton()->trigger();
    ASSERT_TRUE(waitForReport());
    EXPECT_EQ(delegate.reports.first(), (QStringList{kSave, kSave}));
    ASSERT_EQ(library().size(), 1);
    const QList<int> frames = readFrameNumbers(QDir(scratch.file(QStringLiteral("Videos"))).filePath(library().first()));
    ASSERT_EQ(frames.size(), 60);
    EXPECT_EQ(frames.first(), 30);
    EXPECT_TRUE(QFile::exists(before.toLocalFile())) << "the host's movie was not the one saved";
}

TEST_F(EditorSaveTest, CompletedShareComesBeforeTheSaveInTheReport)
{
    useLibrary(scratch.file(QStringLiteral("Videos")));
    auto e = ready(movie(1));
    e->shareSheetDidCompleteWithActivityType(QStringLiteral("com.zafrel.activity.Mail"), true);
    e->saveAction();
    ASSERT_TRUE(waitForReport());
    EXPECT_EQ(delegate.reports.first(), (QStringList{QStringLiteral("com.zafrel.activity.Mail"), kSave}));
}

TEST_F(EditorSaveTest, WithTheShareSheetUpSaveAndDoneDoNothing)
{
    auto e = ready(movie(1));
    e->setShareSheetUp(true);
    e->saveAction();
    e->doneAction();
    spin(300);
    EXPECT_TRUE(delegate.reports.isEmpty());
    EXPECT_TRUE(e->activityTypes().isEmpty());
}

TEST_F(EditorSaveTest, UnavailableLibraryStillFinishesAndKeepsTheMovie)
{
    const QString blocker = scratch.write(QStringLiteral("not-a-directory"), 1);
    useLibrary(blocker + QStringLiteral("/Videos"));
    LogCapture logs;
    const QString source = movie(1, 320, 240, 0, 2);
    auto e = ready(source);
    e->saveAction();
    ASSERT_TRUE(waitForReport());
    EXPECT_EQ(delegate.reports.first(), QStringList{kSave});
    EXPECT_TRUE(QFile::exists(source)) << "a failed library write removes nothing";
    EXPECT_EQ(logs.count(QStringLiteral("Error writing video to camera roll: 4")), 1);
}

} // namespace
} // namespace zaf::test
