#include "DVFrameWriter.h"

#include "CardFamily.h"

#include <array>
#include <cstring>
#include <fstream>
#include <iterator>
#include <stdexcept>

size_t dvFrameSize(DVFamily family) {
    switch (family) {
    case DVFamily::DV25_411_525: return 120000;
    case DVFamily::DV25_420_625:
    case DVFamily::DVCPRO_411_625: return 144000;
    case DVFamily::DV50_525:
    case DVFamily::DV100_720_5994: return 240000;
    case DVFamily::DV50_625:
    case DVFamily::DV100_720_50: return 288000;
    case DVFamily::DV100_1080_5994: return 480000;
    case DVFamily::DV100_1080_50: return 576000;
    }
    return 0;
}

namespace {

constexpr size_t kBlock = 80;
constexpr size_t kSequence = 12000;
constexpr unsigned kBlocksPerSequence = 150;

// Section types of the DIF block ID (byte 0, bits 7-5).
enum Section : uint8_t { Header = 0, Subcode = 1, VAUX = 2, Audio = 3, Video = 4 };

struct FamilyFacts {
    bool fiftyHz;       // 625-line system (DSF set)
    unsigned channels;  // 25 Mb/s channels
    int timecodeRate;
    // STYPE of the video source pack: what a reader takes the raster and
    // sampling from, together with DSF (and, for 625-line DV25, APT).
    uint8_t signalType;
    uint8_t apt;        // application ID of the track: 0 IEC DV, 1 the 25/50/100 Mb/s professional formats
    bool progressive;
};

FamilyFacts facts(DVFamily f) {
    switch (f) {
    case DVFamily::DV25_411_525: return {false, 1, 30, 0x00, 1, false};
    case DVFamily::DV25_420_625: return {true, 1, 25, 0x00, 0, false};
    case DVFamily::DVCPRO_411_625: return {true, 1, 25, 0x00, 1, false};
    case DVFamily::DV50_525: return {false, 2, 30, 0x04, 1, false};
    case DVFamily::DV50_625: return {true, 2, 25, 0x04, 1, false};
    case DVFamily::DV100_720_5994: return {false, 2, 60, 0x18, 1, true};
    case DVFamily::DV100_720_50: return {true, 2, 50, 0x18, 1, true};
    // Both 1080-line systems share one STYPE; DSF and the 50/60 bit tell the
    // 1280-sample 59.94i raster from the 1440-sample 50i one.
    case DVFamily::DV100_1080_5994: return {false, 4, 30, 0x14, 1, false};
    case DVFamily::DV100_1080_50: return {true, 4, 25, 0x14, 1, false};
    }
    return {false, 1, 30, 0, 1, false};
}

bool isDV100(DVFamily f) { return facts(f).signalType >= 0x14; }

// The picture aspect the card states for the family (DVCPRO50 525 is shot 16:9 squeezed).
bool isWide(DVFamily f) {
    for (const CardFamily& c : cardFamilies())
        if (c.dv && c.videoFormat == int(f)) return c.aspectRatio == "16:9";
    return isDV100(f);
}

bool is720(DVFamily f) { return f == DVFamily::DV100_720_5994 || f == DVFamily::DV100_720_50; }

uint8_t bcd(unsigned v) { return uint8_t((v / 10) << 4 | (v % 10)); }

// Byte 1 of a block ID: sequence number, then FSC and FSP. Channels 0-3 of a
// DVCPRO HD frame are told apart by (FSC, FSP) = (0,1), (1,1), (0,0), (1,0); at
// 720p the two channels use FSC alone and FSP marks the frame's place in its
// frame pair instead (clear on the odd frame of the timecode's pair).
uint8_t idByte1(unsigned dseq, unsigned channel, bool is720p, bool oddOfPair) {
    unsigned fsc = channel & 1;
    unsigned fsp = is720p ? (oddOfPair ? 0 : 1) : (channel < 2 ? 1 : 0);
    return uint8_t(dseq << 4 | fsc << 3 | fsp << 2 | 0x03);
}

void blockID(uint8_t* b, Section section, uint8_t byte1, uint8_t dbn) {
    b[0] = uint8_t(section << 5 | 0x10 | 0x0F);
    b[1] = byte1;
    b[2] = dbn;
}

void put(uint8_t* at, uint8_t h, uint8_t b1, uint8_t b2, uint8_t b3, uint8_t b4) {
    at[0] = h; at[1] = b1; at[2] = b2; at[3] = b3; at[4] = b4;
}

// Pack positions of the VAUX area that readers look at first (IEC 61834,
// SMPTE 314M/370M): the video source and source-control packs sit at packs 39
// and 40 (third VAUX block, slots 9 and 10) of even DIF sequences and at packs 0
// and 1 of odd ones.
constexpr size_t kSourcePackInEvenSequence = 5 * kBlock + 3 + 5 * 9;
constexpr size_t kSourcePackInOddSequence = 3 * kBlock + 3;

// One DCT block of the placeholder picture: its DC coefficient alone (9 bits,
// two's complement), DCT mode 0 (8-8), class 0 and the end-of-block code 0110;
// the block's unused bits stay zero. A DC of d is a block of level 128 + d/2.
void putFlatBlock(uint8_t* at, uint8_t level) {
    const unsigned dc = unsigned(2 * (int(level) - 128)) & 0x1FF;
    at[0] = uint8_t(dc >> 1);
    at[1] = uint8_t((dc & 1) << 7 | 0x06);
}

// Bytes 3-79 of every video block: STA 0 (no error) and QNO 15, then the
// macroblock's DCT blocks in their fixed-size places. 25 and 50 Mb/s carry
// Y0-Y3 in 14 bytes each, then Cr and Cb in 10; 100 Mb/s carries Y0-Y3, Cr0 and
// Cr1 in 10 bytes each, then Cb0 and Cb1 in 8.
std::array<uint8_t, kBlock - 3> flatMacroblock(bool dv100) {
    std::array<uint8_t, kBlock - 3> mb{};
    mb[0] = 0x0F;
    uint8_t* at = mb.data() + 1;
    const unsigned lumaBytes = dv100 ? 10 : 14;
    for (unsigned y = 0; y < 4; ++y, at += lumaBytes) putFlatBlock(at, DVFrameWriter::kPictureY);
    for (unsigned c = 0; c < (dv100 ? 2u : 1u); ++c, at += 10) putFlatBlock(at, DVFrameWriter::kPictureCr);
    for (unsigned c = 0; c < (dv100 ? 2u : 1u); ++c, at += dv100 ? 8 : 10) putFlatBlock(at, DVFrameWriter::kPictureCb);
    return mb;
}

int64_t mod(int64_t a, int64_t m) { return ((a % m) + m) % m; }

}  // namespace

