#include "TimecodeFunctions.h"

#include <memory>

using Tolvo::Timecode;

namespace {

constexpr int32_t kOK = 0;
constexpr int32_t kFailed = -1;

int32_t status(Tolvo::TimecodeStatus s) { return s == Tolvo::kTimecodeNoErr ? kOK : kFailed; }

Timecode* handOut(std::unique_ptr<Timecode> created, Timecode** out) {
    Timecode* raw = created.release();
    if (out) *out = raw;
    return raw;
}

Tolvo::InterpStyle style(int32_t s) { return static_cast<Tolvo::InterpStyle>(s); }

}  // namespace

namespace TimecodeFormatNumbers {

Tolvo::TimecodeFormat libraryFormat(int32_t publicFormat) {
    switch (publicFormat) {
    case 1: return Tolvo::kTimecodeFormatDrop;
    case 2: return Tolvo::kTimecodeFormatNonDrop;
    case 3: return Tolvo::kTimecodeFormatFramecount;
    case 4: return Tolvo::kTimecodeFormatMarkedFrame;
    }
    // A value no library operation knows: shown with ":" and never dropped.
    return static_cast<Tolvo::TimecodeFormat>(8);
}

bool publicFormat(Tolvo::TimecodeFormat libraryFormat, int32_t& out) {
    switch (libraryFormat) {
    case Tolvo::kTimecodeFormatNonDrop: out = 2; return true;
    case Tolvo::kTimecodeFormatDrop: out = 1; return true;
    case Tolvo::kTimecodeFormatFramecount: out = 3; return true;
    case Tolvo::kTimecodeFormatMarkedFrame: out = 4; return true;
    default: return false;
    }
}

}  // namespace TimecodeFormatNumbers

using TimecodeFormatNumbers::libraryFormat;

Timecode* TimecodeCreateWithFramecount(long framecount, long iOffset, int32_t format, Timecode** out,
                                       double framerate, double interpFramerate) {
    return handOut(Timecode::TimecodeCreateWithFramecount(framecount, iOffset, framerate, interpFramerate,
                                                          libraryFormat(format)),
                   out);
}

Timecode* TimecodeCreateWithTimeIndex(long timeindex, long iOffset, int32_t format, Timecode** out,
                                      double framerate, double interpFramerate) {
    return handOut(Timecode::TimecodeCreateWithTimeindex(timeindex, iOffset, framerate, interpFramerate,
                                                         libraryFormat(format)),
                   out);
}

Timecode* TimecodeCreateWithParts(int hours, int minutes, int seconds, int frames, long iOffset, int32_t format,
                                  Timecode** out, double framerate, double interpFramerate) {
    return handOut(Timecode::TimecodeCreateWithParts(hours, minutes, seconds, frames, iOffset, framerate,
                                                     interpFramerate, libraryFormat(format)),
                   out);
}

Timecode* TimecodeCreateWithString(const char* string, int32_t format, int* signOut, Timecode** out,
                                   double framerate, double interpFramerate) {
    return handOut(
        Timecode::TimecodeCreateWithString(string, libraryFormat(format), framerate, interpFramerate, signOut), out);
}

void TimecodeDestroy(Timecode* timecode) { delete timecode; }

int32_t TimecodeCopy(const Timecode* timecode, Timecode** out) {
    if (!timecode || !out) return kFailed;
    *out = new Timecode(*timecode);
    return kOK;
}

int32_t TimecodeGetTCFormat(const Timecode* timecode, int32_t* outFormat) {
    if (!timecode || !outFormat) return kFailed;
    return TimecodeFormatNumbers::publicFormat(timecode->format, *outFormat) ? kOK : kFailed;
}

int32_t TimecodeSetTCFormat(Timecode* timecode, int32_t format, bool convert) {
    if (!timecode) return kFailed;
    return status(timecode->setTCFormat(libraryFormat(format), convert));
}

int32_t TimecodeGetCFStringRepresentation(const Timecode* timecode, int32_t s, std::optional<std::string>* out) {
    if (!timecode || !out) return kFailed;
    *out = timecode->toCFString(style(s));
    return out->has_value() ? kOK : kFailed;
}

