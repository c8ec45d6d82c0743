#pragma once

// The host's end of a channel, driven by hand: a connected socket pair whose host end the test writes
// raw bytes, frames or messages to and reads messages from with a bounded wait.

#include "platform/extensionkit/frame_codec.h"
#include "tests/support/wait_until.h"

#include <QJsonObject>
#include <QList>

#include <optional>
#include <utility>

namespace zaf::test {

class SocketPair {
public:
    SocketPair();
    ~SocketPair();
    SocketPair(const SocketPair &) = delete;
    SocketPair &operator=(const SocketPair &) = delete;

    int extensionFd() const { return m_fds[0]; }
    int hostFd() const { return m_fds[1]; }
    // Gives the extension's end away to whatever takes ownership of it.
    int releaseExtensionFd() { return std::exchange(m_fds[0], -1); }
    void closeHost();

    void writeRaw(const QByteArray &bytes) const;
    void writeFrame(const QByteArray &payload) const { writeRaw(extensionkit::encodeFrame(payload)); }
    void writeMessage(const QJsonObject &message) const;

    // Runs the event loop until `count` messages have arrived or `timeoutMs` has passed; returns
    // those read so far (possibly fewer).
    QList<QJsonObject> readMessages(int count, int timeoutMs = 5000);
    // The id and code of the next message, a JSON-RPC error answer; nullopt when none arrives.
    std::optional<std::pair<QJsonValue, int>> readErrorAnswer();
    // True when nothing arrives while the event loop runs for `settleMs`.
    bool nothingToRead(int settleMs = 50);

private:
    int m_fds[2] = {-1, -1};
    extensionkit::FrameDecoder m_decoder{0xffffffffu};
};

} // namespace zaf::test
