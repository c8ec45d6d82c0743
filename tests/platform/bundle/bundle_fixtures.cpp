#include "tests/platform/bundle/bundle_fixtures.h"
#include "tests/support/child_process.h"

#include <QDir>
#include <QFile>
#include <QFileInfo>
#include <QTemporaryDir>
#include <gtest/gtest.h>

namespace zaf::bundle::test {

QByteArray compilePo(const QByteArray &poSource, ByteOrder order)
{
    QTemporaryDir dir;
    const QString po = dir.filePath(QStringLiteral("messages.po"));
    const QString mo = dir.filePath(QStringLiteral("messages.mo"));
    writeFile(po, poSource);
    const zaf::test::ChildRun msgfmt = zaf::test::runChild(QStringLiteral(ZAF_MSGFMT),
        {order == ByteOrder::Big ? QStringLiteral("--endianness=big") : QStringLiteral("--endianness=little"), QStringLiteral("-o"), mo, po});
    QFile file(mo);
    if (!msgfmt.ok() || !file.open(QIODevice::ReadOnly)) {
        ADD_FAILURE() << "msgfmt failed: " << msgfmt.error.toStdString() << msgfmt.err.toStdString();
        return QByteArray();
    }
    return file.readAll();
}

QByteArray poSource(const QList<std::pair<QString, QString>> &messages)
{
    const auto quoted = [](QString s) {
        return QLatin1Char('"') + s.replace(QLatin1Char('\\'), QStringLiteral("\\\\")).replace(QLatin1Char('"'), QStringLiteral("\\\"")) + QLatin1Char('"');
    };
    QString source = QStringLiteral("msgid \"\"\nmsgstr \"\"\n\"Content-Type: text/plain; charset=UTF-8\\n\"\n\n");
    for (const auto &[id, str] : messages)
        source += QStringLiteral("msgid %1\nmsgstr %2\n\n").arg(quoted(id), quoted(str));
    return source.toUtf8();
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

void writeTable(const QString &bundleDir, const QString &localization, const QString &table,
                const QList<std::pair<QString, QString>> &pairs)
{
    writeFile(QStringLiteral("%1/%2.lproj/%3.mo").arg(bundleDir, localization, table), compilePo(poSource(pairs)));
}

void writeDesktopEntry(const QString &dataDir, const QString &id, const QString &body)
{
    writeFile(QStringLiteral("%1/applications/%2.desktop").arg(dataDir, id), ("[Desktop Entry]\nType=Application\n" + body).toUtf8());
}

} // namespace zaf::bundle::test
