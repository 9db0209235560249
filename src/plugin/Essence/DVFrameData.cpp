#include "DVFrameData.h"

#include <cmath>

const std::array<DVFrameTypeInfo, 12> kDVFrameTypeTable = {{
    {DVFourCC("dvc "), DVFourCC("krst"), 2, 120000, 30, 1, 25, 10},
    {DVFourCC("dvcp"), DVFourCC("krst"), 3, 144000, 25, 0, 25, 12},
    {DVFourCC("dvc "), DVFourCC("krst"), 6, 120000, 30, 1, 25, 10},
    {DVFourCC("dvpp"), DVFourCC("krst"), 7, 144000, 25, 0, 25, 12},
    {DVFourCC("dv5n"), DVFourCC("krst"), 4, 240000, 30, 1, 50, 20},
    {DVFourCC("dv5p"), DVFourCC("krst"), 5, 288000, 25, 0, 50, 24},
    // The 720p rows carry rate class 50 although they are 100 Mb/s streams.
    {DVFourCC("dvhp"), DVFourCC("krst"), 8, 240000, 60, 1, 50, 20},
    {DVFourCC("dvhq"), DVFourCC("krst"), 9, 288000, 50, 0, 50, 24},
    {DVFourCC("dvh6"), DVFourCC("krst"), 10, 480000, 30, 1, 100, 40},
    {DVFourCC("dvh5"), DVFourCC("krst"), 11, 576000, 25, 0, 100, 48},
    {DVFourCC("dvh3"), DVFourCC("krst"), 12, 480000, 30, 1, 100, 40},
    {DVFourCC("dvh2"), DVFourCC("krst"), 13, 576000, 25, 0, 100, 48},
}};

