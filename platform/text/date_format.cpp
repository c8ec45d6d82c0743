#include "platform/text/date_format.h"

#include <unicode/locid.h>
#include <unicode/smpdtfmt.h>
#include <unicode/timezone.h>
#include <unicode/unistr.h>

#include <memory>

namespace zaf::text {

QString formatDate(const QDateTime &date, const QString &pattern, const QLocale &locale)
{
    if (!date.isValid())
        return QString();
    UErrorCode status = U_ZERO_ERROR;
    const icu::Locale icuLocale(locale.name().toUtf8().constData());
    const icu::UnicodeString icuPattern(reinterpret_cast<const UChar *>(pattern.utf16()), int32_t(pattern.size()));
    icu::SimpleDateFormat formatter(icuPattern, icuLocale, status);
    if (U_FAILURE(status))
        return QString();
    formatter.adoptTimeZone(icu::TimeZone::createDefault());
    icu::UnicodeString out;
    formatter.format(UDate(date.toMSecsSinceEpoch()), out);
    return QString(reinterpret_cast<const QChar *>(out.getBuffer()), out.length());
}

} // namespace zaf::text
