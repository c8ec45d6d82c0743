#include "platform/text/string_compare.h"

#include <gtest/gtest.h>

namespace zaf::text {
namespace {

TEST(StringCompare, PrefixIgnoresCaseAndDiacriticsOnBothSides)
{
    EXPECT_TRUE(hasPrefixIgnoringCaseAndDiacritics(QStringLiteral("ZAFREPLAY_x"), QStringLiteral("zafreplay")));
    EXPECT_TRUE(hasPrefixIgnoringCaseAndDiacritics(QString::fromUtf8("R\xC3\xA9sum\xC3\xA9.mp4"), QStringLiteral("resume")));
    EXPECT_TRUE(hasPrefixIgnoringCaseAndDiacritics(QStringLiteral("Resume.mp4"), QString::fromUtf8("R\xC3\x89SUM\xC3\x89")));
    // Precomposed and decomposed forms are the same text.
    EXPECT_TRUE(hasPrefixIgnoringCaseAndDiacritics(QString::fromUtf8("e\xCC\x81t\xC3\xA9"), QString::fromUtf8("\xC3\x89T")));
    EXPECT_TRUE(hasPrefixIgnoringCaseAndDiacritics(QStringLiteral("STRASSE"), QString::fromUtf8("stra\xC3\x9F")));
    EXPECT_TRUE(hasPrefixIgnoringCaseAndDiacritics(QStringLiteral("anything"), QString()));
    EXPECT_FALSE(hasPrefixIgnoringCaseAndDiacritics(QStringLiteral("Zaf"), QStringLiteral("Zafrel")));
    EXPECT_FALSE(hasPrefixIgnoringCaseAndDiacritics(QStringLiteral("xZaf"), QStringLiteral("Zaf")));
}

} // namespace
} // namespace zaf::text
