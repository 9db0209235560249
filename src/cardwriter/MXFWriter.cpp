#include "MXFWriter.h"

#include <algorithm>
#include <cstring>
#include <iterator>
#include <map>

namespace {
constexpr MXFKey setKey(uint8_t kind) {
    return {0x06, 0x0e, 0x2b, 0x34, 0x02, 0x53, 0x01, 0x01, 0x0d, 0x01, 0x01, 0x01, 0x01, 0x01, kind, 0x00};
}
constexpr MXFKey partitionKey(uint8_t kind, uint8_t status) {
    return {0x06, 0x0e, 0x2b, 0x34, 0x02, 0x05, 0x01, 0x01, 0x0d, 0x01, 0x02, 0x01, 0x01, kind, status, 0x00};
}
}  // namespace

namespace MXFKeys {
const MXFKey headerPartitionClosedComplete = partitionKey(0x02, 0x04);
const MXFKey bodyPartitionClosedComplete = partitionKey(0x03, 0x04);
const MXFKey footerPartitionClosedComplete = partitionKey(0x04, 0x04);
const MXFKey primerPack = partitionKey(0x05, 0x01);
const MXFKey fill = {0x06, 0x0e, 0x2b, 0x34, 0x01, 0x01, 0x01, 0x02, 0x03, 0x01, 0x02, 0x10, 0x01, 0x00, 0x00, 0x00};
const MXFKey randomIndexPack = partitionKey(0x11, 0x01);
const MXFKey indexTableSegment = {0x06, 0x0e, 0x2b, 0x34, 0x02, 0x53, 0x01, 0x01,
                                  0x0d, 0x01, 0x02, 0x01, 0x01, 0x10, 0x01, 0x00};
const MXFKey xmlCarrier = {0x06, 0x0e, 0x2b, 0x34, 0x01, 0x01, 0x01, 0x09,
                           0x0e, 0x0e, 0x01, 0x01, 0x11, 0x01, 0x01, 0x00};
const MXFKey preface = setKey(0x2f);
const MXFKey identification = setKey(0x30);
const MXFKey contentStorage = setKey(0x18);
const MXFKey essenceContainerData = setKey(0x23);
const MXFKey materialPackage = setKey(0x36);
const MXFKey sourcePackage = setKey(0x37);
const MXFKey timelineTrack = setKey(0x3b);
const MXFKey sequence = setKey(0x0f);
const MXFKey sourceClip = setKey(0x11);
const MXFKey timecodeComponent = setKey(0x14);
const MXFKey cdciDescriptor = setKey(0x28);
const MXFKey aes3Descriptor = setKey(0x47);
const MXFKey mpegVideoDescriptor = setKey(0x51);
const MXFKey multipleDescriptor = setKey(0x44);
const MXFKey ancDataDescriptor = setKey(0x5c);
}  // namespace MXFKeys

namespace MXFLabels {
const MXFUID pictureDataDefinition = {0x06, 0x0e, 0x2b, 0x34, 0x04, 0x01, 0x01, 0x01,
                                      0x01, 0x03, 0x02, 0x02, 0x01, 0x00, 0x00, 0x00};
const MXFUID soundDataDefinition = {0x06, 0x0e, 0x2b, 0x34, 0x04, 0x01, 0x01, 0x01,
                                    0x01, 0x03, 0x02, 0x02, 0x02, 0x00, 0x00, 0x00};
const MXFUID timecodeDataDefinition = {0x06, 0x0e, 0x2b, 0x34, 0x04, 0x01, 0x01, 0x01,
                                       0x01, 0x03, 0x02, 0x01, 0x01, 0x00, 0x00, 0x00};
const MXFUID dataDataDefinition = {0x06, 0x0e, 0x2b, 0x34, 0x04, 0x01, 0x01, 0x01,
                                   0x01, 0x03, 0x02, 0x02, 0x03, 0x00, 0x00, 0x00};
const MXFUID opAtom = {0x06, 0x0e, 0x2b, 0x34, 0x04, 0x01, 0x01, 0x02, 0x0d, 0x01, 0x02, 0x01, 0x10, 0x00, 0x00, 0x00};
const MXFUID op1b = {0x06, 0x0e, 0x2b, 0x34, 0x04, 0x01, 0x01, 0x01, 0x0d, 0x01, 0x02, 0x01, 0x01, 0x02, 0x01, 0x00};
const MXFUID dvClipWrapped = {0x06, 0x0e, 0x2b, 0x34, 0x04, 0x01, 0x01, 0x01,
                              0x0d, 0x01, 0x03, 0x01, 0x02, 0x02, 0x7f, 0x02};
const MXFUID aes3ClipWrapped = {0x06, 0x0e, 0x2b, 0x34, 0x04, 0x01, 0x01, 0x01,
                                0x0d, 0x01, 0x03, 0x01, 0x02, 0x06, 0x04, 0x00};
const MXFUID aes3FrameWrapped = {0x06, 0x0e, 0x2b, 0x34, 0x04, 0x01, 0x01, 0x01,
                                 0x0d, 0x01, 0x03, 0x01, 0x02, 0x06, 0x03, 0x00};
const MXFUID avcFrameWrapped = {0x06, 0x0e, 0x2b, 0x34, 0x04, 0x01, 0x01, 0x0a,
                                0x0d, 0x01, 0x03, 0x01, 0x02, 0x10, 0x60, 0x01};
const MXFUID dvCoding = {0x06, 0x0e, 0x2b, 0x34, 0x04, 0x01, 0x01, 0x01, 0x04, 0x01, 0x02, 0x02, 0x02, 0x02, 0x02, 0x00};
const MXFUID avcIntraCoding = {0x06, 0x0e, 0x2b, 0x34, 0x04, 0x01, 0x01, 0x0a,
                               0x04, 0x01, 0x02, 0x02, 0x01, 0x32, 0x21, 0x01};
const MXFUID avcLongGOPCoding = {0x06, 0x0e, 0x2b, 0x34, 0x04, 0x01, 0x01, 0x0a,
                                 0x04, 0x01, 0x02, 0x02, 0x01, 0x31, 0x20, 0x00};
const MXFUID multipleWrappings = {0x06, 0x0e, 0x2b, 0x34, 0x04, 0x01, 0x01, 0x03,
                                  0x0d, 0x01, 0x03, 0x01, 0x02, 0x7f, 0x01, 0x00};
const MXFUID ancFrameWrapped = {0x06, 0x0e, 0x2b, 0x34, 0x04, 0x01, 0x01, 0x09,
                                0x0d, 0x01, 0x03, 0x01, 0x02, 0x0e, 0x00, 0x00};
}  // namespace MXFLabels