namespace {

// Block b of DIF sequence seq (0-based), or an empty span when it is not wholly
// inside the frame.
template <class Byte>
std::span<Byte> difBlock(std::span<Byte> frame, uint64_t seq, unsigned block) {
    // seq < 2^32, so the offset cannot overflow.
    uint64_t offset = seq * kDVDIFSequenceSize + uint64_t(block) * kDVDIFBlockSize;
    if (offset > frame.size() || frame.size() - offset < kDVDIFBlockSize) return {};
    return frame.subspan(size_t(offset), kDVDIFBlockSize);
}

int32_t bcd(uint8_t b) { return (b >> 4) * 10 + (b & 0x0F); }
int32_t bcd(uint8_t b, unsigned tensBits) { return ((b >> 4) & ((1u << tensBits) - 1)) * 10 + (b & 0x0F); }
uint8_t toBCD(int32_t v) {
    if (v < 0) v = 0;
    return uint8_t(((v / 10) % 16) << 4 | (v % 10));
}

// Subcode packs sit behind a two-byte sync block ID and a 0xFF byte; the reader
// looks at nine positions, more than the six sync blocks a block carries, since
// the reserved tail of the block is 0xFF and never matches a pack header.
constexpr unsigned kSubcodePacks = 9;
size_t subcodePackOffset(unsigned k) { return 6 + 8 * k; }
constexpr unsigned kVAUXPacks = 15;
size_t vauxPackOffset(unsigned k) { return 3 + 5 * k; }

// Frame-pair state from bits 2-3 of the variable-frame-rate byte.
int32_t framePairStateFromBits(uint8_t b1) {
    switch ((b1 >> 2) & 3) {
    case 0: return 2;
    case 3: return 0;
    default: return 1;
    }
}
uint8_t framePairStateBits(int32_t state) {
    switch (state) {
    case 2: return 0;
    case 0: return 3;
    default: return 1;
    }
}

int32_t shootingRateFlags(uint8_t b1, int32_t rate) {
    int32_t flags = 0;
    if (b1 & 0x80) flags |= kDVShootingRateFlagFrames;
    if (!(b1 & 0x20)) flags |= kDVShootingRateFlagBit5Clear;
    if (rate == 24) flags |= (b1 & 0x40) ? kDVShootingRateFlag2332 : kDVShootingRateFlag23;
    return flags;
}

bool shootingRateCheckOK(const uint8_t* pack) {
    return pack[4] == DVShootingRateCheckByte(pack[1], pack[2], pack[3]);
}

// Generic bit-field decoders for the elements whose packs are plain fields.
struct BitField {
    uint8_t byte;   // 1..4
    uint8_t shift;  // lowest bit
    uint8_t width;  // bits; for BCD fields the units nibble
    uint8_t tens;   // 0: plain bits; else the number of tens bits above the units nibble
};

template <size_t N>
void decodeFields(const uint8_t* pack, int32_t* out, const std::array<BitField, N>& fields) {
    for (size_t i = 0; i < N; ++i) {
        const BitField& f = fields[i];
        uint8_t b = pack[f.byte];
        out[i] = f.tens ? bcd(b, f.tens) : int32_t((b >> f.shift) & ((1u << f.width) - 1));
    }
}
template <size_t N>
void encodeFields(uint8_t* pack, const int32_t* in, const std::array<BitField, N>& fields) {
    for (size_t i = 0; i < N; ++i) {
        const BitField& f = fields[i];
        uint8_t& b = pack[f.byte];
        if (f.tens) {
            uint8_t tensMask = uint8_t((1u << f.tens) - 1);
            int32_t v = in[i] < 0 ? 0 : in[i];
            b = uint8_t((b & ~((tensMask << 4) | 0x0F)) | (((v / 10) & tensMask) << 4) | (v % 10));
        } else {
            uint8_t mask = uint8_t(((1u << f.width) - 1) << f.shift);
            b = uint8_t((b & ~mask) | ((uint32_t(in[i]) << f.shift) & mask));
        }
    }
}

constexpr std::array<BitField, 15> kSourceControlFields = {{
    {1, 6, 2, 0}, {1, 4, 2, 0}, {1, 2, 2, 0}, {1, 0, 2, 0},
    {2, 7, 1, 0}, {2, 4, 2, 0}, {2, 0, 3, 0},
    {3, 7, 1, 0}, {3, 6, 1, 0}, {3, 5, 1, 0}, {3, 4, 1, 0}, {3, 3, 1, 0}, {3, 2, 1, 0}, {3, 0, 2, 0},
    {4, 0, 7, 0},
}};
constexpr std::array<BitField, 7> kSourceFields = {{
    {2, 7, 1, 0}, {2, 6, 1, 0}, {2, 4, 2, 0}, {3, 6, 2, 0}, {3, 5, 1, 0}, {3, 0, 5, 0}, {4, 0, 8, 0},
}};
constexpr std::array<BitField, 12> kAudioSourceFields = {{
    {1, 7, 1, 0}, {1, 0, 6, 0}, {2, 5, 2, 0}, {2, 4, 1, 0}, {2, 0, 4, 0}, {3, 6, 1, 0},
    {3, 5, 1, 0}, {3, 0, 5, 0}, {4, 7, 1, 0}, {4, 6, 1, 0}, {4, 3, 3, 0}, {4, 0, 3, 0},
}};
// Timecode: frames, seconds, minutes, hours as BCD with 2, 3, 3 and 2 tens bits.
constexpr std::array<BitField, 7> kTimeCodeFields = {{
    {4, 0, 4, 2}, {3, 0, 4, 3}, {2, 0, 4, 3}, {1, 0, 4, 2}, {1, 6, 1, 0}, {1, 7, 1, 0}, {2, 7, 1, 0},
}};
constexpr std::array<BitField, 8> kBinaryGroupFields = {{
    {1, 0, 4, 0}, {1, 4, 4, 0}, {2, 0, 4, 0}, {2, 4, 4, 0}, {3, 0, 4, 0}, {3, 4, 4, 0}, {4, 0, 4, 0}, {4, 4, 4, 0},
}};

template <class R>
void countPack(R& r, int32_t element) {
    r.tag = DVElementTag(element);
    r.count = uint16_t(r.count + 1);
}

int32_t codeSourceControl(uint8_t* pack, std::span<uint8_t> rec, int32_t, int32_t direction) {
    auto r = DVCURecordRead<DVSourceControlRecord>(rec);
    if (direction == 1) {
        std::memset(pack + 1, 0xFF, 4);  // reserved bits are ones
        pack[0] = kDVPackVideoSourceControl;
        encodeFields(pack, &r.copyGeneration, kSourceControlFields);
        return kDVNoErr;
    }
    countPack(r, kDVElementSourceControl);
    decodeFields(pack, &r.copyGeneration, kSourceControlFields);
    DVCURecordWrite(rec, r);
    return kDVNoErr;
}

int32_t codeSource(uint8_t* pack, std::span<uint8_t> rec, int32_t, int32_t direction) {
    auto r = DVCURecordRead<DVSourceRecord>(rec);
    if (direction == 1) {
        std::memset(pack + 1, 0xFF, 4);  // reserved bits are ones
        pack[0] = kDVPackVideoSource;
        int32_t ch = r.tvChannel < 0 ? 0 : r.tvChannel;
        pack[1] = toBCD(ch % 100);
        pack[2] = uint8_t((pack[2] & 0xF0) | ((ch / 100) & 0x0F));
        encodeFields(pack, &r.blackAndWhite, kSourceFields);
        return kDVNoErr;
    }
    countPack(r, kDVElementSource);
    r.tvChannel = (pack[2] & 0x0F) * 100 + bcd(pack[1]);
    decodeFields(pack, &r.blackAndWhite, kSourceFields);
    DVCURecordWrite(rec, r);
    return kDVNoErr;
}

int32_t codeAudioSource(uint8_t* pack, std::span<uint8_t> rec, int32_t, int32_t direction) {
    auto r = DVCURecordRead<DVAudioSourceRecord>(rec);
    if (direction == 1) {
        std::memset(pack + 1, 0xFF, 4);  // reserved bits are ones
        pack[0] = kDVPackAudioSource;
        encodeFields(pack, &r.unlocked, kAudioSourceFields);
        return kDVNoErr;
    }
    countPack(r, kDVElementAudioSource);
    decodeFields(pack, &r.unlocked, kAudioSourceFields);
    DVCURecordWrite(rec, r);
    return kDVNoErr;
}

int32_t codeTimeCode(uint8_t* pack, std::span<uint8_t> rec, int32_t pairState, int32_t direction) {
    auto r = DVCURecordRead<DVTimeCodeRecord>(rec);
    if (direction == 1) {
        std::memset(pack + 1, 0xFF, 4);  // reserved bits are ones
        pack[0] = kDVPackTimeCode;
        encodeFields(pack, &r.hours, kTimeCodeFields);
        pack[3] = uint8_t((pack[3] & 0x7F) | ((r.groupFlags & 1) << 7));
        pack[4] = uint8_t((pack[4] & 0x3F) | ((r.groupFlags & 2) << 5) | ((r.groupFlags & 4) << 5));
        return kDVNoErr;
    }
    countPack(r, kDVElementTimeCode);
    decodeFields(pack, &r.hours, kTimeCodeFields);
    r.groupFlags = (pack[3] >> 7) | ((pack[4] >> 6) & 1) << 1 | (pack[4] >> 7) << 2;
    r.pairState = pairState;
    DVCURecordWrite(rec, r);
    return kDVNoErr;
}

int32_t codeBinaryGroup(uint8_t* pack, std::span<uint8_t> rec, int32_t pairState, int32_t direction) {
    auto r = DVCURecordRead<DVBinaryGroupRecord>(rec);
    if (direction == 1) {
        std::memset(pack + 1, 0xFF, 4);  // reserved bits are ones
        pack[0] = kDVPackBinaryGroup;
        encodeFields(pack, r.groups, kBinaryGroupFields);
        return kDVNoErr;
    }
    countPack(r, kDVElementBinaryGroup);
    decodeFields(pack, r.groups, kBinaryGroupFields);
    r.pairState = pairState;
    DVCURecordWrite(rec, r);
    return kDVNoErr;
}

int32_t codeShootingRate(uint8_t* pack, std::span<uint8_t> rec, int32_t p, int32_t direction) {
    auto r = DVCURecordRead<DVShootingRateRecord>(rec);
    if (direction == 1) {
        // The inverse of the decoding below: bits 7, 6 and 5 from the flags, and
        // the low two bits chosen so that the repeat mark reads back for this p.
        uint8_t b1 = 0x10;
        if (r.flags & kDVShootingRateFlagFrames) b1 |= 0x80;
        if (!(r.flags & kDVShootingRateFlagBit5Clear)) b1 |= 0x20;
        if (r.rate == 24 && (r.flags & kDVShootingRateFlag2332)) b1 |= 0x40;
        if (r.flags & kDVShootingRateFlagRepeatMark) {
            if (!(b1 & 0x40) && r.rate == 24) {
                b1 &= uint8_t(~0x10);
                b1 |= p == 0 ? 2 : 0;
            } else {
                b1 |= 0x80;  // outside 24p only a frame-based pack can carry the mark
            }
        } else {
            b1 |= 1;
        }
        pack[0] = kDVPackShootingRate;
        pack[1] = b1;
        pack[2] = toBCD(r.rate);
        pack[3] = uint8_t(0xF0 | (r.mode & 0x0F));
        pack[4] = DVShootingRateCheckByte(pack[1], pack[2], pack[3]);
        return kDVNoErr;
    }
    if (!shootingRateCheckOK(pack)) return kDVNoErr;
    const uint8_t b1 = pack[1];
    countPack(r, kDVElementShootingRate);
    r.mode = pack[3] & 0x0F;
    r.rate = bcd(pack[2]);
    r.flags = shootingRateFlags(b1, r.rate);
    bool mark = false;
    if (!(b1 & 0x40) && r.rate == 24 && !(b1 & 0x10))
        mark = ((b1 & 3) == 2 && p == 0) || ((b1 & 3) == 0 && p != 0);
    else if (b1 & 0x80)
        mark = (b1 & 3) != 1 || (p <= 1 && (b1 & 2));
    if (mark) r.flags |= kDVShootingRateFlagRepeatMark;
    DVCURecordWrite(rec, r);
    return kDVNoErr;
}

int32_t codeVFR(uint8_t* pack, std::span<uint8_t> rec, int32_t p, int32_t direction) {
    auto r = DVCURecordRead<DVVFRRecord>(rec);
    const bool firstOfPair = p == 2 || p == 3;
    if (direction == 1) {
        pack[0] = kDVPackBinaryGroup;
        pack[2] = (r.rate == 24 || r.rate == 30 || r.rate == 60) ? toBCD(r.rate) : 0x60;
        uint8_t b1 = 0;
        uint16_t count = 0;
        if (r.rate == 24 || r.rate == 30) {
            if (r.flags & kDVVFRFlagVariable) b1 |= 0x50;
            b1 |= uint8_t(framePairStateBits(r.framePairState) << 2);
            if (r.flags & kDVVFRFlagKeep) b1 |= firstOfPair ? 1 : 2;
            count = uint16_t(r.frameCount);
        }
        pack[1] = b1;
        pack[3] = uint8_t(count);
        pack[4] = uint8_t(count >> 8);
        return kDVNoErr;
    }
    const uint8_t b1 = pack[1];
    countPack(r, kDVElementVFR);
    r.rate = bcd(pack[2]);
    r.frameCount = pack[4] * 256 + pack[3];
    r.framePairState = framePairStateFromBits(b1);
    int32_t flags = (b1 >> 4) == 5 ? kDVVFRFlagVariable : 0;
    if (firstOfPair) flags |= kDVVFRFlagFirstOfPair;
    // Both frames of a 720p pair carry the same pack: bit 1 marks the second
    // frame (FSP set) as new, bit 0 the first.
    if ((!firstOfPair && (b1 & 2)) || (firstOfPair && (b1 & 1))) flags |= kDVVFRFlagKeep;
    if (r.rate == 0 && r.frameCount == 0 && flags == 0) flags = kDVVFRFlagKeep;
    // A pack without variable-frame-rate data (an ordinary binary group) marks
    // every frame as new.
    if (b1 < 16) flags |= kDVVFRFlagKeep;
    r.flags = flags;
    r.flagsByte = b1;
    DVCURecordWrite(rec, r);
    return kDVNoErr;
}

enum class Area { Subcode, VAUX, AudioAux };

struct ElementRow {
    int32_t element;
    uint8_t header;
    Area area;
    size_t recordSize;
    int32_t (*code)(uint8_t* pack, std::span<uint8_t> record, int32_t p, int32_t direction);
};

constexpr std::array<ElementRow, 7> kElements = {{
    {kDVElementSourceControl, kDVPackVideoSourceControl, Area::VAUX, sizeof(DVSourceControlRecord), codeSourceControl},
    {kDVElementSource, kDVPackVideoSource, Area::VAUX, sizeof(DVSourceRecord), codeSource},
    {kDVElementAudioSource, kDVPackAudioSource, Area::AudioAux, sizeof(DVAudioSourceRecord), codeAudioSource},
    {kDVElementTimeCode, kDVPackTimeCode, Area::Subcode, sizeof(DVTimeCodeRecord), codeTimeCode},
    {kDVElementShootingRate, kDVPackShootingRate, Area::VAUX, sizeof(DVShootingRateRecord), codeShootingRate},
    {kDVElementBinaryGroup, kDVPackBinaryGroup, Area::Subcode, sizeof(DVBinaryGroupRecord), codeBinaryGroup},
    {kDVElementVFR, kDVPackBinaryGroup, Area::Subcode, sizeof(DVVFRRecord), codeVFR},
}};

const ElementRow* elementRow(int32_t element) {
    for (const auto& row : kElements)
        if (row.element == element) return &row;
    return nullptr;
}

const DVFrameTypeInfo* frameTypeRow(int32_t type) {
    for (const auto& row : kDVFrameTypeTable)
        if (row.type == type) return &row;
    return nullptr;
}

}  // namespace

