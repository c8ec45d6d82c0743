// zaf-host: the command-line host. Starts the video editor extension on a movie, prints every report
// of the activity types the user carried out as one compact JSON array line, removes the extension's
// view after the first report and waits for the extension to exit.
//
//   zaf-host --movie PATH --app-name NAME --bundle-id ID [--attachment PATH] [--share-message TEXT]
//            [--tint #RRGGBB[AA]] [--extension PATH]
//   zaf-host --open [PATH] [...]
//   zaf-host --watch [DIR] [--app-name NAME --bundle-id ID] [--share-message TEXT] [--tint COLOR] [--extension PATH]
//
// --movie hands the editor the recording itself, as a recorder does: the editor's save removes it.
// --open is how a user opens a movie of their own (the desktop entry's "Open With"): the editor gets
// a private clone of it (a reflink, a hard link or a copy) in a folder of the user's cache that goes
// when zaf-host ends, so the user's file is never removed or changed; the application is then the
// editor itself unless --app-name and --bundle-id say otherwise. Without PATH (the editor started
// from the desktop's menu) the user chooses the movie with the desktop's file chooser.
// --watch is for recorders that cannot start the editor: it watches DIR (by default the desktop's
// screencast folder, $(xdg-user-dir VIDEOS)/Screencasts, waited for while it does not exist) and
// offers the editor each MPEG-4 or QuickTime movie finished there (closed after writing, or renamed
// into place), on a private clone as --open does, one editor at a time, the others waiting in order;
// after each editor a desktop notification says what was done. It runs until SIGTERM or SIGINT
// (host/watch/watch_mode.h); the user service desktop/zafrel-watch.service runs it at login.
//
// Exit status: 0 after a report and a normal exit of the extension (--watch: after SIGTERM or
// SIGINT); 1 when the extension could not start, died, refused the request or ended without a
// report (--watch: the folder cannot be watched); 2 for bad arguments.

#include "host/extension_session.h"
#include "host/host_log.h"
#include "host/private_clone.h"
#include "host/watch/watch_mode.h"
#include "platform/install_layout.h"
#include "platform/log.h"

#include <QApplication>
#include <QCommandLineParser>
#include <QFileDialog>
#include <QCoreApplication>
#include <QDir>
#include <QFileInfo>
#include <QJsonArray>
#include <QJsonDocument>
#include <QStandardPaths>
#include <QTimer>

#include <csignal>
#include <cstdio>

