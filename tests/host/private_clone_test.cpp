// The private clone of a movie a user opens: the clone holds the bytes, goes with its folder, and
// a folder left by a zaf-host that was killed is swept by the next one, never one still in use.
#include "host/private_clone.h"
#include "platform/files/directory_lock.h"
#include "tests/support/named_cases.h"
#include "tests/support/temp_dir.h"

#include <QDir>
#include <QFile>

#include <gtest/gtest.h>

#include <sys/time.h>

namespace zaf::host {
namespace {

ZAF_PRINT_CASES_AS_NAMES

QByteArray contents(const QString &path)
{
    QFile file(path);
    return file.open(QIODevice::ReadOnly) ? file.readAll() : QByteArray();
}

TEST(PrivateClone, HoldsTheBytesAndGoesWithItsFolderLeavingTheSource)
{
    test::ScratchDir scratch;
    const QString source = scratch.write(QStringLiteral("movie.mp4"), 200000);
    const QByteArray before = contents(source);
    QString folder;
    {
        QString error;
        const std::unique_ptr<PrivateClone> clone = PrivateClone::make(source, scratch.file(QStringLiteral("cache")), &error);
        ASSERT_NE(clone, nullptr) << error.toStdString();
        EXPECT_EQ(contents(clone->path()), before);
        folder = QFileInfo(clone->path()).absolutePath();
        EXPECT_TRUE(QFileInfo(folder).fileName().startsWith(QLatin1String("zafrel-open-")));
        EXPECT_EQ(PrivateClone::sweep(scratch.file(QStringLiteral("cache")), 0), 0) << "a folder in use is never swept";
        ASSERT_TRUE(QFile::remove(clone->path())) << "as the editor's save does";
    }
    EXPECT_FALSE(QFileInfo::exists(folder));
    EXPECT_EQ(contents(source), before);
}

struct SweepCase {
    const char *name;
    const char *folder;
    bool old;    // untouched for two minutes
    bool locked; // its owner still runs
    bool swept;
};

class PrivateCloneSweep : public ::testing::TestWithParam<SweepCase> {};

TEST_P(PrivateCloneSweep, RemovesOnlyOldFoldersWhoseOwnerIsGone)
{
    const SweepCase &c = GetParam();
    test::ScratchDir cache;
    const QString folder = cache.file(QLatin1String(c.folder));
    ASSERT_TRUE(QDir().mkpath(folder));
    cache.write(QLatin1String(c.folder) + QStringLiteral("/movie.mp4"), 1000);
    if (c.old) {
        const timeval twoMinutesAgo[2] = {{time(nullptr) - 120, 0}, {time(nullptr) - 120, 0}};
        ASSERT_EQ(::utimes(QFile::encodeName(folder).constData(), twoMinutesAgo), 0);
    }
    Result<DirectoryLock> lock = Result<DirectoryLock>::failure(Error{});
    if (c.locked)
        lock = DirectoryLock::lock(folder, DirectoryLock::Wait::No);
    EXPECT_EQ(PrivateClone::sweep(cache.path()), c.swept ? 1 : 0);
    EXPECT_EQ(QFileInfo::exists(folder), !c.swept);
}

INSTANTIATE_TEST_SUITE_P(Folders, PrivateCloneSweep,
                         ::testing::Values(SweepCase{"LeftByAKilledHost", "zafrel-open-abc123", true, false, true},
                                           SweepCase{"StillInUse", "zafrel-open-abc123", true, true, false},
                                           SweepCase{"JustMade", "zafrel-open-abc123", false, false, false},
                                           SweepCase{"NotOurs", "other-abc123", true, false, false}),
                         test::caseName);

} // namespace
} // namespace zaf::host
