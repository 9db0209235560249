#include "SkarnVestaTimecode.h"
#include "Timecode.h"
#include "TimecodeFunctions.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <limits>
#include <memory>
#include <string>

using namespace Tolvo;

namespace {

// Public format numbers.
constexpr int32_t kPublicDrop = 1;
constexpr int32_t kPublicNonDrop = 2;

std::unique_ptr<Timecode> parse(const char* text, double rate, TimecodeFormat format = kTimecodeFormatNonDrop,
                                double interpRate = 0.0) {
    return Timecode::TimecodeCreateWithString(text, format, rate, interpRate, nullptr);
}

std::string text(const Timecode& tc, InterpStyle style = kInterpStyleFloor) {
    return tc.toCFString(style).value_or("(null)");
}

std::string label(int h, int m, int s, char sep, int f) {
    char buf[32];
    std::snprintf(buf, sizeof buf, "%02d:%02d:%02d%c%02d", h, m, s, sep, f);
    return buf;
}

}  // namespace

// --- Drop-frame conversions ---------------------------------------------------

TEST(TimecodeDropFrame, EveryMinuteOfADayAt2997RoundTrips) {
    // Each minute's first existing label: frames 00 at every tenth minute, 02 elsewhere.
    for (int h = 0; h < 24; ++h) {
        for (int m = 0; m < 60; ++m) {
            const int f = m % 10 == 0 ? 0 : 2;
            const std::string s = label(h, m, 0, ';', f);
            auto tc = parse(s.c_str(), 30.0, kTimecodeFormatNonDrop);
            ASSERT_TRUE(tc);
            ASSERT_EQ(tc->format, kTimecodeFormatDrop) << s;  // ";" selects drop-frame
            const long minutes = h * 60 + m;
            const long expected = minutes * 1800 + f - 2 * (minutes - minutes / 10);
            ASSERT_EQ(tc->framecount, expected) << s;
            ASSERT_EQ(text(*tc), s);
        }
    }
}

TEST(TimecodeDropFrame, EveryFrameOfADayMapsToAnIncreasingLabelAndBack) {
    for (long rate : {30L, 60L}) {
        const long d = rate == 30 ? 2 : 4;
        const long dayFrames = rate * 86400 - 24 * 6 * 9 * d;
        long failures = 0;
        double previous = -1;
        for (long frame = 0; frame < dayFrames; ++frame) {
            double x = double(frame);
            Timecode::dropFramecountToTimeindexWithRate(&x, rate);
            const double labelCount = x;
            // Labels advance by one, or jump over the dropped ones at a minute start.
            const double step = labelCount - previous;
            const long withinTen = long(labelCount) % (rate * 600);
            const bool minuteStart = withinTen % (rate * 60) == d && withinTen >= rate * 60;
            if (frame > 0 && step != (minuteStart ? double(1 + d) : 1.0)) ++failures;
            Timecode::timeindexToDropFramecountWithRate(&x, rate);
            if (x != double(frame)) ++failures;
            previous = labelCount;
        }
        EXPECT_EQ(failures, 0) << "rate " << rate;
        // The last frame of the day is the last label of the day.
        double last = double(dayFrames - 1);
        Timecode::dropFramecountToTimeindexWithRate(&last, rate);
        EXPECT_EQ(last, double(rate * 86400 - 1));
    }
}

TEST(TimecodeDropFrame, TenMinuteAndDayBoundaries) {
    auto before = parse("00:09:59;29", 30.0);
    auto at = parse("00:10:00;00", 30.0);
    ASSERT_TRUE(before && at);
    EXPECT_EQ(at->framecount - before->framecount, 1);
    EXPECT_EQ(at->framecount, 17982);
    ++*before;
    EXPECT_EQ(text(*before), "00:10:00;00");

    auto last = parse("23:59:59;29", 30.0);
    EXPECT_EQ(last->framecount, 2589407);
    (*last)++;
    EXPECT_EQ(text(*last), "00:00:00;00");  // the drop-frame day is 2589408 frames

    auto last60 = parse("23:59:59;59", 60.0);
    EXPECT_EQ(last60->framecount, 5178815);
    EXPECT_EQ(text(*last60), "23:59:59;59");
    // The 60-frame drop day is deliberately shortened by 2592 frames only, as
    // at 30: a count one past the real last frame does not wrap.
    ++*last60;
    EXPECT_EQ(text(*last60), "24:00:00;00");
}

// --- Parsing and edge cases ----------------------------------------------------

