// The plain timecode interface: thin, null-safe calls over Tolvo::Timecode.
//
// Formats here use the public numbering (1 drop-frame, 2 non-drop, 3 frame
// count, 4 marked frames), translated to the library's own; any other public
// value becomes library format 8, which no operation recognises. Styles are
// Tolvo::InterpStyle values. A null timecode makes a call do nothing (status
// -1) unless noted. Creators return a new timecode that the caller releases
// with TimecodeDestroy, and also store it through the out pointer when one is
// given.
#pragma once

#include "Timecode.h"

#include <cstdint>
#include <optional>
#include <string>

namespace TimecodeFormatNumbers {
// Public to library: 1 -> 2, 2 -> 1, 3 -> 3, 4 -> 4, anything else -> 8.
Tolvo::TimecodeFormat libraryFormat(int32_t publicFormat);
// Library to public; false (output untouched) for an unknown library value.
bool publicFormat(Tolvo::TimecodeFormat libraryFormat, int32_t& out);
}  // namespace TimecodeFormatNumbers

Tolvo::Timecode* TimecodeCreateWithFramecount(long framecount, long iOffset, int32_t format, Tolvo::Timecode** out,
                                              double framerate, double interpFramerate);
Tolvo::Timecode* TimecodeCreateWithTimeIndex(long timeindex, long iOffset, int32_t format, Tolvo::Timecode** out,
                                             double framerate, double interpFramerate);
Tolvo::Timecode* TimecodeCreateWithParts(int hours, int minutes, int seconds, int frames, long iOffset,
                                         int32_t format, Tolvo::Timecode** out, double framerate,
                                         double interpFramerate);
Tolvo::Timecode* TimecodeCreateWithString(const char* string, int32_t format, int* signOut, Tolvo::Timecode** out,
                                          double framerate, double interpFramerate);
void TimecodeDestroy(Tolvo::Timecode* timecode);
int32_t TimecodeCopy(const Tolvo::Timecode* timecode, Tolvo::Timecode** out);

int32_t TimecodeGetTCFormat(const Tolvo::Timecode* timecode, int32_t* outFormat);
int32_t TimecodeSetTCFormat(Tolvo::Timecode* timecode, int32_t format, bool convert);
// The caller owns the string (nullopt when the text cannot be made).
int32_t TimecodeGetCFStringRepresentation(const Tolvo::Timecode* timecode, int32_t style,
                                          std::optional<std::string>* out);
// Each out pointer may be null; all four are set to 0 when the parts fail.
int32_t TimecodeGetTCParts(const Tolvo::Timecode* timecode, int* hours, int* minutes, int* seconds, int* frames,
                           int32_t style);
int32_t TimecodeGetFramerate(const Tolvo::Timecode* timecode, double* out);
int32_t TimecodeGetInterpFramerate(const Tolvo::Timecode* timecode, double* out);
int32_t TimecodeGetNativeFramecount(const Tolvo::Timecode* timecode, bool dropAdjust, bool rollover, double* out);
int32_t TimecodeGetInterpFramecount(const Tolvo::Timecode* timecode, bool dropAdjust, bool rollover, double* out);
int32_t TimecodeGetNativeFramecountWithInterpStyle(const Tolvo::Timecode* timecode, int32_t style, long* out);
int32_t TimecodeGetInterpFramecountWithInterpStyle(const Tolvo::Timecode* timecode, int32_t style, long* out);
int32_t TimecodeSetInterpFramerate(Tolvo::Timecode* timecode, int32_t style, double rate);
// A null timecode reads as true.
bool TimecodeGetUseInterpRate(const Tolvo::Timecode* timecode);
int32_t TimecodeSetUseInterpRate(Tolvo::Timecode* timecode, bool use);
int32_t TimecodeInterpolate(Tolvo::Timecode* timecode, const char* string, int32_t format);
// In place; a negative count does nothing.
int32_t TimecodeAddFrames(Tolvo::Timecode* timecode, long count);
int32_t TimecodeSubtractFrames(Tolvo::Timecode* timecode, long count);
// New a + b / a - b through out.
int32_t TimecodeAddTimecode(const Tolvo::Timecode* a, const Tolvo::Timecode* b, Tolvo::Timecode** out);
int32_t TimecodeSubtractTimecode(const Tolvo::Timecode* a, const Tolvo::Timecode* b, Tolvo::Timecode** out);
int32_t TimecodeIncrement(Tolvo::Timecode* timecode);
int32_t TimecodeDecrement(Tolvo::Timecode* timecode);

// False when either is null.
bool TimecodesAreEqual(const Tolvo::Timecode* a, const Tolvo::Timecode* b);
bool TimecodeIsLessThan(const Tolvo::Timecode* a, const Tolvo::Timecode* b);
bool TimecodeIsLessThanOrEqualTo(const Tolvo::Timecode* a, const Tolvo::Timecode* b);
// True when either is null: deliberately unlike the three above, kept as these
// calls have always answered.
bool TimecodeIsGreaterThan(const Tolvo::Timecode* a, const Tolvo::Timecode* b);
bool TimecodeIsGreaterThanOrEqualTo(const Tolvo::Timecode* a, const Tolvo::Timecode* b);
