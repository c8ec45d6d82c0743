// Desktop keys: Space plays and pauses, Escape cancels (the trim, or the editor), Return applies a
// trim, Ctrl+S saves, I and O set the trim range at the playhead, the arrow keys step the playhead
// (one frame, or one second with Shift). Ctrl+Z is the shake, delivered by the window.
#include "editor/editor.h"

#include "editor/editor_constants.h"
#include "platform/media/player.h"
#include "platform/ui/movie_scrubber.h"

#include <QShortcut>
#include <QWidget>

#include <algorithm>
#include <cmath>

using namespace zaf::ui;

void ZafVideoEditorViewController::installKeyboardShortcuts()
{
    QWidget *root = view();
    auto shortcut = [root](const QKeySequence &keys, std::function<void()> fn) {
        auto *s = new QShortcut(keys, root);
        s->setContext(Qt::WindowShortcut);
        QObject::connect(s, &QShortcut::activated, root, std::move(fn));
    };
    shortcut(QKeySequence(Qt::Key_Space), [this] {
        if (m_mvPlayer->rate() > 0)
            pauseAction();
        else
            playAction();
    });
    shortcut(QKeySequence(Qt::Key_Escape), [this] {
        if (m_trimming)
            undoAction();
        else
            doneAction();
    });
    for (Qt::Key key : {Qt::Key_Return, Qt::Key_Enter}) {
        shortcut(QKeySequence(key), [this] {
            if (m_trimming)
                saveAction();
        });
    }
    shortcut(QKeySequence::Save, [this] {
        if (!m_trimming)
            saveAction();
    });
    shortcut(QKeySequence(Qt::Key_I), [this] { setTrimPointAtPlayhead(true); });
    shortcut(QKeySequence(Qt::Key_O), [this] { setTrimPointAtPlayhead(false); });
    // The arrow keys go to the timeline, which steps its playhead as a short scrub.
    const QKeyCombination steps[] = {QKeyCombination(Qt::Key_Left), QKeyCombination(Qt::Key_Right),
                                     QKeyCombination(Qt::ShiftModifier, Qt::Key_Left),
                                     QKeyCombination(Qt::ShiftModifier, Qt::Key_Right), QKeyCombination(Qt::Key_Home),
                                     QKeyCombination(Qt::Key_End)};
    for (const QKeyCombination keys : steps) {
        shortcut(QKeySequence(keys),
                 [this, keys] { m_mvTrimmer->stepPlayheadForKey(keys.key(), keys.keyboardModifiers()); });
    }
}

void ZafVideoEditorViewController::setTrimPointAtPlayhead(bool start)
{
    // Only a ready movie has a range to edit (the timeline has its delegate then).
    if (m_mvTrimmer->delegate() != this || m_exporting)
        return;
    const double duration = getPlayerDuration();
    if (!std::isfinite(duration) || duration < zaf::editor::kMinimumTrimLength)
        return;
    if (!m_mvTrimmer->isEditing()) {
        // As a handle drag does: the timeline enters editing and the editor its edit mode.
        m_mvTrimmer->setEditing(true, true);
        movieScrubberDidBeginEditing(m_mvTrimmer);
    }
    // The timeline moves the handle, and the other one too when the minimum length needs it, and
    // calls back for each, so the editor's range always matches the handles.
    m_mvTrimmer->moveEditingHandleTo(start ? MovieScrubberHandle::Start : MovieScrubberHandle::End,
                                     std::clamp(m_mvTrimmer->value(), 0.0, duration));
}
