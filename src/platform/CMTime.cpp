#include "CMTime.h"

#include <cmath>
#include <cstdio>
#include <limits>
#include <numeric>

namespace {

using i128 = __int128;

constexpr i128 kMaxValue = std::numeric_limits<int64_t>::max();
constexpr i128 kMinValue = std::numeric_limits<int64_t>::min();

// A time whose flags say numeric but whose timescale cannot divide counts as
// invalid; anything else keeps its own kind.
bool isUsable(const CMTime& t) { return CMTIME_IS_VALID(t) && (!CMTIME_IS_NUMERIC(t) || t.timescale > 0); }

CMTime infinityOfSign(bool negative) { return negative ? kCMTimeNegativeInfinity : kCMTimePositiveInfinity; }

enum class Direction { TowardZero, AwayFromZero, HalfAwayFromZero, Up, Down };

// num / den rounded in the given direction; den > 0. Sets inexact when a
// remainder was dropped or carried.
i128 divideRounded(i128 num, i128 den, Direction dir, bool& inexact) {
    i128 q = num / den;
    i128 rem = num % den;
    if (rem == 0) return q;
    inexact = true;
    const i128 away = num < 0 ? -1 : 1;
    switch (dir) {
    case Direction::TowardZero: break;
    case Direction::AwayFromZero: q += away; break;
    case Direction::HalfAwayFromZero: {
        const i128 absRem = rem < 0 ? -rem : rem;
        if (absRem * 2 >= den) q += away;
        break;
    }
    case Direction::Up: if (num > 0) q += 1; break;
    case Direction::Down: if (num < 0) q -= 1; break;
    }
    return q;
}

// The exact quantity num/den seconds expressed at timescale target with
// default rounding. A value that does not fit in 64 bits halves the timescale
// until it does; at timescale 1 it becomes the infinity of its sign.
CMTime fromExact(i128 num, i128 den, int64_t target, CMTimeFlags flags, CMTimeEpoch epoch) {
    if (den < 0) { num = -num; den = -den; }
    for (int64_t ts = target; ts >= 1; ts /= 2) {
        bool inexact = false;
        const i128 v = divideRounded(num * ts, den, Direction::HalfAwayFromZero, inexact);
        if (v >= kMinValue && v <= kMaxValue) {
            CMTime r{int64_t(v), int32_t(ts), kCMTimeFlags_Valid | (flags & kCMTimeFlags_HasBeenRounded), epoch};
            if (inexact || ts != target) r.flags |= kCMTimeFlags_HasBeenRounded;
            return r;
        }
    }
    return infinityOfSign(num < 0);
}

int64_t lcmTimescale(int32_t a, int32_t b) {
    if (a == b) return a;
    const int64_t g = std::gcd(int64_t(a), int64_t(b));
    const int64_t l = int64_t(a) / g * int64_t(b);
    return l <= kCMTimeMaxTimescale ? l : kCMTimeMaxTimescale;
}

// lhs + sign * rhs, both numeric with positive timescales.
CMTime addNumeric(const CMTime& lhs, const CMTime& rhs, int sign, CMTimeEpoch epoch) {
    const CMTimeFlags rounded = (lhs.flags | rhs.flags) & kCMTimeFlags_HasBeenRounded;
    if (lhs.timescale == rhs.timescale) {
        return fromExact(i128(lhs.value) + sign * i128(rhs.value), lhs.timescale, lhs.timescale, rounded, epoch);
    }
    // Exact sum over the product of the timescales (< 2^62), numerator < 2^96:
    // times any 31-bit target it stays inside 128 bits.
    const i128 den = i128(lhs.timescale) * rhs.timescale;
    const i128 num = i128(lhs.value) * rhs.timescale + sign * i128(rhs.value) * lhs.timescale;
    return fromExact(num, den, lcmTimescale(lhs.timescale, rhs.timescale), rounded, epoch);
}

}  // namespace

CMTime CMTimeMake(int64_t value, int32_t timescale) {
    if (timescale <= 0) return kCMTimeInvalid;
    return CMTime{value, timescale, kCMTimeFlags_Valid, 0};
}

CMTime CMTimeMakeWithEpoch(int64_t value, int32_t timescale, int64_t epoch) {
    if (timescale <= 0) return kCMTimeInvalid;
    return CMTime{value, timescale, kCMTimeFlags_Valid, epoch};
}