int32_t DVBlockPairState(uint8_t idByte1) {
    switch (idByte1 & 0x0F) {
    case 3: return 2;
    case 11: return 3;
    case 15: return 1;
    default: return 0;
    }
}

// ---------------------------------------------------------------------------

int32_t DVCULookupFrameType(FourCharCode subtype, FourCharCode vendor, int32_t* bytesPerFrame, int32_t* type,
                            int32_t* rate, uint8_t* is60Hz) {
    if (subtype == 0) return kDVErrBadArgument;
    for (const auto& row : kDVFrameTypeTable) {
        if (row.subtype != subtype || (vendor != 0 && row.vendor != vendor)) continue;
        if (bytesPerFrame) *bytesPerFrame = row.bytesPerFrame;
        if (type) *type = row.type;
        if (rate) *rate = row.rate;
        if (is60Hz) *is60Hz = row.is60Hz;
        return kDVNoErr;
    }
    return kDVErrNotFound;
}

int32_t DVCULookupFrameTypeInfo(int32_t type, int32_t* bytesPerFrame, int32_t* rate, uint8_t* is60Hz,
                                int32_t* rateClass, int32_t* sequences, FourCharCode* subtype,
                                FourCharCode* vendor) {
    if (type < 2 || type > 13) return kDVErrBadArgument;
    const DVFrameTypeInfo* row = frameTypeRow(type);
    if (!row) return kDVErrNotFound;
    if (bytesPerFrame) *bytesPerFrame = row->bytesPerFrame;
    if (rate) *rate = row->rate;
    if (is60Hz) *is60Hz = row->is60Hz;
    if (rateClass) *rateClass = row->rateClass;
    if (sequences) *sequences = row->sequences;
    if (subtype) *subtype = row->subtype;
    if (vendor) *vendor = row->vendor;
    return kDVNoErr;
}

