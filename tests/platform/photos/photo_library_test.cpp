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

Outcome save(PhotoLibrary &library, const QString &movie)
{
    std::promise<Outcome> promise;
    library.performChanges(
        [movie](PhotoLibraryChangeRequest &r) { r.creationRequestForAssetFromVideoAtFileURL(QUrl::fromLocalFile(movie)); },
        [&](bool success, const OptionalError &error) { promise.set_value({success, error, QThread::currentThread() == qApp->thread()}); });
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

TEST(PhotoLibrary, SavesCopiesUnderUniqueNamesOffTheMainThreadAndKeepsTheSource)
{
    test::ScratchDir scratch;
    const QString movie = test::makeFixtureMovie(scratch.path(), {});
    PhotoLibrary library(scratch.file("Videos"));
    const Outcome first = save(library, movie);
    EXPECT_TRUE(first.success);
    EXPECT_FALSE(first.onMainThread);
    EXPECT_TRUE(save(library, movie).success);
    const QStringList saved = entries(library.libraryDirectory());
    ASSERT_EQ(saved.size(), 2) << saved.join(',').toStdString();
    EXPECT_TRUE(QFile::exists(movie));
    for (const QString &name : saved)
        EXPECT_EQ(test::streamMD5(QDir(library.libraryDirectory()).filePath(name), "0"), test::streamMD5(movie, "0"));
}

TEST(PhotoLibrary, RefusesNonMoviesFullVolumesAndUnusableLibrariesWithoutWritingAnything)
{
    test::ScratchDir scratch;
    auto expectRefused = [](PhotoLibrary library, const QString &movie, int code) {
        const Outcome outcome = save(library, movie);
        EXPECT_FALSE(outcome.success);
        EXPECT_EQ(outcome.error.value_or(Error{}).code, code);
        EXPECT_TRUE(entries(library.libraryDirectory()).isEmpty());
        EXPECT_TRUE(QFile::exists(movie));
    };
    expectRefused(PhotoLibrary(scratch.file("Videos")), scratch.write("x.mp4", 5000), kPhotoLibraryErrorNotPlayable);
    const QString movie = test::makeFixtureMovie(scratch.path(), {});
    SmallVolume volume;
    volume.freeSize = std::uint64_t(QFileInfo(movie).size());
    expectRefused(PhotoLibrary(scratch.file("Full"), volume), movie, kPhotoLibraryErrorNotEnoughSpace);
    // A library that cannot be made: a file stands where its parent should be.
    expectRefused(PhotoLibrary(scratch.write("blocker", 1) + "/Videos"), movie, kPhotoLibraryErrorLibraryUnavailable);
}

} // namespace
} // namespace zaf::photos
