// The store manager: records built from a fixture catalogue and from local desktop entries, handed
// back on the main thread exactly once, whatever the store answered.
#include "identity/store_manager.h"

#include "platform/store/store_lookup.h"
#include "tests/platform/store/catalogue_fixture.h"
#include "tests/support/log_capture.h"

#include <QCoreApplication>
#include <QDeadlineTimer>
#include <QDir>
#include <QFile>
#include <QTemporaryDir>
#include <QThread>

#include <gtest/gtest.h>

#include <optional>

using zaf::store::Catalogue;
using zaf::test::CatalogueDirectory;

namespace {

struct Delivery {
    int calls = 0;
    bool onMainThread = false;
    std::optional<ZafStoreInfo> info;
};

// Local applications: desktop entries in a data directory of the test's own, nothing else.
class LocalApplications {
public:
    LocalApplications()
    {
        QDir(m_home.path()).mkpath(QStringLiteral("applications"));
        qputenv("XDG_DATA_HOME", m_home.path().toUtf8());
        qputenv("XDG_DATA_DIRS", m_empty.path().toUtf8());
    }
    void add(const QString &identifier, const QString &name) const
    {
        QFile entry(QDir(m_home.path()).filePath(QStringLiteral("applications/%1.desktop").arg(identifier)));
        ASSERT_TRUE(entry.open(QIODevice::WriteOnly));
        entry.write(QStringLiteral("[Desktop Entry]\nType=Application\nName=%1\nExec=%2\n")
                        .arg(name, identifier.section(QLatin1Char('.'), -1).toLower())
                        .toUtf8());
    }

private:
    QTemporaryDir m_home;
    QTemporaryDir m_empty;
};

class StoreManagerTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        m_dir.write(QStringLiteral("fixture.xml"), zaf::test::kFixtureCollection);
        m_local.add(QStringLiteral("org.zafrel.Nameless"), QStringLiteral("Local Nameless"));
        m_local.add(QStringLiteral("org.zafrel.LocalOnly"), QStringLiteral("Local Only"));
        m_local.add(QStringLiteral("org.zafrel.Recorder"), QStringLiteral("Local Recorder"));
    }

    std::shared_ptr<Catalogue> fixtureCatalogue() const
    {
        return Catalogue::loadFromDirectory(m_dir.path(), QStringLiteral("en_US"));
    }

    // Starts the lookup, checks that nothing is delivered before the call returns, then runs the
    // event loop until the completion has run and a little beyond (to see a second call).
    static std::shared_ptr<Delivery> load(const ZafStoreManager &manager, const QString &identifier)
    {
        auto delivery = std::make_shared<Delivery>();
        manager.loadItemDetailsForBundleIdentifier(identifier, [delivery](const ZafStoreInfo &info) {
            ++delivery->calls;
            delivery->onMainThread = QThread::currentThread() == QCoreApplication::instance()->thread();
            delivery->info = info;
        });
        EXPECT_EQ(delivery->calls, 0);
        runEventLoopUntil([&] { return delivery->calls > 0; });
        runEventLoopUntil([] { return false; }, 100);
        return delivery;
    }

    template <typename Done>
    static void runEventLoopUntil(Done done, int milliseconds = 20000)
    {
        QDeadlineTimer deadline(milliseconds);
        while (!done() && !deadline.hasExpired())
            QCoreApplication::processEvents(QEventLoop::AllEvents | QEventLoop::WaitForMoreEvents, 20);
    }

    LocalApplications m_local;
    CatalogueDirectory m_dir;
};

} // namespace

TEST_F(StoreManagerTest, Load_KnownIdentifier_FillsEveryFieldFromTheStore)
{
    const auto delivery = load(ZafStoreManager(fixtureCatalogue()), QStringLiteral("org.zafrel.Recorder"));
    ASSERT_EQ(delivery->calls, 1);
    EXPECT_TRUE(delivery->onMainThread);
    const ZafStoreInfo &info = *delivery->info;
    EXPECT_EQ(info.bundleID(), QStringLiteral("org.zafrel.Recorder"));
    EXPECT_EQ(info.appName(), QStringLiteral("Zafrel Recorder"));
    EXPECT_EQ(info.author(), QStringLiteral("Zafrel Labs"));
    EXPECT_EQ(info.itemURL(), QStringLiteral("appstream://org.zafrel.Recorder"));
    EXPECT_EQ(info.categories(), (QStringList{QStringLiteral("AudioVideo"), QStringLiteral("Recorder")}));
}

TEST_F(StoreManagerTest, Load_UnknownIdentifierWithLocalEntry_TakesTheLocalNameAndEmptyStoreFields)
{
    const auto delivery = load(ZafStoreManager(fixtureCatalogue()), QStringLiteral("org.zafrel.LocalOnly"));
    ASSERT_EQ(delivery->calls, 1);
    EXPECT_TRUE(delivery->onMainThread);
    const ZafStoreInfo &info = *delivery->info;
    EXPECT_EQ(info.bundleID(), QStringLiteral("org.zafrel.LocalOnly"));
    EXPECT_EQ(info.appName(), QStringLiteral("Local Only"));
    EXPECT_EQ(info.author(), QStringLiteral(""));
    EXPECT_EQ(info.itemURL(), QStringLiteral(""));
    EXPECT_FALSE(info.categories().has_value());
}

