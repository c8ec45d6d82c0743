// The AppStream-backed store lookup: items read from a fixture catalogue, the request's threading
// and answers, and catalogues that cannot be read.
#include "platform/store/store_lookup.h"

#include "platform/dispatch.h"
#include "tests/platform/store/catalogue_fixture.h"
#include "tests/support/log_capture.h"

#include <QCoreApplication>
#include <QThread>
#include <QThreadPool>

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <future>

using namespace zaf::store;
using zaf::test::CatalogueDirectory;
using zaf::test::LogCapture;

namespace {

struct Answer {
    std::optional<Response> response;
    bool onMainThread = true;
};

// Starts the request and waits (without the event loop: the callback never needs it) for its answer.
Answer answerOf(const StoreLookup &lookup)
{
    auto promise = std::make_shared<std::promise<Answer>>();
    std::future<Answer> future = promise->get_future();
    lookup.start([promise](const std::optional<Response> &response) {
        promise->set_value(Answer{response, zaf::dispatch::isMainThread()});
    });
    EXPECT_EQ(future.wait_for(std::chrono::seconds(20)), std::future_status::ready);
    return future.get();
}

StoreLookup productLookup(std::shared_ptr<Catalogue> catalogue, const QStringList &identifiers)
{
    StoreLookup lookup(std::move(catalogue));
    lookup.setKeyProfile(KeyProfile::Product);
    lookup.setLocalizationStyle(kLocalizationStyleUser);
    lookup.setBundleIdentifiers(identifiers);
    return lookup;
}

class CatalogueTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        m_dir.write(QStringLiteral("fixture.xml"), zaf::test::kFixtureCollection);
        m_catalogue = Catalogue::loadFromDirectory(m_dir.path(), QStringLiteral("en_US"));
        ASSERT_TRUE(m_catalogue->isLoaded());
    }

    CatalogueDirectory m_dir;
    std::shared_ptr<Catalogue> m_catalogue;
};

} // namespace

TEST_F(CatalogueTest, ItemForIdentifier_KnownComponent_HasEveryProperty)
{
    const std::optional<ResultItem> item = m_catalogue->itemForIdentifier(QStringLiteral("org.zafrel.Recorder"));
    ASSERT_TRUE(item.has_value());
    EXPECT_EQ(item->shortProductURL, QStringLiteral("appstream://org.zafrel.Recorder"));
    EXPECT_EQ(item->displayName, QStringLiteral("Zafrel Recorder"));
    EXPECT_EQ(item->artistName, QStringLiteral("Zafrel Labs"));
    EXPECT_EQ(item->genreNames, (QStringList{QStringLiteral("AudioVideo"), QStringLiteral("Recorder")}));
}

TEST_F(CatalogueTest, ItemForIdentifier_UnknownOrEmptyIdentifier_IsNone)
{
    EXPECT_FALSE(m_catalogue->itemForIdentifier(QStringLiteral("org.zafrel.Unknown")).has_value());
    EXPECT_FALSE(m_catalogue->itemForIdentifier(QString()).has_value());
}

TEST_F(CatalogueTest, ItemForIdentifier_ComponentWithoutName_HasArtistButNoDisplayName)
{
    const std::optional<ResultItem> item = m_catalogue->itemForIdentifier(QStringLiteral("org.zafrel.Nameless"));
    ASSERT_TRUE(item.has_value());
    EXPECT_FALSE(item->displayName.has_value());
    EXPECT_EQ(item->artistName, QStringLiteral("Nameless Works"));
    EXPECT_EQ(item->shortProductURL, QStringLiteral("appstream://org.zafrel.Nameless"));
}

TEST_F(CatalogueTest, ItemForIdentifier_ComponentWithNameOnly_LeavesArtistAndGenresAbsent)
{
    const std::optional<ResultItem> item = m_catalogue->itemForIdentifier(QStringLiteral("org.zafrel.Plain"));
    ASSERT_TRUE(item.has_value());
    EXPECT_EQ(item->displayName, QStringLiteral("Plain App"));
    EXPECT_FALSE(item->artistName.has_value());
    EXPECT_FALSE(item->genreNames.has_value());
}

TEST_F(CatalogueTest, ItemForIdentifier_GermanLocale_GivesTranslatedNameAndFallsBackWithoutOne)
{
    const auto german = Catalogue::loadFromDirectory(m_dir.path(), QStringLiteral("de-DE"));
    EXPECT_EQ(german->locale(), QStringLiteral("de_DE"));
    EXPECT_EQ(german->itemForIdentifier(QStringLiteral("org.zafrel.Recorder"))->displayName,
              QStringLiteral("Zafrel Rekorder"));
    EXPECT_EQ(german->itemForIdentifier(QStringLiteral("org.zafrel.Plain"))->displayName,
              QStringLiteral("Plain App"));
}

TEST_F(CatalogueTest, Start_KnownIdentifier_AnswersOnceOffTheMainThread)
{
    std::atomic<int> calls{0};
    std::promise<bool> onMain;
    auto future = onMain.get_future();
    productLookup(m_catalogue, {QStringLiteral("org.zafrel.Recorder")})
        .start([&](const std::optional<Response> &response) {
            ++calls;
            EXPECT_TRUE(response.has_value());
            EXPECT_EQ(response ? response->results.size() : -1, 1);
            onMain.set_value(QThread::currentThread() == QCoreApplication::instance()->thread());
        });
    ASSERT_EQ(future.wait_for(std::chrono::seconds(20)), std::future_status::ready);
    EXPECT_FALSE(future.get());
    zaf::dispatch::globalQueue(zaf::dispatch::Priority::Default).waitForDone();
    EXPECT_EQ(calls.load(), 1);
}

