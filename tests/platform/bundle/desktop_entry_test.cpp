// Desktop entries and the application bundles they give, in scratch XDG directories.
#include "platform/bundle/bundle.h"
#include "platform/bundle/desktop_entry.h"
#include "tests/platform/bundle/bundle_fixtures.h"
#include "tests/support/log_capture.h"
#include "tests/support/named_cases.h"

#include <QFile>
#include <QTemporaryDir>
#include <gtest/gtest.h>

namespace zaf::bundle {
namespace {

ZAF_PRINT_CASES_AS_NAMES
using test::ScopedEnvironment;

QString infoString(const std::shared_ptr<Bundle> &bundle, const char *key)
{
    return bundle ? bundle->infoDictionary().value(QString::fromLatin1(key)).toString() : QStringLiteral("(no bundle)");
}

const QByteArray kEditorEntry = "[Desktop Entry]\nType=Application\nName=Editor\nName[de]=Bearbeiter\n"
                                "Name[de_CH]=Bearbeiter (Schweiz)\nName[sr@latin]=Urednik\n"
                                "Exec=zaf-editor --new %F\nHidden=true\nNoDisplay=true\n";

// An application entry that runs /bin/true.
QByteArray appEntry(const char *name)
{
    return QByteArray("[Desktop Entry]\nType=Application\nName=") + name + "\nExec=/bin/true\n";
}

// Scratch XDG data directories: `home` is XDG_DATA_HOME, `system` the only XDG_DATA_DIRS entry, and
// `bin` the only PATH entry, which holds zaf-editor and a link zaf-viewer to opt/viewer/viewer-bin.
// The editor's entry is in `home`; org.example.Both in both; vendor/tool and the viewer in `system`.
class DesktopEntryTest : public ::testing::Test {
protected:
    DesktopEntryTest()
        : m_home(m_root.filePath(QStringLiteral("home"))), m_system(m_root.filePath(QStringLiteral("system"))),
          m_bin(m_root.filePath(QStringLiteral("bin"))), m_dataHome("XDG_DATA_HOME", m_home.toUtf8()),
          m_dataDirs("XDG_DATA_DIRS", m_system.toUtf8()), m_path("PATH", m_bin.toUtf8())
    {
        test::writeExecutable(m_bin + QStringLiteral("/zaf-editor"));
        test::writeExecutable(m_root.filePath(QStringLiteral("opt/viewer/viewer-bin")));
        QFile::link(m_root.filePath(QStringLiteral("opt/viewer/viewer-bin")), m_bin + QStringLiteral("/zaf-viewer"));
        writeEntry(m_home, QStringLiteral("org.example.Editor.desktop"), kEditorEntry);
        writeEntry(m_home, QStringLiteral("org.example.Both.desktop"), appEntry("From home"));
        writeEntry(m_system, QStringLiteral("org.example.Both.desktop"), appEntry("From system"));
        writeEntry(m_system, QStringLiteral("vendor/tool.desktop"), appEntry("Vendor tool"));
        writeEntry(m_system, QStringLiteral("org.example.Viewer.desktop"),
                   "[Desktop Entry]\nType=Application\nName=Viewer\nTryExec=zaf-viewer\nExec=sh -c zaf-viewer\n");
    }

    void writeEntry(const QString &base, const QString &relativePath, const QByteArray &contents)
    {
        test::writeFile(base + QStringLiteral("/applications/") + relativePath, contents);
    }

