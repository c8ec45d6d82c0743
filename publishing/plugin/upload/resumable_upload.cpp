#include "publishing/plugin/upload/resumable_upload.h"

#include "platform/dispatch.h"
#include "platform/log.h"
#include "publishing/plugin/upload/upload_answer.h"
#include "publishing/plugin/upload/upload_chunk_device.h"

#include <QDateTime>
#include <QFileInfo>
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
    return mayCarryAccessToken(url, m_baseUrl);
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
    send(UploadStep::Initiate, m_network->post(request, m_body));
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
    send(UploadStep::SendChunk, reply);
}

void ResumableUpload::queryStatus()
{
    QNetworkRequest request = authorisedRequest(m_sessionUrl);
    request.setHeader(QNetworkRequest::ContentLengthHeader, 0);
    request.setRawHeader("Content-Range", "bytes */" + QByteArray::number(m_total));
    send(UploadStep::QueryStatus, m_network->put(request, QByteArray()));
}

void ResumableUpload::send(UploadStep step, QNetworkReply *reply)
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
        retryLater(0, QStringLiteral("no answer (%1: %2)").arg(QString::fromLatin1(name ? name : "?"), reply->errorString()),
                   parseRetryAfter(reply->rawHeader("Retry-After"), QDateTime::currentDateTimeUtc()));
        return;
    }
    UploadAnswer answer;
    answer.status = statusAttribute.toInt();
    answer.requestUrl = reply->url();
    answer.location = reply->rawHeader("Location");
    answer.range = reply->rawHeader("Range");
    answer.retryAfter = reply->rawHeader("Retry-After");
    answer.body = reply->readAll();
    const UploadState state{m_step, m_offset, m_total, m_baseUrl};
    apply(interpretUploadAnswer(answer, state, QDateTime::currentDateTimeUtc()));
}

void ResumableUpload::apply(const UploadDecision &decision)
{
    using Action = UploadDecision::Action;
    switch (decision.action) {
    case Action::BeginSession:
        m_sessionUrl = decision.sessionUrl;
        m_offset = 0;
        m_retries = 0;
        zaf::log::info(lcPublishing(), QStringLiteral("Upload session %1").arg(m_sessionUrl.toString()));
        sendChunk();
        return;
    case Action::SendFrom: {
        const qint64 before = m_offset;
        m_offset = decision.offset;
        // Bytes that move us forward end a run of failures.
        if (m_offset > before)
            m_retries = 0;
        Q_EMIT progress(m_offset, m_total);
        sendChunk();
        return;
    }
    case Action::Succeed:
        succeed(decision.videoId);
        return;
    case Action::Retry:
        retryLater(decision.code, decision.message, decision.retryAfter);
        return;
    case Action::Restart:
        restartSession(decision.message);
        return;
    case Action::Fail:
        fail(decision.code, decision.message);
        return;
    }
}

void ResumableUpload::retryLater(int status, const QString &reason, std::optional<milliseconds> advertised)
{
    if (m_retries >= m_maxRetries) {
        fail(status > 0 ? status : UploadTooManyRetriesError,
             QStringLiteral("The upload gave up after %1 retries: %2").arg(m_retries).arg(reason));
        return;
    }
    milliseconds wait = m_initialBackoff * (qint64(1) << std::min(m_retries, 20));
    wait = std::min(wait, m_maxBackoff);
    if (advertised)
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
        zaf::dispatch::onThreadOf(self, [self, generation, step] {
            if (self && self->m_running && self->m_generation == generation)
                (self->*step)();
        });
    });
}

void ResumableUpload::succeed(const QString &id)
{
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
