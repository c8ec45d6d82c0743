// Bundles: application bundles from desktop entries in scratch XDG directories, directory bundles
// with string tables, and the executable of a process.
#include "platform/bundle/bundle.h"
#include "tests/platform/bundle/bundle_fixtures.h"
#include "tests/support/log_capture.h"

#include <QCoreApplication>
#include <QDir>
#include <QFileInfo>
#include <QTemporaryDir>
#include <gtest/gtest.h>

#include <unistd.h>

namespace zaf::bundle {
namespace {

using test::ScopedEnvironment;
using test::ScopedPreferredLanguages;

QString infoString(const QVariantMap &info, const char *key)
{
    return info.value(QString::fromLatin1(key)).toString();
}

const QString kEditorEntry = QStringLiteral("[Desktop Entry]\nType=Application\nName=Editor\nName[de]=Bearbeiter\n"
                                            "Name[de_CH]=Bearbeiter (Schweiz)\nName[sr@latin]=Urednik\n"
                                            "Exec=zaf-editor --new %F\nHidden=true\nNoDisplay=true\n");

// An application entry that runs /bin/true.
QString appEntry(const char *name)
{
    return QStringLiteral("[Desktop Entry]\nType=Application\nName=%1\nExec=/bin/true\n").arg(QLatin1String(name));
}

// Scratch XDG data directories: `home` is XDG_DATA_HOME, `system` the only XDG_DATA_DIRS entry, and
// `bin` the only PATH entry.
class DesktopEntryTest : public ::testing::Test {
protected:
    DesktopEntryTest()
        : m_home(m_root.filePath(QStringLiteral("home"))),
          m_system(m_root.filePath(QStringLiteral("system"))),
          m_bin(m_root.filePath(QStringLiteral("bin"))),
          m_dataHome("XDG_DATA_HOME", m_home.toUtf8()),
          m_dataDirs("XDG_DATA_DIRS", m_system.toUtf8()),
          m_path("PATH", m_bin.toUtf8())
    {
    }

    void writeEntry(const QString &base, const QString &relativePath, const QString &contents)
    {
        test::writeFile(base + QStringLiteral("/applications/") + relativePath, contents.toUtf8());
    }

    QTemporaryDir m_root;
    QString m_home;
    QString m_system;
    QString m_bin;
    ScopedEnvironment m_dataHome;
    ScopedEnvironment m_dataDirs;
    ScopedEnvironment m_path;
};

// An entry gives a bundle (hidden ones too) found by id, file URL or the program it starts, with
// its (localized) names and the program resolved through PATH; XDG_DATA_HOME wins over
// XDG_DATA_DIRS, and an entry in a sub-folder has the folder in its id.
TEST_F(DesktopEntryTest, BundlesComeFromEntriesByXdgRules)
{
    test::writeExecutable(m_bin + QStringLiteral("/zaf-editor"));
    writeEntry(m_home, QStringLiteral("org.example.Editor.desktop"), kEditorEntry);
    const auto bundle = Bundle::bundleWithIdentifier(QStringLiteral("org.example.Editor"));
    ASSERT_TRUE(bundle) << "Hidden and NoDisplay do not hide a bundle";
    EXPECT_EQ(bundle->bundleIdentifier(), QStringLiteral("org.example.Editor"));
    EXPECT_EQ(bundle->bundlePath(), m_home + QStringLiteral("/applications/org.example.Editor.desktop"));
    const QVariantMap info = bundle->infoDictionary();
    EXPECT_EQ(infoString(info, kDisplayNameKey), QStringLiteral("Editor"));
    EXPECT_EQ(infoString(info, kBundleNameKey), QStringLiteral("zaf-editor"));
    EXPECT_EQ(infoString(info, kExecutableKey), m_bin + QStringLiteral("/zaf-editor"));
    EXPECT_EQ(infoString(info, kIdentifierKey), QStringLiteral("org.example.Editor"));
    EXPECT_EQ(bundle->localizedStringForKey(QStringLiteral("KEY"), QString(), QString()), QStringLiteral("KEY"));
    const auto byUrl = Bundle::bundleWithURL(QUrl::fromLocalFile(bundle->bundlePath()));
    EXPECT_EQ(byUrl ? byUrl->bundleIdentifier() : QString(), QStringLiteral("org.example.Editor"));
    EXPECT_FALSE(Bundle::bundleWithURL(QUrl(QStringLiteral("https://example.org/org.example.Editor.desktop"))));

    // Name[...] keys follow the desktop-entry locale rules for each preferred language in turn.
    const struct {
        QStringList languages;
        QString expected; // "" when no translation serves the languages
    } cases[] = {
        {{QStringLiteral("de-CH")}, QStringLiteral("Bearbeiter (Schweiz)")},
        {{QStringLiteral("de-AT")}, QStringLiteral("Bearbeiter")},
        {{QStringLiteral("de")}, QStringLiteral("Bearbeiter")},
        {{QStringLiteral("sr-Latn-RS")}, QStringLiteral("Urednik")},
        {{QStringLiteral("fr-FR")}, QString()},
        {{QStringLiteral("fr-FR"), QStringLiteral("de-CH")}, QStringLiteral("Bearbeiter (Schweiz)")},
        {{QStringLiteral("de-DE"), QStringLiteral("de-CH")}, QStringLiteral("Bearbeiter")},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.languages.join(QLatin1Char(',')).toStdString());
        ScopedPreferredLanguages languages(c.languages);
        const QVariantMap localized = bundle->localizedInfoDictionary();
        EXPECT_EQ(infoString(localized, kDisplayNameKey), c.expected);
        EXPECT_EQ(localized.contains(QString::fromLatin1(kDisplayNameKey)), !c.expected.isEmpty());
    }
    EXPECT_EQ(infoString(bundle->infoDictionary(), kDisplayNameKey), QStringLiteral("Editor"));

