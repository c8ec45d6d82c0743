#include "tests/publishing/upload_test_server.h"

#include <QHostAddress>
#include <QJsonDocument>
#include <QJsonObject>
#include <QTcpSocket>
#include <QUrlQuery>

namespace zaf::test {

namespace {

constexpr qint64 kMaxHeaderBytes = 64 * 1024;
constexpr qint64 kMaxBodyBytes = 64 * 1024 * 1024;
const QString kUploadPath = QStringLiteral("/upload/youtube/v3/videos");

QByteArray reasonPhrase(int status)
{
    switch (status) {
    case 200: return "OK";
    case 201: return "Created";
    case 308: return "Resume Incomplete";
    case 400: return "Bad Request";
    case 401: return "Unauthorized";
    case 403: return "Forbidden";
    case 404: return "Not Found";
    case 405: return "Method Not Allowed";
    case 413: return "Payload Too Large";
    case 431: return "Request Header Fields Too Large";
    case 503: return "Service Unavailable";
    default: return "Status";
    }
}

// The metadata problem the service would report, empty when the body is acceptable.
QString metadataProblem(const QByteArray &body, const QSet<QString> &categories)
{
    const QJsonDocument document = QJsonDocument::fromJson(body);
    if (!document.isObject())
        return QStringLiteral("The request body is not a JSON object");
    const QJsonObject snippet = document.object().value(QStringLiteral("snippet")).toObject();
    const QJsonObject status = document.object().value(QStringLiteral("status")).toObject();
    const QString title = snippet.value(QStringLiteral("title")).toString();
    if (title.isEmpty() || title.size() > 100 || title.contains(QLatin1Char('<')) || title.contains(QLatin1Char('>')))
        return QStringLiteral("The request metadata has an invalid video title.");
    const QString description = snippet.value(QStringLiteral("description")).toString();
    if (description.toUtf8().size() > 5000 || description.contains(QLatin1Char('<')) || description.contains(QLatin1Char('>')))
        return QStringLiteral("The request metadata has an invalid video description.");
    const QString category = snippet.value(QStringLiteral("categoryId")).toString();
    if (category.isEmpty() || (!categories.isEmpty() && !categories.contains(category)))
        return QStringLiteral("The request metadata has an invalid video category.");
    static const QSet<QString> privacy = {QStringLiteral("public"), QStringLiteral("unlisted"), QStringLiteral("private")};
    if (!privacy.contains(status.value(QStringLiteral("privacyStatus")).toString()))
        return QStringLiteral("The request metadata has an invalid privacy status.");
    return {};
}

} // namespace

UploadTestServer::UploadTestServer(int maxRequests, std::chrono::milliseconds lifetime, QObject *parent)
    : QObject(parent), m_maxRequests(maxRequests)
{
    connect(&m_server, &QTcpServer::newConnection, this, &UploadTestServer::accept);
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
    int n = 0;
    for (const Request &request : m_requests) {
        if (request.method == method && request.contentRange.startsWith("bytes */") == statusQueries)
            ++n;
    }
    return n;
}

int UploadTestServer::initiations() const
{
    return count(QStringLiteral("POST"));
}

void UploadTestServer::shutDown()
{
    m_lifetime.stop();
    m_server.close();
    const QList<QTcpSocket *> sockets = m_connections.keys();
    for (QTcpSocket *socket : sockets) {
        socket->disconnect(this);
        socket->abort();
        socket->deleteLater();
    }
    m_connections.clear();
}

void UploadTestServer::accept()
{
    while (QTcpSocket *socket = m_server.nextPendingConnection()) {
        if (!socket->peerAddress().isLoopback()) {
            socket->abort();
            socket->deleteLater();
            continue;
        }
        m_connections.insert(socket, Connection{});
        connect(socket, &QTcpSocket::readyRead, this, [this, socket] { readFrom(socket); });
        connect(socket, &QTcpSocket::disconnected, this, [this, socket] {
            m_connections.remove(socket);
            socket->deleteLater();
        });
    }
}

void UploadTestServer::readFrom(QTcpSocket *socket)
{
    auto it = m_connections.find(socket);
    if (it == m_connections.end())
        return;
    Connection &connection = it.value();
    connection.buffer.append(socket->readAll());

    if (!connection.headersDone) {
        const qsizetype end = connection.buffer.indexOf("\r\n\r\n");
        if (end < 0) {
            if (connection.buffer.size() > kMaxHeaderBytes)
                respondError(socket, 431, QStringLiteral("Headers too large"));
            return;
        }
        const QList<QByteArray> lines = connection.buffer.left(end).split('\n');
        connection.buffer.remove(0, end + 4);
        connection.headersDone = true;
        const QList<QByteArray> requestLine = lines.value(0).trimmed().split(' ');
        connection.method = QString::fromLatin1(requestLine.value(0));
        connection.target = QString::fromLatin1(requestLine.value(1));
        for (qsizetype i = 1; i < lines.size(); ++i) {
            const qsizetype colon = lines[i].indexOf(':');
            if (colon > 0)
                connection.headers.insert(lines[i].left(colon).trimmed().toLower(), lines[i].mid(colon + 1).trimmed());
        }
        bool ok = true;
        const QByteArray length = connection.headers.value("content-length", "0");
        connection.contentLength = length.toLongLong(&ok);

        Request request;
        request.method = connection.method;
        request.path = connection.target;
        request.contentRange = connection.headers.value("content-range");
        request.bodyBytes = connection.contentLength;
        m_requests.append(request);

        if (m_requests.size() > m_maxRequests) {
            respondError(socket, 403, QStringLiteral("The test server answers no more requests"));
            return;
        }
        if (!ok || connection.contentLength < 0 || connection.contentLength > kMaxBodyBytes) {
            respondError(socket, 413, QStringLiteral("Unacceptable Content-Length"));
            return;
        }
        Fault fault;
        if (connection.method == QLatin1String("PUT") && !request.contentRange.isEmpty()
            && !request.contentRange.startsWith("bytes */") && takeFault(FaultKind::DropBody, &fault))
            connection.dropAfter = fault.bytes;
    }

    if (connection.dropAfter >= 0 && connection.dropAfter < connection.contentLength
        && connection.buffer.size() >= connection.dropAfter) {
        // Keep what arrived before the break, as the service does, and vanish without an answer.
        const QUrlQuery query(QUrl(connection.target));
        auto session = m_sessions.find(query.queryItemValue(QStringLiteral("upload_id")));
        const QByteArray range = connection.headers.value("content-range");
        const qint64 start = range.mid(6, range.indexOf('-') - 6).toLongLong();
        if (session != m_sessions.end() && start == session->bytes.size())
            session->bytes.append(connection.buffer.left(connection.dropAfter));
        socket->abort(); // emits disconnected: `connection` is gone after this line
        return;
    }
    if (connection.buffer.size() < connection.contentLength)
        return;
    const QByteArray body = connection.buffer.left(connection.contentLength);
    handle(socket, connection, body);
}

bool UploadTestServer::takeFault(FaultKind kind, Fault *fault)
{
    for (qsizetype i = 0; i < m_faults.size(); ++i) {
        if (m_faults[i].kind == kind) {
            *fault = m_faults.takeAt(i);
            return true;
        }
    }
    return false;
}

void UploadTestServer::handle(QTcpSocket *socket, Connection &connection, const QByteArray &body)
{
    if (connection.headers.value("authorization") != "Bearer " + m_token) {
        respondError(socket, 401, QStringLiteral("Invalid Credentials"));
        return;
    }
    const QUrl url(connection.target);
    if (url.path() != kUploadPath) {
        respondError(socket, 404, QStringLiteral("No such resource"));
        return;
    }
    if (connection.method == QLatin1String("POST"))
        handleInitiation(socket, connection, body);
    else if (connection.method == QLatin1String("PUT"))
        handlePut(socket, connection, body);
    else
        respondError(socket, 405, QStringLiteral("Method not allowed"));
}

void UploadTestServer::handleInitiation(QTcpSocket *socket, const Connection &connection, const QByteArray &body)
{
    const QUrlQuery query(QUrl(connection.target));
    if (query.queryItemValue(QStringLiteral("uploadType")) != QLatin1String("resumable")
        || query.queryItemValue(QStringLiteral("part")) != QLatin1String("snippet,status")) {
        respondError(socket, 400, QStringLiteral("Expected uploadType=resumable&part=snippet,status"));
        return;
    }
    bool ok = false;
    const qint64 total = connection.headers.value("x-upload-content-length").toLongLong(&ok);
    if (!ok || total <= 0 || connection.headers.value("x-upload-content-type") != "video/mp4") {
        respondError(socket, 400, QStringLiteral("Missing or invalid X-Upload-Content-Length or X-Upload-Content-Type"));
        return;
    }
    const QString problem = metadataProblem(body, m_categories);
    if (!problem.isEmpty()) {
        respondError(socket, 400, problem);
        return;
    }
    m_initiationBodies.append(body);
    const QString id = QStringLiteral("s%1").arg(m_nextSession++);
    m_sessions.insert(id, Session{total, {}});
    const QByteArray location = (baseUrl().toString() + kUploadPath + QStringLiteral("?uploadType=resumable&upload_id=") + id).toLatin1();
    respond(socket, 200, {{"Location", location}});
}

void UploadTestServer::handlePut(QTcpSocket *socket, const Connection &connection, const QByteArray &body)
{
    const QString id = QUrlQuery(QUrl(connection.target)).queryItemValue(QStringLiteral("upload_id"));
    auto session = m_sessions.find(id);
    if (session == m_sessions.end()) {
        respondError(socket, 404, QStringLiteral("No such upload session"));
        return;
    }
    Fault fault;
    if (takeFault(FaultKind::SessionGone, &fault)) {
        m_sessions.erase(session);
        respondError(socket, 404, QStringLiteral("The upload session expired"));
        return;
    }
    if (takeFault(FaultKind::Unavailable, &fault)) {
        QList<QPair<QByteArray, QByteArray>> headers;
        if (fault.retryAfterSeconds >= 0)
            headers.append(qMakePair(QByteArray("Retry-After"), QByteArray::number(fault.retryAfterSeconds)));
        respondError(socket, 503, QStringLiteral("Backend unavailable"), headers);
        return;
    }

    const QByteArray range = connection.headers.value("content-range");
    const QByteArray totalText = range.mid(range.indexOf('/') + 1);
    if (!range.startsWith("bytes ") || totalText.toLongLong() != session->total) {
        respondError(socket, 400, QStringLiteral("Invalid Content-Range"));
        return;
    }
    if (!range.startsWith("bytes */")) {
        const QByteArray span = range.mid(6, range.indexOf('/') - 6);
        const qint64 first = span.left(span.indexOf('-')).toLongLong();
        const qint64 last = span.mid(span.indexOf('-') + 1).toLongLong();
        if (first != session->bytes.size() || last - first + 1 != body.size() || last >= session->total) {
            respondError(socket, 400, QStringLiteral("Content-Range %1 does not continue the %2 bytes held")
                                          .arg(QString::fromLatin1(range)).arg(session->bytes.size()));
            return;
        }
        session->bytes.append(body);
    } else if (takeFault(FaultKind::ForgetBytes, &fault)) {
        session->bytes.clear();
        respond(socket, 308, {});
        return;
    }

    if (session->bytes.size() == session->total) {
        const QString videoId = QStringLiteral("zafVid%1").arg(m_nextVideo++, 5, 10, QLatin1Char('0'));
        m_videos.insert(videoId, session->bytes);
        m_sessions.erase(session);
        QJsonObject video;
        video.insert(QStringLiteral("kind"), QStringLiteral("youtube#video"));
        video.insert(QStringLiteral("id"), videoId);
        respond(socket, 201, {{"Content-Type", "application/json"}}, QJsonDocument(video).toJson(QJsonDocument::Compact));
        return;
    }
    if (session->bytes.isEmpty())
        respond(socket, 308, {});
    else
        respond(socket, 308, {{"Range", "bytes=0-" + QByteArray::number(session->bytes.size() - 1)}});
}

void UploadTestServer::respond(QTcpSocket *socket, int status, const QList<QPair<QByteArray, QByteArray>> &headers,
                               const QByteArray &body)
{
    if (!m_requests.isEmpty() && m_connections.contains(socket))
        m_requests.last().status = status;
    QByteArray answer = "HTTP/1.1 " + QByteArray::number(status) + ' ' + reasonPhrase(status) + "\r\n";
    for (const auto &header : headers)
        answer += header.first + ": " + header.second + "\r\n";
    answer += "Content-Length: " + QByteArray::number(body.size()) + "\r\nConnection: close\r\n\r\n" + body;
    if (m_responseDelay.count() > 0) {
        // The socket is the timer's context: a connection gone in the meantime gets nothing.
        QTimer::singleShot(m_responseDelay, socket, [socket, answer] {
            socket->write(answer);
            socket->disconnectFromHost();
        });
        return;
    }
    socket->write(answer);
    socket->disconnectFromHost();
}

void UploadTestServer::respondError(QTcpSocket *socket, int status, const QString &message,
                                    const QList<QPair<QByteArray, QByteArray>> &headers)
{
    QJsonObject error;
    error.insert(QStringLiteral("code"), status);
    error.insert(QStringLiteral("message"), message);
    QJsonObject body;
    body.insert(QStringLiteral("error"), error);
    QList<QPair<QByteArray, QByteArray>> all = headers;
    all.append(qMakePair(QByteArray("Content-Type"), QByteArray("application/json")));
    respond(socket, status, all, QJsonDocument(body).toJson(QJsonDocument::Compact));
}

} // namespace zaf::test
