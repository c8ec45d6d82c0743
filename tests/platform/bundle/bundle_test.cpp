// Directory bundles and the executable of a process (application bundles: desktop_entry_test.cpp).
#include "platform/bundle/bundle.h"
#include "tests/platform/bundle/bundle_fixtures.h"
#include "tests/support/log_capture.h"
#include "tests/support/named_cases.h"

#include <QCoreApplication>
#include <QDir>
#include <QFileInfo>
#include <QTemporaryDir>
#include <gtest/gtest.h>

#include <unistd.h>

namespace zaf::bundle {
namespace {

ZAF_PRINT_CASES_AS_NAMES
using test::ScopedPreferredLanguages;

QString displayName(const QVariantMap &info)
{
    return info.value(QString::fromLatin1(kDisplayNameKey)).toString();
}

// A directory bundle with an information dictionary, a resource directory and three localizations
// (the Brazilian table is corrupt).
class DirectoryBundleTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        m_path = m_root.filePath(QStringLiteral("Zafrel"));
        m_resources = m_path + QStringLiteral("/Resources");
        test::writeFile(m_path + QStringLiteral("/Info.desktop"),
                        "[Desktop Entry]\nType=Service\nName=Zafrel\nName[de]=Zafrel DE\nX-Zaf-Identifier=org.example.Zafrel\n");
        test::writeTable(m_resources, "de", "Localizable", {{"HELLO", "Hallo"}, {"ONLY_DE", "Nur Deutsch"}});
        test::writeTable(m_resources, "de", "Other", {{"HELLO", "Servus"}});
        test::writeTable(m_resources, "en", "Localizable", {{"HELLO", "Hello"}});
        test::writeFile(m_resources + QStringLiteral("/pt_BR.lproj/Localizable.mo"), "corrupt catalogue bytes, long enough for a header");
        ASSERT_TRUE(QDir().mkpath(m_resources + QStringLiteral("/not-a-localization")));
        m_bundle = Bundle::bundleWithPath(m_path);
        ASSERT_TRUE(m_bundle);
    }

    QTemporaryDir m_root;
    QString m_path, m_resources;
    std::shared_ptr<Bundle> m_bundle;
};

TEST_F(DirectoryBundleTest, OpensWithWhatItsDirectoryHolds)
{
    EXPECT_EQ(m_bundle->bundlePath(), m_path);
    EXPECT_EQ(m_bundle->bundleIdentifier(), QStringLiteral("org.example.Zafrel"));
    EXPECT_EQ(displayName(m_bundle->infoDictionary()), QStringLiteral("Zafrel"));
    ScopedPreferredLanguages languages({QStringLiteral("de-DE")});
    EXPECT_EQ(displayName(m_bundle->localizedInfoDictionary()), QStringLiteral("Zafrel DE"));
    EXPECT_EQ(m_bundle->resourcePath(), m_resources);
    EXPECT_EQ(m_bundle->localizations(), QStringList({QStringLiteral("de"), QStringLiteral("en"), QStringLiteral("pt_BR")}));
}

// A resource is found in a localization's folder; a string table is stored compiled.
TEST_F(DirectoryBundleTest, PathForResourceFindsTheResourceInItsLocalization)
{
    const QString deTable = m_resources + QStringLiteral("/de.lproj/Localizable.mo");
    EXPECT_EQ(m_bundle->pathForResource(QStringLiteral("Localizable"), QStringLiteral("mo"), QStringLiteral("de")), deTable);
    EXPECT_EQ(m_bundle->pathForResource(QStringLiteral("Localizable"), QStringLiteral("strings"), QStringLiteral("de")), deTable);
    EXPECT_EQ(m_bundle->pathForResource(QStringLiteral("Localizable"), QStringLiteral("strings"), QStringLiteral("fr")), QString());
    EXPECT_EQ(m_bundle->pathForResource(QStringLiteral("Info"), QStringLiteral("plist"), QString()), QString());
}

TEST_F(DirectoryBundleTest, PathsThatAreNoBundleGiveNone)
{
    EXPECT_FALSE(Bundle::bundleWithPath(m_root.filePath(QStringLiteral("missing"))));
    EXPECT_FALSE(Bundle::bundleWithPath(m_path + QStringLiteral("/Info.desktop")));
    EXPECT_FALSE(Bundle::bundleWithPath(QString()));
}

// Its table answers whatever the languages.
TEST_F(DirectoryBundleTest, ABareLocalizationFolderIsABundle)
{
    const auto bare = Bundle::bundleWithPath(m_resources + QStringLiteral("/de.lproj"));
    ASSERT_TRUE(bare);
    EXPECT_TRUE(bare->infoDictionary().isEmpty());
    EXPECT_EQ(bare->resourcePath(), m_resources + QStringLiteral("/de.lproj"));
    EXPECT_TRUE(bare->localizations().isEmpty());
    ScopedPreferredLanguages languages({QStringLiteral("en")});
    EXPECT_EQ(bare->localizedStringForKey(QStringLiteral("HELLO"), QString(), QString()), QStringLiteral("Hallo"));
    EXPECT_EQ(bare->localizedStringForKey(QStringLiteral("MISSING"), QString(), QString()), QStringLiteral("MISSING"));
}

