#include "SkarnVestaTimecode.h"

#include "TimecodeFunctions.h"
#include "TolvoArithmetic.h"

#include <cstdio>

using Tolvo::Timecode;

namespace {

struct RateAndFormat {
    double rate;
    int32_t format;
};

// Frame durations the cameras record, compared as times so that equal
// fractions (2002/60000 and 1001/30000) match. Only the 1000/1001 rates can
// carry drop-frame; 1001/24000 may be asked for it although no drop
// arithmetic exists at 24.
RateAndFormat rateForFrameDuration(CMTime duration, bool drop) {
    auto is = [&](int64_t value, int32_t timescale) {
        return CMTIME_IS_NUMERIC(duration) && CMTimeCompare(duration, CMTimeMake(value, timescale)) == 0;
    };
    const int32_t dropOrNot = drop ? 1 : 2;
    if (is(2002, 60000) || is(100, 2997) || is(1001, 30000)) return {30.0, dropOrNot};
    if (is(1001, 24000)) return {24.0, dropOrNot};
    if (is(100, 2400)) return {24.0, 2};
    if (is(100, 2500)) return {25.0, 2};
    if (is(100, 3000)) return {30.0, 2};
    if (is(100, 5000)) return {50.0, 2};
    if (is(1001, 60000)) return {60.0, dropOrNot};
    if (is(100, 6000)) return {60.0, 2};
    return {0.0, 0};
}

Timecode* valueOf(const SkarnVestaTimecode* t) { return t ? t->timecode() : nullptr; }

}  // namespace

SkarnVestaTimecode::~SkarnVestaTimecode() { TimecodeDestroy(_timecode); }

Ref<SkarnVestaTimecode> SkarnVestaTimecode::initWithTimecode(Timecode* timecode, bool useInterpRate) {
    if (!timecode) return nullptr;
    Ref<SkarnVestaTimecode> object(new SkarnVestaTimecode(timecode));
    TimecodeSetUseInterpRate(timecode, useInterpRate);
    return object;
}

Ref<SkarnVestaTimecode> SkarnVestaTimecode::timecodeWithFramecount(int64_t framecount, double framerate,
                                                                   double iFramerate, int64_t interpOffset,
                                                                   int32_t format) {
    return initWithTimecode(
        TimecodeCreateWithFramecount(framecount, interpOffset, format, nullptr, framerate, iFramerate), false);
}

Ref<SkarnVestaTimecode> SkarnVestaTimecode::timecodeWithTimeIndex(int64_t timeIndex, double framerate,
                                                                  double iFramerate, int64_t interpOffset,
                                                                  int32_t format) {
    return initWithTimecode(
        TimecodeCreateWithTimeIndex(timeIndex, interpOffset, format, nullptr, framerate, iFramerate), false);
}

Ref<SkarnVestaTimecode> SkarnVestaTimecode::timecodeWithHours(int hours, int mins, int secs, int frames,
                                                              double framerate, double iFramerate,
                                                              int64_t interpOffset, int32_t format) {
    return initWithTimecode(TimecodeCreateWithParts(hours, mins, secs, frames, interpOffset, format, nullptr,
                                                    framerate, iFramerate),
                            false);
}

Ref<SkarnVestaTimecode> SkarnVestaTimecode::timecodeWithString(const std::optional<std::string>& string,
                                                               double framerate, double iFramerate,
                                                               int32_t format) {
    if (!string) return nullptr;
    int sign = 0;
    return initWithTimecode(
        TimecodeCreateWithString(string->c_str(), format, &sign, nullptr, framerate, iFramerate), false);
}

Ref<SkarnVestaTimecode> SkarnVestaTimecode::timecodeWithTimecode(const SkarnVestaTimecode* other) {
    if (!other) return nullptr;
    return other->copy();
}

Ref<SkarnVestaTimecode> SkarnVestaTimecode::timecodeWithCMTime(CMTime time, CMTime frameDuration,
                                                               CMTime interpFrameDuration, bool drop) {
    // Every duration the table knows is positive, so the division below is safe.
    const RateAndFormat native = rateForFrameDuration(frameDuration, drop);
    if (native.rate == 0.0 || frameDuration.value <= 0) return nullptr;
    const RateAndFormat interp = rateForFrameDuration(interpFrameDuration, drop);
    const CMTime converted = CMTimeConvertScale(time, frameDuration.timescale, kCMTimeRoundingMethod_QuickTime);
    if (!CMTIME_IS_NUMERIC(converted)) return nullptr;
    const int64_t framecount = converted.value / frameDuration.value;
    return timecodeWithFramecount(framecount, native.rate, interp.rate, 0, native.format);
}

