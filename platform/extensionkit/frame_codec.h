#pragma once

// The framing of the host channel: every message is a 4-byte little-endian unsigned length N
// followed by N bytes of payload (UTF-8 JSON, not inspected here).
//
// FrameDecoder is incremental: feed it whatever chunks the socket produced (a byte at a time or many
// frames at once) and take out the complete payloads. A length above the cap is a protocol error that
// is reported before any memory for the payload is reserved; once in error, the decoder ignores all
// further input (the stream can no longer be resynchronised, so the channel is to be treated as
// closed).
//
// Threads: none of its own. A FrameDecoder is used from one thread at a time; encodeFrame is pure.

#include <QByteArray>
#include <QList>
#include <QString>

#include <cstdint>
#include <optional>

namespace zaf::extensionkit {

// The size of the length prefix, in bytes.
inline constexpr qsizetype kFrameHeaderSize = 4;
// The default largest payload accepted by a decoder: 1 MiB.
inline constexpr std::uint32_t kDefaultMaxFrameLength = 1024 * 1024;

// The 4-byte length prefix followed by the payload. A payload longer than UINT32_MAX cannot be
// framed: the result is then empty.
QByteArray encodeFrame(const QByteArray &payload);

class FrameDecoder {
public:
    enum class Status {
        Ok,        // waiting for more input or holding complete payloads
        TooLarge,  // a length above the cap arrived; the stream is unusable
    };

    explicit FrameDecoder(std::uint32_t maxFrameLength = kDefaultMaxFrameLength);

    // Appends a chunk of the stream. Returns false when the decoder is (or just became) in error;
    // then errorString() says why. Input after an error is discarded.
    bool feed(const char *data, qsizetype size);
    bool feed(const QByteArray &chunk) { return feed(chunk.constData(), chunk.size()); }

    // True when at least one complete payload is waiting.
    bool hasFrame() const { return !m_frames.isEmpty(); }
    // Removes and returns the oldest complete payload, or nullopt when there is none.
    std::optional<QByteArray> takeFrame();
    // Removes and returns all complete payloads, oldest first.
    QList<QByteArray> takeFrames();

    Status status() const { return m_status; }
    bool hasError() const { return m_status != Status::Ok; }
    QString errorString() const { return m_errorString; }

    std::uint32_t maxFrameLength() const { return m_maxFrameLength; }
    // Bytes of a frame received so far but not yet complete (header and payload).
    qsizetype pendingBytes() const;
    // True when no partial frame is buffered (the stream ended on a frame boundary).
    bool isAtFrameBoundary() const { return pendingBytes() == 0; }

private:
    std::uint32_t m_maxFrameLength;
    Status m_status = Status::Ok;
    QString m_errorString;
    // The partial header (up to 4 bytes) while the length is not yet known.
    char m_header[kFrameHeaderSize] = {};
    qsizetype m_headerFill = 0;
    // The length of the frame in progress, once its header is complete.
    std::optional<std::uint32_t> m_expected;
    // The payload bytes received so far for the frame in progress (grows only with received data).
    QByteArray m_payload;
    QList<QByteArray> m_frames;
};

} // namespace zaf::extensionkit
