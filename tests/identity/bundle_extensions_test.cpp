// The recording framework's bundle operations: names, localization choice and text lookup.
#include "identity/bundle_extensions.h"
#include "tests/identity/identity_test_support.h"

namespace zaf::test {
namespace {

class FrameworkBundleTest : public ::testing::Test {
protected:
    // A framework bundle in a scratch directory; the process reads its place once, so every test
    // (a process of its own under ctest) sets it before the first lookup.
    void SetUp() override { qputenv("ZAF_FRAMEWORK_BUNDLE_PATH", QFile::encodeName(framework())); }
    QString framework() const { return scratch.file(QStringLiteral("Zafrel")); }
    ScratchDir scratch;
};

TEST_F(FrameworkBundleTest, RegionalLanguageFallsBackToTheBareLanguagesFolder)
{
    writeTable(framework(), QStringLiteral("en"), QStringLiteral("Localizable"), {{QStringLiteral("HELLO"), QStringLiteral("Hello")}});
    writeTable(framework(), QStringLiteral("de"), QStringLiteral("Localizable"), {{QStringLiteral("HELLO"), QStringLiteral("Hallo")}});
    bundle::setPreferredLanguagesForTesting({QStringLiteral("de-AT"), QStringLiteral("en")});
    ASSERT_TRUE(ZafBundleExtensions::fallbackBundle());
    EXPECT_TRUE(ZafBundleExtensions::fallbackBundle()->bundlePath().endsWith(QStringLiteral("de.lproj")));
    EXPECT_EQ(ZafBundleExtensions::_zafLocalizedStringFromFrameworkBundleWithKey(QStringLiteral("HELLO")), QStringLiteral("Hallo"));
    bundle::setPreferredLanguagesForTesting({QStringLiteral("en-GB")});
    EXPECT_EQ(ZafBundleExtensions::_zafLocalizedStringFromFrameworkBundleWithKey(QStringLiteral("HELLO")), QStringLiteral("Hello"));
}

TEST_F(FrameworkBundleTest, KeyMissingFromTheChosenLocalizationComesBackAsTheKey)
{
    writeTable(framework(), QStringLiteral("pt_BR"), QStringLiteral("Localizable"), {{QStringLiteral("OTHER"), QStringLiteral("Outro")}});
    writeTable(framework(), QStringLiteral("pt"), QStringLiteral("Localizable"), {{QStringLiteral("HELLO"), QStringLiteral("Olá")}});
    bundle::setPreferredLanguagesForTesting({QStringLiteral("pt-BR")});
    ASSERT_TRUE(ZafBundleExtensions::localizedBundle());
    EXPECT_TRUE(ZafBundleExtensions::localizedBundle()->bundlePath().endsWith(QStringLiteral("pt_BR.lproj")));
    EXPECT_EQ(ZafBundleExtensions::_zafLocalizedStringFromFrameworkBundleWithKey(QStringLiteral("HELLO")), QStringLiteral("HELLO"));
}

TEST_F(FrameworkBundleTest, WithoutLocalizationFoldersTheFrameworkBundleAnswers)
{
    QDir().mkpath(framework());
    bundle::setPreferredLanguagesForTesting({QStringLiteral("fr")});
    EXPECT_FALSE(ZafBundleExtensions::localizedBundle());
    EXPECT_FALSE(ZafBundleExtensions::fallbackBundle());
    EXPECT_EQ(ZafBundleExtensions::_zafLocalizedStringFromFrameworkBundleWithKey(QStringLiteral("HELLO")), QStringLiteral("HELLO"));
}

TEST_F(FrameworkBundleTest, MissingFrameworkBundleAnswersNothing)
{
    EXPECT_FALSE(ZafBundleExtensions::_zafFrameworkBundle());
    EXPECT_FALSE(ZafBundleExtensions::_zafLocalizedStringFromFrameworkBundleWithKey(QStringLiteral("HELLO")).has_value());
}

TEST(ShippedFrameworkBundle, ShareTextTakesTheNameAndTheAuthorInEveryLanguage)
{
    qputenv("ZAF_FRAMEWORK_BUNDLE_PATH", ZAF_SHIPPED_FRAMEWORK_BUNDLE);
    for (const char *language : {"en", "de", "fr", "es", "ja"}) {
        bundle::setPreferredLanguagesForTesting({QString::fromLatin1(language)});
        const std::optional<QString> format =
            ZafBundleExtensions::_zafLocalizedStringFromFrameworkBundleWithKey(QStringLiteral("SHARE_TEXT_FORMAT"));
        ASSERT_TRUE(format.has_value());
        EXPECT_TRUE(format->contains(QStringLiteral("%1$@")) && format->contains(QStringLiteral("%2$@")))
            << language << ": " << format->toStdString();
    }
}

TEST(BundleNames, DisplayNamePrecedenceAndUnknownIdentifiers)
{
    ScratchDir scratch;
    const QString data = scratch.file(QStringLiteral("data"));
    qputenv("XDG_DATA_HOME", QFile::encodeName(data));
    qputenv("XDG_DATA_DIRS", QFile::encodeName(scratch.file(QStringLiteral("none"))));
    writeDesktopEntry(data, QStringLiteral("org.example.Localized"),
                      QStringLiteral("Name=Recorder\nName[de]=Aufnahme\nExec=/usr/bin/recorder %U\n"));
    writeDesktopEntry(data, QStringLiteral("org.example.Plain"), QStringLiteral("Name=Plain Recorder\nExec=plainrec\n"));
    bundle::setPreferredLanguagesForTesting({QStringLiteral("de-DE")});
    EXPECT_EQ(ZafBundleExtensions::_zafLocalizedAppNameFromBundleID(QStringLiteral("org.example.Localized")), QStringLiteral("Aufnahme"));
    EXPECT_EQ(ZafBundleExtensions::_zafLocalizedAppNameFromBundleID(QStringLiteral("org.example.Plain")), QStringLiteral("Plain Recorder"));
    EXPECT_FALSE(ZafBundleExtensions::_zafLocalizedAppNameFromBundleID(QStringLiteral("org.example.Unknown")).has_value());

    // A bundle without any name gives "", never none.
    QDir().mkpath(scratch.file(QStringLiteral("Nameless")));
    const auto nameless = bundle::Bundle::bundleWithPath(scratch.file(QStringLiteral("Nameless")));
    ASSERT_TRUE(nameless);
    EXPECT_EQ(ZafBundleExtensions::_zafLocalizedAppName(*nameless), QStringLiteral(""));
}

TEST(BundleNames, BaseIdentifierDropsTheLastComponent)
{
    EXPECT_EQ(ZafBundleExtensions::baseIdentifier(QStringLiteral("com.example.app")), QStringLiteral("com.example"));
    EXPECT_EQ(ZafBundleExtensions::baseIdentifier(QStringLiteral("app")), QStringLiteral(""));
    EXPECT_EQ(ZafBundleExtensions::baseIdentifier(QStringLiteral("com.example.")), QStringLiteral("com.example"));
    EXPECT_FALSE(ZafBundleExtensions::bundleWithPID(-1));
}

} // namespace
} // namespace zaf::test
