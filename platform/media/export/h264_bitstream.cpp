#include "platform/media/export/h264_bitstream.h"

namespace zaf::media::h264 {

namespace {

// Reads the bits of a NAL unit's payload, skipping the emulation prevention bytes (00 00 03).
class RbspReader {
public:
    RbspReader(const QByteArray &nal, int offset)
    {
        int zeros = 0;
        for (int i = offset; i < nal.size(); ++i) {
            const uint8_t byte = uint8_t(nal[i]);
            if (zeros >= 2 && byte == 3) {
                zeros = 0;
                continue;
            }
            zeros = byte == 0 ? zeros + 1 : 0;
            m_bytes.append(char(byte));
        }
    }

    std::optional<int> bit()
    {
        if (m_bit >= m_bytes.size() * 8)
            return std::nullopt;
        const int value = (uint8_t(m_bytes[m_bit / 8]) >> (7 - m_bit % 8)) & 1;
        ++m_bit;
        return value;
    }

    bool skip(int bits)
    {
        m_bit += bits;
        return m_bit <= m_bytes.size() * 8;
    }

    // An unsigned Exp-Golomb number; ids never need more than 31 leading zeros.
    std::optional<int> ue()
    {
        int leadingZeros = 0;
        for (;;) {
            const std::optional<int> b = bit();
            if (!b)
                return std::nullopt;
            if (*b)
                break;
            if (++leadingZeros > 30)
                return std::nullopt;
        }
        int value = 0;
        for (int i = 0; i < leadingZeros; ++i) {
            const std::optional<int> b = bit();
            if (!b)
                return std::nullopt;
            value = value << 1 | *b;
        }
        return (1 << leadingZeros) - 1 + value;
    }

private:
    QByteArray m_bytes;
    int m_bit = 0;
};

void appendBigEndian(QByteArray &out, std::uint32_t value, int bytes)
{
    for (int i = bytes - 1; i >= 0; --i)
        out.append(char((value >> (8 * i)) & 0xff));
}

} // namespace

bool forEachLengthPrefixedNal(const uint8_t *data, int size, int lengthSize,
                              const std::function<void(const uint8_t *nal, int size)> &visit)
{
    if (lengthSize < 1 || lengthSize > 4)
        return false;
    int offset = 0;
    while (offset < size) {
        if (size - offset < lengthSize)
            return false;
        std::uint32_t length = 0;
        for (int i = 0; i < lengthSize; ++i)
            length = length << 8 | data[offset + i];
        offset += lengthSize;
        if (length == 0 || length > std::uint32_t(size - offset))
            return false;
        visit(data + offset, int(length));
        offset += int(length);
    }
    return true;
}

QList<QByteArray> annexBNalUnits(const uint8_t *data, int size)
{
    QList<QByteArray> units;
    int start = -1;
    int i = 0;
    while (i + 2 < size) {
        if (data[i] == 0 && data[i + 1] == 0 && data[i + 2] == 1) {
            if (start >= 0) {
                int end = i;
                while (end > start && data[end - 1] == 0) // a four-byte code's leading zero, or trailing zeros
                    --end;
                units.append(QByteArray(reinterpret_cast<const char *>(data + start), end - start));
            }
            i += 3;
            start = i;
        } else {
            ++i;
        }
    }
    if (start >= 0 && start < size)
        units.append(QByteArray(reinterpret_cast<const char *>(data + start), size - start));
    units.removeIf([](const QByteArray &unit) { return unit.isEmpty(); });
    return units;
}

std::optional<QByteArray> annexBToLengthPrefixed(const uint8_t *data, int size, int lengthSize)
{
    QByteArray out;
    out.reserve(size + 16);
    for (const QByteArray &unit : annexBNalUnits(data, size)) {
        if (lengthSize < 4 && std::uint64_t(unit.size()) >= (std::uint64_t(1) << (8 * lengthSize)))
            return std::nullopt;
        appendBigEndian(out, std::uint32_t(unit.size()), lengthSize);
        out.append(unit);
    }
    return out;
}

std::optional<int> parameterSetId(const QByteArray &nal)
{
    if (nal.isEmpty())
        return std::nullopt;
    const int type = nal[0] & 0x1f;
    if (type == kNalSps) {
        RbspReader reader(nal, 1);
        if (!reader.skip(24)) // profile_idc, the constraint flags, level_idc
            return std::nullopt;
        const std::optional<int> id = reader.ue();
        return id && *id <= 31 ? id : std::nullopt;
    }
    if (type == kNalPps) {
        RbspReader reader(nal, 1);
        const std::optional<int> id = reader.ue();
        return id && *id <= 255 ? id : std::nullopt;
    }
    return std::nullopt;
}

std::optional<DecoderConfiguration> DecoderConfiguration::parse(const uint8_t *data, int size)
{
    if (size < 7 || data[0] != 1)
        return std::nullopt;
    DecoderConfiguration config;
    config.profile = data[1];
    config.compatibility = data[2];
    config.level = data[3];
    config.lengthSize = (data[4] & 3) + 1;
    if (config.lengthSize == 3)
        return std::nullopt;
    int offset = 5;
    auto readSets = [&](int count, QList<QByteArray> &into) {
        for (int i = 0; i < count; ++i) {
            if (size - offset < 2)
                return false;
            const int length = data[offset] << 8 | data[offset + 1];
            offset += 2;
            if (length == 0 || size - offset < length)
                return false;
            into.append(QByteArray(reinterpret_cast<const char *>(data + offset), length));
            offset += length;
        }
        return true;
    };
    if (!readSets(data[offset++] & 0x1f, config.sps) || offset >= size)
        return std::nullopt;
    if (!readSets(data[offset++], config.pps))
        return std::nullopt;
    config.trailer = QByteArray(reinterpret_cast<const char *>(data + offset), size - offset);
    return config;
}

QByteArray DecoderConfiguration::serialize() const
{
    QByteArray out;
    out.append(char(1));
    out.append(char(profile));
    out.append(char(compatibility));
    out.append(char(level));
    out.append(char(0xfc | (lengthSize - 1)));
    out.append(char(0xe0 | (sps.size() & 0x1f)));
    for (const QByteArray &set : sps) {
        appendBigEndian(out, std::uint32_t(set.size()), 2);
        out.append(set);
    }
    out.append(char(pps.size()));
    for (const QByteArray &set : pps) {
        appendBigEndian(out, std::uint32_t(set.size()), 2);
        out.append(set);
    }
    out.append(trailer);
    return out;
}

QList<int> DecoderConfiguration::usedIds() const
{
    QList<int> ids;
    for (const QList<QByteArray> *sets : {&sps, &pps}) {
        for (const QByteArray &set : *sets) {
            if (const std::optional<int> id = parameterSetId(set))
                ids.append(*id);
        }
    }
    return ids;
}

} // namespace zaf::media::h264
