#include "tests/publishing/upload_test_support.h"
#include "tests/support/log_capture.h"

#include <gtest/gtest.h>

using namespace std::chrono_literals;
using zaf::test::UploadHarness;
using zaf::test::UploadTestServer;
using Fault = UploadTestServer::Fault;
using FaultKind = UploadTestServer::FaultKind;

namespace {

// The Content-Range starts of the data PUTs, in order.
QList<qint64> dataStarts(const UploadTestServer &server)
{
    QList<qint64> starts;
    for (const auto &request : server.requests()) {
        if (request.method == QLatin1String("PUT") && !request.contentRange.startsWith("bytes */"))
            starts.append(request.contentRange.mid(6, request.contentRange.indexOf('-') - 6).toLongLong());
    }
    return starts;
}

} // namespace

TEST(ResumableUploadFaults, uploadInterruptedTwiceResumesFromTheServersRange)
{
    UploadHarness h(4 * UploadHarness::kChunk + 77);
    h.server.queueFault(Fault{FaultKind::DropBody, 1000});
    h.server.queueFault(Fault{FaultKind::DropBody, 5000});
    const auto result = h.run();
    ASSERT_TRUE(result.has_value());
    ASSERT_TRUE(result->ok()) << result->error->description().toStdString();
    EXPECT_EQ(h.server.videoBytes(result->videoId), h.movie);

    // Each break is followed by a status query; the next chunk starts where the server's Range ends.
    EXPECT_EQ(h.server.count(QStringLiteral("PUT"), true), 2);
    const QList<qint64> starts = dataStarts(h.server);
    ASSERT_GE(starts.size(), 3);
    EXPECT_EQ(starts.mid(0, 3), (QList<qint64>{0, 1000, 6000}));
    // The server kept bytes before each break, so neither break extends a run of failures.
    EXPECT_EQ(h.delays, (std::vector<std::chrono::milliseconds>{1000ms, 1000ms}));
    EXPECT_EQ(h.server.initiations(), 1);
}

TEST(ResumableUploadFaults, serviceUnavailableIsRetriedAfterTheAdvertisedDelay)
{
    UploadHarness h(2 * UploadHarness::kChunk);
    h.server.queueFault(Fault{FaultKind::Unavailable, 0, 7});
    const auto result = h.run();
    ASSERT_TRUE(result && result->ok()) << (result ? result->error->description().toStdString() : "timeout");
    EXPECT_EQ(h.delays, (std::vector<std::chrono::milliseconds>{7000ms}));
    EXPECT_EQ(h.server.count(QStringLiteral("PUT"), true), 1);
    EXPECT_EQ(h.server.videoBytes(result->videoId), h.movie);
}

TEST(ResumableUploadFaults, serviceUnavailableWithoutRetryAfterBacksOffExponentiallyUpToTheCap)
{
    UploadHarness h(UploadHarness::kChunk);
    h.upload.setBackoff(1000ms, 3000ms, 8);
    for (int i = 0; i < 4; ++i)
        h.server.queueFault(Fault{FaultKind::Unavailable});
    const auto result = h.run();
    ASSERT_TRUE(result && result->ok());
    EXPECT_EQ(h.delays, (std::vector<std::chrono::milliseconds>{1000ms, 2000ms, 3000ms, 3000ms}));
}

TEST(ResumableUploadFaults, statusQueryWithoutRangeRestartsFromZero)
{
    UploadHarness h(3 * UploadHarness::kChunk);
    h.server.queueFault(Fault{FaultKind::DropBody, 2000});
    h.server.queueFault(Fault{FaultKind::ForgetBytes});
    const auto result = h.run();
    ASSERT_TRUE(result && result->ok()) << (result ? result->error->description().toStdString() : "timeout");
    EXPECT_EQ(dataStarts(h.server).mid(0, 2), (QList<qint64>{0, 0}));
    EXPECT_EQ(h.server.videoBytes(result->videoId), h.movie);
}

