// Text helpers: prefix comparison regardless of case and diacritics, date, percent and object formats.
#include "platform/text/date_format.h"
#include "platform/text/object_format.h"
#include "platform/text/percent_format.h"
#include "platform/text/string_compare.h"

#include <gtest/gtest.h>

namespace zaf::text {
namespace {

TEST(StringCompare, PrefixIgnoresCaseAndDiacriticsOnBothSides)
{
    EXPECT_TRUE(hasPrefixIgnoringCaseAndDiacritics("ZAFREPLAY_x", "zafreplay"));
    EXPECT_TRUE(hasPrefixIgnoringCaseAndDiacritics("Résumé.mp4", "resume"));
    EXPECT_TRUE(hasPrefixIgnoringCaseAndDiacritics("Resume.mp4", "RÉSUMÉ"));
    // Precomposed and decomposed forms are the same text.
    EXPECT_TRUE(hasPrefixIgnoringCaseAndDiacritics("e\xCC\x81té", "ÉT"));
    EXPECT_TRUE(hasPrefixIgnoringCaseAndDiacritics("STRASSE", "straß"));
    EXPECT_TRUE(hasPrefixIgnoringCaseAndDiacritics("anything", QString()));
    EXPECT_FALSE(hasPrefixIgnoringCaseAndDiacritics("Zaf", "Zafrel"));
    EXPECT_FALSE(hasPrefixIgnoringCaseAndDiacritics("xZaf", "Zaf"));
}

TEST(ObjectFormat, FillsSequentialAndPositionalObjectsAndKeepsOtherText)
{
    const QStringList args{"Recorder", "Zafrel"};
    EXPECT_EQ(formatWithObjects("Recorded with %@ by %@", args), "Recorded with Recorder by Zafrel");
    EXPECT_EQ(formatWithObjects("%2$@ の %1$@", args), "Zafrel の Recorder");
    EXPECT_EQ(formatWithObjects("100%% of %@", args), "100% of Recorder");
    EXPECT_EQ(formatWithObjects("%@ %@ %@", args), "Recorder Zafrel ");
    EXPECT_EQ(formatWithObjects("%3$@|%0$@|%d|50%", args), "||%d|50%");
}

TEST(DateFormat, FormatsThePatternInTheGivenLocaleAndNothingForAnInvalidDate)
{
    EXPECT_EQ(formatDate(QDateTime(QDate(2026, 11, 16), QTime(16, 47)), "MMMM d HH:mm", QLocale("fr_FR")), "novembre 16 16:47");
    EXPECT_EQ(formatDate(QDateTime(QDate(2026, 1, 2), QTime(0, 5)), "d MMM hh:mm a", QLocale("en_US")), "2 Jan 12:05 AM");
    EXPECT_TRUE(formatDate(QDateTime(), "MMMM").isEmpty());
}

TEST(PercentFormat, WritesThePercentSignAsTheLocaleDoes)
{
    EXPECT_EQ(formatPercent(57, QLocale("en_US")), QStringLiteral("57%"));
    EXPECT_EQ(formatPercent(100, QLocale("de_DE")), QStringLiteral("100\u00a0%"));
    EXPECT_EQ(formatPercent(0, QLocale("C")), QStringLiteral("0%"));
}

} // namespace
} // namespace zaf::text
