// Desktop entries and the application bundles they give, in scratch XDG directories: names and
// their translations, the lookup by identifier and by program, and entries that give no bundle.
#include "platform/bundle/bundle.h"
#include "platform/bundle/desktop_entry.h"
#include "tests/platform/bundle/bundle_fixtures.h"
#include "tests/support/log_capture.h"

#include <QFile>
#include <QTemporaryDir>
#include <gtest/gtest.h>

namespace zaf::bundle {
namespace {

using test::PrintTo;

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
// `bin` the only PATH entry, which holds zaf-editor. The editor's entry is in `home`.
class DesktopEntryTest : public ::testing::Test {
protected:
    DesktopEntryTest()
        : m_home(m_root.filePath(QStringLiteral("home"))), m_system(m_root.filePath(QStringLiteral("system"))),
          m_bin(m_root.filePath(QStringLiteral("bin"))), m_dataHome("XDG_DATA_HOME", m_home.toUtf8()),
          m_dataDirs("XDG_DATA_DIRS", m_system.toUtf8()), m_path("PATH", m_bin.toUtf8())
    {
        test::writeExecutable(m_bin + QStringLiteral("/zaf-editor"));
        writeEntry(m_home, QStringLiteral("org.example.Editor.desktop"), kEditorEntry);
    }

    void writeEntry(const QString &base, const QString &relativePath, const QByteArray &contents)
    {
        test::writeFile(base + QStringLiteral("/applications/") + relativePath, contents);
    }

    QTemporaryDir m_root;
    QString m_home, m_system, m_bin;
    ScopedEnvironment m_dataHome, m_dataDirs, m_path;
};

// An entry gives a bundle (a hidden one too) with its identifier, path and information: the name and
// the program, resolved through PATH. It has no resources, so lookups answer the key.
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

// A file URL of an entry opens its bundle; another URL opens none.
TEST_F(DesktopEntryTest, AnEntrysFileURLOpensItsBundle)
{
    const auto byUrl = Bundle::bundleWithURL(QUrl::fromLocalFile(m_home + QStringLiteral("/applications/org.example.Editor.desktop")));
    EXPECT_EQ(byUrl ? byUrl->bundleIdentifier() : QString(), QStringLiteral("org.example.Editor"));
    EXPECT_FALSE(Bundle::bundleWithURL(QUrl(QStringLiteral("https://example.org/org.example.Editor.desktop"))));
}

// XDG_DATA_HOME wins over XDG_DATA_DIRS.
TEST_F(DesktopEntryTest, TheHomeFolderWinsOverTheSystemFolders)
{
    writeEntry(m_home, QStringLiteral("org.example.Both.desktop"), appEntry("From home"));
    writeEntry(m_system, QStringLiteral("org.example.Both.desktop"), appEntry("From system"));
    EXPECT_EQ(infoString(Bundle::bundleWithIdentifier(QStringLiteral("org.example.Both")), kDisplayNameKey), QStringLiteral("From home"));
}

// An entry in a sub-folder has the folder in its identifier.
TEST_F(DesktopEntryTest, ASubFolderIsPartOfTheIdentifier)
{
    writeEntry(m_system, QStringLiteral("vendor/tool.desktop"), appEntry("Vendor tool"));
    const auto tool = Bundle::bundleWithIdentifier(QStringLiteral("vendor-tool"));
    ASSERT_TRUE(tool);
    EXPECT_EQ(tool->bundleIdentifier(), QStringLiteral("vendor-tool"));
    EXPECT_EQ(infoString(tool, kDisplayNameKey), QStringLiteral("Vendor tool"));
    EXPECT_EQ(infoString(tool, kBundleNameKey), QStringLiteral("true"));
}

// Unknown identifiers, an empty one and one with a path give none, without a log.
TEST_F(DesktopEntryTest, UnknownIdentifiersGiveNoneQuietly)
{
    zaf::test::LogCapture log;
    EXPECT_FALSE(Bundle::bundleWithIdentifier(QStringLiteral("org.example.Unknown")));
    EXPECT_FALSE(Bundle::bundleWithIdentifier(QString()));
    EXPECT_FALSE(Bundle::bundleWithIdentifier(QStringLiteral("../applications/org.example.Editor")));
    EXPECT_TRUE(log.messages(QStringLiteral("zaf.bundle")).isEmpty());
}

struct InvalidEntry {
    const char *name; // also the entry's identifier: org.example.NAME
    const char *contents;
};

class InvalidEntryTest : public DesktopEntryTest, public ::testing::WithParamInterface<InvalidEntry> {};

// Entries that are no application, or broken, give none and one log line naming them.
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
    InvalidEntry{"BadExec", "[Desktop Entry]\nType=Application\nName=x\nExec=\"unclosed\n"}), test::CaseName());

struct ProgramCase {
    const char *name;
    const char *program; // below the scratch root; "" for an empty path
    const char *identifier; // "" when no bundle starts it
};

class BundleForProgramTest : public DesktopEntryTest, public ::testing::WithParamInterface<ProgramCase> {};

// The bundle of a program is the entry that starts it: by its Exec program, or by a TryExec that
// names it through a link in PATH (what /proc/PID/exe shows is the resolved program).
TEST_P(BundleForProgramTest, IsTheEntryThatStartsIt)
{
    test::writeExecutable(m_root.filePath(QStringLiteral("opt/viewer/viewer-bin")));
    QFile::link(m_root.filePath(QStringLiteral("opt/viewer/viewer-bin")), m_bin + QStringLiteral("/zaf-viewer"));
    writeEntry(m_system, QStringLiteral("org.example.Viewer.desktop"),
               "[Desktop Entry]\nType=Application\nName=Viewer\nTryExec=zaf-viewer\nExec=sh -c zaf-viewer\n");
    const QString program = *GetParam().program ? m_root.filePath(QLatin1String(GetParam().program)) : QString();
    const auto bundle = Bundle::bundleForExecutablePath(program);
    EXPECT_EQ(bundle ? bundle->bundleIdentifier() : QString(), QLatin1String(GetParam().identifier));
}

INSTANTIATE_TEST_SUITE_P(Programs, BundleForProgramTest, ::testing::Values(
    ProgramCase{"ExecProgram", "bin/zaf-editor", "org.example.Editor"},
    ProgramCase{"TryExecThroughALink", "opt/viewer/viewer-bin", "org.example.Viewer"},
    ProgramCase{"NoEntryStartsIt", "opt/other", ""},
    ProgramCase{"EmptyPath", "", ""}), test::CaseName());

struct LocalizedNameCase {
    const char *name;
    QStringList languages;
    QString expected; // "" when no translation serves the languages
};

class LocalizedNameTest : public ::testing::TestWithParam<LocalizedNameCase> {};

// Name[...] keys follow the desktop-entry locale rules for each preferred language in turn.
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
    LocalizedNameCase{"FirstLanguageWins", {"de-DE", "de-CH"}, "Bearbeiter"}), test::CaseName());

// A bundle's localized information holds the translated name only when there is one.
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
