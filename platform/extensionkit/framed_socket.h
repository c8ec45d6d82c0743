#pragma once

// FramedSocket: one end of a connected stream socket carrying length-prefixed frames (see
// frame_codec.h); both ends of the host channel sit on it, the extension's Channel and the host's
// session.
//
// Threads: created, started, closed and destroyed on one thread that runs a Qt event loop (its
// owner's), which reads the socket through a QSocketNotifier; every signal is emitted there. With
// FullBuffer::Wait, sendFrame() may be called from any thread (writes are serialised under a mutex);
// with FullBuffer::Queue, only from the owner's thread.
//
// Reading: at most kReadsPerActivation reads of 64 KiB per readiness notification, so a peer that
// writes without pause cannot starve the event loop; readPending() reads more at once. Frames are
// emitted in order. A length above the cap: the frames complete before it are emitted, then
// protocolError(), then the socket closes (the stream cannot be resynchronised). The end of the
// stream inside a frame: protocolError(), then the socket closes. A failed read or the peer's end
// of stream closes it too. closed(reason) is emitted once, from whichever close comes first.
//
// Writing: a frame is written whole; one cut off midway leaves the stream unwritable, and every
// later send fails with EPIPE. Writes never raise SIGPIPE on a socket (MSG_NOSIGNAL); a descriptor
// that is no socket (a pipe) gets plain writes, so its owner ignores SIGPIPE. When the socket buffer
// is full, FullBuffer::Wait waits for room up to the write timeout and then fails with ETIMEDOUT;
// FullBuffer::Queue keeps the rest and writes it as room appears, in order, reporting a later
// failure through writeFailed(). A failed write leaves the reading side open: what the peer wrote
// before it went is still read, and its end of stream closes the socket.
//
// Slots must not delete the socket directly (use deleteLater()).

#include "platform/error.h"
#include "platform/extensionkit/frame_codec.h"
#include "platform/unique_fd.h"

#include <QByteArray>
#include <QObject>
#include <QString>

#include <cstdint>
#include <memory>

namespace zaf::extensionkit {

class FramedSocket : public QObject {
    Q_OBJECT
public:
    enum class FullBuffer { Wait, Queue };
    // Reads per readiness notification.
    static constexpr int kReadsPerActivation = 16;

    // `peerName` names the other end in the reasons and errors it gives ("the host").
    FramedSocket(UniqueFd fd, std::uint32_t maxIncomingFrameLength, FullBuffer fullBuffer, const QString &peerName,
                 QObject *parent = nullptr);
    // Closes the socket without emitting anything.
    ~FramedSocket() override;

    // Owner's thread: makes the descriptor non-blocking and close-on-exec and starts reading. False
    // (with `error` filled) when it is not an open descriptor or start() was already called.
    bool start(QString *error = nullptr);
    // Owner's thread: closes the socket (idempotent); emits closed(reason) when it was open.
    void close(const QString &reason);
    // Any thread.
    bool isOpen() const;
    int fd() const;

    // Owner's thread: reads what has arrived, up to `maxReads` reads, as a readiness notification
    // would.
    void readPending(int maxReads);

    // Writes one frame with this payload (see the threads above). nullopt once it is written or, with
    // FullBuffer::Queue, queued; otherwise an Error in the POSIX domain whose code is the errno
    // (EMSGSIZE for a payload too long to frame, EPIPE once closed or broken).
    OptionalError sendFrame(const QByteArray &payload);
    // FullBuffer::Wait: the longest a send waits for room (default 5000 ms).
    void setWriteTimeout(int milliseconds);

Q_SIGNALS:
    // Owner's thread: one complete frame's payload.
    void frameReceived(const QByteArray &payload);
    // Owner's thread: a frame that cannot be read (too long, or cut off by the end of the stream).
    void protocolError(const QString &text);
    // Owner's thread: the socket has closed (the peer's end, a failed read, a bad frame or close()).
    void closed(const QString &reason);
    // Owner's thread, FullBuffer::Queue only: queued bytes could not be written; they are dropped.
    void writeFailed(const zaf::Error &error);

private:
    struct Private;
    std::unique_ptr<Private> d;
};

} // namespace zaf::extensionkit