MXFKey mxfEssenceElementKey(uint8_t itemType, uint8_t count, uint8_t elementType, uint8_t number) {
    return {0x06, 0x0e, 0x2b, 0x34, 0x01, 0x02, 0x01, 0x01, 0x0d, 0x01, 0x03, 0x01, itemType, count, elementType, number};
}

uint32_t mxfTrackNumberForKey(const MXFKey& key) {
    return uint32_t(key[12]) << 24 | uint32_t(key[13]) << 16 | uint32_t(key[14]) << 8 | key[15];
}

size_t berLengthSize(uint64_t length) { return length <= 0xffffff ? 4 : 8; }

void writeBERLength(ByteWriter& w, uint64_t length) {
    if (length <= 0xffffff) {
        w.u8(0x83);
        w.u8(uint8_t(length >> 16));
        w.u8(uint8_t(length >> 8));
        w.u8(uint8_t(length));
    } else {
        w.u8(0x87);
        for (int shift = 48; shift >= 0; shift -= 8) w.u8(uint8_t(length >> shift));
    }
}

void writeKL(ByteWriter& w, const MXFKey& key, uint64_t length) {
    w.bytes(std::span<const uint8_t>(key));
    writeBERLength(w, length);
}

void writeKLV(ByteWriter& w, const MXFKey& key, std::span<const uint8_t> value) {
    writeKL(w, key, value.size());
    w.bytes(value);
}

void writeFill(ByteWriter& w, size_t total) {
    if (total < 20) {
        w.zeros(total);  // too small for a KLV; only used where a reader never looks
        return;
    }
    writeKL(w, MXFKeys::fill, total - 20);
    w.zeros(total - 20);
}

void padTo(ByteWriter& w, uint64_t offset) {
    if (w.size() >= offset) return;
    uint64_t gap = offset - w.size();
    if (gap < 20) gap += 4096;  // a fill needs room for its key and length
    writeFill(w, size_t(gap));
}

std::vector<uint8_t> partitionPackValue(const PartitionPack& p) {
    ByteWriter w;
    w.u16(p.majorVersion);
    w.u16(p.minorVersion);
    w.u32(p.kagSize);
    w.u64(p.thisPartition);
    w.u64(p.previousPartition);
    w.u64(p.footerPartition);
    w.u64(p.headerByteCount);
    w.u64(p.indexByteCount);
    w.u32(p.indexSID);
    w.u64(p.bodyOffset);
    w.u32(p.bodySID);
    w.bytes(std::span<const uint8_t>(p.operationalPattern));
    w.u32(uint32_t(p.essenceContainers.size()));
    w.u32(16);
    for (const auto& ec : p.essenceContainers) w.bytes(std::span<const uint8_t>(ec));
    return w.bytes();
}

void writePartitionPack(ByteWriter& w, const MXFKey& key, const PartitionPack& p) {
    writeKLV(w, key, partitionPackValue(p));
}

LocalSet& LocalSet::u8(uint16_t tag, uint8_t v) {
    _w.u16(tag); _w.u16(1); _w.u8(v);
    return *this;
}
LocalSet& LocalSet::u16(uint16_t tag, uint16_t v) {
    _w.u16(tag); _w.u16(2); _w.u16(v);
    return *this;
}
LocalSet& LocalSet::u32(uint16_t tag, uint32_t v) {
    _w.u16(tag); _w.u16(4); _w.u32(v);
    return *this;
}
LocalSet& LocalSet::u64(uint16_t tag, uint64_t v) {
    _w.u16(tag); _w.u16(8); _w.u64(v);
    return *this;
}
LocalSet& LocalSet::rational(uint16_t tag, int32_t num, int32_t den) {
    _w.u16(tag); _w.u16(8); _w.u32(uint32_t(num)); _w.u32(uint32_t(den));
    return *this;
}
LocalSet& LocalSet::uid(uint16_t tag, const MXFUID& v) { return bytes(tag, v); }
LocalSet& LocalSet::umid(uint16_t tag, const MXFUMID& v) { return bytes(tag, v); }
LocalSet& LocalSet::bytes(uint16_t tag, std::span<const uint8_t> v) {
    _w.u16(tag); _w.u16(uint16_t(v.size())); _w.bytes(v);
    return *this;
}
LocalSet& LocalSet::utf16(uint16_t tag, const std::string& text, size_t trailingZeros) {
    _w.u16(tag);
    _w.u16(uint16_t((text.size() + trailingZeros) * 2));
    for (unsigned char c : text) _w.u16(c);
    for (size_t i = 0; i < trailingZeros; ++i) _w.u16(0);
    return *this;
}
LocalSet& LocalSet::timestamp(uint16_t tag, int year, int month, int day, int hour, int minute, int second) {
    _w.u16(tag); _w.u16(8);
    _w.u16(uint16_t(year)); _w.u8(uint8_t(month)); _w.u8(uint8_t(day));
    _w.u8(uint8_t(hour)); _w.u8(uint8_t(minute)); _w.u8(uint8_t(second)); _w.u8(0);
    return *this;
}
LocalSet& LocalSet::uidBatch(uint16_t tag, const std::vector<MXFUID>& v) {
    _w.u16(tag); _w.u16(uint16_t(8 + 16 * v.size()));
    _w.u32(uint32_t(v.size())); _w.u32(16);
    for (const auto& u : v) _w.bytes(std::span<const uint8_t>(u));
    return *this;
}