CMTime CMTimeMakeWithSeconds(double seconds, int32_t preferredTimescale) {
    if (std::isnan(seconds) || preferredTimescale <= 0) return kCMTimeInvalid;
    if (std::isinf(seconds)) return infinityOfSign(seconds < 0);
    // 2^63 exactly; values at or beyond it do not fit.
    constexpr long double kLimit = 9223372036854775808.0L;
    for (int64_t ts = preferredTimescale; ts >= 1; ts /= 2) {
        const long double product = static_cast<long double>(seconds) * ts;
        const long double rounded = std::round(product);
        if (rounded < kLimit && rounded >= -kLimit) {
            CMTime r{static_cast<int64_t>(rounded), int32_t(ts), kCMTimeFlags_Valid, 0};
            if (rounded != product || ts != preferredTimescale) r.flags |= kCMTimeFlags_HasBeenRounded;
            return r;
        }
    }
    return infinityOfSign(seconds < 0);
}

double CMTimeGetSeconds(CMTime time) {
    if (!isUsable(time) || CMTIME_IS_INDEFINITE(time)) return std::numeric_limits<double>::quiet_NaN();
    if (CMTIME_IS_POSITIVE_INFINITY(time)) return std::numeric_limits<double>::infinity();
    if (CMTIME_IS_NEGATIVE_INFINITY(time)) return -std::numeric_limits<double>::infinity();
    return static_cast<double>(time.value) / static_cast<double>(time.timescale);
}

CMTime CMTimeConvertScale(CMTime time, int32_t newTimescale, CMTimeRoundingMethod method) {
    if (!isUsable(time)) return kCMTimeInvalid;
    if (!CMTIME_IS_NUMERIC(time)) return time;
    if (newTimescale <= 0) return kCMTimeInvalid;
    if (newTimescale == time.timescale) return time;

    Direction dir;
    switch (method) {
    case kCMTimeRoundingMethod_RoundHalfAwayFromZero: dir = Direction::HalfAwayFromZero; break;
    case kCMTimeRoundingMethod_RoundTowardZero: dir = Direction::TowardZero; break;
    case kCMTimeRoundingMethod_RoundAwayFromZero: dir = Direction::AwayFromZero; break;
    case kCMTimeRoundingMethod_QuickTime:
        dir = newTimescale < time.timescale ? Direction::TowardZero : Direction::AwayFromZero;
        break;
    case kCMTimeRoundingMethod_RoundTowardPositiveInfinity: dir = Direction::Up; break;
    case kCMTimeRoundingMethod_RoundTowardNegativeInfinity: dir = Direction::Down; break;
    default: return kCMTimeInvalid;
    }

    bool inexact = false;
    i128 v = divideRounded(i128(time.value) * newTimescale, time.timescale, dir, inexact);
    // A negative time must stay before zero however coarse the new timescale.
    if (method == kCMTimeRoundingMethod_QuickTime && v == 0 && time.value < 0) v = -1;
    if (v > kMaxValue || v < kMinValue) return infinityOfSign(v < 0);

    CMTime r{int64_t(v), newTimescale, time.flags, time.epoch};
    if (inexact) r.flags |= kCMTimeFlags_HasBeenRounded;
    return r;
}

CMTime CMTimeAdd(CMTime lhs, CMTime rhs) {
    if (!isUsable(lhs) || !isUsable(rhs)) return kCMTimeInvalid;
    const bool lp = CMTIME_IS_POSITIVE_INFINITY(lhs), ln = CMTIME_IS_NEGATIVE_INFINITY(lhs);
    const bool rp = CMTIME_IS_POSITIVE_INFINITY(rhs), rn = CMTIME_IS_NEGATIVE_INFINITY(rhs);
    if ((lp && rn) || (ln && rp)) return kCMTimeInvalid;
    if (lp || rp) return kCMTimePositiveInfinity;
    if (ln || rn) return kCMTimeNegativeInfinity;
    if (CMTIME_IS_INDEFINITE(lhs) || CMTIME_IS_INDEFINITE(rhs)) return kCMTimeIndefinite;
    // Epoch 0 is a duration and may be added to a time of any epoch; two
    // different non-zero epochs cannot be related.
    CMTimeEpoch epoch;
    if (lhs.epoch == rhs.epoch) epoch = lhs.epoch;
    else if (lhs.epoch == 0) epoch = rhs.epoch;
    else if (rhs.epoch == 0) epoch = lhs.epoch;
    else return kCMTimeInvalid;
    return addNumeric(lhs, rhs, 1, epoch);
}