TEST(TimecodeParse, DropFrameLabels) {
    auto hour = parse("01:00:00;00", 30.0);
    EXPECT_EQ(hour->format, kTimecodeFormatDrop);
    EXPECT_EQ(hour->framecount, 107892);
    EXPECT_EQ(text(*hour), "01:00:00;00");
    // A label dropped in drop-frame maps onto the minute's first real frame.
    EXPECT_EQ(parse("00:01:00;00", 30.0)->framecount, 1800);
    EXPECT_EQ(parse("00:01:00;02", 30.0)->framecount, 1800);
    // Only exactly 30.0 and 60.0 drop: at 29.97 the label is counted straight.
    auto ntsc = parse("00:01:00;00", 29.97);
    EXPECT_EQ(ntsc->format, kTimecodeFormatDrop);
    EXPECT_EQ(ntsc->framecount, 1798);  // trunc(60 * 29.97)
}

TEST(TimecodeParse, FieldsCarryInBase100AndPackedDigits) {
    auto carried = parse("1:2:3:120", 30.0);
    EXPECT_EQ(carried->framecount, (3600 + 120 + 4) * 30 + 20);
    EXPECT_EQ(text(*carried), "01:02:04:20");
    // 99 stays in its field, so 99 frames at 30 is 3 s 9 frames.
    EXPECT_EQ(parse("0:0:99", 30.0)->framecount, 99);
    EXPECT_EQ(parse("0:0:0:100", 30.0)->framecount, 30);
    EXPECT_EQ(parse("2:15", 25.0)->framecount, 65);
    EXPECT_EQ(parse("1:", 25.0)->framecount, 25);
    // No separator: packed HHMMSSFF digits, hours taking what remains.
    EXPECT_EQ(parse("1234", 30.0)->framecount, 12 * 30 + 34);
    EXPECT_EQ(parse("101000000", 30.0)->framecount, (101 * 3600 + 0) * 30);
    // ...except in the frame-count form.
    EXPECT_EQ(parse("12345", 30.0, kTimecodeFormatFramecount)->framecount, 12345);
    // Only 13 bytes are read.
    EXPECT_EQ(parse("00:00:01:0012345", 30.0)->framecount, 42);
}

TEST(TimecodeParse, SignsMarksAndFailures) {
    long out = -7;
    TimecodeFormat format = kTimecodeFormatNonDrop;
    int sign = 9;
    EXPECT_EQ(Timecode::stringToFramecount(" - 00:00:01:00", out, 30.0, format, &sign), kTimecodeNoErr);
    EXPECT_EQ(sign, -1);
    EXPECT_EQ(out, 30);
    Timecode::stringToFramecount("+1:00", out, 30.0, format, &sign);
    EXPECT_EQ(sign, 1);
    Timecode::stringToFramecount("1:00", out, 30.0, format, &sign);
    EXPECT_EQ(sign, 0);

    format = kTimecodeFormatMarkedFrame;
    Timecode::stringToFramecount("00:00:01:00*", out, 30.0, format, nullptr);
    EXPECT_EQ(out, 31);
    // A ";" turns the format to drop-frame, and the mark no longer counts.
    Timecode::stringToFramecount("00:00:01;00*", out, 30.0, format, nullptr);
    EXPECT_EQ(format, kTimecodeFormatDrop);
    EXPECT_EQ(out, 30);
    format = kTimecodeFormatMarkedFrame;
    Timecode::stringToFramecount("1:00*", out, 0.0, format, nullptr);
    EXPECT_EQ(out, 1);  // no rate: only the marked frame

    format = kTimecodeFormatNonDrop;
    EXPECT_EQ(Timecode::stringToFramecount("1:2:3:4:5", out, 30.0, format, nullptr), 0xFFFFFFFFu);
    EXPECT_EQ(out, 0);
    EXPECT_EQ(Timecode::stringToFramecount("", out, 30.0, format, nullptr), kTimecodeNoErr);
    EXPECT_EQ(out, 0);

    EXPECT_FALSE(parse(nullptr, 30.0));
    EXPECT_FALSE(parse("01:00:00:00", 0.0));
    // Hostile digits saturate rather than overflow.
    EXPECT_EQ(Timecode::stringToFramecount("99999999999999999999999:1", out, 1e300, format, nullptr),
              kTimecodeNoErr);
}