// ---------------------------------------------------------------------------

int32_t DVExtractTimeCodeFromFrame(std::span<uint8_t> frame, uint32_t sequenceNumber, uint8_t dropFrame,
                                   int32_t frameRate, const uint8_t* replacementPack, int32_t* totalFrames,
                                   int32_t* hours, int32_t* minutes, int32_t* seconds, int32_t* frames,
                                   uint8_t* dropFrameOut) {
    if (sequenceNumber == 0) return kDVNoErr;  // there is no sequence before the first
    const uint64_t seq = uint64_t(sequenceNumber) - 1;
    const int64_t rate = frameRate;
    for (unsigned blockIndex = 1; blockIndex <= 2; ++blockIndex) {
        std::span<uint8_t> block = difBlock(frame, seq, blockIndex);
        if (block.empty()) continue;
        int32_t firstOfPair = 0;
        if (rate == 60) {
            int32_t state = DVBlockPairState(block[1]);
            firstOfPair = state == 2 || state == 3;
        }
        for (unsigned k = 0; k < kSubcodePacks; ++k) {
            uint8_t* pack = block.data() + subcodePackOffset(k);
            if (pack[0] != kDVPackTimeCode) continue;
            const uint8_t df = (dropFrame == 1 && rate == 30 && (pack[1] & 0x40)) ? 1 : 0;
            int32_t f = bcd(pack[1], 2);
            const int32_t s = bcd(pack[2], 3);
            const int32_t m = bcd(pack[3], 3);
            const int32_t h = bcd(pack[4], 2);
            if (rate == 60) f = f * 2 + firstOfPair;
            int64_t total = rate * (s + 60 * m + 3600 * h) + f;
            if (df) {
                // Drop-frame counts skip frame numbers 0 and 1 of every minute
                // except each tenth: 18 per ten minutes.
                int64_t tenMinutes = int64_t(std::trunc(double(total) / 1800.0));
                total -= 18 * (tenMinutes / 10) + 2 * (tenMinutes % 10);
            }
            if (total >= rate * 86400) continue;
            if (replacementPack) std::memcpy(pack, replacementPack, kDVPackSize);
            if (totalFrames) *totalFrames = int32_t(total);
            if (hours) *hours = h;
            if (minutes) *minutes = m;
            if (seconds) *seconds = s;
            if (frames) *frames = f;
            if (dropFrameOut) *dropFrameOut = df;
            return kDVNoErr;
        }
    }
    return kDVNoErr;
}

