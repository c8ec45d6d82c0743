// Creating the directory, the directory constant and the movie names.
#include "tests/tempstore/temp_store_fixture.h"

#include "tempstore/temp_directory.h"

#include <QRegularExpression>

#include <ctime>
#include <sys/stat.h>

namespace zaf::test {
namespace {

TEST(TempStoreSetup, CreatesThePrivateDirectoryOnce)
{
    ScratchDir scratch;
    LogCapture logs;
    ZafTempStore store(FileManager::defaultManager(), scratch.path() + QStringLiteral("/Zafrel/"));
    store._srSetupTempDirectory();

    struct stat st;
    ASSERT_EQ(::stat(QFile::encodeName(store._srTempPath()).constData(), &st), 0);
    EXPECT_TRUE(S_ISDIR(st.st_mode));
    EXPECT_EQ(st.st_mode & 0777, 0700u);

    scratch.write(QStringLiteral("Zafrel/keep.mp4"), 4);
    store._srSetupTempDirectory();
    EXPECT_TRUE(QFile::exists(scratch.file(QStringLiteral("Zafrel/keep.mp4"))));
    EXPECT_EQ(logs.messages(QStringLiteral("zaf.tempstore")),
              QStringList({QStringLiteral("_srSetupTempDirectory"), QStringLiteral("_srSetupTempDirectory")}));
}

TEST(TempStoreSetup, AFileInTheWayIsLeftAlone)
{
    ScratchDir scratch;
    const QString path = scratch.write(QStringLiteral("Zafrel"), 3);
    ZafTempStore store(FileManager::defaultManager(), path + QStringLiteral("/"));
    LogCapture logs;
    store._srSetupTempDirectory();
    EXPECT_EQ(QFileInfo(path).size(), 3);
    EXPECT_EQ(logs.entries().size(), 1) << "only the informational entry";
}

TEST(TempStoreSetup, MissingParentIsReportedNotCreated)
{
    ScratchDir scratch;
    ZafTempStore store(FileManager::defaultManager(), scratch.path() + QStringLiteral("/no/parent/Zafrel/"));
    LogCapture logs;
    store._srSetupTempDirectory();
    EXPECT_FALSE(QFile::exists(scratch.file(QStringLiteral("no"))));
    EXPECT_EQ(logs.messages(QStringLiteral("zaf.tempstore")),
              QStringList({QStringLiteral("_srSetupTempDirectory"), QStringLiteral("error creating temp directory")}));
    const QStringList console = logs.messages(QStringLiteral("default"));
    ASSERT_EQ(console.size(), 1);
    EXPECT_TRUE(console[0].startsWith(QStringLiteral("error: Error Domain=posix Code=%1").arg(ENOENT)));
}

TEST(TempStoreSetup, ProcessStartCreatesTheMissingParentsToo)
{
    ScratchDir scratch;
    ZafTempStore store(FileManager::defaultManager(), scratch.path() + QStringLiteral("/cache/deep/Zafrel/"));
    store.prepareAtProcessStart();
    EXPECT_TRUE(QFileInfo(store._srTempPath()).isDir());
    EXPECT_EQ(QFileInfo(scratch.file(QStringLiteral("cache"))).permissions() & QFileDevice::ReadOther, 0);
}

TEST(TempStoreNames, DirectoryIsAbsoluteAndEndsInASlash)
{
    const QString &dir = ZafScreenRecorderTempDirectory();
    EXPECT_TRUE(dir.startsWith(QLatin1Char('/')));
    EXPECT_TRUE(dir.endsWith(QLatin1Char('/')));
    EXPECT_EQ(&dir, &ZafScreenRecorderTempDirectory()) << "resolved once per process";
    if (qEnvironmentVariableIsEmpty("ZAF_TEMP_DIRECTORY")) {
        EXPECT_TRUE(dir.endsWith(QStringLiteral("/Zafrel/")));
    }
    EXPECT_EQ(ZafTempStore::defaultStore()._srTempPath(), dir);
    EXPECT_EQ(ZafScreenRecorderRequiredFreeSpace, 100000000);
}

TEST(TempStoreNames, MovieNamesAreStemSecondsAndExtension)
{
    const qint64 before = std::time(nullptr);
    const QString name = ZafTempMovieFileName(QStringLiteral("/tmp/Zafrel//ZafReplay_Final"));
    const qint64 after = std::time(nullptr);
    const QRegularExpressionMatch m =
        QRegularExpression(QStringLiteral("^/tmp/Zafrel//ZafReplay_Final(\\d+)\\.mp4$")).match(name);
    ASSERT_TRUE(m.hasMatch()) << name.toStdString();
    EXPECT_GE(m.captured(1).toLongLong(), before);
    EXPECT_LE(m.captured(1).toLongLong(), after);
    EXPECT_TRUE(ZafTempMovieFileName(QStringLiteral("a%1b_")).startsWith(QStringLiteral("a%1b_")));
}

} // namespace
} // namespace zaf::test
