#pragma once

#include <QDateTime>
#include <QLocale>
#include <QString>

namespace zaf::text {

// Formats a date with a Unicode date pattern ("MMMM d hh:mm a") in a locale (default: the
// user's) and the default time zone (TZ), with ICU. An invalid date gives "".
QString formatDate(const QDateTime &date, const QString &pattern, const QLocale &locale = QLocale());

} // namespace zaf::text