int32_t DVExtractShootingRateFromFrame(std::span<uint8_t> frame, uint32_t sequenceCount, uint8_t, int32_t,
                                       const uint8_t* replacementPack, int32_t* rate, int32_t* mode,
                                       int32_t* flags) {
    for (uint64_t seq = 0; seq < sequenceCount; ++seq) {
        if (difBlock(frame, seq, 0).empty()) break;  // past the frame's end
        for (unsigned blockIndex = 3; blockIndex <= 5; ++blockIndex) {
            std::span<uint8_t> block = difBlock(frame, seq, blockIndex);
            if (block.empty()) continue;
            for (unsigned k = 0; k < kVAUXPacks; ++k) {
                uint8_t* pack = block.data() + vauxPackOffset(k);
                if (pack[0] != kDVPackShootingRate || !shootingRateCheckOK(pack)) continue;
                const int32_t r = bcd(pack[2]);
                const int32_t md = pack[3] & 0x0F;
                const int32_t fl = shootingRateFlags(pack[1], r);
                if (replacementPack) std::memcpy(pack, replacementPack, kDVPackSize);
                if (rate) *rate = r;
                if (mode) *mode = md;
                if (flags) *flags = fl;
                return kDVNoErr;
            }
        }
    }
    return kDVNoErr;
}

