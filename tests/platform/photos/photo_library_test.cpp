// The video library: playable movies only, room checked, unique names, never a partial file.
#include "platform/photos/photo_library.h"
#include "tests/support/log_capture.h"
#include "tests/support/media/fixture_movies.h"
#include "tests/support/named_cases.h"
#include "tests/support/private_mounts.h"
#include "tests/support/temp_dir.h"

#include <QCoreApplication>
#include <QDir>
#include <QThread>
#include <gtest/gtest.h>

#include <future>

namespace zaf::photos {
namespace {

ZAF_PRINT_CASES_AS_NAMES

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

// A volume that reports a chosen free size.
class SmallVolume : public FileManager {
public:
    std::uint64_t freeSize = 0;
    Result<FileSystemAttributes> attributesOfFileSystemForPath(const QString &) const override
    {
        return Result<FileSystemAttributes>::success({freeSize, freeSize});
    }
};

TEST(PhotoLibrary, SavesCopiesUnderUniqueNamesOffTheMainThread)
{
    test::ScratchDir scratch;
    const QString movie = test::makeFixtureMovie(scratch.path(), {});
    PhotoLibrary library(scratch.file("Videos"));
    const Outcome first = save(library, movie);
    EXPECT_TRUE(first.success);
    EXPECT_FALSE(first.onMainThread);
    EXPECT_TRUE(save(library, movie).success);
    const QStringList saved = test::entryNames(library.libraryDirectory());
    ASSERT_EQ(saved.size(), 2) << saved.join(',').toStdString();
    EXPECT_TRUE(QFile::exists(movie));
    for (const QString &name : saved)
        EXPECT_EQ(test::streamMD5(QDir(library.libraryDirectory()).filePath(name), "0"), test::streamMD5(movie, "0"));
}

// A save the library refuses writes nothing and keeps the source.
struct Refusal {
    const char *name;
    int code;
};

class PhotoLibraryRefusal : public ::testing::TestWithParam<Refusal> {};

TEST_P(PhotoLibraryRefusal, WritesNothing)
{
    test::ScratchDir scratch;
    const QString name = QString::fromLatin1(GetParam().name);
    const QString movie = name == "NotAMovie" ? scratch.write("x.mp4", 5000) : test::makeFixtureMovie(scratch.path(), {});
    SmallVolume full;
    full.freeSize = std::uint64_t(QFileInfo(movie).size());
    // A library that cannot be made: a file stands where its parent should be.
    PhotoLibrary library = name == "FullVolume" ? PhotoLibrary(scratch.file("Full"), full)
                           : name == "LibraryBlocked" ? PhotoLibrary(scratch.write("blocker", 1) + "/Videos")
                                                      : PhotoLibrary(scratch.file("Videos"));
    const Outcome outcome = save(library, movie);
    EXPECT_FALSE(outcome.success);
    EXPECT_EQ(outcome.error.value_or(Error{}).code, GetParam().code);
    EXPECT_TRUE(test::entryNames(library.libraryDirectory()).isEmpty());
    EXPECT_TRUE(QFile::exists(movie));
}

INSTANTIATE_TEST_SUITE_P(Cases, PhotoLibraryRefusal,
                         ::testing::Values(Refusal{"NotAMovie", kPhotoLibraryErrorNotPlayable}, Refusal{"FullVolume", kPhotoLibraryErrorNotEnoughSpace},
                                           Refusal{"LibraryBlocked", kPhotoLibraryErrorLibraryUnavailable}),
                         test::caseName);

// The library on a file system of its own that fails the copy: one that fills up part-way through
// (its volume claims room enough, so the copy starts) and a read-only one. The save fails with a
// logged error and the right code, the library holds nothing, not even a partial file, and the
// source is as it was.
struct OwnVolumeCase {
    const char *name;
    bool readOnly;
    int code;
};

class PhotoLibraryOnItsOwnVolume : public ::testing::TestWithParam<OwnVolumeCase> {};

TEST_P(PhotoLibraryOnItsOwnVolume, FailsWithALoggedErrorLeavingNothingAndKeepingTheSource)
{
    if (!test::insidePrivateMounts())
        return test::runThisTestInPrivateMounts();
    test::ScratchDir scratch;
    const QString movie = test::makeFixtureMovie(scratch.path(), {});
    const qint64 size = QFileInfo(movie).size();
    ASSERT_GT(size, 16 * 1024);
    const QByteArray before = test::fileDigest(movie);
    const QString directory = scratch.file("Videos");
    ASSERT_TRUE(QDir().mkpath(directory));
    const test::ScopedTmpfs volume(directory, GetParam().readOnly ? 64 * 1024 * 1024 : size / 2 / 4096 * 4096, GetParam().readOnly);
    if (!volume.mounted())
        return;
    SmallVolume roomy;
    roomy.freeSize = 1ull << 40;
    test::LogCapture logs;
    PhotoLibrary library(directory, roomy);
    const Outcome outcome = save(library, movie);
    EXPECT_FALSE(outcome.success);
    EXPECT_EQ(outcome.error.value_or(Error{}).code, GetParam().code) << outcome.error.value_or(Error{}).message.toStdString();
    EXPECT_TRUE(test::entryNames(directory).isEmpty()) << test::entryNames(directory).join(", ").toStdString();
    EXPECT_EQ(test::fileDigest(movie), before);
    const QString logged = logs.messages("zaf.photos").join('\n');
    EXPECT_TRUE(logged.contains("cannot add the video to " + directory)) << logged.toStdString();
}

INSTANTIATE_TEST_SUITE_P(Faults, PhotoLibraryOnItsOwnVolume,
                         ::testing::Values(OwnVolumeCase{"FillsUpMidCopy", false, kPhotoLibraryErrorNotEnoughSpace},
                                           OwnVolumeCase{"ReadOnly", true, kPhotoLibraryErrorLibraryUnavailable}),
                         test::caseName);

} // namespace
} // namespace zaf::photos
