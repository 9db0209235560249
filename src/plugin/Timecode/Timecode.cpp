#include "Timecode.h"

#include "TolvoArithmetic.h"

#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace Tolvo {

using detail::isDropRate;
using detail::satAdd;
using detail::satMul;
using detail::satSub;
using detail::truncInt;
using detail::truncLong;

namespace {

// Beyond this the drop-frame arithmetic's ten-minute products would no longer
// fit; no real rate comes near it.
constexpr long kMaxDropArithmeticRate = 1000000;

bool isSeparator(char c) { return c == ',' || c == '.' || c == ':' || c == ';'; }

// Packed digits: ...HHMMSSFF, two decimal digits per field, hours taking what remains.
void unpackDigits(long v, long& hours, long& minutes, long& seconds, long& frames) {
    frames = v % 100;
    seconds = (v / 100) % 100;
    minutes = (v / 10000) % 100;
    hours = v / 1000000;
}

// Carry in base 100, not at the frame rate: a frames field of 120 moves one
// second and leaves 20 frames, whatever the rate. A field of 99 stays.
void carryBase100(long& from, long& into) {
    if (from >= 99) {
        into = satAdd(into, from / 100);
        from %= 100;
    }
}

}  // namespace

Timecode::Timecode(long framecount, double framerate, double interpFramerate, long iOffset, TimecodeFormat format)
    : MediaTimeIndex(framecount, framerate, interpFramerate == 0.0 ? framerate : interpFramerate, iOffset),
      format(format), isFramecountFormat(format == kTimecodeFormatFramecount) {
    // A frame count given with two rates is taken to count interpolation frames.
    if (format == kTimecodeFormatFramecount && this->framerate != this->interpFramerate) {
        this->iOffset = satAdd(framecount, iOffset);
        this->framecount = 0;
    }
    updateIOffset();
}

Timecode::~Timecode() = default;

std::unique_ptr<Timecode> Timecode::TimecodeCreateWithFramecount(long framecount, long iOffset, double framerate,
                                                                 double interpFramerate, TimecodeFormat format) {
    if (framerate == 0.0) return nullptr;
    return std::make_unique<Timecode>(framecount, framerate, interpFramerate, iOffset, format);
}

std::unique_ptr<Timecode> Timecode::TimecodeCreateWithTimeindex(long timeindex, long iOffset, double framerate,
                                                                double interpFramerate, TimecodeFormat format) {
    if (framerate == 0.0) return nullptr;
    if (isDropRate(framerate) && format == kTimecodeFormatDrop) {
        const double interp = interpFramerate == 0.0 ? framerate : interpFramerate;
        double labels = static_cast<double>(iOffset) * framerate / interp + static_cast<double>(timeindex);
        timeindexToDropFramecountWithRate(&labels, truncLong(framerate));
        return std::make_unique<Timecode>(truncLong(labels), framerate, interpFramerate, 0, format);
    }
    return std::make_unique<Timecode>(timeindex, framerate, interpFramerate, iOffset, format);
}

std::unique_ptr<Timecode> Timecode::TimecodeCreateWithParts(int hours, int minutes, int seconds, int frames,
                                                            long iOffset, double framerate, double interpFramerate,
                                                            TimecodeFormat format) {
    if (framerate == 0.0) return nullptr;
    // Parts are counted as they stand, without drop-frame reduction.
    const long count = tcPartsToFramecount(framerate, hours, minutes, seconds, frames);
    return std::make_unique<Timecode>(count, framerate, interpFramerate, iOffset, format);
}

std::unique_ptr<Timecode> Timecode::TimecodeCreateWithString(const char* string, TimecodeFormat format,
                                                             double framerate, double interpFramerate,
                                                             int* signOut) {
    if (!string || framerate == 0.0) return nullptr;
    // Timecode text is short; only the first 13 bytes are ever looked at.
    char buffer[14] = {};
    std::strncpy(buffer, string, 13);
    long count = 0;
    TimecodeFormat parsedFormat = format;
    stringToFramecount(buffer, count, framerate, parsedFormat, signOut);
    return std::make_unique<Timecode>(count, framerate, interpFramerate, 0, parsedFormat);
}

double Timecode::nativeValue() const {
    return static_cast<double>(iOffset) * framerate / interpFramerate + static_cast<double>(framecount);
}