DVFrameWriter::DVFrameWriter(DVStreamSpec params) : _shape(std::move(params)) {
    const DVFamily f = _shape.family;
    switch (_shape.cadence) {
    case DVCadence::None: break;
    case DVCadence::TwentyFourInThirty:
        if (f != DVFamily::DV25_411_525 && f != DVFamily::DV50_525)
            throw std::invalid_argument("24-in-30 pulldown needs a 525-line DV25 or DV50 stream");
        if (_shape.cadencePhase > 4) throw std::invalid_argument("cadence phase must be 0-4");
        break;
    case DVCadence::TwentyFourInSixty:
        if (f != DVFamily::DV100_720_5994) throw std::invalid_argument("24-in-60 pulldown needs 720p59.94");
        if (_shape.cadencePhase > 4) throw std::invalid_argument("cadence phase must be 0-4");
        break;
    case DVCadence::HalfRate:
        if (!is720(f)) throw std::invalid_argument("half-rate shooting needs a 720p stream");
        if (_shape.cadencePhase > 1) throw std::invalid_argument("half-rate phase must be 0 or 1");
        break;
    }
    if (_shape.essenceFile.empty()) return;

    std::ifstream in(_shape.essenceFile, std::ios::binary);
    if (!in) throw std::runtime_error("cannot read DV essence file " + _shape.essenceFile);
    auto bytes = std::make_shared<std::vector<uint8_t>>(std::istreambuf_iterator<char>(in),
                                                        std::istreambuf_iterator<char>());
    const size_t size = frameSize();
    if (bytes->empty() || bytes->size() % size != 0)
        throw std::runtime_error("DV essence file " + _shape.essenceFile + " is not a whole number of " +
                                 std::to_string(size) + "-byte frames");
    // The family as a reader tells it from the first frame: DSF (525 or 625
    // lines), the video source pack's STYPE and, for 625-line DV25, APT (4:2:0
    // IEC DV or 4:1:1). Packs are not rewritten, so a file of another family
    // would be read as that family.
    const FamilyFacts ff = facts(f);
    const uint8_t* first = bytes->data();
    const bool dsf = (first[3] & 0x80) != 0;
    const uint8_t* vs = first + kSourcePackInEvenSequence;
    bool matches = first[0] >> 5 == Header && dsf == ff.fiftyHz && vs[0] == 0x60 && (vs[3] & 0x1F) == ff.signalType;
    if (ff.signalType == 0 && ff.fiftyHz) matches = matches && ((first[4] & 0x07) != 0) == (ff.apt != 0);
    if (!matches)
        throw std::runtime_error("DV essence file " + _shape.essenceFile + " does not match the stream's family");
    _essenceFrames = bytes->size() / size;
    _essence = std::move(bytes);
}

