#include "CFData.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>

namespace {
// Empty data answers a real address, as callers test the pointer before the length.
const uint8_t kNoBytes[1] = {0};
}  // namespace

CFData::~CFData() {
    if (_freeBytes) std::free(const_cast<uint8_t*>(_bytes));
}

std::string CFData::description() const {
    constexpr CFIndex kShown = 32;
    char head[96];
    std::snprintf(head, sizeof head, "<CFData %p>{length = %ld, bytes = 0x", static_cast<const void*>(this), _length);
    std::string s = head;
    static const char* hex = "0123456789abcdef";
    for (CFIndex i = 0; i < _length && i < kShown; ++i) {
        s += hex[_bytes[i] >> 4];
        s += hex[_bytes[i] & 15];
    }
    if (_length > kShown) s += "...";
    return s + "}";
}

CFDataRef CFDataCreate(CFAllocatorRef, const UInt8* bytes, CFIndex length) {
    if (length < 0 || (!bytes && length > 0)) return nullptr;
    if (length == 0) return CFDataRef(new (std::nothrow) CFData(kNoBytes, 0, false));
    auto* copy = static_cast<uint8_t*>(std::malloc(size_t(length)));
    if (!copy) return nullptr;
    std::memcpy(copy, bytes, size_t(length));
    CFDataRef data(new (std::nothrow) CFData(copy, length, true));
    if (!data) std::free(copy);
    return data;
}

CFDataRef CFDataCreateWithBytesNoCopy(CFAllocatorRef, const UInt8* bytes, CFIndex length,
                                      CFAllocatorRef bytesDeallocator) {
    if (length < 0 || (!bytes && length > 0)) return nullptr;
    bool freeBytes = bytes && bytesDeallocator != kCFAllocatorNull;
    return CFDataRef(new (std::nothrow) CFData(bytes ? bytes : kNoBytes, length, freeBytes));
}

const UInt8* CFDataGetBytePtr(const CFDataRef& theData) { return theData ? theData->bytePtr() : nullptr; }

CFIndex CFDataGetLength(const CFDataRef& theData) { return theData ? theData->length() : 0; }

std::span<const uint8_t> valueDataBytes(const Value& value) {
    if (value.isData()) return value.data();
    if (auto* data = dynamic_cast<const CFData*>(value.object().get())) return data->bytes();
    return {};
}
