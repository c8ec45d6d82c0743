#pragma once

// A loopback HTTP/1.1 server that speaks enough of the video service's resumable upload protocol for
// the upload tests: it initiates sessions, stores the bytes of each one, answers 308 with the Range it
// holds and 201 with a video resource once a session has every byte.
//
// One request per connection ("Connection: close"). It listens on 127.0.0.1 only, answers at most
// maxRequests requests (then 403) and shuts itself down after `lifetime`, so a test that goes wrong
// cannot keep it busy. Faults are queued and each one is spent on the first request it applies to.
// Lives and runs on the thread that creates it (the test's main thread).

#include <QByteArray>
#include <QHash>
#include <QList>
#include <QMap>
#include <QObject>
#include <QPointer>
#include <QSet>
#include <QString>
#include <QTcpServer>
#include <QTimer>
#include <QUrl>

#include <chrono>

class QTcpSocket;

namespace zaf::test {

class UploadTestServer : public QObject {
    Q_OBJECT

public:
    enum class FaultKind {
        // A data PUT: keep the first `bytes` of its body, then drop the connection without answering.
        DropBody,
        // Any PUT on a session: 503 with "Retry-After: retryAfterSeconds" (none when negative).
        Unavailable,
        // A status query: the server forgets what it holds and answers 308 without Range.
        ForgetBytes,
        // Any PUT on a session: the session is discarded and the answer is 404.
        SessionGone,
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
    };

    explicit UploadTestServer(int maxRequests = 200, std::chrono::milliseconds lifetime = std::chrono::seconds(30),
                              QObject *parent = nullptr);
    ~UploadTestServer() override;

    // Listens on 127.0.0.1 on a free port; false when it cannot.
    bool listen();
    // http://127.0.0.1:PORT
    QUrl baseUrl() const;

    void queueFault(const Fault &fault) { m_faults.append(fault); }
    // The bearer token every request must carry (401 otherwise).
    void setExpectedToken(const QByteArray &token) { m_token = token; }
    // Every answer goes out this long after the request was read (a slow link, for screenshots).
    void setResponseDelay(std::chrono::milliseconds delay) { m_responseDelay = delay; }
    // Initiations whose category is not in this set are refused with 400 (empty: any category).
    void setAcceptedCategories(const QSet<QString> &categories) { m_categories = categories; }

    const QList<Request> &requests() const { return m_requests; }
    int count(const QString &method, bool statusQueries = false) const;
    int initiations() const;
    QList<QByteArray> initiationBodies() const { return m_initiationBodies; }
    // The bytes of the session that completed a video, by video id.
    QByteArray videoBytes(const QString &videoId) const { return m_videos.value(videoId); }
    bool stopped() const { return !m_server.isListening(); }

private:
    struct Connection {
        QByteArray buffer;
        bool headersDone = false;
        QString method;
        QString target;
        QHash<QByteArray, QByteArray> headers; // lower-case names
        qint64 contentLength = 0;
        qint64 dropAfter = -1; // the DropBody fault taken by this request
    };
    struct Session {
        qint64 total = 0;
        QByteArray bytes;
    };

    void accept();
    void readFrom(QTcpSocket *socket);
    void handle(QTcpSocket *socket, Connection &connection, const QByteArray &body);
    void handleInitiation(QTcpSocket *socket, const Connection &connection, const QByteArray &body);
    void handlePut(QTcpSocket *socket, const Connection &connection, const QByteArray &body);
    void respond(QTcpSocket *socket, int status, const QList<QPair<QByteArray, QByteArray>> &headers,
                 const QByteArray &body = {});
    void respondError(QTcpSocket *socket, int status, const QString &message,
                      const QList<QPair<QByteArray, QByteArray>> &headers = {});
    bool takeFault(FaultKind kind, Fault *fault);
    void shutDown();

    QTcpServer m_server;
    QTimer m_lifetime;
    int m_maxRequests;
    std::chrono::milliseconds m_responseDelay{0};
    QHash<QTcpSocket *, Connection> m_connections;
    QList<Fault> m_faults;
    QByteArray m_token = "test-token";
    QSet<QString> m_categories;
    QMap<QString, Session> m_sessions;
    QMap<QString, QByteArray> m_videos;
    QList<Request> m_requests;
    QList<QByteArray> m_initiationBodies;
    int m_nextSession = 1;
    int m_nextVideo = 1;
};

} // namespace zaf::test
