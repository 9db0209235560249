// MXF building blocks for the card writer: keys, KLV framing, partition packs,
// local sets, header metadata, index table segments and the random index pack.
//
// Card files are big-endian throughout and frame their values with BER lengths
// in the 4-byte long form (0x83) unless a value needs more than 24 bits, when
// the 8-byte form (0x87) is used.
#pragma once

#include "ByteWriter.h"

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <vector>

using MXFUID = std::array<uint8_t, 16>;
using MXFUMID = std::array<uint8_t, 32>;

namespace MXFKeys {
// Partition packs: byte 13 is the kind (02 header, 03 body, 04 footer), byte 14
// the status (04 closed and complete).
extern const MXFKey headerPartitionClosedComplete;
extern const MXFKey bodyPartitionClosedComplete;
extern const MXFKey footerPartitionClosedComplete;
extern const MXFKey primerPack;
extern const MXFKey fill;
extern const MXFKey randomIndexPack;
extern const MXFKey indexTableSegment;
// The private carrier of the clip XML in self-contained clips.
extern const MXFKey xmlCarrier;
// Structural metadata sets.
extern const MXFKey preface;
extern const MXFKey identification;
extern const MXFKey contentStorage;
extern const MXFKey essenceContainerData;
extern const MXFKey materialPackage;
extern const MXFKey sourcePackage;
extern const MXFKey timelineTrack;
extern const MXFKey sequence;
extern const MXFKey sourceClip;
extern const MXFKey timecodeComponent;
extern const MXFKey cdciDescriptor;
extern const MXFKey aes3Descriptor;
extern const MXFKey mpegVideoDescriptor;
extern const MXFKey multipleDescriptor;
extern const MXFKey ancDataDescriptor;
}  // namespace MXFKeys

namespace MXFLabels {
extern const MXFUID pictureDataDefinition;  // byte 12: 01
extern const MXFUID soundDataDefinition;    // byte 12: 02
extern const MXFUID timecodeDataDefinition;
extern const MXFUID dataDataDefinition;
extern const MXFUID opAtom;
extern const MXFUID op1b;
extern const MXFUID dvClipWrapped;        // DV-DIF essence, clip-wrapped
extern const MXFUID aes3ClipWrapped;      // AES3 PCM, clip-wrapped
extern const MXFUID aes3FrameWrapped;
extern const MXFUID avcFrameWrapped;      // H.264 byte stream, frame-wrapped
extern const MXFUID dvCoding;             // picture essence coding for DV
extern const MXFUID avcIntraCoding;
extern const MXFUID avcLongGOPCoding;
extern const MXFUID multipleWrappings;    // essence container of a multiple descriptor
extern const MXFUID ancFrameWrapped;      // SMPTE 436 ancillary data, frame-wrapped
}  // namespace MXFLabels

// Essence element keys: 06 0e 2b 34 01 02 01 01 0d 01 03 01, then item type
// (15 picture, 16 sound, 17 data), element count, element type, element number.
MXFKey mxfEssenceElementKey(uint8_t itemType, uint8_t count, uint8_t elementType, uint8_t number);
// The track number that ties a track to its essence: the key's last four bytes.
uint32_t mxfTrackNumberForKey(const MXFKey& key);

// Writes a BER length: 0x83 + 3 bytes when it fits, else 0x87 + 7 bytes.
void writeBERLength(ByteWriter& w, uint64_t length);
// Length of the field writeBERLength uses for length (4 or 8).
size_t berLengthSize(uint64_t length);
void writeKLV(ByteWriter& w, const MXFKey& key, std::span<const uint8_t> value);
// Key and length only; the caller appends the value.
void writeKL(ByteWriter& w, const MXFKey& key, uint64_t length);
// A fill KLV that takes exactly `total` bytes (total >= 20).
void writeFill(ByteWriter& w, size_t total);
// Pads with a fill KLV so that the writer's size reaches `offset` (no-op when
// already there; offsets closer than 20 bytes are pushed to the next fill that fits).
void padTo(ByteWriter& w, uint64_t offset);

struct PartitionPack {
    uint16_t majorVersion = 1;
    uint16_t minorVersion = 3;
    uint32_t kagSize = 1;
    uint64_t thisPartition = 0;
    uint64_t previousPartition = 0;
    uint64_t footerPartition = 0;
    uint64_t headerByteCount = 0;
    uint64_t indexByteCount = 0;
    uint32_t indexSID = 0;
    uint64_t bodyOffset = 0;
    uint32_t bodySID = 0;
    MXFUID operationalPattern{};
    std::vector<MXFUID> essenceContainers;
};
// The partition pack's value (88 bytes plus 16 per essence container).
std::vector<uint8_t> partitionPackValue(const PartitionPack& p);
void writePartitionPack(ByteWriter& w, const MXFKey& key, const PartitionPack& p);