TEST(TimecodeParse, PartsAndStacks) {
    EXPECT_EQ(Timecode::tcPartsToFramecount(25.0, 1, 0, 0, 5), 90005);
    EXPECT_EQ(Timecode::tcPartsToFramecount(0.0, 1, 0, 0, 5), 0);
    // Parts are a label counted as it stands: no drop-frame reduction.
    auto fromParts = Timecode::TimecodeCreateWithParts(1, 0, 0, 0, 0, 30.0, 0.0, kTimecodeFormatDrop);
    EXPECT_EQ(fromParts->framecount, 108000);
    auto fromIndex = Timecode::TimecodeCreateWithTimeindex(108000, 0, 30.0, 0.0, kTimecodeFormatDrop);
    EXPECT_EQ(fromIndex->framecount, 107892);

    int stack[4] = {5, 4, 3, 2};
    long out = -1;
    EXPECT_EQ(Timecode::tcStackToTC(1, 30.0, stack, out, kTimecodeFormatNonDrop), kTimecodeNoErr);
    EXPECT_EQ(out, (2 * 3600 + 3 * 60 + 4) * 30 + 5);  // all four read whatever the count
    int packed[4] = {1234, 0, 0, 0};
    Timecode::tcStackToTC(0, 30.0, packed, out, kTimecodeFormatNonDrop);
    EXPECT_EQ(out, 12 * 30 + 34);
    EXPECT_EQ(Timecode::tcStackToTC(4, 30.0, stack, out, kTimecodeFormatNonDrop), kTimecodeErr);
    EXPECT_EQ(out, 0);
    Timecode::tcStackToTC(2, 30.0, stack, out, kTimecodeFormatFramecount);
    EXPECT_EQ(out, 5);
    out = 77;
    EXPECT_EQ(Timecode::tcStackToTC(1, 30.0, nullptr, out, kTimecodeFormatNonDrop), kTimecodeNoErr);
    EXPECT_EQ(out, 77);
}

TEST(TimecodeRollover, DaysWrapForWholeAndFractionalCounts) {
    MediaTimeIndex index;
    long count = 30 * 86400;
    EXPECT_EQ(index.rolloverFramecount(count, 30.0, false), 2592000);
    EXPECT_EQ(count, 0);
    count = -1;
    index.rolloverFramecount(count, 30.0, false);
    EXPECT_EQ(count, 2591999);
    count = 2589408;
    EXPECT_EQ(index.rolloverFramecount(count, 30.0, true), 2589408);
    EXPECT_EQ(count, 0);
    EXPECT_EQ(index.rolloverFramecount(count, 60.0, true), 60 * 86400 - 2592);
    count = std::numeric_limits<long>::max();
    index.rolloverFramecount(count, 25.0, false);
    EXPECT_EQ(count, std::numeric_limits<long>::max() % 2160000);
    count = -5;
    index.rolloverFramecount(count, 0.0, false);  // no day: left alone, no endless loop
    EXPECT_EQ(count, -5);

    double fractional = -0.5;
    const double day = index.rolloverFramecount(fractional, 29.97, false);
    EXPECT_DOUBLE_EQ(day, 29.0 * 86399 + 29.97);  // deliberately short at fractional rates
    EXPECT_DOUBLE_EQ(fractional, day - 0.5);

    auto late = Timecode::TimecodeCreateWithFramecount(2592000 + 5, 0, 30.0, 0.0, kTimecodeFormatNonDrop);
    long whole = 0;
    late->getNativeFramecount(whole, kInterpStyleFloor);
    EXPECT_EQ(whole, 5);
    auto early = Timecode::TimecodeCreateWithFramecount(-1, 0, 30.0, 0.0, kTimecodeFormatNonDrop);
    EXPECT_EQ(text(*early), "23:59:59:29");
    double raw = 0;
    early->getNativeFramecount(raw, false, false);
    EXPECT_EQ(raw, -1.0);
}

// --- Interpolation -----------------------------------------------------------------

TEST(TimecodeInterpolation, OffsetsFoldOnlyInWholeGroups) {
    struct Case {
        double rate, interp;
        long offset, framecount, remaining;
    } cases[] = {
        {30, 60, 4, 2, 0},  {30, 60, 3, 0, 3},  {30, 60, -6, -3, 0}, {24, 60, 10, 4, 0},
        {24, 60, 7, 0, 7},  {24, 60, 15, 6, 0}, {24, 60, 12, 0, 12},  // more than a step, yet kept whole
        {24, 60, -10, -4, 0}, {25, 25, 9, 9, 0},
    };
    for (const auto& c : cases) {
        MediaTimeIndex index(0, c.rate, c.interp, c.offset);
        index.updateIOffset();
        EXPECT_EQ(index.framecount, c.framecount) << c.rate << "/" << c.interp << " " << c.offset;
        EXPECT_EQ(index.iOffset, c.remaining) << c.rate << "/" << c.interp << " " << c.offset;
    }
    EXPECT_EQ(MediaTimeIndex().gcd(24, 60), 12);
}

