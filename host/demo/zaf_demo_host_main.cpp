// zaf-demo-host: a small recording application that records its own window for a few seconds
// and then opens the video editor on the recording, as a screen recorder would.

#include "host/demo/demo_window.h"
#include "host/input_items.h"
#include "platform/install_layout.h"
#include "platform/log.h"

#include <QApplication>
#include <QCommandLineParser>
#include <QDir>
#include <QFileInfo>
#include <QStandardPaths>

#include <cstdio>

namespace {

constexpr const char *kExtensionName = zaf::install::kExtensionProgram;

bool isExecutableFile(const QString &path)
{
    const QFileInfo info(path);
    return info.isFile() && info.isExecutable();
}

// The editor extension: the explicit path, then ZAF_EXTENSION_PATH, then the places it has in a
// build tree and in an installation next to this program, then PATH.
QString findExtension(const QString &explicitPath, QStringList *searched)
{
    if (!explicitPath.isEmpty()) {
        searched->append(explicitPath);
        return isExecutableFile(explicitPath) ? QFileInfo(explicitPath).absoluteFilePath() : QString();
    }
    const QString fromEnvironment = qEnvironmentVariable("ZAF_EXTENSION_PATH");
    if (!fromEnvironment.isEmpty()) {
        searched->append(fromEnvironment);
        return isExecutableFile(fromEnvironment) ? QFileInfo(fromEnvironment).absoluteFilePath() : QString();
    }
    const QDir appDir(QCoreApplication::applicationDirPath());
    const QString name = QString::fromLatin1(kExtensionName);
    const QStringList candidates = {
        appDir.filePath(name),
        appDir.filePath(QStringLiteral("../../extension/") + name), // build tree: build/host/demo
        appDir.filePath(QStringLiteral("../extension/") + name),
        appDir.filePath(QStringLiteral("../libexec/zafrel/") + name),
        appDir.filePath(QStringLiteral("../libexec/") + name),
    };
    for (const QString &candidate : candidates) {
        searched->append(QDir::cleanPath(candidate));
        if (isExecutableFile(candidate))
            return QFileInfo(candidate).absoluteFilePath();
    }
    searched->append(QStringLiteral("PATH"));
    const QString onPath = QStandardPaths::findExecutable(name);
    return onPath;
}

QString defaultOutputDirectory()
{
    QString videos = QStandardPaths::writableLocation(QStandardPaths::MoviesLocation);
    if (videos.isEmpty())
        videos = QDir::home().filePath(QStringLiteral("Videos"));
    return QDir(videos).filePath(QStringLiteral("Zafrel Recordings"));
}

int usageError(const QString &message)
{
    std::fprintf(stderr, "zaf-demo-host: %s\n", qPrintable(message));
    return 2;
}

} // namespace

int main(int argc, char **argv)
{
    QApplication app(argc, argv);
    QApplication::setApplicationName(QString::fromLatin1(zaf::demo::kDemoAppName));
    QApplication::setDesktopFileName(QString::fromLatin1(zaf::demo::kDemoBundleIdentifier));
    zaf::log::hideInformationalEntriesByDefault();

    QCommandLineParser parser;
    parser.setApplicationDescription(QStringLiteral(
        "Records its own animated window for a few seconds (video and two audio tracks), then opens "
        "the Zafrel video editor on the recording and shows what the editor reported."));
    parser.addHelpOption();
    const QCommandLineOption secondsOption(QStringLiteral("seconds"), QStringLiteral("Length of the recording (default 6)."),
                                           QStringLiteral("N"), QStringLiteral("6"));
    const QCommandLineOption outOption(QStringLiteral("out"),
                                       QStringLiteral("Folder for the recordings (default: Zafrel Recordings in your Videos folder)."),
                                       QStringLiteral("DIR"));
    const QCommandLineOption extensionOption(QStringLiteral("extension"),
                                             QStringLiteral("The editor extension's executable."), QStringLiteral("PATH"));
    const QCommandLineOption shareMessageOption(QStringLiteral("share-message"),
                                                QStringLiteral("Text the editor shares instead of its own."), QStringLiteral("TEXT"));
    const QCommandLineOption tintOption(QStringLiteral("tint"), QStringLiteral("The editor's tint colour (default #E0457B)."),
                                       QStringLiteral("#RRGGBB"), QStringLiteral("#E0457B"));
    const QCommandLineOption quitOption(QStringLiteral("quit-after-report"),
                                        QStringLiteral("Quit a few seconds after the editor has reported or failed (for "
                                                       "unattended runs); the exit status is 0 only after a report."));
    parser.addOptions({secondsOption, outOption, extensionOption, shareMessageOption, tintOption, quitOption});
    parser.process(app);

    zaf::demo::DemoOptions options;
    bool ok = false;
    options.seconds = parser.value(secondsOption).toDouble(&ok);
    if (!ok || !(options.seconds > 0) || options.seconds > 600)
        return usageError(QStringLiteral("--seconds wants a number of seconds between 0 and 600"));
    options.outputDirectory = parser.isSet(outOption) ? QDir(parser.value(outOption)).absolutePath() : defaultOutputDirectory();
    if (parser.isSet(shareMessageOption))
        options.shareMessage = parser.value(shareMessageOption);
    options.tintColor = parser.value(tintOption);
    if (!zaf::host::isColorText(options.tintColor))
        return usageError(QStringLiteral("--tint wants a colour as #RRGGBB or #RRGGBBAA"));
    options.quitAfterReport = parser.isSet(quitOption);

    QStringList searched;
    options.extensionPath = findExtension(parser.value(extensionOption), &searched);
    if (options.extensionPath.isEmpty()) {
        options.extensionSearchNote = QStringLiteral("Looked in: %1. Give its path with --extension or ZAF_EXTENSION_PATH.")
                                          .arg(searched.join(QStringLiteral(", ")));
        std::fprintf(stderr, "zaf-demo-host: the editor extension was not found (%s); recording anyway\n",
                     qPrintable(searched.join(QStringLiteral(", "))));
    }

    zaf::demo::DemoWindow window(options);
    window.show();
    const int status = app.exec();
    return options.quitAfterReport ? status : 0;
}
