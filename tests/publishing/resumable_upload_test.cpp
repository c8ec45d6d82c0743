// The resumable upload against the loopback server.
#include "publishing/plugin/upload/upload_chunk_device.h"
#include "tests/support/named_cases.h"
#include "tests/publishing/upload_test_support.h"
#include "tests/support/log_capture.h"
#include "tests/support/temp_dir.h"

#include <QCryptographicHash>

#include <gtest/gtest.h>

using namespace std::chrono_literals;
using namespace zaf::publishing;
using zaf::test::UploadHarness;
using zaf::test::UploadTestServer;
using Fault = UploadTestServer::Fault;
using FaultKind = UploadTestServer::FaultKind;
using Delays = std::vector<std::chrono::milliseconds>;

namespace {

constexpr qint64 kChunk = UploadHarness::kChunk;

// The Content-Range starts of the data PUTs the upload sent (not the network stack's resends), in order.
QList<qint64> dataStarts(const UploadTestServer &server)
{
    QList<qint64> starts;
    for (const auto &request : server.requests()) {
        if (request.method == QLatin1String("PUT") && !request.contentRange.startsWith("bytes */") && !request.resent)
            starts.append(request.contentRange.mid(6, request.contentRange.indexOf('-') - 6).toLongLong());
    }
    return starts;
}

std::string describe(const std::optional<UploadResult> &result)
{
    return !result ? "timeout" : result->ok() ? "completed" : result->error->description().toStdString();
}

// Runs an upload that must end with an error and returns the error's code.
int failureCode(UploadHarness &h)
{
    const auto result = h.run();
    if (!result || result->ok()) {
        ADD_FAILURE() << "expected an error, got " << describe(result);
        return 0;
    }
    EXPECT_EQ(h.results.size(), 1u);
    EXPECT_FALSE(h.upload.isRunning());
    return result->error->code;
}

} // namespace

ZAF_PRINT_CASES_AS_NAMES

// A clean upload sends the file in chunks with rising progress and reports completion once, with
// the watch URL and a byte-identical file on the server. (Metadata: see the flow tests.)
TEST(ResumableUpload, cleanUploadFinishesWithTheWholeFile)
{
    UploadHarness h(5 * kChunk + 1234);
    ASSERT_TRUE(h.listening);
    const auto result = h.run();
    ASSERT_TRUE(result && result->ok()) << describe(result);
    EXPECT_EQ(result->watchUrl, QUrl(QStringLiteral("https://www.youtube.com/watch?v=") + result->videoId));
    EXPECT_EQ(h.server.videoBytes(result->videoId), h.movie);
    EXPECT_EQ(h.results.size(), 1u);
    EXPECT_FALSE(h.upload.isRunning());
    EXPECT_TRUE(h.delays.empty());

    // The server refuses ranges that do not continue what it holds; the chunk size is kept.
    EXPECT_EQ(h.server.initiations(), 1);
    EXPECT_EQ(h.server.count(QStringLiteral("PUT")), 6);
    EXPECT_EQ(h.server.count(QStringLiteral("PUT"), true), 0);

    qint64 last = 0;
    for (const auto &[sent, total] : h.progress) {
        EXPECT_EQ(total, h.movie.size());
        EXPECT_GE(sent, last);
        last = sent;
    }
    EXPECT_EQ(last, h.movie.size());
}

struct FaultCase {
    const char *name;
    qint64 size;
    QList<Fault> faults;
    Delays delays;
    QList<qint64> firstStarts; // the first data PUTs' Content-Range starts
    int statusQueries;
    int initiations;
    std::chrono::milliseconds backoffCap = 0ms; // 0: the upload's own
};

class RecoverableFaultTest : public ::testing::TestWithParam<FaultCase> {};

