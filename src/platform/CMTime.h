// Rational media time with the platform's arithmetic and rounding semantics.
//
// Every operation is exact integer arithmetic (128-bit intermediates); floating
// point enters only through the explicit seconds and Float64 calls. A numeric
// time whose timescale is not positive cannot be made by CMTimeMake and is
// treated as invalid by every operation, so that times built from file data can
// never cause a division by zero.
#pragma once

#include "Value.h"

#include <cstdint>
#include <optional>
#include <string>

using CMTimeValue = int64_t;
using CMTimeScale = int32_t;
using CMTimeEpoch = int64_t;
using CMTimeFlags = uint32_t;

enum : CMTimeFlags {
    kCMTimeFlags_Valid = 1u << 0,
    kCMTimeFlags_HasBeenRounded = 1u << 1,
    kCMTimeFlags_PositiveInfinity = 1u << 2,
    kCMTimeFlags_NegativeInfinity = 1u << 3,
    kCMTimeFlags_Indefinite = 1u << 4,
    kCMTimeFlags_ImpliedValueFlagsMask =
        kCMTimeFlags_PositiveInfinity | kCMTimeFlags_NegativeInfinity | kCMTimeFlags_Indefinite,
};

inline constexpr CMTimeScale kCMTimeMaxTimescale = 0x7fffffff;

struct CMTime {
    CMTimeValue value;
    CMTimeScale timescale;
    CMTimeFlags flags;
    CMTimeEpoch epoch;
};

using CMTimeRoundingMethod = uint32_t;
enum : CMTimeRoundingMethod {
    kCMTimeRoundingMethod_RoundHalfAwayFromZero = 1,
    kCMTimeRoundingMethod_RoundTowardZero = 2,
    kCMTimeRoundingMethod_RoundAwayFromZero = 3,
    // Toward zero when going to a smaller timescale, away from zero when going
    // to a larger one, and a negative time never rounds to 0 (it becomes
    // -1/newTimescale instead).
    kCMTimeRoundingMethod_QuickTime = 4,
    kCMTimeRoundingMethod_RoundTowardPositiveInfinity = 5,
    kCMTimeRoundingMethod_RoundTowardNegativeInfinity = 6,
    kCMTimeRoundingMethod_Default = kCMTimeRoundingMethod_RoundHalfAwayFromZero,
};

inline constexpr CMTime kCMTimeInvalid{0, 0, 0, 0};
inline constexpr CMTime kCMTimeIndefinite{0, 0, kCMTimeFlags_Valid | kCMTimeFlags_Indefinite, 0};
inline constexpr CMTime kCMTimePositiveInfinity{0, 0, kCMTimeFlags_Valid | kCMTimeFlags_PositiveInfinity, 0};
inline constexpr CMTime kCMTimeNegativeInfinity{0, 0, kCMTimeFlags_Valid | kCMTimeFlags_NegativeInfinity, 0};
inline constexpr CMTime kCMTimeZero{0, 1, kCMTimeFlags_Valid, 0};

#define CMTIME_IS_VALID(time) ((bool)(((time).flags & kCMTimeFlags_Valid) != 0))
#define CMTIME_IS_INVALID(time) (!CMTIME_IS_VALID(time))
#define CMTIME_IS_POSITIVE_INFINITY(time) \
    ((bool)(CMTIME_IS_VALID(time) && (((time).flags & kCMTimeFlags_PositiveInfinity) != 0)))
#define CMTIME_IS_NEGATIVE_INFINITY(time) \
    ((bool)(CMTIME_IS_VALID(time) && (((time).flags & kCMTimeFlags_NegativeInfinity) != 0)))
#define CMTIME_IS_INDEFINITE(time) \
    ((bool)(CMTIME_IS_VALID(time) && (((time).flags & kCMTimeFlags_Indefinite) != 0)))
#define CMTIME_IS_NUMERIC(time) \
    ((bool)(((time).flags & (kCMTimeFlags_Valid | kCMTimeFlags_ImpliedValueFlagsMask)) == kCMTimeFlags_Valid))
#define CMTIME_HAS_BEEN_ROUNDED(time) \
    ((bool)(CMTIME_IS_NUMERIC(time) && (((time).flags & kCMTimeFlags_HasBeenRounded) != 0)))