TEST(ResumableUploadFaults, sessionNotFoundStartsAgainWithANewInitiation)
{
    UploadHarness h(3 * UploadHarness::kChunk);
    h.server.queueFault(Fault{FaultKind::SessionGone});
    const auto result = h.run();
    ASSERT_TRUE(result && result->ok()) << (result ? result->error->description().toStdString() : "timeout");
    EXPECT_EQ(h.server.initiations(), 2);
    EXPECT_EQ(h.server.videoBytes(result->videoId), h.movie);
}

TEST(ResumableUploadFaults, sessionNotFoundRepeatedlyEndsAfterTheRestartLimit)
{
    UploadHarness h(UploadHarness::kChunk);
    h.upload.setMaxRestarts(2);
    for (int i = 0; i < 3; ++i)
        h.server.queueFault(Fault{FaultKind::SessionGone});
    const auto result = h.run();
    ASSERT_TRUE(result.has_value());
    ASSERT_FALSE(result->ok());
    EXPECT_EQ(result->error->code, zaf::publishing::UploadTooManyRestartsError);
    EXPECT_EQ(h.server.initiations(), 3);
}

TEST(ResumableUploadFaults, badMetadataEndsWithAFinalErrorAndNoRetry)
{
    zaf::test::LogCapture log;
    UploadHarness h(UploadHarness::kChunk);
    h.server.setAcceptedCategories({QStringLiteral("20")});
    zaf::publishing::VideoMetadata metadata;
    metadata.title = QStringLiteral("Run");
    metadata.categoryId = QStringLiteral("22");
    h.upload.setMetadata(metadata);
    const auto result = h.run();
    ASSERT_TRUE(result.has_value());
    ASSERT_FALSE(result->ok());
    EXPECT_EQ(result->error->code, 400);
    EXPECT_TRUE(result->error->message.contains(QStringLiteral("invalid video category")))
        << result->error->message.toStdString();
    EXPECT_EQ(h.server.requests().size(), 1);
    EXPECT_TRUE(h.delays.empty());
    bool logged = false;
    for (const QString &message : log.messages(QStringLiteral("zaf.publishing")))
        logged = logged || message.contains(QStringLiteral("HTTP 400"));
    EXPECT_TRUE(logged);
}

TEST(ResumableUploadFaults, serverThatStopsMidUploadEndsWithALoggedFinalError)
{
    zaf::test::LogCapture log;
    UploadHarness h(4 * UploadHarness::kChunk, /*maxRequests=*/3);
    h.upload.setBackoff(1000ms, 4000ms, 3);
    const auto result = h.run();
    ASSERT_TRUE(result.has_value());
    ASSERT_FALSE(result->ok());
    EXPECT_EQ(result->error->code, 403);
    EXPECT_FALSE(log.messages(QStringLiteral("zaf.publishing")).isEmpty());
    EXPECT_FALSE(h.upload.isRunning());
}

TEST(ResumableUploadFaults, lostConnectionsBeyondTheRetryLimitEndWithAFinalError)
{
    UploadHarness h(2 * UploadHarness::kChunk);
    h.upload.setBackoff(1000ms, 4000ms, 2);
    // Every data PUT breaks; status queries keep answering, but no progress is ever made.
    for (int i = 0; i < 5; ++i)
        h.server.queueFault(Fault{FaultKind::DropBody, 0});
    const auto result = h.run();
    ASSERT_TRUE(result.has_value());
    ASSERT_FALSE(result->ok());
    EXPECT_EQ(result->error->code, zaf::publishing::UploadTooManyRetriesError);
    EXPECT_EQ(h.delays.size(), 2u);
}

TEST(UploadTestServer, stopsByItselfAfterItsLifetime)
{
    UploadTestServer server(10, 100ms);
    ASSERT_TRUE(server.listen());
    EXPECT_EQ(server.baseUrl().host(), QStringLiteral("127.0.0.1"));
    QEventLoop loop;
    QTimer::singleShot(300ms, &loop, &QEventLoop::quit);
    loop.exec();
    EXPECT_TRUE(server.stopped());
}
