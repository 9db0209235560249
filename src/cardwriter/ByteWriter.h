// Big-endian byte appending for the card writer's MXF, DV and BMP output.
#pragma once

#include <array>
#include <cstdint>
#include <span>
#include <string>
#include <vector>

class ByteWriter {
public:
    std::vector<uint8_t>& bytes() { return _b; }
    const std::vector<uint8_t>& bytes() const { return _b; }
    size_t size() const { return _b.size(); }

    void u8(uint8_t v) { _b.push_back(v); }
    void u16(uint16_t v) { u8(uint8_t(v >> 8)); u8(uint8_t(v)); }
    void u32(uint32_t v) { u16(uint16_t(v >> 16)); u16(uint16_t(v)); }
    void u64(uint64_t v) { u32(uint32_t(v >> 32)); u32(uint32_t(v)); }
    void le16(uint16_t v) { u8(uint8_t(v)); u8(uint8_t(v >> 8)); }
    void le32(uint32_t v) { le16(uint16_t(v)); le16(uint16_t(v >> 16)); }
    void bytes(std::span<const uint8_t> s) { _b.insert(_b.end(), s.begin(), s.end()); }
    void bytes(const std::string& s) { _b.insert(_b.end(), s.begin(), s.end()); }
    void zeros(size_t n) { _b.insert(_b.end(), n, 0); }
    // Patches a 32-bit big-endian value written earlier.
    void patch32(size_t at, uint32_t v) {
        _b[at] = uint8_t(v >> 24); _b[at + 1] = uint8_t(v >> 16); _b[at + 2] = uint8_t(v >> 8); _b[at + 3] = uint8_t(v);
    }
    void patch64(size_t at, uint64_t v) { patch32(at, uint32_t(v >> 32)); patch32(at + 4, uint32_t(v)); }

private:
    std::vector<uint8_t> _b;
};

using MXFKey = std::array<uint8_t, 16>;