TEST(TimecodeInterpolation, RoundingStyles) {
    // 10 frames at 24 plus 3 at 60 (not a whole group of 5): 11.2 native frames.
    Timecode tc(10, 24.0, 60.0, 3, kTimecodeFormatNonDrop);
    ASSERT_EQ(tc.iOffset, 3);
    long native = 0, interp = 0;
    struct Expect {
        InterpStyle style;
        long native, interp;
    } expect[] = {{kInterpStyleCeiling, 12, 28}, {kInterpStyleFloor, 11, 28},
                  {kInterpStyleWholeUp, 12, 30}, {kInterpStyleWholeDown, 10, 25}};
    for (const auto& e : expect) {
        EXPECT_EQ(tc.getNativeFramecount(native, e.style), kTimecodeNoErr);
        EXPECT_EQ(tc.getInterpFramecount(interp, e.style), kTimecodeNoErr);
        EXPECT_EQ(native, e.native) << e.style;
        EXPECT_EQ(interp, e.interp) << e.style;
    }
    EXPECT_EQ(tc.getNativeFramecount(native, InterpStyle(7)), kTimecodeErr);
    // With equal rates the style is not even looked at.
    Timecode plain(10, 24.0, 24.0, 0, kTimecodeFormatNonDrop);
    EXPECT_EQ(plain.getNativeFramecount(native, InterpStyle(7)), kTimecodeNoErr);
    double d = 0;
    tc.getInterpFramecount(d, false, false);
    EXPECT_DOUBLE_EQ(d, 28.0);

    // Working at the interpolation rate, a position between native frames is marked.
    Timecode between(1, 24.0, 60.0, 0, kTimecodeFormatNonDrop);
    between.setUseInterpRate(true);
    EXPECT_EQ(text(between), "00:00:00:02*");
    between.iOffset = 1;  // 1 * 24/60 + 1 = 1.4 native, 3.5 at 60
    EXPECT_EQ(text(between, kInterpStyleCeiling), "00:00:00:04*");
    ++between;
    EXPECT_EQ(between.iOffset, 2);
    between.useInterpRate = false;
    EXPECT_EQ(text(between), "00:00:00:01");
}

TEST(TimecodeInterpolation, ChangingTheInterpolationRate) {
    Timecode tc(10, 24.0, 60.0, 3, kTimecodeFormatNonDrop);
    EXPECT_EQ(tc.setInterpFramerate(0.0, kInterpStyleFloor), kTimecodeErr);
    EXPECT_EQ(tc.setInterpFramerate(60.0, kInterpStyleCeiling), kTimecodeNoErr);
    EXPECT_EQ(tc.iOffset, 3);  // same rate: nothing happens
    EXPECT_EQ(tc.setInterpFramerate(48.0, kInterpStyleCeiling), kTimecodeNoErr);
    EXPECT_EQ(tc.framecount, 12);
    EXPECT_EQ(tc.iOffset, 0);
    EXPECT_EQ(tc.interpFramerate, 48.0);

    // A frame count given with two rates counts interpolation frames.
    Timecode counted(10, 30.0, 60.0, 0, kTimecodeFormatFramecount);
    EXPECT_EQ(counted.framecount, 5);
    EXPECT_EQ(counted.iOffset, 0);
    Timecode odd(11, 30.0, 60.0, 0, kTimecodeFormatFramecount);
    EXPECT_EQ(odd.framecount, 0);
    EXPECT_EQ(odd.iOffset, 11);
    odd = odd + 1L;  // still interpolation frames
    EXPECT_EQ(odd.framecount, 6);
    EXPECT_EQ(odd.iOffset, 0);
}

// --- Format changes, re-reading and arithmetic ------------------------------------------

