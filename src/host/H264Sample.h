// H.264 access units as a movie needs them: NAL units found in a sample that
// carries start codes (Annex B, three- or four-byte) or length prefixes, the
// sample rewritten with four-byte lengths, and the decoder configuration
// record ('avcC') built from parameter sets.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <vector>

class H264Sample {
public:
    // Where one NAL unit's bytes lie in the sample, without its prefix.
    struct Unit {
        size_t offset;
        size_t size;
    };

    // The units between start codes, trailing zero bytes left out. nullopt when
    // the sample does not begin with a start code (after leading zero bytes)
    // or holds no unit.
    static std::optional<std::vector<Unit>> unitsWithStartCodes(std::span<const uint8_t> sample);
    // The units of a sample whose units carry big-endian lengths of
    // lengthSize (1, 2 or 4) bytes. nullopt unless the lengths walk exactly to
    // the sample's end.
    static std::optional<std::vector<Unit>> unitsWithLengths(std::span<const uint8_t> sample, unsigned lengthSize);

    // Bytes the units take with four-byte lengths.
    static size_t lengthPrefixedSize(const std::vector<Unit>& units);
    // Writes the units, in order, each after its four-byte length, into out
    // (lengthPrefixedSize bytes).
    static void writeLengthPrefixed(std::span<const uint8_t> sample, const std::vector<Unit>& units, uint8_t* out);
    // When every unit sits right after a four-byte start code with nothing in
    // between, the length-prefixed form has the very same layout: this writes
    // the lengths over the start codes and answers true. Otherwise it answers
    // false and leaves the sample alone.
    static bool replaceStartCodesInPlace(std::span<uint8_t> sample, const std::vector<Unit>& units);

    static uint8_t unitType(std::span<const uint8_t> sample, const Unit& unit);

    // The configuration record for the first sequence and picture parameter
    // sets among the units, with four-byte lengths; nullopt without both.
    static std::optional<std::vector<uint8_t>> configurationRecord(std::span<const uint8_t> sample,
                                                                   const std::vector<Unit>& units);
    // The length size a configuration record declares; nullopt when it is not one.
    static std::optional<unsigned> recordLengthSize(std::span<const uint8_t> record);
};