Ref<SkarnVestaTimecode> SkarnVestaTimecode::timecodeByAdding(const SkarnVestaTimecode* a,
                                                             const SkarnVestaTimecode* b) {
    Timecode* sum = nullptr;
    TimecodeAddTimecode(valueOf(a), valueOf(b), &sum);
    return initWithTimecode(sum, TimecodeGetUseInterpRate(valueOf(a)));
}

Ref<SkarnVestaTimecode> SkarnVestaTimecode::timecodeBySubtracting(const SkarnVestaTimecode* first,
                                                                  const SkarnVestaTimecode* second) {
    Timecode* difference = nullptr;
    TimecodeSubtractTimecode(valueOf(second), valueOf(first), &difference);
    return initWithTimecode(difference, TimecodeGetUseInterpRate(valueOf(first)));
}

CMTime SkarnVestaTimecode::time() const {
    if (!_timecode) return kCMTimeInvalid;
    double count = 0.0;
    TimecodeGetNativeFramecount(_timecode, false, false, &count);
    return CMTimeMultiplyByFloat64(frameDuration(), count);
}

CMTime SkarnVestaTimecode::frameDuration() const {
    if (!_timecode) return kCMTimeInvalid;
    switch (Tolvo::detail::truncLong(_timecode->framerate)) {
    case 24: return CMTimeMake(1001, 24000);
    case 25: return CMTimeMake(100, 2500);
    case 30: return CMTimeMake(1001, 30000);
    case 50: return CMTimeMake(100, 5000);
    case 60: return CMTimeMake(1001, 60000);
    }
    return kCMTimeInvalid;
}

int32_t SkarnVestaTimecode::format() const {
    int32_t format = 0;
    TimecodeGetTCFormat(_timecode, &format);
    return format;
}

void SkarnVestaTimecode::setFormat(int32_t format) { TimecodeSetTCFormat(_timecode, format, false); }

Array SkarnVestaTimecode::partsWithStyle(int32_t style) const {
    int h = 0, m = 0, s = 0, f = 0;
    TimecodeGetTCParts(_timecode, &h, &m, &s, &f, style);
    return Array{Value(h), Value(m), Value(s), Value(f)};
}

int32_t SkarnVestaTimecode::hour() const {
    if (!_timecode) return -1;
    int h = 0;
    TimecodeGetTCParts(_timecode, &h, nullptr, nullptr, nullptr, Tolvo::kInterpStyleFloor);
    return h;
}

double SkarnVestaTimecode::framerate() const {
    if (!_timecode) return -1.0;
    return _timecode->framerate;
}

double SkarnVestaTimecode::interpFramerate() const {
    if (!_timecode) return -1.0;
    return _timecode->interpFramerate;
}

bool SkarnVestaTimecode::useInterpRate() const { return TimecodeGetUseInterpRate(_timecode); }

void SkarnVestaTimecode::setUseInterpRate(bool use) { TimecodeSetUseInterpRate(_timecode, use); }

std::optional<std::string> SkarnVestaTimecode::stringValue() const {
    std::optional<std::string> text;
    TimecodeGetCFStringRepresentation(_timecode, Tolvo::kInterpStyleFloor, &text);
    return text;
}

std::string SkarnVestaTimecode::description() const {
    char rates[64];
    std::snprintf(rates, sizeof rates, " (%2.0f/%2.0f)", framerate(), interpFramerate());
    return stringValue().value_or("(null)") + rates;
}

double SkarnVestaTimecode::nativeFramecountWithDropAdjust(bool dropAdjust, bool rollover) const {
    if (!_timecode) return -1.0;
    double count = 0.0;
    TimecodeGetNativeFramecount(_timecode, dropAdjust, rollover, &count);
    return count;
}

double SkarnVestaTimecode::interpFramecountWithDropAdjust(bool dropAdjust, bool rollover) const {
    if (!_timecode) return -1.0;
    double count = 0.0;
    TimecodeGetInterpFramecount(_timecode, dropAdjust, rollover, &count);
    return count;
}

int64_t SkarnVestaTimecode::nativeFramecountWithInterpStyle(int32_t style) const {
    if (!_timecode) return -1;
    long count = 0;
    TimecodeGetNativeFramecountWithInterpStyle(_timecode, style, &count);
    return count;
}

int64_t SkarnVestaTimecode::interpFramecountWithInterpStyle(int32_t style) const {
    if (!_timecode) return -1;
    long count = 0;
    TimecodeGetInterpFramecountWithInterpStyle(_timecode, style, &count);
    return count;
}

void SkarnVestaTimecode::setInterpFramerate(double rate, int32_t style) {
    TimecodeSetInterpFramerate(_timecode, style, rate);
}

