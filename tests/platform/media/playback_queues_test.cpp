// The player's hand-overs between threads, the audio ring and the frame queue; thread tests never sleep.
#include "platform/media/playback/playback_audio_ring.h"
#include "platform/media/playback/playback_frame_queue.h"
#include "tests/support/named_cases.h"

#include <gtest/gtest.h>

#include <atomic>
#include <deque>
#include <functional>
#include <limits>
#include <optional>
#include <thread>
#include <vector>

namespace zaf::media::playback {
namespace {

constexpr qsizetype kRing = 64; // the smallest ring there is

// Bytes of a stream whose n-th byte is n modulo 251 (a prime, so no chunk size lines up with it).
std::vector<char> streamBytes(qsizetype from, qsizetype count)
{
    std::vector<char> bytes(static_cast<size_t>(count));
    for (qsizetype i = 0; i < count; ++i)
        bytes[size_t(i)] = char((from + i) % 251);
    return bytes;
}

// A give-up check that answers false `falseCalls` times, then true.
std::function<bool()> giveUpAfter(int falseCalls)
{
    return [calls = 0, falseCalls]() mutable { return calls++ >= falseCalls; };
}

ZAF_PRINT_CASES_AS_NAMES

struct RingStep {
    qsizetype write = 0; // bytes written first (never more than the room left)
    qsizetype read = 0;  // then bytes asked for
};

struct RingCase {
    const char *name;
    std::vector<RingStep> steps;
};

class AudioRingSequence : public ::testing::TestWithParam<RingCase> {};

// Writes and reads on one thread, against a model of the bytes held: every read returns what the
// model holds, up to the size asked for, in the order written.
TEST_P(AudioRingSequence, ReadsReturnTheWrittenBytesInOrder)
{
    AudioRing ring(kRing);
    std::deque<char> model;
    qsizetype written = 0;
    for (const RingStep &step : GetParam().steps) {
        const std::vector<char> bytes = streamBytes(written, step.write);
        ASSERT_TRUE(ring.write(bytes.data(), step.write, giveUpAfter(2))); // a write that wraps takes two steps
        model.insert(model.end(), bytes.begin(), bytes.end());
        written += step.write;
        ASSERT_EQ(ring.available(), qsizetype(model.size()));

        std::vector<char> out(size_t(step.read) + 1, '\xff');
        const qsizetype got = ring.read(out.data(), step.read);
        const qsizetype expected = std::min(step.read, qsizetype(model.size()));
        ASSERT_EQ(got, expected);
        EXPECT_TRUE(std::equal(out.begin(), out.begin() + got, model.begin()));
        EXPECT_EQ(out[size_t(got)], '\xff') << "nothing written past what was read";
        model.erase(model.begin(), model.begin() + got);
        ASSERT_EQ(ring.available(), qsizetype(model.size()));
    }
}

INSTANTIATE_TEST_SUITE_P(
    Cases, AudioRingSequence,
    ::testing::Values(RingCase{"EmptyRingReadsNothing", {{0, 16}}},
                      RingCase{"PartialReadsKeepTheRest", {{40, 10}, {0, 7}, {0, 100}}},
                      RingCase{"FillsToCapacity", {{kRing, 0}, {0, kRing}}},
                      RingCase{"WriteWrapsPastTheEnd", {{48, 40}, {40, 0}, {0, kRing}}},
                      RingCase{"ReadWrapsPastTheEnd", {{60, 50}, {30, 25}, {0, 15}}},
                      RingCase{"ManyLaps", {{50, 33}, {33, 41}, {41, 47}, {47, 49}, {50, 63}, {0, kRing}}}),
    test::caseName);

// A writer on a full ring that gives up keeps what fitted and returns false.
TEST(AudioRing, WriterGivingUpOnAFullRingKeepsWhatFitted)
{
    AudioRing ring(kRing);
    const std::vector<char> bytes = streamBytes(0, 100);
    EXPECT_FALSE(ring.write(bytes.data(), 100, giveUpAfter(1)));
    std::vector<char> out(100);
    ASSERT_EQ(ring.read(out.data(), 100), kRing);
    out.resize(size_t(kRing));
    EXPECT_EQ(out, streamBytes(0, kRing));
}

// The end mark leaves the data readable; a clear empties the ring and forgets the end.
TEST(AudioRing, EndMarkKeepsTheDataAndClearForgetsBoth)
{
    AudioRing ring(kRing);
    EXPECT_FALSE(ring.ended());
    ring.write("abc", 3, {});
    ring.setEnded();
    EXPECT_TRUE(ring.ended());
    char out[4] = {};
    EXPECT_EQ(ring.read(out, 2), 2);
    ring.clear();
    EXPECT_EQ(ring.available(), 0);
    EXPECT_FALSE(ring.ended());
    ring.write("xy", 2, {});
    ASSERT_EQ(ring.read(out, 4), 2);
    EXPECT_EQ(QByteArray(out, 2), "xy");
}

struct ReleaseCase {
    const char *name;
    std::function<void(AudioRing &, std::atomic<bool> &stop)> release;
    bool returns;             // what the writer's write() returns
    qsizetype availableAfter; // bytes in the ring once the writer is done
};

class AudioRingBlockedWriter : public ::testing::TestWithParam<ReleaseCase> {};

TEST_P(AudioRingBlockedWriter, WaitsForRoomUntilReleased)
{
    AudioRing ring(kRing);
    std::atomic<bool> stop = false;
    std::atomic<bool> returned = false;
    bool result = !GetParam().returns;
    const std::vector<char> bytes = streamBytes(0, 100);
    std::thread writer([&] {
        result = ring.write(bytes.data(), 100, [&] { return stop.load(); });
        returned = true;
    });
    while (ring.available() < kRing)
        std::this_thread::yield();
    EXPECT_FALSE(returned) << "a full ring holds its writer back";
    GetParam().release(ring, stop);
    writer.join();
    EXPECT_EQ(result, GetParam().returns);
    EXPECT_EQ(ring.available(), GetParam().availableAfter);
}

INSTANTIATE_TEST_SUITE_P(
    Cases, AudioRingBlockedWriter,
    ::testing::Values(ReleaseCase{"GiveUpAndWake", [](AudioRing &ring, std::atomic<bool> &stop) { stop = true; ring.wake(); }, false, kRing},
                      ReleaseCase{"ClearMakesRoom", [](AudioRing &ring, std::atomic<bool> &) { ring.clear(); }, true, 100 - kRing},
                      ReleaseCase{"ReadMakesRoom", [](AudioRing &ring, std::atomic<bool> &) { ring.read(std::vector<char>(kRing).data(), kRing); }, true, 100 - kRing}),
    test::caseName);

// One producer and one consumer on their own threads, in chunk sizes that never line up with the
// ring: every byte arrives once, in order.
TEST(AudioRing, ProducerAndConsumerThreadsKeepTheOrder)
{
    constexpr qsizetype kTotal = 1 << 20;
    AudioRing ring(1000);
    const std::vector<char> sent = streamBytes(0, kTotal);
    std::thread producer([&] {
        for (qsizetype at = 0, chunk = 1; at < kTotal; at += chunk, chunk = chunk % 997 + 13) {
            chunk = std::min(chunk, kTotal - at);
            ring.write(sent.data() + at, chunk, {});
        }
        ring.setEnded();
    });
    std::vector<char> received;
    received.reserve(size_t(kTotal));
    std::vector<char> buffer(1600);
    for (qsizetype ask = 7; !(ring.ended() && ring.available() == 0); ask = ask % 1499 + 29) {
        const qsizetype got = ring.read(buffer.data(), ask);
        received.insert(received.end(), buffer.begin(), buffer.begin() + got);
        if (got == 0)
            std::this_thread::yield();
    }
    producer.join();
    ASSERT_EQ(qsizetype(received.size()), kTotal);
    EXPECT_TRUE(received == sent);
}

VideoFrame frame(std::int64_t ptsNs, std::uint64_t generation = 1, bool seekResult = false)
{
    return VideoFrame{QImage(), ptsNs, generation, seekResult};
}

struct DueCase {
    const char *name;
    std::vector<VideoFrame> queued;
    std::uint64_t generation;
    std::int64_t ptsNs;
    std::optional<std::int64_t> taken; // the pts of the frame returned
    std::size_t left;                  // frames still queued
};

class FrameQueueTakeDue : public ::testing::TestWithParam<DueCase> {};

TEST_P(FrameQueueTakeDue, ReturnsTheLastDueFrameOfTheGeneration)
{
    const DueCase &c = GetParam();
    FrameQueue queue(8);
    for (const VideoFrame &f : c.queued)
        ASSERT_TRUE(queue.push(f, {}));
    const std::optional<VideoFrame> taken = queue.takeDue(c.generation, c.ptsNs);
    EXPECT_EQ(taken ? std::optional(taken->ptsNs) : std::nullopt, c.taken);
    EXPECT_EQ(queue.size(), c.left);
}

INSTANTIATE_TEST_SUITE_P(
    Cases, FrameQueueTakeDue,
    ::testing::Values(DueCase{"Empty", {}, 1, 1000, std::nullopt, 0},
                      DueCase{"NoneDueYet", {frame(100), frame(200)}, 1, 50, std::nullopt, 2},
                      DueCase{"DueAtItsTime", {frame(100)}, 1, 100, 100, 0},
                      DueCase{"LastOfSeveralDue", {frame(100), frame(200), frame(300)}, 1, 250, 200, 1},
                      DueCase{"SeekResultDueAtOnce", {frame(500, 1, true), frame(600)}, 1, 0, 500, 1},
                      DueCase{"OtherGenerationDropped", {frame(100, 1), frame(200, 1)}, 2, 1000, std::nullopt, 0}),
    test::caseName);

// What a push onto a queue holding `queued` frames of generation 1 does, with a give-up check that
// turns true after `giveUpAfter` calls.
struct PushCase {
    const char *name;
    std::size_t capacity;
    int queued;
    VideoFrame pushed;
    int giveUpAfter;
    bool returns;
    std::size_t left;
};

class FrameQueuePush : public ::testing::TestWithParam<PushCase> {};

TEST_P(FrameQueuePush, KeepsTheBound)
{
    const PushCase &c = GetParam();
    FrameQueue queue(c.capacity);
    for (int i = 0; i < c.queued; ++i)
        ASSERT_TRUE(queue.push(frame(100 * i, 1), {}));
    EXPECT_EQ(queue.push(c.pushed, giveUpAfter(c.giveUpAfter)), c.returns);
    EXPECT_EQ(queue.size(), c.left);
}

// A new generation drops the old frames instead of waiting; a capacity of 0 holds one frame; a
// give-up that holds at once appends nothing, even with room.
INSTANTIATE_TEST_SUITE_P(Cases, FrameQueuePush,
                         ::testing::Values(PushCase{"NewGenerationDropsTheOld", 2, 2, frame(50, 2), 1, true, 1},
                                           PushCase{"FullQueueRefusesOnGiveUp", 2, 2, frame(300, 1), 1, false, 2},
                                           PushCase{"CapacityZeroHoldsOne", 0, 1, frame(300, 1), 1, false, 1},
                                           PushCase{"GiveUpAppendsNothing", 4, 2, frame(300, 1), 0, false, 2}),
                         test::caseName);

struct FrameReleaseCase {
    const char *name;
    std::function<void(FrameQueue &, std::atomic<bool> &stop)> release;
    bool returns;     // what the producer's push() returns
    std::size_t left; // frames queued once the producer is done
};

class FrameQueueBlockedProducer : public ::testing::TestWithParam<FrameReleaseCase> {};

TEST_P(FrameQueueBlockedProducer, WaitsForRoomUntilReleased)
{
    FrameQueue queue(2);
    ASSERT_TRUE(queue.push(frame(100), {}));
    ASSERT_TRUE(queue.push(frame(200), {}));
    std::atomic<bool> stop = false;
    bool result = !GetParam().returns;
    std::thread producer([&] { result = queue.push(frame(300), [&] { return stop.load(); }); });
    GetParam().release(queue, stop);
    producer.join();
    EXPECT_EQ(result, GetParam().returns);
    EXPECT_EQ(queue.size(), GetParam().left);
}

INSTANTIATE_TEST_SUITE_P(
    Cases, FrameQueueBlockedProducer,
    ::testing::Values(FrameReleaseCase{"GiveUpAndWake", [](FrameQueue &queue, std::atomic<bool> &stop) { stop = true; queue.wake(); }, false, 2},
                      FrameReleaseCase{"ClearMakesRoom", [](FrameQueue &queue, std::atomic<bool> &) { queue.clear(); }, true, 1},
                      FrameReleaseCase{"TakeMakesRoom", [](FrameQueue &queue, std::atomic<bool> &) { queue.takeDue(1, 100); }, true, 2}),
    test::caseName);

// A decoder thread pushing into a small queue while the consumer takes whatever is due: the queue
// never holds more than its bound, and the pictures come out in order, ending with the last.
TEST(FrameQueue, ProducerAndConsumerThreadsKeepTheOrderWithinTheBound)
{
    constexpr std::int64_t kFrames = 2000;
    constexpr std::size_t kCapacity = 3;
    FrameQueue queue(kCapacity);
    std::thread producer([&] {
        for (std::int64_t pts = 0; pts < kFrames; ++pts)
            queue.push(frame(pts), {});
    });
    std::int64_t last = -1;
    bool ordered = true;
    std::size_t largest = 0;
    while (last != kFrames - 1) {
        largest = std::max(largest, queue.size());
        if (const std::optional<VideoFrame> taken = queue.takeDue(1, std::numeric_limits<std::int64_t>::max())) {
            ordered = ordered && taken->ptsNs > last;
            last = taken->ptsNs;
        } else {
            std::this_thread::yield();
        }
    }
    producer.join();
    EXPECT_TRUE(ordered);
    EXPECT_LE(largest, kCapacity);
}

} // namespace
} // namespace zaf::media::playback
