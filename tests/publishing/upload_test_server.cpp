#include "tests/publishing/upload_test_server.h"

#include <QHostAddress>
#include <QJsonDocument>
#include <QJsonObject>
#include <QTcpSocket>
#include <QUrlQuery>

#include <algorithm>

namespace zaf::test {

namespace {

const QString kUploadPath = QStringLiteral("/upload/youtube/v3/videos");
constexpr char kTokenPath[] = "/token";

// The metadata problem the service would report, empty when the body is acceptable.
QString metadataProblem(const QByteArray &body, const QSet<QString> &categories)
{
    const QJsonObject document = QJsonDocument::fromJson(body).object();
    const QString title = document.value(QStringLiteral("snippet")).toObject().value(QStringLiteral("title")).toString();
    if (title.isEmpty() || title.size() > 100 || title.contains(QLatin1Char('<')) || title.contains(QLatin1Char('>')))
        return QStringLiteral("The request metadata has an invalid video title.");
    const QString category = document.value(QStringLiteral("snippet")).toObject().value(QStringLiteral("categoryId")).toString();
    if (category.isEmpty() || (!categories.isEmpty() && !categories.contains(category)))
        return QStringLiteral("The request metadata has an invalid video category.");
    const QString privacy = document.value(QStringLiteral("status")).toObject().value(QStringLiteral("privacyStatus")).toString();
    if (!QStringList{QStringLiteral("public"), QStringLiteral("unlisted"), QStringLiteral("private")}.contains(privacy))
        return QStringLiteral("The request metadata has an invalid privacy status.");
    return {};
}

// FIRST and LAST of "bytes FIRST-LAST/TOTAL".
qint64 rangeStart(const QByteArray &range)
{
    return range.mid(6, range.indexOf('-') - 6).toLongLong();
}
qint64 rangeEnd(const QByteArray &range)
{
    return range.mid(range.indexOf('-') + 1, range.indexOf('/') - range.indexOf('-') - 1).toLongLong();
}

} // namespace

UploadTestServer::UploadTestServer(int maxRequests, std::chrono::milliseconds lifetime, QObject *parent)
    : QObject(parent), m_maxRequests(maxRequests)
{
    // Only loopback peers can connect: the server listens on 127.0.0.1.
    connect(&m_server, &QTcpServer::newConnection, this, [this] {
        while (QTcpSocket *socket = m_server.nextPendingConnection()) {
            m_connections.insert(socket, Connection{});
            connect(socket, &QTcpSocket::readyRead, this, [this, socket] { readFrom(socket); });
            connect(socket, &QTcpSocket::disconnected, this, [this, socket] {
                m_connections.remove(socket);
                socket->deleteLater();
            });
        }
    });
    m_lifetime.setSingleShot(true);
    m_lifetime.setInterval(lifetime);
    connect(&m_lifetime, &QTimer::timeout, this, &UploadTestServer::shutDown);
}

UploadTestServer::~UploadTestServer()
{
    shutDown();
}

bool UploadTestServer::listen()
{
    if (!m_server.listen(QHostAddress::LocalHost, 0))
        return false;
    m_lifetime.start();
    return true;
}

QUrl UploadTestServer::baseUrl() const
{
    return QUrl(QStringLiteral("http://127.0.0.1:%1").arg(m_server.serverPort()));
}

int UploadTestServer::count(const QString &method, bool statusQueries) const
{
    return int(std::count_if(m_requests.begin(), m_requests.end(), [&](const Request &request) {
        return request.method == method && request.contentRange.startsWith("bytes */") == statusQueries;
    }));
}

void UploadTestServer::shutDown()
{
    m_lifetime.stop();
    m_server.close();
    for (QTcpSocket *socket : m_connections.keys()) {
        socket->disconnect(this);
        socket->abort();
        socket->deleteLater();
    }
    m_connections.clear();
}

std::optional<UploadTestServer::Fault> UploadTestServer::takeFault(FaultKind kind)
{
    const auto it = std::find_if(m_faults.begin(), m_faults.end(), [kind](const Fault &f) { return f.kind == kind; });
    if (it == m_faults.end())
        return std::nullopt;
    const Fault fault = *it;
    m_faults.erase(it);
    return fault;
}

void UploadTestServer::readFrom(QTcpSocket *socket)
{
    const auto it = m_connections.find(socket);
    if (it == m_connections.end())
        return;
    Connection &c = it.value();
    c.buffer.append(socket->readAll());
    if (!c.headersDone) {
        const qsizetype end = c.buffer.indexOf("\r\n\r\n");
        if (end < 0)
            return;
        const QList<QByteArray> lines = c.buffer.left(end).split('\n');
        c.buffer.remove(0, end + 4);
        c.headersDone = true;
        const QList<QByteArray> requestLine = lines.value(0).trimmed().split(' ');
        c.method = QString::fromLatin1(requestLine.value(0));
        c.target = QUrl(QString::fromLatin1(requestLine.value(1)));
        for (const QByteArray &line : lines.mid(1)) {
            if (const qsizetype colon = line.indexOf(':'); colon > 0)
                c.headers.insert(line.left(colon).trimmed().toLower(), line.mid(colon + 1).trimmed());
        }
        c.contentLength = c.headers.value("content-length", "0").toLongLong();
        const QByteArray range = c.headers.value("content-range");
        m_requests.append(Request{c.method, c.target.toString(), range, c.contentLength});
        if (m_requests.size() > m_maxRequests)
            return respondError(socket, 403, QStringLiteral("The test server answers no more requests"));
        if (c.method == QLatin1String("PUT") && range.startsWith("bytes */")) {
            m_lastDataRange.clear();
            m_resendDrop.reset();
        } else if (c.method == QLatin1String("PUT") && range.startsWith("bytes ")) {
            const QByteArray sessionRange = c.target.toEncoded() + ' ' + range;
            const bool resent = sessionRange == m_lastDataRange;
            m_requests.last().resent = resent;
            m_lastDataRange = sessionRange;
            if (!resent)
                m_resendDrop.reset();
            if (resent && m_resendDrop) {
                c.dropAfter = m_resendDrop->bytes;
            } else if (const auto fault = takeFault(FaultKind::DropBody)) {
                c.dropAfter = fault->bytes;
                m_resendDrop = fault;
            } else if (const auto once = takeFault(FaultKind::DropBodyOnce)) {
                c.dropAfter = once->bytes;
            }
        }
    }
    if (c.dropAfter >= 0 && c.dropAfter < c.contentLength && c.buffer.size() >= c.dropAfter) {
        // Keep what arrived before the break, as the service does, and vanish without an answer.
        const auto session = m_sessions.find(QUrlQuery(c.target).queryItemValue(QStringLiteral("upload_id")));
        if (session != m_sessions.end() && rangeStart(c.headers.value("content-range")) == session->bytes.size())
            session->bytes.append(c.buffer.left(c.dropAfter));
        socket->abort(); // emits disconnected: `c` is gone after this line
        return;
    }
    if (c.buffer.size() < c.contentLength)
        return;
    if (c.target.path() == QLatin1String(kTokenPath) && c.method == QLatin1String("POST"))
        handleTokenRequest(socket, c.buffer.left(c.contentLength));
    else if (c.headers.value("authorization") != "Bearer " + m_token)
        respondError(socket, 401, QStringLiteral("Invalid Credentials"));
    else if (c.target.path() == kUploadPath && c.method == QLatin1String("POST"))
        handleInitiation(socket, c, c.buffer.left(c.contentLength));
    else if (c.target.path() == kUploadPath && c.method == QLatin1String("PUT"))
        handlePut(socket, c, c.buffer.left(c.contentLength));
    else
        respondError(socket, 404, QStringLiteral("No such resource"));
}

QUrl UploadTestServer::tokenUrl() const
{
    QUrl url = baseUrl();
    url.setPath(QLatin1String(kTokenPath));
    return url;
}

void UploadTestServer::handleTokenRequest(QTcpSocket *socket, const QByteArray &body)
{
    const QUrlQuery form(QString::fromUtf8(body));
    const bool refreshes = form.queryItemValue(QStringLiteral("grant_type")) == QLatin1String("refresh_token")
                           && !m_refreshToken.isEmpty()
                           && form.queryItemValue(QStringLiteral("refresh_token"), QUrl::FullyDecoded).toUtf8() == m_refreshToken;
    const QJsonObject answer = refreshes
        ? QJsonObject{{QStringLiteral("access_token"), QString::fromUtf8(m_token)}, {QStringLiteral("expires_in"), 3599},
                      {QStringLiteral("token_type"), QStringLiteral("Bearer")}}
        : QJsonObject{{QStringLiteral("error"), QStringLiteral("invalid_grant")},
                      {QStringLiteral("error_description"), QStringLiteral("Token has been expired or revoked.")}};
    respond(socket, refreshes ? 200 : 400, {{"Content-Type", "application/json"}}, QJsonDocument(answer).toJson(QJsonDocument::Compact));
}

void UploadTestServer::handleInitiation(QTcpSocket *socket, const Connection &c, const QByteArray &body)
{
    const QUrlQuery query(c.target);
    bool ok = false;
    const qint64 total = c.headers.value("x-upload-content-length").toLongLong(&ok);
    if (query.queryItemValue(QStringLiteral("uploadType")) != QLatin1String("resumable")
        || query.queryItemValue(QStringLiteral("part")) != QLatin1String("snippet,status") || !ok || total <= 0
        || c.headers.value("x-upload-content-type") != "video/mp4")
        return respondError(socket, 400, QStringLiteral("Expected a resumable upload of snippet,status with the video's length and type"));
    if (const QString problem = metadataProblem(body, m_categories); !problem.isEmpty())
        return respondError(socket, 400, problem);
    m_initiationBodies.append(body);
    const QString id = QStringLiteral("s%1").arg(m_nextSession++);
    m_sessions.insert(id, Session{total, {}});
    const QString origin = m_sessionOrigin.isEmpty() ? baseUrl().toString() : m_sessionOrigin.toString();
    respond(socket, 200, {{"Location", (origin + kUploadPath + QStringLiteral("?uploadType=resumable&upload_id=") + id).toLatin1()}});
}

void UploadTestServer::handlePut(QTcpSocket *socket, const Connection &c, const QByteArray &body)
{
    auto session = m_sessions.find(QUrlQuery(c.target).queryItemValue(QStringLiteral("upload_id")));
    if (session == m_sessions.end())
        return respondError(socket, 404, QStringLiteral("No such upload session"));
    if (takeFault(FaultKind::SessionGone)) {
        m_sessions.erase(session);
        return respondError(socket, 404, QStringLiteral("The upload session expired"));
    }
    if (const auto fault = takeFault(FaultKind::Unavailable)) {
        Headers headers;
        if (fault->retryAfterSeconds >= 0)
            headers.append({"Retry-After", QByteArray::number(fault->retryAfterSeconds)});
        return respondError(socket, 503, QStringLiteral("Backend unavailable"), headers);
    }
    const QByteArray range = c.headers.value("content-range");
    if (!range.startsWith("bytes ") || range.mid(range.indexOf('/') + 1).toLongLong() != session->total)
        return respondError(socket, 400, QStringLiteral("Invalid Content-Range"));
    if (!range.startsWith("bytes */")) {
        const qint64 first = rangeStart(range), last = rangeEnd(range);
        const qint64 held = session->bytes.size();
        const qint64 overlap = qMin<qint64>(held - first, body.size());
        if (first > held || last - first + 1 != body.size() || last >= session->total
            || session->bytes.mid(first, overlap) != body.left(overlap))
            return respondError(socket, 400, QStringLiteral("Content-Range %1 does not continue the %2 bytes held")
                                                 .arg(QString::fromLatin1(range)).arg(held));
        if (m_stallAfter < 0 || held < m_stallAfter)
            session->bytes.append(body.mid(overlap));
    } else if (takeFault(FaultKind::ForgetBytes)) {
        session->bytes.clear();
    }

    if (session->bytes.size() == session->total) {
        const QString videoId = QStringLiteral("zafVid%1").arg(m_nextVideo++, 5, 10, QLatin1Char('0'));
        m_videos.insert(videoId, session->bytes);
        m_sessions.erase(session);
        const QJsonObject video{{QStringLiteral("kind"), QStringLiteral("youtube#video")}, {QStringLiteral("id"), videoId}};
        respond(socket, 201, {{"Content-Type", "application/json"}}, QJsonDocument(video).toJson(QJsonDocument::Compact));
    } else if (session->bytes.isEmpty()) {
        respond(socket, 308, {});
    } else {
        respond(socket, 308, {{"Range", "bytes=0-" + QByteArray::number(session->bytes.size() - 1)}});
    }
}

void UploadTestServer::respond(QTcpSocket *socket, int status, const Headers &headers, const QByteArray &body)
{
    if (!m_requests.isEmpty() && m_connections.contains(socket))
        m_requests.last().status = status;
    // Clients read the status code only; the reason phrase is generic.
    QByteArray answer = "HTTP/1.1 " + QByteArray::number(status) + (status < 400 ? " OK\r\n" : " Error\r\n");
    for (const auto &[name, value] : headers)
        answer += name + ": " + value + "\r\n";
    answer += "Content-Length: " + QByteArray::number(body.size()) + "\r\nConnection: close\r\n\r\n" + body;
    const auto send = [socket, answer] {
        socket->write(answer);
        socket->disconnectFromHost();
    };
    // The socket is the timer's context: a connection gone in the meantime gets nothing.
    if (m_responseDelay.count() > 0)
        QTimer::singleShot(m_responseDelay, socket, send);
    else
        send();
}

void UploadTestServer::respondError(QTcpSocket *socket, int status, const QString &message, const Headers &headers)
{
    const QJsonObject error{{QStringLiteral("code"), status}, {QStringLiteral("message"), message}};
    respond(socket, status, headers + Headers{{"Content-Type", "application/json"}},
            QJsonDocument(QJsonObject{{QStringLiteral("error"), error}}).toJson(QJsonDocument::Compact));
}

} // namespace zaf::test
