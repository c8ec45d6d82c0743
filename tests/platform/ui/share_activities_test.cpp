// The platform share activities: mail and open with through a stand-in program that records its
// arguments, save to a folder without overwriting, the video library refusing a non-movie, copy to
// the clipboard, and the failures (a program that fails or is missing, a missing attachment).
#include "platform/ui/share_activities.h"
#include "platform/ui/share_sheet.h"
#include "platform/ui/view_controller.h"
#include "platform/ui/window_host.h"
#include "tests/support/log_capture.h"
#include "tests/support/temp_dir.h"

#include <QAbstractButton>
#include <QApplication>
#include <QClipboard>
#include <QDeadlineTimer>
#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QMimeData>
#include <gtest/gtest.h>

#include <functional>
#include <optional>
#include <sys/stat.h>

namespace zaf::ui {
namespace {

bool waitUntil(const std::function<bool()> &condition)
{
    QDeadlineTimer deadline(5000);
    while (!condition()) {
        if (deadline.hasExpired())
            return false;
        QApplication::processEvents(QEventLoop::AllEvents, 20);
    }
    return true;
}

// Sets an environment variable for the life of the object.
class ScopedEnv {
public:
    ScopedEnv(const char *name, const QString &value) : m_name(name), m_had(qEnvironmentVariableIsSet(name)), m_old(qgetenv(name))
    {
        qputenv(name, value.toLocal8Bit());
    }
    ~ScopedEnv()
    {
        if (m_had)
            qputenv(m_name, m_old);
        else
            qunsetenv(m_name);
    }

private:
    const char *m_name;
    bool m_had;
    QByteArray m_old;
};

QByteArray readAll(const QString &path)
{
    QFile file(path);
    return file.open(QIODevice::ReadOnly) ? file.readAll() : QByteArray();
}

void writeFile(const QString &path, const QByteArray &bytes)
{
    QDir().mkpath(QFileInfo(path).path());
    QFile file(path);
    ASSERT_TRUE(file.open(QIODevice::WriteOnly));
    file.write(bytes);
}

struct Outcome {
    bool finished = false;
    bool completed = false;
};

// Runs an activity on items as the sheet would and waits for its end.
Outcome run(ShareActivity &activity, const QVariantList &items)
{
    Outcome outcome;
    QObject::connect(&activity, &ShareActivity::activityFinished, &activity, [&outcome](bool completed) {
        outcome.finished = true;
        outcome.completed = completed;
    });
    EXPECT_TRUE(activity.canPerformWithActivityItems(items));
    activity.prepareWithActivityItems(items);
    activity.performActivity();
    EXPECT_TRUE(waitUntil([&] { return outcome.finished; }));
    QObject::disconnect(&activity, &ShareActivity::activityFinished, &activity, nullptr);
    return outcome;
}

struct ActivitiesFixture : ::testing::Test {
    test::ScratchDir scratch;

