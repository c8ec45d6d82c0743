#include "publishing/plugin/upload/upload_answer.h"

#include "publishing/plugin/upload/resumable_upload.h"

#include <QJsonDocument>
#include <QJsonObject>
#include <QRegularExpression>

#include <algorithm>

namespace zaf::publishing {

namespace {

using std::chrono::milliseconds;
using Action = UploadDecision::Action;

// A Retry-After larger than this is a server asking us to give up, not to wait.
constexpr milliseconds kMaxRetryAfter{10 * 60 * 1000};

int defaultPort(const QString &scheme)
{
    return scheme.compare(QLatin1String("https"), Qt::CaseInsensitive) == 0 ? 443 : 80;
}

bool isRetryableStatus(int status)
{
    return status == 500 || status == 502 || status == 503 || status == 504;
}

// The error message of a failed answer: the service's {"error":{"message"}} or the body's text.
QString serverMessage(const QByteArray &body)
{
    const QJsonDocument document = QJsonDocument::fromJson(body);
    if (document.isObject()) {
        const QJsonValue error = document.object().value(QStringLiteral("error"));
        if (error.isObject()) {
            const QString message = error.toObject().value(QStringLiteral("message")).toString();
            if (!message.isEmpty())
                return message.left(kMaxServerMessageLength);
        } else if (error.isString()) {
            return error.toString().left(kMaxServerMessageLength);
        }
    }
    return QString::fromUtf8(body).simplified().left(kMaxServerMessageLength);
}

UploadDecision fail(int code, const QString &message)
{
    UploadDecision decision;
    decision.action = Action::Fail;
    decision.code = code;
    decision.message = message;
    return decision;
}

UploadDecision retry(const UploadAnswer &answer, int code, const QString &reason, const QDateTime &now)
{
    UploadDecision decision;
    decision.action = Action::Retry;
    decision.code = code;
    decision.message = reason;
    decision.retryAfter = parseRetryAfter(answer.retryAfter, now);
    return decision;
}

UploadDecision readInitiation(const UploadAnswer &answer, const UploadState &state, const QDateTime &now)
{
    const int status = answer.status;
    if (status == 200 || status == 201) {
        const QUrl location = QUrl(QString::fromUtf8(answer.location));
        if (!location.isValid() || location.isEmpty())
            return fail(UploadMalformedAnswerError, QStringLiteral("The upload was accepted without a session address"));
        const QUrl session = answer.requestUrl.resolved(location);
        if (!mayCarryAccessToken(session, state.baseUrl)) {
            // The session address would get the access token: only the service (or the configured
            // base) may have it.
            return fail(UploadUntrustedSessionError,
                        QStringLiteral("The upload session address %1 is not on the service's host; nothing was sent there")
                            .arg(session.toString(QUrl::RemoveUserInfo | QUrl::RemoveQuery).left(kMaxServerMessageLength)));
        }
        UploadDecision decision;
        decision.action = Action::BeginSession;
        decision.sessionUrl = session;
        return decision;
    }
    if (isRetryableStatus(status))
        return retry(answer, status, QStringLiteral("HTTP %1 %2").arg(status).arg(serverMessage(answer.body)), now);
    return fail(status, QStringLiteral("The upload was refused with HTTP %1: %2").arg(status).arg(serverMessage(answer.body)));
}

// The video resource of a finished upload: its id makes the watch URL.
UploadDecision readVideoResource(const QByteArray &body)
{
    const QJsonDocument document = QJsonDocument::fromJson(body);
    const QString id = document.isObject() ? document.object().value(QStringLiteral("id")).toString() : QString();
    static const QRegularExpression idPattern(QStringLiteral("^[A-Za-z0-9_-]{1,64}$"));
    if (!idPattern.match(id).hasMatch())
        return fail(UploadMalformedAnswerError, QStringLiteral("The server finished the upload without a usable video id"));
    UploadDecision decision;
    decision.action = Action::Succeed;
    decision.videoId = id;
    return decision;
}

// A 308: how far the server got ("Range: bytes=0-N", resume at N+1; no Range means from 0).
UploadDecision readProgress(const UploadAnswer &answer, const UploadState &state, const QDateTime &now)
{
    const QByteArray range = answer.range.trimmed();
    qint64 next = 0;
    if (!range.isEmpty()) {
        static const QRegularExpression pattern(QStringLiteral("^bytes=0-(\\d+)$"));
        const QRegularExpressionMatch match = pattern.match(QString::fromLatin1(range));
        bool ok = match.hasMatch();
        const qint64 last = ok ? match.captured(1).toLongLong(&ok) : -1;
        // Compared as `last >= total`: `last + 1` overflows for the largest number a Range can hold.
        if (!ok || last >= state.total) {
            return fail(UploadMalformedAnswerError, QStringLiteral("The server answered with an unusable Range \"%1\" for %2 bytes")
                                                        .arg(QString::fromLatin1(range.left(100)))
                                                        .arg(state.total));
        }
        if (last + 1 == state.total) {
            // Every byte arrived, yet the server neither created the video nor reported an error.
            return fail(UploadMalformedAnswerError, QStringLiteral("The server holds every byte but did not create the video"));
        }
        next = last + 1;
    }
    if (state.step == UploadStep::SendChunk && next <= state.offset) {
        // The server took a chunk and kept none of it (no Range, or a Range that does not pass the
        // chunk's start). Sending it again at once could go on for ever: this is a failed attempt,
        // retried after a wait like a lost connection, within the same bound.
        return retry(answer, 0, QStringLiteral("HTTP 308 without progress (Range \"%1\" for a chunk at %2)")
                                    .arg(QString::fromLatin1(answer.range.left(100))).arg(state.offset), now);
    }
    UploadDecision decision;
    decision.action = Action::SendFrom;
    decision.offset = next;
    return decision;
}

UploadDecision readUploadAnswer(const UploadAnswer &answer, const UploadState &state, const QDateTime &now)
{
    const int status = answer.status;
    if (status == 200 || status == 201)
        return readVideoResource(answer.body);
    if (status == 308)
        return readProgress(answer, state, now);
    if (status == 404 || status == 410) {
        UploadDecision decision;
        decision.action = Action::Restart;
        decision.message = QStringLiteral("HTTP %1 %2").arg(status).arg(serverMessage(answer.body));
        return decision;
    }
    if (isRetryableStatus(status))
        return retry(answer, status, QStringLiteral("HTTP %1 %2").arg(status).arg(serverMessage(answer.body)), now);
    return fail(status, QStringLiteral("The upload failed with HTTP %1: %2").arg(status).arg(serverMessage(answer.body)));
}

} // namespace

UploadDecision interpretUploadAnswer(const UploadAnswer &answer, const UploadState &state, const QDateTime &now)
{
    if (state.step == UploadStep::Initiate)
        return readInitiation(answer, state, now);
    return readUploadAnswer(answer, state, now);
}

std::optional<milliseconds> parseRetryAfter(const QByteArray &raw, const QDateTime &now)
{
    const QByteArray value = raw.trimmed();
    if (value.isEmpty())
        return std::nullopt;
    bool ok = false;
    const qint64 seconds = value.toLongLong(&ok);
    // Capped in seconds, before the conversion could overflow.
    if (ok && seconds >= 0)
        return milliseconds(std::min<qint64>(seconds, kMaxRetryAfter.count() / 1000) * 1000);
    const QDateTime when = QDateTime::fromString(QString::fromLatin1(value), Qt::RFC2822Date);
    if (when.isValid()) {
        const qint64 delta = now.msecsTo(when);
        return std::clamp(milliseconds(delta), milliseconds(0), kMaxRetryAfter);
    }
    return std::nullopt;
}

bool mayCarryAccessToken(const QUrl &url, const QUrl &baseUrl)
{
    if (!url.isValid() || !url.userName().isEmpty())
        return false;
    const auto sameOrigin = [&url](const QUrl &origin) {
        return url.scheme().compare(origin.scheme(), Qt::CaseInsensitive) == 0
            && url.host().compare(origin.host(), Qt::CaseInsensitive) == 0
            && url.port(defaultPort(url.scheme())) == origin.port(defaultPort(origin.scheme()));
    };
    return sameOrigin(QUrl(QStringLiteral("https://") + QLatin1String(kServiceApiHost))) || sameOrigin(baseUrl);
}

} // namespace zaf::publishing
