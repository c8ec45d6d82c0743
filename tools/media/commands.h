#pragma once

// The subcommands of zaf-media. Each takes its arguments (after the subcommand's name), prints
// its result or a clear message, and returns the process exit code.

#include <QStringList>

namespace zaf::tools {

int probeCommand(const QStringList &args);
int trimCommand(const QStringList &args);
int mixCommand(const QStringList &args);
int thumbnailsCommand(const QStringList &args);

// Prints "zaf-media: <message>" to standard error and returns 1.
int fail(const QString &message);

} // namespace zaf::tools
