#include "platform/extensionkit/framed_socket.h"

#include <QElapsedTimer>
#include <QPointer>
#include <QSocketNotifier>

#include <cerrno>
#include <mutex>

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

namespace zaf::extensionkit {

namespace {

constexpr qsizetype kReadChunkSize = 64 * 1024;

// What one attempt to write wrote: `error` is 0 when everything went, EAGAIN when the socket buffer
// is full, or the errno that ended the write.
struct Written {
    qsizetype bytes = 0;
    int error = 0;
};

} // namespace

struct FramedSocket::Private {
    FramedSocket *q = nullptr;
    FullBuffer fullBuffer;
    QString peerName;
    FrameDecoder decoder;
    bool started = false;
    bool closed = false;
    QSocketNotifier *readNotifier = nullptr;
    QSocketNotifier *writeNotifier = nullptr;

    // Guarded by `mutex`: the descriptor (for writing and closing) and the writing side's state.
    mutable std::mutex mutex;
    UniqueFd fd;
    bool writeBroken = false; // a frame was cut off midway: the stream can no longer be written
    bool useSend = true;      // false once the descriptor turned out to be no socket
    int writeTimeoutMs = 5000;
    QByteArray queued;        // FullBuffer::Queue: what the socket has not taken yet

    Private(UniqueFd descriptor, std::uint32_t maxLength, FullBuffer mode, const QString &peer)
        : fullBuffer(mode), peerName(peer), decoder(maxLength), fd(std::move(descriptor))
    {
    }

    int currentFd() const
    {
        std::lock_guard lock(mutex);
        return fd.get();
    }

    // Writes as much as the socket takes now, without waiting. Called under `mutex`.
    Written writeNow(const char *data, qsizetype size)
    {
        Written written;
        while (written.bytes < size) {
            ssize_t n;
            if (useSend) {
                n = ::send(fd.get(), data + written.bytes, size_t(size - written.bytes), MSG_NOSIGNAL | MSG_DONTWAIT);
                if (n < 0 && errno == ENOTSOCK) {
                    useSend = false;
                    continue;
                }
            } else {
                n = ::write(fd.get(), data + written.bytes, size_t(size - written.bytes));
            }
            if (n > 0) {
                written.bytes += n;
                continue;
            }
            if (n < 0 && errno == EINTR)
                continue;
            written.error = n == 0 ? EIO : errno == EWOULDBLOCK ? EAGAIN : errno;
            return written;
        }
        return written;
    }

    // A failed write: a frame cut off midway leaves the stream unwritable. Called under `mutex`.
    Error failWrite(int error, bool cutOff)
    {
        writeBroken = writeBroken || cutOff;
        return Error::fromErrno(error);
    }

