#include "tests/platform/extensionkit/socket_pair.h"

#include "platform/extensionkit/frame_codec.h"
#include "platform/extensionkit/json_rpc.h"

#include <QCoreApplication>
#include <QElapsedTimer>
#include <QJsonDocument>
#include <QThread>

#include <gtest/gtest.h>

#include <cerrno>
#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

namespace zaf::test {

SocketPair::SocketPair()
{
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, m_fds) != 0)
        ADD_FAILURE() << "socketpair failed: " << errno;
}

SocketPair::~SocketPair()
{
    for (int fd : m_fds) {
        if (fd >= 0)
            ::close(fd);
    }
}

int SocketPair::releaseExtensionFd()
{
    const int fd = m_fds[0];
    m_fds[0] = -1;
    return fd;
}

void SocketPair::closeHost()
{
    if (m_fds[1] >= 0)
        ::close(m_fds[1]);
    m_fds[1] = -1;
}

void SocketPair::writeRaw(const QByteArray &bytes) const
{
    qsizetype done = 0;
    while (done < bytes.size()) {
        const ssize_t n = ::send(m_fds[1], bytes.constData() + done, size_t(bytes.size() - done), MSG_NOSIGNAL);
        if (n < 0 && errno == EINTR)
            continue;
        if (n <= 0) {
            ADD_FAILURE() << "host write failed: " << errno;
            return;
        }
        done += n;
    }
}

void SocketPair::writeFrame(const QByteArray &payload) const
{
    writeRaw(zaf::extensionkit::encodeFrame(payload));
}

void SocketPair::writeMessage(const QJsonObject &message) const
{
    writeFrame(zaf::extensionkit::jsonrpc::serialize(message));
}

QList<QByteArray> SocketPair::readFrames(int count, int timeoutMs)
{
    QList<QByteArray> frames;
    QElapsedTimer timer;
    timer.start();
    auto takeComplete = [&] {
        while (frames.size() < count && m_buffer.size() >= 4) {
            const auto *b = reinterpret_cast<const unsigned char *>(m_buffer.constData());
            const quint32 length = quint32(b[0]) | (quint32(b[1]) << 8) | (quint32(b[2]) << 16) | (quint32(b[3]) << 24);
            if (m_buffer.size() < 4 + qsizetype(length))
                break;
            frames.append(m_buffer.mid(4, length));
            m_buffer.remove(0, 4 + qsizetype(length));
        }
    };
    takeComplete();
    while (frames.size() < count && timer.elapsed() < timeoutMs) {
        QCoreApplication::processEvents(QEventLoop::AllEvents, 10);
        pollfd pfd{m_fds[1], POLLIN, 0};
        if (::poll(&pfd, 1, 5) <= 0)
            continue;
        char chunk[65536];
        const ssize_t n = ::recv(m_fds[1], chunk, sizeof chunk, MSG_DONTWAIT);
        if (n <= 0) {
            if (n < 0 && (errno == EAGAIN || errno == EINTR))
                continue;
            break;
        }
        m_buffer.append(chunk, n);
        takeComplete();
    }
    return frames;
}

QList<QJsonObject> SocketPair::readMessages(int count, int timeoutMs)
{
    QList<QJsonObject> messages;
    for (const QByteArray &frame : readFrames(count, timeoutMs))
        messages.append(QJsonDocument::fromJson(frame).object());
    return messages;
}

bool SocketPair::nothingToRead(int settleMs)
{
    waitUntil([] { return false; }, settleMs);
    if (!m_buffer.isEmpty())
        return false;
    pollfd pfd{m_fds[1], POLLIN, 0};
    return ::poll(&pfd, 1, 0) == 0;
}

bool waitUntil(const std::function<bool()> &condition, int timeoutMs)
{
    QElapsedTimer timer;
    timer.start();
    while (!condition()) {
        if (timer.elapsed() >= timeoutMs)
            return condition();
        QCoreApplication::processEvents(QEventLoop::AllEvents, 10);
        QThread::msleep(1);
    }
    return true;
}

} // namespace zaf::test
