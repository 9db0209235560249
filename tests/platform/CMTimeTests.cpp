#include "CMTime.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <limits>
#include <vector>

namespace {

constexpr int64_t kMax = std::numeric_limits<int64_t>::max();

void expectTime(CMTime t, int64_t value, int32_t timescale, bool rounded) {
    EXPECT_TRUE(CMTIME_IS_NUMERIC(t)) << CMTimeCopyDescription(t);
    EXPECT_EQ(t.value, value) << CMTimeCopyDescription(t);
    EXPECT_EQ(t.timescale, timescale) << CMTimeCopyDescription(t);
    EXPECT_EQ(CMTIME_HAS_BEEN_ROUNDED(t), rounded) << CMTimeCopyDescription(t);
}

struct RoundingCase {
    CMTimeRoundingMethod method;
    int64_t positive;  // 1001/30000 at timescale 600 is 20.02
    int64_t negative;  // and -20.02
    int64_t half;      // 1/2 at timescale 1
    int64_t negHalf;   // -1/2 at timescale 1
};

}  // namespace

TEST(CMTimeConvertScale, EachRoundingMethodOnPositiveAndNegativeValues) {
    const RoundingCase cases[] = {
        {kCMTimeRoundingMethod_RoundHalfAwayFromZero, 20, -20, 1, -1},
        {kCMTimeRoundingMethod_RoundTowardZero, 20, -20, 0, 0},
        {kCMTimeRoundingMethod_RoundAwayFromZero, 21, -21, 1, -1},
        {kCMTimeRoundingMethod_QuickTime, 20, -20, 0, -1},
        {kCMTimeRoundingMethod_RoundTowardPositiveInfinity, 21, -20, 1, 0},
        {kCMTimeRoundingMethod_RoundTowardNegativeInfinity, 20, -21, 0, -1},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.method);
        expectTime(CMTimeConvertScale(CMTimeMake(1001, 30000), 600, c.method), c.positive, 600, true);
        expectTime(CMTimeConvertScale(CMTimeMake(-1001, 30000), 600, c.method), c.negative, 600, true);
        EXPECT_EQ(CMTimeConvertScale(CMTimeMake(1, 2), 1, c.method).value, c.half);
        EXPECT_EQ(CMTimeConvertScale(CMTimeMake(-1, 2), 1, c.method).value, c.negHalf);
        // Exact conversions are never marked rounded.
        expectTime(CMTimeConvertScale(CMTimeMake(-3003, 90000), 30000, c.method), -1001, 30000, false);
    }
    EXPECT_EQ(kCMTimeRoundingMethod_Default, kCMTimeRoundingMethod_RoundHalfAwayFromZero);
}

TEST(CMTimeConvertScale, QuickTimeDependsOnDirectionAndNeverRoundsNegativeToZero) {
    // To a larger timescale: away from zero.
    expectTime(CMTimeConvertScale(CMTimeMake(1, 3), 10, kCMTimeRoundingMethod_QuickTime), 4, 10, true);
    expectTime(CMTimeConvertScale(CMTimeMake(-1, 3), 10, kCMTimeRoundingMethod_QuickTime), -4, 10, true);
    // To a smaller one: toward zero, except that a negative time stays negative.
    expectTime(CMTimeConvertScale(CMTimeMake(29, 30000), 1000, kCMTimeRoundingMethod_QuickTime), 0, 1000, true);
    expectTime(CMTimeConvertScale(CMTimeMake(-1, 30000), 600, kCMTimeRoundingMethod_QuickTime), -1, 600, true);
    // Frame boundary of a host time in the 29.97 track timescale.
    expectTime(CMTimeConvertScale(CMTimeMake(3003, 90000), 30000, kCMTimeRoundingMethod_QuickTime), 1001, 30000,
               false);
}