    writeEntry(m_home, QStringLiteral("org.example.Both.desktop"), appEntry("From home"));
    writeEntry(m_system, QStringLiteral("org.example.Both.desktop"), appEntry("From system"));
    writeEntry(m_system, QStringLiteral("vendor/tool.desktop"), appEntry("Vendor tool"));
    const auto both = Bundle::bundleWithIdentifier(QStringLiteral("org.example.Both"));
    EXPECT_EQ(both ? infoString(both->infoDictionary(), kDisplayNameKey) : QString(), QStringLiteral("From home"));
    const auto tool = Bundle::bundleWithIdentifier(QStringLiteral("vendor-tool"));
    ASSERT_TRUE(tool);
    EXPECT_EQ(tool->bundleIdentifier(), QStringLiteral("vendor-tool"));
    EXPECT_EQ(infoString(tool->infoDictionary(), kDisplayNameKey), QStringLiteral("Vendor tool"));
    EXPECT_EQ(infoString(tool->infoDictionary(), kBundleNameKey), QStringLiteral("true"));

    // What /proc/PID/exe shows is the resolved program; TryExec may name it through a link in PATH.
    test::writeExecutable(m_root.filePath(QStringLiteral("opt/viewer/viewer-bin")));
    QFile::link(m_root.filePath(QStringLiteral("opt/viewer/viewer-bin")), m_bin + QStringLiteral("/zaf-viewer"));
    writeEntry(m_system, QStringLiteral("org.example.Viewer.desktop"),
               QStringLiteral("[Desktop Entry]\nType=Application\nName=Viewer\nTryExec=zaf-viewer\nExec=sh -c zaf-viewer\n"));
    const auto editor = Bundle::bundleForExecutablePath(m_bin + QStringLiteral("/zaf-editor"));
    EXPECT_EQ(editor ? editor->bundleIdentifier() : QString(), QStringLiteral("org.example.Editor"));
    const auto viewer = Bundle::bundleForExecutablePath(m_root.filePath(QStringLiteral("opt/viewer/viewer-bin")));
    EXPECT_EQ(viewer ? viewer->bundleIdentifier() : QString(), QStringLiteral("org.example.Viewer"));
    EXPECT_FALSE(Bundle::bundleForExecutablePath(m_root.filePath(QStringLiteral("opt/other"))));
    EXPECT_FALSE(Bundle::bundleForExecutablePath(QString()));
}

// Unknown ids give none quietly; entries that are no application, or broken, give none and a log.
TEST_F(DesktopEntryTest, BundleWithIdentifierGivesNoneForUnknownOrInvalidEntries)
{
    writeEntry(m_home, QStringLiteral("org.example.Link.desktop"), QStringLiteral("[Desktop Entry]\nType=Link\nName=Link\nURL=https://example.org\n"));
    writeEntry(m_home, QStringLiteral("org.example.Garbage.desktop"), QStringLiteral("this is not a key file\n[[[\n"));
    writeEntry(m_home, QStringLiteral("org.example.NoGroup.desktop"), QStringLiteral("[Other]\nName=x\n"));
    writeEntry(m_home, QStringLiteral("org.example.NoName.desktop"), QStringLiteral("[Desktop Entry]\nType=Application\nExec=/bin/true\n"));
    writeEntry(m_home, QStringLiteral("org.example.BadExec.desktop"), QStringLiteral("[Desktop Entry]\nType=Application\nName=x\nExec=\"unclosed\n"));

    zaf::test::LogCapture log;
    EXPECT_FALSE(Bundle::bundleWithIdentifier(QStringLiteral("org.example.Unknown")));
    EXPECT_FALSE(Bundle::bundleWithIdentifier(QString()));
    EXPECT_FALSE(Bundle::bundleWithIdentifier(QStringLiteral("../applications/org.example.Link")));
    EXPECT_TRUE(log.messages(QStringLiteral("zaf.bundle")).isEmpty()) << "a missing entry is not an error";

    for (const char *id : {"org.example.Link", "org.example.Garbage", "org.example.NoGroup", "org.example.NoName", "org.example.BadExec"}) {
        SCOPED_TRACE(id);
        log.clear();
        EXPECT_FALSE(Bundle::bundleWithIdentifier(QString::fromLatin1(id)));
        const QStringList messages = log.messages(QStringLiteral("zaf.bundle"));
        ASSERT_EQ(messages.size(), 1);
        EXPECT_TRUE(messages.first().contains(QString::fromLatin1(id))) << messages.first().toStdString();
    }
}

// A directory bundle with an information dictionary, a resource directory and three localizations.
class DirectoryBundleTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        m_path = m_root.filePath(QStringLiteral("Zafrel"));
        const QString resources = m_path + QStringLiteral("/Resources");
        test::writeFile(m_path + QStringLiteral("/Info.desktop"),
                        "[Desktop Entry]\nType=Service\nName=Zafrel\nName[de]=Zafrel DE\nX-Zaf-Identifier=org.example.Zafrel\n");
        const auto table = [](const QList<std::pair<QString, QString>> &pairs) { return test::compilePo(test::poSource(pairs)); };
        test::writeFile(resources + QStringLiteral("/de.lproj/Localizable.mo"),
                        table({{QStringLiteral("HELLO"), QStringLiteral("Hallo")}, {QStringLiteral("ONLY_DE"), QStringLiteral("Nur Deutsch")}}));
        test::writeFile(resources + QStringLiteral("/de.lproj/Other.mo"), table({{QStringLiteral("HELLO"), QStringLiteral("Servus")}}));
        test::writeFile(resources + QStringLiteral("/en.lproj/Localizable.mo"), table({{QStringLiteral("HELLO"), QStringLiteral("Hello")}}));
        test::writeFile(resources + QStringLiteral("/pt_BR.lproj/Localizable.mo"), "corrupt catalogue bytes, long enough for a header");
        ASSERT_TRUE(QDir().mkpath(resources + QStringLiteral("/not-a-localization")));
    }

    QTemporaryDir m_root;
    QString m_path;
};

