#pragma once

// A private scratch directory for one test, removed with everything in it afterwards.

#include <QString>
#include <QStringList>
#include <QTemporaryDir>

namespace zaf::test {

class ScratchDir {
public:
    ScratchDir();
    // The directory's absolute path, without a trailing "/".
    QString path() const { return m_dir.path(); }
    // A path inside it.
    QString file(const QString &name) const { return m_dir.filePath(name); }
    // Writes `bytes` bytes to a file inside it and returns its path.
    QString write(const QString &name, qint64 bytes) const;

private:
    QTemporaryDir m_dir;
};

// Every name in a directory, hidden ones too (so a temporary left behind shows), sorted.
QStringList entryNames(const QString &directory);

// A file's bytes; empty when it cannot be read.
QByteArray fileContents(const QString &path);

// SHA-256 of a file's bytes, to tell that a user's movie came through a fault untouched; empty
// when the file cannot be read.
QByteArray fileDigest(const QString &path);

// Sets a file's modification time to `secondsSinceEpoch` exactly (nanoseconds 0).
bool setModificationTime(const QString &path, qint64 secondsSinceEpoch);

} // namespace zaf::test
