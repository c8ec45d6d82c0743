#pragma once

// One chunk of the movie file as a request body: bytes [offset, offset + length) read from the file
// as the network asks for them, so a chunk never sits in memory whole.
//
// The device is random-access over the chunk (position 0 is the chunk's first byte): the network
// stack rewinds it with reset() or seek() when it resends a request on a new connection, e.g. after
// the server closed a kept-alive connection under it. A resend carries the same Content-Range; what
// the server answers to it is handled like any other answer. Used on the thread that owns the request.

#include <QFile>
#include <QIODevice>

namespace zaf::publishing {

class UploadChunkDevice final : public QIODevice {
public:
    UploadChunkDevice(const QString &path, qint64 offset, qint64 length, QObject *parent = nullptr);

    // Opens the file and positions it at the chunk; false (with errorString()) when it cannot.
    bool openChunk();

    bool isSequential() const override { return false; }
    qint64 size() const override { return m_length; }
    // Moves to `pos` within the chunk (0 to size()); false outside it or when the file cannot seek.
    bool seek(qint64 pos) override;
    void close() override;

protected:
    qint64 readData(char *data, qint64 maxSize) override;
    qint64 writeData(const char *data, qint64 maxSize) override;

private:
    QFile m_file;
    qint64 m_offset = 0;
    qint64 m_length = 0;
    qint64 m_read = 0; // the position within the chunk that the file stands at
};

} // namespace zaf::publishing
