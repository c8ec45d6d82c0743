#include "platform/ui/view_animation.h"

#include <QGraphicsOpacityEffect>
#include <QPointer>
#include <QPropertyAnimation>
#include <QWidget>

#include <algorithm>
#include <cmath>
#include <vector>

namespace zaf::ui {

namespace {

// Dynamic properties that carry a view's model state.
constexpr const char *kAlphaProperty = "_zaf_alpha";
constexpr const char *kRemovedProperty = "_zaf_removedFromSuperview";
constexpr const char *kMouseOffProperty = "_zaf_alphaMadeMouseTransparent";
constexpr const char *kFadeName = "_zaf_alphaFade";
// Below this alpha a view takes no clicks: they reach whatever lies under it.
constexpr double kHitTestAlpha = 0.01;

// The durations of the animate() blocks being run (nested blocks: the innermost wins).
std::vector<double> &animationStack()
{
    static std::vector<double> stack;
    return stack;
}

QGraphicsOpacityEffect *opacityEffect(QWidget *view, bool create)
{
    if (auto *effect = qobject_cast<QGraphicsOpacityEffect *>(view->graphicsEffect()))
        return effect;
    if (!create)
        return nullptr;
    // A view's alpha owns its graphics effect; at opacity 1 the effect draws the view directly.
    auto *effect = new QGraphicsOpacityEffect(view);
    effect->setOpacity(1.0);
    view->setGraphicsEffect(effect);
    return effect;
}

void stopFade(QGraphicsOpacityEffect *effect)
{
    if (auto *fade = effect->findChild<QPropertyAnimation *>(kFadeName, Qt::FindDirectChildrenOnly)) {
        fade->stop();
        delete fade;
    }
}

void updateHitTesting(QWidget *view, double alpha)
{
    const bool transparent = alpha < kHitTestAlpha;
    if (transparent && !view->testAttribute(Qt::WA_TransparentForMouseEvents)) {
        view->setAttribute(Qt::WA_TransparentForMouseEvents, true);
        view->setProperty(kMouseOffProperty, true);
    } else if (!transparent && view->property(kMouseOffProperty).toBool()) {
        view->setAttribute(Qt::WA_TransparentForMouseEvents, false);
        view->setProperty(kMouseOffProperty, QVariant());
    }
}

} // namespace

void setAlpha(QWidget *view, double value)
{
    if (!view)
        return;
    value = std::clamp(value, 0.0, 1.0);
    view->setProperty(kAlphaProperty, value);
    updateHitTesting(view, value);

    QGraphicsOpacityEffect *effect = opacityEffect(view, value < 1.0 || !animationStack().empty());
    if (!effect)
        return;   // opaque and never faded: nothing to draw differently
    stopFade(effect);
    const double seconds = animationStack().empty() ? 0.0 : animationStack().back();
    if (seconds <= 0.0 || std::abs(effect->opacity() - value) < 1e-6) {
        effect->setOpacity(value);
        return;
    }
    // Fades from what is shown now, so a reversed fade never jumps.
    auto *fade = new QPropertyAnimation(effect, "opacity", effect);
    fade->setObjectName(kFadeName);
    fade->setDuration(int(std::lround(seconds * 1000.0)));
    fade->setStartValue(effect->opacity());
    fade->setEndValue(value);
    fade->setEasingCurve(QEasingCurve::InOutQuad);
    fade->start(QAbstractAnimation::DeleteWhenStopped);
}

double alpha(const QWidget *view)
{
    if (!view)
        return 0.0;
    const QVariant value = view->property(kAlphaProperty);
    return value.isValid() ? value.toDouble() : 1.0;
}

double presentationAlpha(const QWidget *view)
{
    if (!view)
        return 0.0;
    if (auto *effect = qobject_cast<QGraphicsOpacityEffect *>(view->graphicsEffect()))
        return effect->opacity();
    return alpha(view);
}

void animate(double seconds, const std::function<void()> &changes)
{
    if (!changes)
        return;
    animationStack().push_back(seconds);
    struct Pop {
        ~Pop() { animationStack().pop_back(); }
    } pop;
    changes();
}

void addSubview(QWidget *parent, QWidget *child)
{
    if (!parent || !child || parent == child)
        return;
    if (child->parentWidget() != parent)
        child->setParent(parent);
    child->setProperty(kRemovedProperty, QVariant());
    child->raise();
    child->show();
}

void removeFromSuperview(QWidget *view)
{
    if (!view)
        return;
    view->setProperty(kRemovedProperty, true);
    view->hide();
}

QWidget *superview(const QWidget *view)
{
    if (!view || view->isWindow() || view->property(kRemovedProperty).toBool())
        return nullptr;
    return view->parentWidget();
}

} // namespace zaf::ui
