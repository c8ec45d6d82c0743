#include "publishing/plugin/upload/upload_chunk_device.h"

namespace zaf::publishing {

UploadChunkDevice::UploadChunkDevice(const QString &path, qint64 offset, qint64 length, QObject *parent)
    : QIODevice(parent), m_file(path), m_offset(offset), m_length(length)
{
}

bool UploadChunkDevice::openChunk()
{
    if (!m_file.open(QIODevice::ReadOnly)) {
        setErrorString(m_file.errorString());
        return false;
    }
    if (m_file.size() < m_offset + m_length || !m_file.seek(m_offset)) {
        setErrorString(QStringLiteral("The file %1 is shorter than the upload expects").arg(m_file.fileName()));
        m_file.close();
        return false;
    }
    m_read = 0;
    return QIODevice::open(QIODevice::ReadOnly | QIODevice::Unbuffered);
}

bool UploadChunkDevice::seek(qint64 pos)
{
    if (!isOpen() || pos < 0 || pos > m_length)
        return false;
    if (!m_file.seek(m_offset + pos)) {
        setErrorString(m_file.errorString());
        return false;
    }
    m_read = pos;
    return QIODevice::seek(pos);
}

void UploadChunkDevice::close()
{
    m_file.close();
    QIODevice::close();
}

qint64 UploadChunkDevice::readData(char *data, qint64 maxSize)
{
    const qint64 wanted = qMin(maxSize, m_length - m_read);
    if (wanted <= 0)
        return 0; // the end of the chunk
    const qint64 got = m_file.read(data, wanted);
    if (got < 0) {
        setErrorString(m_file.errorString());
        return -1;
    }
    if (got == 0)
        return -1; // the file shrank under us
    m_read += got;
    return got;
}

qint64 UploadChunkDevice::writeData(const char *, qint64)
{
    return -1;
}

} // namespace zaf::publishing