int32_t DVExtractVFRInfoFromFrame(std::span<uint8_t> frame, uint32_t sequenceNumber, uint8_t, int32_t,
                                  const uint8_t* replacementPack, int32_t* rate, int32_t* count,
                                  int32_t* framePairState, int32_t* flags) {
    if (sequenceNumber == 0) return kDVNoErr;
    const uint64_t seq = uint64_t(sequenceNumber) - 1;
    for (unsigned blockIndex = 1; blockIndex <= 2; ++blockIndex) {
        std::span<uint8_t> block = difBlock(frame, seq, blockIndex);
        if (block.empty()) continue;
        const uint8_t nibble = block[1] & 0x0F;
        const bool firstOfPair = nibble == 3 || nibble == 11;
        for (unsigned k = 0; k < kSubcodePacks; ++k) {
            uint8_t* pack = block.data() + subcodePackOffset(k);
            if (pack[0] != kDVPackBinaryGroup) continue;
            const uint8_t b1 = pack[1];
            const int32_t r = b1 != 0 ? bcd(pack[2]) : 0;
            const int32_t c = pack[3] | pack[4] << 8;
            const int32_t state = framePairStateFromBits(b1);
            int32_t fl = (b1 >> 4) == 5 ? kDVVFRFlagVariable : 0;
            if (firstOfPair) fl |= kDVVFRFlagFirstOfPair;
            if (((b1 & 2) && !firstOfPair) || (firstOfPair && (b1 & 1))) fl |= kDVVFRFlagKeep;
            if (replacementPack) std::memcpy(pack, replacementPack, kDVPackSize);
            if (rate) *rate = r;
            if (count) *count = c;
            if (framePairState) *framePairState = state;
            if (flags) *flags = fl;
            return kDVNoErr;
        }
    }
    return kDVNoErr;
}

