// The video library: playable movies only, room checked, unique names, never a partial file.
#include "platform/photos/photo_library.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/temp_dir.h"

#include <QCoreApplication>
#include <QDir>
#include <QThread>
#include <gtest/gtest.h>

#include <future>

namespace zaf::photos {
namespace {

struct Outcome {
    bool success = false;
    OptionalError error;
    bool onMainThread = true;
};

Outcome save(PhotoLibrary &library, const QUrl &movie)
{
    std::promise<Outcome> promise;
    library.performChanges([movie](PhotoLibraryChangeRequest &r) { r.creationRequestForAssetFromVideoAtFileURL(movie); },
                           [&](bool success, const OptionalError &error) {
                               promise.set_value({success, error, QThread::currentThread() == qApp->thread()});
                           });
    auto future = promise.get_future();
    EXPECT_EQ(future.wait_for(std::chrono::seconds(30)), std::future_status::ready);
    return future.get();
}

QStringList entries(const QString &dir)
{
    return QDir(dir).entryList(QDir::AllEntries | QDir::Hidden | QDir::NoDotAndDotDot, QDir::Name);
}

// A volume that reports a chosen free size.
class SmallVolume : public FileManager {
public:
    std::uint64_t freeSize = 0;
    Result<FileSystemAttributes> attributesOfFileSystemForPath(const QString &) const override
    {
        return Result<FileSystemAttributes>::success({freeSize, freeSize});
    }
};

TEST(PhotoLibrary, SavesCopiesUnderUniqueNamesAndKeepsTheSource)
{
    test::ScratchDir scratch;
    const QString movie = test::makeFixtureMovie(scratch.path(), {});
    PhotoLibrary library(scratch.file(QStringLiteral("Videos")));
    const Outcome first = save(library, QUrl::fromLocalFile(movie));
    const Outcome second = save(library, QUrl::fromLocalFile(movie));
    EXPECT_TRUE(first.success);
    EXPECT_TRUE(second.success);
    EXPECT_FALSE(first.onMainThread);
    const QStringList saved = entries(library.libraryDirectory());
    ASSERT_EQ(saved.size(), 2) << saved.join(u',').toStdString();
    EXPECT_NE(saved[0], saved[1]);
    EXPECT_TRUE(QFile::exists(movie));
    for (const QString &name : saved)
        EXPECT_EQ(test::streamMD5(QDir(library.libraryDirectory()).filePath(name), QStringLiteral("0")),
                  test::streamMD5(movie, QStringLiteral("0")));
}

TEST(PhotoLibrary, RefusesNonMoviesAndFullVolumesWithoutWritingAnything)
{
    test::ScratchDir scratch;
    PhotoLibrary library(scratch.file(QStringLiteral("Videos")));
    const Outcome garbage = save(library, QUrl::fromLocalFile(scratch.write(QStringLiteral("x.mp4"), 5000)));
    EXPECT_FALSE(garbage.success);
    ASSERT_TRUE(garbage.error.has_value());
    EXPECT_EQ(garbage.error->code, kPhotoLibraryErrorNotPlayable);

    const QString movie = test::makeFixtureMovie(scratch.path(), {});
    SmallVolume volume;
    volume.freeSize = std::uint64_t(QFileInfo(movie).size());
    PhotoLibrary full(scratch.file(QStringLiteral("Full")), volume);
    const Outcome noRoom = save(full, QUrl::fromLocalFile(movie));
    EXPECT_FALSE(noRoom.success);
    ASSERT_TRUE(noRoom.error.has_value());
    EXPECT_EQ(noRoom.error->code, kPhotoLibraryErrorNotEnoughSpace);
    EXPECT_TRUE(entries(scratch.file(QStringLiteral("Full"))).isEmpty());

    // A library that cannot be made (a file stands where its parent should be).
    const QString blocker = scratch.write(QStringLiteral("blocker"), 1);
    PhotoLibrary unavailable(blocker + QStringLiteral("/Videos"));
    const Outcome blocked = save(unavailable, QUrl::fromLocalFile(movie));
    ASSERT_TRUE(blocked.error.has_value());
    EXPECT_EQ(blocked.error->code, kPhotoLibraryErrorLibraryUnavailable);
    EXPECT_TRUE(QFile::exists(movie));
}

} // namespace
} // namespace zaf::photos