TEST(CMTimeConvertScale, KeepsEpochPassesNonNumericAndRejectsBadArguments) {
    CMTime t = CMTimeConvertScale(CMTimeMakeWithEpoch(1, 2, 7), 4, kCMTimeRoundingMethod_Default);
    EXPECT_EQ(t.epoch, 7);
    EXPECT_EQ(t.value, 2);
    EXPECT_TRUE(CMTIME_IS_POSITIVE_INFINITY(CMTimeConvertScale(kCMTimePositiveInfinity, 600, 1)));
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeConvertScale(kCMTimeInvalid, 600, 1)));
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeConvertScale(CMTimeMake(1, 2), 0, 1)));
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeConvertScale(CMTimeMake(1, 2), 600, 99)));
    // A value that no longer fits becomes the infinity of its sign.
    EXPECT_TRUE(CMTIME_IS_POSITIVE_INFINITY(CMTimeConvertScale(CMTimeMake(kMax, 1), 1000, 1)));
    EXPECT_TRUE(CMTIME_IS_NEGATIVE_INFINITY(CMTimeConvertScale(CMTimeMake(-kMax, 1), 1000, 1)));
    // A hand-built numeric time with no timescale is never divided by.
    CMTime broken{5, 0, kCMTimeFlags_Valid, 0};
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeConvertScale(broken, 600, 1)));
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeMake(1, 0)));
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeAdd(broken, kCMTimeZero)));
}

TEST(CMTimeArithmetic, TimescalesOfSumsAndDifferences) {
    expectTime(CMTimeAdd(CMTimeMake(1001, 30000), CMTimeMake(2002, 30000)), 3003, 30000, false);
    // Least common multiple of 30000 and 24000.
    expectTime(CMTimeAdd(CMTimeMake(1001, 30000), CMTimeMake(1001, 24000)), 9009, 120000, false);
    expectTime(CMTimeSubtract(CMTimeMake(1, 2), CMTimeMake(1, 3)), 1, 6, false);
    expectTime(CMTimeSubtract(CMTimeMake(1, 3), CMTimeMake(1, 2)), -1, 6, false);
    // 1000003 and 999983 are prime: their product exceeds 32 bits, so the
    // largest timescale is used with default rounding.
    CMTime sum = CMTimeAdd(CMTimeMake(1, 1000003), CMTimeMake(1, 999983));
    EXPECT_EQ(sum.timescale, kCMTimeMaxTimescale);
    EXPECT_TRUE(CMTIME_HAS_BEEN_ROUNDED(sum));
    EXPECT_EQ(sum.value, 4295);  // 2147483647 * (1/1000003 + 1/999983) = 4294.97...
    // Rounded operands give a rounded result.
    CMTime rounded = CMTimeConvertScale(CMTimeMake(1, 3), 10, 1);
    EXPECT_TRUE(CMTIME_HAS_BEEN_ROUNDED(CMTimeAdd(rounded, CMTimeMake(1, 10))));
}

TEST(CMTimeArithmetic, OverflowHalvesTheTimescaleThenBecomesInfinite) {
    expectTime(CMTimeAdd(CMTimeMake(kMax, 2), CMTimeMake(kMax, 2)), kMax, 1, true);
    EXPECT_TRUE(CMTIME_IS_POSITIVE_INFINITY(CMTimeAdd(CMTimeMake(kMax, 1), CMTimeMake(1, 1))));
    EXPECT_TRUE(CMTIME_IS_NEGATIVE_INFINITY(CMTimeSubtract(CMTimeMake(-kMax, 1), CMTimeMake(2, 1))));
    EXPECT_TRUE(CMTIME_IS_POSITIVE_INFINITY(CMTimeMultiply(CMTimeMake(kMax / 2 + 1, 1), 2)));
    // -2^63 itself still fits; one more step does not.
    expectTime(CMTimeMultiply(CMTimeMake(kMax / 2 + 1, 1), -2), std::numeric_limits<int64_t>::min(), 1, false);
    EXPECT_TRUE(CMTIME_IS_NEGATIVE_INFINITY(CMTimeMultiply(CMTimeMake(kMax / 2 + 1, 1), -3)));
    expectTime(CMTimeMultiply(CMTimeMake(kMax / 2 + 1, 2), 2), kMax / 2 + 1, 1, true);
}

