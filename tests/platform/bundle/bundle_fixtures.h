#pragma once

// Fixtures for the bundle tests: gettext catalogues compiled with msgfmt at test time, desktop
// entries and bundle directories in a scratch directory, and the XDG environment pointed at it.

#include <QByteArray>
#include <QString>
#include <QStringList>

namespace zaf::bundle::test {

enum class ByteOrder { Little, Big };

// Compiles .po source with msgfmt; fails the current test (and returns "") when msgfmt fails.
QByteArray compilePo(const QString &poSource, ByteOrder order = ByteOrder::Little);
// The same for .po bytes in the charset their header declares.
QByteArray compilePoBytes(const QByteArray &poSource, ByteOrder order = ByteOrder::Little);
// A .po source with a UTF-8 header and the given msgid/msgstr pairs.
QString poSource(const QList<std::pair<QString, QString>> &messages);

// Writes a file, creating its folders.
void writeFile(const QString &path, const QByteArray &contents);
// Writes an executable shell script that does nothing.
void writeExecutable(const QString &path);

// Sets an environment variable for the lifetime of the object, then restores it.
class ScopedEnvironment {
public:
    ScopedEnvironment(const char *name, const QByteArray &value);
    ~ScopedEnvironment();
    ScopedEnvironment(const ScopedEnvironment &) = delete;
    ScopedEnvironment &operator=(const ScopedEnvironment &) = delete;

private:
    const char *m_name;
    bool m_wasSet;
    QByteArray m_previous;
};

// Sets the preferred languages for the lifetime of the object.
class ScopedPreferredLanguages {
public:
    explicit ScopedPreferredLanguages(const QStringList &languages);
    ~ScopedPreferredLanguages();
};

} // namespace zaf::bundle::test
