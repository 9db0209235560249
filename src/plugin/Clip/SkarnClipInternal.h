// Private to SkarnClip's sources: the construction memo and the text-to-number
// readings the format, timing and metadata files all make of clip XML fields.
// Only the SkarnClip*.cpp files include it.
#pragma once

#include "SkarnClip.h"

#include "FileSystem.h"
#include "Value.h"

#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstdint>
#include <limits>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

struct SkarnClip::ConstructionMemo {
    // Keyed by the address of the XPath literal: the few dozen paths a clip
    // reads are all literals, and comparing addresses costs less than hashing
    // the paths would save. Two spellings of one path at different addresses
    // only cost a second evaluation.
    std::vector<std::pair<const char*, std::optional<std::string>>> texts;
    std::optional<std::optional<std::string>> videoFilePath;
};

namespace SkarnClipInternal {

using FileSystem::caseInsensitiveEqual;
using FileSystem::hasPrefix;
using FileSystem::hasSuffix;

// The platform's doubleValue of a text: a leading decimal number, 0 when there
// is none. Spellings the platform does not read as numbers (inf, nan, hex) and
// values too large for a double count as none.
inline double numberValue(std::string_view s) {
    size_t i = 0;
    while (i < s.size() && std::isspace(static_cast<unsigned char>(s[i]))) ++i;
    size_t j = i;
    if (j < s.size() && (s[j] == '+' || s[j] == '-')) ++j;
    if (j >= s.size() || !(std::isdigit(static_cast<unsigned char>(s[j])) || s[j] == '.')) return 0.0;
    if (s[j] == '0' && j + 1 < s.size() && (s[j + 1] == 'x' || s[j + 1] == 'X')) return 0.0;
    double d = stringDoubleValue(s.substr(i));
    return std::isfinite(d) ? d : 0.0;
}
inline double numberValueOrZero(const std::optional<std::string>& s) { return s ? numberValue(*s) : 0.0; }

// The platform's intValue: 32-bit, clamped.
inline int32_t intValue(std::string_view s) {
    int64_t v = stringIntegerValue(s);
    return int32_t(std::clamp<int64_t>(v, std::numeric_limits<int32_t>::min(), std::numeric_limits<int32_t>::max()));
}
inline int32_t intValueOrZero(const std::optional<std::string>& s) { return s ? intValue(*s) : 0; }

// A double as a 64-bit integer, truncated and saturated (NaN is 0).
inline int64_t saturatingInt64(double d) {
    if (std::isnan(d)) return 0;
    if (d >= 9.2e18) return std::numeric_limits<int64_t>::max();
    if (d <= -9.2e18) return std::numeric_limits<int64_t>::min();
    return int64_t(d);
}

inline std::vector<std::string> split(const std::string& s, char sep) {
    std::vector<std::string> parts;
    size_t start = 0;
    for (;;) {
        size_t at = s.find(sep, start);
        parts.push_back(s.substr(start, at == std::string::npos ? std::string::npos : at - start));
        if (at == std::string::npos) break;
        start = at + 1;
    }
    return parts;
}

inline bool ciEquals(const std::optional<std::string>& s, const char* what) {
    return s && caseInsensitiveEqual(*s, what);
}

}  // namespace SkarnClipInternal
