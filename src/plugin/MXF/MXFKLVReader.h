// Key-length-value items of an MXF file, read from a byte source.
//
// A KLV is a 16-byte key, a BER length and the value. The card writes lengths
// in two long forms only, 0x83 (three length bytes follow) and 0x87 (seven),
// and only those are decoded. Any other first byte is refused rather than
// decoded: the length reads as 0, and the length field is taken to be as long
// as the reader's RefusedLengthForm rule says (the readers have always differed
// there, and hostile files can tell).
//
// Lengths come from the file and are believed only as far as the source goes:
// valueBytesThere() says how much of a value is really there, and
// nextKeyOffset() refuses a length that would wrap the offset around.
#pragma once

#include "ByteReader.h"
#include "MXFByteSource.h"

#include <array>
#include <cstdint>
#include <optional>
#include <span>

class MXFKLVReader {
public:
    // How long a refused length field is taken to be.
    enum class RefusedLengthForm {
        KeepsPreviousSize,  // as long as the last one this reader decoded (at first, the size it was made with)
        OneByte,            // one byte, the length byte itself
    };

    struct KLV {
        uint64_t keyOffset = 0;
        std::array<uint8_t, 16> key{};
        uint64_t length = 0;      // 0 when the form was refused
        uint32_t lengthSize = 4;  // bytes of the length field
        bool longForm = false;    // the length came in the 0x83 or 0x87 form
        // The key and the whole length field were there. When they were not,
        // missing length bytes read as 0, as ByteReader reads them.
        bool complete = false;

        uint64_t valueOffset() const { return keyOffset + 16 + lengthSize; }
    };

    explicit MXFKLVReader(Ref<MXFByteSource> source,
                          RefusedLengthForm refused = RefusedLengthForm::KeepsPreviousSize, uint32_t lengthSize = 4);

    // The key and length at keyOffset: reads the 24 bytes a key and the longest
    // length field can take, as many as the source has.
    KLV readKLV(uint64_t keyOffset);
    // Bytes of klv's value the source holds: its length, or fewer when the
    // source ends inside it.
    uint64_t valueBytesThere(const KLV& klv) const;
    // Reads klv's value into `data`, which has room for klv.length bytes;
    // answers what the source's read answered.
    int64_t readValue(const KLV& klv, void* data);
    // Where the KLV after klv starts; nullopt when that offset would not lie
    // past klv's key (a length so large that the sum wraps around).
    static std::optional<uint64_t> nextKeyOffset(const KLV& klv);
    // The size a refused length field is taken to have now.
    uint32_t lengthSize() const { return _lengthSize; }

    // Walks a local set (2-byte tag, 2-byte length, value), calling
    // f(tag, length, value) for each item; an item that runs past the set ends
    // the walk, its bytes not being there.
    template <class F>
    static void forEachLocalTag(std::span<const uint8_t> set, F&& f);

private:
    Ref<MXFByteSource> _source;
    RefusedLengthForm _refused;
    uint32_t _lengthSize;
};

template <class F>
void MXFKLVReader::forEachLocalTag(std::span<const uint8_t> set, F&& f) {
    ByteReader r(set);
    while (r.remaining() >= 4) {
        const uint16_t tag = r.u16();
        const uint16_t length = r.u16();
        if (!r.has(length)) break;
        f(tag, length, r.take(length));
    }
}
