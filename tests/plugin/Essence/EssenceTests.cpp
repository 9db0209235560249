// DV pack extraction, pulldown classification and H.264 length prefixes.
#include "DVFrameData.h"
#include "DVFrameWriter.h"
#include "H264Reference.h"
#include "SkarnH264.h"
#include "SkarnPulldown.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <random>
#include <tuple>
#include <vector>

namespace {

// A frame of n sequences whose every byte is 0xFF: no pack header matches.
std::vector<uint8_t> blankFrame(unsigned sequences = 10) { return std::vector<uint8_t>(sequences * 12000, 0xFF); }
uint8_t* block(std::vector<uint8_t>& f, unsigned seq, unsigned b) { return f.data() + seq * 12000 + b * 80; }
uint8_t* subcodePack(std::vector<uint8_t>& f, unsigned seq, unsigned b, unsigned k) { return block(f, seq, b) + 6 + 8 * k; }
uint8_t* vauxPack(std::vector<uint8_t>& f, unsigned seq, unsigned b, unsigned k) { return block(f, seq, b) + 3 + 5 * k; }
void setPack(uint8_t* at, std::initializer_list<uint8_t> bytes) { std::copy(bytes.begin(), bytes.end(), at); }
void setNibble(std::vector<uint8_t>& f, unsigned seq, unsigned b, uint8_t nibble) {
    block(f, seq, b)[1] = uint8_t((block(f, seq, b)[1] & 0xF0) | nibble);
}
std::array<uint8_t, 5> shootingPack(uint8_t b1, uint8_t rateBCD, uint8_t b3) {
    return {0x64, b1, rateBCD, b3, DVShootingRateCheckByte(b1, rateBCD, b3)};
}
// Places a shooting-rate pack (VAUX sequence 0, block 3, pack 0 by default).
void putShooting(std::vector<uint8_t>& f, uint8_t b1, uint8_t rateBCD, uint8_t b3, unsigned seq = 0,
                 unsigned b = 3, unsigned k = 0) {
    auto pack = shootingPack(b1, rateBCD, b3);
    std::copy(pack.begin(), pack.end(), vauxPack(f, seq, b, k));
}

struct TC {
    int32_t total = -1, h = -1, m = -1, s = -1, f = -1;
    uint8_t df = 0xEE;
};
TC readTC(std::vector<uint8_t>& frame, int32_t rate, uint8_t dfRequest = 0, uint32_t seq = 1,
          const uint8_t* replacement = nullptr) {
    TC t;
    EXPECT_EQ(0, DVExtractTimeCodeFromFrame(frame, seq, dfRequest, rate, replacement, &t.total, &t.h, &t.m, &t.s,
                                            &t.f, &t.df));
    return t;
}

}  // namespace

// ---------------------------------------------------------------------------

TEST(DVTimeCode, LastFrameOfTheDayAndRolloverRejected) {
    auto frame = blankFrame();
    setPack(subcodePack(frame, 0, 1, 0), {0x13, 0x00, 0x00, 0x00, 0x24});  // 24:00:00:00, out of range
    setPack(subcodePack(frame, 0, 1, 3), {0x13, 0x29, 0x59, 0x59, 0x23});  // 23:59:59:29
    TC t = readTC(frame, 30);
    EXPECT_EQ(std::make_tuple(2591999, 23, 59, 59, 29, uint8_t(0)), std::tie(t.total, t.h, t.m, t.s, t.f, t.df));

    // Only the out-of-range pack: nothing is written.
    auto lone = blankFrame();
    setPack(subcodePack(lone, 0, 2, 0), {0x13, 0x00, 0x00, 0x00, 0x24});
    TC none = readTC(lone, 30);
    EXPECT_EQ(-1, none.total);
    EXPECT_EQ(0xEE, none.df);
}

TEST(DVTimeCode, RateSixtyDoublesFramesWithThePairNibble) {
    auto frame = blankFrame(20);
    setPack(subcodePack(frame, 0, 1, 0), {0x13, 0x12, 0x00, 0x00, 0x00});
    // The nibble counts only at rate 60.
    const struct {
        uint8_t nibble;
        int32_t rate, frames;
    } cases[] = {{3, 60, 25}, {11, 60, 25}, {7, 60, 24}, {15, 60, 24}, {3, 30, 12}};
    for (const auto& c : cases) {
        SCOPED_TRACE(testing::Message() << "nibble " << int(c.nibble) << " rate " << c.rate);
        setNibble(frame, 0, 1, c.nibble);
        TC t = readTC(frame, c.rate);
        EXPECT_EQ(c.frames, t.f);
        EXPECT_EQ(c.frames, t.total);
    }
}

TEST(DVTimeCode, DropFrameOnlyWhenAskedAtThirty) {
    auto frame = blankFrame();
    setPack(subcodePack(frame, 0, 1, 0), {0x13, 0x40, 0x00, 0x10, 0x00});  // 00:10:00;00
    TC t = readTC(frame, 30, 1);
    EXPECT_EQ(17982, t.total);
    EXPECT_EQ(1, t.df);
    EXPECT_EQ(18000, readTC(frame, 30, 0).total);  // not asked for
    EXPECT_EQ(0, readTC(frame, 30, 2).df);          // compared with 1 exactly
    setPack(subcodePack(frame, 0, 1, 0), {0x13, 0x42, 0x00, 0x01, 0x00});  // 00:01:00;02
    EXPECT_EQ(1800, readTC(frame, 30, 1).total);
    EXPECT_EQ(0, readTC(frame, 25, 1).df);
}

