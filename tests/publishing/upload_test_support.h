#pragma once

// Helpers shared by the upload tests: a movie-sized file of varied bytes, an upload wired to the
// loopback server with recorded backoff delays, and a bounded wait for its result.

#include "publishing/plugin/upload/resumable_upload.h"
#include "tests/publishing/upload_test_server.h"
#include "tests/support/temp_dir.h"

#include <QEventLoop>
#include <QFile>
#include <QNetworkAccessManager>
#include <QTimer>

#include <chrono>
#include <optional>
#include <vector>

namespace zaf::test {

// `size` bytes that differ from position to position, so a misplaced chunk cannot go unnoticed.
inline QByteArray variedBytes(qint64 size)
{
    QByteArray bytes(size, Qt::Uninitialized);
    quint32 state = 2463534242u;
    for (qint64 i = 0; i < size; ++i) {
        state ^= state << 13;
        state ^= state >> 17;
        state ^= state << 5;
        bytes[i] = char(state & 0xFF);
    }
    return bytes;
}

class UploadHarness {
public:
    static constexpr qint64 kChunk = 64 * 1024;

    explicit UploadHarness(qint64 fileSize, int maxRequests = 60)
        : server(maxRequests, std::chrono::seconds(20)), upload(&network)
    {
        movie = variedBytes(fileSize);
        path = scratch.file(QStringLiteral("movie.mp4"));
        QFile file(path);
        if (file.open(QIODevice::WriteOnly))
            file.write(movie);
        listening = server.listen();

        publishing::VideoMetadata metadata;
        metadata.title = QStringLiteral("Speedrun, part one");
        metadata.description = QStringLiteral("Recorded with the video editor.");
        upload.setBaseUrl(server.baseUrl());
        upload.setAccessToken(QStringLiteral("test-token"));
        upload.setFilePath(path);
        upload.setMetadata(metadata);
        upload.setChunkSize(kChunk);
        upload.setDelayFunction([this](std::chrono::milliseconds delay, std::function<void()> resume) {
            delays.push_back(delay);
            QTimer::singleShot(0, std::move(resume));
        });
        QObject::connect(&upload, &publishing::ResumableUpload::progress, [this](qint64 sent, qint64 total) {
            progress.push_back({sent, total});
        });
        QObject::connect(&upload, &publishing::ResumableUpload::finished,
                         [this](const publishing::UploadResult &r) { results.push_back(r); });
    }

    // Starts the upload and runs the event loop until it finishes or 15 s pass.
    std::optional<publishing::UploadResult> run()
    {
        QEventLoop loop;
        QTimer timeout;
        timeout.setSingleShot(true);
        QObject::connect(&timeout, &QTimer::timeout, &loop, &QEventLoop::quit);
        QObject::connect(&upload, &publishing::ResumableUpload::finished, &loop, &QEventLoop::quit);
        timeout.start(15000);
        upload.start();
        if (results.empty())
            loop.exec();
        if (results.empty())
            return std::nullopt;
        return results.front();
    }

    ScratchDir scratch;
    QByteArray movie;
    QString path;
    UploadTestServer server;
    bool listening = false;
    QNetworkAccessManager network;
    publishing::ResumableUpload upload;
    std::vector<std::chrono::milliseconds> delays;
    std::vector<std::pair<qint64, qint64>> progress;
    std::vector<publishing::UploadResult> results;
};

} // namespace zaf::test
