#pragma once

// One chunk of the movie file as a request body: bytes [offset, offset + length) read from the file
// as the network asks for them, so a chunk never sits in memory whole.
//
// The device is sequential and refuses reset() on purpose: the network stack must not resend a chunk
// on its own after a lost connection. The session has to ask the server how much it kept first, so a
// lost connection has to come back to ResumableUpload as an error.
// Used on the thread that owns the request.

#include <QFile>
#include <QIODevice>

namespace zaf::publishing {

class UploadChunkDevice final : public QIODevice {
public:
    UploadChunkDevice(const QString &path, qint64 offset, qint64 length, QObject *parent = nullptr);

    // Opens the file and positions it at the chunk; false (with errorString()) when it cannot.
    bool openChunk();

    bool isSequential() const override { return true; }
    bool reset() override { return false; }
    qint64 bytesAvailable() const override;
    bool atEnd() const override;
    void close() override;

protected:
    qint64 readData(char *data, qint64 maxSize) override;
    qint64 writeData(const char *data, qint64 maxSize) override;

private:
    QFile m_file;
    qint64 m_offset = 0;
    qint64 m_length = 0;
    qint64 m_read = 0;
};

} // namespace zaf::publishing
