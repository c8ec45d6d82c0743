// The recording framework's bundle operations: names, localization choice and text lookup.
#include "identity/bundle_extensions.h"
#include "tests/platform/bundle/bundle_fixtures.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>
#include <gtest/gtest.h>

namespace zaf::test {
namespace {

std::optional<QString> frameworkText(const char *key)
{
    return ZafBundleExtensions::_zafLocalizedStringFromFrameworkBundleWithKey(QString::fromLatin1(key));
}

// A framework bundle in a scratch directory. The process reads its place once, so every test (a
// process of its own under ctest) sets it before the first lookup.
class FrameworkBundleTest : public ::testing::Test {
protected:
    void SetUp() override { qputenv("ZAF_FRAMEWORK_BUNDLE_PATH", QFile::encodeName(framework())); }
    QString framework() const { return scratch.file(QStringLiteral("Zafrel")); }
    void writeText(const char *localization, const char *key, const char *text) const
    {
        bundle::test::writeTable(framework(), QString::fromLatin1(localization), QStringLiteral("Localizable"),
                                 {{QString::fromLatin1(key), QString::fromUtf8(text)}});
    }
    ScratchDir scratch;
};

TEST_F(FrameworkBundleTest, RegionalLanguageFallsBackToTheBareLanguagesFolder)
{
    writeText("en", "HELLO", "Hello");
    writeText("de", "HELLO", "Hallo");
    bundle::setPreferredLanguagesForTesting({QStringLiteral("de-AT"), QStringLiteral("en")});
    ASSERT_TRUE(ZafBundleExtensions::fallbackBundle());
    EXPECT_TRUE(ZafBundleExtensions::fallbackBundle()->bundlePath().endsWith(QStringLiteral("de.lproj")));
    EXPECT_EQ(frameworkText("HELLO"), QStringLiteral("Hallo"));
    bundle::setPreferredLanguagesForTesting({QStringLiteral("en-GB")});
    EXPECT_EQ(frameworkText("HELLO"), QStringLiteral("Hello"));
}

// The chosen localization answers alone.
TEST_F(FrameworkBundleTest, KeyMissingFromTheChosenLocalizationComesBackAsTheKey)
{
    writeText("pt_BR", "OTHER", "Outro");
    writeText("pt", "HELLO", "Olá");
    bundle::setPreferredLanguagesForTesting({QStringLiteral("pt-BR")});
    ASSERT_TRUE(ZafBundleExtensions::localizedBundle());
    EXPECT_TRUE(ZafBundleExtensions::localizedBundle()->bundlePath().endsWith(QStringLiteral("pt_BR.lproj")));
    EXPECT_EQ(frameworkText("HELLO"), QStringLiteral("HELLO"));
}

TEST_F(FrameworkBundleTest, WithoutLocalizationFoldersTheFrameworkBundleAnswers)
{
    QDir().mkpath(framework());
    bundle::setPreferredLanguagesForTesting({QStringLiteral("fr")});
    EXPECT_FALSE(ZafBundleExtensions::localizedBundle());
    EXPECT_FALSE(ZafBundleExtensions::fallbackBundle());
    EXPECT_EQ(frameworkText("HELLO"), QStringLiteral("HELLO"));
}

TEST_F(FrameworkBundleTest, MissingFrameworkBundleAnswersNothing)
{
    EXPECT_FALSE(ZafBundleExtensions::_zafFrameworkBundle());
    EXPECT_FALSE(frameworkText("HELLO").has_value());
}

// A bundle without any name gives "". (The plain name and an unknown identifier: the store manager
// tests.)
TEST(BundleNames, DisplayNameIsTheLocalizedOneThenThePlainOne)
{
    ScratchDir scratch;
    const QString data = scratch.file(QStringLiteral("data"));
    qputenv("XDG_DATA_HOME", QFile::encodeName(data));
    qputenv("XDG_DATA_DIRS", QFile::encodeName(scratch.file(QStringLiteral("none"))));
    bundle::test::writeDesktopEntry(data, QStringLiteral("org.example.Localized"),
                                    QStringLiteral("Name=Recorder\nName[de]=Aufnahme\nExec=/usr/bin/recorder %U\n"));
    bundle::setPreferredLanguagesForTesting({QStringLiteral("de-DE")});
    EXPECT_EQ(ZafBundleExtensions::_zafLocalizedAppNameFromBundleID(QStringLiteral("org.example.Localized")), QStringLiteral("Aufnahme"));
    QDir().mkpath(scratch.file(QStringLiteral("Nameless")));
    const auto nameless = bundle::Bundle::bundleWithPath(scratch.file(QStringLiteral("Nameless")));
    ASSERT_TRUE(nameless);
    EXPECT_EQ(ZafBundleExtensions::_zafLocalizedAppName(*nameless), QStringLiteral(""));
}

// No process has a bundle of pid -1.
TEST(BundleNames, BaseIdentifierDropsTheLastComponent)
{
    EXPECT_EQ(ZafBundleExtensions::baseIdentifier(QStringLiteral("com.example.app")), QStringLiteral("com.example"));
    EXPECT_EQ(ZafBundleExtensions::baseIdentifier(QStringLiteral("app")), QStringLiteral(""));
    EXPECT_EQ(ZafBundleExtensions::baseIdentifier(QStringLiteral("com.example.")), QStringLiteral("com.example"));
    EXPECT_FALSE(ZafBundleExtensions::bundleWithPID(-1));
}

} // namespace
} // namespace zaf::test