double Timecode::seconds() const { return nativeValue() / (framerate == 0.0 ? 1.0 : framerate); }

TimecodeStatus Timecode::getFramecountAndRound(long& out, InterpStyle style, bool interp) const {
    const bool dropDay = format == kTimecodeFormatDrop && isDropRate(framerate);
    if (framerate == interpFramerate) {
        double v = nativeValue();
        rolloverFramecount(v, framerate, dropDay);
        out = truncLong(v);
        return kTimecodeNoErr;
    }
    switch (style) {
    case kInterpStyleCeiling:
    case kInterpStyleFloor: {
        double v = nativeValue();
        rolloverFramecount(v, framerate, dropDay);
        double x = interp ? v * interpFramerate / framerate : v;
        x = style == kInterpStyleCeiling ? std::ceil(x) : std::floor(x);
        out = truncLong(x);
        return kTimecodeNoErr;
    }
    case kInterpStyleWholeUp:
    case kInterpStyleWholeDown: {
        long count = framecount;
        long offset = iOffset;
        scaleIOffset(offset, count, framerate, interpFramerate);
        double x = static_cast<double>(count);
        if (style == kInterpStyleWholeUp && offset >= 1) {
            const long g = gcd(truncInt(interpFramerate), truncInt(framerate));
            if (g != 0) x += framerate / static_cast<double>(g);
        }
        // The drop test looks at the interpolation rate here, unlike the
        // other paths, and nothing on this path rolls over.
        if (format == kTimecodeFormatDrop && isDropRate(interpFramerate))
            timeindexToDropFramecountWithRate(&x, truncLong(interpFramerate));
        if (interp) x = x * interpFramerate / framerate;
        out = truncLong(x);
        return kTimecodeNoErr;
    }
    }
    return kTimecodeErr;
}

TimecodeStatus Timecode::getNativeFramecount(long& out, InterpStyle style) const {
    return getFramecountAndRound(out, style, false);
}

TimecodeStatus Timecode::getInterpFramecount(long& out, InterpStyle style) const {
    return getFramecountAndRound(out, style, true);
}

TimecodeStatus Timecode::getNativeFramecount(double& out, bool dropAdjust, bool rollover) const {
    double v = nativeValue();
    if (rollover)
        rolloverFramecount(v, framerate, dropAdjust && format == kTimecodeFormatDrop && isDropRate(framerate));
    out = v;
    return kTimecodeNoErr;
}

TimecodeStatus Timecode::getInterpFramecount(double& out, bool dropAdjust, bool rollover) const {
    double v = 0.0;
    getNativeFramecount(v, dropAdjust, rollover);
    out = v * interpFramerate / framerate;
    return kTimecodeNoErr;
}

TimecodeStatus Timecode::getTCParts(int& hours, int& minutes, int& seconds, int& frames, InterpStyle style) const {
    long whole = 0;
    if (getFramecountAndRound(whole, style, useInterpRate) != kTimecodeNoErr) return kTimecodeErr;
    const double rate = useInterpRate ? interpFramerate : framerate;
    if (rate == 0.0) return kTimecodeErr;
    double f = static_cast<double>(whole);
    if (isDropRate(rate) && format == kTimecodeFormatDrop) dropFramecountToTimeindexWithRate(&f, truncLong(rate));
    const long h = truncLong(f / (3600.0 * rate));
    f -= static_cast<double>(truncLong(static_cast<double>(h) * 3600.0 * rate));
    const long m = truncLong(f / (60.0 * rate));
    f -= static_cast<double>(truncLong(static_cast<double>(m) * 60.0 * rate));
    const long s = truncLong(f / rate);
    f -= static_cast<double>(truncLong(static_cast<double>(s) * rate));
    hours = truncInt(static_cast<double>(h));
    minutes = truncInt(static_cast<double>(m));
    seconds = truncInt(static_cast<double>(s));
    frames = truncInt(f);
    return kTimecodeNoErr;
}

