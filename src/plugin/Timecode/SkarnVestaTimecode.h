// The timecode object handed to the host as a clip's start timecode and
// duration: owns one Tolvo::Timecode, archives to a property-list dictionary,
// copies and compares. Formats are the public numbering (1 drop-frame, 2
// non-drop, 3 frame count, 4 marked frames); styles are Tolvo::InterpStyle
// values.
#pragma once

#include "CMTime.h"
#include "Object.h"
#include "Timecode.h"
#include "Value.h"

#include <cstdint>
#include <optional>
#include <string>

class SkarnVestaTimecode : public Object {
public:
    ~SkarnVestaTimecode() override;

    // Takes ownership of timecode; nil for a null pointer.
    static Ref<SkarnVestaTimecode> initWithTimecode(Tolvo::Timecode* timecode, bool useInterpRate);
    // Each nil when the timecode cannot be made (zero rate, nil string).
    static Ref<SkarnVestaTimecode> timecodeWithFramecount(int64_t framecount, double framerate, double iFramerate,
                                                          int64_t interpOffset, int32_t format);
    static Ref<SkarnVestaTimecode> timecodeWithTimeIndex(int64_t timeIndex, double framerate, double iFramerate,
                                                         int64_t interpOffset, int32_t format);
    static Ref<SkarnVestaTimecode> timecodeWithHours(int hours, int mins, int secs, int frames, double framerate,
                                                     double iFramerate, int64_t interpOffset, int32_t format);
    static Ref<SkarnVestaTimecode> timecodeWithString(const std::optional<std::string>& string, double framerate,
                                                      double iFramerate, int32_t format);
    // A copy keeping the other's interpolation flag; nil for nil.
    static Ref<SkarnVestaTimecode> timecodeWithTimecode(const SkarnVestaTimecode* other);
    // The time is converted to the frame duration's timescale (QuickTime
    // rounding) and counted in whole frame durations; rates and format come
    // from the two durations. Nil for an unknown frame duration.
    static Ref<SkarnVestaTimecode> timecodeWithCMTime(CMTime time, CMTime frameDuration, CMTime interpFrameDuration,
                                                      bool drop);
    // a + b, and second - first; the result takes the first argument's flag.
    static Ref<SkarnVestaTimecode> timecodeByAdding(const SkarnVestaTimecode* a, const SkarnVestaTimecode* b);
    static Ref<SkarnVestaTimecode> timecodeBySubtracting(const SkarnVestaTimecode* first,
                                                         const SkarnVestaTimecode* second);

    // The owned value (may be null after an unreadable archive). Replaced, and
    // so invalidated, by the in-place add and subtract operations.
    Tolvo::Timecode* timecode() const { return _timecode; }
    // frameDuration x the native frame count (no drop adjustment, no rollover).
    CMTime time() const;
    // By whole rate: 24, 30 and 60 stand for the 1000/1001 rates.
    CMTime frameDuration() const;
    int32_t format() const;
    // No conversion of the count.
    void setFormat(int32_t format);
    // Four numbers: hours, minutes, seconds, frames.
    Array partsWithStyle(int32_t style) const;
    int32_t hour() const;
    double framerate() const;
    double interpFramerate() const;
    bool useInterpRate() const;
    void setUseInterpRate(bool use);
    std::optional<std::string> stringValue() const;
    // "<string value> (<rate>/<interpolation rate>)".
    std::string description() const override;

    double nativeFramecountWithDropAdjust(bool dropAdjust, bool rollover) const;
    double interpFramecountWithDropAdjust(bool dropAdjust, bool rollover) const;
    int64_t nativeFramecountWithInterpStyle(int32_t style) const;
    int64_t interpFramecountWithInterpStyle(int32_t style) const;
    void setInterpFramerate(double rate, int32_t style);
    void interpolate(const std::optional<std::string>& string, int32_t format);

    // add:to: (a + b) and subtract:from: (b - a) replace the receiver's value.
    void add(const SkarnVestaTimecode* a, const SkarnVestaTimecode* b);
    void subtract(const SkarnVestaTimecode* a, const SkarnVestaTimecode* b);
    // self + other, self - other.
    void add(const SkarnVestaTimecode* other);
    void subtract(const SkarnVestaTimecode* other);
    SkarnVestaTimecode* addFrames(int64_t count);
    SkarnVestaTimecode* subtractFrames(int64_t count);
    void increment();
    void decrement();

    bool isEqualToTimecode(const SkarnVestaTimecode* other) const;
    bool isGreaterThanTimecode(const SkarnVestaTimecode* other) const;
    bool isLessThanTimecode(const SkarnVestaTimecode* other) const;
    bool isGreaterThanOrEqualToTimecode(const SkarnVestaTimecode* other) const;
    bool isLessThanOrEqualToTimecode(const SkarnVestaTimecode* other) const;
    // -1 when other is greater, 1 when it is less, else 0.
    int32_t compare(const SkarnVestaTimecode* other) const;
    bool isEvenFrame() const;

    // Archive keys "format" (public numbering), "framerate", "framecount" (the
    // native count with drop adjustment and rollover), "useInterpRate".
    void encodeWithCoder(Dictionary& coder) const;
    // Restores trunc(framecount) at the stored rate and format; nil when no
    // timecode can be made from it.
    static Ref<SkarnVestaTimecode> initWithCoder(const Dictionary& coder);
    Ref<SkarnVestaTimecode> copyWithZone(void* zone = nullptr) const;
    Ref<SkarnVestaTimecode> copy() const { return copyWithZone(nullptr); }

private:
    explicit SkarnVestaTimecode(Tolvo::Timecode* timecode) : _timecode(timecode) {}
    void replaceTimecode(Tolvo::Timecode* replacement);

    Tolvo::Timecode* _timecode = nullptr;
};
