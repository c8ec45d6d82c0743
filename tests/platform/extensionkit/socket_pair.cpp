#include "tests/platform/extensionkit/socket_pair.h"

#include "platform/extensionkit/json_rpc.h"

#include <QCoreApplication>
#include <QDeadlineTimer>
#include <QJsonDocument>

#include <gtest/gtest.h>

#include <cerrno>
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

void SocketPair::closeHost()
{
    if (m_fds[1] >= 0)
        ::close(std::exchange(m_fds[1], -1));
}

void SocketPair::writeRaw(const QByteArray &bytes) const
{
    for (qsizetype done = 0; done < bytes.size();) {
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

void SocketPair::writeMessage(const QJsonObject &message) const
{
    writeFrame(extensionkit::jsonrpc::serialize(message));
}

QList<QJsonObject> SocketPair::readMessages(int count, int timeoutMs)
{
    QList<QJsonObject> messages;
    const QDeadlineTimer deadline(timeoutMs);
    for (;;) {
        while (messages.size() < count && m_decoder.hasFrame())
            messages.append(QJsonDocument::fromJson(*m_decoder.takeFrame()).object());
        if (messages.size() >= count || deadline.hasExpired())
            return messages;
        QCoreApplication::processEvents(QEventLoop::AllEvents, 10);
        pollfd pfd{m_fds[1], POLLIN, 0};
        if (::poll(&pfd, 1, 5) <= 0)
            continue;
        char chunk[65536];
        const ssize_t n = ::recv(m_fds[1], chunk, sizeof chunk, MSG_DONTWAIT);
        if (n > 0)
            m_decoder.feed(chunk, n);
        else if (n == 0 || (errno != EAGAIN && errno != EINTR))
            return messages;
    }
}

std::optional<std::pair<QJsonValue, int>> SocketPair::readErrorAnswer()
{
    const QList<QJsonObject> answers = readMessages(1);
    if (answers.isEmpty())
        return std::nullopt;
    return std::pair(answers[0].value("id"), answers[0].value("error").toObject().value("code").toInt());
}

bool SocketPair::nothingToRead(int settleMs)
{
    waitUntil([] { return false; }, settleMs);
    pollfd pfd{m_fds[1], POLLIN, 0};
    return !m_decoder.hasFrame() && m_decoder.isAtFrameBoundary() && ::poll(&pfd, 1, 0) == 0;
}

} // namespace zaf::test
