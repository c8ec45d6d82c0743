#pragma once

// One upload of a movie file to the video service with its resumable upload protocol.
//
// Threads: the object lives on the thread whose event loop runs its QNetworkAccessManager (the main
// thread in the plug-in); every method is called and every signal is emitted on that thread.
//
// Order of events after start():
//   1. POST {base}/upload/youtube/v3/videos?uploadType=resumable&part=snippet,status with the
//      metadata; the 200 answer's Location is the session URI.
//   2. PUT the file chunk by chunk ("Content-Range: bytes a-b/TOTAL"); each 308 says how far the
//      server got ("Range: bytes=0-N", resume at N+1; no Range means from 0). A 308 to a chunk that
//      kept none of it counts as a failed attempt (step 3), so a server stuck at 308 ends the upload.
//      The session address must be on the service's host (or the configured base): the access
//      token is sent nowhere else, and another address ends the upload.
//   3. A lost connection or a 500/502/503/504 waits (exponential backoff from 1 s, capped, or the
//      answer's Retry-After), then asks "Content-Range: bytes */TOTAL" and continues from its Range.
//      A 404 on the session starts again at step 1, a bounded number of times.
//   4. 200/201 carries the video resource; its id makes the watch URL.
// progress() follows the bytes on the wire; finished() comes exactly once per start(), also after
// cancel() and after any error (which is logged in the "zaf.publishing" category).

#include "platform/error.h"
#include "publishing/plugin/upload/upload_answer.h"
#include "publishing/plugin/upload/video_metadata.h"

#include <QObject>
#include <QPointer>
#include <QUrl>

#include <chrono>
#include <functional>
#include <optional>

class QNetworkAccessManager;
class QNetworkReply;
class QNetworkRequest;

namespace zaf::publishing {

inline constexpr const char *kUploadErrorDomain = "zaf.publishing.upload";

// Codes of the upload errors that are not an HTTP status (those carry the status as their code).
enum UploadErrorCode {
    UploadFileError = -1,
    UploadCancelledError = -2,
    UploadTooManyRetriesError = -3,
    UploadTooManyRestartsError = -4,
    UploadMalformedAnswerError = -5,
    UploadInvalidMetadataError = -6,
    UploadNetworkError = -7,
    UploadUntrustedSessionError = -8,
};

// The service's host: the access token goes only to https URLs on it, or to the configured base
// (scheme, host and port), which tests point at a local server.
inline constexpr const char *kServiceApiHost = "www.googleapis.com";

struct UploadResult {
    QString videoId;
    // https://www.youtube.com/watch?v=ID when the upload succeeded.
    QUrl watchUrl;
    OptionalError error;

    bool ok() const { return !error.has_value(); }
};

class ResumableUpload : public QObject {
    Q_OBJECT

public:
    // Waits `delay`, then calls `resume` on the upload's thread. The default uses a QTimer; tests
    // record the delays and resume at once.
    using DelayFunction = std::function<void(std::chrono::milliseconds delay, std::function<void()> resume)>;

    static constexpr qint64 kDefaultChunkSize = 8 * 1024 * 1024;

    // `network` must outlive the upload.
    explicit ResumableUpload(QNetworkAccessManager *network, QObject *parent = nullptr);
    ~ResumableUpload() override;

    // Configuration, read by start().
    void setBaseUrl(const QUrl &baseUrl) { m_baseUrl = baseUrl; }
    void setAccessToken(const QString &token) { m_accessToken = token; }
    void setFilePath(const QString &path) { m_filePath = path; }
    void setMetadata(const VideoMetadata &metadata) { m_metadata = metadata; }
    // The service wants multiples of 256 KiB except for the last chunk; tests use small chunks.
    void setChunkSize(qint64 bytes) { m_chunkSize = qMax<qint64>(1, bytes); }
    void setDelayFunction(DelayFunction delay);
    // Backoff: the first wait, its cap, and how many retries in a row without progress are allowed.
    void setBackoff(std::chrono::milliseconds initial, std::chrono::milliseconds cap, int maxRetries);
    // How many times a vanished session (404) may start the upload again.
    void setMaxRestarts(int restarts) { m_maxRestarts = restarts; }
    // A request that moves no bytes for this long counts as a lost connection.
    void setTransferTimeout(std::chrono::milliseconds timeout) { m_transferTimeout = timeout; }

    // Starts the upload; ignored while one is running.
    void start();
    // Stops the upload; finished() reports UploadCancelledError. Ignored when nothing runs.
    void cancel();
    bool isRunning() const { return m_running; }

    QUrl sessionUrl() const { return m_sessionUrl; }

Q_SIGNALS:
    // Bytes of the file the server has or is receiving, out of `total`. Emitted on the upload's thread.
    void progress(qint64 sent, qint64 total);
    // The watch URL or the error, once per start(). Emitted on the upload's thread.
    void finished(const zaf::publishing::UploadResult &result);

private:
    void initiate();
    void sendChunk();
    void queryStatus();
    void send(UploadStep step, QNetworkReply *reply);
    void handleReply(QNetworkReply *reply);
    // Carries out what an answer asked for (see upload_answer.h).
    void apply(const UploadDecision &decision);
    void retryLater(int status, const QString &reason, std::optional<std::chrono::milliseconds> advertised);
    void restartSession(const QString &reason);
    void succeed(const QString &videoId);
    void fail(int code, const QString &message);
    void scheduleAfter(std::chrono::milliseconds delay, void (ResumableUpload::*step)());
    // Whether `url` may receive the access token (see kServiceApiHost).
    bool mayCarryToken(const QUrl &url) const;
    QNetworkRequest authorisedRequest(const QUrl &url) const;

    QNetworkAccessManager *m_network;
    QUrl m_baseUrl;
    QString m_accessToken;
    QString m_filePath;
    VideoMetadata m_metadata;
    qint64 m_chunkSize = kDefaultChunkSize;
    DelayFunction m_delay;
    std::chrono::milliseconds m_initialBackoff{1000};
    std::chrono::milliseconds m_maxBackoff{64000};
    std::chrono::milliseconds m_transferTimeout{60000};
    int m_maxRetries = 8;
    int m_maxRestarts = 3;

    // State of the running upload.
    bool m_running = false;
    quint64 m_generation = 0; // bumped on every start, cancel and finish: stale waits do nothing
    UploadStep m_step = UploadStep::Initiate;
    QPointer<QNetworkReply> m_reply;
    QByteArray m_body;
    QUrl m_sessionUrl;
    qint64 m_total = 0;
    qint64 m_offset = 0;
    int m_retries = 0;
    int m_restarts = 0;
};

} // namespace zaf::publishing