void SkarnVestaTimecode::interpolate(const std::optional<std::string>& string, int32_t format) {
    if (!string) return;
    TimecodeInterpolate(_timecode, string->c_str(), format);
}

void SkarnVestaTimecode::replaceTimecode(Timecode* replacement) {
    // The old value goes only once its replacement exists, since either
    // operand may be this object.
    if (!replacement) return;
    TimecodeDestroy(_timecode);
    _timecode = replacement;
}

void SkarnVestaTimecode::add(const SkarnVestaTimecode* a, const SkarnVestaTimecode* b) {
    Timecode* sum = nullptr;
    TimecodeAddTimecode(valueOf(a), valueOf(b), &sum);
    replaceTimecode(sum);
}

void SkarnVestaTimecode::subtract(const SkarnVestaTimecode* a, const SkarnVestaTimecode* b) {
    Timecode* difference = nullptr;
    TimecodeSubtractTimecode(valueOf(b), valueOf(a), &difference);
    replaceTimecode(difference);
}

void SkarnVestaTimecode::add(const SkarnVestaTimecode* other) { add(this, other); }

void SkarnVestaTimecode::subtract(const SkarnVestaTimecode* other) { subtract(other, this); }

SkarnVestaTimecode* SkarnVestaTimecode::addFrames(int64_t count) {
    TimecodeAddFrames(_timecode, count);
    return this;
}

SkarnVestaTimecode* SkarnVestaTimecode::subtractFrames(int64_t count) {
    TimecodeSubtractFrames(_timecode, count);
    return this;
}

void SkarnVestaTimecode::increment() { TimecodeIncrement(_timecode); }

void SkarnVestaTimecode::decrement() { TimecodeDecrement(_timecode); }

bool SkarnVestaTimecode::isEqualToTimecode(const SkarnVestaTimecode* other) const {
    return TimecodesAreEqual(_timecode, valueOf(other));
}

bool SkarnVestaTimecode::isGreaterThanTimecode(const SkarnVestaTimecode* other) const {
    return TimecodeIsGreaterThan(_timecode, valueOf(other));
}

bool SkarnVestaTimecode::isLessThanTimecode(const SkarnVestaTimecode* other) const {
    return TimecodeIsLessThan(_timecode, valueOf(other));
}

bool SkarnVestaTimecode::isGreaterThanOrEqualToTimecode(const SkarnVestaTimecode* other) const {
    return TimecodeIsGreaterThanOrEqualTo(_timecode, valueOf(other));
}

bool SkarnVestaTimecode::isLessThanOrEqualToTimecode(const SkarnVestaTimecode* other) const {
    return TimecodeIsLessThanOrEqualTo(_timecode, valueOf(other));
}

int32_t SkarnVestaTimecode::compare(const SkarnVestaTimecode* other) const {
    if (TimecodeIsGreaterThan(valueOf(other), _timecode)) return -1;
    if (TimecodeIsLessThan(valueOf(other), _timecode)) return 1;
    return 0;
}

bool SkarnVestaTimecode::isEvenFrame() const {
    int frames = 0;
    TimecodeGetTCParts(_timecode, nullptr, nullptr, nullptr, &frames, Tolvo::kInterpStyleFloor);
    return frames % 2 == 0;
}

void SkarnVestaTimecode::encodeWithCoder(Dictionary& coder) const {
    int32_t format = 0;
    double rate = 0.0;
    double count = 0.0;
    TimecodeGetTCFormat(_timecode, &format);
    TimecodeGetFramerate(_timecode, &rate);
    TimecodeGetNativeFramecount(_timecode, true, true, &count);
    coder.set("format", Value(format));
    coder.set("framerate", Value(rate));
    coder.set("framecount", Value(count));
    coder.set("useInterpRate", Value(TimecodeGetUseInterpRate(_timecode)));
}

Ref<SkarnVestaTimecode> SkarnVestaTimecode::initWithCoder(const Dictionary& coder) {
    auto number = [&](const char* key) {
        const Value* v = coder.find(key);
        return v ? v->doubleValue() : 0.0;
    };
    const Value* format = coder.find("format");
    const Value* flag = coder.find("useInterpRate");
    const double rate = number("framerate");
    const long count = Tolvo::detail::truncLong(number("framecount"));
    Timecode* restored = TimecodeCreateWithFramecount(count, 0, format ? int32_t(format->integerValue()) : 0,
                                                      nullptr, rate, rate);
    return initWithTimecode(restored, flag ? flag->boolValue().value_or(false) : false);
}

Ref<SkarnVestaTimecode> SkarnVestaTimecode::copyWithZone(void*) const {
    Timecode* duplicate = nullptr;
    TimecodeCopy(_timecode, &duplicate);
    return initWithTimecode(duplicate, TimecodeGetUseInterpRate(_timecode));
}