    // A stand-in program that writes its arguments, each ended by NUL, to argv.bin, then exits.
    QString stub(int exitStatus)
    {
        const QString path = scratch.file(QStringLiteral("stub.sh"));
        writeFile(path, QStringLiteral("#!/bin/sh\nfor a in \"$@\"; do printf '%s\\0' \"$a\"; done > '%1'\n"
                                       "echo 'stub says no' >&2\nexit %2\n")
                            .arg(argvFile())
                            .arg(exitStatus)
                            .toUtf8());
        ::chmod(QFile::encodeName(path).constData(), 0755);
        return path;
    }
    QString argvFile() const { return scratch.file(QStringLiteral("argv.bin")); }
    QStringList recordedArguments() const
    {
        QStringList arguments;
        for (const QByteArray &argument : readAll(argvFile()).split('\0'))
            arguments.append(QString::fromUtf8(argument));
        if (!arguments.isEmpty())
            arguments.removeLast();   // after the last NUL
        return arguments;
    }
};

TEST_F(ActivitiesFixture, MailAttachesACopyOfACachedMovieAndSendsTheTexts)
{
    ScopedEnv program("ZAF_XDG_EMAIL", stub(0));
    ScopedEnv cache("XDG_CACHE_HOME", scratch.file(QStringLiteral("cache")));
    ScopedEnv data("XDG_DATA_HOME", scratch.file(QStringLiteral("data")));
    const QString movie = scratch.file(QStringLiteral("cache/Zafrel/ABC/movie.mov"));
    writeFile(movie, "movie bytes");
    const QVariantList items{QStringLiteral("Made with the recorder"), QStringLiteral("https://example.org/app"),
                             QUrl::fromLocalFile(movie)};

    MailShareActivity mail;
    const Outcome outcome = run(mail, items);
    EXPECT_TRUE(outcome.completed);
    EXPECT_FALSE(mail.activityError().has_value());
    const QString shared = scratch.file(QStringLiteral("data/Zafrel/Shared/"));
    EXPECT_EQ(MailShareActivity::sharedFolderPath(), shared);
    EXPECT_EQ(recordedArguments(),
              (QStringList{QStringLiteral("--body"), QStringLiteral("Made with the recorder\n\nhttps://example.org/app"),
                           QStringLiteral("--attach"), shared + QStringLiteral("movie.mov")}));
    EXPECT_EQ(readAll(shared + QStringLiteral("movie.mov")), QByteArray("movie bytes"));
    QFileInfo folder(shared);
    EXPECT_EQ(folder.permissions() & (QFile::ReadGroup | QFile::ReadOther | QFile::ExeOther), QFile::Permissions());

    // A second mail of the same movie gets a copy of its own.
    MailShareActivity again;
    EXPECT_TRUE(run(again, items).completed);
    EXPECT_EQ(recordedArguments().last(), shared + QStringLiteral("movie 2.mov"));
}

TEST_F(ActivitiesFixture, MailAttachesALastingFileInPlace)
{
    ScopedEnv program("ZAF_XDG_EMAIL", stub(0));
    ScopedEnv temporary("TMPDIR", scratch.file(QStringLiteral("tmp")));
    ScopedEnv cache("XDG_CACHE_HOME", scratch.file(QStringLiteral("cache")));
    const QString lasting = scratch.file(QStringLiteral("Documents/lasting.mov"));
    writeFile(lasting, "x");
    QDir().mkpath(scratch.file(QStringLiteral("tmp")));
    ASSERT_FALSE(MailShareActivity::isInVolatileDirectory(lasting));
    EXPECT_TRUE(MailShareActivity::isInVolatileDirectory(scratch.file(QStringLiteral("tmp/a.mov"))));
    MailShareActivity mail;
    EXPECT_TRUE(run(mail, {QUrl::fromLocalFile(lasting)}).completed);
    EXPECT_EQ(recordedArguments(), (QStringList{QStringLiteral("--attach"), lasting}));
}

TEST_F(ActivitiesFixture, FailingMailProgramEndsNotCompletedWithAnError)
{
    ScopedEnv program("ZAF_XDG_EMAIL", stub(3));
    test::LogCapture logs;
    // Errors must reach the log whatever the logging rules of the run say.
    const_cast<QLoggingCategory &>(lcShare()).setEnabled(QtWarningMsg, true);
    MailShareActivity mail;
    const Outcome outcome = run(mail, {QStringLiteral("hello")});
    EXPECT_FALSE(outcome.completed);
    ASSERT_TRUE(mail.activityError().has_value());
    EXPECT_EQ(mail.activityError()->domain, QString::fromLatin1(kShareErrorDomain));
    EXPECT_EQ(mail.activityError()->code, kShareErrorProgramFailed);
    EXPECT_TRUE(mail.activityError()->message.contains(QStringLiteral("status 3")));
    EXPECT_TRUE(mail.activityError()->message.contains(QStringLiteral("stub says no")));
    bool logged = false;
    for (const test::LogEntry &entry : logs.entries())
        logged = logged || (entry.category == QStringLiteral("zaf.share") && entry.type == QtWarningMsg);
    EXPECT_TRUE(logged);
}

TEST_F(ActivitiesFixture, MissingProgramAndMissingAttachmentEndNotCompleted)
{
    ScopedEnv program("ZAF_XDG_EMAIL", scratch.file(QStringLiteral("no-such-program")));
    MailShareActivity mail;
    EXPECT_FALSE(run(mail, {QStringLiteral("hello")}).completed);
    ASSERT_TRUE(mail.activityError().has_value());
    EXPECT_EQ(mail.activityError()->code, kShareErrorProgramFailed);

    ScopedEnv working("ZAF_XDG_EMAIL", stub(0));
    MailShareActivity missing;
    EXPECT_FALSE(run(missing, {QUrl::fromLocalFile(scratch.file(QStringLiteral("gone.mov")))}).completed);
    ASSERT_TRUE(missing.activityError().has_value());
    EXPECT_EQ(missing.activityError()->code, kShareErrorNoItems);
    EXPECT_FALSE(QFile::exists(argvFile()));   // the program never ran
}

TEST_F(ActivitiesFixture, OpenWithThroughTheSheetRunsTheOpenerAndReportsItsFailure)
{
    const QString movie = scratch.write(QStringLiteral("movie.mov"), 16);
    ViewController root;
    WindowHost host(&root);
    host.show();

    for (int status : {0, 1}) {
        ScopedEnv program("ZAF_XDG_OPEN", stub(status));
        ShareSheet sheet({QStringLiteral("text"), QUrl::fromLocalFile(movie)}, {});
        int calls = 0;
        QString type;
        bool completed = !status;
        std::optional<Error> error;
        sheet.setCompletionWithItemsHandler([&](const QString &t, bool c, const QVariantList &, const std::optional<Error> &e) {
            ++calls;
            type = t;
            completed = c;
            error = e;
        });
        root.presentViewController(&sheet, false);
        sheet.buttonForActivityType(QString::fromLatin1(kActivityTypeOpenWith))->click();
        ASSERT_TRUE(waitUntil([&] { return calls > 0; }));
        QApplication::processEvents();
        EXPECT_EQ(calls, 1);
        EXPECT_EQ(type, QString::fromLatin1(kActivityTypeOpenWith));
        EXPECT_EQ(recordedArguments(), QStringList{movie});
        EXPECT_EQ(completed, status == 0);
        EXPECT_EQ(error.has_value(), status != 0);
        QFile::remove(argvFile());
    }
}

TEST_F(ActivitiesFixture, SaveToFolderNeverOverwrites)
{
    const QString movie = scratch.file(QStringLiteral("source/Movie.mov"));
    writeFile(movie, "new movie");
    const QString folder = scratch.file(QStringLiteral("target"));
    writeFile(folder + QStringLiteral("/Movie.mov"), "older one");
    QWidget *chooserParent = reinterpret_cast<QWidget *>(1);
    SaveToFolderShareActivity::setFolderChooserForTesting([&](QWidget *parent, std::function<void(const QString &)> done) {
        chooserParent = parent;
        done(folder);
    });

    SaveToFolderShareActivity first;
    EXPECT_TRUE(run(first, {QUrl::fromLocalFile(movie)}).completed);
    EXPECT_EQ(chooserParent, nullptr);
    EXPECT_EQ(first.savedPaths(), QStringList{folder + QStringLiteral("/Movie 2.mov")});
    EXPECT_EQ(readAll(folder + QStringLiteral("/Movie.mov")), QByteArray("older one"));
    EXPECT_EQ(readAll(folder + QStringLiteral("/Movie 2.mov")), QByteArray("new movie"));

    SaveToFolderShareActivity second;
    EXPECT_TRUE(run(second, {QUrl::fromLocalFile(movie)}).completed);
    EXPECT_EQ(second.savedPaths(), QStringList{folder + QStringLiteral("/Movie 3.mov")});

    // Cancelling the chooser ends the activity without an error; a missing source is an error.
    SaveToFolderShareActivity::setFolderChooserForTesting([](QWidget *, std::function<void(const QString &)> done) { done({}); });
    SaveToFolderShareActivity cancelled;
    EXPECT_FALSE(run(cancelled, {QUrl::fromLocalFile(movie)}).completed);
    EXPECT_FALSE(cancelled.activityError().has_value());
    SaveToFolderShareActivity::setFolderChooserForTesting([&](QWidget *, std::function<void(const QString &)> done) { done(folder); });
    SaveToFolderShareActivity missing;
    EXPECT_FALSE(run(missing, {QUrl::fromLocalFile(scratch.file(QStringLiteral("gone.mov")))}).completed);
    ASSERT_TRUE(missing.activityError().has_value());
    EXPECT_EQ(missing.activityError()->code, kShareErrorCopyFailed);
    SaveToFolderShareActivity::setFolderChooserForTesting({});

    EXPECT_EQ(SaveToFolderShareActivity::uniqueDestination(QStringLiteral("/d"), QStringLiteral(".hidden"), 2),
              QStringLiteral("/d/.hidden 2"));
    EXPECT_EQ(SaveToFolderShareActivity::uniqueDestination(QStringLiteral("/d/"), QStringLiteral("a.b.mov"), 4),
              QStringLiteral("/d/a.b 4.mov"));
}

TEST_F(ActivitiesFixture, VideoLibraryRefusesAFileThatIsNotAMovie)
{
    ScopedEnv library("ZAF_VIDEO_LIBRARY", scratch.file(QStringLiteral("library")));
    const QString notMovie = scratch.write(QStringLiteral("notes.mov"), 100);
    SaveToVideoLibraryShareActivity save;
    EXPECT_EQ(save.activityType(), QStringLiteral("com.zafrel.activity.SaveToPhotoLibrary"));
    EXPECT_FALSE(run(save, {QUrl::fromLocalFile(notMovie)}).completed);
    ASSERT_TRUE(save.activityError().has_value());
    EXPECT_EQ(save.activityError()->domain, QStringLiteral("zaf.photos"));
}

TEST_F(ActivitiesFixture, CopyPutsFileURIsAndTextsOnTheClipboard)
{
    const QString movie = scratch.write(QStringLiteral("movie.mov"), 8);
    CopyShareActivity copy;
    EXPECT_FALSE(copy.canPerformWithActivityItems({}));
    QApplication::clipboard()->clear();
    EXPECT_TRUE(run(copy, {QUrl::fromLocalFile(movie), QStringLiteral("caption")}).completed);
    const QMimeData *data = QApplication::clipboard()->mimeData();
    ASSERT_NE(data, nullptr);
    EXPECT_EQ(QString::fromUtf8(data->data(QStringLiteral("text/uri-list"))).trimmed(), QUrl::fromLocalFile(movie).toString());
    EXPECT_EQ(data->text(), QStringLiteral("caption\n") + QUrl::fromLocalFile(movie).toString());
}

} // namespace
} // namespace zaf::ui
