#pragma once

// Editors on generated movies, for the editor's tests: each test gets a private temporary
// directory, a fixture movie and, where it matters, a capability file.

#include "editor/editor.h"
#include "platform/capability/capability_service.h"
#include "platform/media/player_item.h"
#include "platform/ui/bar_button_item.h"
#include "platform/ui/toolbar.h"
#include "tests/support/log_capture.h"
#include "tests/support/process_temp_directory.h"
#include "tests/support/media/fixture_movies.h"
#include "tempstore/temp_store.h"
#include "tests/support/temp_dir.h"

#include <QCoreApplication>
#include <QElapsedTimer>
#include <QFile>
#include <gtest/gtest.h>

#include <memory>

namespace zaf::test {

// Records the editor's reports (main thread, or the thread the editor calls on).
class RecordingDelegate : public QObject, public ZafVideoEditorViewControllerDelegate {
    Q_OBJECT
    Q_INTERFACES(ZafVideoEditorViewControllerDelegate)
public:
    QList<QStringList> reports;
    void videoEditorDidFinishWithActivityTypes(ZafVideoEditorViewController *, const QStringList &types) override
    {
        reports << types;
    }
};

// Points the process at a capability file with these answers (before the first editor: the
// home-button answer is read once per process, and each test runs in a process of its own).
inline void useCapabilities(const ScratchDir &scratch, const QByteArray &json)
{
    const QString path = scratch.file(QStringLiteral("capabilities.json"));
    QFile f(path);
    if (f.open(QIODevice::WriteOnly))
        f.write(json);
    f.close();
    qputenv("ZAF_CAPABILITIES_FILE", QFile::encodeName(path));
    CapabilityService::shared().reload();
}

// Waits (bounded) until the editor's current item is ready, handling events.
inline bool waitUntilReady(ZafVideoEditorViewController &editor, int timeoutMs = 10000)
{
    QElapsedTimer timer;
    timer.start();
    while (timer.elapsed() < timeoutMs) {
        if (editor.mvPlayer()->currentItem()->status() == media::PlayerItem::Status::ReadyToPlay)
            return true;
        QCoreApplication::processEvents(QEventLoop::AllEvents, 20);
    }
    return false;
}

// Handles pending events for a while (queued main-thread work, fades).
inline void spin(int ms = 50)
{
    QElapsedTimer timer;
    timer.start();
    while (timer.elapsed() < ms)
        QCoreApplication::processEvents(QEventLoop::AllEvents, 10);
}

class EditorTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        usePrivateTempDirectoryForProcess();
    }

    // A movie of the given shape in the scratch directory.
    QString movie(double seconds = 3, int width = 320, int height = 240, int rotation = 0, int audioTracks = 1)
    {
        fixture::FixtureSpec spec;
        spec.seconds = seconds;
        spec.width = width;
        spec.height = height;
        spec.rotation = rotation;
        spec.audioTracks = audioTracks;
        return makeFixtureMovie(scratch.path(), spec);
    }

    std::unique_ptr<ZafVideoEditorViewController> makeEditor(const QString &path, const QRectF &rect,
                                                             const QColor &tint = QColor())
    {
        return std::make_unique<ZafVideoEditorViewController>(QStringLiteral("com.example.recorder"),
                                                              QUrl::fromLocalFile(path), QStringLiteral("Recorder"),
                                                              tint, rect);
    }

    ScratchDir scratch;
};

// The items of a toolbar, by the editor's names for them.
inline QStringList itemNames(const ZafVideoEditorViewController &e, ui::Toolbar *toolbar)
{
    const QList<std::pair<ui::BarButtonItem *, QString>> names = {
        {e.shareButton(), QStringLiteral("share")},   {e.pauseButton(), QStringLiteral("pause")},
        {e.saveButton(), QStringLiteral("save")},     {e.flexSpace(), QStringLiteral("flex")},
        {e.doneButton(), QStringLiteral("done")},     {e.cancelButton(), QStringLiteral("cancel")},
        {e.cancelTrimButton(), QStringLiteral("cancelTrim")}, {e.trimButton(), QStringLiteral("trim")},
        {e.undoButton(), QStringLiteral("undo")},     {e.titleButton(), QStringLiteral("title")},
        {e.playButton(), QStringLiteral("play")},     {e.fixSpace(), QStringLiteral("fix")},
    };
    QStringList out;
    for (ui::BarButtonItem *item : toolbar->items()) {
        QString name = QStringLiteral("?");
        for (const auto &[candidate, label] : names)
            if (candidate == item)
                name = label;
        out << name;
    }
    return out;
}

inline QStringList words(const char *text)
{
    return QString::fromLatin1(text).split(QLatin1Char(' '), Qt::SkipEmptyParts);
}

} // namespace zaf::test