// ---------------------------------------------------------------------------

size_t DVCUDataElementRecordSize(int32_t element) {
    const ElementRow* row = elementRow(element);
    return row ? row->recordSize : 0;
}

int32_t DVCUCodeDataElement(int32_t element, std::span<uint8_t, kDVPackSize> pack, std::span<uint8_t> record,
                            int32_t pairState, int32_t direction) {
    const ElementRow* row = elementRow(element);
    if (!row || record.size() < row->recordSize) return kDVErrBadArgument;
    return row->code(pack.data(), record, pairState, direction);
}

int32_t DVCUExtractDataElementFromFrame(int32_t type, FourCharCode vendor, std::span<const uint8_t> frame,
                                        int32_t element, OwnedRecord* record, uint32_t flags) {
    if (!frame.data() || !record) return kDVErrBadArgument;
    if ((flags & kDVCUExtractCallerRecord) && !*record) return kDVErrBadArgument;
    if (type < 2 || type > 13) return kDVErrBadArgument;
    const DVFrameTypeInfo* typeRow = frameTypeRow(type);
    if (!typeRow || (vendor != 0 && typeRow->vendor != vendor)) return kDVErrNotFound;
    const ElementRow* row = elementRow(element);
    if (!row) return kDVErrBadArgument;

    if (flags & kDVCUExtractCallerRecord) {
        if (record->getPtrSize() < row->recordSize) return kDVErrBadArgument;
    } else if (*record) {
        if (!record->setPtrSize(row->recordSize)) return kDVErrNoMemory;
    } else {
        *record = OwnedRecord::newPtrClear(kDVDefaultRecordSize);
        if (!*record) return kDVErrNoMemory;
    }

    std::span<uint8_t> out = record->bytes();
    // The decoders work on a copy of each pack: decoding never writes the frame.
    uint8_t pack[kDVPackSize];
    auto visit = [&](std::span<const uint8_t> block, size_t offset) {
        if (block[offset] != row->header) return;
        std::memcpy(pack, block.data() + offset, kDVPackSize);
        row->code(pack, out, DVBlockPairState(block[1]), 0);
    };
    for (uint64_t seq = 0; seq < uint64_t(typeRow->sequences); ++seq) {
        switch (row->area) {
        case Area::Subcode:
            for (unsigned b = 1; b <= 2; ++b) {
                auto block = difBlock(frame, seq, b);
                if (block.empty()) continue;
                for (unsigned k = 0; k < kSubcodePacks; ++k) visit(block, subcodePackOffset(k));
            }
            break;
        case Area::VAUX:
            for (unsigned b = 3; b <= 5; ++b) {
                auto block = difBlock(frame, seq, b);
                if (block.empty()) continue;
                for (unsigned k = 0; k < kVAUXPacks; ++k) visit(block, vauxPackOffset(k));
            }
            break;
        case Area::AudioAux:
            // Nine audio blocks, each ahead of fifteen video blocks.
            for (unsigned a = 0; a < 9; ++a) {
                auto block = difBlock(frame, seq, 6 + 16 * a);
                if (!block.empty()) visit(block, 3);
            }
            break;
        }
    }
    return kDVNoErr;
}
