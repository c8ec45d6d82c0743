#pragma once

// A rational media time: a 64-bit value over a 32-bit timescale (value / timescale seconds), with
// flags and an epoch. The invalid time (no Valid flag) converts to NaN seconds.

#include <QString>

#include <cstdint>

namespace zaf::media {

struct MediaTime {
    enum Flag : std::uint32_t {
        Valid = 1u << 0,
        HasBeenRounded = 1u << 1,
        PositiveInfinity = 1u << 2,
        NegativeInfinity = 1u << 3,
        Indefinite = 1u << 4,
    };

    std::int64_t value = 0;
    std::int32_t timescale = 0;
    std::uint32_t flags = 0;
    std::int64_t epoch = 0;

    static constexpr MediaTime make(std::int64_t value, std::int32_t timescale)
    {
        return timescale > 0 ? MediaTime{value, timescale, Valid, 0} : MediaTime{};
    }
    static MediaTime zero() { return MediaTime{0, 1, Valid, 0}; }
    static MediaTime invalid() { return MediaTime{}; }
    static MediaTime positiveInfinity() { return MediaTime{0, 0, Valid | PositiveInfinity, 0}; }

    // The time nearest to `seconds` in the given timescale (ties away from zero), flagged as rounded
    // when that is not exact. NaN gives the invalid time; infinities and values out of the 64-bit
    // range give the infinite times; a timescale <= 0 gives the invalid time.
    static MediaTime fromSeconds(double seconds, std::int32_t timescale);

    // value / timescale; NaN when invalid or indefinite, +-infinity for the infinite times.
    double seconds() const;

    bool isValid() const { return flags & Valid; }
    bool isNumeric() const { return (flags & (Valid | PositiveInfinity | NegativeInfinity | Indefinite)) == Valid; }
    bool isPositiveInfinity() const { return isValid() && (flags & PositiveInfinity); }
    bool isNegativeInfinity() const { return isValid() && (flags & NegativeInfinity); }

    // The same instant in another timescale, rounded to nearest (ties away from zero).
    MediaTime convertScale(std::int32_t newTimescale) const;

    // Exact comparison across timescales: -1, 0 or 1. Invalid times sort before everything;
    // infinities sort outside every numeric time.
    static int compare(const MediaTime &a, const MediaTime &b);

    // Exact sum and difference when both are numeric, in the larger timescale; invalid otherwise.
    MediaTime operator+(const MediaTime &other) const;
    MediaTime operator-(const MediaTime &other) const;

    bool operator==(const MediaTime &o) const { return compare(*this, o) == 0; }
    bool operator<(const MediaTime &o) const { return compare(*this, o) < 0; }
    bool operator<=(const MediaTime &o) const { return compare(*this, o) <= 0; }
    bool operator>(const MediaTime &o) const { return compare(*this, o) > 0; }
    bool operator>=(const MediaTime &o) const { return compare(*this, o) >= 0; }

    QString debugDescription() const;
};

// A start time and a duration.
struct MediaTimeRange {
    MediaTime start;
    MediaTime duration;

    static MediaTimeRange fromStartEnd(const MediaTime &start, const MediaTime &end) { return {start, end - start}; }
    MediaTime end() const { return start + duration; }
    bool isValid() const { return start.isNumeric() && duration.isNumeric() && duration.value >= 0; }
};

} // namespace zaf::media
