// The video service's answers to the resumable upload: status, Location, Range, Retry-After and
// body, read for each of the upload's requests.
//
// Input, as text: a first line "STEP OFFSET TOTAL" (STEP: initiate, chunk or status) giving where
// the upload stands, then an HTTP response head ("HTTP/1.1 308 ...", header lines, an empty line)
// and the body. What cannot be read in the first line or the status line is taken as 0.

#include "fuzz_support.h"

#include "publishing/plugin/upload/upload_answer.h"

#include <QList>
#include <QRegularExpression>

#include <cstddef>
#include <cstdint>

namespace up = zaf::publishing;
using Action = up::UploadDecision::Action;

namespace {

const QUrl kBaseUrl(QStringLiteral("http://127.0.0.1:8080"));
const QUrl kSessionUrl(QStringLiteral("https://www.googleapis.com/upload/youtube/v3/videos?uploadType=resumable&upload_id=fuzz"));
const QUrl kInitiateUrl(QStringLiteral("http://127.0.0.1:8080/upload/youtube/v3/videos?uploadType=resumable&part=snippet,status"));
const QDateTime kNow = QDateTime::fromSecsSinceEpoch(1700000000, Qt::UTC);

// Splits off the text up to the next line end (LF, optionally after CR).
QByteArray takeLine(QByteArray &rest)
{
    const qsizetype end = rest.indexOf('\n');
    QByteArray line = end < 0 ? rest : rest.left(end);
    rest = end < 0 ? QByteArray() : rest.mid(end + 1);
    if (line.endsWith('\r'))
        line.chop(1);
    return line;
}

void check(const up::UploadDecision &decision, const up::UploadState &state)
{
    switch (decision.action) {
    case Action::BeginSession:
        ZAF_FUZZ_CHECK(state.step == up::UploadStep::Initiate);
        // The token goes only where it may.
        ZAF_FUZZ_CHECK(up::mayCarryAccessToken(decision.sessionUrl, state.baseUrl));
        break;
    case Action::SendFrom:
        ZAF_FUZZ_CHECK(state.step != up::UploadStep::Initiate);
        ZAF_FUZZ_CHECK(decision.offset >= 0 && decision.offset < state.total);
        // A chunk's answer moves forward or is a failed attempt, never a loop in place.
        ZAF_FUZZ_CHECK(state.step != up::UploadStep::SendChunk || decision.offset > state.offset);
        break;
    case Action::Succeed: {
        static const QRegularExpression idPattern(QStringLiteral("^[A-Za-z0-9_-]{1,64}$"));
        ZAF_FUZZ_CHECK(idPattern.match(decision.videoId).hasMatch());
        break;
    }
    case Action::Retry:
    case Action::Restart:
    case Action::Fail:
        ZAF_FUZZ_CHECK(!decision.message.isEmpty());
        break;
    }
    if (decision.retryAfter) {
        ZAF_FUZZ_CHECK(decision.retryAfter->count() >= 0);
        ZAF_FUZZ_CHECK(decision.retryAfter->count() <= 10 * 60 * 1000);
    }
}

} // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***)
{
    zaf::fuzz::setUpOnce();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    QByteArray rest(reinterpret_cast<const char *>(data), qsizetype(size));

    const QList<QByteArray> where = takeLine(rest).split(' ');
    up::UploadState state;
    state.baseUrl = kBaseUrl;
    const QByteArray step = where.value(0);
    state.step = step == "chunk" ? up::UploadStep::SendChunk : step == "status" ? up::UploadStep::QueryStatus : up::UploadStep::Initiate;
    state.total = where.value(2).toLongLong();
    if (state.total <= 0)
        state.total = 1000;
    state.offset = qBound<qint64>(0, where.value(1).toLongLong(), state.total - 1);

    up::UploadAnswer answer;
    answer.requestUrl = state.step == up::UploadStep::Initiate ? kInitiateUrl : kSessionUrl;
    const QList<QByteArray> statusLine = takeLine(rest).split(' ');
    answer.status = statusLine.value(1).toInt();
    while (!rest.isEmpty()) {
        const QByteArray line = takeLine(rest);
        if (line.isEmpty())
            break;
        const qsizetype colon = line.indexOf(':');
        if (colon < 0)
            continue;
        const QByteArray name = line.left(colon).trimmed().toLower();
        const QByteArray value = line.mid(colon + 1);
        if (name == "location")
            answer.location = value.trimmed();
        else if (name == "range")
            answer.range = value;
        else if (name == "retry-after")
            answer.retryAfter = value;
    }
    answer.body = rest;

    check(up::interpretUploadAnswer(answer, state, kNow), state);
    up::parseRetryAfter(answer.retryAfter, kNow);
    return 0;
}
