#include "tests/publishing/upload_test_support.h"

#include <QJsonDocument>
#include <QJsonObject>
#include <gtest/gtest.h>

using namespace std::chrono_literals;
using zaf::test::UploadHarness;

TEST(ResumableUpload, startUploadsTheFileInChunksAndFinishesWithTheWatchUrl)
{
    UploadHarness h(5 * UploadHarness::kChunk + 1234);
    ASSERT_TRUE(h.listening);
    const auto result = h.run();
    ASSERT_TRUE(result.has_value());
    ASSERT_TRUE(result->ok()) << result->error->description().toStdString();
    EXPECT_EQ(result->watchUrl, QUrl(QStringLiteral("https://www.youtube.com/watch?v=") + result->videoId));
    EXPECT_EQ(h.server.videoBytes(result->videoId), h.movie);

    EXPECT_EQ(h.server.initiations(), 1);
    EXPECT_EQ(h.server.count(QStringLiteral("PUT")), 6);
    EXPECT_EQ(h.server.count(QStringLiteral("PUT"), true), 0);
    EXPECT_EQ(h.server.requests().at(1).contentRange, QByteArray("bytes 0-65535/328914"));
    EXPECT_EQ(h.server.requests().last().contentRange, QByteArray("bytes 327680-328913/328914"));
    EXPECT_TRUE(h.delays.empty());
    EXPECT_EQ(h.results.size(), 1u);
    EXPECT_FALSE(h.upload.isRunning());
}

TEST(ResumableUpload, startSendsTheNormalisedMetadata)
{
    UploadHarness h(1000);
    zaf::publishing::VideoMetadata metadata;
    metadata.title = QStringLiteral("  <Best> run  ");
    metadata.categoryId = QStringLiteral("24");
    metadata.privacyStatus = QStringLiteral("Unlisted");
    h.upload.setMetadata(metadata);
    const auto result = h.run();
    ASSERT_TRUE(result && result->ok());
    ASSERT_EQ(h.server.initiationBodies().size(), 1);
    const QJsonObject body = QJsonDocument::fromJson(h.server.initiationBodies().first()).object();
    EXPECT_EQ(body.value("snippet").toObject().value("title").toString(), QStringLiteral("Best run"));
    EXPECT_EQ(body.value("snippet").toObject().value("categoryId").toString(), QStringLiteral("24"));
    EXPECT_EQ(body.value("status").toObject().value("privacyStatus").toString(), QStringLiteral("unlisted"));
}

TEST(ResumableUpload, progressRisesToTheTotal)
{
    UploadHarness h(3 * UploadHarness::kChunk);
    const auto result = h.run();
    ASSERT_TRUE(result && result->ok());
    ASSERT_FALSE(h.progress.empty());
    qint64 last = 0;
    for (const auto &[sent, total] : h.progress) {
        EXPECT_EQ(total, h.movie.size());
        EXPECT_GE(sent, last);
        last = sent;
    }
    EXPECT_EQ(last, h.movie.size());
}

TEST(ResumableUpload, startFailsWithoutNetworkWhenTheFileIsMissing)
{
    UploadHarness h(1000);
    h.upload.setFilePath(h.scratch.file(QStringLiteral("absent.mp4")));
    const auto result = h.run();
    ASSERT_TRUE(result.has_value());
    ASSERT_FALSE(result->ok());
    EXPECT_EQ(result->error->code, zaf::publishing::UploadFileError);
    EXPECT_TRUE(h.server.requests().isEmpty());
}

TEST(ResumableUpload, cancelEndsTheUploadWithACancelledError)
{
    UploadHarness h(4 * UploadHarness::kChunk);
    QObject::connect(&h.upload, &zaf::publishing::ResumableUpload::progress, &h.upload,
                     [&h](qint64 sent, qint64) {
                         if (sent >= UploadHarness::kChunk)
                             h.upload.cancel();
                     });
    const auto result = h.run();
    ASSERT_TRUE(result.has_value());
    ASSERT_FALSE(result->ok());
    EXPECT_EQ(result->error->code, zaf::publishing::UploadCancelledError);
    EXPECT_EQ(h.results.size(), 1u);
    EXPECT_FALSE(h.upload.isRunning());
}
