// ShareSheet and the platform share activities on real widgets; programs they run are stand-ins.
#include "platform/ui/bar_button_item.h"
#include "platform/ui/share_activities.h"
#include "platform/ui/share_sheet.h"
#include "platform/ui/window_host.h"
#include "tests/support/log_capture.h"
#include "tests/support/temp_dir.h"
#include "tests/support/wait_until.h"

#include <QAbstractButton>
#include <QApplication>
#include <QClipboard>
#include <QDir>
#include <QFileInfo>
#include <QMimeData>
#include <QPushButton>
#include <gtest/gtest.h>

#include <algorithm>
#include <optional>
#include <sys/stat.h>

namespace zaf::ui {
namespace {

using test::waitUntil;

QString typeOf(const char *activityType) { return QString::fromLatin1(activityType); }

// How a run ended, as "type completed|cancelled error-code" ("-" without an error).
QString outcome(const QString &type, bool completed, std::optional<int> errorCode = {})
{
    return QStringLiteral("%1 %2 %3").arg(type, completed ? "completed" : "cancelled",
                                          errorCode ? QString::number(*errorCode) : QStringLiteral("-"));
}

class CustomActivity : public ShareActivity {
public:
    CustomActivity(QString type, ViewController *controller = nullptr, bool canPerform = true)
        : m_type(std::move(type)), m_controller(controller), m_canPerform(canPerform) {}
    QString activityType() const override { return m_type; }
    QString activityTitle() const override { return QStringLiteral("Custom ") + m_type; }
    bool canPerformWithActivityItems(const QVariantList &) override { return m_canPerform; }
    void prepareWithActivityItems(const QVariantList &items) override
    {
        ShareActivity::prepareWithActivityItems(items);
        ++m_prepared;
    }
    ViewController *activityViewController() override { return m_controller; }
    void performActivity() override { ++m_performed; }

    int m_prepared = 0;
    int m_performed = 0;

private:
    QString m_type;
    ViewController *m_controller;
    bool m_canPerform;
};

// Sets an environment variable for the life of the object.
class ScopedEnv {
public:
    ScopedEnv(const char *name, const QString &value) : m_name(name), m_old(qgetenv(name)) { qputenv(name, value.toLocal8Bit()); }
    ~ScopedEnv() { m_old.isNull() ? qunsetenv(m_name) : qputenv(m_name, m_old); }

private:
    const char *m_name;
    QByteArray m_old;
};

void writeFile(const QString &path, const QByteArray &bytes)
{
    QDir().mkpath(QFileInfo(path).path());
    QFile file(path);
    ASSERT_TRUE(file.open(QIODevice::WriteOnly));
    file.write(bytes);
}

// Runs an activity on items as the sheet would, waits for its end and tells how it ended.
QString run(ShareActivity &activity, const QVariantList &items)
{
    std::optional<bool> completed;
    QObject::connect(&activity, &ShareActivity::activityFinished, &activity, [&](bool done) { completed = done; });
    EXPECT_TRUE(activity.canPerformWithActivityItems(items));
    activity.prepareWithActivityItems(items);
    activity.performActivity();
    EXPECT_TRUE(waitUntil([&] { return completed.has_value(); }));
    QObject::disconnect(&activity, &ShareActivity::activityFinished, &activity, nullptr);
    const std::optional<Error> error = activity.activityError();
    return outcome({}, completed.value_or(false), error ? std::optional(error->code) : std::nullopt);
}

// A shown window whose root controller presents the sheets, a movie and a scratch directory.
struct ShareTest : ::testing::Test {
    test::ScratchDir scratch;
    QString movie = scratch.write(QStringLiteral("movie.mov"), 64);
    ViewController root;
    std::optional<WindowHost> host;
    QStringList completions;

