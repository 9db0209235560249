// Packs read from (and written into) DV-family frames: DV, DVCPRO, DVCPRO50 and
// DVCPRO HD.
//
// A frame is a run of 12000-byte DIF sequences of 150 80-byte DIF blocks. Block 0
// of a sequence is the header, blocks 1-2 the subcode (six sync blocks of
// ID, ID, 0xFF and a five-byte pack, at 3 + 8k), blocks 3-5 the video auxiliary
// data (fifteen packs at 3 + 5k), and every sixteenth block from 6 on an audio
// block whose bytes 3-7 are an audio auxiliary pack. Byte 1 of every block ID
// carries the sequence number (high nibble) and, in its low nibble, the FSC
// (bit 3) and FSP (bit 2) bits that tell DVCPRO HD channels and 720p frame pairs
// apart.
//
// Every function takes the frame as a span and reads nothing outside it: blocks
// that do not lie wholly inside the frame are skipped. Out pointers may be null.
#pragma once

#include "OwnedRecord.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>

using FourCharCode = uint32_t;

constexpr FourCharCode DVFourCC(const char (&s)[5]) {
    return FourCharCode(uint8_t(s[0])) << 24 | FourCharCode(uint8_t(s[1])) << 16 |
           FourCharCode(uint8_t(s[2])) << 8 | FourCharCode(uint8_t(s[3]));
}

enum : int32_t {
    kDVNoErr = 0,
    kDVErrBadArgument = -2,
    kDVErrNotFound = -3,
    kDVErrNoMemory = -5,
};

inline constexpr size_t kDVDIFBlockSize = 80;
inline constexpr size_t kDVDIFSequenceSize = 12000;
inline constexpr size_t kDVPackSize = 5;

// Pack headers used here.
enum : uint8_t {
    kDVPackTimeCode = 0x13,
    kDVPackBinaryGroup = 0x14,  // also the variable-frame-rate pack
    kDVPackAudioSource = 0x50,
    kDVPackVideoSource = 0x60,
    kDVPackVideoSourceControl = 0x61,
    kDVPackShootingRate = 0x64,
    kDVPackNoInfo = 0xFF,
};

// The 0x64 check byte: the sum of data bytes 1-3, XOR 0x55.
constexpr uint8_t DVShootingRateCheckByte(uint8_t b1, uint8_t b2, uint8_t b3) {
    return uint8_t(uint8_t(b1 + b2 + b3) ^ 0x55);
}

// ---------------------------------------------------------------------------
// Frame types.

struct DVFrameTypeInfo {
    FourCharCode subtype;
    FourCharCode vendor;
    int32_t type;
    int32_t bytesPerFrame;
    int32_t rate;
    uint8_t is60Hz;
    int32_t rateClass;
    int32_t sequences;
};

// Searched from the top. Type 6 shares its subtype with type 2, so a lookup by
// subtype never reaches it; only a lookup by number does.
extern const std::array<DVFrameTypeInfo, 12> kDVFrameTypeTable;

// -2 for subtype 0, -3 when no row matches. Vendor 0 compares the subtype only.
int32_t DVCULookupFrameType(FourCharCode subtype, FourCharCode vendor, int32_t* bytesPerFrame, int32_t* type,
                            int32_t* rate, uint8_t* is60Hz);
// -2 for a type outside 2..13, -3 when no row has it.
int32_t DVCULookupFrameTypeInfo(int32_t type, int32_t* bytesPerFrame, int32_t* rate, uint8_t* is60Hz,
                                int32_t* rateClass, int32_t* sequences, FourCharCode* subtype,
                                FourCharCode* vendor);

// ---------------------------------------------------------------------------
// The three direct extractors. They never fail: when the frame holds no usable
// pack the outputs are left as they were (callers preset them) and 0 comes back.
// A non-null replacementPack (five bytes) overwrites the pack that was found,
// after its values have been read.

// Subcode blocks 1 then 2 of the 1-based sequenceNumber-th DIF sequence; the
// first 0x13 pack whose total is under a day at frameRate wins. At rate 60 the
// pack counts frame pairs and the block's FSP bit says which frame of the pair
// this is. The drop-frame flag is honoured only when requested (dropFrame == 1)
// at rate 30.
int32_t DVExtractTimeCodeFromFrame(std::span<uint8_t> frame, uint32_t sequenceNumber, uint8_t dropFrame,
                                   int32_t frameRate, const uint8_t* replacementPack, int32_t* totalFrames,
                                   int32_t* hours, int32_t* minutes, int32_t* seconds, int32_t* frames,
                                   uint8_t* dropFrameOut);

