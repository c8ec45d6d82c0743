// Removal, move and prefix clean-up: off the caller's thread, completions on worker threads.
#include "tests/tempstore/temp_store_fixture.h"

#include "platform/dispatch.h"

#include <QCoreApplication>
#include <QDir>
#include <QThread>
#include <QThreadPool>
#include <QUrl>

#include <future>

namespace zaf::test {
namespace {

struct CompletionResult {
    OptionalError error;
    bool onMainThread = true;
};

// Runs an operation with a completion and waits for the completion's result.
template <typename Op>
CompletionResult await(Op op)
{
    std::promise<CompletionResult> promise;
    op([&promise](const OptionalError &e) {
        promise.set_value({e, QThread::currentThread() == QCoreApplication::instance()->thread()});
    });
    auto future = promise.get_future();
    EXPECT_EQ(future.wait_for(std::chrono::seconds(10)), std::future_status::ready);
    return future.get();
}

QUrl url(const QString &path)
{
    return QUrl::fromLocalFile(path);
}

TEST_F(TempStoreTest, RemoveFileRemovesOffTheMainThread)
{
    const QString path = entry(QStringLiteral("gone.mp4"), 10, 0);
    const CompletionResult r = await([&](auto done) { store._srRemoveFile(url(path), done); });
    EXPECT_FALSE(r.error.has_value());
    EXPECT_FALSE(r.onMainThread);
    EXPECT_FALSE(QFile::exists(path));
}

TEST_F(TempStoreTest, RemoveFileOfNothingCompletesWithoutErrorOrLog)
{
    const CompletionResult r = await([&](auto done) { store._srRemoveFile(url(dir + QStringLiteral("none.mp4")), done); });
    EXPECT_FALSE(r.error.has_value());
    EXPECT_TRUE(logs.entries().isEmpty());
}

TEST_F(TempStoreTest, RemoveFileFailureReachesTheCompletionAndTheLog)
{
    const QString path = entry(QStringLiteral("stuck.mp4"), 10, 0);
    fileManager.failingRemovals = {QStringLiteral("stuck.mp4")};
    const CompletionResult r = await([&](auto done) { store._srRemoveFile(url(path), done); });
    ASSERT_TRUE(r.error.has_value());
    EXPECT_EQ(r.error->code, EBUSY);
    EXPECT_EQ(logs.count(QStringLiteral("_zavRemoveFile error: %1").arg(EBUSY)), 1);
    EXPECT_TRUE(QFile::exists(path));
}

TEST_F(TempStoreTest, RemoveFileWithoutCompletionStillRemoves)
{
    const QString path = entry(QStringLiteral("quiet.mp4"), 10, 0);
    store._srRemoveFile(url(path));
    dispatch::globalQueue(dispatch::Priority::Background).waitForDone();
    EXPECT_FALSE(QFile::exists(path));
}

TEST_F(TempStoreTest, MoveReplacesAnExistingDestination)
{
    const QString from = entry(QStringLiteral("from.mp4"), 123, 0);
    const QString to = entry(QStringLiteral("to.mp4"), 9, 0);
    const CompletionResult r = await([&](auto done) { store._srMoveFileFromURL(url(from), url(to), done); });
    EXPECT_FALSE(r.error.has_value());
    EXPECT_FALSE(r.onMainThread);
    EXPECT_FALSE(QFile::exists(from));
    EXPECT_EQ(QFileInfo(to).size(), 123);
}

TEST_F(TempStoreTest, MoveOfMissingSourceLeavesNoDestinationAndReportsTheError)
{
    const QString to = entry(QStringLiteral("to.mp4"), 9, 0);
    const CompletionResult r = await(
        [&](auto done) { store._srMoveFileFromURL(url(dir + QStringLiteral("absent.mp4")), url(to), done); });
    ASSERT_TRUE(r.error.has_value());
    EXPECT_EQ(r.error->code, ENOENT);
    EXPECT_FALSE(QFile::exists(to));
    EXPECT_EQ(logs.count(QStringLiteral("_zavMoveFileFromURL error: %1").arg(ENOENT)), 1);
}

TEST_F(TempStoreTest, PrefixCleanupIgnoresCaseAndDiacriticsAndRemovesMatchingDirectoriesWhole)
{
    const QStringList matching = {QStringLiteral("ZafReplay_Final1.mp4"), QStringLiteral("zafreplay_final2.mp4"),
                                  QStringLiteral("ZÀFRÉPLAY_FINAL3.mp4"), QString::fromUtf8("Zafreplay_Fi\xC3\xB1" "al4.mp4")};
    for (const QString &name : matching)
        entry(name, 1, 0);
    entry(QStringLiteral("Other_ZafReplay_Final.mp4"), 1, 0);
    entry(QStringLiteral("ZafReplay_Fina"), 1, 0);
    ASSERT_TRUE(QDir(dir).mkpath(QStringLiteral("ZAFREPLAY_FINALdir/deeper")));
    entry(QStringLiteral("ZAFREPLAY_FINALdir/deeper/x.mp4"), 1, 0);
    ASSERT_TRUE(QDir(dir).mkdir(QStringLiteral("keep")));
    entry(QStringLiteral("keep/ZafReplay_Final9.mp4"), 1, 0);

    store._srDeleteFilesWithPrefix(QStringLiteral("zafreplay_final"));
    dispatch::globalQueue(dispatch::Priority::Default).waitForDone();

    for (const QString &name : matching)
        EXPECT_FALSE(exists(name)) << name.toStdString();
    EXPECT_FALSE(exists(QStringLiteral("ZAFREPLAY_FINALdir")));
    EXPECT_TRUE(exists(QStringLiteral("Other_ZafReplay_Final.mp4")));
    EXPECT_TRUE(exists(QStringLiteral("ZafReplay_Fina")));
    EXPECT_TRUE(exists(QStringLiteral("keep/ZafReplay_Final9.mp4"))) << "the clean-up never descends";
}

TEST_F(TempStoreTest, PrefixCleanupLogsEachFailedRemovalAndGoesOn)
{
    entry(QStringLiteral("ZafReplay_YouTube1.mp4"), 1, 0);
    entry(QStringLiteral("ZafReplay_YouTube2.mp4"), 1, 0);
    entry(QStringLiteral("ZafReplay_YouTube3.mp4"), 1, 0);
    fileManager.failingRemovals = {QStringLiteral("ZafReplay_YouTube1.mp4"), QStringLiteral("ZafReplay_YouTube3.mp4")};

    store._srDeleteFilesWithPrefix(QStringLiteral("ZafReplay_YouTube"));
    dispatch::globalQueue(dispatch::Priority::Default).waitForDone();

    EXPECT_EQ(logs.count(QStringLiteral("_zavDeleteFilesWithPrefix error: %1").arg(EBUSY)), 2);
    EXPECT_FALSE(exists(QStringLiteral("ZafReplay_YouTube2.mp4")));
}

TEST_F(TempStoreTest, PrefixCleanupOfMissingDirectoryDoesNothing)
{
    ZafTempStore missing(fileManager, scratch.path() + QStringLiteral("/absent/"));
    missing._srDeleteFilesWithPrefix(QStringLiteral("x"));
    dispatch::globalQueue(dispatch::Priority::Default).waitForDone();
    EXPECT_TRUE(logs.entries().isEmpty());
}

} // namespace
} // namespace zaf::test
