#include "platform/media/media_time.h"

#include <cmath>
#include <limits>

namespace zaf::media {

namespace {

using i128 = __int128;

// value * num / den rounded to nearest, ties away from zero; false when it does not fit 64 bits.
bool scaleRounded(std::int64_t value, std::int64_t num, std::int64_t den, std::int64_t &out, bool &exact)
{
    const i128 p = i128(value) * num;
    i128 q = p / den;
    const i128 r = p % den;
    exact = r == 0;
    const i128 twice = (r < 0 ? -r : r) * 2;
    if (twice >= den)
        q += (p < 0) ? -1 : 1;
    if (q > std::numeric_limits<std::int64_t>::max() || q < std::numeric_limits<std::int64_t>::min())
        return false;
    out = std::int64_t(q);
    return true;
}

int infinityRank(const MediaTime &t)
{
    if (t.flags & MediaTime::PositiveInfinity)
        return 1;
    if (t.flags & MediaTime::NegativeInfinity)
        return -1;
    return 0;
}

} // namespace

MediaTime MediaTime::fromSeconds(double seconds, std::int32_t timescale)
{
    if (std::isnan(seconds) || timescale <= 0)
        return invalid();
    const double scaled = seconds * double(timescale);
    if (std::isinf(seconds) || std::fabs(scaled) >= 9.2e18)
        return MediaTime{0, 0, Valid | (scaled > 0 ? PositiveInfinity : NegativeInfinity), 0};
    const double rounded = std::round(scaled); // ties away from zero
    MediaTime t{std::int64_t(rounded), timescale, Valid, 0};
    if (rounded != scaled)
        t.flags |= HasBeenRounded;
    return t;
}

double MediaTime::seconds() const
{
    if (!isValid() || (flags & Indefinite))
        return std::numeric_limits<double>::quiet_NaN();
    if (flags & PositiveInfinity)
        return std::numeric_limits<double>::infinity();
    if (flags & NegativeInfinity)
        return -std::numeric_limits<double>::infinity();
    return double(value) / double(timescale);
}

MediaTime MediaTime::convertScale(std::int32_t newTimescale) const
{
    if (!isNumeric() || newTimescale <= 0)
        return newTimescale <= 0 ? invalid() : *this;
    if (newTimescale == timescale)
        return *this;
    std::int64_t v;
    bool exact;
    if (!scaleRounded(value, newTimescale, timescale, v, exact))
        return MediaTime{0, 0, Valid | (value > 0 ? PositiveInfinity : NegativeInfinity), 0};
    MediaTime t{v, newTimescale, Valid | (flags & HasBeenRounded), epoch};
    if (!exact)
        t.flags |= HasBeenRounded;
    return t;
}

int MediaTime::compare(const MediaTime &a, const MediaTime &b)
{
    if (!a.isValid() || !b.isValid())
        return a.isValid() == b.isValid() ? 0 : (a.isValid() ? 1 : -1);
    const int ia = infinityRank(a), ib = infinityRank(b);
    if (ia != 0 || ib != 0)
        return ia == ib ? 0 : (ia < ib ? -1 : 1);
    if (a.epoch != b.epoch)
        return a.epoch < b.epoch ? -1 : 1;
    const i128 l = i128(a.value) * b.timescale;
    const i128 r = i128(b.value) * a.timescale;
    return l == r ? 0 : (l < r ? -1 : 1);
}

MediaTime MediaTime::operator+(const MediaTime &other) const
{
    if (!isNumeric() || !other.isNumeric())
        return invalid();
    const std::int32_t ts = timescale >= other.timescale ? timescale : other.timescale;
    const MediaTime a = convertScale(ts), b = other.convertScale(ts);
    if (!a.isNumeric() || !b.isNumeric())
        return invalid();
    std::int64_t sum;
    if (__builtin_add_overflow(a.value, b.value, &sum))
        return MediaTime{0, 0, Valid | (a.value > 0 ? PositiveInfinity : NegativeInfinity), 0};
    return MediaTime{sum, ts, Valid | ((a.flags | b.flags) & HasBeenRounded), epoch};
}

MediaTime MediaTime::operator-(const MediaTime &other) const
{
    if (!other.isNumeric())
        return invalid();
    MediaTime negated = other;
    negated.value = -other.value;
    return *this + negated;
}

QString MediaTime::debugDescription() const
{
    if (!isValid())
        return QStringLiteral("{INVALID}");
    if (flags & PositiveInfinity)
        return QStringLiteral("{+INFINITY}");
    if (flags & NegativeInfinity)
        return QStringLiteral("{-INFINITY}");
    return QStringLiteral("{%1/%2 = %3}").arg(value).arg(timescale).arg(seconds());
}

} // namespace zaf::media
