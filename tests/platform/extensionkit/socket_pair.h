#pragma once

// Test support for the host channel: a connected socket pair whose "host" end the test drives by
// hand (raw writes, frame reads with a bounded wait), and a bounded event-loop wait.

#include <QByteArray>
#include <QJsonObject>
#include <QList>

#include <functional>
#include <optional>

namespace zaf::test {

class SocketPair {
public:
    SocketPair();
    ~SocketPair();
    SocketPair(const SocketPair &) = delete;
    SocketPair &operator=(const SocketPair &) = delete;

    // The extension's end; release it when something else takes ownership of it.
    int extensionFd() const { return m_fds[0]; }
    int releaseExtensionFd();
    int hostFd() const { return m_fds[1]; }
    void closeHost();

    // Writes raw bytes / one framed payload / one framed JSON object from the host end.
    void writeRaw(const QByteArray &bytes) const;
    void writeFrame(const QByteArray &payload) const;
    void writeMessage(const QJsonObject &message) const;

    // Reads from the host end, running the Qt event loop meanwhile, until `count` complete frames
    // have arrived or `timeoutMs` has passed; returns the frames read so far (possibly fewer).
    QList<QByteArray> readFrames(int count, int timeoutMs = 5000);
    // The same, for messages parsed as JSON objects.
    QList<QJsonObject> readMessages(int count, int timeoutMs = 5000);
    // True when the host end has nothing to read right now (after letting the event loop run for
    // `settleMs` milliseconds).
    bool nothingToRead(int settleMs = 50);

private:
    int m_fds[2] = {-1, -1};
    QByteArray m_buffer;
};

// Runs the Qt event loop until `condition` holds or `timeoutMs` has passed; returns the condition.
bool waitUntil(const std::function<bool()> &condition, int timeoutMs = 5000);

} // namespace zaf::test
