#pragma once

#include "platform/files/file_manager.h"
#include "tempstore/temp_store.h"
#include "tests/support/log_capture.h"
#include "tests/support/temp_dir.h"

#include <gtest/gtest.h>

#include <chrono>
#include <set>

namespace zaf::test {

// A file manager whose removals fail for chosen names and whose volume reports a chosen free size;
// everything else is the real file system.
class ScriptedFileManager : public FileManager {
public:
    std::set<QString> failingRemovals;           // entry names whose removal fails with EBUSY
    std::optional<std::uint64_t> freeSize;       // when set, the volume reports it
    bool fileSystemUnreadable = false;

    OptionalError removeItemAtPath(const QString &path) const override
    {
        if (failingRemovals.count(path.section(QLatin1Char('/'), -1)))
            return Error::fromErrno(EBUSY, path);
        return FileManager::removeItemAtPath(path);
    }
    Result<FileSystemAttributes> attributesOfFileSystemForPath(const QString &path) const override
    {
        if (fileSystemUnreadable)
            return Result<FileSystemAttributes>::failure(Error::fromErrno(EIO, path));
        if (freeSize)
            return Result<FileSystemAttributes>::success({*freeSize, *freeSize});
        return FileManager::attributesOfFileSystemForPath(path);
    }
};

// A store over a private directory with a fixed "now".
class TempStoreTest : public ::testing::Test {
protected:
    static constexpr qint64 kNow = 1700000000; // whole seconds since 1970

    TempStoreTest()
        : dir(scratch.path() + QStringLiteral("/Zafrel/"))
        , store(fileManager, dir, [] { return Date(std::chrono::seconds(kNow)); })
    {
        store._srSetupTempDirectory();
        logs.clear();
    }

    // A file of `bytes` bytes in the store's directory, modified `age` seconds before now.
    QString entry(const QString &name, qint64 bytes, qint64 age)
    {
        const QString path = scratch.write(QStringLiteral("Zafrel/") + name, bytes);
        EXPECT_TRUE(setModificationTime(path, kNow - age));
        return path;
    }
    bool exists(const QString &name) const { return QFile::exists(dir + name); }

    ScratchDir scratch;
    ScriptedFileManager fileManager;
    QString dir;
    ZafTempStore store;
    LogCapture logs;
};

} // namespace zaf::test