// A directory bundle has its information, resources and localizations; a bare localization folder
// is a bundle too, a malformed information file leaves none, and missing paths give no bundle.
TEST_F(DirectoryBundleTest, OpensWithItsInformationDictionaryResourcesAndLocalizations)
{
    const auto bundle = Bundle::bundleWithPath(m_path);
    ASSERT_TRUE(bundle);
    EXPECT_EQ(bundle->bundlePath(), m_path);
    EXPECT_EQ(bundle->bundleIdentifier(), QStringLiteral("org.example.Zafrel"));
    EXPECT_EQ(infoString(bundle->infoDictionary(), kDisplayNameKey), QStringLiteral("Zafrel"));
    {
        ScopedPreferredLanguages languages({QStringLiteral("de-DE")});
        EXPECT_EQ(infoString(bundle->localizedInfoDictionary(), kDisplayNameKey), QStringLiteral("Zafrel DE"));
    }
    EXPECT_EQ(bundle->resourcePath(), m_path + QStringLiteral("/Resources"));
    EXPECT_EQ(bundle->localizations(), QStringList({QStringLiteral("de"), QStringLiteral("en"), QStringLiteral("pt_BR")}));

    const QString deTable = m_path + QStringLiteral("/Resources/de.lproj/Localizable.mo");
    EXPECT_EQ(bundle->pathForResource(QStringLiteral("Localizable"), QStringLiteral("mo"), QStringLiteral("de")), deTable);
    EXPECT_EQ(bundle->pathForResource(QStringLiteral("Localizable"), QStringLiteral("strings"), QStringLiteral("de")), deTable);
    EXPECT_EQ(bundle->pathForResource(QStringLiteral("Localizable"), QStringLiteral("strings"), QStringLiteral("fr")), QString());
    EXPECT_EQ(bundle->pathForResource(QStringLiteral("Info"), QStringLiteral("plist"), QString()), QString());

    EXPECT_FALSE(Bundle::bundleWithPath(m_root.filePath(QStringLiteral("missing"))));
    EXPECT_FALSE(Bundle::bundleWithPath(m_path + QStringLiteral("/Info.desktop"))) << "not an application entry";
    EXPECT_FALSE(Bundle::bundleWithPath(QString()));

    // A bare localization folder is a bundle of its own whose table answers whatever the languages.
    const auto bare = Bundle::bundleWithPath(m_path + QStringLiteral("/Resources/de.lproj"));
    ASSERT_TRUE(bare);
    EXPECT_TRUE(bare->infoDictionary().isEmpty());
    EXPECT_EQ(bare->resourcePath(), m_path + QStringLiteral("/Resources/de.lproj"));
    EXPECT_TRUE(bare->localizations().isEmpty());
    ScopedPreferredLanguages languages({QStringLiteral("en")});
    EXPECT_EQ(bare->localizedStringForKey(QStringLiteral("HELLO"), QString(), QString()), QStringLiteral("Hallo"));
    EXPECT_EQ(bare->localizedStringForKey(QStringLiteral("MISSING"), QString(), QString()), QStringLiteral("MISSING"));

    // A malformed information dictionary is logged and leaves the bundle without one, but usable.
    test::writeFile(m_path + QStringLiteral("/Info.desktop"), "[Desktop Entry\nName=broken\n");
    zaf::test::LogCapture log;
    const auto malformed = Bundle::bundleWithPath(m_path);
    ASSERT_TRUE(malformed);
    EXPECT_TRUE(malformed->infoDictionary().isEmpty());
    EXPECT_TRUE(malformed->localizedInfoDictionary().isEmpty());
    EXPECT_EQ(log.messages(QStringLiteral("zaf.bundle")).size(), 1);
    EXPECT_EQ(malformed->localizations().size(), 3);
}

