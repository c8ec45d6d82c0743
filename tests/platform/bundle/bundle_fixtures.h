#pragma once

// Fixtures for the bundle and identity tests: string tables compiled with msgfmt at test time,
// desktop entries, scratch files, and settings undone at the end of a scope.

#include "platform/bundle/bundle.h"

#include <QByteArray>
#include <QString>
#include <QStringList>

#include <utility>

namespace zaf::bundle::test {

enum class ByteOrder { Little, Big };

// Compiles .po source (in the charset its header declares) with msgfmt; fails the current test and
// returns "" when msgfmt fails.
QByteArray compilePo(const QByteArray &poSource, ByteOrder order = ByteOrder::Little);
// A .po source with a UTF-8 header and the given msgid/msgstr pairs.
QByteArray poSource(const QList<std::pair<QString, QString>> &messages);
// Writes a file, creating its folders.
void writeFile(const QString &path, const QByteArray &contents);
// Writes an executable shell script that does nothing.
void writeExecutable(const QString &path);
// Writes BUNDLE/LOCALIZATION.lproj/TABLE.mo holding the pairs.
void writeTable(const QString &bundleDir, const QString &localization, const QString &table,
                const QList<std::pair<QString, QString>> &pairs);
// Writes an application's desktop entry DATA/applications/ID.desktop with this body after its Type.
void writeDesktopEntry(const QString &dataDir, const QString &id, const QString &body);

// Sets an environment variable for the lifetime of the object, then restores it.
class ScopedEnvironment {
public:
    ScopedEnvironment(const char *name, const QByteArray &value)
        : m_name(name), m_wasSet(qEnvironmentVariableIsSet(name)), m_previous(qgetenv(name))
    {
        qputenv(name, value);
    }
    ~ScopedEnvironment() { m_wasSet ? qputenv(m_name, m_previous) : qunsetenv(m_name); }
    ScopedEnvironment(const ScopedEnvironment &) = delete;
    ScopedEnvironment &operator=(const ScopedEnvironment &) = delete;

private:
    const char *m_name;
    bool m_wasSet;
    QByteArray m_previous;
};

// Sets the preferred languages for the lifetime of the object.
struct ScopedPreferredLanguages {
    explicit ScopedPreferredLanguages(const QStringList &languages) { setPreferredLanguagesForTesting(languages); }
    ~ScopedPreferredLanguages() { setPreferredLanguagesForTesting({}); }
};

} // namespace zaf::bundle::test