#define CMTIME_COMPARE_INLINE(time1, comparator, time2) ((bool)(CMTimeCompare(time1, time2) comparator 0))

// Timescale <= 0 gives kCMTimeInvalid.
CMTime CMTimeMake(int64_t value, int32_t timescale);
CMTime CMTimeMakeWithEpoch(int64_t value, int32_t timescale, int64_t epoch);
// NaN gives invalid, the infinities the infinite times; the value is rounded
// half away from zero. When the product does not fit, the timescale is halved
// until it does.
CMTime CMTimeMakeWithSeconds(double seconds, int32_t preferredTimescale);
// NaN for invalid and indefinite times, +-infinity for the infinities.
double CMTimeGetSeconds(CMTime time);

// Non-numeric times pass through (invalid stays invalid); a non-positive new
// timescale or an unknown method gives invalid; a result beyond 64 bits becomes
// the infinity of its sign. Sets HasBeenRounded when the result is inexact.
CMTime CMTimeConvertScale(CMTime time, int32_t newTimescale, CMTimeRoundingMethod method);

CMTime CMTimeAdd(CMTime lhs, CMTime rhs);
CMTime CMTimeSubtract(CMTime lhs, CMTime rhs);
CMTime CMTimeMultiply(CMTime time, int32_t multiplier);
CMTime CMTimeMultiplyByFloat64(CMTime time, double multiplier);
CMTime CMTimeMultiplyByRatio(CMTime time, int32_t multiplier, int32_t divisor);
// -1, 0 or 1. Order: negative infinity < numeric < indefinite < positive
// infinity < invalid (all invalid times are equal). Numeric times compare by
// epoch first, then by exact value across timescales.
int32_t CMTimeCompare(CMTime time1, CMTime time2);
CMTime CMTimeMinimum(CMTime time1, CMTime time2);
CMTime CMTimeMaximum(CMTime time1, CMTime time2);
CMTime CMTimeAbsoluteValue(CMTime time);

// Keys "value", "timescale", "flags", "epoch".
Dictionary CMTimeCopyAsDictionary(CMTime time);
// Invalid when a key is missing or not a number.
CMTime CMTimeMakeFromDictionary(const Dictionary& dict);
CMTime CMTimeMakeFromDictionary(const Value& dict);
// "{1001/30000 = 0.033}", "{INVALID}", "{+INFINITY}", "{-INFINITY}", "{INDEFINITE}".
std::string CMTimeCopyDescription(CMTime time);

struct CMTimeRange {
    CMTime start;
    CMTime duration;
};

inline constexpr CMTimeRange kCMTimeRangeZero{kCMTimeZero, kCMTimeZero};
inline constexpr CMTimeRange kCMTimeRangeInvalid{kCMTimeInvalid, kCMTimeInvalid};

#define CMTIMERANGE_IS_VALID(range)                                                              \
    ((bool)(CMTIME_IS_VALID((range).start) && CMTIME_IS_VALID((range).duration) &&               \
            (range).duration.epoch == 0 && !CMTIME_IS_NEGATIVE_INFINITY((range).duration) &&     \
            !(CMTIME_IS_NUMERIC((range).duration) && (range).duration.value < 0)))
#define CMTIMERANGE_IS_INVALID(range) (!CMTIMERANGE_IS_VALID(range))
#define CMTIMERANGE_IS_EMPTY(range) \
    ((bool)(CMTIMERANGE_IS_VALID(range) && CMTimeCompare((range).duration, kCMTimeZero) == 0))

CMTimeRange CMTimeRangeMake(CMTime start, CMTime duration);
CMTime CMTimeRangeGetEnd(CMTimeRange range);
// start <= time < end.
bool CMTimeRangeContainsTime(CMTimeRange range, CMTime time);
bool CMTimeRangeEqual(CMTimeRange range1, CMTimeRange range2);

struct CMTimeMapping {
    CMTimeRange source;
    CMTimeRange target;
};

CMTimeMapping CMTimeMappingMake(CMTimeRange source, CMTimeRange target);
// An empty edit: the source is invalid.
CMTimeMapping CMTimeMappingMakeEmpty(CMTimeRange target);