int32_t TimecodeGetTCParts(const Timecode* timecode, int* hours, int* minutes, int* seconds, int* frames,
                           int32_t s) {
    if (!timecode) return kFailed;
    int h = 0, m = 0, sec = 0, f = 0;
    const int32_t result = status(timecode->getTCParts(h, m, sec, f, style(s)));
    if (result != kOK) h = m = sec = f = 0;
    if (hours) *hours = h;
    if (minutes) *minutes = m;
    if (seconds) *seconds = sec;
    if (frames) *frames = f;
    return result;
}

int32_t TimecodeGetFramerate(const Timecode* timecode, double* out) {
    if (!timecode || !out) return kFailed;
    *out = timecode->framerate;
    return kOK;
}

int32_t TimecodeGetInterpFramerate(const Timecode* timecode, double* out) {
    if (!timecode || !out) return kFailed;
    *out = timecode->interpFramerate;
    return kOK;
}

int32_t TimecodeGetNativeFramecount(const Timecode* timecode, bool dropAdjust, bool rollover, double* out) {
    if (!timecode || !out) return kFailed;
    return status(timecode->getNativeFramecount(*out, dropAdjust, rollover));
}

int32_t TimecodeGetInterpFramecount(const Timecode* timecode, bool dropAdjust, bool rollover, double* out) {
    if (!timecode || !out) return kFailed;
    return status(timecode->getInterpFramecount(*out, dropAdjust, rollover));
}

int32_t TimecodeGetNativeFramecountWithInterpStyle(const Timecode* timecode, int32_t s, long* out) {
    if (!timecode || !out) return kFailed;
    return status(timecode->getNativeFramecount(*out, style(s)));
}

int32_t TimecodeGetInterpFramecountWithInterpStyle(const Timecode* timecode, int32_t s, long* out) {
    if (!timecode || !out) return kFailed;
    return status(timecode->getInterpFramecount(*out, style(s)));
}

int32_t TimecodeSetInterpFramerate(Timecode* timecode, int32_t s, double rate) {
    if (!timecode) return kFailed;
    return status(timecode->setInterpFramerate(rate, style(s)));
}

bool TimecodeGetUseInterpRate(const Timecode* timecode) { return timecode ? timecode->getUseInterpRate() : true; }

int32_t TimecodeSetUseInterpRate(Timecode* timecode, bool use) {
    if (!timecode) return kFailed;
    timecode->setUseInterpRate(use);
    return kOK;
}

int32_t TimecodeInterpolate(Timecode* timecode, const char* string, int32_t format) {
    if (!timecode || !string) return kFailed;
    return status(timecode->interp(string, libraryFormat(format)));
}

int32_t TimecodeAddFrames(Timecode* timecode, long count) {
    if (!timecode || count < 0) return kFailed;
    *timecode = *timecode + count;
    return kOK;
}

int32_t TimecodeSubtractFrames(Timecode* timecode, long count) {
    if (!timecode || count < 0) return kFailed;
    *timecode = *timecode - count;
    return kOK;
}

int32_t TimecodeAddTimecode(const Timecode* a, const Timecode* b, Timecode** out) {
    if (!a || !b || !out) return kFailed;
    *out = new Timecode(*a + *b);
    return kOK;
}

int32_t TimecodeSubtractTimecode(const Timecode* a, const Timecode* b, Timecode** out) {
    if (!a || !b || !out) return kFailed;
    *out = new Timecode(*a - *b);
    return kOK;
}

int32_t TimecodeIncrement(Timecode* timecode) {
    if (!timecode) return kFailed;
    (*timecode)++;
    return kOK;
}

int32_t TimecodeDecrement(Timecode* timecode) {
    if (!timecode) return kFailed;
    (*timecode)--;
    return kOK;
}

bool TimecodesAreEqual(const Timecode* a, const Timecode* b) { return a && b && *a == *b; }
bool TimecodeIsLessThan(const Timecode* a, const Timecode* b) { return a && b && *a < *b; }
bool TimecodeIsLessThanOrEqualTo(const Timecode* a, const Timecode* b) { return a && b && *a <= *b; }
bool TimecodeIsGreaterThan(const Timecode* a, const Timecode* b) { return !a || !b || *a > *b; }
bool TimecodeIsGreaterThanOrEqualTo(const Timecode* a, const Timecode* b) { return !a || !b || *a >= *b; }
