// Conversions shared by the timecode library. Its arithmetic truncates toward
// zero throughout; these make each conversion total, so that a hostile rate or
// count (from clip XML) saturates instead of invoking undefined behaviour.
#pragma once

#include <cstdint>
#include <limits>

namespace Tolvo::detail {

// Toward zero to 64 bits; NaN gives 0, out-of-range values saturate.
inline long truncLong(double x) {
    if (!(x == x)) return 0;
    if (x >= 9223372036854775807.0) return std::numeric_limits<long>::max();
    if (x <= -9223372036854775808.0) return std::numeric_limits<long>::min();
    return static_cast<long>(x);
}

// Toward zero to 32 bits, saturating.
inline int32_t truncInt(double x) {
    if (!(x == x)) return 0;
    if (x >= 2147483647.0) return std::numeric_limits<int32_t>::max();
    if (x <= -2147483648.0) return std::numeric_limits<int32_t>::min();
    return static_cast<int32_t>(x);
}

inline long clampLong(__int128 v) {
    if (v > std::numeric_limits<long>::max()) return std::numeric_limits<long>::max();
    if (v < std::numeric_limits<long>::min()) return std::numeric_limits<long>::min();
    return static_cast<long>(v);
}

inline long satAdd(long a, long b) { return clampLong(static_cast<__int128>(a) + b); }
inline long satSub(long a, long b) { return clampLong(static_cast<__int128>(a) - b); }
inline long satMul(long a, long b) { return clampLong(static_cast<__int128>(a) * b); }

// Drop-frame arithmetic only runs at exactly these two rates; 29.97 and 59.94
// are never treated as drop-frame even when the format says so.
inline bool isDropRate(double rate) { return rate == 30.0 || rate == 60.0; }

// Labels skipped per minute: 2 at 30, and 4 at every other rate, so that the
// 60-frame form skips twice as many (and odd rates get the 60-frame rule).
inline long dropLabelsPerMinute(long rate) { return rate == 30 ? 2 : 4; }

}  // namespace Tolvo::detail
