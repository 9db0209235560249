#include "mxfEssenseOffsets.h"

#include <cstdio>

namespace {
// Indexed by the low three bits of the index entry's Flags byte. Types 1, 2 and
// 5 never occur in card files; they carry no flags so the host treats them as
// plain samples.
struct PictureTypeInfo {
    const char* label;
    uint32_t flags;
};
constexpr PictureTypeInfo kPictureTypes[8] = {
    {"I  ", 0x44010001},  // open-GOP I frame: partial sync only
    {"BAD", 0},
    {"BAD", 0},
    {"B  ", 0x08000001},
    {"IDR", 0x44000000},
    {"BAD", 0},
    {"P  ", 0x44000001},
    {"Br ", 0x44000001},
};
}  // namespace

Ref<mxfEssenseOffsets> mxfEssenseOffsets::initWithOffset(int64_t offset, uint32_t size, uint32_t decodeOrder,
                                                         uint8_t avcPictureType, int16_t temporalOffsetIndexed) {
    Ref<mxfEssenseOffsets> r(new mxfEssenseOffsets());
    r->_offset = offset;
    r->_size = size;
    r->_decodeOrder = decodeOrder;
    r->_avcPictureType = avcPictureType;
    r->_temporalOffsetIndexed = temporalOffsetIndexed;
    return r;
}

uint32_t mxfEssenseOffsets::mediaSampleFlags() const { return kPictureTypes[_avcPictureType & 7].flags; }

std::string mxfEssenseOffsets::description() const {
    char buf[256];
    std::snprintf(buf, sizeof buf, "<%s: offset:%8llx size:%6d PTS:%4d DTS:%4d %s flags=%8x TO:%2d >",
                  className().c_str(), static_cast<unsigned long long>(_offset), int(_size),
                  int(_presentationOrder), int(_decodeOrder), kPictureTypes[_avcPictureType & 7].label,
                  unsigned(mediaSampleFlags()), int(_temporalOffsetIndexed));
    return buf;
}

int ptsCompare(const mxfEssenseOffsets* a, const mxfEssenseOffsets* b, void*) {
    int32_t pa = int32_t(a->presentationOrder());
    int32_t pb = int32_t(b->presentationOrder());
    if (pa < pb) return -1;
    if (pa > pb) return 1;
    return 0;
}