// A local set value: 2-byte tag, 2-byte length, value.
class LocalSet {
public:
    LocalSet& u8(uint16_t tag, uint8_t v);
    LocalSet& u16(uint16_t tag, uint16_t v);
    LocalSet& u32(uint16_t tag, uint32_t v);
    LocalSet& u64(uint16_t tag, uint64_t v);
    LocalSet& i64(uint16_t tag, int64_t v) { return u64(tag, uint64_t(v)); }
    LocalSet& rational(uint16_t tag, int32_t num, int32_t den);
    LocalSet& uid(uint16_t tag, const MXFUID& v);
    LocalSet& umid(uint16_t tag, const MXFUMID& v);
    LocalSet& bytes(uint16_t tag, std::span<const uint8_t> v);
    // UTF-16 big-endian text (ASCII input), optionally with trailing zero units.
    LocalSet& utf16(uint16_t tag, const std::string& text, size_t trailingZeros = 0);
    // 8-byte timestamp: year (16-bit), month, day, hour, minute, second, quarter-ms.
    LocalSet& timestamp(uint16_t tag, int year, int month, int day, int hour, int minute, int second);
    // A batch/array: 4-byte count, 4-byte element size, elements.
    LocalSet& uidBatch(uint16_t tag, const std::vector<MXFUID>& v);
    const std::vector<uint8_t>& value() const { return _w.bytes(); }

private:
    ByteWriter _w;
};

// Deterministic identifiers for generated sets: a seed string and a counter
// give a UUID (v4-shaped) so cards are reproducible.
class MXFIdentifierSource {
public:
    explicit MXFIdentifierSource(std::string seed) : _seed(std::move(seed)) {}
    MXFUID nextUID();
    MXFUMID nextUMID();

private:
    std::string _seed;
    uint64_t _counter = 0;
};

// The tracks of one header metadata: what a material package and the file's
// source package hold.
struct MXFTrackDescription {
    enum class Kind { Picture, Sound, Data, Timecode } kind = Kind::Picture;
    uint32_t trackID = 1;
    MXFKey essenceKey{};  // for the track number; zero for timecode
    int32_t editRateNum = 30000, editRateDen = 1001;
    int64_t duration = 0;
    // With MXFHeaderMetadataSpec::packagePerBodySID: the essence container
    // (body stream) the track's elements lie in, and its index stream.
    uint32_t bodySID = 0;
    uint32_t indexSID = 0;
};

struct MXFPictureDescriptor {
    MXFUID essenceContainer{};
    MXFUID codingLabel{};
    uint32_t storedWidth = 720, storedHeight = 480;
    int32_t aspectNum = 4, aspectDen = 3;
    uint8_t frameLayout = 1;  // 0 full frame, 1 separate fields
    uint32_t componentDepth = 8;
    uint32_t horizontalSubsampling = 4, verticalSubsampling = 1;
};

struct MXFSoundDescriptor {
    MXFUID essenceContainer{};
    uint32_t sampleRate = 48000;
    uint32_t channelCount = 1;
    uint32_t bitsPerSample = 16;
};

struct MXFIdentificationInfo {
    std::string companyName = "corvane";
    std::string productName = "Skarn Card Writer";
    std::string versionString = "1.0";
    int year = 2026, month = 1, day = 1, hour = 0, minute = 0, second = 0;
};

struct MXFHeaderMetadataSpec {
    MXFUID operationalPattern{};
    std::vector<MXFUID> essenceContainers;
    std::vector<MXFTrackDescription> tracks;  // the file's tracks, in order
    std::optional<MXFPictureDescriptor> picture;
    std::vector<MXFSoundDescriptor> sounds;   // one descriptor per sound track, in track order
    uint32_t bodySID = 1;
    uint32_t indexSID = 0;
    std::string packageName;                  // material package name
    MXFIdentificationInfo identification;
    uint64_t startTimecodeFrames = 0;
    uint16_t timecodeRate = 30;
    bool dropFrame = false;
    std::string seed = "skarn";               // for the identifiers
    // A file with several essence tracks (picture plus sound tracks) describes
    // them through a multiple descriptor whose sub-descriptors each name their
    // track; without it only the first descriptor is linked to the package.
    bool multipleDescriptor = false;
    // OP1b files whose tracks lie in separate essence containers (one BodySID
    // each): demuxers tie an element to its track only through the essence
    // container data of the file package the track belongs to, so every
    // container gets its own file package (holding the tracks that name its
    // bodySID; the package's descriptor describes the first of them) and its
    // own essence container data. The packages follow the order in which the
    // tracks first name them; the first also takes the timecode track.
    // multipleDescriptor, bodySID and indexSID above are then unused.
    bool packagePerBodySID = false;
};

// Primer pack plus every set of the header metadata, ready to follow the header
// partition pack.
std::vector<uint8_t> buildHeaderMetadata(const MXFHeaderMetadataSpec& params);

struct MXFIndexEntry {
    int8_t temporalOffset = 0;
    int8_t keyFrameOffset = 0;
    uint8_t flags = 0;
    uint64_t streamOffset = 0;
};

struct MXFIndexSegment {
    MXFUID instanceUID{};
    int32_t editRateNum = 30000, editRateDen = 1001;
    int64_t indexStartPosition = 0;
    int64_t indexDuration = 0;
    uint32_t editUnitByteCount = 0;  // constant-size essence (audio); 0 with entries
    uint32_t indexSID = 0;
    uint32_t bodySID = 0;
    std::vector<MXFIndexEntry> entries;  // variable-size essence (video)
};
// The index table segment's value.
std::vector<uint8_t> indexSegmentValue(const MXFIndexSegment& s);

struct MXFRIPEntry {
    uint32_t bodySID;
    uint64_t byteOffset;
};
void writeRandomIndexPack(ByteWriter& w, const std::vector<MXFRIPEntry>& entries);