    QTemporaryDir m_root;
    QString m_home, m_system, m_bin;
    ScopedEnvironment m_dataHome, m_dataDirs, m_path;
};

// A hidden entry too; the program is resolved through PATH; without resources lookups answer the key.
TEST_F(DesktopEntryTest, AnEntryGivesAnApplicationBundle)
{
    const auto bundle = Bundle::bundleWithIdentifier(QStringLiteral("org.example.Editor"));
    ASSERT_TRUE(bundle);
    EXPECT_EQ(bundle->bundleIdentifier(), QStringLiteral("org.example.Editor"));
    EXPECT_EQ(bundle->bundlePath(), m_home + QStringLiteral("/applications/org.example.Editor.desktop"));
    EXPECT_EQ(infoString(bundle, kDisplayNameKey), QStringLiteral("Editor"));
    EXPECT_EQ(infoString(bundle, kBundleNameKey), QStringLiteral("zaf-editor"));
    EXPECT_EQ(infoString(bundle, kExecutableKey), m_bin + QStringLiteral("/zaf-editor"));
    EXPECT_EQ(infoString(bundle, kIdentifierKey), QStringLiteral("org.example.Editor"));
    EXPECT_EQ(bundle->localizedStringForKey(QStringLiteral("KEY"), QString(), QString()), QStringLiteral("KEY"));
}

struct LookupCase {
    const char *name;
    enum { Identifier, FileURL, URL, Program } by;
    const char *query;    // an identifier, a path or program below the scratch root, or a URL
    const char *expected; // the display name of the bundle found; "" for none
};

class BundleLookupTest : public DesktopEntryTest, public ::testing::WithParamInterface<LookupCase> {};

// An application's bundle is found by desktop-file ID (XDG_DATA_HOME before XDG_DATA_DIRS, a
// sub-folder part of the ID), by its entry's file URL, or by the program it starts: its Exec
// program, or a TryExec naming it through a link in PATH (/proc/PID/exe shows the resolved program).
// A lookup that finds nothing logs nothing.
TEST_P(BundleLookupTest, FindsTheApplicationsBundle)
{
    const LookupCase &c = GetParam();
    const QString query = QString::fromLatin1(c.query);
    const QString path = query.isEmpty() ? QString() : m_root.filePath(query);
    zaf::test::LogCapture log;
    const auto bundle = c.by == LookupCase::Identifier ? Bundle::bundleWithIdentifier(query)
                        : c.by == LookupCase::FileURL  ? Bundle::bundleWithURL(QUrl::fromLocalFile(path))
                        : c.by == LookupCase::URL      ? Bundle::bundleWithURL(QUrl(query))
                                                       : Bundle::bundleForExecutablePath(path);
    EXPECT_EQ(bundle ? infoString(bundle, kDisplayNameKey) : QString(), QString::fromLatin1(c.expected));
    EXPECT_TRUE(log.messages(QStringLiteral("zaf.bundle")).isEmpty());
}

INSTANTIATE_TEST_SUITE_P(Lookups, BundleLookupTest, ::testing::Values(
    LookupCase{"HomeBeforeSystem", LookupCase::Identifier, "org.example.Both", "From home"},
    LookupCase{"SubFolderInTheIdentifier", LookupCase::Identifier, "vendor-tool", "Vendor tool"},
    LookupCase{"UnknownIdentifier", LookupCase::Identifier, "org.example.Unknown", ""},
    LookupCase{"EmptyIdentifier", LookupCase::Identifier, "", ""},
    LookupCase{"IdentifierWithAPath", LookupCase::Identifier, "../applications/org.example.Editor", ""},
    LookupCase{"EntrysFileURL", LookupCase::FileURL, "home/applications/org.example.Editor.desktop", "Editor"},
    LookupCase{"WebURL", LookupCase::URL, "https://example.org/org.example.Editor.desktop", ""},
    LookupCase{"ExecProgram", LookupCase::Program, "bin/zaf-editor", "Editor"},
    LookupCase{"TryExecThroughALink", LookupCase::Program, "opt/viewer/viewer-bin", "Viewer"},
    LookupCase{"ProgramNoEntryStarts", LookupCase::Program, "opt/other", ""},
    LookupCase{"EmptyProgram", LookupCase::Program, "", ""}), zaf::test::caseName);

struct InvalidEntry {
    const char *name; // also the entry's identifier: org.example.NAME
    const char *contents;
};

class InvalidEntryTest : public DesktopEntryTest, public ::testing::WithParamInterface<InvalidEntry> {};

TEST_P(InvalidEntryTest, GivesNoBundleWithALog)
{
    const QString id = QStringLiteral("org.example.") + QLatin1String(GetParam().name);
    writeEntry(m_home, id + QStringLiteral(".desktop"), GetParam().contents);
    zaf::test::LogCapture log;
    EXPECT_FALSE(Bundle::bundleWithIdentifier(id));
    const QStringList messages = log.messages(QStringLiteral("zaf.bundle"));
    ASSERT_EQ(messages.size(), 1);
    EXPECT_TRUE(messages.first().contains(id)) << messages.first().toStdString();
}

INSTANTIATE_TEST_SUITE_P(Entries, InvalidEntryTest, ::testing::Values(
    InvalidEntry{"Link", "[Desktop Entry]\nType=Link\nName=Link\nURL=https://example.org\n"},
    InvalidEntry{"Garbage", "this is not a key file\n[[[\n"},
    InvalidEntry{"NoGroup", "[Other]\nName=x\n"},
    InvalidEntry{"NoName", "[Desktop Entry]\nType=Application\nExec=/bin/true\n"},
    InvalidEntry{"BadExec", "[Desktop Entry]\nType=Application\nName=x\nExec=\"unclosed\n"}), zaf::test::caseName);

struct LocalizedNameCase {
    const char *name;
    QStringList languages;
    QString expected; // "" when no translation serves the languages
};

class LocalizedNameTest : public ::testing::TestWithParam<LocalizedNameCase> {};

TEST_P(LocalizedNameTest, FollowsTheLocaleRulesForEachLanguageInTurn)
{
    static QTemporaryDir dir;
    static const std::optional<DesktopEntry> entry = [] {
        test::writeFile(dir.filePath(QStringLiteral("editor.desktop")), kEditorEntry);
        return DesktopEntry::read(dir.filePath(QStringLiteral("editor.desktop")), DesktopEntry::Requirement::Application);
    }();
    ASSERT_TRUE(entry);
    EXPECT_EQ(entry->localizedName(GetParam().languages), GetParam().expected);
    EXPECT_EQ(entry->name(), QStringLiteral("Editor"));
}

INSTANTIATE_TEST_SUITE_P(Languages, LocalizedNameTest, ::testing::Values(
    LocalizedNameCase{"LanguageAndRegion", {"de-CH"}, "Bearbeiter (Schweiz)"},
    LocalizedNameCase{"OtherRegion", {"de-AT"}, "Bearbeiter"},
    LocalizedNameCase{"LanguageOnly", {"de"}, "Bearbeiter"},
    LocalizedNameCase{"ScriptAsModifier", {"sr-Latn-RS"}, "Urednik"},
    LocalizedNameCase{"Untranslated", {"fr-FR"}, ""},
    LocalizedNameCase{"SecondLanguage", {"fr-FR", "de-CH"}, "Bearbeiter (Schweiz)"},
    LocalizedNameCase{"FirstLanguageWins", {"de-DE", "de-CH"}, "Bearbeiter"}), zaf::test::caseName);

TEST_F(DesktopEntryTest, TheLocalizedInformationHoldsOnlyATranslatedName)
{
    const auto bundle = Bundle::bundleWithIdentifier(QStringLiteral("org.example.Editor"));
    ASSERT_TRUE(bundle);
    test::ScopedPreferredLanguages french({QStringLiteral("fr-FR")});
    EXPECT_TRUE(bundle->localizedInfoDictionary().isEmpty());
    test::ScopedPreferredLanguages german({QStringLiteral("de-CH")});
    EXPECT_EQ(bundle->localizedInfoDictionary(), (QVariantMap{{QString::fromLatin1(kDisplayNameKey), QStringLiteral("Bearbeiter (Schweiz)")}}));
}

} // namespace
} // namespace zaf::bundle