static uint64_t fnv1a(const std::string& s, uint64_t h = 0xcbf29ce484222325ull) {
    for (unsigned char c : s) {
        h ^= c;
        h *= 0x100000001b3ull;
    }
    return h;
}

MXFUID MXFIdentifierSource::nextUID() {
    uint64_t a = fnv1a(_seed + "#" + std::to_string(_counter));
    uint64_t b = fnv1a(std::to_string(_counter++) + "#" + _seed, a);
    MXFUID u;
    for (int i = 0; i < 8; ++i) u[size_t(i)] = uint8_t(a >> (56 - 8 * i));
    for (int i = 0; i < 8; ++i) u[size_t(8 + i)] = uint8_t(b >> (56 - 8 * i));
    u[6] = uint8_t((u[6] & 0x0f) | 0x40);  // version 4 shape
    u[8] = uint8_t((u[8] & 0x3f) | 0x80);
    return u;
}

MXFUMID MXFIdentifierSource::nextUMID() {
    // Basic UMID: universal label, length 0x13, instance number, then material number.
    MXFUMID m{0x06, 0x0a, 0x2b, 0x34, 0x01, 0x01, 0x01, 0x05, 0x01, 0x01, 0x0d, 0x20, 0x13, 0x00, 0x00, 0x00};
    MXFUID material = nextUID();
    std::memcpy(m.data() + 16, material.data(), 16);
    return m;
}

