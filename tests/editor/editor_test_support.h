#pragma once

// Editors on generated movies, each test with a private temporary directory, and the editor's reports.

#include "editor/editor.h"
#include "platform/media/playback/playback_clock.h"
#include "platform/media/player_item.h"
#include "platform/ui/bar_button_item.h"
#include "platform/ui/movie_scrubber.h"
#include "platform/ui/toolbar.h"
#include "platform/ui/transition_coordinator.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/named_cases.h"
#include "tests/support/process_temp_directory.h"
#include "tests/support/scoped_capabilities.h"
#include "tests/support/temp_dir.h"
#include "tests/support/wait_until.h"
#include "tempstore/temp_store.h"

#include <QCoreApplication>
#include <QElapsedTimer>
#include <QWidget>
#include <gtest/gtest.h>

#include <algorithm>
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

// Waits (bounded) until the editor's current item is ready, handling events.
inline bool waitUntilReady(ZafVideoEditorViewController &editor)
{
    return waitUntil([&] { return editor.mvPlayer()->currentItem()->status() == media::PlayerItem::Status::ReadyToPlay; },
                     10000);
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
    void SetUp() override { usePrivateTempDirectoryForProcess(); }

    // A movie of the given shape in the scratch directory.
    QString movie(double seconds = 3, int width = 320, int height = 240, int rotation = 0, int audioTracks = 1)
    {
        return makeFixtureMovie(scratch.path(), {.seconds = seconds, .width = width, .height = height,
                                                 .audioTracks = audioTracks, .rotation = rotation});
    }

    // A path where no movie is: enough for everything but playback, and quick.
    QString noMovie() const { return scratch.file(QStringLiteral("none.mp4")); }

    // An editor in a portrait (small-screen) frame unless told otherwise.
    std::unique_ptr<ZafVideoEditorViewController> makeEditor(const QString &path, const QRectF &rect = QRectF(0, 0, 400, 700),
                                                             const QColor &tint = QColor())
    {
        return std::make_unique<ZafVideoEditorViewController>(QStringLiteral("com.example.recorder"),
                                                              QUrl::fromLocalFile(path), QStringLiteral("Recorder"),
                                                              tint, rect);
    }

    // An editor whose movie is ready and whose player runs on `clock`, which only the test advances.
    std::unique_ptr<ZafVideoEditorViewController> ready(const QString &path, const QRectF &rect = QRectF(0, 0, 400, 700))
    {
        auto editor = makeEditor(path, rect);
        EXPECT_TRUE(waitUntilReady(*editor));
        clock = std::make_shared<media::ManualTimeSource>();
        editor->mvPlayer()->setTimeSource(clock);
        return editor;
    }

    ScratchDir scratch;
    std::shared_ptr<media::ManualTimeSource> clock;
};

// Resizes the editor's view to a new shape as a window rotation does, running the transition.
inline void rotate(ZafVideoEditorViewController &e, double width, double height)
{
    ui::TransitionCoordinator coordinator(QSizeF(width, height));
    e.view()->resize(int(width), int(height));
    e.viewWillTransitionToSize(QSizeF(width, height), coordinator);
    coordinator.complete();
}

// Drags the trim handles as the timeline reports it: editing begins, then both values move.
inline void selectRange(ZafVideoEditorViewController &e, double start, double end)
{
    ui::MovieScrubber *s = e.mvTrimmer();
    if (!s->isEditing()) {
        s->setEditing(true, false);
        e.movieScrubberDidBeginEditing(s);
    }
    s->setEditingRange(start, end);
    e.movieScrubberEditingStartValueDidChange(s, start);
    e.movieScrubberEditingEndValueDidChange(s, end);
    spin(20);
}

// Applies the trim with the trim item and waits (bounded) for the trimmed movie to be loaded.
inline bool applyTrim(ZafVideoEditorViewController &e)
{
    const QUrl before = e.videoURL();
    e.trimButton()->trigger();
    return waitUntil([&] { return e.videoURL() != before; });
}

// The items of a toolbar, by the editor's names for them.
inline QStringList itemNames(const ZafVideoEditorViewController &e, ui::Toolbar *toolbar)
{
    const QList<std::pair<ui::BarButtonItem *, const char *>> names = {
        {e.shareButton(), "share"}, {e.pauseButton(), "pause"}, {e.saveButton(), "save"}, {e.flexSpace(), "flex"},
        {e.doneButton(), "done"}, {e.cancelButton(), "cancel"}, {e.cancelTrimButton(), "cancelTrim"}, {e.trimButton(), "trim"},
        {e.undoButton(), "undo"}, {e.titleButton(), "title"}, {e.playButton(), "play"}, {e.fixSpace(), "fix"}};
    QStringList out;
    for (ui::BarButtonItem *item : toolbar->items()) {
        auto named = std::find_if(names.begin(), names.end(), [&](const auto &name) { return name.first == item; });
        out << (named == names.end() ? "?" : named->second);
    }
    return out;
}

inline QStringList words(const char *text)
{
    return QString::fromLatin1(text).split(QLatin1Char(' '), Qt::SkipEmptyParts);
}

} // namespace zaf::test
