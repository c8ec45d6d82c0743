#pragma once

// A loopback HTTP/1.1 server speaking enough of the video service's resumable upload protocol for the
// upload tests: it checks the requests as the service does, keeps each session's bytes, answers 308
// with the Range it holds and 201 with a video resource once a session is complete. A data PUT may
// repeat bytes the session holds (a request the client's network stack resent) as long as they are
// the same bytes. One request per
// connection, 127.0.0.1 only, at most maxRequests answers (then 403) and closed after `lifetime`, so
// a test that goes wrong cannot keep it busy. Queued faults are each spent on the first request they
// apply to. Lives on the thread that creates it.

#include <QByteArray>
#include <QHash>
#include <QList>
#include <QMap>
#include <QObject>
#include <QSet>
#include <QString>
#include <QTcpServer>
#include <QTimer>
#include <QUrl>

#include <chrono>
#include <optional>

class QTcpSocket;

namespace zaf::test {

class UploadTestServer : public QObject {
    Q_OBJECT

public:
    enum class FaultKind {
        DropBody,    // a data PUT: keep the first `bytes` of its body, then drop the connection unanswered;
                     // the client's resends of that PUT are dropped alike until its next status query
        DropBodyOnce, // as DropBody, but a resend of the PUT gets through
        Unavailable, // any PUT on a session: 503 with "Retry-After: retryAfterSeconds" (none when negative)
        ForgetBytes, // a status query: the server forgets what it holds and answers 308 without Range
        SessionGone, // any PUT on a session: the session is discarded and the answer is 404
    };
    struct Fault {
        FaultKind kind;
        qint64 bytes = 0;
        int retryAfterSeconds = -1;
    };
    // What the server saw, one entry per request, in order.
    struct Request {
        QString method;
        QString path;
        QByteArray contentRange;
        qint64 bodyBytes = 0;
        int status = 0; // 0: dropped without an answer
        // A data PUT with the previous data PUT's session and Content-Range and no status query between: sent
        // again by the client's network stack, not by the upload.
        bool resent = false;
    };

    explicit UploadTestServer(int maxRequests = 200, std::chrono::milliseconds lifetime = std::chrono::seconds(30),
                              QObject *parent = nullptr);
    ~UploadTestServer() override;

    bool listen();        // on 127.0.0.1, a free port; false when it cannot
    QUrl baseUrl() const; // http://127.0.0.1:PORT

    void queueFault(const Fault &fault) { m_faults.append(fault); }
    // The bearer token every request must carry (401 otherwise).
    void setExpectedToken(const QByteArray &token) { m_token = token; }
    // The OAuth token endpoint at tokenUrl(): a POST refreshing a sign-in with this refresh token
    // gets the expected bearer token; any other grant gets 400 "invalid_grant", as for a revoked one.
    void setRefreshToken(const QByteArray &refreshToken) { m_refreshToken = refreshToken; }
    QUrl tokenUrl() const; // http://127.0.0.1:PORT/token
    // Every answer goes out this long after the request was read (a slow link, for screenshots).
    void setResponseDelay(std::chrono::milliseconds delay) { m_responseDelay = delay; }
    // Initiations whose category is not in this set are refused with 400 (empty: any category).
    void setAcceptedCategories(const QSet<QString> &categories) { m_categories = categories; }
    // A server stuck at 308: once a session holds `bytes`, every data PUT is read, its bytes dropped
    // and answered 308 with the Range held (none while nothing is held). Negative: off.
    void setStallAfter(qint64 bytes) { m_stallAfter = bytes; }
    // The scheme, host and port the session addresses in Location name (empty: the server's own).
    void setSessionOrigin(const QUrl &origin) { m_sessionOrigin = origin; }

    const QList<Request> &requests() const { return m_requests; }
    // Requests with this method; PUTs are data PUTs or, with `statusQueries`, status queries.
    int count(const QString &method, bool statusQueries = false) const;
    int initiations() const { return count(QStringLiteral("POST")); }
    QList<QByteArray> initiationBodies() const { return m_initiationBodies; }
    // The bytes of the session that completed a video, by video id.
    QByteArray videoBytes(const QString &videoId) const { return m_videos.value(videoId); }
    bool stopped() const { return !m_server.isListening(); }

private:
    using Headers = QList<QPair<QByteArray, QByteArray>>;
    struct Connection {
        QByteArray buffer;
        bool headersDone = false;
        QString method;
        QUrl target;
        QHash<QByteArray, QByteArray> headers; // lower-case names
        qint64 contentLength = 0;
        qint64 dropAfter = -1; // the DropBody fault taken by this request
    };
    struct Session {
        qint64 total = 0;
        QByteArray bytes; // received so far
    };

    void readFrom(QTcpSocket *socket);
    void handleInitiation(QTcpSocket *socket, const Connection &connection, const QByteArray &body);
    void handlePut(QTcpSocket *socket, const Connection &connection, const QByteArray &body);
    void handleTokenRequest(QTcpSocket *socket, const QByteArray &body);
    void respond(QTcpSocket *socket, int status, const Headers &headers, const QByteArray &body = {});
    void respondError(QTcpSocket *socket, int status, const QString &message, const Headers &headers = {});
    std::optional<Fault> takeFault(FaultKind kind);
    void shutDown();

    QTcpServer m_server;
    QTimer m_lifetime;
    int m_maxRequests;
    std::chrono::milliseconds m_responseDelay{0};
    qint64 m_stallAfter = -1;
    QByteArray m_lastDataRange; // session and Content-Range of the last data PUT since the last status query
    std::optional<Fault> m_resendDrop; // the DropBody fault that also drops resends of m_lastDataRange
    QUrl m_sessionOrigin;
    QHash<QTcpSocket *, Connection> m_connections;
    QList<Fault> m_faults;
    QByteArray m_token = "test-token";
    QByteArray m_refreshToken;
    QSet<QString> m_categories;
    QMap<QString, Session> m_sessions;
    QMap<QString, QByteArray> m_videos;
    QList<Request> m_requests;
    QList<QByteArray> m_initiationBodies;
    int m_nextSession = 1;
    int m_nextVideo = 1;
};

} // namespace zaf::test
