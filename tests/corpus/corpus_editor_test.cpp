// Every corpus movie through the editor's open path: ready with a first picture and thumbnails, or
// failed with a logged error and the editor saying so. Every wait is bounded.
#include "tests/corpus/hostile_movies.h"
#include "tests/editor/editor_test_support.h"

#include "platform/media/image_generator.h"

namespace zaf::test::corpus {
namespace {

using zaf::media::PlayerItem;

constexpr int kHangMs = 60000;

class CorpusEditorTest : public EditorTest, public ::testing::WithParamInterface<HostileMovie> {};

TEST_P(CorpusEditorTest, OpenPathEndsCleanly)
{
    const HostileMovie &k = GetParam();
    if (const QString why = unavailableReason(k); !why.isEmpty())
        GTEST_SKIP() << qPrintable(why);
    const QString path = hostileMoviePath(k);
    ASSERT_FALSE(path.isEmpty());
    LogCapture log;
    auto editor = makeEditor(path);
    editor->view()->show();
    const std::shared_ptr<PlayerItem> item = editor->mvPlayer()->currentItem();
    ASSERT_TRUE(waitUntil([&] { return item->status() != PlayerItem::Status::Unknown; }, kHangMs))
        << "HANG: the movie " << k.name << " neither became ready nor failed within " << kHangMs / 1000 << " s";

    const bool ready = item->status() == PlayerItem::Status::ReadyToPlay;
    // Garbage, and a movie whose pictures no decoder may allocate, cannot be played: the item
    // fails and the editor says so instead of showing a black picture over an empty timeline.
    if (k.nature == Nature::Garbage || k.nature == Nature::TooLarge || (k.nature == Nature::Damaged && !ready)) {
        EXPECT_EQ(item->status(), PlayerItem::Status::Failed) << "WRONG SUCCESS: " << k.name << " is ready to play";
        EXPECT_TRUE(item->error());
        EXPECT_TRUE(loggedWarning(log)) << "the failure was not logged";
        EXPECT_TRUE(waitUntil([&] { return editor->unplayableMovieMessage() != nullptr; }, kHangMs));
        spin(200);
        EXPECT_TRUE(editor->mvPlayer()->currentVideoFrame().isNull());
        return;
    }
    ASSERT_TRUE(ready) << k.name << ": " << (item->error() ? qPrintable(item->error()->description()) : "no error");
    if (!k.hasVideo()) {
        EXPECT_TRUE(waitUntil([&] { return editor->unplayableMovieMessage() != nullptr; }, kHangMs)) << "sound alone is no movie to edit";
        return;
    }
    EXPECT_FALSE(editor->currentItemIsUnplayable());
    ASSERT_TRUE(waitUntil([&] { return !editor->mvPlayer()->currentVideoFrame().isNull(); }, kHangMs))
        << "HANG: no first picture of " << k.name << " within " << kHangMs / 1000 << " s";
    EXPECT_EQ(editor->mvPlayer()->currentVideoFrame().size(), k.videoSize);

    // Every thumbnail the timeline asks for arrives; a damaged movie may answer some with nothing
    // (the timeline keeps its placeholder), so there the generator only has to be asked.
    ui::MovieScrubber *scrubber = editor->mvTrimmer();
    ASSERT_TRUE(waitUntil([&] {
        const qsizetype wanted = scrubber->thumbnailTimestamps().size();
        if (wanted == 0 || !editor->thumbnailGenerator())
            return false;
        if (k.nature == Nature::Damaged)
            return editor->thumbnailGenerator()->requestedTimeCount() >= wanted;
        const auto &cache = editor->cachedTimeStamps();
        return cache && cache->size() >= wanted;
    }, kHangMs)) << "HANG: the timeline of " << k.name << " got no thumbnails within " << kHangMs / 1000 << " s";
    spin(100);
    if (k.nature == Nature::Valid) {
        for (const QImage &image : *editor->cachedTimeStamps())
            EXPECT_FALSE(image.isNull());
    }
}

INSTANTIATE_TEST_SUITE_P(Corpus, CorpusEditorTest, ::testing::ValuesIn(hostileMovies()), caseName);

} // namespace
} // namespace zaf::test::corpus
