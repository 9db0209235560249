#include "H264Sample.h"

#include "ByteReader.h"

#include <cstring>

namespace {

constexpr uint8_t kTypeSPS = 7, kTypePPS = 8;

// Exp-Golomb reading over a parameter set's payload, emulation-prevention
// bytes removed. Reads past the end fail and answer 0.
class BitReader {
public:
    explicit BitReader(std::span<const uint8_t> nal) {
        // Only the first bytes of a parameter set are ever needed.
        size_t zeros = 0;
        for (size_t i = 1; i < nal.size() && _rbsp.size() < 64; ++i) {
            if (zeros >= 2 && nal[i] == 3) {
                zeros = 0;
                continue;
            }
            zeros = nal[i] == 0 ? zeros + 1 : 0;
            _rbsp.push_back(nal[i]);
        }
    }
    unsigned bit() {
        if (_bit >= _rbsp.size() * 8) {
            _failed = true;
            return 0;
        }
        unsigned b = (_rbsp[_bit / 8] >> (7 - _bit % 8)) & 1;
        ++_bit;
        return b;
    }
    uint32_t bits(unsigned n) {
        uint32_t v = 0;
        while (n--) v = v << 1 | bit();
        return v;
    }
    uint32_t ue() {
        unsigned zeros = 0;
        while (!bit()) {
            if (_failed || ++zeros > 31) {
                _failed = true;
                return 0;
            }
        }
        return (uint32_t(1) << zeros) - 1 + bits(zeros);
    }
    bool ok() const { return !_failed; }

private:
    std::vector<uint8_t> _rbsp;
    size_t _bit = 0;
    bool _failed = false;
};

bool isStartCode(std::span<const uint8_t> s, size_t i) {
    return i + 3 <= s.size() && s[i] == 0 && s[i + 1] == 0 && s[i + 2] == 1;
}

void appendBE16(std::vector<uint8_t>& out, size_t v) {
    out.push_back(uint8_t(v >> 8));
    out.push_back(uint8_t(v));
}

}  // namespace

std::optional<std::vector<H264Sample::Unit>> H264Sample::unitsWithStartCodes(std::span<const uint8_t> sample) {
    const size_t n = sample.size();
    size_t i = 0;
    while (i < n && sample[i] == 0 && !isStartCode(sample, i)) ++i;
    if (!isStartCode(sample, i)) return std::nullopt;
    std::vector<Unit> units;
    size_t start = i + 3;
    for (;;) {
        // A unit ends where 00 00 00 or 00 00 01 begins.
        size_t end = n;
        for (size_t j = start; j + 3 <= n; ++j) {
            if (sample[j] == 0 && sample[j + 1] == 0 && sample[j + 2] <= 1) {
                end = j;
                break;
            }
        }
        if (end > start) units.push_back({start, end - start});
        if (end == n) break;
        // Only zero bytes may stand before the next start code.
        size_t k = end;
        while (k < n && !isStartCode(sample, k)) {
            if (sample[k] != 0) return std::nullopt;
            ++k;
        }
        if (k >= n) break;
        start = k + 3;
    }
    if (units.empty()) return std::nullopt;
    return units;
}

std::optional<std::vector<H264Sample::Unit>> H264Sample::unitsWithLengths(std::span<const uint8_t> sample,
                                                                          unsigned lengthSize) {
    if (lengthSize != 1 && lengthSize != 2 && lengthSize != 4) return std::nullopt;
    ByteReader r(sample);
    std::vector<Unit> units;
    while (!r.atEnd()) {
        uint64_t n = r.uN(lengthSize);
        if (!r.ok() || n == 0 || n > r.remaining()) return std::nullopt;
        units.push_back({r.position(), size_t(n)});
        r.skip(size_t(n));
    }
    if (units.empty()) return std::nullopt;
    return units;
}

size_t H264Sample::lengthPrefixedSize(const std::vector<Unit>& units) {
    size_t total = 0;
    for (const Unit& u : units) total += 4 + u.size;
    return total;
}

void H264Sample::writeLengthPrefixed(std::span<const uint8_t> sample, const std::vector<Unit>& units, uint8_t* out) {
    for (const Unit& u : units) {
        storeBE32(out, uint32_t(u.size));
        std::memcpy(out + 4, sample.data() + u.offset, u.size);
        out += 4 + u.size;
    }
}

bool H264Sample::replaceStartCodesInPlace(std::span<uint8_t> sample, const std::vector<Unit>& units) {
    size_t expected = 0;
    for (const Unit& u : units) {
        if (u.offset != expected + 4 || u.offset + u.size > sample.size() || u.size > UINT32_MAX) return false;
        if (sample[expected] != 0) return false;  // the zero byte of a four-byte start code
        expected = u.offset + u.size;
    }
    if (expected != sample.size()) return false;
    for (const Unit& u : units) storeBE32(sample.data() + u.offset - 4, uint32_t(u.size));
    return true;
}

uint8_t H264Sample::unitType(std::span<const uint8_t> sample, const Unit& unit) {
    if (unit.size == 0 || unit.offset >= sample.size()) return 0;
    return sample[unit.offset] & 0x1f;
}

std::optional<std::vector<uint8_t>> H264Sample::configurationRecord(std::span<const uint8_t> sample,
                                                                    const std::vector<Unit>& units) {
    std::vector<std::span<const uint8_t>> sps, pps;
    for (const Unit& u : units) {
        if (u.offset + u.size > sample.size() || u.size > 0xffff) continue;
        std::span<const uint8_t> nal = sample.subspan(u.offset, u.size);
        uint8_t type = unitType(sample, u);
        if (type == kTypeSPS && nal.size() >= 4 && sps.size() < 31) sps.push_back(nal);
        if (type == kTypePPS && nal.size() >= 2 && pps.size() < 255) pps.push_back(nal);
    }
    if (sps.empty() || pps.empty()) return std::nullopt;
    const std::span<const uint8_t> first = sps.front();
    const uint8_t profile = first[1];
    std::vector<uint8_t> out = {1, profile, first[2], first[3], 0xff, uint8_t(0xe0 | sps.size())};
    for (auto s : sps) {
        appendBE16(out, s.size());
        out.insert(out.end(), s.begin(), s.end());
    }
    out.push_back(uint8_t(pps.size()));
    for (auto p : pps) {
        appendBE16(out, p.size());
        out.insert(out.end(), p.begin(), p.end());
    }
    // The high profiles append their chroma format and bit depths.
    if (profile == 100 || profile == 110 || profile == 122 || profile == 144) {
        BitReader bits(first);
        bits.bits(24);  // profile, constraint flags, level
        bits.ue();  // seq_parameter_set_id
        uint32_t chroma = bits.ue();
        if (chroma == 3) bits.bit();
        uint32_t lumaDepth = bits.ue(), chromaDepth = bits.ue();
        if (bits.ok() && chroma <= 3 && lumaDepth <= 7 && chromaDepth <= 7) {
            out.push_back(uint8_t(0xfc | chroma));
            out.push_back(uint8_t(0xf8 | lumaDepth));
            out.push_back(uint8_t(0xf8 | chromaDepth));
            out.push_back(0);
        }
    }
    return out;
}

std::optional<unsigned> H264Sample::recordLengthSize(std::span<const uint8_t> record) {
    ByteReader r(record);
    if (r.u8() != 1) return std::nullopt;
    r.skip(3);
    unsigned size = (r.u8() & 3) + 1;
    if (!r.ok() || size == 3) return std::nullopt;
    return size;
}
