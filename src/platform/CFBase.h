// The scalar types and allocator names every CoreFoundation- and CoreMedia-style
// header of the platform layer shares.
//
// Code ported from the macOS frameworks keeps spelling UInt32, OSStatus and
// CFIndex; defining them once here keeps those spellings one type each.
// Allocators are named, not implemented: the default and malloc allocators use
// malloc/free, kCFAllocatorNull means "never free this memory".
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

using UInt8 = uint8_t;
using SInt8 = int8_t;
using UInt16 = uint16_t;
using SInt16 = int16_t;
using UInt32 = uint32_t;
using SInt32 = int32_t;
using UInt64 = uint64_t;
using SInt64 = int64_t;
using Float32 = float;
using Float64 = double;
using OSStatus = int32_t;
using FourCharCode = uint32_t;
using Boolean = bool;
using CFIndex = long;
// Counts and indexes of samples and queued buffers.
using CMItemCount = CFIndex;
using CMItemIndex = CFIndex;

static_assert(sizeof(Float32) == 4 && sizeof(Float64) == 8);

inline constexpr OSStatus noErr = 0;

// The code 'abcd' as the frameworks pack it: the first character in the high
// byte. (Multi-character literals are implementation-defined in C++.)
constexpr FourCharCode FourCC(const char (&s)[5]) {
    return FourCharCode(uint8_t(s[0])) << 24 | FourCharCode(uint8_t(s[1])) << 16 | FourCharCode(uint8_t(s[2])) << 8 |
           FourCharCode(uint8_t(s[3]));
}
// "'avc1'" for printable codes, "0x00000001" otherwise; for logs and descriptions.
std::string FourCCDescription(FourCharCode code);

using CFComparisonResult = CFIndex;
enum : CFComparisonResult {
    kCFCompareLessThan = -1,
    kCFCompareEqualTo = 0,
    kCFCompareGreaterThan = 1,
};

struct CFAllocatorOpaque;
using CFAllocatorRef = const CFAllocatorOpaque*;
inline constexpr CFAllocatorRef kCFAllocatorDefault = nullptr;
extern const CFAllocatorRef kCFAllocatorMalloc;
extern const CFAllocatorRef kCFAllocatorNull;