TEST(DVTimeCode, SequenceChoiceBlockTwoAndReplacement) {
    auto frame = blankFrame();
    setPack(subcodePack(frame, 3, 2, 8), {0x13, 0x05, 0x01, 0x00, 0x00});  // last of nine positions
    EXPECT_EQ(-1, readTC(frame, 25, 0, 1).total);
    EXPECT_EQ(30, readTC(frame, 25, 0, 4).total);
    EXPECT_EQ(-1, readTC(frame, 25, 0, 0).total);           // no sequence 0
    EXPECT_EQ(-1, readTC(frame, 25, 0, 11).total);          // past the frame
    EXPECT_EQ(-1, readTC(frame, 25, 0, 0xFFFFFFFF).total);  // far past it

    const uint8_t replacement[5] = {0x13, 0x01, 0x00, 0x00, 0x00};
    EXPECT_EQ(30, readTC(frame, 25, 0, 4, replacement).total);  // values of the pack found
    EXPECT_EQ(1, readTC(frame, 25, 0, 4).total);                // which is now replaced
}

TEST(DVShootingRate, BadCheckByteSkippedForTheNextGoodPack) {
    auto frame = blankFrame();
    putShooting(frame, 0x80, 0x30, 0x01, 0, 3, 14);
    vauxPack(frame, 0, 3, 14)[4] ^= 1;
    putShooting(frame, 0xC0, 0x24, 0xF3, 0, 4, 0);
    int32_t rate = -1, mode = -1, flags = -1;
    EXPECT_EQ(0, DVExtractShootingRateFromFrame(frame, 1, 0, 30, nullptr, &rate, &mode, &flags));
    EXPECT_EQ(std::make_tuple(24, 3, int32_t(kDVShootingRateFlagFrames | kDVShootingRateFlagBit5Clear |
                                             kDVShootingRateFlag2332)),
              std::tie(rate, mode, flags));
}

TEST(DVShootingRate, SequenceCountBoundsTheWalk) {
    auto frame = blankFrame();
    putShooting(frame, 0x20, 0x60, 0x00, 2, 5, 7);
    int32_t rate = -1, flags = -1;
    DVExtractShootingRateFromFrame(frame, 0, 0, 0, nullptr, &rate, nullptr, &flags);
    EXPECT_EQ(-1, rate);
    DVExtractShootingRateFromFrame(frame, 2, 0, 0, nullptr, &rate, nullptr, &flags);
    EXPECT_EQ(-1, rate);
    DVExtractShootingRateFromFrame(frame, 1000, 0, 0, nullptr, &rate, nullptr, &flags);  // stops at the frame's end
    EXPECT_EQ(60, rate);
    EXPECT_EQ(0, flags);  // bit 7 clear: a field rate; bit 5 set

    const uint8_t replacement[5] = {0x64, 0, 0, 0, 0x55};
    DVExtractShootingRateFromFrame(frame, 3, 0, 0, replacement, &rate, nullptr, nullptr);
    EXPECT_EQ(60, rate);
    EXPECT_EQ(0, std::memcmp(vauxPack(frame, 2, 5, 7), replacement, 5));
}

TEST(DVVFRInfo, FlagsFollowTheFramesPlaceInItsPair) {
    auto frame = blankFrame(20);
    setPack(subcodePack(frame, 0, 1, 1), {0x14, 0x5A, 0x24, 0x34, 0x12});  // bits 1 and 3 set
    struct Case {
        uint8_t nibble;
        int32_t flags;
    } cases[] = {{7, 1 | 2}, {15, 1 | 2}, {3, 1 | 4}, {11, 1 | 4}};
    for (const Case& c : cases) {
        setNibble(frame, 0, 1, c.nibble);
        int32_t rate = -1, count = -1, state = -1, flags = -1;
        DVExtractVFRInfoFromFrame(frame, 1, 0, 60, nullptr, &rate, &count, &state, &flags);
        EXPECT_EQ(std::make_tuple(24, 0x1234, 1), std::tie(rate, count, state));  // state: bits 2-3 = 2
        EXPECT_EQ(c.flags, flags) << int(c.nibble);
    }
    setPack(subcodePack(frame, 0, 1, 1), {0x14, 0x01, 0x24, 0, 0});
    int32_t rate = -1, state = -1, flags = -1;
    DVExtractVFRInfoFromFrame(frame, 1, 0, 60, nullptr, &rate, nullptr, &state, &flags);
    EXPECT_EQ(2, state);
    EXPECT_EQ(4 | 2, flags);  // first of pair (nibble 11), bit 0
    setPack(subcodePack(frame, 0, 1, 1), {0x14, 0x00, 0x24, 0, 0});
    DVExtractVFRInfoFromFrame(frame, 1, 0, 60, nullptr, &rate, nullptr, &state, nullptr);
    EXPECT_EQ(0, rate);  // no flags byte, no rate
}