int DVFrameWriter::timecodeRate() const { return facts(_shape.family).timecodeRate; }
unsigned DVFrameWriter::channelCount() const { return facts(_shape.family).channels; }
unsigned DVFrameWriter::sequenceCount() const { return unsigned(frameSize() / kSequence); }

int DVFrameWriter::shootingRate() const {
    if (_shape.shootingRate > 0) return _shape.shootingRate;
    switch (_shape.cadence) {
    case DVCadence::TwentyFourInThirty:
    case DVCadence::TwentyFourInSixty: return 24;
    case DVCadence::HalfRate: return timecodeRate() / 2;
    case DVCadence::None: return 0;
    }
    return 0;
}

unsigned DVFrameWriter::cadencePosition(uint64_t index) const {
    switch (_shape.cadence) {
    case DVCadence::TwentyFourInThirty:
    case DVCadence::TwentyFourInSixty: return unsigned((_shape.cadencePhase + index) % 5);
    case DVCadence::HalfRate: return unsigned((_shape.cadencePhase + index) % 2);
    case DVCadence::None: return 0;
    }
    return 0;
}

bool DVFrameWriter::isRepeatFrameSigned(int64_t index) const {
    switch (_shape.cadence) {
    case DVCadence::TwentyFourInThirty: return mod(_shape.cadencePhase + index, 5) == 2;
    case DVCadence::TwentyFourInSixty: {
        // A shown twice, B three times: keep-drop-keep-drop-drop.
        int64_t pos = mod(_shape.cadencePhase + index, 5);
        return pos != 0 && pos != 2;
    }
    case DVCadence::HalfRate: return mod(_shape.cadencePhase + index, 2) == 1;
    case DVCadence::None: return false;
    }
    return false;
}

bool DVFrameWriter::isRepeatFrame(uint64_t index) const { return isRepeatFrameSigned(int64_t(index)); }

std::vector<uint8_t> DVFrameWriter::frame(uint64_t index) const {
    std::vector<uint8_t> f(frameSize());
    writeFrame(index, f.data());
    return f;
}

void DVFrameWriter::writeFrame(uint64_t index, uint8_t* out) const {
    if (_essence) {
        std::memcpy(out, _essence->data() + (index % _essenceFrames) * frameSize(), frameSize());
        writePacks(index, out, false);
    } else {
        writePlaceholder(index, out);
        writePacks(index, out, true);
    }
}

