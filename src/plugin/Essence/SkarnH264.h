// H.264 access units from byte-stream form (start codes) to the length-prefixed
// form CoreMedia wants, in place.
#pragma once

#include <cstdint>
#include <span>

inline constexpr uint32_t kSkarnH264MaxParameterSets = 8;

// Rewrites every four-byte start code 00 00 00 01 of the access unit into the
// big-endian length of the NAL unit behind it, in one forward pass without
// copying, and notes where the sequence and picture parameter sets (NAL types 7
// and 8) lie. The caller zeroes the arrays and the count first.
//
// Kept as the camera files need it, odd or not:
// - only four-byte start codes count; 00 00 01 stays inside its unit;
// - a start code in the last four bytes is not seen (the scan ends at L - 5);
// - the buffer is taken to begin with a start code: its first four bytes always
//   become a length;
// - a parameter set gets its size only when another start code follows it, so a
//   parameter set that ends the buffer is pointed to but not counted;
// - at most eight parameter sets are noted; later ones are neither pointed to
//   nor sized. Pointers point into data and live as long as it does.
// Buffers shorter than four bytes are left alone. Answers 0.
int32_t SkarnH264ReplaceStartCodesWithLengthCodes(uint8_t* data, int64_t length,
                                                  std::span<const uint8_t*, kSkarnH264MaxParameterSets> parameterSets,
                                                  std::span<uint64_t, kSkarnH264MaxParameterSets> parameterSetSizes,
                                                  uint32_t* parameterSetCount);