// VAUX blocks of the first sequenceCount sequences; the first 0x64 pack with a
// right check byte wins. dropFrame and frameRate are not used.
int32_t DVExtractShootingRateFromFrame(std::span<uint8_t> frame, uint32_t sequenceCount, uint8_t dropFrame,
                                       int32_t frameRate, const uint8_t* replacementPack, int32_t* rate,
                                       int32_t* mode, int32_t* flags);

// Subcode blocks 1 then 2 of the 1-based sequenceNumber-th sequence; the first
// 0x14 pack wins. dropFrame and frameRate are not used.
int32_t DVExtractVFRInfoFromFrame(std::span<uint8_t> frame, uint32_t sequenceNumber, uint8_t dropFrame,
                                  int32_t frameRate, const uint8_t* replacementPack, int32_t* rate, int32_t* count,
                                  int32_t* framePairState, int32_t* flags);

// Shooting-rate flag values (DVExtractShootingRateFromFrame and element 5).
enum : int32_t {
    kDVShootingRateFlagFrames = 1,       // pack byte 1 bit 7: the rate counts frames, not fields
    kDVShootingRateFlagBit5Clear = 2,    // pack byte 1 bit 5 clear
    kDVShootingRateFlag23 = 4,           // rate 24, byte 1 bit 6 clear
    kDVShootingRateFlag2332 = 8,         // rate 24, byte 1 bit 6 set
    kDVShootingRateFlagRepeatMark = 16,  // element 5 only
};
// Variable-frame-rate flag values (DVExtractVFRInfoFromFrame and element 7).
enum : int32_t {
    kDVVFRFlagVariable = 1,     // byte 1 upper nibble 5
    kDVVFRFlagKeep = 2,         // this frame of the pair is a new picture
    kDVVFRFlagFirstOfPair = 4,  // FSP clear in the block ID
};

// ---------------------------------------------------------------------------
// Data elements: packs decoded into records.
//
// A record starts with a 16-bit tag (0x2000 + element), a 16-bit count of packs
// decoded into it and a 32-bit field nobody writes; every field after that is
// 32-bit. The layouts below are the records' byte layouts (host byte order).

enum : int32_t {
    kDVElementSourceControl = 1,  // 0x61, VAUX
    kDVElementSource = 2,         // 0x60, VAUX
    kDVElementAudioSource = 3,    // 0x50, audio auxiliary
    kDVElementTimeCode = 4,       // 0x13, subcode
    kDVElementShootingRate = 5,   // 0x64, VAUX
    kDVElementBinaryGroup = 6,    // 0x14, subcode
    kDVElementVFR = 7,            // 0x14, subcode
};
inline constexpr uint16_t DVElementTag(int32_t element) { return uint16_t(0x2000 + element); }
inline constexpr size_t kDVDefaultRecordSize = 128;

