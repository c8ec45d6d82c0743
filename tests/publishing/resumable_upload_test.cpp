// The resumable upload against the loopback server: a clean run, recovery from each fault the
// service produces, and the errors that end an upload for good.
#include "tests/publishing/upload_test_support.h"
#include "publishing/plugin/upload/upload_chunk_device.h"
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

// A clean upload sends the file in chunks with rising progress and reports completion once, with
// the watch URL and a byte-identical file on the server. (Metadata: see the flow tests.)
TEST(ResumableUpload, cleanUploadFinishesWithTheWatchUrlAndTheWholeFile)
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

// Every recoverable fault ends with the whole file on the server, after the expected waits, the
// expected number of sessions and data PUTs that resume where the server says it stands.
TEST(ResumableUpload, recoversFromEachServiceFault)
{
    const struct {
        const char *name;
        qint64 size;
        QList<Fault> faults;
        Delays delays;
        QList<qint64> firstStarts; // the first data PUTs' Content-Range starts
        int statusQueries;
        int initiations;
        std::chrono::milliseconds backoffCap = 0ms; // 0: the upload's own
    } cases[] = {
        // Each break is followed by a status query and the next chunk starts where the server's Range
        // ends; the server kept bytes each time, so neither break extends a run of failures.
        {"interrupted twice", 4 * kChunk + 77, {{FaultKind::DropBody, 1000}, {FaultKind::DropBody, 5000}},
         {1000ms, 1000ms}, {0, 1000, 6000}, 2, 1},
        {"503 with Retry-After", 2 * kChunk, {{FaultKind::Unavailable, 0, 7}}, {7000ms}, {0, 0}, 1, 1},
        // Backoff doubles from 1 s up to the cap.
        {"503 without Retry-After", kChunk, QList<Fault>(4, Fault{FaultKind::Unavailable}),
         {1000ms, 2000ms, 3000ms, 3000ms}, {0, 0}, 4, 1, 3000ms},
        {"308 without Range restarts from zero", 3 * kChunk, {{FaultKind::DropBody, 2000}, {FaultKind::ForgetBytes}},
         {1000ms}, {0, 0}, 1, 1},
        {"404 starts a new session", 3 * kChunk, {{FaultKind::SessionGone}}, {}, {0, 0}, 0, 2},
        // A connection lost once is the network stack's to mend: it rewinds the chunk and sends it
        // again, and the upload neither waits nor asks the server.
        {"interrupted once, resent by the network stack", 2 * kChunk, {{FaultKind::DropBodyOnce, 1000}}, {}, {0, kChunk}, 0, 1},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.name);
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
}

// A 400 is final: no retry, no wait, the error carries the service's reason and is logged.
TEST(ResumableUpload, badRequestEndsAtOnceWithTheServicesReason)
{
    zaf::test::LogCapture log;
    UploadHarness h(kChunk);
    h.server.setAcceptedCategories({QStringLiteral("20")});
    VideoMetadata metadata;
    metadata.categoryId = QStringLiteral("22");
    h.upload.setMetadata(metadata);
    EXPECT_EQ(failureCode(h), 400);
    EXPECT_TRUE(h.results.front().error->message.contains(QStringLiteral("invalid video category")));
    EXPECT_EQ(h.server.requests().size(), 1);
    EXPECT_TRUE(h.delays.empty());
    EXPECT_TRUE(log.messages(QStringLiteral("zaf.publishing")).join(QLatin1Char('\n')).contains(QStringLiteral("HTTP 400")));
}