    // FullBuffer::Queue, on the owner's thread: writes what the socket takes of the queue.
    void flushQueue()
    {
        writeNotifier->setEnabled(false);
        OptionalError failure;
        {
            std::lock_guard lock(mutex);
            if (!fd.isValid() || queued.isEmpty())
                return;
            const Written written = writeNow(queued.constData(), queued.size());
            queued.remove(0, written.bytes);
            if (written.error == EAGAIN) {
                writeNotifier->setEnabled(true);
                return;
            }
            if (written.error != 0) {
                // The queue may have started inside a frame: what follows can no longer be framed.
                failure = failWrite(written.error, true);
                queued.clear();
            }
        }
        if (failure)
            Q_EMIT q->writeFailed(*failure);
    }
};

FramedSocket::FramedSocket(UniqueFd fd, std::uint32_t maxIncomingFrameLength, FullBuffer fullBuffer, const QString &peerName,
                           QObject *parent)
    : QObject(parent), d(std::make_unique<Private>(std::move(fd), maxIncomingFrameLength, fullBuffer, peerName))
{
    d->q = this;
}

FramedSocket::~FramedSocket()
{
    // The notifiers go before the descriptor they watch.
    delete d->readNotifier;
    delete d->writeNotifier;
    std::lock_guard lock(d->mutex);
    d->fd.reset();
}

bool FramedSocket::start(QString *error)
{
    auto fail = [&](const QString &text) {
        if (error)
            *error = text;
        return false;
    };
    if (d->started)
        return fail(QStringLiteral("already started"));
    const int fd = d->currentFd();
    if (fd < 0)
        return fail(QStringLiteral("no descriptor"));
    const int flags = ::fcntl(fd, F_GETFL);
    if (flags < 0)
        return fail(QStringLiteral("descriptor %1 is not open: %2").arg(fd).arg(Error::fromErrno(errno).message));
    if (::fcntl(fd, F_SETFL, flags | O_NONBLOCK) < 0)
        return fail(QStringLiteral("cannot make descriptor %1 non-blocking: %2").arg(fd).arg(Error::fromErrno(errno).message));
    const int fdFlags = ::fcntl(fd, F_GETFD);
    if (fdFlags >= 0)
        ::fcntl(fd, F_SETFD, fdFlags | FD_CLOEXEC);
    d->started = true;
    d->readNotifier = new QSocketNotifier(fd, QSocketNotifier::Read, this);
    connect(d->readNotifier, &QSocketNotifier::activated, this, [this] { readPending(kReadsPerActivation); });
    if (d->fullBuffer == FullBuffer::Queue) {
        d->writeNotifier = new QSocketNotifier(fd, QSocketNotifier::Write, this);
        connect(d->writeNotifier, &QSocketNotifier::activated, this, [this] { d->flushQueue(); });
        std::lock_guard lock(d->mutex);
        d->writeNotifier->setEnabled(!d->queued.isEmpty());
    }
    return true;
}

void FramedSocket::close(const QString &reason)
{
    // This may run inside a notifier's own signal: the notifiers are deleted later.
    for (QSocketNotifier **notifier : {&d->readNotifier, &d->writeNotifier}) {
        if (*notifier) {
            (*notifier)->setEnabled(false);
            (*notifier)->deleteLater();
            *notifier = nullptr;
        }
    }
    {
        std::lock_guard lock(d->mutex);
        d->fd.reset();
        d->queued.clear();
    }
    if (d->closed)
        return;
    d->closed = true;
    Q_EMIT closed(reason);
}

bool FramedSocket::isOpen() const
{
    return d->currentFd() >= 0;
}

int FramedSocket::fd() const
{
    return d->currentFd();
}

void FramedSocket::readPending(int maxReads)
{
    QPointer<FramedSocket> self(this);
    QByteArray buffer(kReadChunkSize, Qt::Uninitialized);
    for (int reads = 0; reads < maxReads; ++reads) {
        const int fd = d->currentFd();
        if (fd < 0)
            return;
        const ssize_t n = ::read(fd, buffer.data(), size_t(buffer.size()));
        if (n < 0) {
            if (errno == EINTR)
                continue;
            if (errno == EAGAIN || errno == EWOULDBLOCK)
                return;
            close(QStringLiteral("read failed: %1").arg(Error::fromErrno(errno).message));
            return;
        }
        if (n == 0) {
            if (!d->decoder.isAtFrameBoundary()) {
                Q_EMIT protocolError(QStringLiteral("the stream ended inside a frame (%1 bytes of it received)").arg(d->decoder.pendingBytes()));
                if (!self)
                    return;
            }
            close(QStringLiteral("%1 closed the connection").arg(d->peerName));
            return;
        }
        const bool fed = d->decoder.feed(buffer.constData(), qsizetype(n));
        // Complete frames are emitted in order, those before a bad length too. A slot may close the
        // socket (or schedule its deletion).
        while (std::optional<QByteArray> payload = d->decoder.takeFrame()) {
            Q_EMIT frameReceived(*payload);
            if (!self || d->closed)
                return;
        }
        if (!fed) {
            Q_EMIT protocolError(d->decoder.errorString());
            if (self)
                close(QStringLiteral("protocol error: %1").arg(d->decoder.errorString()));
            return;
        }
    }
}

OptionalError FramedSocket::sendFrame(const QByteArray &payload)
{
    const QByteArray frame = encodeFrame(payload);
    if (frame.isEmpty())
        return Error::fromErrno(EMSGSIZE);

    std::lock_guard lock(d->mutex);
    if (!d->fd.isValid() || d->writeBroken)
        return Error::fromErrno(EPIPE);
    const bool queue = d->fullBuffer == FullBuffer::Queue;
    if (queue && !d->queued.isEmpty()) {
        d->queued += frame; // behind what is already waiting, to keep the order
        return std::nullopt;
    }
    qsizetype done = 0;
    QElapsedTimer waited;
    for (;;) {
        const Written written = d->writeNow(frame.constData() + done, frame.size() - done);
        done += written.bytes;
        if (written.error == 0)
            return std::nullopt;
        if (written.error != EAGAIN)
            return d->failWrite(written.error, done > 0);
        if (queue) {
            d->queued = frame.mid(done);
            if (d->writeNotifier)
                d->writeNotifier->setEnabled(true);
            return std::nullopt;
        }
        if (!waited.isValid())
            waited.start();
        const qint64 remaining = d->writeTimeoutMs - waited.elapsed();
        if (remaining <= 0)
            return d->failWrite(ETIMEDOUT, done > 0);
        pollfd pfd{d->fd.get(), POLLOUT, 0};
        if (::poll(&pfd, 1, int(remaining)) < 0 && errno != EINTR)
            return d->failWrite(errno, done > 0);
    }
}

void FramedSocket::setWriteTimeout(int milliseconds)
{
    std::lock_guard lock(d->mutex);
    d->writeTimeoutMs = milliseconds;
}

} // namespace zaf::extensionkit
