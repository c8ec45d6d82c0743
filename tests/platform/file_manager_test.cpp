// The file operations whose failure would lose data: moves and copies never overwrite.
#include "platform/files/file_manager.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>
#include <gtest/gtest.h>

namespace zaf {
namespace {

QByteArray contents(const QString &path)
{
    QFile f(path);
    return f.open(QIODevice::ReadOnly) ? f.readAll() : QByteArray();
}

TEST(FileManager, MoveAndCopyNeverOverwrite)
{
    test::ScratchDir scratch;
    FileManager &fm = FileManager::defaultManager();
    const QString a = scratch.write(QStringLiteral("a"), 10);
    const QString b = scratch.write(QStringLiteral("b"), 20);

    OptionalError e = fm.moveItemAtPath(a, b);
    ASSERT_TRUE(e.has_value());
    EXPECT_EQ(e->code, EEXIST);
    e = fm.copyItemAtPath(a, b);
    ASSERT_TRUE(e.has_value());
    EXPECT_EQ(e->code, EEXIST);
    EXPECT_EQ(contents(b).size(), 20);
    EXPECT_EQ(contents(a).size(), 10);
}

TEST(FileManager, CopyWritesTheWholeFileAndLeavesNoTemporaries)
{
    test::ScratchDir scratch;
    FileManager &fm = FileManager::defaultManager();
    const QString a = scratch.write(QStringLiteral("a"), 300000);
    ASSERT_TRUE(QDir(scratch.path()).mkdir(QStringLiteral("out")));
    const QString c = scratch.file(QStringLiteral("out/c"));
    EXPECT_FALSE(fm.copyItemAtPath(a, c).has_value());
    EXPECT_EQ(contents(c), contents(a));
    EXPECT_EQ(QDir(scratch.file(QStringLiteral("out"))).entryList(QDir::AllEntries | QDir::Hidden | QDir::NoDotAndDotDot),
              QStringList{QStringLiteral("c")});

    // A directory or a missing file is not copied, and nothing is left behind.
    EXPECT_EQ(fm.copyItemAtPath(scratch.file(QStringLiteral("out")), scratch.file(QStringLiteral("d")))->code, EINVAL);
    EXPECT_EQ(fm.copyItemAtPath(scratch.file(QStringLiteral("none")), scratch.file(QStringLiteral("d")))->code, ENOENT);
    EXPECT_FALSE(QFile::exists(scratch.file(QStringLiteral("d"))));
}

TEST(FileManager, RemoveListAndAttributesReportErrors)
{
    test::ScratchDir scratch;
    FileManager &fm = FileManager::defaultManager();
    EXPECT_EQ(fm.removeItemAtPath(scratch.file(QStringLiteral("none")))->code, ENOENT);
    EXPECT_EQ(fm.contentsOfDirectoryAtPath(scratch.file(QStringLiteral("none"))).error->code, ENOENT);
    EXPECT_EQ(fm.attributesOfItemAtPath(scratch.file(QStringLiteral("none"))).error->code, ENOENT);

    ASSERT_FALSE(fm.createDirectoryAtPath(scratch.file(QStringLiteral("x/y/z")), true, 0700).has_value());
    scratch.write(QStringLiteral("x/y/z/f"), 5);
    const Result<FileAttributes> attrs = fm.attributesOfItemAtPath(scratch.file(QStringLiteral("x/y/z/f")));
    ASSERT_TRUE(attrs.ok());
    EXPECT_EQ(attrs.value->size, 5);
    EXPECT_FALSE(attrs.value->isDirectory);
    EXPECT_EQ(fm.contentsOfDirectoryAtPath(scratch.file(QStringLiteral("x"))).value, QStringList{QStringLiteral("y")});
    EXPECT_FALSE(fm.removeItemAtPath(scratch.file(QStringLiteral("x"))).has_value());
    EXPECT_FALSE(fm.fileExistsAtPath(scratch.file(QStringLiteral("x"))));
}

} // namespace
} // namespace zaf