// The frame's structure with silent audio and a flat picture: every block in
// the order of the DV standards (header, two subcode, three VAUX, then nine
// times one audio block and fifteen video blocks).
void DVFrameWriter::writePlaceholder(uint64_t index, uint8_t* out) const {
    const FamilyFacts ff = facts(_shape.family);
    const unsigned sequences = sequenceCount();
    const unsigned perChannel = sequences / ff.channels;
    const bool hd720 = is720(_shape.family);
    const bool oddOfPair = ((_shape.startTimecodeFrames + index) & 1) != 0;
    const std::array<uint8_t, kBlock - 3> macroblock = flatMacroblock(isDV100(_shape.family));
    // Video source: no channel number, colour; 50/60 and STYPE. Source control:
    // copy free, 4:3 or 16:9 (DISP 000/010), both fields, field 1 first
    // (readers take that as bottom field first at 525/625 lines, top field
    // first at 1080), interlaced but at 720p.
    const uint8_t vs[5] = {0x60, 0xFF, 0xFF, uint8_t(0xC0 | (ff.fiftyHz ? 0x20 : 0) | ff.signalType), 0xFF};
    const uint8_t vsc[5] = {0x61, 0x3F, uint8_t(isWide(_shape.family) ? 0xCA : 0xC8),
                            uint8_t(ff.progressive ? 0xEC : 0xFC), 0xFF};
    std::memset(out, 0xFF, frameSize());
    for (unsigned s = 0; s < sequences; ++s) {
        uint8_t* seq = out + s * kSequence;
        const unsigned channel = s / perChannel, dseq = s % perChannel;
        const uint8_t id1 = idByte1(dseq, channel, hd720, oddOfPair);

        uint8_t* h = seq;
        blockID(h, Header, id1, 0);
        h[3] = uint8_t((ff.fiftyHz ? 0x80 : 0x00) | 0x3F);  // DSF
        h[4] = uint8_t(0xF8 | ff.apt);                       // APT
        for (int i = 5; i < 8; ++i) h[i] = uint8_t(0x78 | ff.apt);  // TF1-3 (valid) and AP1-3

        for (unsigned b = 0; b < 2; ++b) {
            uint8_t* sc = seq + (1 + b) * kBlock;
            blockID(sc, Subcode, id1, uint8_t(b));
            for (unsigned k = 0; k < 6; ++k) {
                // Sync block ID: FR set in the first half of the channel's sequences.
                sc[3 + 8 * k] = uint8_t((dseq < perChannel / 2 ? 0x80 : 0x00) | 0x0F);
                sc[4 + 8 * k] = uint8_t(0xF0 | (b * 6 + k));
            }
        }
        for (unsigned b = 0; b < 3; ++b) blockID(seq + (3 + b) * kBlock, VAUX, id1, uint8_t(b));
        uint8_t* source = seq + (dseq % 2 == 0 ? kSourcePackInEvenSequence : kSourcePackInOddSequence);
        std::memcpy(source, vs, 5);
        std::memcpy(source + 5, vsc, 5);

        for (unsigned a = 0; a < 9; ++a) {
            uint8_t* au = seq + (6 + 16 * a) * kBlock;
            blockID(au, Audio, id1, uint8_t(a));
            // The audio source pack sits in audio block 3 of even sequences and 0
            // of odd ones; 48 kHz, 16-bit, two channels, locked, emphasis off.
            if (a == (dseq % 2 == 0 ? 3u : 0u)) {
                const uint8_t afSize = ff.fiftyHz ? 24 : 20;  // 1920 - 1896, 1600 - 1580 samples
                put(au + 3, 0x50, uint8_t(0x40 | afSize), 0x80, uint8_t(0xC0 | (ff.fiftyHz ? 0x20 : 0)), 0xC0);
            }
            std::memset(au + 8, 0, kBlock - 8);
            for (unsigned v = 0; v < 15; ++v) {
                uint8_t* vi = au + (1 + v) * kBlock;
                blockID(vi, Video, id1, uint8_t(a * 15 + v));
                std::memcpy(vi + 3, macroblock.data(), macroblock.size());
            }
        }
    }
}

