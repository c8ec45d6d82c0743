#pragma once

// Bundles written at test time: string tables in localization folders, and desktop entries.

#include "tests/platform/bundle/bundle_fixtures.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>
#include <gtest/gtest.h>

namespace zaf::test {

// The languages the shipped string tables are in.
inline const auto kShippedLanguages = ::testing::Values("en", "de", "fr", "es", "ja");
inline std::string languageName(const ::testing::TestParamInfo<const char *> &info)
{
    return info.param;
}

// Writes DIR/LANG.lproj/TABLE.mo holding the pairs.
inline void writeTable(const QString &bundleDir, const QString &localization, const QString &table,
                       const QList<std::pair<QString, QString>> &pairs)
{
    bundle::test::writeFile(QStringLiteral("%1/%2.lproj/%3.mo").arg(bundleDir, localization, table),
                            bundle::test::compilePo(bundle::test::poSource(pairs)));
}

// Writes an application's desktop entry ID.desktop into DATA/applications.
inline void writeDesktopEntry(const QString &dataDir, const QString &id, const QString &body)
{
    bundle::test::writeFile(QStringLiteral("%1/applications/%2.desktop").arg(dataDir, id),
                            ("[Desktop Entry]\nType=Application\n" + body).toUtf8());
}

} // namespace zaf::test
