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

    QString editorEntry() const
    {
        return QStringLiteral("[Desktop Entry]\nType=Application\nName=Editor\nName[de]=Bearbeiter\n"
                              "Name[de_CH]=Bearbeiter (Schweiz)\nName[sr@latin]=Urednik\n"
                              "Exec=zaf-editor --new %F\nHidden=true\nNoDisplay=true\n");
    }

    QTemporaryDir m_root;
    QString m_home;
    QString m_system;
    QString m_bin;
    ScopedEnvironment m_dataHome;
    ScopedEnvironment m_dataDirs;
    ScopedEnvironment m_path;
};

TEST_F(DesktopEntryTest, BundleWithIdentifierReadsTheEntryAndResolvesTheProgramThroughPath)
{
    test::writeExecutable(m_bin + QStringLiteral("/zaf-editor"));
    writeEntry(m_home, QStringLiteral("org.example.Editor.desktop"), editorEntry());

    const auto bundle = Bundle::bundleWithIdentifier(QStringLiteral("org.example.Editor"));
    ASSERT_TRUE(bundle) << "Hidden and NoDisplay do not hide a bundle";
    EXPECT_EQ(bundle->bundleIdentifier(), QStringLiteral("org.example.Editor"));
    EXPECT_EQ(bundle->bundlePath(), m_home + QStringLiteral("/applications/org.example.Editor.desktop"));
    const QVariantMap info = bundle->infoDictionary();
    EXPECT_EQ(infoString(info, kDisplayNameKey), QStringLiteral("Editor"));
    EXPECT_EQ(infoString(info, kBundleNameKey), QStringLiteral("zaf-editor"));
    EXPECT_EQ(infoString(info, kExecutableKey), m_bin + QStringLiteral("/zaf-editor"));
    EXPECT_EQ(infoString(info, kIdentifierKey), QStringLiteral("org.example.Editor"));
    EXPECT_TRUE(bundle->localizations().isEmpty());
    EXPECT_EQ(bundle->localizedStringForKey(QStringLiteral("KEY"), QString(), QString()), QStringLiteral("KEY"));

    // The same bundle through its path and its file URL.
    const auto byUrl = Bundle::bundleWithURL(QUrl::fromLocalFile(bundle->bundlePath()));
    ASSERT_TRUE(byUrl);
    EXPECT_EQ(byUrl->bundleIdentifier(), QStringLiteral("org.example.Editor"));
    EXPECT_FALSE(Bundle::bundleWithURL(QUrl(QStringLiteral("https://example.org/org.example.Editor.desktop"))));
}

TEST_F(DesktopEntryTest, BundleWithIdentifierFollowsXdgPrecedenceAndSubFolderIds)
{
    writeEntry(m_home, QStringLiteral("org.example.Both.desktop"), QStringLiteral("[Desktop Entry]\nType=Application\nName=From home\nExec=/bin/true\n"));
    writeEntry(m_system, QStringLiteral("org.example.Both.desktop"), QStringLiteral("[Desktop Entry]\nType=Application\nName=From system\nExec=/bin/true\n"));
    writeEntry(m_system, QStringLiteral("vendor/tool.desktop"), QStringLiteral("[Desktop Entry]\nType=Application\nName=Vendor tool\nExec=/bin/true\n"));

    const auto both = Bundle::bundleWithIdentifier(QStringLiteral("org.example.Both"));
    ASSERT_TRUE(both);
    EXPECT_EQ(infoString(both->infoDictionary(), kDisplayNameKey), QStringLiteral("From home"));

    const auto tool = Bundle::bundleWithIdentifier(QStringLiteral("vendor-tool"));
    ASSERT_TRUE(tool);
    EXPECT_EQ(tool->bundleIdentifier(), QStringLiteral("vendor-tool"));
    EXPECT_EQ(infoString(tool->infoDictionary(), kDisplayNameKey), QStringLiteral("Vendor tool"));
    EXPECT_EQ(infoString(tool->infoDictionary(), kBundleNameKey), QStringLiteral("true"));
}

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

TEST_F(DesktopEntryTest, LocalizedNameFollowsDesktopEntryLocaleRulesForEachPreferredLanguage)
{
    writeEntry(m_home, QStringLiteral("org.example.Editor.desktop"), editorEntry());
    const auto bundle = Bundle::bundleWithIdentifier(QStringLiteral("org.example.Editor"));
    ASSERT_TRUE(bundle);

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
        EXPECT_EQ(infoString(bundle->infoDictionary(), kDisplayNameKey), QStringLiteral("Editor"));
    }
}

