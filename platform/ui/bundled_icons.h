#pragma once

// The project's own monochrome glyphs (platform/ui/icons), for desktops whose icon theme lacks an
// icon. Any thread; the icon itself is used on the main thread like every QIcon drawn in a widget.

#include <QIcon>

namespace zaf::ui {

// The glyph "icons/NAME.svg" compiled into this library; a null icon for an unknown name.
QIcon bundledIcon(const char *name);

} // namespace zaf::ui