struct DVSourceControlRecord {  // element 1
    uint16_t tag, count;
    uint32_t unused;
    int32_t copyGeneration;    // CGMS, byte 1 bits 7-6
    int32_t inputSource;       // ISR, bits 5-4
    int32_t compressionCount;  // CMP, bits 3-2
    int32_t sourceSituation;   // SS, bits 1-0
    int32_t recordingStart;    // REC ST, byte 2 bit 7
    int32_t recordingMode;     // REC MODE, bits 5-4
    int32_t displayMode;       // DISP, bits 2-0 (0 4:3, 2 16:9)
    int32_t frameField;        // FF, byte 3 bit 7
    int32_t firstSecond;       // FS, bit 6
    int32_t frameChange;       // FC, bit 5
    int32_t interlaced;        // IL, bit 4
    int32_t stillField;        // ST, bit 3
    int32_t stillCamera;       // SC, bit 2
    int32_t broadcastSystem;   // BCSYS, bits 1-0
    int32_t genreCategory;     // byte 4 bits 6-0
};
struct DVSourceRecord {  // element 2
    uint16_t tag, count;
    uint32_t unused;
    int32_t tvChannel;          // BCD: hundreds from byte 2 bits 3-0, tens and units byte 1
    int32_t blackAndWhite;      // B/W, byte 2 bit 7
    int32_t colourFramesValid;  // EN, bit 6
    int32_t colourFramesId;     // CLF, bits 5-4
    int32_t sourceCode;         // SRC, byte 3 bits 7-6
    int32_t fiftyHz;            // 50/60, bit 5
    int32_t signalType;         // STYPE, bits 4-0 (0 DV25, 4 DV50, 0x14 1080, 0x18 720)
    int32_t tunerCategory;      // byte 4
};
struct DVAudioSourceRecord {  // element 3
    uint16_t tag, count;
    uint32_t unused;
    int32_t unlocked;           // LF, byte 1 bit 7 (0: audio locked to video)
    int32_t audioFrameSize;     // AF SIZE, bits 5-0: samples in the frame minus the minimum
    int32_t channels;           // CHN, byte 2 bits 6-5
    int32_t pairMode;           // PA, bit 4
    int32_t audioMode;          // AUDIO MODE, bits 3-0
    int32_t multiLanguage;      // ML, byte 3 bit 6
    int32_t fiftyHz;            // 50/60, bit 5
    int32_t signalType;         // STYPE, bits 4-0
    int32_t emphasisOff;        // EF, byte 4 bit 7
    int32_t timeConstant;       // TC, bit 6
    int32_t samplingFrequency;  // SMP, bits 5-3 (0 48 kHz, 1 44.1 kHz, 2 32 kHz)
    int32_t quantization;       // QU, bits 2-0 (0 16-bit, 1 12-bit, 2 20-bit)
};
struct DVTimeCodeRecord {  // element 4
    uint16_t tag, count;
    uint32_t unused;
    int32_t hours, minutes, seconds, frames;  // BCD as packed (frame pairs at 720p)
    int32_t dropFrame;     // byte 1 bit 6
    int32_t colourFrame;   // byte 1 bit 7
    int32_t polarity;      // byte 2 bit 7
    int32_t groupFlags;    // byte 3 bit 7, byte 4 bit 6, byte 4 bit 7 as bits 0-2
    int32_t pairState;     // of the block the pack came from
};
struct DVShootingRateRecord {  // element 5
    uint16_t tag, count;
    uint32_t unused;
    int32_t rate;
    int32_t mode;
    int32_t flags;  // kDVShootingRateFlag...
};
struct DVBinaryGroupRecord {  // element 6
    uint16_t tag, count;
    uint32_t unused;
    int32_t groups[8];  // binary groups 1-8: low then high nibble of bytes 1-4
    int32_t pairState;
};
struct DVVFRRecord {  // element 7
    uint16_t tag, count;
    uint32_t unused;
    int32_t rate;
    int32_t frameCount;
    int32_t framePairState;
    int32_t flags;      // kDVVFRFlag...
    uint8_t flagsByte;  // byte 1 of the last pack, as it stood
};
static_assert(offsetof(DVShootingRateRecord, rate) == 8 && sizeof(DVShootingRateRecord) == 20);
static_assert(offsetof(DVVFRRecord, flagsByte) == 24);

// Size a record of this element needs (0 for an unknown element).
size_t DVCUDataElementRecordSize(int32_t element);

// Copies a record out of (or into) record bytes; a short record reads as zero.
template <class R>
R DVCURecordRead(std::span<const uint8_t> record) {
    R r{};
    if (record.size() >= sizeof(R)) std::memcpy(&r, record.data(), sizeof(R));
    return r;
}
template <class R>
bool DVCURecordWrite(std::span<uint8_t> record, const R& r) {
    if (record.size() < sizeof(R)) return false;
    std::memcpy(record.data(), &r, sizeof(R));
    return true;
}

// Flag values of DVCUExtractDataElementFromFrame.
enum : uint32_t {
    kDVCUExtractCallerRecord = 2,  // the caller supplies the record; it is not resized
};

// Walks every DIF sequence of the frame type (the ones wholly in the frame) and
// decodes every pack of the element into *record, the last one winning; the
// record's count says how many were decoded. Without kDVCUExtractCallerRecord a
// present record is resized to the element's size and a missing one is
// allocated zero-filled at 128 bytes. Finding no pack is not an error.
int32_t DVCUExtractDataElementFromFrame(int32_t type, FourCharCode vendor, std::span<const uint8_t> frame,
                                        int32_t element, OwnedRecord* record, uint32_t flags);

// One element decoder in either direction: 0 decodes the pack into the record,
// 1 builds the pack from the record. pairState is that of the block holding the
// pack (DVBlockPairState). -2 for an unknown element or a short record.
int32_t DVCUCodeDataElement(int32_t element, std::span<uint8_t, kDVPackSize> pack, std::span<uint8_t> record,
                            int32_t pairState, int32_t direction);

// The pair state of a DIF block from byte 1 of its ID: 2 or 3 for the first
// frame of a 720p pair (FSP clear, FSC 0 or 1), 1 for FSC set with FSP set,
// 0 otherwise.
int32_t DVBlockPairState(uint8_t idByte1);