namespace {

struct PrimerRow {
    uint16_t tag;
    uint8_t tail[9];  // the label after its common 06 0e 2b 34 01 01 01
};

// Local tags used by the writer and the labels they stand for, for the primer pack.
constexpr PrimerRow kPrimerRows[] = {
    // Every set: its instance and generation identifiers.
    {0x3c0a, {0x01, 0x01, 0x01, 0x15, 0x02, 0x00, 0x00, 0x00, 0x00}},
    {0x0102, {0x02, 0x05, 0x20, 0x07, 0x01, 0x08, 0x00, 0x00, 0x00}},
    // Preface.
    {0x3b02, {0x02, 0x07, 0x02, 0x01, 0x10, 0x02, 0x04, 0x00, 0x00}},
    {0x3b05, {0x02, 0x03, 0x01, 0x02, 0x01, 0x05, 0x00, 0x00, 0x00}},
    {0x3b06, {0x02, 0x06, 0x01, 0x01, 0x04, 0x06, 0x04, 0x00, 0x00}},
    {0x3b03, {0x02, 0x06, 0x01, 0x01, 0x04, 0x02, 0x01, 0x00, 0x00}},
    {0x3b09, {0x05, 0x01, 0x02, 0x02, 0x03, 0x00, 0x00, 0x00, 0x00}},
    {0x3b0a, {0x05, 0x01, 0x02, 0x02, 0x10, 0x02, 0x01, 0x00, 0x00}},
    {0x3b0b, {0x05, 0x01, 0x02, 0x02, 0x10, 0x02, 0x02, 0x00, 0x00}},
    // Identification.
    {0x3c01, {0x02, 0x05, 0x20, 0x07, 0x01, 0x02, 0x01, 0x00, 0x00}},
    {0x3c02, {0x02, 0x05, 0x20, 0x07, 0x01, 0x03, 0x01, 0x00, 0x00}},
    {0x3c04, {0x02, 0x05, 0x20, 0x07, 0x01, 0x05, 0x01, 0x00, 0x00}},
    {0x3c05, {0x02, 0x05, 0x20, 0x07, 0x01, 0x07, 0x00, 0x00, 0x00}},
    {0x3c06, {0x02, 0x07, 0x02, 0x01, 0x10, 0x02, 0x03, 0x00, 0x00}},
    {0x3c09, {0x02, 0x05, 0x20, 0x07, 0x01, 0x01, 0x00, 0x00, 0x00}},
    // Content storage and essence container data (whose stream IDs index
    // segments share).
    {0x1901, {0x02, 0x06, 0x01, 0x01, 0x04, 0x05, 0x01, 0x00, 0x00}},
    {0x1902, {0x02, 0x06, 0x01, 0x01, 0x04, 0x05, 0x02, 0x00, 0x00}},
    {0x2701, {0x02, 0x06, 0x01, 0x01, 0x06, 0x01, 0x00, 0x00, 0x00}},
    {0x3f06, {0x04, 0x01, 0x03, 0x04, 0x05, 0x00, 0x00, 0x00, 0x00}},
    {0x3f07, {0x04, 0x01, 0x03, 0x04, 0x04, 0x00, 0x00, 0x00, 0x00}},
    // Packages.
    {0x4401, {0x01, 0x01, 0x01, 0x15, 0x10, 0x00, 0x00, 0x00, 0x00}},
    {0x4402, {0x01, 0x01, 0x03, 0x03, 0x02, 0x01, 0x00, 0x00, 0x00}},
    {0x4403, {0x02, 0x06, 0x01, 0x01, 0x04, 0x06, 0x05, 0x00, 0x00}},
    {0x4404, {0x02, 0x07, 0x02, 0x01, 0x10, 0x02, 0x05, 0x00, 0x00}},
    {0x4405, {0x02, 0x07, 0x02, 0x01, 0x10, 0x01, 0x03, 0x00, 0x00}},
    {0x4701, {0x02, 0x06, 0x01, 0x01, 0x04, 0x02, 0x03, 0x00, 0x00}},
    // Tracks.
    {0x4801, {0x02, 0x01, 0x07, 0x01, 0x01, 0x00, 0x00, 0x00, 0x00}},
    {0x4804, {0x02, 0x01, 0x04, 0x01, 0x03, 0x00, 0x00, 0x00, 0x00}},
    {0x4b01, {0x02, 0x05, 0x30, 0x04, 0x05, 0x00, 0x00, 0x00, 0x00}},
    {0x4b02, {0x02, 0x07, 0x02, 0x01, 0x03, 0x01, 0x03, 0x00, 0x00}},
    {0x4803, {0x02, 0x06, 0x01, 0x01, 0x04, 0x02, 0x04, 0x00, 0x00}},
    // Sequences, source clips and timecode components.
    {0x0201, {0x02, 0x04, 0x07, 0x01, 0x00, 0x00, 0x00, 0x00, 0x00}},
    {0x0202, {0x02, 0x07, 0x02, 0x02, 0x01, 0x01, 0x03, 0x00, 0x00}},
    {0x1001, {0x02, 0x06, 0x01, 0x01, 0x04, 0x06, 0x09, 0x00, 0x00}},
    {0x1201, {0x02, 0x07, 0x02, 0x01, 0x03, 0x01, 0x04, 0x00, 0x00}},
    {0x1101, {0x02, 0x06, 0x01, 0x01, 0x03, 0x01, 0x00, 0x00, 0x00}},
    {0x1102, {0x02, 0x06, 0x01, 0x01, 0x03, 0x02, 0x00, 0x00, 0x00}},
    {0x1501, {0x02, 0x07, 0x02, 0x01, 0x03, 0x01, 0x05, 0x00, 0x00}},
    {0x1502, {0x02, 0x04, 0x04, 0x01, 0x01, 0x02, 0x06, 0x00, 0x00}},
    {0x1503, {0x01, 0x04, 0x04, 0x01, 0x01, 0x05, 0x00, 0x00, 0x00}},
    // Every descriptor, and the multiple descriptor's sub-descriptors.
    {0x3006, {0x05, 0x06, 0x01, 0x01, 0x03, 0x05, 0x00, 0x00, 0x00}},
    {0x3001, {0x01, 0x04, 0x06, 0x01, 0x01, 0x00, 0x00, 0x00, 0x00}},
    {0x3002, {0x01, 0x04, 0x06, 0x01, 0x02, 0x00, 0x00, 0x00, 0x00}},
    {0x3004, {0x02, 0x06, 0x01, 0x01, 0x04, 0x01, 0x02, 0x00, 0x00}},
    {0x3f01, {0x04, 0x06, 0x01, 0x01, 0x04, 0x06, 0x0b, 0x00, 0x00}},
    // Picture descriptors.
    {0x3201, {0x02, 0x04, 0x01, 0x06, 0x01, 0x00, 0x00, 0x00, 0x00}},
    {0x3202, {0x01, 0x04, 0x01, 0x05, 0x02, 0x01, 0x00, 0x00, 0x00}},
    {0x3203, {0x01, 0x04, 0x01, 0x05, 0x02, 0x02, 0x00, 0x00, 0x00}},
    {0x320c, {0x01, 0x04, 0x01, 0x03, 0x01, 0x04, 0x00, 0x00, 0x00}},
    {0x320e, {0x01, 0x04, 0x01, 0x01, 0x01, 0x01, 0x00, 0x00, 0x00}},
    {0x3301, {0x02, 0x04, 0x01, 0x05, 0x03, 0x0a, 0x00, 0x00, 0x00}},
    {0x3302, {0x01, 0x04, 0x01, 0x05, 0x01, 0x05, 0x00, 0x00, 0x00}},
    {0x3308, {0x01, 0x04, 0x01, 0x05, 0x01, 0x10, 0x00, 0x00, 0x00}},
    // Sound descriptors.
    {0x3d03, {0x05, 0x04, 0x02, 0x03, 0x01, 0x01, 0x01, 0x00, 0x00}},
    {0x3d07, {0x05, 0x04, 0x02, 0x01, 0x01, 0x04, 0x00, 0x00, 0x00}},
    {0x3d01, {0x04, 0x04, 0x02, 0x03, 0x03, 0x04, 0x00, 0x00, 0x00}},
    {0x3d0a, {0x05, 0x04, 0x02, 0x03, 0x02, 0x01, 0x00, 0x00, 0x00}},
    {0x3d09, {0x05, 0x04, 0x02, 0x03, 0x03, 0x05, 0x00, 0x00, 0x00}},
    // Index table segments.
    {0x3f0b, {0x05, 0x05, 0x30, 0x04, 0x06, 0x00, 0x00, 0x00, 0x00}},
    {0x3f0c, {0x05, 0x07, 0x02, 0x01, 0x03, 0x01, 0x0a, 0x00, 0x00}},
    {0x3f0d, {0x05, 0x07, 0x02, 0x02, 0x01, 0x01, 0x02, 0x00, 0x00}},
    {0x3f05, {0x04, 0x04, 0x06, 0x02, 0x01, 0x00, 0x00, 0x00, 0x00}},
    {0x3f0a, {0x05, 0x04, 0x04, 0x04, 0x01, 0x06, 0x00, 0x00, 0x00}},
    {0x3f09, {0x05, 0x04, 0x04, 0x04, 0x01, 0x01, 0x00, 0x00, 0x00}},
    {0x3f08, {0x05, 0x04, 0x04, 0x04, 0x01, 0x04, 0x00, 0x00, 0x00}},
};

// The primer pack: a batch of (local tag, UL) pairs, in tag order.
void writePrimerPack(ByteWriter& out) {
    std::map<uint16_t, MXFUID> entries;
    for (const PrimerRow& row : kPrimerRows) {
        MXFUID u{0x06, 0x0e, 0x2b, 0x34, 0x01, 0x01, 0x01};
        std::copy(std::begin(row.tail), std::end(row.tail), u.begin() + 7);
        entries[row.tag] = u;
    }
    ByteWriter primer;
    primer.u32(uint32_t(entries.size()));
    primer.u32(18);
    for (const auto& [tag, ul] : entries) {
        primer.u16(tag);
        primer.bytes(std::span<const uint8_t>(ul));
    }
    writeKLV(out, MXFKeys::primerPack, primer.bytes());
}

void writeSet(ByteWriter& w, const MXFKey& key, const LocalSet& set) { writeKLV(w, key, set.value()); }

LocalSet& stamp(LocalSet& s, uint16_t tag, const MXFIdentificationInfo& i) {
    return s.timestamp(tag, i.year, i.month, i.day, i.hour, i.minute, i.second);
}

// The fields a CDCI descriptor adds to the file descriptor's.
void addPictureFields(LocalSet& d, const MXFPictureDescriptor& p) {
    d.uid(0x3004, p.essenceContainer).uid(0x3201, p.codingLabel).u32(0x3203, p.storedWidth)
        .u32(0x3202, p.storedHeight).rational(0x320e, p.aspectNum, p.aspectDen).u8(0x320c, p.frameLayout)
        .u32(0x3301, p.componentDepth).u32(0x3302, p.horizontalSubsampling).u32(0x3308, p.verticalSubsampling);
}

// The fields an AES3 descriptor adds to the file descriptor's.
void addSoundFields(LocalSet& d, const MXFSoundDescriptor& snd) {
    const uint16_t blockAlign = uint16_t(snd.channelCount * ((snd.bitsPerSample + 7) / 8));
    d.uid(0x3004, snd.essenceContainer).rational(0x3d03, int32_t(snd.sampleRate), 1)
        .u32(0x3d07, snd.channelCount).u32(0x3d01, snd.bitsPerSample).u16(0x3d0a, blockAlign)
        .u32(0x3d09, snd.sampleRate * blockAlign);
}

// The track a file's one descriptor describes, and its length and rate.
struct FileDescriptorTiming {
    uint32_t pictureTrackID = 0;
    int64_t duration = 0;
    int32_t rn = 30000, rd = 1001;
};

// One file package per essence container; the first keeps the identifiers
// a single file package would have had.
struct FilePackage {
    uint32_t bodySID = 0, indexSID = 0;
    MXFUMID umid{};
    MXFUID uid{}, ecd{}, descriptor{};
};

// Builds the sets of one header metadata in file order. Every identifier comes
// from one seeded source in the order the sets ask for it, so the order of the
// steps is part of the bytes a card gets: build() must keep it.
class HeaderMetadataBuilder {
public:
    explicit HeaderMetadataBuilder(const MXFHeaderMetadataSpec& params);
    std::vector<uint8_t> build();

private:
    void planFilePackages();
    const MXFUMID& packageUMIDFor(const MXFTrackDescription& t) const;
    ByteWriter packageTracks(bool material, std::vector<MXFUID>& trackRefs, const FilePackage* only = nullptr);
    void writeTimecodeTrack(ByteWriter& out, std::vector<MXFUID>& trackRefs);
    void writeEssenceTrack(ByteWriter& out, std::vector<MXFUID>& trackRefs, const MXFTrackDescription& t,
                           bool material);
    void writePreface();
    void writeIdentification();
    void writeContentStorage();
    void writeMaterialPackage();
    void writeSourcePackage(const MXFUID& uid, const MXFUMID& umid, const MXFUID& descriptor, const FilePackage* only);
    void writeFilePackages();
    void writeSingleFilePackage();
    void writeSingleFileDescriptors();

