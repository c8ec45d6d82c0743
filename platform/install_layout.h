#pragma once

// Where an installed program finds its data. Installed under a prefix, the programs are in
// PREFIX/bin (the host and the tools) or PREFIX/libexec/zafrel (the extension), and their data in
// PREFIX/share/zafrel and PREFIX/lib/zafrel, so each finds the prefix from its own executable and
// works from any folder, with no environment variable set. A program run from the build tree is in
// no such place; it uses the build tree's own paths, fixed when it was built.

#include <QString>

namespace zaf::install {

// The prefix the running program is installed under, from its executable (/proc/self/exe);
// empty when it does not sit in an installed layout (a build tree).
QString installPrefix();
// The prefix of an executable at `executablePath`, by the same rule.
QString installPrefixOf(const QString &executablePath);

// The path of one piece of data: the environment variable `overrideVariable` when it is set (tests
// point the programs elsewhere with it), else `relativePath` under the install prefix, else
// `buildTreePath`.
QString dataPath(const char *overrideVariable, const QString &relativePath, const QString &buildTreePath);

// The relative paths of the installed layout.
inline constexpr const char *kStringTablesDir = "share/zafrel";
inline constexpr const char *kPluginsDir = "lib/zafrel/plugins";
inline constexpr const char *kLibexecDir = "libexec/zafrel";
// The editor extension's program, in kLibexecDir once installed.
inline constexpr const char *kExtensionProgram = "zaf-video-editor-extension";

} // namespace zaf::install
