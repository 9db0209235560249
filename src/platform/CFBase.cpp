#include "CFBase.h"

#include <cstdio>

namespace {
const char mallocAllocatorTag = 0;
const char nullAllocatorTag = 0;
}  // namespace

const CFAllocatorRef kCFAllocatorMalloc = reinterpret_cast<CFAllocatorRef>(&mallocAllocatorTag);
const CFAllocatorRef kCFAllocatorNull = reinterpret_cast<CFAllocatorRef>(&nullAllocatorTag);

std::string FourCCDescription(FourCharCode code) {
    char chars[4] = {char(code >> 24), char(code >> 16), char(code >> 8), char(code)};
    bool printable = true;
    for (char c : chars) printable = printable && c >= 0x20 && c < 0x7f;
    if (printable) return "'" + std::string(chars, 4) + "'";
    char buf[16];
    std::snprintf(buf, sizeof buf, "0x%08x", code);
    return buf;
}
