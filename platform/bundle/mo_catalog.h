#pragma once

// A reader for compiled gettext catalogues (".mo" files), the on-disk form of a bundle's string
// tables. It trusts nothing in the file: every offset and length is checked against the file's size
// before it is read, and any inconsistency turns the whole catalogue into an error.
//
// Keys: a message without context is found under its msgid; a message with a context under
// "CONTEXT\x04MSGID", the way gettext stores it. For plural messages the key is the singular msgid
// and the value the first translated form. The header entry (empty msgid) is not a message.

#include <QByteArray>
#include <QHash>
#include <QString>

namespace zaf::bundle {

// Files larger than this are refused without being read.
inline constexpr qint64 kMaxMoFileSize = 16 * 1024 * 1024;

struct MoCatalog {
    QHash<QString, QString> strings;
    QString error; // empty when the catalogue was read
    bool isValid() const { return error.isEmpty(); }
};

// Parses catalogue bytes (either byte order).
MoCatalog parseMoCatalog(const QByteArray &data);
// Reads and parses a catalogue file; the error names the file.
MoCatalog readMoCatalog(const QString &path);

} // namespace zaf::bundle