TEST(CMTimeArithmetic, InfinitiesIndefiniteAndEpochs) {
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeAdd(kCMTimePositiveInfinity, kCMTimeNegativeInfinity)));
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeSubtract(kCMTimePositiveInfinity, kCMTimePositiveInfinity)));
    EXPECT_TRUE(CMTIME_IS_POSITIVE_INFINITY(CMTimeSubtract(CMTimeMake(1, 1), kCMTimeNegativeInfinity)));
    EXPECT_TRUE(CMTIME_IS_NEGATIVE_INFINITY(CMTimeAdd(kCMTimeNegativeInfinity, kCMTimeIndefinite)));
    EXPECT_TRUE(CMTIME_IS_INDEFINITE(CMTimeAdd(kCMTimeIndefinite, CMTimeMake(1, 1))));
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeAdd(kCMTimeInvalid, CMTimeMake(1, 1))));
    EXPECT_EQ(CMTimeAdd(CMTimeMakeWithEpoch(1, 1, 3), CMTimeMake(1, 1)).epoch, 3);
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeAdd(CMTimeMakeWithEpoch(1, 1, 3), CMTimeMakeWithEpoch(1, 1, 4))));
    EXPECT_EQ(CMTimeSubtract(CMTimeMakeWithEpoch(5, 1, 3), CMTimeMakeWithEpoch(1, 1, 3)).epoch, 0);
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeSubtract(CMTimeMake(5, 1), CMTimeMakeWithEpoch(1, 1, 3))));
}

TEST(CMTimeArithmetic, MultiplyByRatioFloatAndAbsoluteValue) {
    expectTime(CMTimeMultiplyByRatio(CMTimeMake(1001, 30000), 3, 2), 1502, 30000, true);
    expectTime(CMTimeMultiplyByRatio(CMTimeMake(1001, 30000), 2, -1), -2002, 30000, false);
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeMultiplyByRatio(CMTimeMake(1, 1), 1, 0)));
    expectTime(CMTimeMultiplyByFloat64(CMTimeMake(1001, 30000), 2.5), 2503, 30000, true);
    expectTime(CMTimeMultiplyByFloat64(CMTimeMake(1001, 30000), -2.0), -2002, 30000, false);
    EXPECT_TRUE(CMTIME_IS_NEGATIVE_INFINITY(CMTimeMultiplyByFloat64(kCMTimePositiveInfinity, -1.0)));
    expectTime(CMTimeAbsoluteValue(CMTimeMake(-5, 3)), 5, 3, false);
    EXPECT_TRUE(CMTIME_IS_POSITIVE_INFINITY(CMTimeAbsoluteValue(kCMTimeNegativeInfinity)));
}

TEST(CMTimeCompare, OrdersAcrossTimescalesAndKinds) {
    EXPECT_EQ(CMTimeCompare(CMTimeMake(1001, 30000), CMTimeMake(2002, 60000)), 0);
    EXPECT_EQ(CMTimeCompare(CMTimeMake(1, 3), CMTimeMake(333333, 1000000)), 1);
    EXPECT_EQ(CMTimeCompare(CMTimeMake(-kMax, 1), CMTimeMake(kMax, 1)), -1);
    // Values whose cross products exceed 64 bits still compare exactly.
    EXPECT_EQ(CMTimeCompare(CMTimeMake(kMax, 1000000007), CMTimeMake(kMax - 1, 1000000007)), 1);
    EXPECT_EQ(CMTimeCompare(CMTimeMakeWithEpoch(0, 1, 2), CMTimeMakeWithEpoch(100, 1, 1)), 1);

    std::vector<CMTime> times = {kCMTimeInvalid, kCMTimePositiveInfinity, kCMTimeIndefinite, CMTimeMake(5, 1),
                                 kCMTimeNegativeInfinity, CMTimeMake(-5, 1)};
    std::sort(times.begin(), times.end(), [](CMTime a, CMTime b) { return CMTimeCompare(a, b) < 0; });
    EXPECT_TRUE(CMTIME_IS_NEGATIVE_INFINITY(times[0]));
    EXPECT_EQ(times[1].value, -5);
    EXPECT_EQ(times[2].value, 5);
    EXPECT_TRUE(CMTIME_IS_INDEFINITE(times[3]));
    EXPECT_TRUE(CMTIME_IS_POSITIVE_INFINITY(times[4]));
    EXPECT_TRUE(CMTIME_IS_INVALID(times[5]));
    EXPECT_EQ(CMTimeCompare(kCMTimeInvalid, CMTime{0, 0, 0, 9}), 0);

    EXPECT_EQ(CMTimeMinimum(kCMTimeInvalid, CMTimeMake(3, 1)).value, 3);
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeMaximum(kCMTimeInvalid, CMTimeMake(3, 1))));
    EXPECT_TRUE(CMTIME_COMPARE_INLINE(CMTimeMake(1, 30), <, CMTimeMake(1, 24)));
    EXPECT_TRUE(CMTIME_COMPARE_INLINE(kCMTimeZero, ==, CMTimeMake(0, 600)));
}

