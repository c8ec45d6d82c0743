#include "platform/bundle/mo_catalog.h"

#include <QFile>
#include <QStringDecoder>
#include <QtEndian>

namespace zaf::bundle {

namespace {

constexpr quint32 kMagic = 0x950412deu;
constexpr qint64 kHeaderSize = 28;
constexpr qint64 kDescriptorSize = 8; // length + offset, both 32-bit

MoCatalog failure(const QString &message)
{
    MoCatalog result;
    result.error = message;
    return result;
}

struct Range {
    qint64 begin = 0;
    qint64 end = 0; // one past the last byte
    bool overlaps(const Range &other) const { return begin < other.end && other.begin < end; }
};

class Parser {
public:
    explicit Parser(const QByteArray &data)
        : m_bytes(reinterpret_cast<const uchar *>(data.constData())), m_size(data.size())
    {
    }

    MoCatalog parse();

private:
    // Callers check `offset + 4 <= m_size` before reading.
    quint32 word(qint64 offset) const
    {
        return m_bigEndian ? qFromBigEndian<quint32>(m_bytes + offset) : qFromLittleEndian<quint32>(m_bytes + offset);
    }
    // The bytes of string `index` of the table at `tableOffset`, or an error.
    bool string(qint64 tableOffset, quint32 index, const char *what, QByteArray *out, QString *error) const;
    bool decode(const QByteArray &bytes, QString *out) const;
    bool setCharsetFromHeader(const QByteArray &header, QString *error);