    const MXFHeaderMetadataSpec& _params;
    const MXFIdentificationInfo& _ident;
    MXFIdentifierSource _ids;
    ByteWriter _sets;
    MXFUID _prefaceUID{}, _identUID{}, _storageUID{}, _ecdUID{}, _generation{}, _productUID{};
    MXFUMID _materialUMID{}, _sourceUMID{};
    MXFUID _materialUID{}, _sourceUID{}, _descriptorUID{};
    std::vector<FilePackage> _filePackages;
};

HeaderMetadataBuilder::HeaderMetadataBuilder(const MXFHeaderMetadataSpec& params)
    : _params(params), _ident(params.identification), _ids(params.seed) {
    _prefaceUID = _ids.nextUID();
    _identUID = _ids.nextUID();
    _storageUID = _ids.nextUID();
    _ecdUID = _ids.nextUID();
    _generation = _ids.nextUID();
    _productUID = _ids.nextUID();
    _materialUMID = _ids.nextUMID();
    _sourceUMID = _ids.nextUMID();
    _materialUID = _ids.nextUID();
    _sourceUID = _ids.nextUID();
    _descriptorUID = _ids.nextUID();
}

std::vector<uint8_t> HeaderMetadataBuilder::build() {
    if (_params.packagePerBodySID) planFilePackages();
    writePreface();
    writeIdentification();
    writeContentStorage();
    writeMaterialPackage();
    writeFilePackages();
    if (!_params.packagePerBodySID) {
        writeSingleFilePackage();
        writeSingleFileDescriptors();
    }
    // Primer pack first.
    ByteWriter out;
    writePrimerPack(out);
    out.bytes(_sets.bytes());
    return out.bytes();
}

void HeaderMetadataBuilder::planFilePackages() {
    for (const auto& t : _params.tracks) {
        if (t.kind == MXFTrackDescription::Kind::Timecode) continue;
        bool known = false;
        for (const auto& p : _filePackages) known = known || p.bodySID == t.bodySID;
        if (known) continue;
        FilePackage p;
        p.bodySID = t.bodySID;
        p.indexSID = t.indexSID;
        if (_filePackages.empty()) {
            p.umid = _sourceUMID;
            p.uid = _sourceUID;
            p.ecd = _ecdUID;
            p.descriptor = _descriptorUID;
        } else {
            p.umid = _ids.nextUMID();
            p.uid = _ids.nextUID();
            p.ecd = _ids.nextUID();
            p.descriptor = _ids.nextUID();
        }
        _filePackages.push_back(p);
    }
}

const MXFUMID& HeaderMetadataBuilder::packageUMIDFor(const MXFTrackDescription& t) const {
    for (const auto& p : _filePackages)
        if (p.bodySID == t.bodySID) return p.umid;
    return _sourceUMID;
}

// Package tracks: every track in both packages, material first; a timecode
// track in each package ahead of the essence tracks. `only`: a file package of
// its own essence container, holding just the tracks in it (and the timecode
// track when it is the first).
ByteWriter HeaderMetadataBuilder::packageTracks(bool material, std::vector<MXFUID>& trackRefs,
                                                const FilePackage* only) {
    ByteWriter out;
    if (!only || only == &_filePackages.front()) writeTimecodeTrack(out, trackRefs);
    for (const auto& t : _params.tracks) {
        if (t.kind == MXFTrackDescription::Kind::Timecode) continue;
        if (only && t.bodySID != only->bodySID) continue;
        writeEssenceTrack(out, trackRefs, t, material);
    }
    return out;
}

void HeaderMetadataBuilder::writeTimecodeTrack(ByteWriter& out, std::vector<MXFUID>& trackRefs) {
    MXFUID trackUID = _ids.nextUID(), seqUID = _ids.nextUID(), tcUID = _ids.nextUID();
    trackRefs.push_back(trackUID);
    int64_t duration = 0;
    int32_t rn = 30000, rd = 1001;
    for (const auto& t : _params.tracks)
        if (t.kind == MXFTrackDescription::Kind::Picture) {
            duration = t.duration;
            rn = t.editRateNum;
            rd = t.editRateDen;
        }
    if (!duration && !_params.tracks.empty()) {
        duration = _params.tracks.front().duration;
        rn = _params.tracks.front().editRateNum;
        rd = _params.tracks.front().editRateDen;
    }
    LocalSet track;
    track.uid(0x3c0a, trackUID).u32(0x4801, 0).u32(0x4804, 0).rational(0x4b01, rn, rd).i64(0x4b02, 0)
        .uid(0x4803, seqUID);
    writeSet(out, MXFKeys::timelineTrack, track);
    LocalSet seq;
    seq.uid(0x3c0a, seqUID).uid(0x0201, MXFLabels::timecodeDataDefinition).i64(0x0202, duration)
        .uidBatch(0x1001, {tcUID});
    writeSet(out, MXFKeys::sequence, seq);
    LocalSet tc;
    tc.uid(0x3c0a, tcUID).uid(0x0201, MXFLabels::timecodeDataDefinition).i64(0x0202, duration)
        .u16(0x1502, _params.timecodeRate).i64(0x1501, int64_t(_params.startTimecodeFrames))
        .u8(0x1503, _params.dropFrame ? 1 : 0);
    writeSet(out, MXFKeys::timecodeComponent, tc);
}

// A material track's source clip names the file package's track; a file
// package's own tracks are where the references end.
void HeaderMetadataBuilder::writeEssenceTrack(ByteWriter& out, std::vector<MXFUID>& trackRefs,
                                              const MXFTrackDescription& t, bool material) {
    MXFUID trackUID = _ids.nextUID(), seqUID = _ids.nextUID(), clipUID = _ids.nextUID();
    trackRefs.push_back(trackUID);
    const MXFUID& def = t.kind == MXFTrackDescription::Kind::Picture ? MXFLabels::pictureDataDefinition
                        : t.kind == MXFTrackDescription::Kind::Sound ? MXFLabels::soundDataDefinition
                                                                    : MXFLabels::dataDataDefinition;
    LocalSet track;
    track.uid(0x3c0a, trackUID).u32(0x4801, t.trackID)
        .u32(0x4804, material ? 0 : mxfTrackNumberForKey(t.essenceKey))
        .rational(0x4b01, t.editRateNum, t.editRateDen).i64(0x4b02, 0).uid(0x4803, seqUID);
    writeSet(out, MXFKeys::timelineTrack, track);
    LocalSet seq;
    seq.uid(0x3c0a, seqUID).uid(0x0201, def).i64(0x0202, t.duration).uidBatch(0x1001, {clipUID});
    writeSet(out, MXFKeys::sequence, seq);
    LocalSet clip;
    MXFUMID zero{};
    clip.uid(0x3c0a, clipUID).uid(0x0201, def).i64(0x0202, t.duration).i64(0x1201, 0)
        .umid(0x1101, material ? packageUMIDFor(t) : zero).u32(0x1102, material ? t.trackID : 0);
    writeSet(out, MXFKeys::sourceClip, clip);
}

void HeaderMetadataBuilder::writePreface() {
    LocalSet s;
    s.uid(0x3c0a, _prefaceUID);
    stamp(s, 0x3b02, _ident).u16(0x3b05, 0x0103).uidBatch(0x3b06, {_identUID}).uid(0x3b03, _storageUID)
        .uid(0x3b09, _params.operationalPattern).uidBatch(0x3b0a, _params.essenceContainers).uidBatch(0x3b0b, {});
    writeSet(_sets, MXFKeys::preface, s);
}

void HeaderMetadataBuilder::writeIdentification() {
    LocalSet s;
    s.uid(0x3c0a, _identUID).utf16(0x3c01, _ident.companyName).utf16(0x3c02, _ident.productName)
        .utf16(0x3c04, _ident.versionString).uid(0x3c05, _productUID);
    stamp(s, 0x3c06, _ident).uid(0x3c09, _generation);
    writeSet(_sets, MXFKeys::identification, s);
}

// Content storage and the essence container data linking each body stream to
// its file package.
void HeaderMetadataBuilder::writeContentStorage() {
    std::vector<FilePackage> packages = _filePackages;
    if (!_params.packagePerBodySID) {
        FilePackage single;
        single.bodySID = _params.bodySID;
        single.indexSID = _params.indexSID;
        single.umid = _sourceUMID;
        single.uid = _sourceUID;
        single.ecd = _ecdUID;
        packages = {single};
    }
    std::vector<MXFUID> packageUIDs{_materialUID}, containers;
    for (const auto& p : packages) {
        packageUIDs.push_back(p.uid);
        containers.push_back(p.ecd);
    }
    LocalSet s;
    s.uid(0x3c0a, _storageUID).uidBatch(0x1901, packageUIDs).uidBatch(0x1902, containers);
    writeSet(_sets, MXFKeys::contentStorage, s);
    for (const auto& p : packages) {
        LocalSet e;
        e.uid(0x3c0a, p.ecd).umid(0x2701, p.umid).u32(0x3f06, p.indexSID).u32(0x3f07, p.bodySID);
        writeSet(_sets, MXFKeys::essenceContainerData, e);
    }
}

void HeaderMetadataBuilder::writeMaterialPackage() {
    std::vector<MXFUID> trackRefs;
    ByteWriter tracks = packageTracks(true, trackRefs);
    LocalSet s;
    s.uid(0x3c0a, _materialUID).umid(0x4401, _materialUMID);
    if (!_params.packageName.empty()) s.utf16(0x4402, _params.packageName);
    stamp(s, 0x4404, _ident);
    stamp(s, 0x4405, _ident).uidBatch(0x4403, trackRefs);
    writeSet(_sets, MXFKeys::materialPackage, s);
    _sets.bytes(tracks.bytes());
}

void HeaderMetadataBuilder::writeSourcePackage(const MXFUID& uid, const MXFUMID& umid, const MXFUID& descriptor,
                                               const FilePackage* only) {
    std::vector<MXFUID> trackRefs;
    ByteWriter tracks = packageTracks(false, trackRefs, only);
    LocalSet s;
    s.uid(0x3c0a, uid).umid(0x4401, umid);
    stamp(s, 0x4404, _ident);
    stamp(s, 0x4405, _ident).uidBatch(0x4403, trackRefs).uid(0x4701, descriptor);
    writeSet(_sets, MXFKeys::sourcePackage, s);
    _sets.bytes(tracks.bytes());
}

// File (source) packages, one per essence container, each with the
// descriptor of its track.
void HeaderMetadataBuilder::writeFilePackages() {
    size_t soundIndex = 0;
    for (const auto& p : _filePackages) {
        writeSourcePackage(p.uid, p.umid, p.descriptor, &p);
        const MXFTrackDescription* track = nullptr;
        for (const auto& t : _params.tracks)
            if (!track && t.kind != MXFTrackDescription::Kind::Timecode && t.bodySID == p.bodySID) track = &t;
        LocalSet d;
        d.uid(0x3c0a, p.descriptor).u32(0x3006, track->trackID).rational(0x3001, track->editRateNum, track->editRateDen)
            .i64(0x3002, track->duration);
        if (track->kind == MXFTrackDescription::Kind::Picture && _params.picture) {
            addPictureFields(d, *_params.picture);
            writeSet(_sets, MXFKeys::cdciDescriptor, d);
        } else if (track->kind == MXFTrackDescription::Kind::Sound && soundIndex < _params.sounds.size()) {
            addSoundFields(d, _params.sounds[soundIndex++]);
            writeSet(_sets, MXFKeys::aes3Descriptor, d);
        } else {
            d.uid(0x3004, MXFLabels::ancFrameWrapped);
            writeSet(_sets, MXFKeys::ancDataDescriptor, d);
        }
    }
}

// The single file package and its descriptor.
void HeaderMetadataBuilder::writeSingleFilePackage() {
    writeSourcePackage(_sourceUID, _sourceUMID, _descriptorUID, nullptr);
}

// One descriptor per file: the picture's when there is one, else the first sound's.
FileDescriptorTiming fileDescriptorTiming(const std::vector<MXFTrackDescription>& tracks) {
    FileDescriptorTiming d;
    uint32_t soundTrackID = 0;
    for (const auto& t : tracks) {
        if (t.kind == MXFTrackDescription::Kind::Picture && !d.pictureTrackID) {
            d.pictureTrackID = t.trackID;
            d.duration = t.duration;
            d.rn = t.editRateNum;
            d.rd = t.editRateDen;
        }
        if (t.kind == MXFTrackDescription::Kind::Sound && !soundTrackID) {
            soundTrackID = t.trackID;
            if (!d.pictureTrackID) {
                d.duration = t.duration;
                d.rn = t.editRateNum;
                d.rd = t.editRateDen;
            }
        }
    }
    return d;
}

void HeaderMetadataBuilder::writeSingleFileDescriptors() {
    const auto [pictureTrackID, duration, rn, rd] = fileDescriptorTiming(_params.tracks);
    // With a multiple descriptor the package names it, and every essence
    // descriptor gets its own identifier as one of its sub-descriptors.
    std::vector<MXFUID> subDescriptors;
    if (_params.multipleDescriptor) {
        if (_params.picture) subDescriptors.push_back(_ids.nextUID());
        for (size_t i = 0; i < _params.sounds.size(); ++i) subDescriptors.push_back(_ids.nextUID());
        LocalSet m;
        m.uid(0x3c0a, _descriptorUID).rational(0x3001, rn, rd).i64(0x3002, duration)
            .uid(0x3004, MXFLabels::multipleWrappings).uidBatch(0x3f01, subDescriptors);
        writeSet(_sets, MXFKeys::multipleDescriptor, m);
    }
    size_t nextSub = 0;
    if (_params.picture) {
        LocalSet d;
        d.uid(0x3c0a, _params.multipleDescriptor ? subDescriptors[nextSub++] : _descriptorUID)
            .u32(0x3006, pictureTrackID).rational(0x3001, rn, rd).i64(0x3002, duration);
        addPictureFields(d, *_params.picture);
        writeSet(_sets, MXFKeys::cdciDescriptor, d);
    }
    // Sound descriptors: the first takes the file descriptor's identifier when
    // there is no picture; the others get their own.
    bool first = !_params.picture;
    uint32_t soundIndex = 0;
    for (const auto& t : _params.tracks) {
        if (t.kind != MXFTrackDescription::Kind::Sound || soundIndex >= _params.sounds.size()) continue;
        const MXFUID uid = _params.multipleDescriptor ? subDescriptors[nextSub++]
                           : first                     ? _descriptorUID
                                                       : _ids.nextUID();
        LocalSet d;
        d.uid(0x3c0a, uid).u32(0x3006, t.trackID).rational(0x3001, t.editRateNum, t.editRateDen)
            .i64(0x3002, t.duration);
        addSoundFields(d, _params.sounds[soundIndex++]);
        writeSet(_sets, MXFKeys::aes3Descriptor, d);
        first = false;
    }
}

}  // namespace