std::optional<std::string> Timecode::toCFString(InterpStyle style) const {
    if (isFramecountFormat) {
        long count = 0;
        if (getFramecountAndRound(count, style, useInterpRate) != kTimecodeNoErr) return std::nullopt;
        return std::to_string(count);
    }
    int h = 0, m = 0, s = 0, f = 0;
    if (getTCParts(h, m, s, f, style) != kTimecodeNoErr) return std::nullopt;
    const char separator = format == kTimecodeFormatDrop ? ';' : ':';
    // "*" marks a position between native frames when working at the
    // interpolation rate.
    bool between = false;
    if (useInterpRate) {
        const double x = nativeValue() * interpFramerate / framerate;
        double whole = 0.0;
        between = std::modf(x, &whole) > 0.0;
    }
    char buffer[96];
    const int n = std::snprintf(buffer, sizeof buffer, "%02d:%02d:%02d%c%02d%s", h, m, s, separator, f,
                                between ? "*" : "");
    return std::string(buffer, static_cast<size_t>(n));
}

TimecodeStatus Timecode::setInterpFramerate(double rate, InterpStyle style) {
    if (rate == 0.0) return kTimecodeErr;
    if (rate == interpFramerate) return kTimecodeNoErr;
    updateIOffset();
    long whole = 0;
    if (getFramecountAndRound(whole, style, false) != kTimecodeNoErr) return kTimecodeErr;
    framecount = whole;
    iOffset = 0;
    interpFramerate = rate;
    return kTimecodeNoErr;
}

TimecodeStatus Timecode::setTCFormat(TimecodeFormat newFormat, bool convert) {
    if (format == newFormat && (!isFramecountFormat || newFormat == kTimecodeFormatFramecount)) return kTimecodeNoErr;
    // The frame-count form is a display flag: the format field keeps the
    // form the value came from, so that changing back can still convert.
    if (newFormat == kTimecodeFormatFramecount) {
        isFramecountFormat = true;
        return kTimecodeNoErr;
    }
    isFramecountFormat = false;
    double v = static_cast<double>(framecount) + static_cast<double>(iOffset) * framerate / interpFramerate;
    if (convert) {
        // No 30/60 check on either conversion: any rate gets the labels-per-
        // minute of the rule (2 at 30, else 4).
        if (format == kTimecodeFormatNonDrop)
            dropFramecountToTimeindexWithRate(&v, truncLong(framerate));
        else if (format == kTimecodeFormatDrop)
            timeindexToDropFramecountWithRate(&v, truncLong(framerate));
    } else {
        rolloverFramecount(v, framerate, format == kTimecodeFormatDrop && isDropRate(framerate));
    }
    format = newFormat;
    framecount = truncLong(v);
    iOffset = 0;
    updateIOffset();
    return kTimecodeNoErr;
}

TimecodeStatus Timecode::interp(const char* string, TimecodeFormat parseFormat) {
    if (!string) return kTimecodeErr;
    TimecodeFormat f = parseFormat;
    if (parseFormat == kTimecodeFormatFromString) {
        f = kTimecodeFormatFramecount;
        for (const char* c = string; *c; ++c) {
            if (*c == ';') {
                f = kTimecodeFormatDrop;
                break;
            }
            if (isSeparator(*c)) f = kTimecodeFormatNonDrop;
        }
    }
    int sign = 0;
    std::unique_ptr<Timecode> parsed =
        useInterpRate ? TimecodeCreateWithString(string, f, interpFramerate, interpFramerate, &sign)
                      : TimecodeCreateWithString(string, f, framerate, interpFramerate, &sign);
    if (!parsed) return kTimecodeErr;
    if (useInterpRate && framerate != interpFramerate && framerate != 0.0) {
        // Rebuilt at this timecode's rates; the scale is native over
        // interpolation rate, as the value has always been rebuilt.
        const long offset = truncLong(parsed->nativeValue() * framerate / interpFramerate);
        auto rebuilt = std::make_unique<Timecode>(0, framerate, interpFramerate, offset, parsed->format);
        rebuilt->useInterpRate = true;
        parsed = std::move(rebuilt);
    }
    const TimecodeFormat keptFormat = format;
    if (sign == 0) {
        framecount = parsed->framecount;
        iOffset = parsed->iOffset;
        framerate = parsed->framerate;
        interpFramerate = parsed->interpFramerate;
        useInterpRate = parsed->useInterpRate;
        isFramecountFormat = parsed->isFramecountFormat;
    } else if (sign > 0) {
        *this = *this + *parsed;
    } else {
        *this = *this - *parsed;
    }
    format = keptFormat;
    return kTimecodeNoErr;
}

