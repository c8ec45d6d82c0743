#pragma once

// View alpha and animation blocks. setAlpha() inside animate()'s block fades the view to the alpha
// over the duration; outside a block it applies at once. alpha() reads the target value (the value
// the view will have), as a model layer does. A view whose alpha is below 0.01 takes no clicks (they
// reach what lies under it). Alpha is drawn with a QGraphicsOpacityEffect that the view keeps; a
// new setAlpha stops a fade in progress and starts from what is shown. Main thread only.

#include <functional>

class QWidget;

namespace zaf::ui {

void setAlpha(QWidget *view, double alpha);
double alpha(const QWidget *view);
// The alpha the view shows right now (changes while a fade runs).
double presentationAlpha(const QWidget *view);

// Runs changes at once; alpha changes made inside become fades of `seconds`.
void animate(double seconds, const std::function<void()> &changes);

// Adds a child to a view, or brings it to the front if it is there already, and shows it.
void addSubview(QWidget *parent, QWidget *child);
// Takes a view out of its parent's hierarchy: it is hidden and counts as removed (superview() is
// null) until addSubview() brings it back. Its Qt parent keeps owning it, so nothing is deleted.
void removeFromSuperview(QWidget *view);
// The parent a view is shown in, or null when it was removed or has none.
QWidget *superview(const QWidget *view);

} // namespace zaf::ui