std::vector<uint8_t> buildHeaderMetadata(const MXFHeaderMetadataSpec& params) {
    return HeaderMetadataBuilder(params).build();
}

std::vector<uint8_t> indexSegmentValue(const MXFIndexSegment& s) {
    LocalSet set;
    set.uid(0x3c0a, s.instanceUID).rational(0x3f0b, s.editRateNum, s.editRateDen).i64(0x3f0c, s.indexStartPosition)
        .i64(0x3f0d, s.indexDuration).u32(0x3f05, s.editUnitByteCount).u32(0x3f06, s.indexSID).u32(0x3f07, s.bodySID);
    std::vector<uint8_t> v = set.value();
    if (!s.entries.empty()) {
        // IndexEntryArray: count, entry size (11: temporal offset, key-frame offset,
        // flags, 8-byte stream offset), entries.
        ByteWriter w;
        w.u16(0x3f0a);
        w.u16(uint16_t(8 + 11 * s.entries.size()));
        w.u32(uint32_t(s.entries.size()));
        w.u32(11);
        for (const auto& e : s.entries) {
            w.u8(uint8_t(e.temporalOffset));
            w.u8(uint8_t(e.keyFrameOffset));
            w.u8(e.flags);
            w.u64(e.streamOffset);
        }
        v.insert(v.end(), w.bytes().begin(), w.bytes().end());
    }
    return v;
}

void writeRandomIndexPack(ByteWriter& w, const std::vector<MXFRIPEntry>& entries) {
    uint64_t length = entries.size() * 12 + 4;
    size_t start = w.size();
    writeKL(w, MXFKeys::randomIndexPack, length);
    for (const auto& e : entries) {
        w.u32(e.bodySID);
        w.u64(e.byteOffset);
    }
    // Overall length of the pack, key included, so a reader can find it from the end.
    w.u32(uint32_t(w.size() - start + 4));
}
