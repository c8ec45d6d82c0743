#pragma once

// Autoresizing: how a view follows the size changes of the view that contains it.
//
// A flexible margin or size takes a share of the container's change along its axis, in
// proportion to its current size (equal shares when all of them are zero): a view with flexible
// left and right margins that sits in the middle stays in the middle, and a flexible width takes
// the whole change when it is the only flexible part. A view without flags keeps its frame.
//
// The frame is followed in fractional points, so repeated resizes do not drift by rounding; a
// view moved or resized by its owner starts over from its new frame. The view may change its
// container; it then follows the new one. Qt delivers a hidden container's size changes when it is
// shown, so a view follows them from then on. Main thread only.

#include <QFlags>

class QWidget;

namespace zaf::ui {

enum class Autoresizing {
    None = 0,
    FlexibleLeftMargin = 1 << 0,
    FlexibleWidth = 1 << 1,
    FlexibleRightMargin = 1 << 2,
    FlexibleTopMargin = 1 << 3,
    FlexibleHeight = 1 << 4,
    FlexibleBottomMargin = 1 << 5,
};
Q_DECLARE_FLAGS(AutoresizingMask, Autoresizing)
Q_DECLARE_OPERATORS_FOR_FLAGS(AutoresizingMask)

// All four margins flexible: the size stays, the position follows the container.
inline constexpr AutoresizingMask kFlexibleMargins{int(Autoresizing::FlexibleLeftMargin) | int(Autoresizing::FlexibleRightMargin)
                                                   | int(Autoresizing::FlexibleTopMargin) | int(Autoresizing::FlexibleBottomMargin)};

void setAutoresizingMask(QWidget *view, AutoresizingMask mask);
AutoresizingMask autoresizingMask(const QWidget *view);

} // namespace zaf::ui
