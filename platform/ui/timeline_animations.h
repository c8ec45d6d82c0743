#pragma once

// TimelineAnimations: the timeline's two animations. The window the strip shows slides to a zoom
// window and back; the editing look (highlighted handles, the movie outside the range dimmed) fades
// in and out. Either can also jump at once, as it does while the widget is hidden. Main thread
// only: both run on the main thread's event loop, and so do the callbacks.

#include "platform/ui/timeline_model.h"

#include <QVariantAnimation>

#include <functional>

namespace zaf::ui {

class TimelineAnimations {
public:
    // `changed`: main thread, whenever either animated value moves (the owner repaints).
    // `windowSettled`: main thread, when the shown window has reached its target, animated or not.
    TimelineAnimations(std::function<void()> changed, std::function<void()> windowSettled);

    // The window shown right now: the target, or a window between the old and the new one.
    TimelineWindow shownWindow() const { return m_shown; }
    bool isSliding() const { return m_slide.state() == QAbstractAnimation::Running; }
    // Shows `target`, sliding there when `animated`; any slide under way stops where it is first.
    void showWindow(const TimelineWindow &target, bool animated);
    // Stops any slide where it is.
    void stopSliding() { m_slide.stop(); }

    // 0 plain .. 1 editing.
    double editingLook() const { return m_editingLook; }
    void setEditingLook(bool editing, bool animated);

private:
    std::function<void()> m_changed;
    std::function<void()> m_windowSettled;
    TimelineWindow m_shown;
    TimelineWindow m_from;
    TimelineWindow m_to;
    QVariantAnimation m_slide;
    double m_editingLook = 0.0;
    QVariantAnimation m_editing;
};

} // namespace zaf::ui