long Timecode::tcPartsToFramecount(double framerate, long hours, long minutes, long seconds, long frames) {
    if (framerate == 0.0) return 0;
    const long secs = satAdd(satAdd(truncLong(static_cast<double>(minutes) * 60.0), seconds),
                             truncLong(static_cast<double>(hours) * 60.0 * 60.0));
    return satAdd(truncLong(static_cast<double>(secs) * framerate), frames);
}

TimecodeStatus Timecode::stringToFramecount(const char* string, long& out, double framerate, TimecodeFormat& format,
                                            int* signOut) {
    if (!string || !*string) {
        out = 0;
        return kTimecodeNoErr;
    }
    const bool marked = format == kTimecodeFormatMarkedFrame && string[std::strlen(string) - 1] == '*';

    const char* p = string;
    while (*p == ' ') ++p;
    if (signOut) {
        if (*p == '-') {
            *signOut = -1;
            ++p;
        } else if (*p == '+') {
            *signOut = 1;
            ++p;
        } else {
            *signOut = 0;
        }
    }
    while (*p == ' ') ++p;

    int separators = 0;
    for (const char* c = p; *c; ++c) {
        if (!isSeparator(*c)) continue;
        ++separators;
        if (*c == ';') format = kTimecodeFormatDrop;
    }

    long hours = 0, minutes = 0, seconds = 0, frames = 0;
    TimecodeStatus status = kTimecodeNoErr;
    if (separators >= 1 && separators <= 3) {
        long fields[4] = {};
        const char* c = p;
        for (int k = 0; k <= separators; ++k) {
            // strtol saturates and stops at the separator; an empty field is 0.
            fields[k] = (*c == '\0' || isSeparator(*c)) ? 0 : std::strtol(c, nullptr, 10);
            while (*c && !isSeparator(*c)) ++c;
            if (*c) ++c;
        }
        // The most significant field comes first.
        long* parts[4] = {&hours, &minutes, &seconds, &frames};
        for (int k = 0; k <= separators; ++k) *parts[3 - separators + k] = fields[k];
        carryBase100(frames, seconds);
        carryBase100(seconds, minutes);
        carryBase100(minutes, hours);
    } else if (separators == 0) {
        const long number = std::strtol(p, nullptr, 10);
        if (format == kTimecodeFormatFramecount) {
            out = number;
            return kTimecodeNoErr;
        }
        unpackDigits(number, hours, minutes, seconds, frames);
    } else {
        status = kTimecodeErr;
    }

    const long markedFrame = (marked && format == kTimecodeFormatMarkedFrame) ? 1 : 0;
    if (framerate == 0.0)
        out = markedFrame;
    else
        out = satAdd(tcPartsToFramecount(framerate, hours, minutes, seconds, frames), markedFrame);

    if (isDropRate(framerate) && format == kTimecodeFormatDrop) {
        double labels = static_cast<double>(out);
        timeindexToDropFramecountWithRate(&labels, truncLong(framerate));
        out = truncLong(labels);
    }
    return status;
}

void Timecode::timeindexToDropFramecountWithRate(double* inout, long rate) {
    if (!inout || rate <= 0 || rate > kMaxDropArithmeticRate) return;
    const long d = detail::dropLabelsPerMinute(rate);
    const long tenMinutes = rate * 600;
    const long minute = rate * 60;
    const double labels = *inout;
    const long q = truncLong(labels / static_cast<double>(tenMinutes));
    const long r = satSub(truncLong(labels), satMul(tenMinutes, q));
    const long m = r / minute;
    long skipped = 0;
    if (m > 0 && m < 10) {
        // A label inside the skipped ones at the top of a minute maps onto
        // the minute's first real frame.
        const long intoMinute = r % minute;
        skipped = intoMinute < d ? m * d - d + intoMinute : m * d;
    } else if (m >= 10) {
        skipped = 9 * d;
    }
    *inout = labels - static_cast<double>(satAdd(satMul(9 * d, q), skipped));
}