    void SetUp() override
    {
        root.view()->resize(480, 320);
        host.emplace(&root);
        host->show();
    }
    void TearDown() override
    {
        if (root.presentedViewController())
            root.dismissViewController(false);
        QApplication::processEvents();
    }
    QVariantList items() const { return {QStringLiteral("Look at this"), QUrl::fromLocalFile(movie)}; }
    void watch(ShareSheet &sheet)
    {
        completions.clear();
        sheet.setCompletionWithItemsHandler([this](const QString &type, bool completed, const QVariantList &returned,
                                                   const std::optional<Error> &error) {
            completions << outcome(type, completed, error ? std::optional(error->code) : std::nullopt);
            EXPECT_TRUE(returned.isEmpty());
        });
    }
    // Waits for the completion, then lets any duplicate run arrive before the caller checks the list.
    bool waitForCompletion()
    {
        const bool done = waitUntil([&] { return !completions.isEmpty(); });
        QApplication::processEvents();
        return done;
    }

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
        for (const QByteArray &argument : test::fileContents(argvFile()).split('\0'))
            arguments.append(QString::fromUtf8(argument));
        if (!arguments.isEmpty())
            arguments.removeLast();   // after the last NUL
        return arguments;
    }
};

TEST_F(ShareTest, ListsActivitiesInTheGivenOrderWithoutExcludedOnes)
{
    CustomActivity custom(QStringLiteral("org.example.Custom"));
    CustomActivity unable(QStringLiteral("org.example.Unable"), nullptr, false);
    ShareSheet sheet(items(), {&custom, &unable});
    sheet.setExcludedActivityTypes({typeOf(kActivityTypeMail)});
    sheet.setActivityTypeOrder({QStringLiteral("org.example.Custom"), typeOf(kActivityTypeMessage),
                                typeOf(kActivityTypeOpenWith), typeOf(kActivityTypeCopyToPasteboard)});
    EXPECT_EQ(sheet.visibleActivityTypes(),
              (QStringList{QStringLiteral("org.example.Custom"), typeOf(kActivityTypeOpenWith),
                           typeOf(kActivityTypeCopyToPasteboard), typeOf(kActivityTypeSaveToPhotoLibrary),
                           typeOf(kActivityTypeSaveToFolder)}));
    QAbstractButton *button = sheet.buttonForActivityType(QStringLiteral("org.example.Custom"));
    ASSERT_NE(button, nullptr);
    EXPECT_EQ(button->text(), QStringLiteral("Custom org.example.Custom"));
    EXPECT_EQ(sheet.buttonForActivityType(typeOf(kActivityTypeMail)), nullptr);
    EXPECT_EQ(sheet.buttonForActivityType(QStringLiteral("org.example.Unable")), nullptr);
    ASSERT_NE(sheet.cancelButton(), nullptr);

    // Changing the lists afterwards updates the buttons; no order means the default order.
    sheet.setActivityTypeOrder({});
    sheet.setExcludedActivityTypes({typeOf(kActivityTypeSaveToFolder)});
    EXPECT_EQ(sheet.visibleActivityTypes().first(), typeOf(kActivityTypeMail));
    EXPECT_EQ(sheet.visibleActivityTypes().last(), QStringLiteral("org.example.Custom"));
    EXPECT_EQ(sheet.buttonForActivityType(typeOf(kActivityTypeSaveToFolder)), nullptr);
    EXPECT_NE(sheet.buttonForActivityType(typeOf(kActivityTypeMail)), nullptr);

    // Text alone offers no file activities.
    ShareSheet textOnly({QStringLiteral("just text")}, {});
    EXPECT_EQ(textOnly.visibleActivityTypes(), (QStringList{typeOf(kActivityTypeMail), typeOf(kActivityTypeCopyToPasteboard)}));
}

TEST_F(ShareTest, CancelOrClosingTheWindowCompletesOnceWithNoType)
{
    for (const bool viaButton : {true, false}) {
        SCOPED_TRACE(viaButton ? "cancel button" : "window closed");
        CustomActivity custom(QStringLiteral("org.example.Custom"));
        ShareSheet sheet(items(), {&custom});
        watch(sheet);
        bool presented = false;
        root.presentViewController(&sheet, true, [&] { presented = true; });
        ASSERT_EQ(root.presentedViewController(), &sheet);
        ASSERT_TRUE(waitUntil([&] { return presented; }));

        if (viaButton)
            sheet.cancelButton()->click();
        else
            root.presentationWindow()->close();
        EXPECT_EQ(root.presentedViewController(), nullptr);
        ASSERT_TRUE(waitUntil([&] { return !completions.isEmpty(); }));
        sheet.cancel();   // a second cancel does nothing
        ASSERT_TRUE(waitForCompletion());
        EXPECT_EQ(completions, QStringList{outcome({}, false)});
        EXPECT_EQ(custom.m_prepared, 0);
    }
}

TEST_F(ShareTest, ApplicationActivityControllerIsPresentedUntilItFinishesOrIsDestroyed)
{
    for (const bool destroy : {false, true}) {
        SCOPED_TRACE(destroy ? "destroyed" : "finished");
        ViewController form;
        form.view()->resize(300, 200);
        auto *custom = new CustomActivity(QStringLiteral("org.example.Publish"), &form);
        ShareSheet sheet(items(), {custom});
        watch(sheet);
        root.presentViewController(&sheet, true);
        sheet.buttonForActivityType(QStringLiteral("org.example.Publish"))->click();
        ASSERT_TRUE(waitUntil([&] { return root.presentedViewController() == &form; }));
        EXPECT_EQ(custom->m_prepared, 1);
        EXPECT_EQ(custom->m_performed, 0);
        EXPECT_EQ(custom->activityItems(), items());
        EXPECT_TRUE(completions.isEmpty());

        if (destroy)
            delete custom;
        else
            custom->activityDidFinish(true);
        EXPECT_EQ(root.presentedViewController(), nullptr);
        ASSERT_TRUE(waitUntil([&] { return !completions.isEmpty(); }));
        if (!destroy) {
            custom->activityDidFinish(false);   // ignored: the activity has ended
            delete custom;
        }
        ASSERT_TRUE(waitForCompletion());
        EXPECT_EQ(completions, QStringList{destroy ? outcome(QStringLiteral("org.example.Publish"), false, kShareErrorNoItems)
                                                   : outcome(QStringLiteral("org.example.Publish"), true)});
    }
}

TEST_F(ShareTest, ActivityWithoutControllerIsPerformedAndReportsItsError)
{
    CustomActivity custom(QStringLiteral("org.example.Quick"));
    ShareSheet sheet(items(), {&custom});
    watch(sheet);
    root.presentViewController(&sheet, false);
    sheet.chooseActivity(&custom);
    EXPECT_EQ(root.presentedViewController(), nullptr);
    ASSERT_TRUE(waitUntil([&] { return custom.m_performed == 1; }));
    custom.setActivityError(Error{QStringLiteral("org.example"), 7, QStringLiteral("refused")});
    custom.activityDidFinish(false);
    ASSERT_TRUE(waitForCompletion());
    EXPECT_EQ(completions, QStringList{outcome(QStringLiteral("org.example.Quick"), false, 7)});
}

TEST_F(ShareTest, PopoverIsAnchoredAtTheSourceItem)
{
    auto *anchor = new QPushButton(QStringLiteral("Share"), root.view());
    anchor->setGeometry(200, 20, 60, 30);
    anchor->show();
    BarButtonItem item(anchor);
    ShareSheet sheet(items(), {});
    sheet.setPopoverSourceItem(&item);
    root.presentViewController(&sheet, false);
    QWidget *window = root.presentationWindow();
    ASSERT_NE(window, nullptr);
    EXPECT_TRUE(window->windowFlags().testFlag(Qt::Popup));
    EXPECT_TRUE(window->isVisible());
    const QRect anchorRect(anchor->mapToGlobal(QPoint(0, 0)), anchor->size());
    const QRect popup = window->frameGeometry();
    // Right below or right above the anchor, overlapping it horizontally.
    const bool below = popup.top() >= anchorRect.bottom() && popup.top() - anchorRect.bottom() <= 8;
    const bool above = popup.bottom() <= anchorRect.top() && anchorRect.top() - popup.bottom() <= 8;
    EXPECT_TRUE(below || above) << popup.top() << " " << popup.bottom() << " " << anchorRect.top();
    EXPECT_TRUE(popup.left() <= anchorRect.right() && popup.right() >= anchorRect.left());

    // Without a source item the sheet stays a centred dialog.
    root.dismissViewController(false);
    ShareSheet plain(items(), {});
    root.presentViewController(&plain, false);
    EXPECT_FALSE(root.presentationWindow()->windowFlags().testFlag(Qt::Popup));
}

TEST_F(ShareTest, CopyButtonPutsTheFileAndTheTextsOnTheClipboard)
{
    EXPECT_FALSE(CopyShareActivity().canPerformWithActivityItems({}));
    ShareSheet sheet(items(), {});
    watch(sheet);
    root.presentViewController(&sheet, false);
    QApplication::clipboard()->clear();
    sheet.buttonForActivityType(typeOf(kActivityTypeCopyToPasteboard))->click();
    ASSERT_TRUE(waitForCompletion());
    EXPECT_EQ(completions, QStringList{outcome(typeOf(kActivityTypeCopyToPasteboard), true)});
    const QMimeData *data = QApplication::clipboard()->mimeData();
    ASSERT_NE(data, nullptr);
    EXPECT_EQ(data->urls(), QList<QUrl>{QUrl::fromLocalFile(movie)});
    EXPECT_EQ(QString::fromUtf8(data->data(QStringLiteral("text/uri-list"))).trimmed(), QUrl::fromLocalFile(movie).toString());
    EXPECT_EQ(data->text(), QStringLiteral("Look at this\n") + QUrl::fromLocalFile(movie).toString());
}

TEST_F(ShareTest, OpenWithFromItsButtonRunsTheOpenerAndReportsItsFailure)
{
    for (int status : {0, 1}) {
        SCOPED_TRACE(status);
        ScopedEnv program("ZAF_XDG_OPEN", stub(status));
        ShareSheet sheet(items(), {});
        watch(sheet);
        root.presentViewController(&sheet, false);
        sheet.buttonForActivityType(typeOf(kActivityTypeOpenWith))->click();
        ASSERT_TRUE(waitForCompletion());
        EXPECT_EQ(completions, QStringList{status ? outcome(typeOf(kActivityTypeOpenWith), false, kShareErrorProgramFailed)
                                                  : outcome(typeOf(kActivityTypeOpenWith), true)});
        EXPECT_EQ(recordedArguments(), QStringList{movie});
        QFile::remove(argvFile());
    }
}

TEST_F(ShareTest, MailAttachesACopyOfACachedMovieAndSendsTheTexts)
{
    ScopedEnv program("ZAF_XDG_EMAIL", stub(0));
    ScopedEnv cache("XDG_CACHE_HOME", scratch.file(QStringLiteral("cache")));
    ScopedEnv data("XDG_DATA_HOME", scratch.file(QStringLiteral("data")));
    const QString cached = scratch.file(QStringLiteral("cache/Zafrel/ABC/movie.mov"));
    writeFile(cached, "movie bytes");
    const QVariantList items{QStringLiteral("Made with the recorder"), QStringLiteral("https://example.org/app"),
                             QUrl::fromLocalFile(cached)};

    MailShareActivity mail;
    EXPECT_EQ(run(mail, items), outcome({}, true));
    const QString shared = scratch.file(QStringLiteral("data/Zafrel/Shared/"));
    EXPECT_EQ(MailShareActivity::sharedFolderPath(), shared);
    EXPECT_EQ(recordedArguments(),
              (QStringList{QStringLiteral("--body"), QStringLiteral("Made with the recorder\n\nhttps://example.org/app"),
                           QStringLiteral("--attach"), shared + QStringLiteral("movie.mov")}));
    EXPECT_EQ(test::fileContents(shared + QStringLiteral("movie.mov")), QByteArray("movie bytes"));
    EXPECT_EQ(QFileInfo(shared).permissions() & (QFile::ReadGroup | QFile::ReadOther | QFile::ExeOther), QFile::Permissions());

    // A second mail of the same movie gets a copy of its own.
    MailShareActivity again;
    EXPECT_EQ(run(again, items), outcome({}, true));
    EXPECT_EQ(recordedArguments().last(), shared + QStringLiteral("movie 2.mov"));
}

TEST_F(ShareTest, MailAttachesALastingFileInPlace)
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
    EXPECT_EQ(run(mail, {QUrl::fromLocalFile(lasting)}), outcome({}, true));
    EXPECT_EQ(recordedArguments(), (QStringList{QStringLiteral("--attach"), lasting}));
}