// After the expected waits, with the expected sessions and data PUTs that resume where the server
// says it stands.
TEST_P(RecoverableFaultTest, endsWithTheWholeFileOnTheServer)
{
    const FaultCase &c = GetParam();
    UploadHarness h(c.size);
    if (c.backoffCap > 0ms)
        h.upload.setBackoff(1000ms, c.backoffCap, 8);
    for (const Fault &fault : c.faults)
        h.server.queueFault(fault);
    const auto result = h.run();
    ASSERT_TRUE(result && result->ok()) << describe(result);
    EXPECT_EQ(h.server.videoBytes(result->videoId), h.movie);
    EXPECT_EQ(zaf::test::fileDigest(h.path), QCryptographicHash::hash(h.movie, QCryptographicHash::Sha256))
        << "the file uploaded is left as it was";
    EXPECT_EQ(h.delays, c.delays);
    EXPECT_EQ(dataStarts(h.server).mid(0, c.firstStarts.size()), c.firstStarts);
    EXPECT_EQ(h.server.count(QStringLiteral("PUT"), true), c.statusQueries);
    EXPECT_EQ(h.server.initiations(), c.initiations);
}

INSTANTIATE_TEST_SUITE_P(Faults, RecoverableFaultTest, ::testing::Values(
    // Each break is followed by a status query and the next chunk starts where the server's Range
    // ends; the server kept bytes each time, so neither break extends a run of failures.
    FaultCase{"InterruptedTwice", 4 * kChunk + 77, {{FaultKind::DropBody, 1000}, {FaultKind::DropBody, 5000}},
              {1000ms, 1000ms}, {0, 1000, 6000}, 2, 1},
    FaultCase{"UnavailableWithRetryAfter", 2 * kChunk, {{FaultKind::Unavailable, 0, 7}}, {7000ms}, {0, 0}, 1, 1},
    // Backoff doubles from 1 s up to the cap.
    FaultCase{"UnavailableWithoutRetryAfter", kChunk, QList<Fault>(4, Fault{FaultKind::Unavailable}),
              {1000ms, 2000ms, 3000ms, 3000ms}, {0, 0}, 4, 1, 3000ms},
    FaultCase{"ResumeWithoutRangeRestartsFromZero", 3 * kChunk, {{FaultKind::DropBody, 2000}, {FaultKind::ForgetBytes}},
              {1000ms}, {0, 0}, 1, 1},
    FaultCase{"SessionGoneStartsANewSession", 3 * kChunk, {{FaultKind::SessionGone}}, {}, {0, 0}, 0, 2}),
    zaf::test::caseName);

// A connection lost once mid-chunk is mended by one of two hands, and which one depends on whether
// the reset reaches the network stack while it writes or while it waits for the answer: either the
// stack rewinds the chunk and resends it, and the upload neither waits nor asks the server, or the
// stack gives up and the upload asks where the server stands after its first wait. Either way each
// byte reaches the server once, in order.
TEST(ResumableUpload, connectionLostOnceIsMendedWithoutDuplicatingBytes)
{
    UploadHarness h(2 * kChunk);
    h.server.queueFault(Fault{FaultKind::DropBodyOnce, 1000});
    const auto result = h.run();
    ASSERT_TRUE(result && result->ok()) << describe(result);
    EXPECT_EQ(h.server.videoBytes(result->videoId), h.movie);
    EXPECT_EQ(h.server.initiations(), 1);
    const bool resentByTheStack = h.server.count(QStringLiteral("PUT"), true) == 0;
    if (resentByTheStack) {
        EXPECT_TRUE(h.delays.empty());
        EXPECT_EQ(dataStarts(h.server).mid(0, 2), (QList<qint64>{0, kChunk}));
    } else {
        EXPECT_EQ(h.delays, Delays{1000ms});
        EXPECT_EQ(h.server.count(QStringLiteral("PUT"), true), 1);
        EXPECT_EQ(dataStarts(h.server).mid(0, 2), (QList<qint64>{0, 1000}));
    }
}

struct LimitCase {
    const char *name;
    qint64 size;
    int maxRequests;
    std::function<void(UploadHarness &)> arrange;
    int code;
    std::function<void(const UploadHarness &, const zaf::test::LogCapture &)> verify;
};

class UploadLimitTest : public ::testing::TestWithParam<LimitCase> {};

// Once; a 400 at once, with the service's reason, logged.
TEST_P(UploadLimitTest, endsWithItsError)
{
    const LimitCase &c = GetParam();
    zaf::test::LogCapture log;
    UploadHarness h(c.size, c.maxRequests);
    c.arrange(h);
    EXPECT_EQ(failureCode(h), c.code);
    c.verify(h, log);
}

