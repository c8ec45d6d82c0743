// Ordering localizations against preferred languages, and where the preferred languages come from.
#include "platform/bundle/localization_matching.h"
#include "tests/platform/bundle/bundle_fixtures.h"
#include "tests/support/named_cases.h"

#include <QLocale>
#include <gtest/gtest.h>

namespace zaf::bundle {
namespace {

ZAF_PRINT_CASES_AS_NAMES

struct OrderCase {
    const char *name;
    QStringList localizations, preferences, expected;
};

class PreferredLocalizationsTest : public ::testing::TestWithParam<OrderCase> {};

TEST_P(PreferredLocalizationsTest, OrdersByPreferenceThenKeepsTheRestInOrder)
{
    EXPECT_EQ(preferredLocalizationsFromArray(GetParam().localizations, GetParam().preferences), GetParam().expected);
}

INSTANTIATE_TEST_SUITE_P(Orders, PreferredLocalizationsTest, ::testing::Values(
    // A regional preference is served by its language; the second preference comes next.
    OrderCase{"RegionServedByItsLanguage", {"en", "de", "fr"}, {"de-CH", "en"}, {"de", "en", "fr"}},
    OrderCase{"OnePreference", {"en", "de", "fr"}, {"fr"}, {"fr", "en", "de"}},
    // Folder names use "_"; the exact region wins over the bare language.
    OrderCase{"ExactRegionFirst", {"pt", "pt_BR"}, {"pt-BR"}, {"pt_BR", "pt"}},
    OrderCase{"ExactRegionThenLanguage", {"pt_BR", "pt", "en"}, {"pt-BR", "en"}, {"pt_BR", "pt", "en"}},
    // Scripts matter: traditional Chinese in Taiwan is not served by simplified Chinese first.
    OrderCase{"ScriptsMatter", {"zh_CN", "zh_TW"}, {"zh-Hant-TW"}, {"zh_TW", "zh_CN"}},
    // Preferences no localization serves leave the development localization first, then the rest.
    OrderCase{"UnservedKeepsEnglishFirst", {"en", "de"}, {"ja-JP"}, {"en", "de"}},
    OrderCase{"UnservedMovesEnglishFirst", {"de", "en", "fr"}, {"pl-PL"}, {"en", "de", "fr"}},
    OrderCase{"UnservedWithoutEnglish", {"de", "fr"}, {"pl"}, {"de", "fr"}},
    OrderCase{"NoPreferences", {"de", "en"}, {}, {"en", "de"}},
    OrderCase{"ServedThenEnglish", {"de", "en", "ja"}, {"ja", "pl"}, {"ja", "en", "de"}},
    OrderCase{"NoLocalizations", {}, {"de"}, {}},
    // Names that are not language tags never match but are kept.
    OrderCase{"FolderThatIsNoTag", {"Base", "de", "en"}, {"de", "en"}, {"de", "en", "Base"}},
    OrderCase{"PreferenceThatIsNoTag", {"en", "de"}, {"not a tag!", "de"}, {"de", "en"}},
    // The given order breaks ties between equally good localizations.
    OrderCase{"TieKeepsTheGivenOrder", {"de_AT", "de_CH"}, {"de"}, {"de_AT", "de_CH"}},
    OrderCase{"TieKeepsTheReversedOrder", {"de_CH", "de_AT"}, {"de"}, {"de_CH", "de_AT"}}), zaf::test::caseName);

// The system languages as tags (C and POSIX meaning English), replaced while a test override is set.
TEST(PreferredLanguagesTest, TestOverrideReplacesTheSystemLanguagesUntilCleared)
{
    QStringList system;
    for (QString language : QLocale::system().uiLanguages()) {
        if (language == QLatin1String("C") || language == QLatin1String("POSIX"))
            language = QStringLiteral("en");
        system << language.replace(QLatin1Char('_'), QLatin1Char('-'));
    }
    system.removeDuplicates();
    EXPECT_EQ(preferredLanguages(), system);
    {
        test::ScopedPreferredLanguages languages(QStringList{"de-CH", "en"});
        EXPECT_EQ(preferredLanguages(), (QStringList{"de-CH", "en"}));
    }
    EXPECT_EQ(preferredLanguages(), system);
}

TEST(PreferredLanguagesTest, SystemLanguagesHonourTheLanguageVariable)
{
    // Qt reads LANGUAGE at each request (LANG only once per process).
    test::ScopedEnvironment language("LANGUAGE", "de_CH:fr");
    const QStringList languages = preferredLanguages();
    ASSERT_GE(languages.size(), 2);
    EXPECT_EQ(languages.first(), QStringLiteral("de-CH"));
    EXPECT_TRUE(languages.contains(QStringLiteral("fr")));
    for (const QString &l : languages)
        EXPECT_FALSE(l.contains(QLatin1Char('_'))) << l.toStdString();
}

} // namespace
} // namespace zaf::bundle
