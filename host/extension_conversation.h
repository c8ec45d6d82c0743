#pragma once

// The host's half of the conversation with the extension, without a channel or a process: the
// messages a host sends, and what each message from the extension means. Every host of this
// library (ExtensionSession on a Qt event loop, the polled session of the C library) talks through
// it, so they read the extension the same way.
//
// Threads: none of its own; used from one thread at a time.

#include "host/input_items.h"

#include <QByteArray>
#include <QList>
#include <QString>
#include <QStringList>

#include <optional>

namespace zaf::host {

// What one message from the extension said.
struct ExtensionMessage {
    enum class Kind {
        Accepted,      // the request was accepted; protocolVersion is the extension's
        Refused,       // the request was refused: errorCode and text
        Reported,      // extensionDidFinishWithActivityTypes: activityTypes
        ProtocolError, // a malformed or unexpected message: text (already logged)
    };
    Kind kind = Kind::ProtocolError;
    QString protocolVersion;
    int errorCode = 0;
    QString text;
    QStringList activityTypes;
    // A JSON-RPC error to send back (the extension made a request of its own), framed payload.
    std::optional<QByteArray> answer;
};

class ExtensionConversation {
public:
    // The serialized beginExtensionRequest with `items`, in the protocol version this host speaks,
    // which is then the one awaiting an answer.
    QByteArray beginRequest(const QList<InputItem> &items);
    // The serialized removeExtensionView notification.
    static QByteArray removeView();

    // What `payload`, one message from the extension, means. Malformed messages and messages that
    // answer no pending request are protocol errors, logged under "zaf.host".
    ExtensionMessage interpret(const QByteArray &payload);

private:
    int m_pendingRequestId = 0; // 0: none awaiting an answer
    int m_nextRequestId = 1;
};

} // namespace zaf::host
