#pragma once

#include <QString>

namespace zaf::text {

// True when `string` begins with `prefix`, compared without regard to case and to diacritics:
// both sides are decomposed (NFD), stripped of combining marks and case-folded (full folding,
// so "STRASSE" starts with "straß") before the comparison. An empty prefix matches everything.
bool hasPrefixIgnoringCaseAndDiacritics(const QString &string, const QString &prefix);

} // namespace zaf::text
