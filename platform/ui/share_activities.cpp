#include "platform/ui/share_activities.h"

#include "platform/dispatch.h"
#include "platform/files/file_manager.h"
#include "platform/log.h"
#include "platform/photos/photo_library.h"
#include "platform/ui/bundled_icons.h"

#include <QClipboard>
#include <QDir>
#include <QFileDialog>
#include <QFileInfo>
#include <QGuiApplication>
#include <QMimeData>
#include <QProcess>

#include <cerrno>
#include <sys/stat.h>

namespace zaf::ui {
namespace {

Error shareError(int code, const QString &message)
{
    return Error{QString::fromLatin1(kShareErrorDomain), code, message};
}

// The desktop theme's icon of that name, else the project's own glyph.
QIcon themedIcon(const char *name, const char *bundledName)
{
    const QIcon icon = QIcon::fromTheme(QString::fromLatin1(name));
    if (!icon.isNull())
        return icon;
    return bundledIcon(bundledName);
}

QString programFromEnvironment(const char *variable, const char *fallback)
{
    const QString program = qEnvironmentVariable(variable);
    return program.isEmpty() ? QString::fromLatin1(fallback) : program;
}

// Runs a helper program for an activity and finishes the activity when it ends.
void runProgram(ShareActivity *activity, const QString &program, const QStringList &arguments)
{
    log::info(lcShare(), QStringLiteral("Running %1 %2").arg(program, arguments.join(u' ')));
    auto *process = new QProcess(activity);
    process->setProgram(program);
    process->setArguments(arguments);
    process->setProcessChannelMode(QProcess::ForwardedOutputChannel);
    QObject::connect(process, &QProcess::errorOccurred, activity, [activity, process, program](QProcess::ProcessError error) {
        if (error != QProcess::FailedToStart)
            return;   // crashes and exits are handled by finished()
        activity->setActivityError(shareError(kShareErrorProgramFailed,
                                              QStringLiteral("Could not run %1: %2").arg(program, process->errorString())));
        activity->activityDidFinish(false);
        process->deleteLater();
    });
    QObject::connect(process, &QProcess::finished, activity, [activity, process, program](int exitCode, QProcess::ExitStatus status) {
        const QString errorText = QString::fromLocal8Bit(process->readAllStandardError()).trimmed();
        process->deleteLater();
        if (status == QProcess::NormalExit && exitCode == 0) {
            activity->activityDidFinish(true);
            return;
        }
        QString message = status == QProcess::CrashExit ? QStringLiteral("%1 crashed").arg(program)
                                                        : QStringLiteral("%1 exited with status %2").arg(program).arg(exitCode);
        if (!errorText.isEmpty())
            message += QStringLiteral(": ") + errorText;
        activity->setActivityError(shareError(kShareErrorProgramFailed, message));
        activity->activityDidFinish(false);
    });
    process->start();
}

// Splits "name.ext" into ("name", ".ext"); a leading dot is part of the name.
std::pair<QString, QString> splitExtension(const QString &fileName)
{
    const qsizetype dot = fileName.lastIndexOf(u'.');
    if (dot <= 0)
        return {fileName, QString()};
    return {fileName.left(dot), fileName.mid(dot)};
}

// Copies a file into a folder under the first free name; never overwrites. Returns the new path.
Result<QString> copyWithoutOverwriting(const QString &source, const QString &folder)
{
    const QString fileName = QFileInfo(source).fileName();
    const FileManager &files = FileManager::defaultManager();
    for (int attempt = 1; attempt <= 10000; ++attempt) {
        const QString destination = SaveToFolderShareActivity::uniqueDestination(folder, fileName, attempt);
        if (files.fileExistsAtPath(destination))
            continue;
        OptionalError error = files.copyItemAtPath(source, destination);
        if (!error)
            return Result<QString>::success(destination);
        if (error->domain == QLatin1String(kPosixErrorDomain) && error->code == EEXIST)
            continue;   // taken between the check and the copy: try the next name
        return Result<QString>::failure(shareError(kShareErrorCopyFailed,
                                                   QStringLiteral("Could not copy %1 to %2: %3").arg(source, destination, error->message)));
    }
    return Result<QString>::failure(shareError(kShareErrorCopyFailed, QStringLiteral("No free name for %1 in %2").arg(fileName, folder)));
}

// The path with symbolic links resolved when it exists (a temporary directory is often a link).
QString resolvedPath(const QString &path)
{
    const QString canonical = QFileInfo(path).canonicalFilePath();
    return canonical.isEmpty() ? QDir::cleanPath(path) : canonical;
}

bool pathIsInside(const QString &path, QString directory)
{
    if (directory.isEmpty())
        return false;
    directory = resolvedPath(directory);
    if (!directory.endsWith(u'/'))
        directory += u'/';
    return resolvedPath(path).startsWith(directory);
}

QString homeRelative(const char *variable, const char *underHome)
{
    const QString value = qEnvironmentVariable(variable);
    if (!value.isEmpty() && QDir::isAbsolutePath(value))
        return value;
    return QDir::homePath() + QLatin1Char('/') + QLatin1String(underHome);
}

SaveToFolderShareActivity::FolderChooser &folderChooserHook()
{
    static SaveToFolderShareActivity::FolderChooser hook;
    return hook;
}

void chooseFolderWithDialog(QWidget *parent, std::function<void(const QString &)> done)
{
    auto *dialog = new QFileDialog(parent, QObject::tr("Save to Folder"));
    dialog->setFileMode(QFileDialog::Directory);
    dialog->setOption(QFileDialog::ShowDirsOnly, true);
    dialog->setAcceptMode(QFileDialog::AcceptOpen);
    dialog->setAttribute(Qt::WA_DeleteOnClose);
    auto answered = std::make_shared<bool>(false);
    QObject::connect(dialog, &QFileDialog::fileSelected, dialog, [done, answered](const QString &folder) {
        *answered = true;
        done(folder);
    });
    QObject::connect(dialog, &QDialog::finished, dialog, [done, answered](int) {
        if (!*answered) {
            *answered = true;
            done(QString());
        }
    });
    dialog->open();
}

} // namespace

// ---- Mail

MailShareActivity::MailShareActivity(QObject *parent) : ShareActivity(parent) {}

QString MailShareActivity::activityType() const { return QString::fromLatin1(kActivityTypeMail); }
QString MailShareActivity::activityTitle() const { return tr("Mail"); }
QIcon MailShareActivity::activityImage() const { return themedIcon("mail-send", "mail"); }

bool MailShareActivity::canPerformWithActivityItems(const QVariantList &activityItems)
{
    return !fileURLsInItems(activityItems).isEmpty() || !textsInItems(activityItems).isEmpty();
}

QString MailShareActivity::sharedFolderPath()
{
    return homeRelative("XDG_DATA_HOME", ".local/share") + QStringLiteral("/Zafrel/Shared/");
}

bool MailShareActivity::isInVolatileDirectory(const QString &path)
{
    return pathIsInside(path, QDir::tempPath()) || pathIsInside(path, homeRelative("XDG_CACHE_HOME", ".cache"));
}

void MailShareActivity::performActivity()
{
    const QVariantList items = activityItems();
    QStringList arguments;
    const QStringList texts = textsInItems(items);
    if (!texts.isEmpty())
        arguments << QStringLiteral("--body") << texts.join(QStringLiteral("\n\n"));

    const FileManager &files = FileManager::defaultManager();
    for (const QUrl &url : fileURLsInItems(items)) {
        QString path = url.toLocalFile();
        if (!files.fileExistsAtPath(path)) {
            setActivityError(shareError(kShareErrorNoItems, QStringLiteral("The attachment %1 does not exist").arg(path)));
            activityDidFinish(false);
            return;
        }
        if (isInVolatileDirectory(path)) {
            const QString folder = sharedFolderPath();
            // The share folder is private to the user: made 0700, its parents with the usual mode.
            QDir().mkpath(QFileInfo(QDir::cleanPath(folder)).path());
            if (!files.fileExistsAtPath(folder)) {
                if (OptionalError error = files.createDirectoryAtPath(folder, true, 0700)) {
                    setActivityError(shareError(kShareErrorFolderUnavailable,
                                                QStringLiteral("Could not create %1: %2").arg(folder, error->message)));
                    activityDidFinish(false);
                    return;
                }
            }
            ::chmod(QFile::encodeName(folder).constData(), 0700);
            Result<QString> copy = copyWithoutOverwriting(path, folder);
            if (!copy.ok()) {
                setActivityError(copy.error);
                activityDidFinish(false);
                return;
            }
            path = *copy.value;
        }
        arguments << QStringLiteral("--attach") << path;
    }
    if (arguments.isEmpty()) {
        setActivityError(shareError(kShareErrorNoItems, QStringLiteral("Nothing to send by mail")));
        activityDidFinish(false);
        return;
    }
    runProgram(this, programFromEnvironment("ZAF_XDG_EMAIL", "xdg-email"), arguments);
}

// ---- Open with

OpenWithShareActivity::OpenWithShareActivity(QObject *parent) : ShareActivity(parent) {}

QString OpenWithShareActivity::activityType() const { return QString::fromLatin1(kActivityTypeOpenWith); }
QString OpenWithShareActivity::activityTitle() const { return tr("Open With"); }
QIcon OpenWithShareActivity::activityImage() const { return themedIcon("document-open", "open-with"); }

bool OpenWithShareActivity::canPerformWithActivityItems(const QVariantList &activityItems)
{
    return !fileURLsInItems(activityItems).isEmpty();
}

void OpenWithShareActivity::performActivity()
{
    const QList<QUrl> urls = fileURLsInItems(activityItems());
    if (urls.isEmpty() || !FileManager::defaultManager().fileExistsAtPath(urls.first().toLocalFile())) {
        setActivityError(shareError(kShareErrorNoItems, urls.isEmpty() ? QStringLiteral("No file to open")
                                                                       : QStringLiteral("%1 does not exist").arg(urls.first().toLocalFile())));
        activityDidFinish(false);
        return;
    }
    runProgram(this, programFromEnvironment("ZAF_XDG_OPEN", "xdg-open"), {urls.first().toLocalFile()});
}

// ---- Save to folder

SaveToFolderShareActivity::SaveToFolderShareActivity(QObject *parent) : ShareActivity(parent) {}

QString SaveToFolderShareActivity::activityType() const { return QString::fromLatin1(kActivityTypeSaveToFolder); }
QString SaveToFolderShareActivity::activityTitle() const { return tr("Save to Folder"); }
QIcon SaveToFolderShareActivity::activityImage() const { return themedIcon("folder", "folder"); }

bool SaveToFolderShareActivity::canPerformWithActivityItems(const QVariantList &activityItems)
{
    return !fileURLsInItems(activityItems).isEmpty();
}

void SaveToFolderShareActivity::setFolderChooserForTesting(FolderChooser chooser)
{
    folderChooserHook() = std::move(chooser);
}

QString SaveToFolderShareActivity::uniqueDestination(const QString &folder, const QString &fileName, int attempt)
{
    QString directory = folder;
    if (!directory.endsWith(u'/'))
        directory += u'/';
    if (attempt <= 1)
        return directory + fileName;
    const auto [base, extension] = splitExtension(fileName);
    return directory + base + QStringLiteral(" %1").arg(attempt) + extension;
}

void SaveToFolderShareActivity::performActivity()
{
    m_savedPaths.clear();
    QPointer<SaveToFolderShareActivity> self(this);
    auto done = [self](const QString &folder) {
        if (!self)
            return;
        if (folder.isEmpty()) {
            self->activityDidFinish(false);   // the user cancelled
            return;
        }
        self->saveInto(folder);
    };
    if (folderChooserHook())
        folderChooserHook()(presentationWidget(), done);
    else
        chooseFolderWithDialog(presentationWidget(), done);
}

void SaveToFolderShareActivity::saveInto(const QString &folder)
{
    if (!QFileInfo(folder).isDir()) {
        setActivityError(shareError(kShareErrorFolderUnavailable, QStringLiteral("%1 is not a folder").arg(folder)));
        activityDidFinish(false);
        return;
    }
    for (const QUrl &url : fileURLsInItems(activityItems())) {
        Result<QString> copy = copyWithoutOverwriting(url.toLocalFile(), folder);
        if (!copy.ok()) {
            setActivityError(copy.error);
            activityDidFinish(false);
            return;
        }
        log::info(lcShare(), QStringLiteral("Saved %1 as %2").arg(url.toLocalFile(), *copy.value));
        m_savedPaths.append(*copy.value);
    }
    activityDidFinish(true);
}

// ---- Save to the video library

SaveToVideoLibraryShareActivity::SaveToVideoLibraryShareActivity(QObject *parent) : ShareActivity(parent) {}

QString SaveToVideoLibraryShareActivity::activityType() const { return QString::fromLatin1(kActivityTypeSaveToPhotoLibrary); }
QString SaveToVideoLibraryShareActivity::activityTitle() const { return tr("Save Video"); }
QIcon SaveToVideoLibraryShareActivity::activityImage() const { return themedIcon("video-x-generic", "video-library"); }

bool SaveToVideoLibraryShareActivity::canPerformWithActivityItems(const QVariantList &activityItems)
{
    return !fileURLsInItems(activityItems).isEmpty();
}

void SaveToVideoLibraryShareActivity::performActivity()
{
    const QList<QUrl> urls = fileURLsInItems(activityItems());
    QPointer<SaveToVideoLibraryShareActivity> self(this);
    photos::PhotoLibrary::sharedPhotoLibrary().performChanges(
        [urls](photos::PhotoLibraryChangeRequest &request) {
            for (const QUrl &url : urls)
                request.creationRequestForAssetFromVideoAtFileURL(url);
        },
        [self](bool success, const OptionalError &error) {
            // The library answers on its own queue.
            dispatch::main([self, success, error] {
                if (!self)
                    return;
                if (!success)
                    self->setActivityError(error ? error : std::optional(shareError(kShareErrorCopyFailed, QStringLiteral("The video library refused the movie"))));
                self->activityDidFinish(success);
            });
        });
}

// ---- Copy

CopyShareActivity::CopyShareActivity(QObject *parent) : ShareActivity(parent) {}

QString CopyShareActivity::activityType() const { return QString::fromLatin1(kActivityTypeCopyToPasteboard); }
QString CopyShareActivity::activityTitle() const { return tr("Copy"); }
QIcon CopyShareActivity::activityImage() const { return themedIcon("edit-copy", "copy"); }

bool CopyShareActivity::canPerformWithActivityItems(const QVariantList &activityItems)
{
    return !fileURLsInItems(activityItems).isEmpty() || !textsInItems(activityItems).isEmpty();
}

void CopyShareActivity::performActivity()
{
    const QVariantList items = activityItems();
    const QList<QUrl> urls = fileURLsInItems(items);
    QStringList lines = textsInItems(items);
    for (const QUrl &url : urls)
        lines.append(url.toString(QUrl::FullyEncoded));
    QClipboard *clipboard = QGuiApplication::clipboard();
    if (lines.isEmpty() || !clipboard) {
        setActivityError(shareError(kShareErrorNoItems, QStringLiteral("Nothing to copy")));
        activityDidFinish(false);
        return;
    }
    auto *data = new QMimeData;
    if (!urls.isEmpty())
        data->setUrls(urls);
    data->setText(lines.join(u'\n'));
    clipboard->setMimeData(data);
    activityDidFinish(true);
}

QList<ShareActivity *> makePlatformShareActivities(QObject *parent)
{
    return {new MailShareActivity(parent), new CopyShareActivity(parent), new SaveToVideoLibraryShareActivity(parent),
            new SaveToFolderShareActivity(parent), new OpenWithShareActivity(parent)};
}

} // namespace zaf::ui
