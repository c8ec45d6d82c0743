// The decoders' steps on their own: exact seeks, the audio mix and lead-in, the request hand-over.
#include "platform/media/playback/playback_audio_mix.h"
#include "platform/media/playback/playback_decoder_thread.h"
#include "platform/media/playback/playback_exact_seek.h"
#include "tests/support/named_cases.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <optional>
#include <vector>

namespace zaf::media::playback {
namespace {

ZAF_PRINT_CASES_AS_NAMES

struct HandedOn {
    std::int64_t ptsNs;
    bool seekResult;
    bool operator==(const HandedOn &) const = default;
};

struct SeekCase {
    const char *name;
    std::int64_t targetNs;
    std::vector<std::int64_t> decoded; // presentation times, in decoding order
    std::vector<HandedOn> handedOn;
};

class ExactSeekPictures : public ::testing::TestWithParam<SeekCase> {};

// Plays the decoder's part: holds, hands on and, at the end of the stream, hands on the held one.
TEST_P(ExactSeekPictures, AnswerTheSeekWithThePictureShownAtTheTarget)
{
    const SeekCase &c = GetParam();
    ExactSeek seek;
    seek.begin(c.targetNs);
    std::optional<std::int64_t> held;
    std::vector<HandedOn> handedOn;
    for (std::int64_t pts : c.decoded) {
        const ExactSeek::Choice choice = seek.next(pts);
        if (choice.hold) {
            held = pts;
            continue;
        }
        if (choice.handOnHeld)
            handedOn.push_back({held.value(), true});
        handedOn.push_back({pts, choice.seekResult});
    }
    if (seek.end())
        handedOn.push_back({held.value(), true});
    EXPECT_EQ(handedOn, c.handedOn);
    EXPECT_FALSE(seek.seeking());
}

INSTANTIATE_TEST_SUITE_P(
    Cases, ExactSeekPictures,
    ::testing::Values(SeekCase{"PictureAtTheTarget", 80, {0, 40, 80, 120}, {{80, true}, {120, false}}},
                      SeekCase{"BetweenPicturesTheEarlierOne", 100, {0, 40, 80, 120, 160}, {{80, true}, {120, false}, {160, false}}},
                      SeekCase{"BeforeTheFirstPicture", 0, {40, 80}, {{40, true}, {80, false}}},
                      SeekCase{"PastTheLastPictureTheLastOne", 500, {0, 40, 80}, {{80, true}}},
                      SeekCase{"NoPictures", 100, {}, {}}),
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