// Logged, and the bundle has no information.
TEST_F(DirectoryBundleTest, AMalformedInformationFileLeavesTheBundleUsable)
{
    test::writeFile(m_path + QStringLiteral("/Info.desktop"), "[Desktop Entry\nName=broken\n");
    zaf::test::LogCapture log;
    const auto malformed = Bundle::bundleWithPath(m_path);
    ASSERT_TRUE(malformed);
    EXPECT_TRUE(malformed->infoDictionary().isEmpty());
    EXPECT_TRUE(malformed->localizedInfoDictionary().isEmpty());
    EXPECT_EQ(log.messages(QStringLiteral("zaf.bundle")).size(), 1);
    EXPECT_EQ(malformed->localizations().size(), 3);
}

struct LookupCase {
    const char *name;
    const char *languages, *key, *value, *table, *expected;
};

class LookupTest : public DirectoryBundleTest, public ::testing::WithParamInterface<LookupCase> {};

// The best localization's table alone, then the value, then the key.
TEST_P(LookupTest, UsesTheBestLocalizationThenTheValueThenTheKey)
{
    const LookupCase &c = GetParam();
    const auto text = [](const char *s) { return *s ? QString::fromUtf8(s) : QString(); };
    ScopedPreferredLanguages languages(text(c.languages).split(QLatin1Char(',')));
    EXPECT_EQ(m_bundle->localizedStringForKey(text(c.key), text(c.value), text(c.table)), text(c.expected));
}

INSTANTIATE_TEST_SUITE_P(Lookups, LookupTest, ::testing::Values(
    LookupCase{"DefaultTable", "de-CH,en", "HELLO", "", "", "Hallo"},
    LookupCase{"NamedTable", "de-CH,en", "HELLO", "", "Localizable", "Hallo"},
    LookupCase{"OtherTable", "de-CH,en", "HELLO", "", "Other", "Servus"},
    LookupCase{"MissingKeyGivesTheValue", "de-CH,en", "MISSING", "Default", "", "Default"},
    LookupCase{"MissingKeyGivesTheKey", "de-CH,en", "MISSING", "", "", "MISSING"},
    LookupCase{"MissingTable", "de-CH,en", "HELLO", "", "NoSuchTable", "HELLO"},
    LookupCase{"English", "en-GB", "HELLO", "", "", "Hello"},
    LookupCase{"NoFallbackToAnotherLocalization", "en-GB", "ONLY_DE", "", "", "ONLY_DE"},
    LookupCase{"CorruptTable", "pt-BR", "HELLO", "", "", "HELLO"},
    LookupCase{"CorruptTableGivesTheValue", "pt-BR", "HELLO", "Olá", "", "Olá"}), zaf::test::caseName);

// However often it is looked in, with the reason.
TEST_F(DirectoryBundleTest, ACorruptTableIsLoggedOnce)
{
    zaf::test::LogCapture log;
    ScopedPreferredLanguages languages({QStringLiteral("pt-BR")});
    for (const char *key : {"HELLO", "OTHER"})
        EXPECT_EQ(m_bundle->localizedStringForKey(QLatin1String(key), QString(), QString()), QLatin1String(key));
    const QStringList messages = log.messages(QStringLiteral("zaf.bundle")).filter(QStringLiteral("pt_BR.lproj/Localizable.mo"));
    ASSERT_EQ(messages.size(), 1);
    EXPECT_TRUE(messages.first().contains(QStringLiteral("magic"))) << messages.first().toStdString();
}

TEST(ExecutablePathOfProcessTest, ReadsTheRunningProgram)
{
    QString path;
    const int length = executablePathOfProcess(getpid(), &path);
    const QString expected = QFileInfo(QCoreApplication::applicationFilePath()).canonicalFilePath();
    EXPECT_EQ(path, expected);
    EXPECT_EQ(length, expected.toUtf8().size());
    EXPECT_EQ(executablePathOfProcess(getpid(), nullptr), length);
}

class UnreadableProcessTest : public ::testing::TestWithParam<pid_t> {};

TEST_P(UnreadableProcessTest, ReadsNothing)
{
    QString path = QStringLiteral("stale");
    EXPECT_EQ(executablePathOfProcess(GetParam(), &path), 0);
    EXPECT_TRUE(path.isEmpty());
}

// The last is above the kernel's largest PID.
INSTANTIATE_TEST_SUITE_P(Pids, UnreadableProcessTest, ::testing::Values(0, -1, 0x3ffffff0));

} // namespace
} // namespace zaf::bundle