TEST(DVFrameType, LookupsByCodeAndByNumber) {
    int32_t bytes = 0, type = 0, rate = 0;
    uint8_t is60 = 9;
    EXPECT_EQ(0, DVCULookupFrameType(DVFourCC("dvc "), 0, &bytes, &type, &rate, &is60));
    // Type 6 shares the code and is never found this way.
    EXPECT_EQ(std::make_tuple(2, 120000, 30, uint8_t(1)), std::tie(type, bytes, rate, is60));
    EXPECT_EQ(0, DVCULookupFrameType(DVFourCC("dvhq"), DVFourCC("krst"), &bytes, &type, nullptr, nullptr));
    EXPECT_EQ(9, type);
    EXPECT_EQ(-3, DVCULookupFrameType(DVFourCC("dvhq"), DVFourCC("xxxx"), nullptr, nullptr, nullptr, nullptr));
    EXPECT_EQ(-3, DVCULookupFrameType(DVFourCC("avc1"), 0, nullptr, nullptr, nullptr, nullptr));
    EXPECT_EQ(-2, DVCULookupFrameType(0, 0, nullptr, nullptr, nullptr, nullptr));

    FourCharCode subtype = 0, vendor = 0;
    int32_t rateClass = 0, sequences = 0;
    EXPECT_EQ(0, DVCULookupFrameTypeInfo(6, &bytes, &rate, &is60, &rateClass, &sequences, &subtype, &vendor));
    EXPECT_EQ(std::make_tuple(DVFourCC("dvc "), DVFourCC("krst"), 10), std::tie(subtype, vendor, sequences));
    EXPECT_EQ(0, DVCULookupFrameTypeInfo(8, nullptr, &rate, nullptr, &rateClass, &sequences, nullptr, nullptr));
    EXPECT_EQ(std::make_tuple(60, 50, 20), std::tie(rate, rateClass, sequences));
    EXPECT_EQ(-2, DVCULookupFrameTypeInfo(14, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr));
    EXPECT_EQ(-2, DVCULookupFrameTypeInfo(1, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr));
    for (const auto& row : kDVFrameTypeTable) EXPECT_EQ(size_t(row.bytesPerFrame), row.sequences * 12000u);
}

// ---------------------------------------------------------------------------

TEST(DVDataElement, ArgumentsAndRecordAllocation) {
    auto frame = blankFrame();
    OwnedRecord record;
    EXPECT_EQ(-2, DVCUExtractDataElementFromFrame(2, 0, {}, 5, &record, 0));
    EXPECT_EQ(-2, DVCUExtractDataElementFromFrame(2, 0, frame, 5, nullptr, 0));
    EXPECT_EQ(-2, DVCUExtractDataElementFromFrame(14, 0, frame, 5, &record, 0));
    EXPECT_EQ(-2, DVCUExtractDataElementFromFrame(2, 0, frame, 5, &record, 2));  // caller record missing
    EXPECT_EQ(-3, DVCUExtractDataElementFromFrame(2, DVFourCC("xxxx"), frame, 5, &record, 0));
    EXPECT_EQ(-2, DVCUExtractDataElementFromFrame(2, 0, frame, 8, &record, 0));
    EXPECT_FALSE(record);

    // Missing: 128 zero-filled bytes, and no pack is no error.
    EXPECT_EQ(0, DVCUExtractDataElementFromFrame(2, 0, frame, 5, &record, 0));
    ASSERT_EQ(128u, record.getPtrSize());
    EXPECT_EQ(0, DVCURecordRead<DVShootingRateRecord>(record.bytes()).tag);
    // Present: resized for the element.
    EXPECT_EQ(0, DVCUExtractDataElementFromFrame(2, 0, frame, 7, &record, 0));
    EXPECT_EQ(sizeof(DVVFRRecord), record.getPtrSize());
    // Caller-supplied and too small for the element.
    OwnedRecord small = OwnedRecord::newPtrClear(12);
    EXPECT_EQ(-2, DVCUExtractDataElementFromFrame(2, 0, frame, 5, &small, 3));
    EXPECT_EQ(12u, small.getPtrSize());
}

TEST(DVDataElement, ShootingRateRecordCountsPacksAndReadsRepeatMarks) {
    auto frame = blankFrame();
    auto pack = shootingPack(0xA1, 0x24, 0xF2);
    for (unsigned seq : {0u, 4u}) std::copy(pack.begin(), pack.end(), vauxPack(frame, seq, 3, 4));
    auto bad = pack;
    bad[4] ^= 0xFF;
    std::copy(bad.begin(), bad.end(), vauxPack(frame, 6, 5, 0));  // ignored: not counted
    OwnedRecord record;
    ASSERT_EQ(0, DVCUExtractDataElementFromFrame(2, 0, frame, 5, &record, 0));
    auto r = DVCURecordRead<DVShootingRateRecord>(record.bytes());
    EXPECT_EQ(std::make_tuple(0x2005, 2, 24, 2, int32_t(kDVShootingRateFlagFrames | kDVShootingRateFlag23)),
              std::make_tuple(int(r.tag), int(r.count), r.rate, r.mode, r.flags));

    // The repeat mark by byte 1 and the block's pair state p.
    struct Case {
        uint8_t b1, rate, nibble;  // nibble 7: p 0; 15: p 1; 3: p 2
        bool mark;
    } cases[] = {
        {0x02, 0x24, 7, true},  {0x02, 0x24, 15, false}, {0x00, 0x24, 15, true}, {0x00, 0x24, 7, false},
        {0x12, 0x24, 7, false}, {0x80, 0x30, 7, true},   {0x81, 0x30, 7, false}, {0x83, 0x30, 7, true},
        {0x42, 0x24, 7, false}, {0xC3, 0x24, 3, true},   {0xC1, 0x24, 3, false},
    };
    for (const Case& c : cases) {
        auto f = blankFrame(1);
        putShooting(f, c.b1, c.rate, 0);
        setNibble(f, 0, 3, c.nibble);
        OwnedRecord rec = OwnedRecord::newPtrClear(128);
        ASSERT_EQ(0, DVCUExtractDataElementFromFrame(2, 0, f, 5, &rec, 3));
        EXPECT_EQ(c.mark, (DVCURecordRead<DVShootingRateRecord>(rec.bytes()).flags & 16) != 0)
            << std::hex << int(c.b1) << " nibble " << int(c.nibble);
    }
}