// The limits that end an upload which makes no progress, a missing file and a cancel.
TEST(ResumableUpload, endsWithAnErrorAtEachLimit)
{
    {
        SCOPED_TRACE("404 beyond the restart limit");
        UploadHarness h(kChunk);
        h.upload.setMaxRestarts(2);
        for (int i = 0; i < 3; ++i)
            h.server.queueFault(Fault{FaultKind::SessionGone});
        EXPECT_EQ(failureCode(h), UploadTooManyRestartsError);
        EXPECT_EQ(h.server.initiations(), 3);
    }
    {
        SCOPED_TRACE("lost connections beyond the retry limit");
        UploadHarness h(2 * kChunk);
        h.upload.setBackoff(1000ms, 4000ms, 2);
        for (int i = 0; i < 5; ++i)
            h.server.queueFault(Fault{FaultKind::DropBody, 0});
        EXPECT_EQ(failureCode(h), UploadTooManyRetriesError);
        EXPECT_EQ(h.delays.size(), 2u);
    }
    {
        SCOPED_TRACE("server that stops answering mid-upload");
        zaf::test::LogCapture log;
        UploadHarness h(4 * kChunk, /*maxRequests=*/3);
        h.upload.setBackoff(1000ms, 4000ms, 3);
        EXPECT_EQ(failureCode(h), 403);
        EXPECT_FALSE(log.messages(QStringLiteral("zaf.publishing")).isEmpty());
    }
    {
        SCOPED_TRACE("missing file");
        UploadHarness h(1000);
        h.upload.setFilePath(h.scratch.file(QStringLiteral("absent.mp4")));
        EXPECT_EQ(failureCode(h), UploadFileError);
        EXPECT_TRUE(h.server.requests().isEmpty());
    }
    {
        SCOPED_TRACE("cancel");
        UploadHarness h(4 * kChunk);
        QObject::connect(&h.upload, &ResumableUpload::progress, &h.upload, [&h](qint64 sent, qint64) {
            if (sent >= kChunk)
                h.upload.cancel();
        });
        EXPECT_EQ(failureCode(h), UploadCancelledError);
    }
}

// A server that misleads the upload cannot keep it going or get the token elsewhere: a 308 that keeps
// none of a chunk (no Range, or a Range stuck before the chunk) is a failed attempt within the
// bounded retries, and a session address off the base's origin ends the upload before any PUT.
TEST(ResumableUpload, endsWhenTheServerStallsOrSendsTheSessionElsewhere)
{
    const struct {
        const char *name;
        qint64 stallAfter;
        QString sessionOrigin; // "PORT" stands for the server's port
        int code;
        int dataPuts;
    } cases[] = {
        {"308 without Range for ever", 0, {}, UploadTooManyRetriesError, 4},
        {"308 with a Range stuck after the first chunk", kChunk, {}, UploadTooManyRetriesError, 5},
        {"session on another host", -1, QStringLiteral("http://localhost:PORT"), UploadUntrustedSessionError, 0},
        {"session on another port", -1, QStringLiteral("http://127.0.0.1:1"), UploadUntrustedSessionError, 0},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.name);
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
}

// Header values at the edge of what a 64-bit number holds are read without overflow: a Retry-After
// of that many seconds waits the longest allowed wait, and a Range ending at the largest byte number
// is an unusable Range.
TEST(UploadAnswer, readsHeaderValuesAtTheEdgeOfANumberWithoutOverflow)
{
    using Action = UploadDecision::Action;
    const struct {
        const char *name;
        int status;
        QByteArray range, retryAfter;
        Action action;
        qint64 offsetOrCode;
        std::optional<std::chrono::milliseconds> retryAfterDelay;
    } cases[] = {
        {"Retry-After in seconds", 503, {}, "120", Action::Retry, 503, 120000ms},
        {"Retry-After past the largest wait", 503, {}, "9223372036854776", Action::Retry, 503, 600000ms},
        {"Range inside the file", 308, "bytes=0-499", {}, Action::SendFrom, 500, std::nullopt},
        {"Range at the largest byte number", 308, "bytes=0-9223372036854775807", {}, Action::Fail, UploadMalformedAnswerError, std::nullopt},
    };
    const QDateTime now = QDateTime::fromSecsSinceEpoch(1700000000, Qt::UTC);
    for (const auto &c : cases) {
        SCOPED_TRACE(c.name);
        UploadAnswer answer;
        answer.status = c.status;
        answer.range = c.range;
        answer.retryAfter = c.retryAfter;
        const UploadDecision decision = interpretUploadAnswer(answer, UploadState{UploadStep::SendChunk, 0, 1000, {}}, now);
        EXPECT_EQ(decision.action, c.action);
        EXPECT_EQ(c.action == Action::SendFrom ? decision.offset : qint64(decision.code), c.offsetOrCode);
        EXPECT_EQ(decision.retryAfter, c.retryAfterDelay);
    }
}

// The chunk device reads its slice of the file and rewinds, so the network stack can resend it.
TEST(UploadChunkDevice, readsItsSliceAndRewinds)
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

// The server closes itself after its lifetime, so a test that goes wrong cannot keep it busy.
TEST(UploadTestServer, stopsByItselfAfterItsLifetime)
{
    UploadTestServer server(10, 100ms);
    ASSERT_TRUE(server.listen());
    EXPECT_EQ(server.baseUrl().host(), QStringLiteral("127.0.0.1"));
    EXPECT_TRUE(zaf::test::waitUntil([&] { return server.stopped(); }, 5000));
}