TEST_F(StoreManagerTest, Load_UnknownIdentifierWithoutLocalEntry_LeavesAppNameAbsent)
{
    const auto delivery = load(ZafStoreManager(fixtureCatalogue()), QStringLiteral("org.zafrel.Nowhere"));
    ASSERT_EQ(delivery->calls, 1);
    const ZafStoreInfo &info = *delivery->info;
    EXPECT_EQ(info.bundleID(), QStringLiteral("org.zafrel.Nowhere"));
    EXPECT_FALSE(info.appName().has_value());
    const QVariantMap dictionary = info.dictionary();
    EXPECT_EQ(dictionary.keys(), (QStringList{ZafStoreInfoAuthorKey, ZafStoreInfoBundleIDKey, ZafStoreInfoItemURLKey}));
}

TEST_F(StoreManagerTest, Load_ComponentWithoutName_TakesTheLocalNameAndTheStoreAuthor)
{
    const auto delivery = load(ZafStoreManager(fixtureCatalogue()), QStringLiteral("org.zafrel.Nameless"));
    ASSERT_EQ(delivery->calls, 1);
    const ZafStoreInfo &info = *delivery->info;
    EXPECT_EQ(info.appName(), QStringLiteral("Local Nameless"));
    EXPECT_EQ(info.author(), QStringLiteral("Nameless Works"));
    EXPECT_EQ(info.itemURL(), QStringLiteral("appstream://org.zafrel.Nameless"));
    EXPECT_FALSE(info.categories().has_value());
}

TEST_F(StoreManagerTest, Load_CorruptCatalogue_IsLoggedAndStillDeliversARecord)
{
    CatalogueDirectory corrupt(QStringLiteral("corrupt"));
    corrupt.write(QStringLiteral("corrupt.xml"), zaf::test::kCorruptCollection);
    zaf::test::LogCapture log;
    const ZafStoreManager manager(Catalogue::loadFromDirectory(corrupt.path(), QStringLiteral("en_US")));
    EXPECT_EQ(log.messages(QStringLiteral("zaf.store")).size(), 1);

    const auto delivery = load(manager, QStringLiteral("org.zafrel.Recorder"));
    ASSERT_EQ(delivery->calls, 1);
    EXPECT_TRUE(delivery->onMainThread);
    EXPECT_EQ(delivery->info->bundleID(), QStringLiteral("org.zafrel.Recorder"));
    EXPECT_EQ(delivery->info->appName(), QStringLiteral("Local Recorder"));
    EXPECT_EQ(delivery->info->author(), QStringLiteral(""));
    EXPECT_EQ(delivery->info->itemURL(), QStringLiteral(""));
    EXPECT_FALSE(delivery->info->categories().has_value());
}

TEST_F(StoreManagerTest, Load_LookupThatFailsAtOnce_StillCompletesOnTheMainThread)
{
    const QString missing = QDir::temp().filePath(QStringLiteral("zaf-store-fixtures/missing-catalogue"));
    QDir(missing).removeRecursively();
    const ZafStoreManager manager(Catalogue::loadFromDirectory(missing));

    const auto delivery = load(manager, QStringLiteral("org.zafrel.Nameless"));
    ASSERT_EQ(delivery->calls, 1);
    EXPECT_TRUE(delivery->onMainThread);
    EXPECT_EQ(delivery->info->appName(), QStringLiteral("Local Nameless"));
    EXPECT_EQ(delivery->info->author(), QStringLiteral(""));
}

TEST_F(StoreManagerTest, Load_WithoutCompletion_IsLoggedAndIgnored)
{
    zaf::test::LogCapture log;
    ZafStoreManager(fixtureCatalogue()).loadItemDetailsForBundleIdentifier(QStringLiteral("org.zafrel.Recorder"), {});
    runEventLoopUntil([] { return false; }, 100);
    EXPECT_EQ(log.messages(QStringLiteral("zaf.store")),
              QStringList{QStringLiteral("Store lookup for org.zafrel.Recorder made without a completion; not started")});
}

// The only test of this program that uses the shared manager, so the catalogue directory it names
// is the one the process-wide catalogue is loaded from.
TEST_F(StoreManagerTest, SharedManager_IsOneInstanceAnsweringFromTheProcessCatalogue)
{
    qputenv(zaf::store::kCatalogDirEnvironmentVariable, m_dir.path().toUtf8());
    ZafStoreManager &manager = ZafStoreManager::sharedManager();
    EXPECT_EQ(&manager, &ZafStoreManager::sharedManager());

    const auto delivery = load(manager, QStringLiteral("org.zafrel.Plain"));
    ASSERT_EQ(delivery->calls, 1);
    EXPECT_TRUE(delivery->onMainThread);
    EXPECT_EQ(delivery->info->appName(), QStringLiteral("Plain App"));
    EXPECT_EQ(delivery->info->author(), QStringLiteral(""));
    EXPECT_EQ(delivery->info->itemURL(), QStringLiteral("appstream://org.zafrel.Plain"));
}
