// Bounds-checked big-endian reading over a span of bytes.
//
// All binary parsing (MXF KLV, DV packs, card checks) goes through this. A read
// past the end answers 0 and sets a sticky failure flag, so a parser can read a
// whole structure and check ok() once; nothing is ever read outside the span.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <optional>
#include <span>

inline uint16_t loadBE16(const uint8_t* p) { return uint16_t(p[0] << 8 | p[1]); }
inline uint32_t loadBE32(const uint8_t* p) {
    return uint32_t(p[0]) << 24 | uint32_t(p[1]) << 16 | uint32_t(p[2]) << 8 | uint32_t(p[3]);
}
inline uint64_t loadBE64(const uint8_t* p) { return uint64_t(loadBE32(p)) << 32 | loadBE32(p + 4); }
inline void storeBE16(uint8_t* p, uint16_t v) { p[0] = uint8_t(v >> 8); p[1] = uint8_t(v); }
inline void storeBE32(uint8_t* p, uint32_t v) {
    p[0] = uint8_t(v >> 24); p[1] = uint8_t(v >> 16); p[2] = uint8_t(v >> 8); p[3] = uint8_t(v);
}
inline void storeBE64(uint8_t* p, uint64_t v) { storeBE32(p, uint32_t(v >> 32)); storeBE32(p + 4, uint32_t(v)); }

class ByteReader {
public:
    ByteReader() = default;
    explicit ByteReader(std::span<const uint8_t> bytes) : _bytes(bytes) {}
    ByteReader(const uint8_t* data, size_t size) : _bytes(data, size) {}

    size_t size() const { return _bytes.size(); }
    size_t position() const { return _pos; }
    size_t remaining() const { return _pos <= _bytes.size() ? _bytes.size() - _pos : 0; }
    bool ok() const { return !_failed; }
    bool atEnd() const { return remaining() == 0; }
    std::span<const uint8_t> bytes() const { return _bytes; }

    // Moves to an absolute position; past the end fails.
    bool seek(size_t pos) {
        if (pos > _bytes.size()) return fail();
        _pos = pos;
        return true;
    }
    bool skip(size_t n) {
        if (n > remaining()) return fail();
        _pos += n;
        return true;
    }
    bool has(size_t n) const { return n <= remaining(); }

    uint8_t u8() {
        if (!has(1)) return fail(), 0;
        return _bytes[_pos++];
    }
    uint16_t u16() {
        if (!has(2)) return fail(), 0;
        uint16_t v = loadBE16(_bytes.data() + _pos);
        _pos += 2;
        return v;
    }
    uint32_t u32() {
        if (!has(4)) return fail(), 0;
        uint32_t v = loadBE32(_bytes.data() + _pos);
        _pos += 4;
        return v;
    }
    uint64_t u64() {
        if (!has(8)) return fail(), 0;
        uint64_t v = loadBE64(_bytes.data() + _pos);
        _pos += 8;
        return v;
    }
    int32_t i32() { return int32_t(u32()); }
    int64_t i64() { return int64_t(u64()); }
    // An unsigned big-endian number of n (0..8) bytes.
    uint64_t uN(size_t n) {
        if (n > 8 || !has(n)) return fail(), 0;
        uint64_t v = 0;
        for (size_t i = 0; i < n; ++i) v = v << 8 | _bytes[_pos + i];
        _pos += n;
        return v;
    }
    // A view of the next n bytes, empty (and failed) when they are not all there.
    std::span<const uint8_t> take(size_t n) {
        if (!has(n)) return fail(), std::span<const uint8_t>();
        auto s = _bytes.subspan(_pos, n);
        _pos += n;
        return s;
    }
    bool copy(void* out, size_t n) {
        if (!has(n)) return fail();
        std::memcpy(out, _bytes.data() + _pos, n);
        _pos += n;
        return true;
    }

    // Reads without moving (nullopt when not all there; does not set failure).
    std::optional<uint8_t> peekU8(size_t at) const {
        if (at >= _bytes.size()) return std::nullopt;
        return _bytes[at];
    }

private:
    bool fail() {
        _failed = true;
        return false;
    }
    std::span<const uint8_t> _bytes;
    size_t _pos = 0;
    bool _failed = false;
};
