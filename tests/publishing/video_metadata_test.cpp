// The metadata rules of the video service: what normalising repairs and what it refuses.
#include "publishing/plugin/upload/video_metadata.h"
#include "tests/support/named_cases.h"

#include <QJsonDocument>
#include <QJsonObject>
#include <gtest/gtest.h>

using namespace zaf::publishing;

namespace {

ZAF_PRINT_CASES_AS_NAMES

const QString kEmoji = QString::fromUtf8("\xF0\x9F\x8E\xAE");

struct TitleCase {
    const char *name;
    QString typed, normalised;
};

class TitleTest : public ::testing::TestWithParam<TitleCase> {};

struct RefusedCase {
    const char *name;
    const char *categoryId, *privacyStatus;
    int code;
};

class RefusedMetadataTest : public ::testing::TestWithParam<RefusedCase> {};

} // namespace

// Titles are trimmed, lose angle brackets, fall back to "Untitled" and are cut at 100 characters,
// never inside a surrogate pair.
TEST_P(TitleTest, normaliseTitleRepairsWhatThePersonTyped)
{
    EXPECT_EQ(VideoMetadata::normaliseTitle(GetParam().typed), GetParam().normalised);
}

INSTANTIATE_TEST_SUITE_P(Titles, TitleTest, ::testing::Values(
    TitleCase{"TrimmedWithoutBrackets", QStringLiteral("  <b>Boss fight</b>  "), QStringLiteral("bBoss fight/b")},
    TitleCase{"Empty", QString(), QStringLiteral("Untitled")},
    TitleCase{"OnlyBrackets", QStringLiteral(" <> "), QStringLiteral("Untitled")},
    TitleCase{"TooLong", QString(150, QLatin1Char('a')), QString(100, QLatin1Char('a'))},
    // The 100th character is one whole emoji (two UTF-16 units).
    TitleCase{"CutAfterASurrogatePair", QString(99, QLatin1Char('b')) + kEmoji + kEmoji, QString(99, QLatin1Char('b')) + kEmoji}),
    zaf::test::caseName);

// Descriptions lose angle brackets and are cut at 5000 UTF-8 bytes on a character boundary.
TEST(VideoMetadata, normaliseDescriptionCutsOnACharacterBoundary)
{
    const QString euro = QString::fromUtf8("\xE2\x82\xAC");
    EXPECT_EQ(VideoMetadata::normaliseDescription(QStringLiteral("a <script> b")), QStringLiteral("a script b"));
    // 4999 bytes and then a three-byte character: it does not fit and must not be split.
    EXPECT_EQ(VideoMetadata::normaliseDescription(QString(4999, QLatin1Char('x')) + euro + QStringLiteral("tail")),
              QString(4999, QLatin1Char('x')));
    const QString fits = QString(4997, QLatin1Char('x')) + euro;
    EXPECT_EQ(VideoMetadata::normaliseDescription(fits), fits);
}

TEST_P(RefusedMetadataTest, normalisedRefusesWhatCannotBeRepaired)
{
    VideoMetadata metadata;
    metadata.categoryId = QString::fromLatin1(GetParam().categoryId);
    metadata.privacyStatus = QString::fromLatin1(GetParam().privacyStatus);
    EXPECT_EQ(metadata.normalised().error.value_or(zaf::Error{}).code, GetParam().code);
}

INSTANTIATE_TEST_SUITE_P(Fields, RefusedMetadataTest, ::testing::Values(
    RefusedCase{"CategoryThatCannotBeAssigned", "18", "private", InvalidCategoryError}, // it exists
    RefusedCase{"UnknownPrivacyStatus", "20", "friends", InvalidPrivacyStatusError}), zaf::test::caseName);

// The JSON carries the normalised fields; the privacy status is read in any case and with spaces.
TEST(VideoMetadata, toJsonWritesTheNormalisedFields)
{
    VideoMetadata metadata;
    metadata.categoryId = QStringLiteral("20");
    metadata.title = QStringLiteral("<Run>");
    metadata.description = QStringLiteral("d");
    metadata.privacyStatus = QStringLiteral(" Unlisted ");
    const auto normalised = metadata.normalised();
    ASSERT_TRUE(normalised.ok());
    const QJsonObject body = QJsonDocument::fromJson(normalised.value->toJson()).object();
    const QJsonObject snippet = body.value(QStringLiteral("snippet")).toObject();
    EXPECT_EQ(snippet.value(QStringLiteral("title")).toString(), QStringLiteral("Run"));
    EXPECT_EQ(snippet.value(QStringLiteral("description")).toString(), QStringLiteral("d"));
    EXPECT_EQ(snippet.value(QStringLiteral("categoryId")).toString(), QStringLiteral("20"));
    EXPECT_EQ(body.value(QStringLiteral("status")).toObject().value(QStringLiteral("privacyStatus")).toString(),
              QStringLiteral("unlisted"));
}

// The assignable categories are the US list in the service's order, each with a label.
TEST(VideoCategories, listTheAssignableUsCategoriesWithLabels)
{
    QStringList ids;
    for (const auto &category : assignableCategories()) {
        ids.append(category.id);
        EXPECT_EQ(categoryLabel(category.id), category.label);
        EXPECT_FALSE(category.label.isEmpty());
    }
    EXPECT_EQ(ids, QStringList({"1", "2", "10", "15", "17", "19", "20", "22", "23", "24", "25", "26", "27", "28", "29"}));
    EXPECT_EQ(categoryLabel(QStringLiteral("20")), QStringLiteral("Gaming"));
    EXPECT_FALSE(isAssignableCategory(QStringLiteral("18")));
}
