#pragma once

// Helpers shared by the publishing tests: the plug-in's upload environment, and an upload of a file
// of varied bytes to the loopback server that records its backoff waits.

#include "publishing/plugin/upload/resumable_upload.h"
#include "tests/publishing/upload_test_server.h"
#include "tests/support/temp_dir.h"
#include "tests/support/wait_until.h"

#include <QFile>
#include <gtest/gtest.h>
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

// Points the plug-in at the loopback server for one test and restores the environment afterwards.
struct ScopedUploadEnvironment {
    explicit ScopedUploadEnvironment(const QUrl &base)
    {
        qputenv("ZAF_YOUTUBE_API_BASE", base.toString().toUtf8());
        qputenv("ZAF_YOUTUBE_ACCESS_TOKEN", "test-token");
    }
    ~ScopedUploadEnvironment()
    {
        qunsetenv("ZAF_YOUTUBE_API_BASE");
        qunsetenv("ZAF_YOUTUBE_ACCESS_TOKEN");
    }
};

class UploadHarness {
public:
    static constexpr qint64 kChunk = 64 * 1024;

    explicit UploadHarness(qint64 fileSize, int maxRequests = 60)
        : movie(variedBytes(fileSize)), path(scratch.file(QStringLiteral("movie.mp4"))),
          server(maxRequests, std::chrono::seconds(20)), upload(&network)
    {
        QFile file(path);
        EXPECT_TRUE(file.open(QIODevice::WriteOnly) && file.write(movie) == movie.size());
        file.close();
        listening = server.listen();
        publishing::VideoMetadata metadata;
        metadata.title = QStringLiteral("Speedrun");
        upload.setBaseUrl(server.baseUrl());
        upload.setAccessToken(QStringLiteral("test-token"));
        upload.setFilePath(path);
        upload.setMetadata(metadata);
        upload.setChunkSize(kChunk);
        upload.setDelayFunction([this](std::chrono::milliseconds delay, std::function<void()> resume) {
            delays.push_back(delay);
            QTimer::singleShot(0, std::move(resume));
        });
        QObject::connect(&upload, &publishing::ResumableUpload::progress,
                         [this](qint64 sent, qint64 total) { progress.push_back({sent, total}); });
        QObject::connect(&upload, &publishing::ResumableUpload::finished,
                         [this](const publishing::UploadResult &r) { results.push_back(r); });
    }

    // Starts the upload and runs the event loop until it finishes or 15 s pass.
    std::optional<publishing::UploadResult> run()
    {
        upload.start();
        if (!waitUntil([this] { return !results.empty(); }, 15000))
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
