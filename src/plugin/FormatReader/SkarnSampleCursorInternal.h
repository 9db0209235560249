// Arithmetic shared by the cursor's sources. Tracks built from damaged clips
// may carry zero chunk sizes or frame durations: divisions by them answer 0
// rather than trapping, and a missing offset record reads as zeros, the way
// a message to nil answers.
#pragma once

#include "CMTime.h"
#include "mxfEssenseOffsets.h"

#include <cstdint>

namespace SkarnCursorDetail {

inline int64_t safeDivide(int64_t numerator, int64_t denominator) {
    if (denominator == 0) return 0;
    if (denominator == -1) return numerator == INT64_MIN ? INT64_MAX : -numerator;
    return numerator / denominator;
}

// duration x count, exactly; beyond 64 bits it is the infinity of its sign.
inline CMTime timeTimes(CMTime duration, int64_t count) {
    if (!CMTIME_IS_NUMERIC(duration)) return duration;
    int64_t value = 0;
    if (__builtin_mul_overflow(duration.value, count, &value))
        return (duration.value < 0) != (count < 0) ? kCMTimeNegativeInfinity : kCMTimePositiveInfinity;
    return CMTimeMake(value, duration.timescale);
}

inline uint32_t presentationOrderOf(const Ref<mxfEssenseOffsets>& record) {
    return record ? record->presentationOrder() : 0;
}
inline uint32_t decodeOrderOf(const Ref<mxfEssenseOffsets>& record) { return record ? record->decodeOrder() : 0; }
inline uint32_t presentationOrderOf(const mxfEssenseOffsets* record) { return record ? record->presentationOrder() : 0; }
inline uint32_t decodeOrderOf(const mxfEssenseOffsets* record) { return record ? record->decodeOrder() : 0; }

}  // namespace SkarnCursorDetail
