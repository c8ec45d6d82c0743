// The store manager: records built from a fixture catalogue and from local desktop entries.
#include "identity/store_manager.h"

#include "platform/store/store_lookup.h"
#include "tests/platform/bundle/bundle_fixtures.h"
#include "tests/platform/store/catalogue_fixture.h"
#include "tests/support/log_capture.h"
#include "tests/support/wait_until.h"

#include <QCoreApplication>
#include <QThread>

#include <gtest/gtest.h>

#include <optional>

using zaf::store::Catalogue;
using zaf::test::CatalogueDirectory;

namespace {

// What a record must hold; categories absent when not given.
struct Expected {
    std::optional<QString> appName;
    QString author;
    QString itemURL;
    std::optional<QStringList> categories = std::nullopt;
};

class StoreManagerTest : public ::testing::Test {
protected:
    // Three local applications in a data directory of the test's own, and the fixture catalogue.
    void SetUp() override
    {
        qputenv("XDG_DATA_HOME", m_home.path().toUtf8());
        qputenv("XDG_DATA_DIRS", m_empty.path().toUtf8());
        for (const char *name : {"Nameless", "LocalOnly", "Recorder"})
            zaf::bundle::test::writeDesktopEntry(m_home.path(), QStringLiteral("org.zafrel.") + QLatin1String(name),
                                         QStringLiteral("Name=Local %1\nExec=true\n").arg(QLatin1String(name)));
        m_dir.write(QStringLiteral("fixture.xml"), zaf::test::kFixtureCollection);
    }

    std::shared_ptr<Catalogue> fixtureCatalogue() const { return Catalogue::loadFromDirectory(m_dir.path(), QStringLiteral("en_US")); }

    // Looks `identifier` up: nothing is delivered before the call returns, then exactly one record
    // on the main thread (the loop runs a little beyond the first to see a second one).
    static void expectRecord(const ZafStoreManager &manager, const QString &identifier, const Expected &expected)
    {
        SCOPED_TRACE(identifier.toStdString());
        int calls = 0;
        bool onMainThread = false;
        std::optional<ZafStoreInfo> info;
        manager.loadItemDetailsForBundleIdentifier(identifier, [&](const ZafStoreInfo &delivered) {
            ++calls;
            onMainThread = QThread::currentThread() == QCoreApplication::instance()->thread();
            info = delivered;
        });
        EXPECT_EQ(calls, 0);
        zaf::test::waitUntil([&] { return calls > 0; }, 20000);
        zaf::test::waitUntil([] { return false; }, 100);
        ASSERT_EQ(calls, 1);
        EXPECT_TRUE(onMainThread);
        EXPECT_EQ(info->bundleID(), identifier);
        EXPECT_EQ(info->appName(), expected.appName);
        EXPECT_EQ(info->author(), expected.author);
        EXPECT_EQ(info->itemURL(), expected.itemURL);
        EXPECT_EQ(info->categories(), expected.categories);
    }

    QTemporaryDir m_home;
    QTemporaryDir m_empty;
    CatalogueDirectory m_dir;
};

} // namespace

// Store fields come from the catalogue, the name from it or else from the local entry; what the
// store does not know is an empty author and link, and no name without a local entry.
class StoreManagerRecordTest : public StoreManagerTest, public ::testing::WithParamInterface<std::pair<const char *, Expected>> {};

TEST_P(StoreManagerRecordTest, CombinesTheStoreAndTheLocalEntry)
{
    expectRecord(ZafStoreManager(fixtureCatalogue()), QStringLiteral("org.zafrel.") + QLatin1String(GetParam().first), GetParam().second);
}

INSTANTIATE_TEST_SUITE_P(
    Applications, StoreManagerRecordTest,
    ::testing::Values(std::pair{"Recorder", Expected{"Zafrel Recorder", "Zafrel Labs", "appstream://org.zafrel.Recorder", QStringList{"AudioVideo", "Recorder"}}},
                      std::pair{"Nameless", Expected{"Local Nameless", "Nameless Works", "appstream://org.zafrel.Nameless"}},
                      std::pair{"LocalOnly", Expected{"Local LocalOnly", "", ""}}, std::pair{"Nowhere", Expected{std::nullopt, "", ""}}),
    [](const auto &info) { return std::string(info.param.first); });

// A catalogue that cannot be read (no answer at all) still gives a record with the local name.
TEST_F(StoreManagerTest, MissingCatalogueStillDeliversARecord)
{
    const QString missing = QDir::temp().filePath(QStringLiteral("zaf-store-fixtures/missing-catalogue"));
    QDir(missing).removeRecursively();
    expectRecord(ZafStoreManager(Catalogue::loadFromDirectory(missing)), QStringLiteral("org.zafrel.Nameless"),
                 {QStringLiteral("Local Nameless"), QString(""), QString("")});
}

TEST_F(StoreManagerTest, LoadWithoutCompletionIsLoggedAndIgnored)
{
    zaf::test::LogCapture log;
    ZafStoreManager(fixtureCatalogue()).loadItemDetailsForBundleIdentifier(QStringLiteral("org.zafrel.Recorder"), {});
    zaf::test::waitUntil([] { return false; }, 100);
    EXPECT_EQ(log.messages(QStringLiteral("zaf.store")),
              QStringList{QStringLiteral("Store lookup for org.zafrel.Recorder made without a completion; not started")});
}

// The only test of this program that uses the shared manager, so the catalogue directory it names
// is the one the process-wide catalogue is loaded from.
TEST_F(StoreManagerTest, SharedManagerIsOneInstanceAnsweringFromTheProcessCatalogue)
{
    qputenv(zaf::store::kCatalogDirEnvironmentVariable, m_dir.path().toUtf8());
    ZafStoreManager &manager = ZafStoreManager::sharedManager();
    EXPECT_EQ(&manager, &ZafStoreManager::sharedManager());
    expectRecord(manager, QStringLiteral("org.zafrel.Plain"), {QStringLiteral("Plain App"), QString(""), QStringLiteral("appstream://org.zafrel.Plain")});
}
