#include "tests/platform/bundle/bundle_fixtures.h"

#include "platform/bundle/bundle.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QProcess>
#include <QTemporaryDir>
#include <gtest/gtest.h>

namespace zaf::bundle::test {

QByteArray compilePo(const QString &poSource, ByteOrder order)
{
    return compilePoBytes(poSource.toUtf8(), order);
}

QByteArray compilePoBytes(const QByteArray &poSource, ByteOrder order)
{
    QTemporaryDir dir;
    const QString po = dir.filePath(QStringLiteral("messages.po"));
    const QString mo = dir.filePath(QStringLiteral("messages.mo"));
    writeFile(po, poSource);
    QProcess msgfmt;
    QStringList arguments{QStringLiteral("--endianness=") + (order == ByteOrder::Big ? QStringLiteral("big") : QStringLiteral("little")),
                          QStringLiteral("-o"), mo, po};
    msgfmt.start(QStringLiteral(ZAF_MSGFMT), arguments);
    if (!msgfmt.waitForFinished(30000) || msgfmt.exitStatus() != QProcess::NormalExit || msgfmt.exitCode() != 0) {
        ADD_FAILURE() << "msgfmt failed: " << msgfmt.readAllStandardError().toStdString();
        return QByteArray();
    }
    QFile file(mo);
    if (!file.open(QIODevice::ReadOnly)) {
        ADD_FAILURE() << "msgfmt wrote no catalogue";
        return QByteArray();
    }
    return file.readAll();
}

static QString quoted(const QString &s)
{
    QString escaped = s;
    escaped.replace(QLatin1Char('\\'), QStringLiteral("\\\\")).replace(QLatin1Char('"'), QStringLiteral("\\\""));
    return QLatin1Char('"') + escaped + QLatin1Char('"');
}

QString poSource(const QList<std::pair<QString, QString>> &messages)
{
    QString source = QStringLiteral("msgid \"\"\nmsgstr \"\"\n\"Content-Type: text/plain; charset=UTF-8\\n\"\n\n");
    for (const auto &[id, str] : messages)
        source += QStringLiteral("msgid %1\nmsgstr %2\n\n").arg(quoted(id), quoted(str));
    return source;
}

void writeFile(const QString &path, const QByteArray &contents)
{
    ASSERT_TRUE(QDir().mkpath(QFileInfo(path).absolutePath())) << path.toStdString();
    QFile file(path);
    ASSERT_TRUE(file.open(QIODevice::WriteOnly | QIODevice::Truncate)) << path.toStdString();
    ASSERT_EQ(file.write(contents), contents.size());
}

void writeExecutable(const QString &path)
{
    writeFile(path, "#!/bin/sh\nexit 0\n");
    QFile::setPermissions(path, QFile::permissions(path) | QFile::ExeOwner | QFile::ReadOwner);
}

ScopedEnvironment::ScopedEnvironment(const char *name, const QByteArray &value)
    : m_name(name), m_wasSet(qEnvironmentVariableIsSet(name)), m_previous(qgetenv(name))
{
    qputenv(name, value);
}

ScopedEnvironment::~ScopedEnvironment()
{
    if (m_wasSet)
        qputenv(m_name, m_previous);
    else
        qunsetenv(m_name);
}

ScopedPreferredLanguages::ScopedPreferredLanguages(const QStringList &languages)
{
    setPreferredLanguagesForTesting(languages);
}

ScopedPreferredLanguages::~ScopedPreferredLanguages()
{
    setPreferredLanguagesForTesting({});
}

} // namespace zaf::bundle::test
