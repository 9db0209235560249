// Arithmetic shared by the cursor's sources. Tracks built from damaged clips
// may carry zero chunk sizes or frame durations: divisions by them answer 0
// rather than trapping, and a missing offset record reads as zeros, the way
// a message to nil answers.
#pragma once

#include "CMTime.h"
#include "mxfEssenseOffsets.h"

#include <cstdint>

namespace SkarnCursorDetail {

// The source named in the cursors' hard assertions.
inline constexpr const char* kSource = "SkarnFormatReader";

inline int64_t safeDivide(int64_t numerator, int64_t denominator) {
    if (denominator == 0) return 0;
    if (denominator == -1) return numerator == INT64_MIN ? INT64_MAX : -numerator;
    return numerator / denominator;
}

// The chunk holding an audio time: sampleSize x time / chunkSize, with a time
// beyond the 64-bit range (or an infinite one) past every chunk.
inline int64_t audioChunkAt(CMTime time, int64_t sampleSize, int64_t chunkSize) {
    if (CMTIME_IS_POSITIVE_INFINITY(time)) return INT64_MAX;
    if (!CMTIME_IS_NUMERIC(time)) return -1;
    int64_t bytes = 0;
    if (__builtin_mul_overflow(sampleSize, time.value, &bytes)) return (time.value < 0) != (sampleSize < 0) ? -1 : INT64_MAX;
    return safeDivide(bytes, chunkSize);
}

// duration x count, exactly; beyond 64 bits it is the infinity of its sign.
inline CMTime timeTimes(CMTime duration, int64_t count) {
    if (!CMTIME_IS_NUMERIC(duration)) return duration;
    int64_t value = 0;
    if (__builtin_mul_overflow(duration.value, count, &value))
        return (duration.value < 0) != (count < 0) ? kCMTimeNegativeInfinity : kCMTimePositiveInfinity;
    return CMTimeMake(value, duration.timescale);
}

// Byte positions of a cursor left far past its track's end (an audio step
// leaves it wherever the step took it) do not fit in 64 bits: they stop at
// the limit of their sign, which lies past any file.
inline int64_t saturatingSum(int64_t a, int64_t b) {
    int64_t sum = 0;
    if (__builtin_add_overflow(a, b, &sum)) return a < 0 ? INT64_MIN : INT64_MAX;
    return sum;
}
inline int64_t saturatingProduct(int64_t a, int64_t b) {
    int64_t product = 0;
    if (__builtin_mul_overflow(a, b, &product)) return (a < 0) != (b < 0) ? INT64_MIN : INT64_MAX;
    return product;
}

inline uint32_t presentationOrderOf(const Ref<mxfEssenseOffsets>& record) {
    return record ? record->presentationOrder() : 0;
}
inline uint32_t decodeOrderOf(const Ref<mxfEssenseOffsets>& record) { return record ? record->decodeOrder() : 0; }
inline uint32_t presentationOrderOf(const mxfEssenseOffsets* record) { return record ? record->presentationOrder() : 0; }
inline uint32_t decodeOrderOf(const mxfEssenseOffsets* record) { return record ? record->decodeOrder() : 0; }

}  // namespace SkarnCursorDetail
