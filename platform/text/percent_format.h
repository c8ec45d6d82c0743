#pragma once

#include <QLocale>
#include <QString>

namespace zaf::text {

// Formats a whole percentage the way the locale writes one ("57%" in English, "57 %" in German and
// French), with ICU. Any thread.
QString formatPercent(int percent, const QLocale &locale = QLocale());

} // namespace zaf::text
