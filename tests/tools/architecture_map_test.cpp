// The architecture map (docs/ARCHITECTURE.md) matches the tree: every folder it names exists, and
// every folder of the tree is named in it. A folder is named as `path/` in backquotes; `a/{b,c}/`
// names a/b and a/c, and naming a folder names its parents too.

#include "tests/support/child_process.h"

#include <QFile>
#include <QRegularExpression>
#include <QSet>

#include <gtest/gtest.h>

namespace {

void addWithParents(QSet<QString> &set, QString folder)
{
    while (!folder.isEmpty() && folder != QLatin1String(".")) {
        set.insert(folder);
        const qsizetype slash = folder.lastIndexOf(QLatin1Char('/'));
        folder = slash < 0 ? QString() : folder.left(slash);
    }
}

// `prefix{a,b}suffix` as its alternatives (one brace group at most, as the map writes them).
QStringList expanded(const QString &path)
{
    const qsizetype open = path.indexOf(QLatin1Char('{')), close = path.indexOf(QLatin1Char('}'));
    if (open < 0 || close < open)
        return {path};
    QStringList paths;
    for (const QString &choice : path.mid(open + 1, close - open - 1).split(QLatin1Char(',')))
        paths << path.left(open) + choice + path.mid(close + 1);
    return paths;
}

TEST(ArchitectureMap, NamesEveryFolderOfTheTreeAndNoOther)
{
    QFile map(QStringLiteral(ZAF_SOURCE_DIR "/docs/ARCHITECTURE.md"));
    ASSERT_TRUE(map.open(QIODevice::ReadOnly)) << "no docs/ARCHITECTURE.md";
    const QString text = QString::fromUtf8(map.readAll());
    QSet<QString> named;
    static const QRegularExpression folder(QStringLiteral("`(\\.?[A-Za-z0-9_{},.-]+(?:/[A-Za-z0-9_{},.-]+)*)/`"));
    for (const QRegularExpressionMatch &m : folder.globalMatch(text)) {
        for (const QString &path : expanded(m.captured(1)))
            addWithParents(named, path);
    }

    const zaf::test::ChildRun files = zaf::test::runChild(QStringLiteral("git"), {QStringLiteral("-C"), QStringLiteral(ZAF_SOURCE_DIR), QStringLiteral("ls-files")});
    if (!files.ok())
        GTEST_SKIP() << "the source is not a git checkout: " << files.err.toStdString();
    QSet<QString> tree;
    for (const QByteArray &line : files.out.split('\n')) {
        const QString file = QString::fromUtf8(line);
        const qsizetype slash = file.lastIndexOf(QLatin1Char('/'));
        if (slash > 0)
            addWithParents(tree, file.left(slash));
    }

    QStringList missing = QStringList(named.begin(), named.end()), unnamed;
    missing.removeIf([&](const QString &f) { return tree.contains(f); });
    for (const QString &f : tree) {
        if (!named.contains(f))
            unnamed << f;
    }
    missing.sort();
    unnamed.sort();
    EXPECT_TRUE(missing.isEmpty()) << "named in the map but not in the tree: " << missing.join(QLatin1String(", ")).toStdString();
    EXPECT_TRUE(unnamed.isEmpty()) << "in the tree but not in the map: " << unnamed.join(QLatin1String(", ")).toStdString();
}

} // namespace
