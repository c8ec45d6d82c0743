// The AppStream-backed store lookup: items read from a fixture catalogue, the request's threading
// and answers, and catalogues that cannot be read.
#include "platform/store/store_lookup.h"

#include "platform/dispatch.h"
#include "tests/platform/store/catalogue_fixture.h"
#include "tests/support/log_capture.h"

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

// Starts the request and waits (without the event loop: the callback never needs it) for its
// answer, which must come exactly once.
Answer answerOf(const StoreLookup &lookup)
{
    struct Shared {
        std::promise<Answer> promise;
        std::atomic<int> calls{0};
    };
    const auto shared = std::make_shared<Shared>();
    std::future<Answer> future = shared->promise.get_future();
    lookup.start([shared](const std::optional<Response> &response) {
        if (++shared->calls == 1)
            shared->promise.set_value(Answer{response, zaf::dispatch::isMainThread()});
    });
    if (future.wait_for(std::chrono::seconds(20)) != std::future_status::ready) {
        ADD_FAILURE() << "no answer";
        return {};
    }
    zaf::dispatch::waitForGlobalQueue(zaf::dispatch::Priority::Default);
    EXPECT_EQ(shared->calls.load(), 1);
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

// "url | name | artist | genres", "-" for an absent property, "none" for no item.
QString describe(const std::optional<ResultItem> &item)
{
    if (!item)
        return QStringLiteral("none");
    const auto text = [](const std::optional<QString> &value) { return value.value_or(QStringLiteral("-")); };
    return QStringList{text(item->shortProductURL), text(item->displayName), text(item->artistName),
                       item->genreNames ? item->genreNames->join(QLatin1Char(',')) : QStringLiteral("-")}
        .join(QStringLiteral(" | "));
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

// Each component gives exactly the properties it has; unknown and empty identifiers give none.
class CatalogueItemTest : public CatalogueTest, public ::testing::WithParamInterface<std::pair<const char *, const char *>> {};

TEST_P(CatalogueItemTest, HoldsThePropertiesTheComponentHas)
{
    const auto [id, expected] = GetParam();
    EXPECT_EQ(describe(m_catalogue->itemForIdentifier(QString::fromLatin1(id))), QString::fromLatin1(expected));
}

INSTANTIATE_TEST_SUITE_P(
    Identifiers, CatalogueItemTest,
    ::testing::Values(std::pair{"org.zafrel.Recorder", "appstream://org.zafrel.Recorder | Zafrel Recorder | Zafrel Labs | AudioVideo,Recorder"},
                      std::pair{"org.zafrel.Nameless", "appstream://org.zafrel.Nameless | - | Nameless Works | -"},
                      std::pair{"org.zafrel.Plain", "appstream://org.zafrel.Plain | Plain App | - | -"},
                      std::pair{"org.zafrel.Unknown", "none"}, std::pair{"", "none"}),
    [](const auto &info) { return *info.param.first ? QString::fromLatin1(info.param.first).section('.', -1).toStdString() : "Empty"; });

// A German catalogue takes the translated name and falls back to the untranslated one.
TEST_F(CatalogueTest, GermanCatalogueTakesTheTranslatedName)
{
    const auto german = Catalogue::loadFromDirectory(m_dir.path(), QStringLiteral("de-DE"));
    EXPECT_EQ(german->locale(), QStringLiteral("de_DE"));
    EXPECT_EQ(german->itemForIdentifier(QStringLiteral("org.zafrel.Recorder"))->displayName, QStringLiteral("Zafrel Rekorder"));
    EXPECT_EQ(german->itemForIdentifier(QStringLiteral("org.zafrel.Plain"))->displayName, QStringLiteral("Plain App"));
}

// Known identifiers are answered, off the main thread, in the order asked and unknown ones skipped.
TEST_F(CatalogueTest, StartAnswersKnownIdentifiersInOrder)
{
    const Answer answer = answerOf(productLookup(m_catalogue,
        {QStringLiteral("org.zafrel.Plain"), QStringLiteral("org.zafrel.Unknown"), QStringLiteral("org.zafrel.Recorder")}));
    EXPECT_FALSE(answer.onMainThread);
    ASSERT_TRUE(answer.response.has_value());
    ASSERT_EQ(answer.response->results.size(), 2);
    EXPECT_EQ(answer.response->results[0].displayName, QStringLiteral("Plain App"));
    EXPECT_EQ(answer.response->results[1].displayName, QStringLiteral("Zafrel Recorder"));
}

// A request without a key profile or without identifiers is answered with none.
TEST_F(CatalogueTest, MalformedRequestIsAnsweredWithNone)
{
    StoreLookup noProfile(m_catalogue);
    noProfile.setBundleIdentifiers({QStringLiteral("org.zafrel.Recorder")});
    EXPECT_FALSE(answerOf(noProfile).response.has_value());
    EXPECT_FALSE(answerOf(productLookup(m_catalogue, {})).response.has_value());
}

// Each corrupt file is logged by name and the good items stay.
TEST(StoreCatalogueErrorsTest, CorruptFileIsLoggedAndTheGoodItemsStay)
{
    CatalogueDirectory mixed(QStringLiteral("mixed"));
    mixed.write(QStringLiteral("a-good.xml"), zaf::test::kFixtureCollection);
    const QString bad = mixed.write(QStringLiteral("b-corrupt.xml"), zaf::test::kCorruptCollection);
    LogCapture log;
    const auto catalogue = Catalogue::loadFromDirectory(mixed.path(), QStringLiteral("en_US"));
    const QStringList messages = log.messages(QStringLiteral("zaf.store"));
    ASSERT_EQ(messages.size(), 1) << messages.join(QLatin1Char('\n')).toStdString();
    EXPECT_TRUE(messages[0].startsWith(QStringLiteral("Store catalogue file %1 is unreadable: ").arg(bad))) << messages[0].toStdString();
    EXPECT_TRUE(catalogue->itemForIdentifier(QStringLiteral("org.zafrel.Recorder")).has_value());
    EXPECT_FALSE(catalogue->itemForIdentifier(QStringLiteral("org.zafrel.Bro")).has_value());
}

// With only corrupt files each is logged, and the answer, still off the main thread, has no items.
TEST(StoreCatalogueErrorsTest, OnlyCorruptFilesAnswerWithoutItems)
{
    CatalogueDirectory corrupt(QStringLiteral("corrupt"));
    corrupt.write(QStringLiteral("corrupt.xml"), zaf::test::kCorruptCollection);
    corrupt.write(QStringLiteral("garbage.xml.gz"), QByteArray("\x1f\x8b not really gzip", 19));
    LogCapture log;
    const auto broken = Catalogue::loadFromDirectory(corrupt.path(), QStringLiteral("en_US"));
    EXPECT_EQ(log.messages(QStringLiteral("zaf.store")).size(), 2);
    const Answer answer = answerOf(productLookup(broken, {QStringLiteral("org.zafrel.Recorder")}));
    EXPECT_FALSE(answer.onMainThread);
    EXPECT_TRUE(!answer.response || answer.response->results.isEmpty());
}

// A missing directory is logged, leaves the catalogue unloaded and answers with none.
TEST(StoreCatalogueErrorsTest, MissingDirectoryIsLoggedAndAnsweredWithNone)
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
TEST(StoreSharedCatalogueTest, LookupWithoutCatalogueUsesTheDirectoryNamedByTheEnvironment)
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
