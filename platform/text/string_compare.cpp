#include "platform/text/string_compare.h"

#include <unicode/normalizer2.h>
#include <unicode/uchar.h>
#include <unicode/unistr.h>

namespace zaf::text {

namespace {

icu::UnicodeString toIcu(const QString &s)
{
    return icu::UnicodeString(reinterpret_cast<const UChar *>(s.utf16()), int32_t(s.size()));
}

// Canonical decomposition, combining marks removed, then case folding.
bool foldForComparison(const QString &in, icu::UnicodeString &out)
{
    UErrorCode status = U_ZERO_ERROR;
    const icu::Normalizer2 *nfd = icu::Normalizer2::getNFDInstance(status);
    if (U_FAILURE(status))
        return false;
    icu::UnicodeString decomposed = nfd->normalize(toIcu(in), status);
    if (U_FAILURE(status))
        return false;
    out.remove();
    for (int32_t i = 0; i < decomposed.length();) {
        const UChar32 c = decomposed.char32At(i);
        if (u_charType(c) != U_NON_SPACING_MARK && u_charType(c) != U_ENCLOSING_MARK)
            out.append(c);
        i += U16_LENGTH(c);
    }
    out.foldCase();
    return true;
}

} // namespace

bool hasPrefixIgnoringCaseAndDiacritics(const QString &string, const QString &prefix)
{
    icu::UnicodeString s, p;
    if (!foldForComparison(string, s) || !foldForComparison(prefix, p))
        return string.startsWith(prefix, Qt::CaseInsensitive);
    return s.startsWith(p);
}

} // namespace zaf::text