TEST(TimecodeFormatChange, DeliberateQuirksAreKept) {
    Timecode tc(108000, 30.0, 30.0, 0, kTimecodeFormatNonDrop);
    tc.setTCFormat(kTimecodeFormatFramecount, true);
    EXPECT_TRUE(tc.isFramecountFormat);
    EXPECT_EQ(tc.format, kTimecodeFormatNonDrop);  // the old format stays
    EXPECT_EQ(text(tc), "108000");
    // Back to the same format: not a no-op, since the count form was set, and
    // the non-drop value gains the drop labels of its count.
    tc.setTCFormat(kTimecodeFormatNonDrop, true);
    EXPECT_FALSE(tc.isFramecountFormat);
    EXPECT_EQ(tc.framecount, 108108);

    // No 30/60 check when converting: 25 frames gets the 4-label rule.
    Timecode pal(1500, 25.0, 25.0, 0, kTimecodeFormatNonDrop);
    pal.setTCFormat(kTimecodeFormatDrop, true);
    EXPECT_EQ(pal.framecount, 1504);
    EXPECT_EQ(text(pal), "00:01:00;04");  // shown, but never dropped at 25

    Timecode drop(108000, 30.0, 30.0, 0, kTimecodeFormatDrop);
    drop.setTCFormat(kTimecodeFormatNonDrop, true);
    EXPECT_EQ(drop.framecount, 107892);
    Timecode wrap(2589408 + 3, 30.0, 30.0, 0, kTimecodeFormatDrop);
    wrap.setTCFormat(kTimecodeFormatNonDrop, false);  // no conversion: rolled into the drop day
    EXPECT_EQ(wrap.framecount, 3);
}

TEST(TimecodeReRead, SignsKeepTheFormat) {
    Timecode tc(100, 30.0, 30.0, 0, kTimecodeFormatNonDrop);
    EXPECT_EQ(tc.interp("+00:00:01:00", kTimecodeFormatNonDrop), kTimecodeNoErr);
    EXPECT_EQ(tc.framecount, 130);
    tc.interp("-00:00:02:00", kTimecodeFormatNonDrop);
    EXPECT_EQ(tc.framecount, 70);
    tc.interp("00:01:00;02", kTimecodeFormatFromString);
    EXPECT_EQ(tc.framecount, 1800);
    EXPECT_EQ(tc.format, kTimecodeFormatNonDrop);
    tc.interp("250", kTimecodeFormatFromString);  // no separator: a frame count
    EXPECT_EQ(tc.framecount, 250);
    // The parsed count form replaces ours though the format field is kept.
    EXPECT_TRUE(tc.isFramecountFormat);
    EXPECT_EQ(tc.format, kTimecodeFormatNonDrop);
    EXPECT_EQ(text(tc), "250");
    EXPECT_EQ(tc.interp(nullptr, kTimecodeFormatNonDrop), kTimecodeErr);

    // At the interpolation rate the parsed value is rebuilt scaled by
    // native/interpolation rate: one second at 60 becomes 24 interpolation frames.
    Timecode slow(0, 24.0, 60.0, 0, kTimecodeFormatNonDrop);
    slow.setUseInterpRate(true);
    slow.interp("00:00:01:00", kTimecodeFormatNonDrop);
    EXPECT_EQ(slow.framecount, 0);
    EXPECT_EQ(slow.iOffset, 24);
    EXPECT_TRUE(slow.useInterpRate);
}

TEST(TimecodeArithmetic, SumsIncrementsAndComparisons) {
    Timecode a(10, 24.0, 60.0, 2, kTimecodeFormatNonDrop);
    Timecode b(5, 24.0, 60.0, 3, kTimecodeFormatNonDrop);
    Timecode sum = a + b;  // offsets 2 + 3 make a whole group
    EXPECT_EQ(sum.framecount, 17);
    EXPECT_EQ(sum.iOffset, 0);
    Timecode diff = a - b;
    EXPECT_EQ(diff.framecount, 5);
    EXPECT_EQ(diff.iOffset, -1);
    // A value at our interpolation rate crosses over.
    Timecode c(6, 60.0, 60.0, 0, kTimecodeFormatNonDrop);
    c.iOffset = 1;  // left unfolded, to see where each part lands
    Timecode crossed = a + c;
    EXPECT_EQ(crossed.framecount, 11);
    EXPECT_EQ(crossed.iOffset, 8);
    // Unrelated rates leave the value alone.
    Timecode d(6, 25.0, 25.0, 0, kTimecodeFormatNonDrop);
    EXPECT_EQ((a + d).framecount, 10);

    Timecode tc(10, 30.0, 30.0, 0, kTimecodeFormatNonDrop);
    Timecode former = tc++;
    EXPECT_EQ(former.framecount, 10);
    EXPECT_EQ(tc.framecount, 11);
    EXPECT_EQ((--tc).framecount, 10);
    EXPECT_EQ((tc - 15L).framecount, -5);

    Timecode pal(25, 25.0, 25.0, 0, kTimecodeFormatNonDrop);
    Timecode ntsc(30, 30.0, 30.0, 0, kTimecodeFormatNonDrop);
    EXPECT_TRUE(pal == ntsc);  // both one second
    EXPECT_TRUE(pal >= ntsc && pal <= ntsc);
    ++ntsc;
    EXPECT_TRUE(pal < ntsc);
    EXPECT_FALSE(pal > ntsc);
}