TEST_F(ShareTest, FailingOrMissingMailProgramAndMissingAttachmentEndNotCompletedWithAnError)
{
    ScopedEnv program("ZAF_XDG_EMAIL", stub(3));
    test::LogCapture logs;
    // Errors must reach the log whatever the logging rules of the run say.
    const_cast<QLoggingCategory &>(lcShare()).setEnabled(QtWarningMsg, true);
    MailShareActivity mail;
    ASSERT_EQ(run(mail, {QStringLiteral("hello")}), outcome({}, false, kShareErrorProgramFailed));
    EXPECT_EQ(mail.activityError()->domain, typeOf(kShareErrorDomain));
    EXPECT_TRUE(mail.activityError()->message.contains(QStringLiteral("status 3")));
    EXPECT_TRUE(mail.activityError()->message.contains(QStringLiteral("stub says no")));
    const QList<test::LogEntry> entries = logs.entries();
    EXPECT_TRUE(std::any_of(entries.begin(), entries.end(), [](const test::LogEntry &entry) {
        return entry.category == QStringLiteral("zaf.share") && entry.type == QtWarningMsg;
    }));

    ScopedEnv missingProgram("ZAF_XDG_EMAIL", scratch.file(QStringLiteral("no-such-program")));
    MailShareActivity unstarted;
    EXPECT_EQ(run(unstarted, {QStringLiteral("hello")}), outcome({}, false, kShareErrorProgramFailed));

    QFile::remove(argvFile());
    ScopedEnv working("ZAF_XDG_EMAIL", stub(0));
    MailShareActivity missing;
    EXPECT_EQ(run(missing, {QUrl::fromLocalFile(scratch.file(QStringLiteral("gone.mov")))}),
              outcome({}, false, kShareErrorNoItems));
    EXPECT_FALSE(QFile::exists(argvFile()));   // the program never ran
}

