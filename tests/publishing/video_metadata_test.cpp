#include "publishing/plugin/upload/video_metadata.h"

#include <QJsonDocument>
#include <QJsonObject>
#include <gtest/gtest.h>

using zaf::publishing::VideoMetadata;

TEST(VideoMetadata, normaliseTitleTrimsAndRemovesAngleBrackets)
{
    EXPECT_EQ(VideoMetadata::normaliseTitle(QStringLiteral("  <b>Boss fight</b>  ")), QStringLiteral("bBoss fight/b"));
}

TEST(VideoMetadata, normaliseTitleFallsBackToUntitledWhenEmpty)
{
    EXPECT_EQ(VideoMetadata::normaliseTitle(QString()), QStringLiteral("Untitled"));
    EXPECT_EQ(VideoMetadata::normaliseTitle(QStringLiteral(" <> ")), QStringLiteral("Untitled"));
}

TEST(VideoMetadata, normaliseTitleCutsAtOneHundredCharactersWithoutSplittingSurrogates)
{
    const QString longTitle = QString(150, QLatin1Char('a'));
    EXPECT_EQ(VideoMetadata::normaliseTitle(longTitle).size(), 100);

    // 99 letters and then emoji (two UTF-16 units each): the 100th character is one whole emoji.
    const QString emoji = QString::fromUtf8("\xF0\x9F\x8E\xAE");
    const QString mixed = QString(99, QLatin1Char('b')) + emoji + emoji;
    const QString cut = VideoMetadata::normaliseTitle(mixed);
    EXPECT_EQ(cut, QString(99, QLatin1Char('b')) + emoji);
    EXPECT_EQ(cut.toUcs4().size(), 100);
}

TEST(VideoMetadata, normaliseDescriptionCutsAtFiveThousandBytesOnACharacterBoundary)
{
    // 4999 ASCII bytes and then a three-byte character: it does not fit and must not be split.
    const QString description = QString(4999, QLatin1Char('x')) + QString::fromUtf8("\xE2\x82\xAC") + QStringLiteral("tail");
    const QString cut = VideoMetadata::normaliseDescription(description);
    EXPECT_EQ(cut, QString(4999, QLatin1Char('x')));
    EXPECT_LE(cut.toUtf8().size(), 5000);

    const QString fits = QString(4997, QLatin1Char('x')) + QString::fromUtf8("\xE2\x82\xAC");
    EXPECT_EQ(VideoMetadata::normaliseDescription(fits), fits);
}

TEST(VideoMetadata, normaliseDescriptionRemovesAngleBrackets)
{
    EXPECT_EQ(VideoMetadata::normaliseDescription(QStringLiteral("a <script> b")), QStringLiteral("a script b"));
}

TEST(VideoMetadata, normalisedRejectsUnknownCategoryAndPrivacy)
{
    VideoMetadata metadata;
    metadata.categoryId = QStringLiteral("18"); // exists, but cannot be assigned
    auto result = metadata.normalised();
    ASSERT_FALSE(result.ok());
    EXPECT_EQ(result.error->code, zaf::publishing::InvalidCategoryError);

    metadata.categoryId = QStringLiteral("20");
    metadata.privacyStatus = QStringLiteral("friends");
    result = metadata.normalised();
    ASSERT_FALSE(result.ok());
    EXPECT_EQ(result.error->code, zaf::publishing::InvalidPrivacyStatusError);

    metadata.privacyStatus = QStringLiteral(" Unlisted ");
    result = metadata.normalised();
    ASSERT_TRUE(result.ok());
    EXPECT_EQ(result.value->privacyStatus, QStringLiteral("unlisted"));
}

TEST(VideoMetadata, toJsonWritesSnippetAndStatus)
{
    VideoMetadata metadata;
    metadata.title = QStringLiteral("<Run>");
    metadata.description = QStringLiteral("d");
    metadata.privacyStatus = QStringLiteral("public");
    const auto normalised = metadata.normalised();
    ASSERT_TRUE(normalised.ok());
    const QJsonObject body = QJsonDocument::fromJson(normalised.value->toJson()).object();
    const QJsonObject snippet = body.value(QStringLiteral("snippet")).toObject();
    EXPECT_EQ(snippet.value(QStringLiteral("title")).toString(), QStringLiteral("Run"));
    EXPECT_EQ(snippet.value(QStringLiteral("description")).toString(), QStringLiteral("d"));
    EXPECT_EQ(snippet.value(QStringLiteral("categoryId")).toString(), QStringLiteral("20"));
    EXPECT_EQ(body.value(QStringLiteral("status")).toObject().value(QStringLiteral("privacyStatus")).toString(),
              QStringLiteral("public"));
}

TEST(VideoCategories, listTheAssignableUsCategoriesWithLabels)
{
    const QStringList expected = {"1", "2", "10", "15", "17", "19", "20", "22", "23", "24", "25", "26", "27", "28", "29"};
    QStringList ids;
    for (const auto &category : zaf::publishing::assignableCategories()) {
        ids.append(category.id);
        EXPECT_FALSE(category.label.isEmpty());
    }
    EXPECT_EQ(ids, expected);
    EXPECT_EQ(zaf::publishing::categoryLabel(QStringLiteral("20")), QStringLiteral("Gaming"));
    EXPECT_FALSE(zaf::publishing::isAssignableCategory(QStringLiteral("18")));
}
