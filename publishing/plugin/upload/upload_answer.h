#pragma once

// What the resumable upload does with one answer of the video service: a pure reading of the HTTP
// status, the headers that matter (Location, Range, Retry-After) and the body, with no network
// object involved. ResumableUpload sends the requests and carries out the decisions.
//
// Threads: pure functions, callable from any thread.

#include <QByteArray>
#include <QDateTime>
#include <QString>
#include <QUrl>

#include <chrono>
#include <optional>

namespace zaf::publishing {

// The request an answer belongs to.
enum class UploadStep {
    Initiate,     // the POST that opens a session
    SendChunk,    // a PUT carrying bytes of the file
    QueryStatus,  // a PUT asking how far the server got
};

struct UploadAnswer {
    int status = 0;      // the HTTP status
    QUrl requestUrl;     // where the request went; a relative Location resolves against it
    QByteArray location; // raw header values, empty when absent
    QByteArray range;
    QByteArray retryAfter;
    QByteArray body;
};

// Where the upload stands when the answer arrives.
struct UploadState {
    UploadStep step = UploadStep::Initiate;
    qint64 offset = 0; // the first byte the last request did not cover
    qint64 total = 0;  // the file's size (> 0)
    QUrl baseUrl;      // the configured service base, which may receive the token
};

struct UploadDecision {
    enum class Action {
        BeginSession, // sessionUrl is the session: send from byte 0
        SendFrom,     // send the next chunk from `offset`
        Succeed,      // the video exists: videoId
        Retry,        // wait (retryAfter when the server said so) and ask again; `message` says why
        Restart,      // the session vanished: open a new one; `message` says why
        Fail,         // end the upload with error `code` and `message`
    };
    Action action = Action::Fail;
    QUrl sessionUrl;
    qint64 offset = 0;
    QString videoId;
    // Fail: the error code (an UploadErrorCode or the HTTP status). Retry: the HTTP status, 0 when
    // the answer was no HTTP failure.
    int code = 0;
    QString message;
    std::optional<std::chrono::milliseconds> retryAfter;
};

// Reads one answer. `now` is the time an HTTP-date Retry-After is measured from.
UploadDecision interpretUploadAnswer(const UploadAnswer &answer, const UploadState &state, const QDateTime &now);

// Retry-After as a delay: delta seconds or an HTTP date, at most ten minutes; nullopt when absent or
// unreadable.
std::optional<std::chrono::milliseconds> parseRetryAfter(const QByteArray &value, const QDateTime &now);

// Whether `url` may receive the access token: https on the service's host, or the configured base
// (scheme, host and port).
bool mayCarryAccessToken(const QUrl &url, const QUrl &baseUrl);

// Server messages end up in logs and dialogs; this keeps them readable.
inline constexpr int kMaxServerMessageLength = 500;

} // namespace zaf::publishing
