// Media times: conversion from seconds with rounding, invalid and infinite values, exact comparison across
// timescales, and arithmetic.
#include "platform/media/media_time.h"

#include <gtest/gtest.h>

#include <cmath>

namespace zaf::media {
namespace {

TEST(MediaTime, FromSecondsRoundsToTheTimescaleTiesAwayFromZeroAndFlagsRounding)
{
    const MediaTime exact = MediaTime::fromSeconds(2.5, 600);
    EXPECT_EQ(exact.value, 1500);
    EXPECT_EQ(exact.flags, MediaTime::Valid);
    const MediaTime third = MediaTime::fromSeconds(1.0 / 3.0, 1000000000);
    EXPECT_EQ(third.value, 333333333);
    EXPECT_TRUE(third.flags & MediaTime::HasBeenRounded);
    EXPECT_EQ(MediaTime::fromSeconds(0.0025, 1000).value, 3);
    EXPECT_EQ(MediaTime::fromSeconds(-0.0025, 1000).value, -3);
    EXPECT_EQ(MediaTime::fromSeconds(47.3, 30).value, 1419);
}

TEST(MediaTime, InvalidAndInfiniteTimesConvertAsExpected)
{
    EXPECT_TRUE(std::isnan(MediaTime::invalid().seconds()));
    EXPECT_FALSE(MediaTime::fromSeconds(std::nan(""), 600).isValid());
    EXPECT_FALSE(MediaTime::fromSeconds(1.0, 0).isValid());
    EXPECT_TRUE(std::isinf(MediaTime::fromSeconds(INFINITY, 600).seconds()));
    EXPECT_TRUE(MediaTime::fromSeconds(1e300, 600).isPositiveInfinity());
    EXPECT_TRUE(MediaTime::zero().isNumeric());
    EXPECT_EQ(MediaTime::zero().seconds(), 0.0);
    EXPECT_DOUBLE_EQ(MediaTime::make(1001, 30000).seconds(), 1001.0 / 30000.0);
}

TEST(MediaTime, ComparesExactlyAcrossTimescales)
{
    EXPECT_EQ(MediaTime::make(1, 3), MediaTime::make(400, 1200));
    EXPECT_LT(MediaTime::make(333333333, 1000000000), MediaTime::make(1, 3));
    EXPECT_GT(MediaTime::positiveInfinity(), MediaTime::make(INT64_MAX, 1));
    EXPECT_LT(MediaTime::invalid(), MediaTime::make(INT64_MIN, 1));
    // Values whose cross products overflow 64 bits still compare correctly.
    EXPECT_LT(MediaTime::make(INT64_MAX / 2, 1000000000), MediaTime::make(INT64_MAX / 2 + 1, 1000000000));
}

TEST(MediaTime, ArithmeticAndRescalingKeepTheInstant)
{
    const MediaTime sum = MediaTime::make(1, 3) + MediaTime::make(1, 600);
    EXPECT_EQ(sum.value, 201);
    EXPECT_EQ(sum.timescale, 600);
    EXPECT_EQ((MediaTime::make(10, 1) - MediaTime::make(5, 1)).seconds(), 5.0);
    EXPECT_FALSE((MediaTime::invalid() + MediaTime::zero()).isValid());
    const MediaTime scaled = MediaTime::make(1, 3).convertScale(1000);
    EXPECT_EQ(scaled.value, 333);
    EXPECT_TRUE(scaled.flags & MediaTime::HasBeenRounded);
    EXPECT_EQ(MediaTime::make(7, 2).convertScale(90000).value, 315000);
    const MediaTimeRange range = MediaTimeRange::fromStartEnd(MediaTime::make(2, 1), MediaTime::make(7, 1));
    EXPECT_TRUE(range.isValid());
    EXPECT_EQ(range.duration.seconds(), 5.0);
    EXPECT_EQ(range.end(), MediaTime::make(7, 1));
}

} // namespace
} // namespace zaf::media