namespace {

constexpr const char *kExtensionName = zaf::install::kExtensionProgram;
// Who asks for the editor when a user opens a movie of their own: the editor, by its desktop entry.
constexpr char kOwnAppName[] = "Zafrel";
constexpr char kOwnBundleIdentifier[] = "com.zafrel.VideoEditor";
// How long the extension may take to exit once its channel is closed without a report, and once
// its view has been removed (it empties its temporary directory first).
constexpr int kExitAfterCloseMs = 10000;
constexpr int kExitAfterRemoveMs = 60000;

void complain(const QString &message)
{
    std::fprintf(stderr, "zaf-host: %s\n", qPrintable(message));
    std::fflush(stderr);
}

int usage(const QString &problem, const QCommandLineParser &parser)
{
    complain(problem);
    std::fprintf(stderr, "%s", qPrintable(parser.helpText()));
    return 2;
}

bool isExecutableFile(const QString &path)
{
    const QFileInfo info(path);
    return info.isFile() && info.isExecutable();
}

// --extension, else $ZAF_EXTENSION_PATH, else the installed one (PREFIX/libexec/zafrel), else the
// build's extension directory beside ours, else our own directory, else PATH. Empty (with `error` set) when none of these names a program.
QString findExtension(const QString &given, QString *error)
{
    if (!given.isEmpty()) {
        if (isExecutableFile(given))
            return QFileInfo(given).absoluteFilePath();
        *error = QStringLiteral("the extension %1 is not an executable file").arg(given);
        return {};
    }
    const QString fromEnvironment = qEnvironmentVariable("ZAF_EXTENSION_PATH");
    if (!fromEnvironment.isEmpty()) {
        if (isExecutableFile(fromEnvironment))
            return QFileInfo(fromEnvironment).absoluteFilePath();
        *error = QStringLiteral("ZAF_EXTENSION_PATH=%1 is not an executable file").arg(fromEnvironment);
        return {};
    }
    const QDir ownDir(QCoreApplication::applicationDirPath());
    QStringList candidates{ownDir.filePath(QStringLiteral("../extension/") + QLatin1String(kExtensionName)),
                           ownDir.filePath(QLatin1String(kExtensionName))};
    if (const QString prefix = zaf::install::installPrefix(); !prefix.isEmpty())
        candidates.prepend(QDir(prefix).filePath(QLatin1String(zaf::install::kLibexecDir) + QLatin1Char('/') + QLatin1String(kExtensionName)));
    for (const QString &candidate : candidates) {
        if (isExecutableFile(candidate))
            return QFileInfo(candidate).canonicalFilePath();
    }
    const QString onPath = QStandardPaths::findExecutable(QLatin1String(kExtensionName));
    if (!onPath.isEmpty())
        return onPath;
    *error = QStringLiteral("cannot find %1 (give --extension PATH or set ZAF_EXTENSION_PATH)").arg(QLatin1String(kExtensionName));
    return {};
}

// `--open` and no movie among the arguments: the user is to choose one.
bool choosesAMovie(int argc, char **argv)
{
    bool open = false, positional = false;
    for (int i = 1; i < argc; ++i) {
        const QByteArray arg(argv[i]);
        if (arg == "--open" || arg == "-open")
            open = true;
        else if (arg == "--watch" || arg == "-watch")
            return false; // watching asks for nothing
        else if (arg == "--help" || arg == "-h" || arg == "--help-all")
            return false; // the help is printed, nothing is opened
        else if (arg.startsWith('-'))
            i += arg.contains('=') ? 0 : 1; // every other option takes a value
        else
            positional = true;
    }
    return open && !positional;
}

// The movie the user chooses, or nothing when they cancel.
QString chooseMovie()
{
    return QFileDialog::getOpenFileName(nullptr, QStringLiteral("Open a movie"),
                                        QStandardPaths::writableLocation(QStandardPaths::MoviesLocation),
                                        QStringLiteral("Movies (*.mp4 *.m4v *.mov);;All files (*)"));
}

// --watch [DIR]: checks the arguments, then watches until SIGTERM or SIGINT.
int watch(const QCommandLineParser &parser, const QString &given, std::initializer_list<const QCommandLineOption *> excluded,
          const QCommandLineOption &appNameOption, const QCommandLineOption &bundleIdOption, const QCommandLineOption &shareMessageOption,
          const QCommandLineOption &tintOption, const QCommandLineOption &extensionOption)
{
    for (const QCommandLineOption *option : excluded) {
        if (parser.isSet(*option))
            return usage(QStringLiteral("--watch and --%1 exclude each other").arg(option->names().constFirst()), parser);
    }
    zaf::host::watch::WatchSettings settings;
    settings.folder = given.isEmpty() ? zaf::host::watch::defaultWatchFolder() : QFileInfo(given).absoluteFilePath();
    if (const std::optional<QString> problem = zaf::host::watch::watchFolderProblem(settings.folder, !given.isEmpty()))
        return usage(*problem, parser);
    settings.details.appName = parser.isSet(appNameOption) ? parser.value(appNameOption) : QString::fromLatin1(kOwnAppName);
    settings.details.bundleIdentifier = parser.isSet(bundleIdOption) ? parser.value(bundleIdOption) : QString::fromLatin1(kOwnBundleIdentifier);
    if (parser.isSet(shareMessageOption))
        settings.details.shareMessage = parser.value(shareMessageOption);
    if (parser.isSet(tintOption))
        settings.details.tintColor = parser.value(tintOption);
    QString problem;
    for (const QString &value : {settings.details.appName, settings.details.bundleIdentifier}) {
        if (value.isEmpty())
            return usage(QStringLiteral("--app-name and --bundle-id may not be empty"), parser);
    }
    zaf::host::RecordingDetails check = settings.details;
    check.moviePath = settings.folder; // any path: only the other values are checked here
    if (!zaf::host::makeInputItems(check, &problem))
        return usage(problem, parser);
    settings.extension = findExtension(parser.value(extensionOption), &problem);
    if (settings.extension.isEmpty()) {
        complain(problem);
        return 1;
    }
    settings.cacheDirectory = QStandardPaths::writableLocation(QStandardPaths::GenericCacheLocation);
    return zaf::host::watch::runWatchMode(settings);
}

} // namespace

