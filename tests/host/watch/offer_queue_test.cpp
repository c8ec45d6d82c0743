// The bookkeeping of --watch: the queue keeps the order files were finished in, each file once, and
// the memory of offered files knows a file renamed but not one rewritten.
#include "host/watch/offer_queue.h"
#include "tests/support/temp_dir.h"

#include <QFile>

#include <gtest/gtest.h>

namespace zaf::host::watch {
namespace {

TEST(OfferQueue, GivesFilesFirstInFirstOutEachOnce)
{
    OfferQueue queue;
    EXPECT_EQ(queue.pop(), std::nullopt);
    EXPECT_TRUE(queue.push(QStringLiteral("/w/a.mp4")));
    EXPECT_TRUE(queue.push(QStringLiteral("/w/b.mp4")));
    EXPECT_FALSE(queue.push(QStringLiteral("/w/a.mp4"))) << "a file finished again keeps its place";
    EXPECT_TRUE(queue.push(QStringLiteral("/w/c.mp4")));
    EXPECT_EQ(queue.size(), 3);
    EXPECT_EQ(queue.pop(), QStringLiteral("/w/a.mp4"));
    EXPECT_TRUE(queue.push(QStringLiteral("/w/a.mp4"))) << "once taken out, it may come again";
    EXPECT_EQ(queue.pop(), QStringLiteral("/w/b.mp4"));
    EXPECT_EQ(queue.clear(), 2);
    EXPECT_TRUE(queue.isEmpty());
    EXPECT_EQ(queue.pop(), std::nullopt);
}

TEST(OfferedFiles, KnowsAFileRenamedButNotOneRewritten)
{
    test::ScratchDir scratch;
    const QString path = scratch.write(QStringLiteral("a.mp4"), 1000);
    OfferedFiles offered;
    const FileIdentity first = checkMovieFile(path).identity;
    ASSERT_NE(first.inode, ino_t(0));
    offered.remember(first);

    ASSERT_TRUE(QFile::rename(path, scratch.file(QStringLiteral("b.mp4"))));
    EXPECT_TRUE(offered.contains(checkMovieFile(scratch.file(QStringLiteral("b.mp4"))).identity));

    QFile file(scratch.file(QStringLiteral("b.mp4")));
    ASSERT_TRUE(file.open(QIODevice::Append));
    file.write("more");
    file.close();
    EXPECT_FALSE(offered.contains(checkMovieFile(file.fileName()).identity));

    const QString copy = scratch.write(QStringLiteral("c.mp4"), 1000);
    EXPECT_FALSE(offered.contains(checkMovieFile(copy).identity)) << "same bytes, another file";
    EXPECT_EQ(offered.size(), 1);
}

} // namespace
} // namespace zaf::host::watch