TEST(DVDataElement, VFRRecordFlags) {
    struct Case {
        uint8_t b1, rate, nibble;
        int32_t flags;
    } cases[] = {
        {0x52, 0x24, 7, 1 | 2}, {0x51, 0x24, 7, 1},      {0x51, 0x24, 3, 1 | 4 | 2}, {0x52, 0x24, 11, 1 | 4},
        {0x00, 0x00, 7, 2},     {0x00, 0x00, 3, 4 | 2},  {0x02, 0x24, 7, 2},          {0x30, 0x24, 7, 0},
    };
    for (const Case& c : cases) {
        auto f = blankFrame(20);
        setPack(subcodePack(f, 0, 2, 5), {0x14, c.b1, c.rate, 0x02, 0x01});
        setNibble(f, 0, 2, c.nibble);
        OwnedRecord rec;
        ASSERT_EQ(0, DVCUExtractDataElementFromFrame(8, 0, f, 7, &rec, 0));
        auto r = DVCURecordRead<DVVFRRecord>(rec.bytes());
        EXPECT_EQ(c.flags, r.flags) << std::hex << int(c.b1) << " nibble " << int(c.nibble);
        EXPECT_EQ(std::make_tuple(0x2007, 1, 0x0102, c.b1), std::make_tuple(int(r.tag), int(r.count), r.frameCount,
                                                                            r.flagsByte));
    }
}

TEST(DVDataElement, EveryDecoderRoundTrips) {
    // Packs as the DV standards fill them (reserved bits set) read back unchanged.
    const std::array<uint8_t, 5> packs[] = {
        {0x61, 0x3F, 0xCA, 0xEC, 0xFF}, {0x60, 0x23, 0xE1, 0xD8, 0x07}, {0x50, 0xD4, 0xAB, 0xE5, 0x4A},
        {0x13, 0x59, 0xD9, 0x45, 0x63}, {0x14, 0x12, 0x34, 0x56, 0x78},
    };
    const int32_t elements[] = {1, 2, 3, 4, 6};
    for (size_t i = 0; i < 5; ++i) {
        std::array<uint8_t, 5> pack = packs[i], rebuilt{};
        OwnedRecord rec = OwnedRecord::newPtrClear(128);
        ASSERT_EQ(0, DVCUCodeDataElement(elements[i], pack, rec.bytes(), 0, 0));
        EXPECT_EQ(DVElementTag(elements[i]), DVCURecordRead<DVSourceRecord>(rec.bytes()).tag);
        ASSERT_EQ(0, DVCUCodeDataElement(elements[i], rebuilt, rec.bytes(), 0, 1));
        EXPECT_EQ(pack, rebuilt) << "element " << elements[i];
    }
    // Elements 5 and 7 from records, for every pair state.
    auto roundTrip = [](int32_t element, const auto& in, int32_t p) {
        std::array<uint8_t, 5> pack{};
        OwnedRecord rec = OwnedRecord::newPtrClear(128), out = OwnedRecord::newPtrClear(128);
        DVCURecordWrite(rec.bytes(), in);
        EXPECT_EQ(0, DVCUCodeDataElement(element, pack, rec.bytes(), p, 1));
        EXPECT_EQ(0, DVCUCodeDataElement(element, pack, out.bytes(), p, 0));
        return DVCURecordRead<std::decay_t<decltype(in)>>(out.bytes());
    };
    for (int32_t p = 0; p < 4; ++p) {
        SCOPED_TRACE(testing::Message() << "p " << p);
        for (int32_t flags : {1 | 4, 1 | 8, 1 | 4 | 16, 2 | 4, 1 | 2 | 8 | 16}) {
            auto r = roundTrip(5, DVShootingRateRecord{0x2005, 1, 0, 24, 3, flags}, p);
            EXPECT_EQ(std::make_tuple(flags, 3, 24), std::tie(r.flags, r.mode, r.rate));
        }
        for (int32_t flags : {1, 1 | 2}) {
            DVVFRRecord in{0x2007, 1, 0, 24, 777, 1, flags | (p >= 2 ? 4 : 0), 0};
            auto r = roundTrip(7, in, p);
            EXPECT_EQ(std::make_tuple(in.flags, 777, 1), std::tie(r.flags, r.frameCount, r.framePairState));
        }
    }
    std::array<uint8_t, 5> pack{};
    DVVFRRecord other{0x2007, 1, 0, 50, 5, 0, 1, 0};
    OwnedRecord rec = OwnedRecord::newPtrClear(128);
    DVCURecordWrite(rec.bytes(), other);
    DVCUCodeDataElement(7, pack, rec.bytes(), 0, 1);
    EXPECT_EQ(0x60, pack[2]);  // rates other than 24, 30 and 60 are written as 60
    EXPECT_EQ(-2, DVCUCodeDataElement(5, pack, rec.bytes().first(10), 0, 0));
    EXPECT_EQ(-2, DVCUCodeDataElement(9, pack, rec.bytes(), 0, 0));
}