TEST_F(ShareTest, SaveToFolderNeverOverwrites)
{
    const QString source = scratch.file(QStringLiteral("source/Movie.mov"));
    writeFile(source, "new movie");
    const QString folder = scratch.file(QStringLiteral("target"));
    writeFile(folder + QStringLiteral("/Movie.mov"), "older one");
    QWidget *chooserParent = reinterpret_cast<QWidget *>(1);
    QString chosen = folder;
    SaveToFolderShareActivity::setFolderChooserForTesting([&](QWidget *parent, std::function<void(const QString &)> done) {
        chooserParent = parent;
        done(chosen);
    });

    SaveToFolderShareActivity first;
    EXPECT_EQ(run(first, {QUrl::fromLocalFile(source)}), outcome({}, true));
    EXPECT_EQ(chooserParent, nullptr);
    EXPECT_EQ(first.savedPaths(), QStringList{folder + QStringLiteral("/Movie 2.mov")});
    EXPECT_EQ(test::fileContents(folder + QStringLiteral("/Movie.mov")), QByteArray("older one"));
    EXPECT_EQ(test::fileContents(folder + QStringLiteral("/Movie 2.mov")), QByteArray("new movie"));
    SaveToFolderShareActivity second;
    EXPECT_EQ(run(second, {QUrl::fromLocalFile(source)}), outcome({}, true));
    EXPECT_EQ(second.savedPaths(), QStringList{folder + QStringLiteral("/Movie 3.mov")});

    // A missing source is an error; cancelling the chooser ends the activity without one.
    SaveToFolderShareActivity missing;
    EXPECT_EQ(run(missing, {QUrl::fromLocalFile(scratch.file(QStringLiteral("gone.mov")))}),
              outcome({}, false, kShareErrorCopyFailed));
    chosen.clear();
    SaveToFolderShareActivity cancelled;
    EXPECT_EQ(run(cancelled, {QUrl::fromLocalFile(source)}), outcome({}, false));
    SaveToFolderShareActivity::setFolderChooserForTesting({});

    EXPECT_EQ(SaveToFolderShareActivity::uniqueDestination(QStringLiteral("/d"), QStringLiteral(".hidden"), 2),
              QStringLiteral("/d/.hidden 2"));
    EXPECT_EQ(SaveToFolderShareActivity::uniqueDestination(QStringLiteral("/d/"), QStringLiteral("a.b.mov"), 4),
              QStringLiteral("/d/a.b 4.mov"));
}

TEST_F(ShareTest, VideoLibraryRefusesAFileThatIsNotAMovie)
{
    ScopedEnv library("ZAF_VIDEO_LIBRARY", scratch.file(QStringLiteral("library")));
    SaveToVideoLibraryShareActivity save;
    EXPECT_NE(run(save, {QUrl::fromLocalFile(scratch.write(QStringLiteral("notes.mov"), 100))}), outcome({}, true));
    ASSERT_TRUE(save.activityError().has_value());
    EXPECT_EQ(save.activityError()->domain, QStringLiteral("zaf.photos"));
}

} // namespace
} // namespace zaf::ui
