// The timecode value: a frame position at a native rate, optionally carried at
// an interpolation rate, shown as hours:minutes:seconds:frames in non-drop or
// drop-frame form or as a plain frame count.
#pragma once

#include "MediaTimeIndex.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

namespace Tolvo {

// The library's own numbering; the plain functions and the timecode object
// number drop-frame 1 and non-drop 2 and translate.
enum TimecodeFormat : int32_t {
    kTimecodeFormatNonDrop = 1,
    kTimecodeFormatDrop = 2,
    kTimecodeFormatFramecount = 3,
    kTimecodeFormatMarkedFrame = 4,
    kTimecodeFormatFromString = 65535,
};

enum InterpStyle : int32_t {
    kInterpStyleCeiling = 1,
    kInterpStyleFloor = 2,
    kInterpStyleWholeUp = 3,
    kInterpStyleWholeDown = 4,
};

// Operations answer 0, or all ones for a zero rate, an unknown style, a null
// string or an unparseable separator count.
using TimecodeStatus = uint32_t;
inline constexpr TimecodeStatus kTimecodeNoErr = 0;
inline constexpr TimecodeStatus kTimecodeErr = 0xFFFFFFFFu;

class Timecode : public MediaTimeIndex {
public:
    // An interpFramerate of 0 means the native rate.
    Timecode(long framecount, double framerate, double interpFramerate, long iOffset, TimecodeFormat format);
    Timecode(const Timecode&) = default;
    Timecode& operator=(const Timecode&) = default;
    ~Timecode() override;

    // Null for a zero framerate (and, for the string form, a null string).
    static std::unique_ptr<Timecode> TimecodeCreateWithFramecount(long framecount, long iOffset, double framerate,
                                                                  double interpFramerate, TimecodeFormat format);
    static std::unique_ptr<Timecode> TimecodeCreateWithTimeindex(long timeindex, long iOffset, double framerate,
                                                                 double interpFramerate, TimecodeFormat format);
    static std::unique_ptr<Timecode> TimecodeCreateWithParts(int hours, int minutes, int seconds, int frames,
                                                             long iOffset, double framerate, double interpFramerate,
                                                             TimecodeFormat format);
    static std::unique_ptr<Timecode> TimecodeCreateWithString(const char* string, TimecodeFormat format,
                                                              double framerate, double interpFramerate,
                                                              int* signOut);

    std::optional<std::string> toCFString(InterpStyle style) const;
    TimecodeStatus getTCParts(int& hours, int& minutes, int& seconds, int& frames, InterpStyle style) const;
    TimecodeStatus getFramecountAndRound(long& out, InterpStyle style, bool interp) const;
    TimecodeStatus getNativeFramecount(long& out, InterpStyle style) const;
    TimecodeStatus getInterpFramecount(long& out, InterpStyle style) const;
    TimecodeStatus getNativeFramecount(double& out, bool dropAdjust, bool rollover) const;
    TimecodeStatus getInterpFramecount(double& out, bool dropAdjust, bool rollover) const;
    TimecodeStatus setInterpFramerate(double rate, InterpStyle style);
    TimecodeStatus setTCFormat(TimecodeFormat newFormat, bool convert);
    TimecodeStatus interp(const char* string, TimecodeFormat format);

    TimecodeFormat getTCFormat() const { return format; }
    bool getIsFramecountFormat() const { return isFramecountFormat; }
    double getFramerate() const { return framerate; }
    double getInterpFramerate() const { return interpFramerate; }
    // framecount + iOffset at the native rate, as a double.
    double nativeValue() const;
    // nativeValue() in seconds (over 1.0 when the rate is 0).
    double seconds() const;

    static long tcPartsToFramecount(double framerate, long hours, long minutes, long seconds, long frames);
    static TimecodeStatus stringToFramecount(const char* string, long& out, double framerate,
                                             TimecodeFormat& format, int* signOut);
    // Drop-frame label count to real frames (in place).
    static void timeindexToDropFramecountWithRate(double* inout, long rate);
    // Real frames to drop-frame label count (in place).
    static void dropFramecountToTimeindexWithRate(double* inout, long rate);
    static TimecodeStatus tcStackToTC(int count, double framerate, int* stack, long& out, TimecodeFormat format);

    Timecode operator+(const Timecode& other) const;
    Timecode operator-(const Timecode& other) const;
    Timecode operator+(long frames) const;
    Timecode operator-(long frames) const;
    Timecode& operator++();
    Timecode& operator--();
    Timecode operator++(int);
    Timecode operator--(int);
    bool operator==(const Timecode& other) const;
    bool operator>(const Timecode& other) const;
    bool operator<(const Timecode& other) const;
    bool operator>=(const Timecode& other) const;
    bool operator<=(const Timecode& other) const;

    TimecodeFormat format;
    bool isFramecountFormat;

private:
    Timecode combine(const Timecode& other, int sign) const;
    Timecode addFrames(long frames, int sign) const;
};

}  // namespace Tolvo