// ---------------------------------------------------------------------------

namespace {

CMBlockBufferRef blockBufferWith(const std::vector<uint8_t>& bytes) {
    void* memory = std::malloc(bytes.size());
    std::memcpy(memory, bytes.data(), bytes.size());
    CMBlockBufferRef buffer;
    EXPECT_EQ(0, CMBlockBufferCreateWithMemoryBlock(kCFAllocatorDefault, memory, bytes.size(), kCFAllocatorDefault,
                                                    nullptr, 0, bytes.size(), 0, &buffer));
    return buffer;
}

DVStreamSpec streamSpec(DVFamily family, DVCadence cadence, unsigned phase, uint64_t start = 0) {
    DVStreamSpec params;
    params.family = family;
    params.cadence = cadence;
    params.cadencePhase = phase;
    params.startTimecodeFrames = start;
    return params;
}

struct Analysis {
    int32_t status;
    bool dropped;
    uint32_t sequence;
};
Analysis analyze(const std::vector<uint8_t>& frame, const char (&subtype)[5], int32_t shootingRate) {
    uint8_t dropped = 0xEE;
    uint32_t sequence = 0xEEEE;
    int32_t status = SkarnAnalyzePulldown(blockBufferWith(frame), DVFourCC(subtype), "clip.MXF", shootingRate,
                                          &dropped, &sequence);
    EXPECT_LE(dropped, 1);
    return {status, dropped == 1, sequence};
}

}  // namespace

TEST(Pulldown, FramesThatAreNotAnalysed) {
    auto frame = blankFrame();
    putShooting(frame, 0xA1, 0x24, 0xF2);  // would be a drop frame
    Analysis a = analyze(frame, "avc1", 24);
    EXPECT_EQ(std::make_tuple(0, false, 0u), std::tie(a.status, a.dropped, a.sequence));
    EXPECT_FALSE(analyze(frame, "dvh5", 24).dropped);  // 1080i50 DVCPRO HD is not looked at

    uint8_t dropped = 0xEE;
    uint32_t sequence = 0xEEEE;
    EXPECT_EQ(0, SkarnAnalyzePulldown(nullptr, DVFourCC("dvc "), nullptr, 24, &dropped, &sequence));
    EXPECT_EQ(0, dropped);
    EXPECT_EQ(0u, sequence);

    // A block buffer whose memory cannot be had: its status and the defaults.
    CMBlockBufferCustomBlockSource failing;
    failing.AllocateBlock = [](void*, size_t) -> void* { return nullptr; };
    CMBlockBufferRef buffer;
    ASSERT_EQ(0, CMBlockBufferCreateWithMemoryBlock(nullptr, nullptr, 120000, nullptr, &failing, 0, 120000, 0, &buffer));
    dropped = 0xEE;
    EXPECT_EQ(kCMBlockBufferBlockAllocationFailedErr,
              SkarnAnalyzePulldown(buffer, DVFourCC("dvc "), nullptr, 24, &dropped, nullptr));
    EXPECT_EQ(0, dropped);
}

TEST(Pulldown, DV25ShootingRatePackModeIsTheSequence) {
    // Without the frame-rate bit, or at another rate, no cadence is read; a
    // repeat-marked pack is kept and starts the process-wide mark.
    const struct {
        uint8_t b1, rate, b3;
        bool dropped;
        uint32_t sequence;
    } cases[] = {{0xA1, 0x24, 0xF2, true, 2}, {0xA1, 0x24, 0xF3, false, 3}, {0x21, 0x24, 0xF2, false, 0},
                 {0xA1, 0x30, 0xF2, false, 0}, {0x80, 0x24, 0xF2, false, 0}};
    auto frame = blankFrame();
    for (const auto& c : cases) {
        SCOPED_TRACE(testing::Message() << std::hex << int(c.b1) << " " << int(c.rate) << " " << int(c.b3));
        putShooting(frame, c.b1, c.rate, c.b3);
        Analysis a = analyze(frame, "dvc ", 30);
        EXPECT_EQ(c.dropped, a.dropped);
        EXPECT_EQ(c.sequence, a.sequence);
    }
    EXPECT_TRUE(SkarnPulldownRepeatMarkSeen());
}