// --- Plain functions ---------------------------------------------------------------

TEST(TimecodeFunctions, PublicFormatNumbering) {
    Timecode* out = nullptr;
    Timecode* tc = TimecodeCreateWithFramecount(107892, 0, kPublicDrop, &out, 30.0, 0.0);
    ASSERT_TRUE(tc);
    EXPECT_EQ(out, tc);
    EXPECT_EQ(tc->format, kTimecodeFormatDrop);
    std::optional<std::string> s;
    TimecodeGetCFStringRepresentation(tc, kInterpStyleFloor, &s);
    EXPECT_EQ(s, "01:00:00;00");
    int32_t format = 0;
    TimecodeGetTCFormat(tc, &format);
    EXPECT_EQ(format, kPublicDrop);
    TimecodeDestroy(tc);

    // Public 5 has no library meaning: format 8, ":" and never dropped.
    int sign = 5;
    Timecode* unknown = TimecodeCreateWithString("01:00:00:00", 5, &sign, nullptr, 30.0, 0.0);
    EXPECT_EQ(int(unknown->format), 8);
    EXPECT_EQ(sign, 0);
    EXPECT_EQ(unknown->framecount, 108000);
    TimecodeGetCFStringRepresentation(unknown, kInterpStyleFloor, &s);
    EXPECT_EQ(s, "01:00:00:00");
    format = 42;
    TimecodeGetTCFormat(unknown, &format);
    EXPECT_EQ(format, 42);  // untouched
    TimecodeSetTCFormat(unknown, kPublicNonDrop, true);
    EXPECT_EQ(unknown->format, kTimecodeFormatNonDrop);
    TimecodeDestroy(unknown);

    Timecode* index = TimecodeCreateWithTimeIndex(1802, 0, kPublicDrop, nullptr, 30.0, 30.0);
    EXPECT_EQ(index->framecount, 1800);
    int h = -1, m = -1, sec = -1, f = -1;
    TimecodeGetTCParts(index, &h, &m, &sec, &f, kInterpStyleFloor);
    EXPECT_EQ(h * 10000 + m * 100 + sec, 100);
    EXPECT_EQ(f, 2);
    TimecodeGetTCParts(index, nullptr, nullptr, nullptr, &f, 9);  // bad style on equal rates still works
    EXPECT_EQ(f, 2);
    TimecodeDestroy(index);
}

TEST(TimecodeFunctions, NullArgumentsAndAsymmetricComparisons) {
    Timecode* x = TimecodeCreateWithParts(0, 0, 1, 0, 0, kPublicNonDrop, nullptr, 25.0, 0.0);
    ASSERT_TRUE(x);
    EXPECT_TRUE(TimecodeIsGreaterThan(nullptr, x));
    EXPECT_TRUE(TimecodeIsGreaterThan(x, nullptr));
    EXPECT_TRUE(TimecodeIsGreaterThanOrEqualTo(nullptr, x));
    EXPECT_FALSE(TimecodeIsLessThan(nullptr, x));
    EXPECT_FALSE(TimecodeIsLessThanOrEqualTo(x, nullptr));
    EXPECT_FALSE(TimecodesAreEqual(nullptr, nullptr));
    EXPECT_TRUE(TimecodesAreEqual(x, x));
    EXPECT_TRUE(TimecodeGetUseInterpRate(nullptr));

    EXPECT_EQ(TimecodeCreateWithFramecount(1, 0, kPublicNonDrop, nullptr, 0.0, 25.0), nullptr);
    EXPECT_EQ(TimecodeCreateWithString(nullptr, kPublicNonDrop, nullptr, nullptr, 25.0, 25.0), nullptr);
    EXPECT_EQ(TimecodeIncrement(nullptr), -1);
    EXPECT_EQ(TimecodeInterpolate(x, nullptr, kPublicNonDrop), -1);
    Timecode* copy = nullptr;
    EXPECT_EQ(TimecodeCopy(nullptr, &copy), -1);
    EXPECT_EQ(copy, nullptr);
    int h = 3, m = 3, s = 3, f = 3;
    Timecode* zeroRate = TimecodeCreateWithFramecount(1, 0, kPublicNonDrop, nullptr, 25.0, 0.0);
    zeroRate->framerate = 0.0;  // only reachable by hand: parts fail and read as zeros
    zeroRate->interpFramerate = 0.0;
    EXPECT_EQ(TimecodeGetTCParts(zeroRate, &h, &m, &s, &f, kInterpStyleFloor), -1);
    EXPECT_EQ(h + m + s + f, 0);
    TimecodeDestroy(zeroRate);

    EXPECT_EQ(TimecodeAddFrames(x, -5), -1);  // negative counts do nothing
    EXPECT_EQ(x->framecount, 25);
    TimecodeAddFrames(x, 5);
    TimecodeSubtractFrames(x, 2);
    EXPECT_EQ(x->framecount, 28);
    TimecodeCopy(x, &copy);
    TimecodeIncrement(copy);
    EXPECT_EQ(copy->framecount, 29);
    Timecode* sum = nullptr;
    TimecodeAddTimecode(x, copy, &sum);
    EXPECT_EQ(sum->framecount, 57);
    TimecodeDestroy(sum);
    TimecodeDestroy(copy);
    TimecodeDestroy(x);
    TimecodeDestroy(nullptr);
}