// Lookups use the best localization's table alone, then the value, then the key; a corrupt table is logged once.
TEST_F(DirectoryBundleTest, LookupUsesTheBestLocalizationAndFallsBackToValueThenKey)
{
    const auto bundle = Bundle::bundleWithPath(m_path);
    ASSERT_TRUE(bundle);
    zaf::test::LogCapture log;
    const struct {
        const char *languages, *key, *value, *table, *expected;
    } cases[] = {
        {"de-CH,en", "HELLO", "", "", "Hallo"},
        {"de-CH,en", "HELLO", "", "Localizable", "Hallo"},
        {"de-CH,en", "HELLO", "", "Other", "Servus"},
        {"de-CH,en", "MISSING", "Default", "", "Default"},
        {"de-CH,en", "MISSING", "", "", "MISSING"},
        {"de-CH,en", "HELLO", "", "NoSuchTable", "HELLO"},
        {"en-GB", "HELLO", "", "", "Hello"},
        {"en-GB", "ONLY_DE", "", "", "ONLY_DE"},
        {"pt-BR", "HELLO", "", "", "HELLO"},
        {"pt-BR", "HELLO", "Olá", "", "Olá"},
    };
    const auto text = [](const char *s) { return *s ? QString::fromUtf8(s) : QString(); };
    for (const auto &c : cases) {
        SCOPED_TRACE(std::string(c.languages) + " " + c.key + " " + c.table);
        ScopedPreferredLanguages languages(text(c.languages).split(QLatin1Char(',')));
        EXPECT_EQ(bundle->localizedStringForKey(text(c.key), text(c.value), text(c.table)), text(c.expected));
    }
    const QStringList messages = log.messages(QStringLiteral("zaf.bundle")).filter(QStringLiteral("pt_BR.lproj/Localizable.mo"));
    ASSERT_EQ(messages.size(), 1);
    EXPECT_TRUE(messages.first().contains(QStringLiteral("magic"))) << messages.first().toStdString();
}

// The running test program is read through /proc; unreadable processes give 0 and an empty path.
TEST(ExecutablePathOfProcessTest, ReadsTheRunningProgramAndGivesZeroForOthers)
{
    QString path;
    const int length = executablePathOfProcess(getpid(), &path);
    const QString expected = QFileInfo(QCoreApplication::applicationFilePath()).canonicalFilePath();
    EXPECT_EQ(path, expected);
    EXPECT_EQ(length, expected.toUtf8().size());
    EXPECT_EQ(executablePathOfProcess(getpid(), nullptr), length);
    for (const pid_t pid : {0, -1, 0x3ffffff0}) { // the last above the kernel's largest PID
        EXPECT_EQ(executablePathOfProcess(pid, &path), 0) << pid;
        EXPECT_TRUE(path.isEmpty()) << pid;
    }
}

} // namespace
} // namespace zaf::bundle