// Timecode, binary-group / variable-frame-rate and shooting-rate packs, written
// the same way into placeholder frames and into frames from an essence file.
void DVFrameWriter::writePacks(uint64_t index, uint8_t* out, bool ownsWholeFrame) const {
    const FamilyFacts ff = facts(_shape.family);
    const bool hd720 = is720(_shape.family);
    const unsigned sequences = sequenceCount();
    const uint64_t tcCount = _shape.startTimecodeFrames + index;
    const bool oddOfPair = (tcCount & 1) != 0;

    // 720p timecode counts frame pairs; the block IDs' FSP bit tells the frames
    // of a pair apart. An essence file's frames do not know their pair, so the
    // bit is rewritten in every block.
    if (hd720 && !ownsWholeFrame) {
        for (unsigned s = 0; s < sequences; ++s)
            for (unsigned b = 0; b < kBlocksPerSequence; ++b) {
                uint8_t& id1 = out[s * kSequence + b * kBlock + 1];
                id1 = uint8_t((id1 & ~0x04) | (oddOfPair ? 0 : 0x04));
            }
    }

    // Timecode pack.
    const int tcRate = hd720 ? ff.timecodeRate / 2 : ff.timecodeRate;
    uint64_t n = hd720 ? tcCount / 2 : tcCount;
    const bool df = _shape.dropFrame && tcRate == 30;
    if (df) {
        // Frame count to drop-frame display count: frames 0 and 1 of every minute
        // but each tenth are skipped.
        uint64_t d = n / 17982, m = n % 17982;
        n += 18 * d + (m >= 2 ? 2 * ((m - 2) / 1798) : 0);
    }
    const unsigned frames = unsigned(n % tcRate);
    const unsigned seconds = unsigned(n / tcRate % 60);
    const unsigned minutes = unsigned(n / tcRate / 60 % 60);
    const unsigned hours = unsigned(n / tcRate / 3600 % 24);
    uint8_t tc[5] = {0x13, uint8_t((df ? 0x40 : 0) | bcd(frames)), uint8_t(0x80 | bcd(seconds)),
                     uint8_t(0x80 | bcd(minutes)), uint8_t(0xC0 | bcd(hours))};

    // Binary group pack; for the 720p cadences the variable-frame-rate pack. Both
    // frames of a pair carry the same pack: bit 1 says the even frame is a new
    // picture, bit 0 the odd one.
    uint8_t bg[5] = {0x14, 0x00, 0x00, 0x00, 0x00};
    const int shoot = shootingRate();
    if (hd720 && _shape.cadence != DVCadence::None) {
        const int64_t evenIndex = int64_t(index) - (oddOfPair ? 1 : 0);
        uint8_t b1 = 0x50;
        if (!isRepeatFrameSigned(evenIndex)) b1 |= 0x02;
        if (!isRepeatFrameSigned(evenIndex + 1)) b1 |= 0x01;
        const uint16_t pair = uint16_t(tcCount / 2);
        bg[1] = b1;
        bg[2] = bcd(unsigned(shoot) % 100);
        bg[3] = uint8_t(pair);
        bg[4] = uint8_t(pair >> 8);
    }

    // Shooting-rate pack: frame-based rate, no repeat mark (low bits 01); for
    // 24-in-30 the mode nibble counts the cadence position.
    uint8_t sr[5] = {0x64, 0xA1, bcd(unsigned(shoot) % 100),
                     uint8_t(0xF0 | (_shape.cadence == DVCadence::TwentyFourInThirty ? cadencePosition(index) : 0)),
                     0};
    sr[4] = uint8_t(uint8_t(sr[1] + sr[2] + sr[3]) ^ 0x55);

    for (unsigned s = 0; s < sequences; ++s) {
        uint8_t* seq = out + s * kSequence;
        for (unsigned b = 0; b < 2; ++b) {
            uint8_t* sc = seq + (1 + b) * kBlock;
            for (unsigned k = 0; k < 6; ++k) {
                uint8_t* p = sc + 6 + 8 * k;
                sc[5 + 8 * k] = 0xFF;
                std::memcpy(p, k % 2 == 0 ? tc : bg, 5);
            }
        }
        if (shoot > 0) {
            for (unsigned b = 0; b < 3; ++b) std::memcpy(seq + (3 + b) * kBlock + 3 + 5 * 4, sr, 5);
        }
    }
}