// --- The timecode object ------------------------------------------------------------------

TEST(SkarnVestaTimecode, BuildsFromStringsAndCountsLikeTheClip) {
    auto start = SkarnVestaTimecode::timecodeWithString(std::string("01:00:00;00"), 30.0, 30.0, kPublicDrop);
    ASSERT_TRUE(start);
    EXPECT_EQ(start->stringValue(), "01:00:00;00");
    EXPECT_EQ(start->nativeFramecountWithDropAdjust(true, true), 107892.0);
    EXPECT_EQ(start->format(), kPublicDrop);
    EXPECT_EQ(start->hour(), 1);
    EXPECT_EQ(start->description(), "01:00:00;00 (30/30)");
    EXPECT_EQ(start->partsWithStyle(kInterpStyleFloor), (Array{1, 0, 0, 0}));
    EXPECT_TRUE(start->isEvenFrame());
    EXPECT_FALSE(SkarnVestaTimecode::timecodeWithString(std::nullopt, 30.0, 30.0, kPublicDrop));
    EXPECT_FALSE(SkarnVestaTimecode::timecodeWithString(std::string("01:00:00:00"), 0.0, 30.0, kPublicDrop));

    // Frame pairs: the 60p start is twice the 30-frame count.
    auto half = SkarnVestaTimecode::timecodeWithString(std::string("01:00:00:00"), 30.0, 0.0, kPublicNonDrop);
    const double pairs = half->nativeFramecountWithDropAdjust(false, true);
    auto full = SkarnVestaTimecode::timecodeWithFramecount(int64_t(pairs) * 2, 60.0, 60.0, 0, kPublicNonDrop);
    EXPECT_EQ(full->stringValue(), "01:00:00:00");
    EXPECT_EQ(full->frameDuration().value, 1001);
    EXPECT_EQ(full->frameDuration().timescale, 60000);

    auto thirty = SkarnVestaTimecode::timecodeWithFramecount(30, 30.0, 30.0, 0, kPublicNonDrop);
    CMTime t = thirty->time();
    EXPECT_EQ(t.value, 30030);
    EXPECT_EQ(t.timescale, 30000);
    auto odd = SkarnVestaTimecode::timecodeWithFramecount(30, 29.97, 29.97, 0, kPublicNonDrop);
    EXPECT_TRUE(CMTIME_IS_INVALID(odd->frameDuration()));
}

TEST(SkarnVestaTimecode, FromCMTimeByFrameDuration) {
    // 1/25 s: rate 25 and non-drop, drop or not.
    auto pal = SkarnVestaTimecode::timecodeWithCMTime(CMTimeMake(2, 1), CMTimeMake(1, 25), CMTimeMake(1, 25), true);
    ASSERT_TRUE(pal);
    EXPECT_EQ(pal->framerate(), 25.0);
    EXPECT_EQ(pal->format(), kPublicNonDrop);
    EXPECT_EQ(pal->nativeFramecountWithInterpStyle(kInterpStyleFloor), 50);

    // 23.976 with drop asked for: ";" shown, but no drops counted at 24.
    auto film = SkarnVestaTimecode::timecodeWithCMTime(CMTimeMake(60060, 1000), CMTimeMake(1001, 24000),
                                                       CMTimeMake(1001, 24000), true);
    EXPECT_EQ(film->format(), kPublicDrop);
    EXPECT_EQ(film->stringValue(), "00:01:00;00");
    EXPECT_EQ(film->nativeFramecountWithInterpStyle(kInterpStyleFloor), 1440);

    // QuickTime rounding toward zero: just short of frame 2 is frame 1; the
    // equal fraction 2002/60000 is the same 29.97 duration.
    auto ntsc = SkarnVestaTimecode::timecodeWithCMTime(CMTimeMake(2001, 30000), CMTimeMake(2002, 60000),
                                                       CMTimeMake(1001, 60000), false);
    ASSERT_TRUE(ntsc);
    EXPECT_EQ(ntsc->framerate(), 30.0);
    EXPECT_EQ(ntsc->interpFramerate(), 60.0);
    EXPECT_EQ(ntsc->nativeFramecountWithDropAdjust(false, false), 1.0);

    EXPECT_FALSE(SkarnVestaTimecode::timecodeWithCMTime(CMTimeMake(1, 1), CMTimeMake(1, 23), CMTimeMake(1, 23),
                                                        false));
    EXPECT_FALSE(SkarnVestaTimecode::timecodeWithCMTime(CMTimeMake(1, 1), kCMTimeInvalid, kCMTimeInvalid, false));
}