INSTANTIATE_TEST_SUITE_P(Limits, UploadLimitTest, ::testing::Values(
    LimitCase{"BadRequest", kChunk, 60, [](UploadHarness &h) {
        h.server.setAcceptedCategories({QStringLiteral("20")});
        VideoMetadata metadata;
        metadata.categoryId = QStringLiteral("22");
        h.upload.setMetadata(metadata);
    }, 400, [](const UploadHarness &h, const auto &log) {
        EXPECT_TRUE(h.results.front().error->message.contains(QStringLiteral("invalid video category")));
        EXPECT_EQ(h.server.requests().size(), 1);
        EXPECT_TRUE(h.delays.empty());
        EXPECT_TRUE(log.messages(QStringLiteral("zaf.publishing")).join(QLatin1Char('\n')).contains(QStringLiteral("HTTP 400")));
    }},
    LimitCase{"SessionGoneBeyondTheRestartLimit", kChunk, 60, [](UploadHarness &h) {
        h.upload.setMaxRestarts(2);
        for (int i = 0; i < 3; ++i)
            h.server.queueFault(Fault{FaultKind::SessionGone});
    }, UploadTooManyRestartsError, [](const UploadHarness &h, const auto &) { EXPECT_EQ(h.server.initiations(), 3); }},
    LimitCase{"LostConnectionsBeyondTheRetryLimit", 2 * kChunk, 60, [](UploadHarness &h) {
        h.upload.setBackoff(1000ms, 4000ms, 2);
        for (int i = 0; i < 5; ++i)
            h.server.queueFault(Fault{FaultKind::DropBody, 0});
    }, UploadTooManyRetriesError, [](const UploadHarness &h, const auto &) { EXPECT_EQ(h.delays.size(), 2u); }},
    LimitCase{"ServerStopsAnsweringMidUpload", 4 * kChunk, 3, [](UploadHarness &h) { h.upload.setBackoff(1000ms, 4000ms, 3); }, 403,
              [](const UploadHarness &, const auto &log) { EXPECT_FALSE(log.messages(QStringLiteral("zaf.publishing")).isEmpty()); }},
    LimitCase{"MissingFile", 1000, 60, [](UploadHarness &h) { h.upload.setFilePath(h.scratch.file(QStringLiteral("absent.mp4"))); },
              UploadFileError, [](const UploadHarness &h, const auto &) { EXPECT_TRUE(h.server.requests().isEmpty()); }},
    LimitCase{"Cancel", 4 * kChunk, 60, [](UploadHarness &h) {
        QObject::connect(&h.upload, &ResumableUpload::progress, &h.upload, [&h](qint64 sent, qint64) {
            if (sent >= kChunk)
                h.upload.cancel();
        });
    }, UploadCancelledError, [](const UploadHarness &, const auto &) {}}),
    zaf::test::caseName);

struct MisleadingCase {
    const char *name;
    qint64 stallAfter;
    QString sessionOrigin; // "PORT" stands for the server's port
    int code;
    int dataPuts;
};

class MisleadingServerTest : public ::testing::TestWithParam<MisleadingCase> {};

// A server that misleads the upload cannot keep it going or get the token elsewhere: a 308 that keeps
// none of a chunk (no Range, or a Range stuck before the chunk) is a failed attempt within the
// bounded retries, and a session address off the base's origin ends the upload before any PUT.
TEST_P(MisleadingServerTest, endsTheUpload)
{
    const MisleadingCase &c = GetParam();
    UploadHarness h(3 * kChunk);
    h.upload.setBackoff(1000ms, 4000ms, 3);
    h.server.setStallAfter(c.stallAfter);
    QString origin = c.sessionOrigin;
    h.server.setSessionOrigin(QUrl(origin.replace(QStringLiteral("PORT"), QString::number(h.server.baseUrl().port()))));
    EXPECT_EQ(failureCode(h), c.code);
    EXPECT_EQ(h.server.count(QStringLiteral("PUT")), c.dataPuts);
    EXPECT_EQ(h.delays.size(), c.code == UploadTooManyRetriesError ? 3u : 0u);
    EXPECT_EQ(h.server.initiations(), 1);
}

