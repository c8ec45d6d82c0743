#pragma once

// A small AppStream collection written at test time into a directory of the test's own, so store
// lookups never see the system's catalogue. The path is fixed per test: AppStream keeps a cache file
// per catalogue path, and as root in a system directory XDG_CACHE_HOME does not move, so a random path
// would leave a new file there on every run.

#include <QByteArray>
#include <QDir>
#include <QFile>
#include <QString>
#include <QTemporaryDir>

#include <gtest/gtest.h>

namespace zaf::test {

// A complete component (with a German name), one without a name, and one with a name only.
inline const char *kFixtureCollection = R"(<?xml version="1.0" encoding="UTF-8"?>
<components version="0.16" origin="zaf-fixture">
  <component type="desktop-application">
    <id>org.zafrel.Recorder</id>
    <name>Zafrel Recorder</name><name xml:lang="de">Zafrel Rekorder</name><summary>Records the screen</summary>
    <developer_name>Zafrel Labs</developer_name>
    <categories><category>AudioVideo</category><category>Recorder</category></categories>
  </component>
  <component type="desktop-application">
    <id>org.zafrel.Nameless</id><summary>Has no name</summary><developer_name>Nameless Works</developer_name>
  </component>
  <component type="desktop-application">
    <id>org.zafrel.Plain</id><name>Plain App</name><summary>Has a name only</summary>
  </component>
</components>
)";

// A collection file cut off in the middle of a tag.
inline const char *kCorruptCollection = "<?xml version=\"1.0\"?>\n<components version=\"0.16\"><component><id>org.zafrel.Bro";

class CatalogueDirectory {
public:
    // `variant` tells apart two directories of the same test.
    explicit CatalogueDirectory(const QString &variant = {})
    {
        const auto *info = ::testing::UnitTest::GetInstance()->current_test_info();
        const QString name = info ? QStringLiteral("%1.%2").arg(QString::fromUtf8(info->test_suite_name()),
                                                                QString::fromUtf8(info->name()))
                                  : QStringLiteral("global");
        m_path = QDir::temp().filePath(QStringLiteral("zaf-store-fixtures/") + name
                                       + (variant.isEmpty() ? QString() : QLatin1Char('.') + variant));
        QDir(m_path).removeRecursively();
        QDir().mkpath(m_path);
        qputenv("XDG_CACHE_HOME", m_cache.path().toUtf8());
    }
    ~CatalogueDirectory() { QDir(m_path).removeRecursively(); }
    CatalogueDirectory(const CatalogueDirectory &) = delete;
    CatalogueDirectory &operator=(const CatalogueDirectory &) = delete;

    QString path() const { return m_path; }
    QString write(const QString &fileName, const QByteArray &contents) const
    {
        const QString file = QDir(m_path).filePath(fileName);
        QFile out(file);
        EXPECT_TRUE(out.open(QIODevice::WriteOnly | QIODevice::Truncate));
        out.write(contents);
        return file;
    }

private:
    QTemporaryDir m_cache;
    QString m_path;
};

} // namespace zaf::test
