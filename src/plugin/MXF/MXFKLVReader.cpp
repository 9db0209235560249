#include "MXFKLVReader.h"

#include <algorithm>
#include <limits>

MXFKLVReader::MXFKLVReader(Ref<MXFByteSource> source, RefusedLengthForm refused, uint32_t lengthSize)
    : _source(std::move(source)), _refused(refused), _lengthSize(lengthSize) {}

MXFKLVReader::KLV MXFKLVReader::readKLV(uint64_t keyOffset) {
    uint8_t header[24];
    const int64_t got = _source->readAt(keyOffset, header, sizeof header);
    ByteReader r(header, got > 0 ? size_t(got) : 0);
    KLV klv;
    klv.keyOffset = keyOffset;
    klv.lengthSize = _refused == RefusedLengthForm::OneByte ? 1 : _lengthSize;
    if (!r.copy(klv.key.data(), klv.key.size())) return klv;
    const uint8_t form = r.u8();
    if (form == 0x83) {
        klv.length = r.uN(3);
        klv.lengthSize = 4;
        klv.longForm = true;
    } else if (form == 0x87) {
        klv.length = r.uN(7);
        klv.lengthSize = 8;
        klv.longForm = true;
    }
    if (klv.longForm) _lengthSize = klv.lengthSize;
    klv.complete = r.ok();
    return klv;
}

uint64_t MXFKLVReader::valueBytesThere(const KLV& klv) const {
    const uint64_t start = klv.valueOffset();
    const uint64_t size = _source->size();
    return start < size ? std::min(klv.length, size - start) : 0;
}

int64_t MXFKLVReader::readValue(const KLV& klv, void* data) {
    return _source->readAt(klv.valueOffset(), data, size_t(klv.length));
}

std::optional<uint64_t> MXFKLVReader::nextKeyOffset(const KLV& klv) {
    const uint64_t start = klv.valueOffset();
    if (start < klv.keyOffset || klv.length >= std::numeric_limits<uint64_t>::max() - start) return std::nullopt;
    return start + klv.length;
}