    const uchar *m_bytes;
    qint64 m_size;
    bool m_bigEndian = false;
    Range m_tables[3]; // header, original table, translation table
    QStringConverter::Encoding m_encoding = QStringConverter::Utf8;
};

bool Parser::string(qint64 tableOffset, quint32 index, const char *what, QByteArray *out, QString *error) const
{
    const qint64 descriptor = tableOffset + qint64(index) * kDescriptorSize;
    const qint64 length = word(descriptor);
    const qint64 offset = word(descriptor + 4);
    // The string plus its terminating NUL must lie inside the file.
    if (offset + length >= m_size) {
        *error = QStringLiteral("%1 string %2 (offset %3, length %4) runs past the end of the file (%5 bytes)")
                     .arg(QLatin1String(what))
                     .arg(index)
                     .arg(offset)
                     .arg(length)
                     .arg(m_size);
        return false;
    }
    if (m_bytes[offset + length] != 0) {
        *error = QStringLiteral("%1 string %2 is not NUL-terminated").arg(QLatin1String(what)).arg(index);
        return false;
    }
    const Range range{offset, offset + length + 1};
    for (const Range &table : m_tables) {
        if (range.overlaps(table)) {
            *error = QStringLiteral("%1 string %2 overlaps the catalogue header or its string tables")
                         .arg(QLatin1String(what))
                         .arg(index);
            return false;
        }
    }
    *out = QByteArray(reinterpret_cast<const char *>(m_bytes + offset), qsizetype(length));
    return true;
}

bool Parser::decode(const QByteArray &bytes, QString *out) const
{
    // Stateless: a sequence cut off at the end of the string is an error, not input kept for later.
    QStringDecoder decoder(m_encoding, QStringDecoder::Flag::Stateless);
    *out = decoder.decode(bytes);
    return !decoder.hasError();
}

bool Parser::setCharsetFromHeader(const QByteArray &header, QString *error)
{
    for (const QByteArray &line : header.split('\n')) {
        if (!line.startsWith("Content-Type:"))
            continue;
        const qsizetype at = line.indexOf("charset=");
        if (at < 0)
            return true;
        const QByteArray charset = line.mid(at + 8).trimmed().toLower();
        if (charset == "utf-8" || charset == "utf8" || charset == "ascii" || charset == "us-ascii"
            || charset == "charset" /* msgfmt's placeholder in an untouched template */) {
            m_encoding = QStringConverter::Utf8;
            return true;
        }
        const auto encoding = QStringConverter::encodingForName(charset.constData());
        if (!encoding) {
            *error = QStringLiteral("unsupported charset \"%1\"").arg(QString::fromLatin1(charset));
            return false;
        }
        m_encoding = *encoding;
        return true;
    }
    return true;
}

MoCatalog Parser::parse()
{
    if (m_size > kMaxMoFileSize)
        return failure(QStringLiteral("catalogue of %1 bytes exceeds the limit of %2 bytes").arg(m_size).arg(kMaxMoFileSize));
    if (m_size < kHeaderSize)
        return failure(QStringLiteral("catalogue of %1 bytes is too short for its header").arg(m_size));

    if (qFromLittleEndian<quint32>(m_bytes) == kMagic) {
        m_bigEndian = false;
    } else if (qFromBigEndian<quint32>(m_bytes) == kMagic) {
        m_bigEndian = true;
    } else {
        return failure(QStringLiteral("bad magic number 0x%1").arg(qFromLittleEndian<quint32>(m_bytes), 8, 16, QLatin1Char('0')));
    }
    const quint32 revision = word(4);
    if ((revision >> 16) > 1)
        return failure(QStringLiteral("unsupported catalogue revision %1.%2").arg(revision >> 16).arg(revision & 0xffff));

    const qint64 count = word(8);
    const qint64 originals = word(12);
    const qint64 translations = word(16);
    // Each message needs a descriptor in both tables and at least a NUL byte for each string.
    if (count > (m_size - kHeaderSize) / (2 * kDescriptorSize + 2))
        return failure(QStringLiteral("string count %1 cannot fit in a catalogue of %2 bytes").arg(count).arg(m_size));
    const qint64 tableBytes = count * kDescriptorSize;
    m_tables[0] = {0, kHeaderSize};
    m_tables[1] = {originals, originals + tableBytes};
    m_tables[2] = {translations, translations + tableBytes};
    if (m_tables[1].end > m_size || m_tables[2].end > m_size)
        return failure(QStringLiteral("string tables (at %1 and %2, %3 bytes each) run past the end of the file (%4 bytes)")
                           .arg(originals)
                           .arg(translations)
                           .arg(tableBytes)
                           .arg(m_size));
    if (count > 0 && (m_tables[1].overlaps(m_tables[0]) || m_tables[2].overlaps(m_tables[0]) || m_tables[1].overlaps(m_tables[2])))
        return failure(QStringLiteral("string tables (at %1 and %2) overlap each other or the header").arg(originals).arg(translations));

    MoCatalog result;
    QString error;
    QByteArray original;
    QByteArray translation;
    for (quint32 i = 0; i < quint32(count); ++i) {
        if (!string(originals, i, "original", &original, &error) || !string(translations, i, "translated", &translation, &error))
            return failure(error);
        if (original.isEmpty()) {
            // The header entry: its charset says how the other strings are encoded.
            if (!setCharsetFromHeader(translation, &error))
                return failure(error);
            continue;
        }
        // Plural messages keep their forms NUL-separated; the first form stands for the message.
        const qsizetype originalEnd = original.indexOf('\0');
        if (originalEnd >= 0)
            original.truncate(originalEnd);
        // A plural entry with an empty singular is no message either, like the header.
        if (original.isEmpty())
            continue;
        const qsizetype translationEnd = translation.indexOf('\0');
        if (translationEnd >= 0)
            translation.truncate(translationEnd);
        QString key;
        QString value;
        if (!decode(original, &key) || !decode(translation, &value))
            return failure(QStringLiteral("string %1 is not valid in the catalogue's charset").arg(i));
        if (!result.strings.contains(key))
            result.strings.insert(key, value);
    }
    return result;
}

} // namespace

MoCatalog parseMoCatalog(const QByteArray &data)
{
    return Parser(data).parse();
}

MoCatalog readMoCatalog(const QString &path)
{
    QFile file(path);
    if (!file.open(QIODevice::ReadOnly))
        return failure(QStringLiteral("%1: cannot open: %2").arg(path, file.errorString()));
    if (file.size() > kMaxMoFileSize)
        return failure(QStringLiteral("%1: catalogue of %2 bytes exceeds the limit of %3 bytes").arg(path).arg(file.size()).arg(kMaxMoFileSize));
    // Read one byte more than allowed so that a file that grew meanwhile is still refused.
    const QByteArray data = file.read(kMaxMoFileSize + 1);
    MoCatalog result = parseMoCatalog(data);
    if (!result.isValid())
        result.error = QStringLiteral("%1: %2").arg(path, result.error);
    return result;
}

} // namespace zaf::bundle