int main(int argc, char **argv)
{
    // A closed stdout or a vanished extension must give a write error, not kill the host.
    std::signal(SIGPIPE, SIG_IGN);
    // `--open` without a movie asks for one with the desktop's file chooser, which needs the widgets
    // of a QApplication; every other use runs without a display.
    std::unique_ptr<QCoreApplication> application = choosesAMovie(argc, argv) ? std::make_unique<QApplication>(argc, argv)
                                                                                : std::make_unique<QCoreApplication>(argc, argv);
    QCoreApplication &app = *application;
    zaf::log::hideInformationalEntriesByDefault();

    QCommandLineParser parser;
    parser.setApplicationDescription(QStringLiteral("Opens the video editor extension on a recorded movie and prints the "
                                                    "activity types the user carried out as a JSON array."));
    parser.addHelpOption();
    const QCommandLineOption movieOption(QStringLiteral("movie"), QStringLiteral("The recorded movie."), QStringLiteral("PATH"));
    const QCommandLineOption appNameOption(QStringLiteral("app-name"), QStringLiteral("The recording application's display name."),
                                           QStringLiteral("NAME"));
    const QCommandLineOption bundleIdOption(QStringLiteral("bundle-id"), QStringLiteral("The recording application's identifier."),
                                            QStringLiteral("ID"));
    const QCommandLineOption attachmentOption(QStringLiteral("attachment"), QStringLiteral("An extra file to share with the movie."),
                                              QStringLiteral("PATH"));
    const QCommandLineOption shareMessageOption(QStringLiteral("share-message"), QStringLiteral("Text replacing the default share text."),
                                                QStringLiteral("TEXT"));
    const QCommandLineOption tintOption(QStringLiteral("tint"), QStringLiteral("Tint colour, #RRGGBB or #RRGGBBAA."), QStringLiteral("COLOR"));
    const QCommandLineOption extensionOption(QStringLiteral("extension"), QStringLiteral("The extension program."), QStringLiteral("PATH"));
    const QCommandLineOption openOption(QStringLiteral("open"),
        QStringLiteral("Open the movie given after the options as one of the user's own: the editor gets a private clone, and "
                       "the file is never removed or changed. Without a movie, the user chooses one."));
    const QCommandLineOption watchOption(QStringLiteral("watch"),
        QStringLiteral("Watch the folder given after the options (by default the desktop's screencast folder, %1) and offer "
                       "the editor each MPEG-4 or QuickTime movie a recorder finishes there, on a private clone, one at a "
                       "time, until SIGTERM or SIGINT; a desktop notification says what was done.")
            .arg(zaf::host::watch::defaultWatchFolder()));
    parser.addOptions({movieOption, appNameOption, bundleIdOption, attachmentOption, shareMessageOption, tintOption, extensionOption, openOption,
                       watchOption});
    parser.addPositionalArgument(QStringLiteral("PATH|DIR"), QStringLiteral("With --open, the movie; with --watch, the folder."),
                                 QStringLiteral("[PATH|DIR]"));

    if (!parser.parse(app.arguments()))
        return usage(parser.errorText(), parser);
    if (parser.isSet(QStringLiteral("help"))) {
        std::fprintf(stdout, "%s", qPrintable(parser.helpText()));
        return 0;
    }
    const bool opening = parser.isSet(openOption);
    const bool watching = parser.isSet(watchOption);
    const QStringList positional = parser.positionalArguments();
    if (positional.size() > (opening || watching ? 1 : 0))
        return usage(QStringLiteral("unexpected argument: %1").arg(positional.constLast()), parser);
    for (const QCommandLineOption *single : {&movieOption, &appNameOption, &bundleIdOption, &attachmentOption, &shareMessageOption,
                                             &tintOption, &extensionOption}) {
        if (parser.values(*single).size() > 1)
            return usage(QStringLiteral("--%1 is given more than once").arg(single->names().constFirst()), parser);
    }
    if (watching)
        return watch(parser, positional.value(0), {&movieOption, &openOption, &attachmentOption}, appNameOption, bundleIdOption,
                     shareMessageOption, tintOption, extensionOption);
    QString opened;
    if (opening) {
        opened = positional.isEmpty() ? chooseMovie() : positional.constFirst();
        if (opened.isEmpty())
            return 0; // the user chose nothing
    }
    if (opening && parser.isSet(movieOption))
        return usage(QStringLiteral("--movie and --open exclude each other"), parser);
    for (const QCommandLineOption *required : {&movieOption, &appNameOption, &bundleIdOption}) {
        if (opening && !parser.isSet(*required))
            continue;
        if (!parser.isSet(*required) || parser.value(*required).isEmpty())
            return usage(QStringLiteral("--%1 is required").arg(required->names().constFirst()), parser);
    }

    zaf::host::RecordingDetails details;
    const QString given = opening ? opened : parser.value(movieOption);
    details.moviePath = QFileInfo(given).absoluteFilePath();
    details.appName = parser.isSet(appNameOption) ? parser.value(appNameOption) : QString::fromLatin1(kOwnAppName);
    details.bundleIdentifier = parser.isSet(bundleIdOption) ? parser.value(bundleIdOption) : QString::fromLatin1(kOwnBundleIdentifier);
    if (!QFileInfo(details.moviePath).isFile())
        return usage(QStringLiteral("the movie %1 is not a file").arg(given), parser);
    // The private clone lives until main() returns, and goes with its folder.
    std::unique_ptr<zaf::host::PrivateClone> clone;
    if (opening) {
        QString problem;
        clone = zaf::host::PrivateClone::make(details.moviePath, QStandardPaths::writableLocation(QStandardPaths::GenericCacheLocation), &problem);
        if (!clone) {
            complain(problem);
            return 1;
        }
        details.moviePath = clone->path();
    }
    if (parser.isSet(attachmentOption)) {
        const QString path = QFileInfo(parser.value(attachmentOption)).absoluteFilePath();
        if (!QFileInfo(path).isFile())
            return usage(QStringLiteral("the attachment %1 is not a file").arg(parser.value(attachmentOption)), parser);
        details.fileAttachmentPath = path;
    }
    if (parser.isSet(shareMessageOption))
        details.shareMessage = parser.value(shareMessageOption);
    if (parser.isSet(tintOption))
        details.tintColor = parser.value(tintOption);
    QString problem;
    const std::optional<QList<zaf::host::InputItem>> items = zaf::host::makeInputItems(details, &problem);
    if (!items)
        return usage(problem, parser);

    const QString extension = findExtension(parser.value(extensionOption), &problem);
    if (extension.isEmpty()) {
        complain(problem);
        return 1;
    }

    zaf::host::ExtensionSession session;
    bool reported = false;
    bool rejected = false;
    QTimer exitDeadline;
    exitDeadline.setSingleShot(true);
    auto awaitExit = [&exitDeadline](int milliseconds) {
        if (!exitDeadline.isActive())
            exitDeadline.start(milliseconds);
    };

    QObject::connect(&session, &zaf::host::ExtensionSession::activityTypesReported, [&](const QStringList &types) {
        const QByteArray line = QJsonDocument(QJsonArray::fromStringList(types)).toJson(QJsonDocument::Compact);
        std::fprintf(stdout, "%s\n", line.constData());
        std::fflush(stdout);
        if (!reported) {
            reported = true;
            session.removeView();
            awaitExit(kExitAfterRemoveMs);
        }
    });
    QObject::connect(&session, &zaf::host::ExtensionSession::requestRejected, [&](const QString &message) {
        complain(message);
        rejected = true;
        session.removeView();
        awaitExit(kExitAfterRemoveMs);
    });
    QObject::connect(&session, &zaf::host::ExtensionSession::channelClosed, [&]() {
        if (!reported)
            awaitExit(kExitAfterCloseMs);
    });
    QObject::connect(&session, &zaf::host::ExtensionSession::finished, [&](int exitCode, bool crashed) {
        exitDeadline.stop();
        if (crashed) {
            complain(exitCode > 128 ? QStringLiteral("the extension died (signal %1)").arg(exitCode - 128)
                                    : QStringLiteral("the extension failed (exit status %1)").arg(exitCode));
            app.exit(1);
        } else if (!reported) {
            if (!rejected)
                complain(QStringLiteral("the extension ended without reporting what the user did"));
            app.exit(1);
        } else {
            app.exit(0);
        }
    });
    QObject::connect(&exitDeadline, &QTimer::timeout, [&]() {
        complain(reported ? QStringLiteral("the extension did not exit after its view was removed; ending it")
                          : QStringLiteral("the extension closed the channel without a report and did not exit; ending it"));
        app.exit(1);
    });

    if (!session.start(extension, *items, &problem)) {
        complain(problem);
        return 1;
    }
    return app.exec();
    // The session's destructor ends an extension still running (after a deadline) and reaps it.
}
