#include "SkarnLog.h"

#include "LogSink.h"

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <cctype>
#include <cstring>

namespace {
std::atomic<uint32_t> gMask{0xffffffffu};
}

void SkarnStartLogging() {
#if defined(SKARN_DIAGNOSTIC_LOG) && SKARN_DIAGNOSTIC_LOG
    const char* env = std::getenv("SKARN_LOG_MASK");
    if (env && *env) gMask = uint32_t(std::strtoul(env, nullptr, 0));
#endif
}

namespace SkarnLogDetail {

bool enabled(uint32_t mask) { return (mask & gMask.load(std::memory_order_relaxed)) != 0; }

void write(const std::string& line) { logLine(line); }

std::string format(const char* fmt, const std::vector<Arg>& args) {
    std::string out;
    if (!fmt) return out;
    size_t next = 0;
    auto nextArg = [&]() -> const Arg* { return next < args.size() ? &args[next++] : nullptr; };
    for (const char* p = fmt; *p; ++p) {
        if (*p != '%') {
            out += *p;
            continue;
        }
        if (p[1] == '%') {
            out += '%';
            ++p;
            continue;
        }
        if (p[1] == '@') {
            const Arg* a = nextArg();
            if (!a) out += "(null)";
            else if (auto s = std::get_if<std::string>(a)) out += *s;
            else if (auto i = std::get_if<int64_t>(a)) out += std::to_string(*i);
            else if (auto u = std::get_if<uint64_t>(a)) out += std::to_string(*u);
            else if (auto d = std::get_if<double>(a)) out += std::to_string(*d);
            else out += "(pointer)";
            ++p;
            continue;
        }
        // Collect "%[flags][width][.prec][length]conv".
        const char* start = p++;
        while (*p && std::strchr("-+ #0", *p)) ++p;
        while (*p && (std::isdigit(static_cast<unsigned char>(*p)) || *p == '.' || *p == '*')) ++p;
        while (*p && std::strchr("hlLqjzt", *p)) ++p;
        if (!*p) {
            out.append(start);
            break;
        }
        char conv = *p;
        std::string conversion(start, p);
        // Drop length modifiers; we supply the widest type ourselves.
        std::string clean;
        for (char c : conversion)
            if (!std::strchr("hlLqjzt", c)) clean += c;
        const Arg* a = nextArg();
        char buf[512];
        buf[0] = 0;
        if (!a) {
            out += "(missing)";
            continue;
        }
        switch (conv) {
        case 'd': case 'i': {
            int64_t v = std::holds_alternative<int64_t>(*a) ? std::get<int64_t>(*a)
                        : std::holds_alternative<uint64_t>(*a) ? int64_t(std::get<uint64_t>(*a))
                        : std::holds_alternative<double>(*a) ? int64_t(std::get<double>(*a)) : 0;
            std::snprintf(buf, sizeof buf, (clean + "lld").c_str(), (long long)v);
            break;
        }
        case 'u': case 'x': case 'X': case 'o': case 'c': {
            uint64_t v = std::holds_alternative<uint64_t>(*a) ? std::get<uint64_t>(*a)
                         : std::holds_alternative<int64_t>(*a) ? uint64_t(std::get<int64_t>(*a)) : 0;
            if (conv == 'c') std::snprintf(buf, sizeof buf, (clean + "c").c_str(), int(v));
            else std::snprintf(buf, sizeof buf, (clean + "ll" + conv).c_str(), (unsigned long long)v);
            break;
        }
        case 'f': case 'F': case 'e': case 'E': case 'g': case 'G': {
            double v = std::holds_alternative<double>(*a) ? std::get<double>(*a)
                       : std::holds_alternative<int64_t>(*a) ? double(std::get<int64_t>(*a))
                       : std::holds_alternative<uint64_t>(*a) ? double(std::get<uint64_t>(*a)) : 0.0;
            std::snprintf(buf, sizeof buf, (clean + conv).c_str(), v);
            break;
        }
        case 's': {
            const std::string* s = std::get_if<std::string>(a);
            std::snprintf(buf, sizeof buf, (clean + "s").c_str(), s ? s->c_str() : "(null)");
            break;
        }
        case 'p': {
            const void* v = std::holds_alternative<const void*>(*a) ? std::get<const void*>(*a) : nullptr;
            std::snprintf(buf, sizeof buf, "%p", v);
            break;
        }
        default:
            out.append(start, p + 1);
            continue;
        }
        out += buf;
    }
    return out;
}

}  // namespace SkarnLogDetail