INSTANTIATE_TEST_SUITE_P(Servers, MisleadingServerTest, ::testing::Values(
    MisleadingCase{"ResumeWithoutRangeForEver", 0, {}, UploadTooManyRetriesError, 4},
    MisleadingCase{"RangeStuckAfterTheFirstChunk", kChunk, {}, UploadTooManyRetriesError, 5},
    MisleadingCase{"SessionOnAnotherHost", -1, QStringLiteral("http://localhost:PORT"), UploadUntrustedSessionError, 0},
    MisleadingCase{"SessionOnAnotherPort", -1, QStringLiteral("http://127.0.0.1:1"), UploadUntrustedSessionError, 0}),
    zaf::test::caseName);

struct AnswerCase {
    const char *name;
    int status;
    QByteArray range, retryAfter;
    UploadDecision::Action action;
    int code;
    std::optional<std::chrono::milliseconds> retryAfterDelay;
};

class UploadAnswerTest : public ::testing::TestWithParam<AnswerCase> {};

// A Retry-After of that many seconds waits the longest allowed wait, and a Range ending at the
// largest byte number is an unusable Range. (Ordinary values: the loopback tests above.)
TEST_P(UploadAnswerTest, readsHeaderValuesWithoutOverflow)
{
    const AnswerCase &c = GetParam();
    UploadAnswer answer;
    answer.status = c.status;
    answer.range = c.range;
    answer.retryAfter = c.retryAfter;
    const QDateTime now = QDateTime::fromSecsSinceEpoch(1700000000, Qt::UTC);
    const UploadDecision decision = interpretUploadAnswer(answer, UploadState{UploadStep::SendChunk, 0, 1000, {}}, now);
    EXPECT_EQ(decision.action, c.action);
    EXPECT_EQ(decision.code, c.code);
    EXPECT_EQ(decision.retryAfter, c.retryAfterDelay);
}

using Action = UploadDecision::Action;
INSTANTIATE_TEST_SUITE_P(Headers, UploadAnswerTest, ::testing::Values(
    AnswerCase{"RetryAfterPastTheLargestWait", 503, {}, "9223372036854776", Action::Retry, 503, 600000ms},
    AnswerCase{"RangeAtTheLargestByteNumber", 308, "bytes=0-9223372036854775807", {}, Action::Fail, UploadMalformedAnswerError, std::nullopt}),
    zaf::test::caseName);

// It rewinds, so the network stack can resend it.
TEST(UploadChunkDevice, readsItsSliceRepeatably)
{
    zaf::test::ScratchDir scratch;
    const QByteArray bytes = zaf::test::variedBytes(1000);
    const QString path = scratch.file(QStringLiteral("movie.mp4"));
    QFile file(path);
    ASSERT_TRUE(file.open(QIODevice::WriteOnly) && file.write(bytes) == bytes.size());
    file.close();
    UploadChunkDevice device(path, 100, 300);
    ASSERT_TRUE(device.openChunk());
    EXPECT_EQ(device.size(), 300);
    EXPECT_EQ(device.readAll(), bytes.mid(100, 300));
    EXPECT_TRUE(device.atEnd());
    ASSERT_TRUE(device.reset());
    EXPECT_EQ(device.readAll(), bytes.mid(100, 300));
    ASSERT_TRUE(device.seek(250));
    EXPECT_EQ(device.readAll(), bytes.mid(350, 50));
    EXPECT_FALSE(device.seek(301));
    EXPECT_FALSE(UploadChunkDevice(path, 900, 300).openChunk()) << "a chunk past the file's end";
}

// So a test that goes wrong cannot keep it busy.
TEST(UploadTestServer, stopsByItselfAfterItsLifetime)
{
    UploadTestServer server(10, 100ms);
    ASSERT_TRUE(server.listen());
    EXPECT_EQ(server.baseUrl().host(), QStringLiteral("127.0.0.1"));
    EXPECT_TRUE(zaf::test::waitUntil([&] { return server.stopped(); }, 5000));
}
