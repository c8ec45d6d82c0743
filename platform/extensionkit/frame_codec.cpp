#include "platform/extensionkit/frame_codec.h"

#include <algorithm>
#include <limits>

namespace zaf::extensionkit {

namespace {

std::uint32_t readLittleEndian32(const char *bytes)
{
    const auto *b = reinterpret_cast<const unsigned char *>(bytes);
    return std::uint32_t(b[0]) | (std::uint32_t(b[1]) << 8) | (std::uint32_t(b[2]) << 16) | (std::uint32_t(b[3]) << 24);
}

} // namespace

QByteArray encodeFrame(const QByteArray &payload)
{
    if (std::uint64_t(payload.size()) > std::numeric_limits<std::uint32_t>::max())
        return {};
    const auto length = std::uint32_t(payload.size());
    QByteArray frame;
    frame.reserve(kFrameHeaderSize + payload.size());
    frame.append(char(length & 0xff));
    frame.append(char((length >> 8) & 0xff));
    frame.append(char((length >> 16) & 0xff));
    frame.append(char((length >> 24) & 0xff));
    frame.append(payload);
    return frame;
}

FrameDecoder::FrameDecoder(std::uint32_t maxFrameLength) : m_maxFrameLength(maxFrameLength) {}

bool FrameDecoder::feed(const char *data, qsizetype size)
{
    if (m_status != Status::Ok)
        return false;
    if (!data || size <= 0)
        return true;
    qsizetype offset = 0;
    while (offset < size) {
        if (!m_expected) {
            const qsizetype take = std::min(kFrameHeaderSize - m_headerFill, size - offset);
            std::copy(data + offset, data + offset + take, m_header + m_headerFill);
            m_headerFill += take;
            offset += take;
            if (m_headerFill < kFrameHeaderSize)
                break;
            const std::uint32_t length = readLittleEndian32(m_header);
            m_headerFill = 0;
            if (length > m_maxFrameLength) {
                // The length is refused before anything is reserved for it; the stream cannot be
                // resynchronised after this, so the decoder stays in error.
                m_status = Status::TooLarge;
                m_errorString = QStringLiteral("frame length %1 exceeds the limit of %2 bytes").arg(length).arg(m_maxFrameLength);
                m_payload.clear();
                return false;
            }
            m_expected = length;
            m_payload.clear();
            if (length == 0) {
                m_frames.append(QByteArray());
                m_expected.reset();
            }
            continue;
        }
        // The payload grows only with the bytes actually received, never with the announced length.
        const qsizetype missing = qsizetype(*m_expected) - m_payload.size();
        const qsizetype take = std::min(missing, size - offset);
        m_payload.append(data + offset, take);
        offset += take;
        if (m_payload.size() == qsizetype(*m_expected)) {
            m_frames.append(m_payload);
            m_payload = QByteArray();
            m_expected.reset();
        }
    }
    return true;
}

std::optional<QByteArray> FrameDecoder::takeFrame()
{
    if (m_frames.isEmpty())
        return std::nullopt;
    return m_frames.takeFirst();
}

QList<QByteArray> FrameDecoder::takeFrames()
{
    QList<QByteArray> frames;
    frames.swap(m_frames);
    return frames;
}

qsizetype FrameDecoder::pendingBytes() const
{
    if (m_expected)
        return kFrameHeaderSize + m_payload.size();
    return m_headerFill;
}

} // namespace zaf::extensionkit
