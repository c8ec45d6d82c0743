#pragma once

// The trace log and the console log on Qt's logging.
//
// Every subsystem declares its own logging category ("zaf.tempstore", "zaf.editor", ...) and writes
// its trace entries through these functions, which fix how the trace levels map onto Qt's:
//   informational -> qCDebug, default -> qCInfo, error -> qCWarning.
// The console log is qWarning in the default category.
// Message texts are passed already formatted; callable from any thread.

#include <QLoggingCategory>
#include <QString>

namespace zaf::log {

void info(const QLoggingCategory &category, const QString &message);
void notice(const QLoggingCategory &category, const QString &message);
void error(const QLoggingCategory &category, const QString &message);
void console(const QString &message);

// For programs a person runs: hides the informational entries unless QT_LOGGING_RULES asks for
// them, so a terminal shows warnings and errors only. Call once from main().
void hideInformationalEntriesByDefault();

} // namespace zaf::log