CMTime CMTimeSubtract(CMTime lhs, CMTime rhs) {
    if (!isUsable(lhs) || !isUsable(rhs)) return kCMTimeInvalid;
    const bool lp = CMTIME_IS_POSITIVE_INFINITY(lhs), ln = CMTIME_IS_NEGATIVE_INFINITY(lhs);
    const bool rp = CMTIME_IS_POSITIVE_INFINITY(rhs), rn = CMTIME_IS_NEGATIVE_INFINITY(rhs);
    if ((lp && rp) || (ln && rn)) return kCMTimeInvalid;
    if (lp || rn) return kCMTimePositiveInfinity;
    if (ln || rp) return kCMTimeNegativeInfinity;
    if (CMTIME_IS_INDEFINITE(lhs) || CMTIME_IS_INDEFINITE(rhs)) return kCMTimeIndefinite;
    // Two times of one epoch differ by a duration; a duration subtracted from a
    // time keeps its epoch; a time cannot be taken from a duration.
    CMTimeEpoch epoch;
    if (lhs.epoch == rhs.epoch) epoch = 0;
    else if (rhs.epoch == 0) epoch = lhs.epoch;
    else return kCMTimeInvalid;
    return addNumeric(lhs, rhs, -1, epoch);
}

CMTime CMTimeMultiply(CMTime time, int32_t multiplier) {
    if (!isUsable(time)) return kCMTimeInvalid;
    if (CMTIME_IS_INDEFINITE(time)) return time;
    if (CMTIME_IS_POSITIVE_INFINITY(time) || CMTIME_IS_NEGATIVE_INFINITY(time)) {
        if (multiplier == 0) return kCMTimeIndefinite;
        return infinityOfSign(CMTIME_IS_NEGATIVE_INFINITY(time) != (multiplier < 0));
    }
    return fromExact(i128(time.value) * multiplier, time.timescale, time.timescale, time.flags, time.epoch);
}

CMTime CMTimeMultiplyByFloat64(CMTime time, double multiplier) {
    if (!isUsable(time) || std::isnan(multiplier)) return kCMTimeInvalid;
    if (CMTIME_IS_INDEFINITE(time)) return time;
    if (CMTIME_IS_POSITIVE_INFINITY(time) || CMTIME_IS_NEGATIVE_INFINITY(time)) {
        if (multiplier == 0) return kCMTimeIndefinite;
        return infinityOfSign(CMTIME_IS_NEGATIVE_INFINITY(time) != (multiplier < 0));
    }
    if (std::isinf(multiplier)) {
        if (time.value == 0) return kCMTimeIndefinite;
        return infinityOfSign((time.value < 0) != (multiplier < 0));
    }
    constexpr long double kLimit = 9223372036854775808.0L;
    for (int64_t ts = time.timescale; ts >= 1; ts /= 2) {
        const long double product =
            static_cast<long double>(time.value) * multiplier * ts / static_cast<long double>(time.timescale);
        const long double rounded = std::round(product);
        if (rounded < kLimit && rounded >= -kLimit) {
            CMTime r{static_cast<int64_t>(rounded), int32_t(ts), time.flags, time.epoch};
            if (rounded != product || ts != time.timescale) r.flags |= kCMTimeFlags_HasBeenRounded;
            return r;
        }
    }
    return infinityOfSign((time.value < 0) != (multiplier < 0));
}

CMTime CMTimeMultiplyByRatio(CMTime time, int32_t multiplier, int32_t divisor) {
    if (!isUsable(time) || divisor == 0) return kCMTimeInvalid;
    if (CMTIME_IS_INDEFINITE(time)) return time;
    if (CMTIME_IS_POSITIVE_INFINITY(time) || CMTIME_IS_NEGATIVE_INFINITY(time)) {
        if (multiplier == 0) return kCMTimeIndefinite;
        return infinityOfSign(CMTIME_IS_NEGATIVE_INFINITY(time) != ((multiplier < 0) != (divisor < 0)));
    }
    return fromExact(i128(time.value) * multiplier, i128(time.timescale) * divisor, time.timescale, time.flags,
                     time.epoch);
}

int32_t CMTimeCompare(CMTime time1, CMTime time2) {
    // Rank of the non-numeric kinds; numeric times share rank 1.
    auto rank = [](const CMTime& t) {
        if (!isUsable(t)) return 4;
        if (CMTIME_IS_POSITIVE_INFINITY(t)) return 3;
        if (CMTIME_IS_INDEFINITE(t)) return 2;
        if (CMTIME_IS_NEGATIVE_INFINITY(t)) return 0;
        return 1;
    };
    const int r1 = rank(time1), r2 = rank(time2);
    if (r1 != r2) return r1 < r2 ? -1 : 1;
    if (r1 != 1) return 0;
    if (time1.epoch != time2.epoch) return time1.epoch < time2.epoch ? -1 : 1;
    const i128 a = i128(time1.value) * time2.timescale;
    const i128 b = i128(time2.value) * time1.timescale;
    return a < b ? -1 : (a > b ? 1 : 0);
}

