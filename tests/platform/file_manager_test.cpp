// The file operations whose failure would lose data: moves and copies never overwrite, copies are
// whole or absent, and failures carry the errno.
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

TEST(FileManager, MoveAndCopyNeverOverwriteAndCopyWritesTheWholeFileOrNothing)
{
    test::ScratchDir scratch;
    const FileManager &fm = FileManager::defaultManager();
    const QString a = scratch.write("a", 300000);
    const QString b = scratch.write("b", 20);
    EXPECT_EQ(fm.moveItemAtPath(a, b).value_or(Error{}).code, EEXIST);
    EXPECT_EQ(fm.copyItemAtPath(a, b).value_or(Error{}).code, EEXIST);
    EXPECT_EQ(contents(b).size(), 20);
    EXPECT_EQ(contents(a).size(), 300000);

    ASSERT_TRUE(QDir(scratch.path()).mkdir("out"));
    EXPECT_FALSE(fm.copyItemAtPath(a, scratch.file("out/c")).has_value());
    EXPECT_EQ(contents(scratch.file("out/c")), contents(a));
    EXPECT_EQ(QDir(scratch.file("out")).entryList(QDir::AllEntries | QDir::Hidden | QDir::NoDotAndDotDot), QStringList{"c"})
        << "no temporaries left behind";
    // A directory or a missing file is not copied, and nothing is left behind.
    EXPECT_EQ(fm.copyItemAtPath(scratch.file("out"), scratch.file("d")).value_or(Error{}).code, EINVAL);
    EXPECT_EQ(fm.copyItemAtPath(scratch.file("none"), scratch.file("d")).value_or(Error{}).code, ENOENT);
    EXPECT_FALSE(QFile::exists(scratch.file("d")));
}

TEST(FileManager, RemoveListAndAttributesReportErrors)
{
    test::ScratchDir scratch;
    const FileManager &fm = FileManager::defaultManager();
    const QString none = scratch.file("none");
    EXPECT_EQ(fm.removeItemAtPath(none).value_or(Error{}).code, ENOENT);
    EXPECT_EQ(fm.contentsOfDirectoryAtPath(none).error.value_or(Error{}).code, ENOENT);
    EXPECT_EQ(fm.attributesOfItemAtPath(none).error.value_or(Error{}).code, ENOENT);

    ASSERT_FALSE(fm.createDirectoryAtPath(scratch.file("x/y/z"), true, 0700).has_value());
    scratch.write("x/y/z/f", 5);
    const Result<FileAttributes> attrs = fm.attributesOfItemAtPath(scratch.file("x/y/z/f"));
    ASSERT_TRUE(attrs.ok());
    EXPECT_EQ(attrs.value->size, 5);
    EXPECT_FALSE(attrs.value->isDirectory);
    EXPECT_EQ(fm.contentsOfDirectoryAtPath(scratch.file("x")).value, QStringList{"y"});
    EXPECT_FALSE(fm.removeItemAtPath(scratch.file("x")).has_value());
    EXPECT_FALSE(fm.fileExistsAtPath(scratch.file("x")));
}

} // namespace
} // namespace zaf
