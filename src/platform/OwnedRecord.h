// Zero-filled heap records that remember their size.
//
// The DV element decoders were written against handle-style pointer calls
// (allocate cleared, ask the size, resize, dispose). OwnedRecord keeps those
// operations under their old names but owns its memory, so a record can neither
// leak nor be written past its end.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

class OwnedRecord {
public:
    OwnedRecord() noexcept = default;
    ~OwnedRecord() { disposePtr(); }
    OwnedRecord(const OwnedRecord&) = delete;
    OwnedRecord& operator=(const OwnedRecord&) = delete;
    OwnedRecord(OwnedRecord&& o) noexcept;
    OwnedRecord& operator=(OwnedRecord&& o) noexcept;

    // A zero-filled record of size bytes; an empty (nil) record when the memory
    // cannot be had or size is 0.
    static OwnedRecord newPtrClear(size_t size);

    // Resizes in place or by moving; new bytes are zero. False (record unchanged)
    // when the memory cannot be had. Size 0 disposes of the record.
    bool setPtrSize(size_t size);
    size_t getPtrSize() const { return _size; }
    void disposePtr();

    uint8_t* data() { return _p; }
    const uint8_t* data() const { return _p; }
    std::span<uint8_t> bytes() { return {_p, _size}; }
    std::span<const uint8_t> bytes() const { return {_p, _size}; }
    explicit operator bool() const { return _p != nullptr; }

private:
    uint8_t* _p = nullptr;
    size_t _size = 0;
};
