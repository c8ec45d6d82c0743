#include "platform/text/percent_format.h"

#include <unicode/locid.h>
#include <unicode/numfmt.h>
#include <unicode/unistr.h>

#include <memory>

namespace zaf::text {

QString formatPercent(int percent, const QLocale &locale)
{
    UErrorCode status = U_ZERO_ERROR;
    const icu::Locale icuLocale(locale.name().toUtf8().constData());
    const std::unique_ptr<icu::NumberFormat> formatter(icu::NumberFormat::createPercentInstance(icuLocale, status));
    if (U_FAILURE(status) || !formatter)
        return QStringLiteral("%1%").arg(percent);
    icu::UnicodeString out;
    formatter->format(double(percent) / 100.0, out);
    return QString(reinterpret_cast<const QChar *>(out.getBuffer()), out.length());
}

} // namespace zaf::text
