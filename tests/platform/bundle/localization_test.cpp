// Ordering localizations against preferred languages, and where the preferred languages come from.
#include "platform/bundle/bundle.h"
#include "tests/platform/bundle/bundle_fixtures.h"

#include <QLocale>
#include <gtest/gtest.h>

namespace zaf::bundle {
namespace {

QStringList list(std::initializer_list<const char *> items)
{
    QStringList result;
    for (const char *item : items)
        result << QString::fromLatin1(item);
    return result;
}

TEST(PreferredLocalizationsTest, OrdersLocalizationsByPreferenceThenKeepsTheRestInOrder)
{
    const struct {
        QStringList localizations;
        QStringList preferences;
        QStringList expected;
    } cases[] = {
        // A regional preference is served by its language; the second preference comes next.
        {list({"en", "de", "fr"}), list({"de-CH", "en"}), list({"de", "en", "fr"})},
        {list({"en", "de", "fr"}), list({"fr"}), list({"fr", "en", "de"})},
        // Folder names use "_"; the exact region wins over the bare language.
        {list({"pt", "pt_BR"}), list({"pt-BR"}), list({"pt_BR", "pt"})},
        {list({"pt_BR", "pt", "en"}), list({"pt-BR", "en"}), list({"pt_BR", "pt", "en"})},
        // Scripts matter: traditional Chinese in Taiwan is not served by simplified Chinese first.
        {list({"zh_CN", "zh_TW"}), list({"zh-Hant-TW"}), list({"zh_TW", "zh_CN"})},
        // Preferences no localization serves leave the development localization first, then the
        // given order.
        {list({"en", "de"}), list({"ja-JP"}), list({"en", "de"})},
        {list({"de", "en", "fr"}), list({"pl-PL"}), list({"en", "de", "fr"})},
        {list({"de", "fr"}), list({"pl"}), list({"de", "fr"})},
        {list({"de", "en"}), QStringList(), list({"en", "de"})},
        {list({"de", "en", "ja"}), list({"ja", "pl"}), list({"ja", "en", "de"})},
        {QStringList(), list({"de"}), QStringList()},
        // Names that are not language tags never match but are kept.
        {list({"Base", "de", "en"}), list({"de", "en"}), list({"de", "en", "Base"})},
        {list({"en", "de"}), list({"not a tag!", "de"}), list({"de", "en"})},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE((c.localizations.join(QLatin1Char(',')) + QStringLiteral(" for ") + c.preferences.join(QLatin1Char(','))).toStdString());
        EXPECT_EQ(preferredLocalizationsFromArray(c.localizations, c.preferences), c.expected);
    }
}

TEST(PreferredLocalizationsTest, GivenOrderBreaksTiesBetweenEquallyGoodLocalizations)
{
    EXPECT_EQ(preferredLocalizationsFromArray(list({"de_AT", "de_CH"}), list({"de"})).first(), QStringLiteral("de_AT"));
    EXPECT_EQ(preferredLocalizationsFromArray(list({"de_CH", "de_AT"}), list({"de"})).first(), QStringLiteral("de_CH"));
}

TEST(PreferredLanguagesTest, TestOverrideReplacesTheSystemLanguagesUntilCleared)
{
    QStringList system;
    for (QString language : QLocale::system().uiLanguages()) {
        // The C locale (as on build machines) is the untranslated, English one.
        if (language == QLatin1String("C") || language == QLatin1String("POSIX"))
            language = QStringLiteral("en");
        system << language.replace(QLatin1Char('_'), QLatin1Char('-'));
    }
    system.removeDuplicates();
    EXPECT_EQ(preferredLanguages(), system);
    {
        test::ScopedPreferredLanguages languages(list({"de-CH", "en"}));
        EXPECT_EQ(preferredLanguages(), list({"de-CH", "en"}));
    }
    EXPECT_EQ(preferredLanguages(), system);
}

TEST(PreferredLanguagesTest, SystemLanguagesHonourTheLanguageVariable)
{
    // Qt reads LANGUAGE when asked for the user interface languages (LANG only once per process).
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