TEST_F(DesktopEntryTest, BundleForExecutablePathFindsTheEntryThatStartsTheProgram)
{
    test::writeExecutable(m_bin + QStringLiteral("/zaf-editor"));
    test::writeExecutable(m_root.filePath(QStringLiteral("opt/viewer/viewer-bin")));
    QFile::link(m_root.filePath(QStringLiteral("opt/viewer/viewer-bin")), m_bin + QStringLiteral("/zaf-viewer"));
    writeEntry(m_system, QStringLiteral("org.example.Editor.desktop"), editorEntry());
    writeEntry(m_system, QStringLiteral("org.example.Viewer.desktop"),
               QStringLiteral("[Desktop Entry]\nType=Application\nName=Viewer\nTryExec=zaf-viewer\nExec=sh -c zaf-viewer\n"));

    const auto editor = Bundle::bundleForExecutablePath(m_bin + QStringLiteral("/zaf-editor"));
    ASSERT_TRUE(editor);
    EXPECT_EQ(editor->bundleIdentifier(), QStringLiteral("org.example.Editor"));

    // What /proc/PID/exe shows is the resolved program; TryExec names it through a link in PATH.
    const auto viewer = Bundle::bundleForExecutablePath(m_root.filePath(QStringLiteral("opt/viewer/viewer-bin")));
    ASSERT_TRUE(viewer);
    EXPECT_EQ(viewer->bundleIdentifier(), QStringLiteral("org.example.Viewer"));

    EXPECT_FALSE(Bundle::bundleForExecutablePath(m_root.filePath(QStringLiteral("opt/other"))));
    EXPECT_FALSE(Bundle::bundleForExecutablePath(QString()));
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
        test::writeFile(resources + QStringLiteral("/de.lproj/Localizable.mo"),
                        test::compilePo(test::poSource({{QStringLiteral("HELLO"), QStringLiteral("Hallo")},
                                                        {QStringLiteral("ONLY_DE"), QStringLiteral("Nur Deutsch")}})));
        test::writeFile(resources + QStringLiteral("/de.lproj/Other.mo"),
                        test::compilePo(test::poSource({{QStringLiteral("HELLO"), QStringLiteral("Servus")}})));
        test::writeFile(resources + QStringLiteral("/en.lproj/Localizable.mo"),
                        test::compilePo(test::poSource({{QStringLiteral("HELLO"), QStringLiteral("Hello")}})));
        test::writeFile(resources + QStringLiteral("/pt_BR.lproj/Localizable.mo"), "corrupt catalogue bytes, long enough for a header");
        ASSERT_TRUE(QDir().mkpath(resources + QStringLiteral("/not-a-localization")));
    }

    QTemporaryDir m_root;
    QString m_path;
};

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
}

TEST_F(DirectoryBundleTest, DirectoryWithoutInformationOrResourcesIsItsOwnResourceDirectory)
{
    const auto bundle = Bundle::bundleWithPath(m_path + QStringLiteral("/Resources/de.lproj"));
    ASSERT_TRUE(bundle);
    EXPECT_TRUE(bundle->infoDictionary().isEmpty());
    EXPECT_TRUE(bundle->bundleIdentifier().isEmpty());
    EXPECT_EQ(bundle->resourcePath(), m_path + QStringLiteral("/Resources/de.lproj"));
    EXPECT_TRUE(bundle->localizations().isEmpty());
    ScopedPreferredLanguages languages({QStringLiteral("en")});
    EXPECT_EQ(bundle->localizedStringForKey(QStringLiteral("HELLO"), QString(), QString()), QStringLiteral("Hallo"));
    EXPECT_EQ(bundle->localizedStringForKey(QStringLiteral("MISSING"), QString(), QString()), QStringLiteral("MISSING"));
}

