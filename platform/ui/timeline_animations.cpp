#include "platform/ui/timeline_animations.h"

#include <QEasingCurve>

namespace zaf::ui {

namespace {

constexpr int kSlideMs = 220;
constexpr int kEditingMs = 180;

} // namespace

TimelineAnimations::TimelineAnimations(std::function<void()> changed, std::function<void()> windowSettled)
    : m_changed(std::move(changed)), m_windowSettled(std::move(windowSettled))
{
    m_slide.setDuration(kSlideMs);
    m_slide.setStartValue(0.0);
    m_slide.setEndValue(1.0);
    m_slide.setEasingCurve(QEasingCurve::OutCubic);
    QObject::connect(&m_slide, &QVariantAnimation::valueChanged, &m_slide, [this](const QVariant &v) {
        const double t = v.toDouble();
        m_shown.start = m_from.start + (m_to.start - m_from.start) * t;
        m_shown.end = m_from.end + (m_to.end - m_from.end) * t;
        m_changed();
    });
    QObject::connect(&m_slide, &QVariantAnimation::finished, &m_slide, [this] {
        m_shown = m_to;
        m_windowSettled();
        m_changed();
    });

    m_editing.setDuration(kEditingMs);
    m_editing.setEasingCurve(QEasingCurve::InOutQuad);
    QObject::connect(&m_editing, &QVariantAnimation::valueChanged, &m_editing, [this](const QVariant &v) {
        m_editingLook = v.toDouble();
        m_changed();
    });
}

void TimelineAnimations::showWindow(const TimelineWindow &target, bool animated)
{
    m_slide.stop();
    if (!animated) {
        m_shown = target;
        m_windowSettled();
        m_changed();
        return;
    }
    m_from = m_shown;
    m_to = target;
    m_slide.start();
}

void TimelineAnimations::setEditingLook(bool editing, bool animated)
{
    m_editing.stop();
    const double target = editing ? 1.0 : 0.0;
    if (!animated) {
        m_editingLook = target;
        m_changed();
        return;
    }
    m_editing.setStartValue(m_editingLook);
    m_editing.setEndValue(target);
    m_editing.start();
}

} // namespace zaf::ui