TEST(SkarnVestaTimecode, ArchiveCopyAndArithmetic) {
    Tolvo::Timecode* raw = TimecodeCreateWithFramecount(10, 3, kPublicNonDrop, nullptr, 24.0, 60.0);
    auto fractional = SkarnVestaTimecode::initWithTimecode(raw, true);
    Dictionary archive;
    fractional->encodeWithCoder(archive);
    EXPECT_EQ(archive.keys(), (std::vector<std::string>{"format", "framerate", "framecount", "useInterpRate"}));
    EXPECT_DOUBLE_EQ(archive.find("framecount")->doubleValue(), 11.2);
    EXPECT_EQ(archive.find("format")->integerValue(), kPublicNonDrop);
    auto restored = SkarnVestaTimecode::initWithCoder(archive);
    ASSERT_TRUE(restored);
    EXPECT_EQ(restored->nativeFramecountWithDropAdjust(false, false), 11.0);  // truncated
    EXPECT_EQ(restored->interpFramerate(), 24.0);
    EXPECT_TRUE(restored->useInterpRate());
    EXPECT_FALSE(SkarnVestaTimecode::initWithCoder(Dictionary{}));
    EXPECT_FALSE(SkarnVestaTimecode::initWithTimecode(nullptr, false));

    auto copy = fractional->copy();
    EXPECT_TRUE(copy->useInterpRate());
    copy->increment();
    EXPECT_NE(copy->timecode(), fractional->timecode());
    EXPECT_EQ(fractional->timecode()->iOffset, 3);
    EXPECT_EQ(copy->compare(fractional.get()), 1);
    EXPECT_EQ(fractional->compare(copy.get()), -1);
    EXPECT_EQ(fractional->compare(fractional.get()), 0);
    EXPECT_TRUE(fractional->isGreaterThanTimecode(nullptr));
    EXPECT_FALSE(fractional->isLessThanTimecode(nullptr));

    auto one = SkarnVestaTimecode::timecodeWithFramecount(25, 25.0, 25.0, 0, kPublicNonDrop);
    auto two = SkarnVestaTimecode::timecodeWithFramecount(50, 25.0, 25.0, 0, kPublicNonDrop);
    EXPECT_EQ(SkarnVestaTimecode::timecodeByAdding(one.get(), two.get())->nativeFramecountWithInterpStyle(2), 75);
    // Second minus first.
    EXPECT_EQ(SkarnVestaTimecode::timecodeBySubtracting(one.get(), two.get())->nativeFramecountWithInterpStyle(2),
              25);
    EXPECT_FALSE(SkarnVestaTimecode::timecodeByAdding(one.get(), nullptr));
    auto work = SkarnVestaTimecode::timecodeWithTimecode(one.get());
    work->add(work.get());
    EXPECT_EQ(work->nativeFramecountWithInterpStyle(2), 50);
    work->subtract(one.get(), two.get());  // two - one
    EXPECT_EQ(work->nativeFramecountWithInterpStyle(2), 25);
    work->subtract(two.get());
    EXPECT_EQ(work->nativeFramecountWithDropAdjust(false, false), -25.0);
    EXPECT_EQ(work->nativeFramecountWithInterpStyle(2), 25 * 86400 - 25);  // whole counts roll over
    EXPECT_EQ(work->addFrames(30)->nativeFramecountWithInterpStyle(2), 5);
    EXPECT_FALSE(work->isEvenFrame());
    work->setFormat(kPublicDrop);
    EXPECT_EQ(work->stringValue(), "00:00:00;05");
}
