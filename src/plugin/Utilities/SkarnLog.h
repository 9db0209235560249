// The plug-in's one diagnostic call.
//
// SkarnLog(mask, format, args...) takes a category mask, a format with "%@"
// (an object's description) and printf placeholders, and its values. In the
// default build it is compiled out: nothing is formatted or written and the
// arguments are not evaluated (they are still type-checked). Built with
// SKARN_DIAGNOSTIC_LOG=ON it writes to the log sink (stderr) when the mask
// shares a bit with SKARN_LOG_MASK (decimal or 0x hex; unset means all).
#pragma once

#include "Object.h"
#include "Value.h"

#include <cstdint>
#include <optional>
#include <string>
#include <type_traits>
#include <variant>
#include <vector>

// Called once by the factory before anything else.
void SkarnStartLogging();

namespace SkarnLogDetail {

using Arg = std::variant<int64_t, uint64_t, double, std::string, const void*>;

inline Arg toArg(const std::string& s) { return s; }
inline Arg toArg(const char* s) { return std::string(s ? s : "(null)"); }
inline Arg toArg(const std::optional<std::string>& s) { return s ? *s : std::string("(null)"); }
inline Arg toArg(const Object* o) { return describe(o); }
template <class T>
Arg toArg(const Ref<T>& r) { return describe(r); }
inline Arg toArg(const Value& v) { return v.description(); }
template <class T>
Arg toArg(T v) requires std::is_arithmetic_v<T> || std::is_enum_v<T> {
    if constexpr (std::is_floating_point_v<T>) return double(v);
    else if constexpr (std::is_enum_v<T>) return int64_t(v);
    else if constexpr (std::is_signed_v<T>) return int64_t(v);
    else return uint64_t(v);
}
template <class T>
Arg toArg(T* p) requires(!std::is_base_of_v<Object, T> && !std::is_same_v<std::remove_cv_t<T>, char>) {
    return static_cast<const void*>(p);
}
template <class T>
Arg toArg(T* p) requires std::is_base_of_v<Object, T> { return describe(static_cast<const Object*>(p)); }

// Formats with "%@" and the printf conversions d i u x X o c s f e g p (with
// flags, width, precision and length modifiers, which are ignored for size).
std::string format(const char* fmt, const std::vector<Arg>& args);
bool enabled(uint32_t mask);
void write(const std::string& line);

template <class... A>
void log(uint32_t mask, const char* fmt, const A&... args) {
    if (!enabled(mask)) return;
    write(format(fmt, std::vector<Arg>{toArg(args)...}));
}

}  // namespace SkarnLogDetail

// The formatted text of a log call, always available (for tests and messages).
template <class... A>
std::string SkarnLogFormat(const char* fmt, const A&... args) {
    return SkarnLogDetail::format(fmt, std::vector<SkarnLogDetail::Arg>{SkarnLogDetail::toArg(args)...});
}

#if defined(SKARN_DIAGNOSTIC_LOG) && SKARN_DIAGNOSTIC_LOG
#define SkarnLog(mask, ...) ::SkarnLogDetail::log(uint32_t(mask), __VA_ARGS__)
#else
#define SkarnLog(mask, ...)                                                  \
    do {                                                                     \
        if constexpr (false) ::SkarnLogDetail::log(uint32_t(mask), __VA_ARGS__); \
    } while (0)
#endif