CMTime CMTimeMinimum(CMTime time1, CMTime time2) { return CMTimeCompare(time1, time2) <= 0 ? time1 : time2; }

CMTime CMTimeMaximum(CMTime time1, CMTime time2) { return CMTimeCompare(time1, time2) >= 0 ? time1 : time2; }

CMTime CMTimeAbsoluteValue(CMTime time) {
    if (!isUsable(time)) return kCMTimeInvalid;
    if (CMTIME_IS_NEGATIVE_INFINITY(time)) return kCMTimePositiveInfinity;
    if (!CMTIME_IS_NUMERIC(time) || time.value >= 0) return time;
    if (time.value == std::numeric_limits<int64_t>::min()) return kCMTimePositiveInfinity;
    time.value = -time.value;
    return time;
}

Dictionary CMTimeCopyAsDictionary(CMTime time) {
    return Dictionary{{"value", Value(time.value)},
                      {"timescale", Value(time.timescale)},
                      {"flags", Value(time.flags)},
                      {"epoch", Value(time.epoch)}};
}

CMTime CMTimeMakeFromDictionary(const Dictionary& dict) {
    const Value* value = dict.find("value");
    const Value* timescale = dict.find("timescale");
    const Value* flags = dict.find("flags");
    const Value* epoch = dict.find("epoch");
    if (!value || !timescale || !flags || !epoch) return kCMTimeInvalid;
    if (!value->isNumber() || !timescale->isNumber() || !flags->isNumber() || !epoch->isNumber())
        return kCMTimeInvalid;
    const int64_t ts = timescale->integerValue();
    if (ts < std::numeric_limits<int32_t>::min() || ts > std::numeric_limits<int32_t>::max()) return kCMTimeInvalid;
    const CMTimeFlags known = kCMTimeFlags_Valid | kCMTimeFlags_HasBeenRounded | kCMTimeFlags_ImpliedValueFlagsMask;
    CMTime t{value->integerValue(), int32_t(ts), CMTimeFlags(flags->integerValue()) & known, epoch->integerValue()};
    if (!isUsable(t)) return kCMTimeInvalid;
    return t;
}

CMTime CMTimeMakeFromDictionary(const Value& dict) {
    if (!dict.isDictionary()) return kCMTimeInvalid;
    return CMTimeMakeFromDictionary(dict.dictionary());
}

std::string CMTimeCopyDescription(CMTime time) {
    if (!isUsable(time)) return "{INVALID}";
    if (CMTIME_IS_POSITIVE_INFINITY(time)) return "{+INFINITY}";
    if (CMTIME_IS_NEGATIVE_INFINITY(time)) return "{-INFINITY}";
    if (CMTIME_IS_INDEFINITE(time)) return "{INDEFINITE}";
    char buf[128];
    int n = std::snprintf(buf, sizeof buf, "{%lld/%d = %.3f", static_cast<long long>(time.value), time.timescale,
                          CMTimeGetSeconds(time));
    std::string s(buf, size_t(n));
    if (time.flags & kCMTimeFlags_HasBeenRounded) s += ", rounded";
    if (time.epoch != 0) s += ", epoch = " + std::to_string(time.epoch);
    s += "}";
    return s;
}

CMTimeRange CMTimeRangeMake(CMTime start, CMTime duration) { return CMTimeRange{start, duration}; }

CMTime CMTimeRangeGetEnd(CMTimeRange range) {
    if (!CMTIMERANGE_IS_VALID(range)) return kCMTimeInvalid;
    return CMTimeAdd(range.start, range.duration);
}

bool CMTimeRangeContainsTime(CMTimeRange range, CMTime time) {
    if (!CMTIMERANGE_IS_VALID(range) || !isUsable(time)) return false;
    return CMTimeCompare(time, range.start) >= 0 && CMTimeCompare(time, CMTimeRangeGetEnd(range)) < 0;
}

bool CMTimeRangeEqual(CMTimeRange range1, CMTimeRange range2) {
    return CMTimeCompare(range1.start, range2.start) == 0 && CMTimeCompare(range1.duration, range2.duration) == 0;
}

CMTimeMapping CMTimeMappingMake(CMTimeRange source, CMTimeRange target) { return CMTimeMapping{source, target}; }

CMTimeMapping CMTimeMappingMakeEmpty(CMTimeRange target) { return CMTimeMapping{kCMTimeRangeInvalid, target}; }