void Timecode::dropFramecountToTimeindexWithRate(double* inout, long rate) {
    if (!inout || rate <= 0 || rate > kMaxDropArithmeticRate) return;
    const long d = detail::dropLabelsPerMinute(rate);
    const long perTenMinutes = 9 * d;
    const long framesInTenMinutes = rate * 600 - perTenMinutes;
    const long framesInMinute = rate * 60 - d;
    const double frames = *inout;
    const long q = truncLong(frames / static_cast<double>(framesInTenMinutes));
    const double r = frames - static_cast<double>(framesInTenMinutes) * static_cast<double>(q);
    long m = truncLong(r / static_cast<double>(framesInMinute));
    long added = 0;
    if (m > 0) {
        added = perTenMinutes;
        if (m <= 9) {
            if (truncLong(r) % framesInMinute < d) m = m - 1;
            added = m * d;
        }
    }
    *inout = frames + static_cast<double>(perTenMinutes) * static_cast<double>(q) + static_cast<double>(added);
}

TimecodeStatus Timecode::tcStackToTC(int count, double framerate, int* stack, long& out, TimecodeFormat format) {
    if (!stack) return kTimecodeNoErr;
    if (format == kTimecodeFormatFramecount) {
        out = stack[0];
        return kTimecodeNoErr;
    }
    long hours = 0, minutes = 0, seconds = 0, frames = 0;
    TimecodeStatus status = kTimecodeNoErr;
    if (count == 0) {
        unpackDigits(stack[0], hours, minutes, seconds, frames);
    } else if (count >= 1 && count <= 3) {
        // All four entries are read whatever the count says.
        frames = stack[0];
        seconds = stack[1];
        minutes = stack[2];
        hours = stack[3];
    } else {
        status = kTimecodeErr;
    }
    out = framerate == 0.0 ? 0 : tcPartsToFramecount(framerate, hours, minutes, seconds, frames);
    return status;
}

Timecode Timecode::combine(const Timecode& other, int sign) const {
    Timecode result(*this);
    auto apply = [sign](long a, long b) { return sign > 0 ? satAdd(a, b) : satSub(a, b); };
    if (other.framerate == framerate && other.interpFramerate == interpFramerate) {
        result.framecount = apply(result.framecount, other.framecount);
        result.iOffset = apply(result.iOffset, other.iOffset);
    } else if (other.framerate == interpFramerate) {
        // The other value is counted at our interpolation rate: its offset
        // and frame count cross over, as they always have.
        result.framecount = apply(result.framecount, other.iOffset);
        result.iOffset = apply(result.iOffset, other.framecount);
    }
    result.updateIOffset();
    return result;
}

Timecode Timecode::addFrames(long frames, int sign) const {
    // Counted at the interpolation rate when working at it, or when a frame
    // count was given with two rates (see the constructor).
    const bool interpUnits = useInterpRate || (isFramecountFormat && framerate != interpFramerate);
    Timecode step(*this);
    step.framecount = interpUnits ? 0 : frames;
    step.iOffset = interpUnits ? frames : 0;
    return combine(step, sign);
}

Timecode Timecode::operator+(const Timecode& other) const { return combine(other, 1); }
Timecode Timecode::operator-(const Timecode& other) const { return combine(other, -1); }
Timecode Timecode::operator+(long frames) const { return addFrames(frames, 1); }
Timecode Timecode::operator-(long frames) const { return addFrames(frames, -1); }

Timecode& Timecode::operator++() {
    if (useInterpRate) {
        iOffset = satAdd(iOffset, 1);
        updateIOffset();
    } else {
        *this = *this + 1L;
    }
    return *this;
}

Timecode& Timecode::operator--() {
    if (useInterpRate) {
        iOffset = satSub(iOffset, 1);
        updateIOffset();
    } else {
        *this = *this - 1L;
    }
    return *this;
}

Timecode Timecode::operator++(int) {
    Timecode former(*this);
    ++*this;
    return former;
}

Timecode Timecode::operator--(int) {
    Timecode former(*this);
    --*this;
    return former;
}

bool Timecode::operator>(const Timecode& other) const { return seconds() > other.seconds(); }
bool Timecode::operator<(const Timecode& other) const { return seconds() < other.seconds(); }
bool Timecode::operator==(const Timecode& other) const { return !(*this > other) && !(other > *this); }
bool Timecode::operator>=(const Timecode& other) const { return *this > other || *this == other; }
bool Timecode::operator<=(const Timecode& other) const { return *this < other || *this == other; }

}  // namespace Tolvo
