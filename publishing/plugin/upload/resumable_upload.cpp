#include "publishing/plugin/upload/resumable_upload.h"

#include "platform/log.h"
#include "publishing/plugin/upload/upload_chunk_device.h"

#include <QDateTime>
#include <QFileInfo>
#include <QJsonDocument>
#include <QJsonObject>
#include <QLoggingCategory>
#include <QMetaEnum>
#include <QNetworkAccessManager>
#include <QNetworkReply>
#include <QNetworkRequest>
#include <QRegularExpression>
#include <QTimer>
#include <QUrlQuery>

Q_LOGGING_CATEGORY(lcPublishing, "zaf.publishing")

namespace zaf::publishing {

namespace {

using std::chrono::milliseconds;

constexpr const char *kUploadContentType = "video/mp4";
constexpr const char *kWatchUrlPrefix = "https://www.youtube.com/watch?v=";
// A Retry-After larger than this is a server asking us to give up, not to wait.
constexpr milliseconds kMaxRetryAfter{10 * 60 * 1000};
// Server messages end up in logs and dialogs; keep them readable.
constexpr int kMaxServerMessageLength = 500;

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

// Retry-After as a delay: delta seconds or an HTTP date; nullopt when absent or unreadable.
std::optional<milliseconds> retryAfter(QNetworkReply *reply)
{
    const QByteArray value = reply->rawHeader("Retry-After").trimmed();
    if (value.isEmpty())
        return std::nullopt;
    bool ok = false;
    const qint64 seconds = value.toLongLong(&ok);
    if (ok && seconds >= 0)
        return std::min(milliseconds(seconds * 1000), kMaxRetryAfter);
    const QDateTime when = QDateTime::fromString(QString::fromLatin1(value), Qt::RFC2822Date);
    if (when.isValid()) {
        const qint64 delta = QDateTime::currentDateTimeUtc().msecsTo(when);
        return std::clamp(milliseconds(delta), milliseconds(0), kMaxRetryAfter);
    }
    return std::nullopt;
}

} // namespace

ResumableUpload::ResumableUpload(QNetworkAccessManager *network, QObject *parent)
    : QObject(parent), m_network(network)
{
    setDelayFunction({});
}

ResumableUpload::~ResumableUpload()
{
    if (m_reply) {
        m_reply->disconnect(this);
        m_reply->abort();
        m_reply->deleteLater();
    }
}

void ResumableUpload::setDelayFunction(DelayFunction delay)
{
    if (delay) {
        m_delay = std::move(delay);
        return;
    }
    m_delay = [this](milliseconds wait, std::function<void()> resume) {
        QTimer::singleShot(wait, this, std::move(resume));
    };
}

void ResumableUpload::setBackoff(milliseconds initial, milliseconds cap, int maxRetries)
{
    m_initialBackoff = initial;
    m_maxBackoff = std::max(cap, initial);
    m_maxRetries = maxRetries;
}

void ResumableUpload::start()
{
    if (m_running)
        return;
    m_running = true;
    ++m_generation;
    m_retries = 0;
    m_restarts = 0;
    m_offset = 0;
    m_sessionUrl.clear();

    const Result<VideoMetadata> metadata = m_metadata.normalised();
    if (!metadata.ok()) {
        fail(UploadInvalidMetadataError, metadata.error->message);
        return;
    }
    m_body = metadata.value->toJson();

    const QFileInfo file(m_filePath);
    if (!file.isFile() || !file.isReadable()) {
        fail(UploadFileError, QStringLiteral("The movie %1 cannot be read").arg(m_filePath));
        return;
    }
    m_total = file.size();
    if (m_total <= 0) {
        fail(UploadFileError, QStringLiteral("The movie %1 is empty").arg(m_filePath));
        return;
    }
    zaf::log::info(lcPublishing(), QStringLiteral("Uploading %1 (%2 bytes)").arg(m_filePath).arg(m_total));
    initiate();
}

void ResumableUpload::cancel()
{
    if (!m_running)
        return;
    fail(UploadCancelledError, QStringLiteral("The upload was cancelled"));
}

bool ResumableUpload::mayCarryToken(const QUrl &url) const
{
    if (!url.isValid() || !url.userName().isEmpty())
        return false;
    const auto sameOrigin = [&url](const QUrl &origin) {
        return url.scheme().compare(origin.scheme(), Qt::CaseInsensitive) == 0
            && url.host().compare(origin.host(), Qt::CaseInsensitive) == 0
            && url.port(defaultPort(url.scheme())) == origin.port(defaultPort(origin.scheme()));
    };
    return sameOrigin(QUrl(QStringLiteral("https://") + QLatin1String(kServiceApiHost))) || sameOrigin(m_baseUrl);
}

QNetworkRequest ResumableUpload::authorisedRequest(const QUrl &url) const
{
    QNetworkRequest request(url);
    // Checked again here so that no path can hand the token to another host.
    if (mayCarryToken(url))
        request.setRawHeader("Authorization", "Bearer " + m_accessToken.toUtf8());
    request.setTransferTimeout(int(m_transferTimeout.count()));
    // A session URI is never followed elsewhere: the answer is read as it comes.
    request.setAttribute(QNetworkRequest::RedirectPolicyAttribute, QNetworkRequest::ManualRedirectPolicy);
    return request;
}

void ResumableUpload::initiate()
{
    QUrl url = m_baseUrl;
    url.setPath(url.path().remove(QRegularExpression(QStringLiteral("/+$")))
                + QStringLiteral("/upload/youtube/v3/videos"));
    QUrlQuery query;
    query.addQueryItem(QStringLiteral("uploadType"), QStringLiteral("resumable"));
    query.addQueryItem(QStringLiteral("part"), QStringLiteral("snippet,status"));
    url.setQuery(query);

    QNetworkRequest request = authorisedRequest(url);
    request.setHeader(QNetworkRequest::ContentTypeHeader, QByteArrayLiteral("application/json; charset=UTF-8"));
    request.setRawHeader("X-Upload-Content-Length", QByteArray::number(m_total));
    request.setRawHeader("X-Upload-Content-Type", kUploadContentType);
    send(Step::Initiate, m_network->post(request, m_body));
}

void ResumableUpload::sendChunk()
{
    const qint64 length = qMin(m_chunkSize, m_total - m_offset);
    auto *device = new UploadChunkDevice(m_filePath, m_offset, length);
    if (!device->openChunk()) {
        const QString reason = device->errorString();
        delete device;
        fail(UploadFileError, QStringLiteral("The movie cannot be read: %1").arg(reason));
        return;
    }
    QNetworkRequest request = authorisedRequest(m_sessionUrl);
    request.setHeader(QNetworkRequest::ContentTypeHeader, QByteArray(kUploadContentType));
    request.setHeader(QNetworkRequest::ContentLengthHeader, length);
    request.setRawHeader("Content-Range", QStringLiteral("bytes %1-%2/%3")
                                               .arg(m_offset).arg(m_offset + length - 1).arg(m_total).toLatin1());
    // Stream the chunk from the file instead of copying it into a buffer first.
    request.setAttribute(QNetworkRequest::DoNotBufferUploadDataAttribute, true);
    QNetworkReply *reply = m_network->put(request, device);
    device->setParent(reply);
    const qint64 base = m_offset;
    connect(reply, &QNetworkReply::uploadProgress, this, [this, reply, base, length](qint64 sent, qint64 total) {
        // The network stack also reports (0, 0) while it winds a request down: not progress.
        if (reply != m_reply || sent <= 0 || total <= 0)
            return;
        Q_EMIT progress(base + qMin(sent, length), m_total);
    });
    send(Step::SendChunk, reply);
}

void ResumableUpload::queryStatus()
{
    QNetworkRequest request = authorisedRequest(m_sessionUrl);
    request.setHeader(QNetworkRequest::ContentLengthHeader, 0);
    request.setRawHeader("Content-Range", "bytes */" + QByteArray::number(m_total));
    send(Step::QueryStatus, m_network->put(request, QByteArray()));
}

void ResumableUpload::send(Step step, QNetworkReply *reply)
{
    m_step = step;
    m_reply = reply;
    connect(reply, &QNetworkReply::finished, this, [this, reply] { handleReply(reply); });
}

void ResumableUpload::handleReply(QNetworkReply *reply)
{
    reply->deleteLater();
    if (reply != m_reply || !m_running)
        return;
    m_reply = nullptr;

    const QVariant statusAttribute = reply->attribute(QNetworkRequest::HttpStatusCodeAttribute);
    if (!statusAttribute.isValid()) {
        // No answer at all: the connection was lost, refused or timed out.
        const char *name = QMetaEnum::fromType<QNetworkReply::NetworkError>().valueToKey(reply->error());
        retryLater(reply, 0, QStringLiteral("no answer (%1: %2)")
                                 .arg(QString::fromLatin1(name ? name : "?"), reply->errorString()));
        return;
    }
    const int status = statusAttribute.toInt();
    if (m_step == Step::Initiate)
        handleInitiation(reply, status);
    else
        handleUploadAnswer(reply, status);
}

void ResumableUpload::handleInitiation(QNetworkReply *reply, int status)
{
    const QByteArray body = reply->readAll();
    if (status == 200 || status == 201) {
        const QUrl location = QUrl(QString::fromUtf8(reply->rawHeader("Location")));
        if (!location.isValid() || location.isEmpty()) {
            fail(UploadMalformedAnswerError, QStringLiteral("The upload was accepted without a session address"));
            return;
        }
        const QUrl session = reply->url().resolved(location);
        if (!mayCarryToken(session)) {
            // The session address would get the access token: only the service (or the configured
            // base) may have it.
            fail(UploadUntrustedSessionError,
                 QStringLiteral("The upload session address %1 is not on the service's host; nothing was sent there")
                     .arg(session.toString(QUrl::RemoveUserInfo | QUrl::RemoveQuery).left(kMaxServerMessageLength)));
            return;
        }
        m_sessionUrl = session;
        m_offset = 0;
        m_retries = 0;
        zaf::log::info(lcPublishing(), QStringLiteral("Upload session %1").arg(m_sessionUrl.toString()));
        sendChunk();
        return;
    }
    if (isRetryableStatus(status)) {
        retryLater(reply, status, QStringLiteral("HTTP %1 %2").arg(status).arg(serverMessage(body)));
        return;
    }
    fail(status, QStringLiteral("The upload was refused with HTTP %1: %2").arg(status).arg(serverMessage(body)));
}

void ResumableUpload::handleUploadAnswer(QNetworkReply *reply, int status)
{
    const QByteArray body = reply->readAll();
    if (status == 200 || status == 201) {
        succeed(body);
        return;
    }
    if (status == 308) {
        const qint64 before = m_offset;
        const QByteArray range = reply->rawHeader("Range").left(100);
        if (!resumeFromRange(reply))
            return;
        if (m_step == Step::SendChunk && m_offset <= before) {
            // The server took a chunk and kept none of it (no Range, or a Range that does not pass the
            // chunk's start). Sending it again at once could go on for ever: this is a failed attempt,
            // retried after a wait like a lost connection, within the same bound.
            m_offset = before;
            retryLater(reply, 0, QStringLiteral("HTTP 308 without progress (Range \"%1\" for a chunk at %2)")
                                     .arg(QString::fromLatin1(range)).arg(before));
            return;
        }
        // Bytes that move us forward end a run of failures.
        if (m_offset > before)
            m_retries = 0;
        Q_EMIT progress(m_offset, m_total);
        sendChunk();
        return;
    }
    if (status == 404 || status == 410) {
        restartSession(QStringLiteral("HTTP %1 %2").arg(status).arg(serverMessage(body)));
        return;
    }
    if (isRetryableStatus(status)) {
        retryLater(reply, status, QStringLiteral("HTTP %1 %2").arg(status).arg(serverMessage(body)));
        return;
    }
    fail(status, QStringLiteral("The upload failed with HTTP %1: %2").arg(status).arg(serverMessage(body)));
}

bool ResumableUpload::resumeFromRange(QNetworkReply *reply)
{
    const QByteArray range = reply->rawHeader("Range").trimmed();
    if (range.isEmpty()) {
        m_offset = 0;
        return true;
    }
    static const QRegularExpression pattern(QStringLiteral("^bytes=0-(\\d+)$"));
    const QRegularExpressionMatch match = pattern.match(QString::fromLatin1(range));
    bool ok = match.hasMatch();
    const qint64 last = ok ? match.captured(1).toLongLong(&ok) : -1;
    if (!ok || last + 1 > m_total) {
        fail(UploadMalformedAnswerError,
             QStringLiteral("The server answered with an unusable Range \"%1\" for %2 bytes")
                 .arg(QString::fromLatin1(range.left(100)))
                 .arg(m_total));
        return false;
    }
    if (last + 1 == m_total) {
        // Every byte arrived, yet the server neither created the video nor reported an error.
        fail(UploadMalformedAnswerError, QStringLiteral("The server holds every byte but did not create the video"));
        return false;
    }
    m_offset = last + 1;
    return true;
}

void ResumableUpload::retryLater(QNetworkReply *reply, int status, const QString &reason)
{
    if (m_retries >= m_maxRetries) {
        fail(status > 0 ? status : UploadTooManyRetriesError,
             QStringLiteral("The upload gave up after %1 retries: %2").arg(m_retries).arg(reason));
        return;
    }
    milliseconds wait = m_initialBackoff * (qint64(1) << std::min(m_retries, 20));
    wait = std::min(wait, m_maxBackoff);
    if (const std::optional<milliseconds> advertised = retryAfter(reply))
        wait = *advertised;
    ++m_retries;
    zaf::log::notice(lcPublishing(), QStringLiteral("Upload interrupted: %1; retry %2 of %3 in %4 ms")
                                         .arg(reason).arg(m_retries).arg(m_maxRetries).arg(wait.count()));
    // Without a session there is nothing to ask about: initiate again.
    scheduleAfter(wait, m_sessionUrl.isEmpty() ? &ResumableUpload::initiate : &ResumableUpload::queryStatus);
}

void ResumableUpload::restartSession(const QString &reason)
{
    if (m_restarts >= m_maxRestarts) {
        fail(UploadTooManyRestartsError,
             QStringLiteral("The upload session vanished %1 times; last answer: %2").arg(m_restarts + 1).arg(reason));
        return;
    }
    ++m_restarts;
    zaf::log::notice(lcPublishing(), QStringLiteral("Upload session %1 is gone (%2); starting again")
                                         .arg(m_sessionUrl.toString(), reason));
    m_sessionUrl.clear();
    m_offset = 0;
    m_retries = 0;
    Q_EMIT progress(0, m_total);
    initiate();
}

void ResumableUpload::scheduleAfter(milliseconds delay, void (ResumableUpload::*step)())
{
    const quint64 generation = m_generation;
    QPointer<ResumableUpload> self(this);
    m_delay(delay, [self, generation, step] {
        // Deliver on our thread, and only to the upload that asked.
        if (!self)
            return;
        QMetaObject::invokeMethod(self, [self, generation, step] {
            if (self && self->m_running && self->m_generation == generation)
                (self->*step)();
        }, Qt::QueuedConnection);
    });
}

void ResumableUpload::succeed(const QByteArray &body)
{
    const QJsonDocument document = QJsonDocument::fromJson(body);
    const QString id = document.isObject() ? document.object().value(QStringLiteral("id")).toString() : QString();
    static const QRegularExpression idPattern(QStringLiteral("^[A-Za-z0-9_-]{1,64}$"));
    if (!idPattern.match(id).hasMatch()) {
        fail(UploadMalformedAnswerError, QStringLiteral("The server finished the upload without a usable video id"));
        return;
    }
    UploadResult result;
    result.videoId = id;
    result.watchUrl = QUrl(QString::fromLatin1(kWatchUrlPrefix) + id);
    m_running = false;
    ++m_generation;
    zaf::log::info(lcPublishing(), QStringLiteral("Uploaded %1 as %2").arg(m_filePath, result.watchUrl.toString()));
    Q_EMIT progress(m_total, m_total);
    Q_EMIT finished(result);
}

void ResumableUpload::fail(int code, const QString &message)
{
    if (m_reply) {
        QNetworkReply *reply = m_reply;
        m_reply = nullptr;
        reply->disconnect(this);
        reply->abort();
        reply->deleteLater();
    }
    m_running = false;
    ++m_generation;
    UploadResult result;
    result.error = Error{QString::fromLatin1(kUploadErrorDomain), code, message};
    zaf::log::error(lcPublishing(), QStringLiteral("Upload of %1 failed: %2").arg(m_filePath, result.error->description()));
    Q_EMIT finished(result);
}

} // namespace zaf::publishing