TEST_F(DirectoryBundleTest, LookupUsesTheBestLocalizationAndFallsBackToValueThenKey)
{
    const auto bundle = Bundle::bundleWithPath(m_path);
    ASSERT_TRUE(bundle);
    {
        ScopedPreferredLanguages languages({QStringLiteral("de-CH"), QStringLiteral("en")});
        EXPECT_EQ(bundle->localizedStringForKey(QStringLiteral("HELLO"), QString(), QString()), QStringLiteral("Hallo"));
        EXPECT_EQ(bundle->localizedStringForKey(QStringLiteral("HELLO"), QString(), QStringLiteral("Localizable")), QStringLiteral("Hallo"));
        EXPECT_EQ(bundle->localizedStringForKey(QStringLiteral("HELLO"), QString(), QStringLiteral("Other")), QStringLiteral("Servus"));
        EXPECT_EQ(bundle->localizedStringForKey(QStringLiteral("MISSING"), QStringLiteral("Default"), QString()), QStringLiteral("Default"));
        EXPECT_EQ(bundle->localizedStringForKey(QStringLiteral("MISSING"), QString(), QString()), QStringLiteral("MISSING"));
        EXPECT_EQ(bundle->localizedStringForKey(QStringLiteral("HELLO"), QString(), QStringLiteral("NoSuchTable")), QStringLiteral("HELLO"));
    }
    {
        // A change of languages takes effect on the next lookup; the key missing from the chosen
        // table is not looked up in another localization.
        ScopedPreferredLanguages languages({QStringLiteral("en-GB")});
        EXPECT_EQ(bundle->localizedStringForKey(QStringLiteral("HELLO"), QString(), QString()), QStringLiteral("Hello"));
        EXPECT_EQ(bundle->localizedStringForKey(QStringLiteral("ONLY_DE"), QString(), QString()), QStringLiteral("ONLY_DE"));
    }
}

TEST_F(DirectoryBundleTest, CorruptTableIsEmptyAndLoggedOnce)
{
    const auto bundle = Bundle::bundleWithPath(m_path);
    ASSERT_TRUE(bundle);
    ScopedPreferredLanguages languages({QStringLiteral("pt-BR")});
    zaf::test::LogCapture log;
    EXPECT_EQ(bundle->localizedStringForKey(QStringLiteral("HELLO"), QString(), QString()), QStringLiteral("HELLO"));
    EXPECT_EQ(bundle->localizedStringForKey(QStringLiteral("HELLO"), QStringLiteral("Olá"), QString()), QStringLiteral("Olá"));
    const QStringList messages = log.messages(QStringLiteral("zaf.bundle"));
    ASSERT_EQ(messages.size(), 1);
    EXPECT_TRUE(messages.first().contains(QStringLiteral("pt_BR.lproj/Localizable.mo"))) << messages.first().toStdString();
    EXPECT_TRUE(messages.first().contains(QStringLiteral("magic"))) << messages.first().toStdString();
}

TEST_F(DirectoryBundleTest, MalformedInformationDictionaryLeavesTheBundleWithoutOne)
{
    test::writeFile(m_path + QStringLiteral("/Info.desktop"), "[Desktop Entry\nName=broken\n");
    zaf::test::LogCapture log;
    const auto bundle = Bundle::bundleWithPath(m_path);
    ASSERT_TRUE(bundle);
    EXPECT_TRUE(bundle->infoDictionary().isEmpty());
    EXPECT_TRUE(bundle->localizedInfoDictionary().isEmpty());
    EXPECT_EQ(log.messages(QStringLiteral("zaf.bundle")).size(), 1);
    EXPECT_EQ(bundle->localizations().size(), 3);
}

TEST(ExecutablePathOfProcessTest, ReadsTheRunningTestProgram)
{
    QString path;
    const int length = executablePathOfProcess(getpid(), &path);
    const QString expected = QFileInfo(QCoreApplication::applicationFilePath()).canonicalFilePath();
    EXPECT_EQ(path, expected);
    EXPECT_EQ(length, expected.toUtf8().size());
    EXPECT_EQ(executablePathOfProcess(getpid(), nullptr), length);
}

TEST(ExecutablePathOfProcessTest, GivesZeroForProcessesThatCannotBeRead)
{
    QString path = QStringLiteral("stale");
    EXPECT_EQ(executablePathOfProcess(0, &path), 0);
    EXPECT_TRUE(path.isEmpty());
    EXPECT_EQ(executablePathOfProcess(-1, &path), 0);
    EXPECT_EQ(executablePathOfProcess(0x3ffffff0, &path), 0); // above the kernel's largest PID
    EXPECT_TRUE(path.isEmpty());
}

} // namespace
} // namespace zaf::bundle
