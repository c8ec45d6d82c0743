// Ordering localizations against preferred languages, and where the preferred languages come from.
#include "platform/bundle/bundle.h"
#include "tests/platform/bundle/bundle_fixtures.h"

#include <QLocale>
#include <gtest/gtest.h>

namespace zaf::bundle {
namespace {

// Localizations are ordered by the best match for each preference, then the rest as given.
TEST(PreferredLocalizationsTest, OrdersLocalizationsByPreferenceThenKeepsTheRestInOrder)
{
    const struct {
        QStringList localizations;
        QStringList preferences;
        QStringList expected;
    } cases[] = {
        // A regional preference is served by its language; the second preference comes next.
        {{"en", "de", "fr"}, {"de-CH", "en"}, {"de", "en", "fr"}},
        {{"en", "de", "fr"}, {"fr"}, {"fr", "en", "de"}},
        // Folder names use "_"; the exact region wins over the bare language.
        {{"pt", "pt_BR"}, {"pt-BR"}, {"pt_BR", "pt"}},
        {{"pt_BR", "pt", "en"}, {"pt-BR", "en"}, {"pt_BR", "pt", "en"}},
        // Scripts matter: traditional Chinese in Taiwan is not served by simplified Chinese first.
        {{"zh_CN", "zh_TW"}, {"zh-Hant-TW"}, {"zh_TW", "zh_CN"}},
        // Preferences no localization serves leave the development localization first, then the rest.
        {{"en", "de"}, {"ja-JP"}, {"en", "de"}},
        {{"de", "en", "fr"}, {"pl-PL"}, {"en", "de", "fr"}},
        {{"de", "fr"}, {"pl"}, {"de", "fr"}},
        {{"de", "en"}, {}, {"en", "de"}},
        {{"de", "en", "ja"}, {"ja", "pl"}, {"ja", "en", "de"}},
        {{}, {"de"}, {}},
        // Names that are not language tags never match but are kept.
        {{"Base", "de", "en"}, {"de", "en"}, {"de", "en", "Base"}},
        {{"en", "de"}, {"not a tag!", "de"}, {"de", "en"}},
        // The given order breaks ties between equally good localizations.
        {{"de_AT", "de_CH"}, {"de"}, {"de_AT", "de_CH"}},
        {{"de_CH", "de_AT"}, {"de"}, {"de_CH", "de_AT"}},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE((c.localizations.join(QLatin1Char(',')) + QStringLiteral(" for ") + c.preferences.join(QLatin1Char(','))).toStdString());
        EXPECT_EQ(preferredLocalizationsFromArray(c.localizations, c.preferences), c.expected);
    }
}

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

// The system languages follow LANGUAGE, as tags with "-".
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
