#pragma once

// Bundles written at test time: localization folders with tables compiled by msgfmt, and desktop
// entries in a private XDG data directory.

#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>
#include <QProcess>
#include <QString>
#include <gtest/gtest.h>

#include <utility>

namespace zaf::test {

// Writes DIR/LANG.lproj/TABLE.mo holding the pairs (compiled with msgfmt).
inline void writeTable(const QString &bundleDir, const QString &localization, const QString &table,
                       const QList<std::pair<QString, QString>> &pairs)
{
    const QString folder = bundleDir + QLatin1Char('/') + localization + QStringLiteral(".lproj");
    QDir().mkpath(folder);
    const QString po = folder + QLatin1Char('/') + table + QStringLiteral(".po");
    QFile f(po);
    ASSERT_TRUE(f.open(QIODevice::WriteOnly));
    f.write("msgid \"\"\nmsgstr \"Content-Type: text/plain; charset=UTF-8\\n\"\n\n");
    for (const auto &[key, text] : pairs)
        f.write(QStringLiteral("msgid \"%1\"\nmsgstr \"%2\"\n\n").arg(key, text).toUtf8());
    f.close();
    QProcess msgfmt;
    msgfmt.start(QStringLiteral("msgfmt"), {QStringLiteral("-o"), folder + QLatin1Char('/') + table + QStringLiteral(".mo"), po});
    ASSERT_TRUE(msgfmt.waitForFinished(30000));
    ASSERT_EQ(msgfmt.exitCode(), 0) << msgfmt.readAllStandardError().toStdString();
    QFile::remove(po);
}

// Writes an application's desktop entry ID.desktop into DATA/applications.
inline void writeDesktopEntry(const QString &dataDir, const QString &id, const QString &body)
{
    QDir().mkpath(dataDir + QStringLiteral("/applications"));
    QFile f(dataDir + QStringLiteral("/applications/") + id + QStringLiteral(".desktop"));
    ASSERT_TRUE(f.open(QIODevice::WriteOnly));
    f.write(QStringLiteral("[Desktop Entry]\nType=Application\n%1").arg(body).toUtf8());
}

} // namespace zaf::test
