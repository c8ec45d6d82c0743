// zaf-editor-preview: opens the editor on a movie in a window of its own, as the extension would,
// and prints the activity types carried out as one JSON array line when the editor finishes.
//
//   zaf-editor-preview MOVIE [--app-name NAME] [--bundle-id ID] [--size WxH] [--tint #RRGGBB]
#include "editor/editor.h"
#include "platform/log.h"
#include "platform/ui/window_host.h"
#include "tempstore/temp_store.h"

#include <QApplication>
#include <QFileInfo>
#include <QJsonArray>
#include <QJsonDocument>
#include <QTimer>
#include <QTranslator>
#include <QLibraryInfo>
#include <QLocale>

#include <cstdio>

namespace {

// Prints the report and closes the window.
class PreviewDelegate : public QObject, public ZafVideoEditorViewControllerDelegate {
    Q_OBJECT
    Q_INTERFACES(ZafVideoEditorViewControllerDelegate)
public:
    std::function<void()> onFinish;
    void videoEditorDidFinishWithActivityTypes(ZafVideoEditorViewController *, const QStringList &types) override
    {
        std::printf("%s\n", QJsonDocument(QJsonArray::fromStringList(types)).toJson(QJsonDocument::Compact).constData());
        std::fflush(stdout);
        if (onFinish)
            onFinish();
    }
};

int usage()
{
    std::fprintf(stderr, "usage: zaf-editor-preview MOVIE [--app-name NAME] [--bundle-id ID] [--size WxH] [--tint #RRGGBB]\n");
    return 2;
}

} // namespace

int main(int argc, char **argv)
{
    QApplication app(argc, argv);
    QApplication::setApplicationName(QStringLiteral("Zafrel Video Editor"));
    zaf::log::hideInformationalEntriesByDefault();
    // Qt's own translations give the standard item texts (Done, Cancel, Save) in the user's language.
    QTranslator qtTranslations;
    if (qtTranslations.load(QLocale(), QStringLiteral("qtbase"), QStringLiteral("_"),
                            QLibraryInfo::path(QLibraryInfo::TranslationsPath)))
        app.installTranslator(&qtTranslations);

    QStringList args = app.arguments().mid(1);
    if (args.isEmpty() || args.first().startsWith(QLatin1String("--")))
        return usage();
    const QString movie = QFileInfo(args.takeFirst()).absoluteFilePath();
    QString appName = QStringLiteral("Zafrel Recorder"), bundleId = QStringLiteral("com.zafrel.recorder");
    QSize size(1280, 720);
    QColor tint;
    for (int i = 0; i + 1 < args.size(); i += 2) {
        const QString &key = args[i], &value = args[i + 1];
        if (key == QLatin1String("--app-name"))
            appName = value;
        else if (key == QLatin1String("--bundle-id"))
            bundleId = value;
        else if (key == QLatin1String("--tint"))
            tint = QColor(value);
        else if (key == QLatin1String("--size")) {
            const QStringList wh = value.split(QLatin1Char('x'));
            if (wh.size() != 2 || wh[0].toInt() < 200 || wh[1].toInt() < 200)
                return usage();
            size = QSize(wh[0].toInt(), wh[1].toInt());
        } else
            return usage();
    }
    if (args.size() % 2 != 0)
        return usage();

    ZafTempStore::defaultStore().prepareAtProcessStart();

    auto *editor = new ZafVideoEditorViewController(bundleId, QUrl::fromLocalFile(movie), appName, tint,
                                                    QRectF(QPointF(0, 0), QSizeF(size)));
    PreviewDelegate delegate;
    editor->setDelegate(&delegate);
    zaf::ui::WindowHost window(editor);
    window.setWindowTitle(QStringLiteral("%1 — %2").arg(QApplication::applicationName(), appName));
    window.resize(size);
    // Closing the window is Cancel.
    window.setCloseHandler([editor] { editor->doneAction(); });
    delegate.onFinish = [&] {
        // The report is out; the editor goes away (emptying its temporary directory) and so does the window.
        QTimer::singleShot(0, &app, [&] {
            window.setCloseHandler({});
            window.close();
            delete editor;
            app.quit();
        });
    };
    window.show();
    return app.exec();
}

#include "zaf_editor_preview_main.moc"