TEST(CMTimeSeconds, MakeAndGet) {
    expectTime(CMTimeMakeWithSeconds(1.5, 600), 900, 600, false);
    expectTime(CMTimeMakeWithSeconds(-0.0251, 1000), -25, 1000, true);
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeMakeWithSeconds(std::nan(""), 600)));
    EXPECT_TRUE(CMTIME_IS_NEGATIVE_INFINITY(CMTimeMakeWithSeconds(-INFINITY, 600)));
    // Too large for the preferred timescale: the timescale gives way.
    CMTime big = CMTimeMakeWithSeconds(1e16, 1000);
    EXPECT_LT(big.timescale, 1000);
    EXPECT_DOUBLE_EQ(CMTimeGetSeconds(big), 1e16);
    EXPECT_DOUBLE_EQ(CMTimeGetSeconds(CMTimeMake(1001, 30000)), 1001.0 / 30000.0);
    EXPECT_TRUE(std::isnan(CMTimeGetSeconds(kCMTimeIndefinite)));
    EXPECT_TRUE(std::isinf(CMTimeGetSeconds(kCMTimePositiveInfinity)));
}

TEST(CMTimeDictionary, RoundTripDescriptionAndRanges) {
    CMTime t = CMTimeConvertScale(CMTimeMakeWithEpoch(1, 3, 2), 10, 1);
    Dictionary d = CMTimeCopyAsDictionary(t);
    EXPECT_EQ(d.keys(), (std::vector<std::string>{"value", "timescale", "flags", "epoch"}));
    CMTime back = CMTimeMakeFromDictionary(d);
    EXPECT_EQ(back.value, t.value);
    EXPECT_EQ(back.timescale, t.timescale);
    EXPECT_EQ(back.flags, t.flags);
    EXPECT_EQ(back.epoch, t.epoch);
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeMakeFromDictionary(Value(Dictionary{{"value", 1}}))));
    Dictionary noScale = CMTimeCopyAsDictionary(CMTimeMake(1, 30));
    noScale.set("timescale", 0);
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeMakeFromDictionary(noScale)));

    EXPECT_EQ(CMTimeCopyDescription(CMTimeMake(1001, 30000)), "{1001/30000 = 0.033}");
    EXPECT_EQ(CMTimeCopyDescription(kCMTimeInvalid), "{INVALID}");
    EXPECT_EQ(CMTimeCopyDescription(kCMTimeNegativeInfinity), "{-INFINITY}");

    CMTimeRange r = CMTimeRangeMake(CMTimeMake(1001, 30000), CMTimeMake(1001, 24000));
    expectTime(CMTimeRangeGetEnd(r), 9009, 120000, false);
    EXPECT_TRUE(CMTimeRangeContainsTime(r, CMTimeMake(1001, 30000)));
    EXPECT_FALSE(CMTimeRangeContainsTime(r, CMTimeRangeGetEnd(r)));
    EXPECT_TRUE(CMTIMERANGE_IS_EMPTY(kCMTimeRangeZero));
    EXPECT_TRUE(CMTIMERANGE_IS_INVALID(kCMTimeRangeInvalid));
    EXPECT_TRUE(CMTIMERANGE_IS_INVALID(CMTimeRangeMake(kCMTimeZero, CMTimeMake(-1, 1))));
    CMTimeMapping empty = CMTimeMappingMakeEmpty(r);
    EXPECT_TRUE(CMTIMERANGE_IS_INVALID(empty.source));
    EXPECT_TRUE(CMTimeRangeEqual(empty.target, r));
}
