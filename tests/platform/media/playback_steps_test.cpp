// The decoders' steps on their own: the decoded-frame window, the audio mix and lead-in, the request hand-over.
#include "platform/media/playback/playback_audio_mix.h"
#include "platform/media/playback/playback_decoder_thread.h"
#include "platform/media/playback/playback_frame_window.h"
#include "tests/support/named_cases.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <functional>
#include <optional>
#include <vector>

namespace zaf::media::playback {
namespace {

ZAF_PRINT_CASES_AS_NAMES

// A run of decoding into a window: the pictures of one run (no seek within it), `bytes` each.
struct DecodedRun {
    std::vector<std::int64_t> pts; // in the order the decoder produced them
    bool first = false;            // the run starts at the stream's first picture, after an earlier target
    bool reachesTheEnd = false;    // its last picture is the stream's last
};

void decodeInto(FrameWindow &window, const DecodedRun &run, std::int64_t bytes = 1)
{
    std::optional<std::int64_t> previous;
    for (std::int64_t pts : run.pts) {
        window.insert(pts, nullptr, bytes, previous, run.first && !previous);
        previous = pts;
    }
    if (run.reachesTheEnd && previous)
        window.markLast(*previous);
}

struct WindowCase {
    const char *name;
    std::vector<DecodedRun> runs;
    std::int64_t timeNs;
    std::optional<std::int64_t> exact;
};

class FrameWindowExact : public ::testing::TestWithParam<WindowCase> {};

// The window knows the picture shown at a time only when it holds the latest picture at or before
// it and the one after, from the same run.
TEST_P(FrameWindowExact, AnswersWithThePictureShownAtTheTimeOnlyWhenItKnows)
{
    const WindowCase &c = GetParam();
    FrameWindow window(1 << 20);
    for (const DecodedRun &run : c.runs)
        decodeInto(window, run);
    EXPECT_EQ(window.exactAt(c.timeNs), c.exact);
}

INSTANTIATE_TEST_SUITE_P(
    Cases, FrameWindowExact,
    ::testing::Values(WindowCase{"PictureAtTheTime", {{{0, 40, 80, 120}}}, 80, 80},
                      WindowCase{"BetweenPicturesTheEarlierOne", {{{0, 40, 80, 120}}}, 100, 80},
                      WindowCase{"LastPictureOfARunIsNotKnownYet", {{{0, 40, 80}}}, 100, std::nullopt},
                      WindowCase{"PastTheStreamsLastPicture", {{{0, 40, 80}, false, true}}, 500, 80},
                      WindowCase{"BeforeTheStreamsFirstPicture", {{{40, 80}, true}}, 0, 40},
                      WindowCase{"BeforeARunThatIsNotTheFirst", {{{40, 80}}}, 0, std::nullopt},
                      // Two runs with a gap: 120 and 160 were never decoded between them.
                      WindowCase{"GapBetweenRuns", {{{0, 40, 80}}, {{200, 240}}}, 150, std::nullopt},
                      WindowCase{"SecondRunAnswersItsOwnTimes", {{{0, 40, 80}}, {{200, 240}}}, 210, 200},
                      // A run that reached a picture again continues the links of the first.
                      WindowCase{"RunsThatMeet", {{{0, 40, 80}}, {{80, 120, 160}}}, 90, 80},
                      WindowCase{"TimesGoingBackwardLinkNothing", {{{0, 80, 40}}}, 50, std::nullopt},
                      WindowCase{"EmptyWindow", {}, 0, std::nullopt}),
    test::caseName);

struct TrimCase {
    const char *name;
    std::int64_t budget;
    std::int64_t focusNs;
    FrameWindow::Kept keep;
    std::vector<std::int64_t> left;
};

class FrameWindowTrim : public ::testing::TestWithParam<TrimCase> {};

// Over its budget the window drops the pictures farthest from the focus, never the kept ones, and
// forgets what it dropped: a successor that is gone is no successor.
TEST_P(FrameWindowTrim, DropsTheFarthestPicturesFirst)
{
    const TrimCase &c = GetParam();
    FrameWindow window(1 << 20);
    decodeInto(window, DecodedRun{{0, 40, 80, 120, 160, 200}}, 10);
    window.setBudget(c.budget);
    window.trim(c.focusNs, c.keep);
    std::vector<std::int64_t> left;
    for (std::int64_t pts : {0, 40, 80, 120, 160, 200}) {
        if (window.latestAt(pts, pts))
            left.push_back(pts);
    }
    EXPECT_EQ(left, c.left);
    EXPECT_EQ(window.bytes(), std::int64_t(c.left.size()) * 10);
    EXPECT_EQ(window.size(), c.left.size());
    for (std::int64_t pts : left) {
        if (const auto next = window.successorOf(pts)) {
            EXPECT_NE(std::find(left.begin(), left.end(), *next), left.end());
        }
    }
}

INSTANTIATE_TEST_SUITE_P(
    Cases, FrameWindowTrim,
    ::testing::Values(TrimCase{"WithinTheBudget", 60, 0, {}, {0, 40, 80, 120, 160, 200}},
                      TrimCase{"FocusInTheMiddle", 30, 100, {}, {80, 120, 160}},
                      TrimCase{"FocusAtTheStart", 20, 0, {}, {0, 40}},
                      TrimCase{"FocusPastTheEnd", 20, 900, {}, {160, 200}},
                      TrimCase{"KeptPicturesStayBeyondTheBudget", 10, 200, {{0, 40, std::nullopt}}, {0, 40}},
                      TrimCase{"NothingButKeptPictures", 0, 100, {{0, 200, 120}}, {0, 120, 200}}),
    test::caseName);

struct MixCase {
    const char *name;
    int channels;
    std::vector<std::vector<float>> lanes;
    std::vector<bool> ended;
    bool all;
    std::vector<float> mixed;
    std::vector<float> thenRest; // what is left, mixed at the end of the input
};

class AudioMixTake : public ::testing::TestWithParam<MixCase> {};

constexpr std::size_t kSkewFrames = 4;

TEST_P(AudioMixTake, SumsWhatTheLanesShareAndKeepsTheRest)
{
    const MixCase &c = GetParam();
    AudioMix mix(c.channels, kSkewFrames);
    mix.reset(c.lanes.size());
    for (std::size_t lane = 0; lane < c.lanes.size(); ++lane) {
        mix.append(lane, c.lanes[lane].data(), c.lanes[lane].size());
        if (c.ended[lane])
            mix.end(lane);
    }
    const auto near = [](const std::vector<float> &expected) {
        return ::testing::Pointwise(::testing::FloatNear(1e-6f), expected);
    };
    EXPECT_THAT(mix.take(c.all), near(c.mixed));
    EXPECT_THAT(mix.take(true), near(c.thenRest));
}

INSTANTIATE_TEST_SUITE_P(
    Cases, AudioMixTake,
    ::testing::Values(MixCase{"SumsTheStretchAllLanesHave", 1, {{0.25f, 0.25f, 0.5f}, {0.5f, 0.5f}}, {false, false}, false, {0.75f, 0.75f}, {0.5f}},
                      MixCase{"LimitsToFullScale", 1, {{0.75f, -0.75f}, {0.5f, -0.5f}}, {false, false}, false, {1.0f, -1.0f}, {}},
                      MixCase{"WaitsForALiveLaneWithNothing", 1, {{0.1f, 0.2f}, {}}, {false, false}, false, {}, {0.1f, 0.2f}},
                      MixCase{"AnEndedLaneHoldsNothingBack", 1, {{0.1f, 0.2f}, {}}, {false, true}, false, {0.1f, 0.2f}, {}},
                      MixCase{"AllTakesEverythingLeft", 1, {{0.1f, 0.2f, 0.3f}, {0.5f}}, {false, false}, true, {0.6f, 0.2f, 0.3f}, {}},
                      MixCase{"SkewAtTheLimitStillWaits", 1, {{0.1f, 0.1f, 0.1f, 0.1f}, {}}, {false, false}, false, {}, {0.1f, 0.1f, 0.1f, 0.1f}},
                      MixCase{"SkewPastTheLimitGoesOn", 1, {{0.1f, 0.1f, 0.1f, 0.1f, 0.1f}, {}}, {false, false}, false, {0.1f, 0.1f, 0.1f, 0.1f, 0.1f}, {}},
                      MixCase{"CountsWholeFramesOfEveryChannel", 2, {{0.1f, 0.2f, 0.3f}, {0.1f, 0.1f, 0.1f, 0.1f}}, {false, false}, false, {0.2f, 0.3f}, {0.4f, 0.1f}}),
    test::caseName);

struct LeadInCase {
    const char *name;
    double targetSeconds;
    double firstSampleSeconds;
    std::size_t drop;
    std::size_t silence;
};

class AudioLeadIn : public ::testing::TestWithParam<LeadInCase> {};

TEST_P(AudioLeadIn, LinesTheFirstSampleUpWithTheTarget)
{
    const LeadInCase &c = GetParam();
    const LeadIn lead = leadIn(c.targetSeconds, c.firstSampleSeconds, 100, 2);
    EXPECT_EQ(lead.dropSamples, c.drop);
    EXPECT_EQ(lead.silenceSamples, c.silence);
}

INSTANTIATE_TEST_SUITE_P(
    Cases, AudioLeadIn,
    ::testing::Values(LeadInCase{"OnTime", 1.0, 1.0, 0, 0},
                      LeadInCase{"EarlyAudioIsDropped", 1.0, 0.75, 50, 0},
                      LeadInCase{"LateAudioIsPaddedWithSilence", 1.0, 1.5, 0, 100},
                      LeadInCase{"SilenceIsCapped", 0.0, 60.0, 0, std::size_t(kMaxLeadingSilenceSeconds * 100 * 2)}),
    test::caseName);

// A burst of requests reaches the thread as its latest one; a newer request is seen between steps;
// stopping wakes a thread waiting for work.
TEST(DecoderThreadRequests, TheLatestRequestIsTakenAndStopWakesAWaitingThread)
{
    DecoderThread<int> thread(std::function<void()>{});
    EXPECT_FALSE(thread.take(false).has_value());
    thread.post(1);
    EXPECT_EQ(thread.post(2), 2u);
    const auto taken = thread.take(false);
    ASSERT_TRUE(taken.has_value());
    EXPECT_EQ(taken->request, 2);
    EXPECT_EQ(taken->number, 2u);
    EXPECT_FALSE(thread.hasNewerRequest());
    thread.post(3);
    EXPECT_TRUE(thread.hasNewerRequest());
    ASSERT_TRUE(thread.take(true).has_value());

    bool tookOne = true;
    thread.start([&] { tookOne = thread.take(true).has_value(); });
    thread.stop();
    EXPECT_FALSE(tookOne);
}

} // namespace
} // namespace zaf::media::playback
