#pragma once

// Measures the editor's concerns share.

#include <cstdint>

namespace zaf::editor {

// Toolbar heights, with and without a home button.
inline constexpr double kTopToolbarHeightWithHomeButton = 60;
inline constexpr double kTopToolbarHeightWithoutHomeButton = 85;
inline constexpr double kBottomToolbarHeightWithHomeButton = 44;
inline constexpr double kBottomToolbarHeightWithoutHomeButton = 64;
// The timeline's container, and so its thumbnails, are this many points high.
inline constexpr double kTimelineHeight = 38;
// The timeline keeps its handles at least this far apart (seconds).
inline constexpr double kMinimumTrimLength = 1.0;

inline double topToolbarHeight(bool hasHomeButton)
{
    return hasHomeButton ? kTopToolbarHeightWithHomeButton : kTopToolbarHeightWithoutHomeButton;
}
inline double bottomToolbarHeight(bool hasHomeButton)
{
    return hasHomeButton ? kBottomToolbarHeightWithHomeButton : kBottomToolbarHeightWithoutHomeButton;
}

} // namespace zaf::editor