TEST_F(CatalogueTest, Start_SeveralIdentifiers_AnswersKnownOnesInTheOrderAsked)
{
    const Answer answer = answerOf(productLookup(m_catalogue,
        {QStringLiteral("org.zafrel.Plain"), QStringLiteral("org.zafrel.Unknown"), QStringLiteral("org.zafrel.Recorder")}));
    ASSERT_TRUE(answer.response.has_value());
    ASSERT_EQ(answer.response->results.size(), 2);
    EXPECT_EQ(answer.response->results[0].displayName, QStringLiteral("Plain App"));
    EXPECT_EQ(answer.response->results[1].displayName, QStringLiteral("Zafrel Recorder"));
}

TEST_F(CatalogueTest, Start_MalformedRequest_AnswersNone)
{
    StoreLookup noProfile(m_catalogue);
    noProfile.setBundleIdentifiers({QStringLiteral("org.zafrel.Recorder")});
    EXPECT_FALSE(answerOf(noProfile).response.has_value());

    EXPECT_FALSE(answerOf(productLookup(m_catalogue, {})).response.has_value());
}

TEST(StoreCatalogueErrorsTest, LoadFromDirectory_CorruptFileBesideGoodOne_LogsItAndKeepsTheGoodItems)
{
    CatalogueDirectory dir;
    dir.write(QStringLiteral("a-good.xml"), zaf::test::kFixtureCollection);
    const QString corrupt = dir.write(QStringLiteral("b-corrupt.xml"), zaf::test::kCorruptCollection);
    LogCapture log;
    const auto catalogue = Catalogue::loadFromDirectory(dir.path(), QStringLiteral("en_US"));

    const QStringList messages = log.messages(QStringLiteral("zaf.store"));
    ASSERT_EQ(messages.size(), 1) << messages.join(QLatin1Char('\n')).toStdString();
    EXPECT_TRUE(messages[0].startsWith(QStringLiteral("Store catalogue file %1 is unreadable: ").arg(corrupt)))
        << messages[0].toStdString();
    EXPECT_TRUE(catalogue->itemForIdentifier(QStringLiteral("org.zafrel.Recorder")).has_value());
    EXPECT_FALSE(catalogue->itemForIdentifier(QStringLiteral("org.zafrel.Bro")).has_value());
}

TEST(StoreCatalogueErrorsTest, Start_OnlyCorruptFiles_LogsThemAndAnswersWithoutItems)
{
    CatalogueDirectory dir;
    dir.write(QStringLiteral("corrupt.xml"), zaf::test::kCorruptCollection);
    dir.write(QStringLiteral("garbage.xml.gz"), QByteArray("\x1f\x8b not really gzip", 19));
    LogCapture log;
    const auto catalogue = Catalogue::loadFromDirectory(dir.path(), QStringLiteral("en_US"));
    EXPECT_EQ(log.messages(QStringLiteral("zaf.store")).size(), 2);

    const Answer answer = answerOf(productLookup(catalogue, {QStringLiteral("org.zafrel.Recorder")}));
    EXPECT_FALSE(answer.onMainThread);
    EXPECT_TRUE(!answer.response || answer.response->results.isEmpty());
}

TEST(StoreCatalogueErrorsTest, Start_MissingDirectory_LogsItAndAnswersNone)
{
    const QString missing = QDir::temp().filePath(QStringLiteral("zaf-store-fixtures/does-not-exist"));
    QDir(missing).removeRecursively();
    LogCapture log;
    const auto catalogue = Catalogue::loadFromDirectory(missing);
    EXPECT_FALSE(catalogue->isLoaded());
    EXPECT_EQ(log.messages(QStringLiteral("zaf.store")),
              QStringList{QStringLiteral("Store catalogue directory %1 is missing or unreadable").arg(missing)});

    EXPECT_FALSE(catalogue->itemForIdentifier(QStringLiteral("org.zafrel.Recorder")).has_value());
    EXPECT_FALSE(answerOf(productLookup(catalogue, {QStringLiteral("org.zafrel.Recorder")})).response.has_value());
}

// The only test of this program that touches the process-wide catalogue, so the directory it
// names is the one read at the first load.
TEST(StoreSharedCatalogueTest, Start_WithoutCatalogue_UsesTheDirectoryNamedByTheEnvironment)
{
    CatalogueDirectory dir;
    dir.write(QStringLiteral("fixture.xml"), zaf::test::kFixtureCollection);
    qputenv(kCatalogDirEnvironmentVariable, dir.path().toUtf8());

    StoreLookup lookup;
    lookup.setKeyProfile(KeyProfile::Product);
    lookup.setBundleIdentifiers({QStringLiteral("org.zafrel.Nameless")});
    const Answer answer = answerOf(lookup);
    ASSERT_TRUE(answer.response.has_value());
    ASSERT_EQ(answer.response->results.size(), 1);
    EXPECT_EQ(answer.response->results[0].artistName, QStringLiteral("Nameless Works"));
    EXPECT_EQ(Catalogue::shared(), Catalogue::shared());
}
