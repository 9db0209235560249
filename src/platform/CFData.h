// Immutable byte buffers with an identity, as property lists and keepers hold them.
//
// Value already carries bytes by value; CFData is for bytes that must stay at
// one address while several owners share them (a stream description or buffer
// list handed to the host by pointer and kept alive by whoever retains the data
// object). CFDataCreateWithBytesNoCopy adopts malloc'd memory without copying.
#pragma once

#include "CFBase.h"
#include "Object.h"
#include "Value.h"

#include <span>

class CFData : public Object {
public:
    ~CFData() override;
    // "<CFData 0x...>{length = 3, bytes = 0x010203}", long contents elided.
    std::string description() const override;

    const uint8_t* bytePtr() const { return _bytes; }
    CFIndex length() const { return _length; }
    std::span<const uint8_t> bytes() const { return {_bytes, size_t(_length)}; }

private:
    CFData(const uint8_t* bytes, CFIndex length, bool freeBytes) : _bytes(bytes), _length(length), _freeBytes(freeBytes) {}
    friend Ref<CFData> CFDataCreate(CFAllocatorRef, const UInt8*, CFIndex);
    friend Ref<CFData> CFDataCreateWithBytesNoCopy(CFAllocatorRef, const UInt8*, CFIndex, CFAllocatorRef);

    const uint8_t* _bytes;
    CFIndex _length;
    bool _freeBytes;
};

using CFDataRef = Ref<CFData>;

// A copy of length bytes; null when length is negative, bytes is null with a
// non-zero length, or memory runs out.
CFDataRef CFDataCreate(CFAllocatorRef allocator, const UInt8* bytes, CFIndex length);
// Takes over bytes without copying. They are freed with free() when the data
// goes, unless bytesDeallocator is kCFAllocatorNull. On failure (null answer)
// the caller still owns them.
CFDataRef CFDataCreateWithBytesNoCopy(CFAllocatorRef allocator, const UInt8* bytes, CFIndex length,
                                      CFAllocatorRef bytesDeallocator);
// nullptr for a null data object; a valid pointer for empty data.
const UInt8* CFDataGetBytePtr(const CFDataRef& theData);
CFIndex CFDataGetLength(const CFDataRef& theData);

// The bytes of a property-list value that holds data inline (Value::Data) or
// as a CFData object; empty for anything else. Valid while the value lives.
std::span<const uint8_t> valueDataBytes(const Value& value);