TEST(Pulldown, UnmarkedDVCPROHDFrames) {
    auto frame = blankFrame(20);  // no packs at all
    EXPECT_TRUE(analyze(frame, "dvhp", 24).dropped);
    EXPECT_TRUE(analyze(frame, "dvh6", 24).dropped);
    EXPECT_TRUE(analyze(frame, "dvhq", 24).dropped);
    // Otherwise "dvhp" answers the process-wide mark (set by any marked frame).
    auto marked = blankFrame(20);
    setPack(subcodePack(marked, 0, 1, 0), {0x14, 0x52, 0x30, 0, 0});
    EXPECT_FALSE(analyze(marked, "dvhp", 30).dropped);
    ASSERT_TRUE(SkarnPulldownRepeatMarkSeen());
    EXPECT_TRUE(analyze(frame, "dvhp", 30).dropped);
    EXPECT_FALSE(analyze(frame, "dvhq", 25).dropped);
    EXPECT_FALSE(analyze(frame, "dvh6", 30).dropped);
}

// Every row of the cadence table, from frames the card writer makes.
TEST(Pulldown, CardWriterCadencesClassifyAsTheTableSays) {
    // A marked 720p frame first, so that the half-rate drop frames of "dvhp" read
    // as dropped whatever ran before.
    DVFrameWriter primer(streamSpec(DVFamily::DV100_720_5994, DVCadence::HalfRate, 0));
    analyze(primer.frame(0), "dvhp", 30);

    for (const SkarnCadence& row : kSkarnCadenceTable) {
        const struct Stream {
            SkarnCadenceRecording recording;
            DVFamily family;
            DVCadence cadence;
            const char* subtype;
            int32_t shootingRate;
        } streams[] = {
            {SkarnCadenceRecording::TwentyFourInThirty, DVFamily::DV25_411_525, DVCadence::TwentyFourInThirty, "dvc ",
             24},
            {SkarnCadenceRecording::TwentyFourInSixty, DVFamily::DV100_720_5994, DVCadence::TwentyFourInSixty, "dvhp",
             24},
            {SkarnCadenceRecording::HalfRate, DVFamily::DV100_720_5994, DVCadence::HalfRate, "dvhp", 30}};
        const Stream& stream = *std::find_if(std::begin(streams), std::end(streams),
                                             [&](const Stream& s) { return s.recording == row.recording; });
        for (uint64_t start : {0u, 1u}) {  // both frame-pair alignments
            DVFrameWriter writer(streamSpec(stream.family, stream.cadence, row.index, start));
            uint8_t pattern = 0;
            uint32_t firstSequence = 99;
            for (uint64_t i = 0; i < row.length; ++i) {
                auto frame = writer.frame(i);
                char subtype[5];
                std::memcpy(subtype, stream.subtype, 5);
                uint8_t dropped = 0;
                uint32_t sequence = 0;
                EXPECT_EQ(0, SkarnAnalyzePulldown(blockBufferWith(frame), DVFourCC(subtype), nullptr,
                                                  stream.shootingRate, &dropped, &sequence));
                EXPECT_EQ(writer.isRepeatFrame(i), dropped == 1);
                if (i == 0) firstSequence = sequence;
                pattern = uint8_t(pattern << 1 | (dropped ? 0 : 1));
            }
            EXPECT_EQ(row.pattern, pattern) << row.name << " start " << start;
            const SkarnCadence* found = SkarnCadenceLookup(pattern, row.length);
            ASSERT_NE(nullptr, found);
            EXPECT_EQ(row.index, found->index);
            if (row.recording == SkarnCadenceRecording::TwentyFourInThirty) {
                EXPECT_EQ(row.index, firstSequence);
            }
        }
    }
}

TEST(Pulldown, HalfRate50IsNeverDropped) {
    DVFrameWriter writer(streamSpec(DVFamily::DV100_720_50, DVCadence::HalfRate, 1));
    ASSERT_TRUE(writer.isRepeatFrame(0));
    EXPECT_FALSE(analyze(writer.frame(0), "dvhq", 25).dropped);
}

TEST(Pulldown, CadenceTableAndDropSequences) {
    const struct {
        uint8_t pattern;
        uint32_t length;
        double shift;
    } shifts[] = {{0x0f, 5, 0.5}, {0x1d, 5, -0.25}, {0x05, 5, 2.0}, {0x1, 2, 1.0}, {0x1f, 5, 0.0}};
    for (const auto& c : shifts) EXPECT_EQ(c.shift, SkarnCadenceFrameShift(c.pattern, c.length)) << int(c.pattern);
    EXPECT_EQ(nullptr, SkarnCadenceLookup(0x2, 5));
    // Shared constants: the same storage every time.
    const std::pair<SkarnCadenceRecording, std::span<const uint8_t>> sequences[] = {
        {SkarnCadenceRecording::TwentyFourInThirty, kSkarnTwentyFourInThirtyDropSequence},
        {SkarnCadenceRecording::TwentyFourInSixty, kSkarnTwentyFourInSixtyDropSequence},
        {SkarnCadenceRecording::HalfRate, kSkarnHalfRateDropSequence}};
    for (const auto& [recording, constant] : sequences) {
        EXPECT_EQ(constant.data(), SkarnCadenceDropSequence(recording).data());
        EXPECT_EQ(constant.size(), SkarnCadenceDropSequence(recording).size());
    }
}

// ---------------------------------------------------------------------------

namespace {

struct H264Result {
    std::vector<uint8_t> bytes;
    std::vector<ptrdiff_t> pointers;  // offsets of the noted parameter sets
    std::vector<uint64_t> sizes;
    uint32_t count;
};
H264Result convert(std::vector<uint8_t> bytes) {
    const uint8_t* pointers[8] = {};
    uint64_t sizes[8] = {};
    uint32_t count = 0;
    SkarnH264ReplaceStartCodesWithLengthCodes(bytes.data(), int64_t(bytes.size()), pointers, sizes, &count);
    H264Result r{bytes, {}, {}, count};
    for (auto* p : pointers)
        if (p) r.pointers.push_back(p - bytes.data() - 0);
    r.sizes.assign(sizes, sizes + 8);
    return r;
}


}  // namespace

TEST(H264, TheTwentyOneByteAccessUnitLastParameterSetAndShortAndOddBuffers) {
    using Bytes = std::vector<uint8_t>;
    const struct {
        const char* name;
        Bytes in, out;
        uint32_t count;
        std::vector<ptrdiff_t> pointers;
        std::vector<uint64_t> sizes;
    } cases[] = {
        {"twenty-one-byte access unit",
         {0, 0, 0, 1, 0x67, 0xA, 0xB, 0, 0, 0, 1, 0x68, 0xC, 0, 0, 0, 1, 0x65, 0xD, 0xE, 0xF},
         {0, 0, 0, 3, 0x67, 0xA, 0xB, 0, 0, 0, 2, 0x68, 0xC, 0, 0, 0, 4, 0x65, 0xD, 0xE, 0xF}, 2, {4, 11}, {3, 2}},
        // The last parameter set is pointed to but not sized.
        {"last parameter set", {0, 0, 0, 1, 0x67, 0xA, 0xB}, {0, 0, 0, 3, 0x67, 0xA, 0xB}, 0, {4}, {0}},
        {"four bytes", {0, 0, 0, 1}, {0, 0, 0, 0}, 0, {}, {}},
        {"too short: left alone", {1, 2, 3}, {1, 2, 3}, 0, {}, {}},
        {"start code in the last four bytes is not seen", {0, 0, 0, 1, 0x65, 0, 0, 0, 1},
         {0, 0, 0, 5, 0x65, 0, 0, 0, 1}, 0, {}, {}},
        {"no leading start code: the first four bytes become a length all the same",
         {9, 9, 9, 9, 9, 9, 0, 0, 0, 1, 0x41, 7}, {0, 0, 0, 2, 9, 9, 0, 0, 0, 2, 0x41, 7}, 0, {}, {}},
        {"a three-byte start code does not split the unit", {0, 0, 0, 1, 0x65, 1, 0, 0, 1, 0x67, 2},
         {0, 0, 0, 7, 0x65, 1, 0, 0, 1, 0x67, 2}, 0, {}, {}},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        H264Result r = convert(c.in);
        EXPECT_EQ(c.out, r.bytes);
        EXPECT_EQ(c.count, r.count);
        EXPECT_EQ(c.pointers, r.pointers);
        for (size_t i = 0; i < c.sizes.size(); ++i) EXPECT_EQ(c.sizes[i], r.sizes[i]);
    }
}

TEST(H264, OnlyEightParameterSetsAreNoted) {
    std::vector<uint8_t> au;
    for (int i = 0; i < 10; ++i) au.insert(au.end(), {0, 0, 0, 1, uint8_t(i % 2 ? 0x68 : 0x67), uint8_t(i), 0xAA});
    au.insert(au.end(), {0, 0, 0, 1, 0x65, 0x88, 0x80});
    H264Result r = convert(au);
    EXPECT_EQ(8u, r.count);
    ASSERT_EQ(8u, r.pointers.size());
    for (int i = 0; i < 8; ++i) {
        EXPECT_EQ(i * 7 + 4, r.pointers[i]);
        EXPECT_EQ(3u, r.sizes[i]);
    }
    for (size_t at = 0; at < au.size(); at += 7) EXPECT_EQ(3, r.bytes[at + 3]);
}

TEST(H264, MatchesTheByteByByteConversion) {
    std::mt19937 rng(1234);
    for (int round = 0; round < 3000; ++round) {
        // Mostly zeros and ones so that start codes, near-misses and overlaps abound.
        std::vector<uint8_t> bytes(4 + rng() % 200);
        for (auto& b : bytes) {
            unsigned r = rng() % 10;
            b = r < 5 ? 0 : r < 7 ? 1 : r < 8 ? 0x67 : r < 9 ? 0x68 : uint8_t(rng());
        }
        std::vector<uint8_t> expected = bytes;
        const uint8_t* ep[8] = {};
        uint64_t es[8] = {};
        uint32_t ec = 0;
        referenceReplaceStartCodes(expected, ep, es, &ec);
        const uint8_t* ap[8] = {};
        uint64_t as[8] = {};
        uint32_t ac = 0;
        SkarnH264ReplaceStartCodesWithLengthCodes(bytes.data(), int64_t(bytes.size()), ap, as, &ac);
        ASSERT_EQ(expected, bytes) << "round " << round;
        ASSERT_EQ(ec, ac);
        for (int i = 0; i < 8; ++i) {
            ASSERT_EQ(ep[i] ? ep[i] - expected.data() : -1, ap[i] ? ap[i] - bytes.data() : -1);
            ASSERT_EQ(es[i], as[i]);
        }
    }
}

// ---------------------------------------------------------------------------

// Random bytes of every DV frame size (and of cut-off sizes) through every
// reader; under ASan this proves no read strays outside the frame.
TEST(DVRobustness, RandomFramesOfEverySize) {
    std::mt19937 rng(99);
    std::vector<size_t> sizes;
    for (const auto& row : kDVFrameTypeTable) sizes.push_back(size_t(row.bytesPerFrame));
    for (size_t s : {size_t(1), size_t(79), size_t(80), size_t(241), size_t(11999), size_t(12000), size_t(12081),
                     size_t(119999)})
        sizes.push_back(s);
    const char* subtypes[] = {"dvc ", "dv5n", "dvhp", "dvhq", "dvh6", "dvh3", "dvh2"};
    for (size_t size : sizes) {
        for (int round = 0; round < 3; ++round) {
            // Exact-size heap copies, so that ASan sees the frame's real end.
            std::vector<uint8_t> frame(size);
            for (auto& b : frame) {
                unsigned r = rng() % 8;
                b = r == 0 ? 0x13 : r == 1 ? 0x14 : r == 2 ? 0x64 : r == 3 ? 0x50 : uint8_t(rng());
            }
            for (uint32_t seq : {0u, 1u, 2u, 40u, 49u, 0xFFFFFFFFu}) {
                int32_t v[6];
                uint8_t df;
                DVExtractTimeCodeFromFrame(frame, seq, 1, 60, nullptr, &v[0], &v[1], &v[2], &v[3], &v[4], &df);
                DVExtractTimeCodeFromFrame(frame, seq, 1, 30, nullptr, &v[0], &v[1], &v[2], &v[3], &v[4], &df);
                DVExtractVFRInfoFromFrame(frame, seq, 0, 0, nullptr, &v[0], &v[1], &v[2], &v[3]);
                DVExtractShootingRateFromFrame(frame, seq, 0, 0, nullptr, &v[0], &v[1], &v[2]);
            }
            for (int32_t type = 2; type <= 13; ++type)
                for (int32_t element = 1; element <= 7; ++element) {
                    OwnedRecord rec;
                    EXPECT_EQ(0, DVCUExtractDataElementFromFrame(type, 0, frame, element, &rec, 0));
                }
            for (const char* st : subtypes) {
                uint8_t dropped;
                uint32_t sequence;
                char code[5];
                std::memcpy(code, st, 5);
                SkarnAnalyzePulldown(blockBufferWith(frame), DVFourCC(code), nullptr, 24, &dropped, &sequence);
            }
        }
    }
}

// ---------------------------------------------------------------------------

TEST(CMBlockBuffer, ViewsCopiesAndBadArguments) {
    std::vector<uint8_t> bytes(100);
    for (size_t i = 0; i < bytes.size(); ++i) bytes[i] = uint8_t(i);
    CMBlockBufferRef buffer;
    ASSERT_EQ(0, CMBlockBufferCreateWithMemoryBlock(nullptr, bytes.data(), 100, kCFAllocatorNull, nullptr, 10, 50, 0,
                                                    &buffer));
    EXPECT_EQ(50u, CMBlockBufferGetDataLength(buffer));
    char* data = nullptr;
    size_t atOffset = 0, total = 0;
    ASSERT_EQ(0, CMBlockBufferGetDataPointer(buffer, 5, &atOffset, &total, &data));
    EXPECT_EQ(15, data[0]);
    EXPECT_EQ(45u, atOffset);
    EXPECT_EQ(50u, total);
    EXPECT_EQ(kCMBlockBufferBadOffsetParameterErr, CMBlockBufferGetDataPointer(buffer, 50, &atOffset, &total, &data));
    EXPECT_EQ(nullptr, data);
    uint8_t out[4];
    EXPECT_EQ(0, CMBlockBufferCopyDataBytes(buffer, 46, 4, out));
    EXPECT_EQ(59, out[3]);
    EXPECT_EQ(kCMBlockBufferBadLengthParameterErr, CMBlockBufferCopyDataBytes(buffer, 47, 4, out));
    EXPECT_TRUE(CMBlockBufferIsRangeContiguous(buffer, 0, 0));
    EXPECT_FALSE(CMBlockBufferIsRangeContiguous(buffer, 10, 41));
    EXPECT_EQ(kCMBlockBufferBadLengthParameterErr,
              CMBlockBufferCreateWithMemoryBlock(nullptr, bytes.data(), 100, kCFAllocatorNull, nullptr, 60, 50, 0,
                                                 &buffer));
    EXPECT_FALSE(buffer);
    EXPECT_EQ(kCMBlockBufferBadPointerParameterErr, CMBlockBufferGetDataPointer(nullptr, 0, nullptr, nullptr, &data));

    // The block is given back through the custom source when the last ref goes.
    static int freed = 0;
    CMBlockBufferCustomBlockSource source;
    source.AllocateBlock = [](void*, size_t n) { return std::calloc(1, n); };
    source.FreeBlock = [](void*, void* block, size_t) {
        ++freed;
        std::free(block);
    };
    {
        CMBlockBufferRef owned;
        ASSERT_EQ(0, CMBlockBufferCreateWithMemoryBlock(nullptr, nullptr, 64, nullptr, &source, 0, 64,
                                                        kCMBlockBufferAssureMemoryNowFlag, &owned));
        CMBlockBufferRef second = owned;
    }
    EXPECT_EQ(1, freed);
}
