#include "CFData.h"
#include "CMFormatDescription.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <limits>
#include <vector>

namespace {

std::vector<uint8_t> hexBytes(const char* hex) {
    std::vector<uint8_t> out;
    for (size_t i = 0; hex[i] && hex[i + 1]; i += 2) out.push_back(uint8_t(std::stoi(std::string(hex + i, 2), nullptr, 16)));
    return out;
}

OSStatus createH264(const std::vector<std::vector<uint8_t>>& sets, int nalLength, CMFormatDescriptionRef* out) {
    std::vector<const uint8_t*> pointers;
    std::vector<size_t> sizes;
    for (const auto& s : sets) {
        pointers.push_back(s.data());
        sizes.push_back(s.size());
    }
    return CMVideoFormatDescriptionCreateFromH264ParameterSets(kCFAllocatorDefault, sets.size(), pointers.data(),
                                                               sizes.data(), nalLength, out);
}

std::vector<uint8_t> avcCOf(const CMFormatDescriptionRef& desc) {
    auto bytes = valueDataBytes(
        CMFormatDescriptionGetExtension(desc, kCMFormatDescriptionExtension_SampleDescriptionExtensionAtoms)["avcC"]);
    return {bytes.begin(), bytes.end()};
}

// Parameter sets from streams made with the ffmpeg tool (libx264, one frame).
struct H264Case {
    const char* name;
    const char* sps;
    const char* pps;
    int32_t width, height;
    int fieldCount;
    int64_t sarH, sarV;  // 0: no aspect ratio in the stream
    int fullRange;       // -1: not signalled
    std::vector<uint8_t> highProfileTail;  // chroma format / bit depth bytes of the record, if any
};

const H264Case kH264Cases[] = {
    {"Qcif444", "67f4000b919b28589d80880000030008000003019078a14cb0", "68ebe3c44844", 176, 144, 1, 1, 1, -1,
     {0xFF, 0xF8, 0xF8, 0x00}},
    // 1088 coded lines cropped by 8 (crop unit 2 for 4:2:0 frames).
    {"HD420Cropped", "67640028acd940780227e5c044000003000400000300c83c60c658", "68ebe3cb3002c0", 1920, 1080, 1, 1, 1,
     -1, {0xFD, 0xF8, 0xF8, 0x00}},
    {"Baseline720", "6742c01fd9005005bb011000000300100000030320f1832480", "68cb83cb20", 1280, 720, 1, 1, 1, -1, {}},
    // Scaling matrices in the sequence set, 4:2:2 10-bit, field coded.
    {"IntraClass100Interlaced",
     "677a1029b6d420223319c6632321011198ce33191821033a46656a6524ade91232141a2634ada441822301502b1a24694830402e11120"
     "8c68c0441284c34f01e0113f2e022000007d20001d4c108",
     "68ce3348d0", 1920, 1080, 2, 1, 1, -1, {0xFE, 0xFA, 0xFA, 0x00}},
    // 4:2:0 10-bit with scaling matrices, 1440 wide with a 4:3 sample aspect.
    {"IntraClass50Anamorphic",
     "676e1028a6d42032330c7118886210191986388c44302102564e6e61873e734d980c03069c0b73e6c0b518630d39e05b02d4c6191a798"
     "c323424f0168113f7870800001f480007530420",
     "68ee311211", 1440, 1080, 2, 4, 3, -1, {0xFD, 0xFA, 0xFA, 0x00}},
    {"FullRange422", "677a0028b6cd9405a044fcb8736400000fa40003a9807c58b658", "68fba3cb22c0", 1440, 1080, 2, 4, 3, 1,
     {0xFE, 0xFA, 0xFA, 0x00}},
    {"ExtendedSAR", "6764000bacd942c4effc001c001440000003004000000c83c50a6580", "68ebe3cb22c0", 176, 144, 1, 7, 5, -1,
     {0xFD, 0xF8, 0xF8, 0x00}},
};

AudioStreamBasicDescription pcm16(UInt32 channels, bool nonInterleaved = false) {
    UInt32 flags = kAudioFormatFlagIsSignedInteger | kAudioFormatFlagIsPacked |
                   (nonInterleaved ? UInt32(kAudioFormatFlagIsNonInterleaved) : 0u);
    UInt32 frame = nonInterleaved ? 2 : 2 * channels;
    return {48000, kAudioFormatLinearPCM, flags, frame, 1, frame, channels, 16, 0};
}

}  // namespace

TEST(CMFormatDescription, VideoDescriptionKeepsCodecDimensionsAndExtensions) {
    Dictionary extensions{
        {kCMFormatDescriptionExtension_FieldCount, 2},
        {kCMFormatDescriptionExtension_FieldDetail, kCMFormatDescriptionFieldDetail_TemporalBottomFirst},
        {kCMFormatDescriptionExtension_PixelAspectRatio,
         Dictionary{{kCMFormatDescriptionKey_PixelAspectRatioHorizontalSpacing, 10},
                    {kCMFormatDescriptionKey_PixelAspectRatioVerticalSpacing, 11}}},
    };
    CMVideoFormatDescriptionRef desc;
    ASSERT_EQ(CMVideoFormatDescriptionCreate(kCFAllocatorDefault, kCMVideoCodecType_DVCNTSC, 720, 480, &extensions,
                                             &desc),
              noErr);
    EXPECT_EQ(CMFormatDescriptionGetMediaType(desc), kCMMediaType_Video);
    EXPECT_EQ(CMFormatDescriptionGetMediaSubType(desc), FourCC("dvc "));
    EXPECT_EQ(CMVideoFormatDescriptionGetDimensions(desc).width, 720);
    EXPECT_EQ(CMVideoFormatDescriptionGetDimensions(desc).height, 480);
    EXPECT_EQ(CMFormatDescriptionGetExtension(desc, "CVFieldCount").integerValue(), 2);
    EXPECT_EQ(CMFormatDescriptionGetExtension(desc, kCMFormatDescriptionExtension_PixelAspectRatio)["VerticalSpacing"]
                  .integerValue(),
              11);
    EXPECT_TRUE(CMFormatDescriptionGetExtension(desc, "Missing").isNull());
    // Changing the caller's dictionary afterwards changes nothing.
    extensions.set(kCMFormatDescriptionExtension_FieldCount, 1);
    EXPECT_EQ(CMFormatDescriptionGetExtension(desc, kCMFormatDescriptionExtension_FieldCount).integerValue(), 2);
    std::string text = desc->description();
    EXPECT_NE(text.find("'vide'"), std::string::npos) << text;
    EXPECT_NE(text.find("'dvc '"), std::string::npos) << text;
    EXPECT_NE(text.find("720 x 480"), std::string::npos) << text;
    EXPECT_NE(text.find("TemporalBottomFirst"), std::string::npos) << text;

    CMVideoFormatDescriptionRef same, other, bare;
    ASSERT_EQ(CMVideoFormatDescriptionCreate(nullptr, kCMVideoCodecType_DVCNTSC, 720, 480, desc->extensions().empty()
                                                 ? nullptr : &desc->extensions(), &same), noErr);
    ASSERT_EQ(CMVideoFormatDescriptionCreate(nullptr, kCMVideoCodecType_DVCNTSC, 720, 486, &desc->extensions(), &other),
              noErr);
    ASSERT_EQ(CMVideoFormatDescriptionCreate(nullptr, kCMVideoCodecType_DVCNTSC, 720, 480, nullptr, &bare), noErr);
    EXPECT_TRUE(CMFormatDescriptionEqual(desc, same));
    EXPECT_FALSE(CMFormatDescriptionEqual(desc, other));
    EXPECT_FALSE(CMFormatDescriptionEqual(desc, bare));
    EXPECT_FALSE(CMFormatDescriptionEqual(desc, nullptr));
    EXPECT_EQ(CMFormatDescriptionGetExtensions(bare), nullptr);
    ASSERT_NE(CMFormatDescriptionGetExtensions(desc), nullptr);
    EXPECT_EQ(CMFormatDescriptionGetExtensions(desc)->size(), 3u);
}

TEST(CMFormatDescription, NullAndWrongKindArgumentsAnswerDefaults) {
    CMFormatDescriptionRef desc;
    EXPECT_EQ(CMVideoFormatDescriptionCreate(nullptr, kCMVideoCodecType_H264, 16, 16, nullptr, nullptr),
              kCMFormatDescriptionError_InvalidParameter);
    EXPECT_EQ(CMVideoFormatDescriptionCreate(nullptr, kCMVideoCodecType_H264, -1, 16, nullptr, &desc),
              kCMFormatDescriptionError_InvalidParameter);
    EXPECT_FALSE(desc);
    EXPECT_EQ(CMFormatDescriptionGetMediaType(nullptr), 0u);
    EXPECT_EQ(CMFormatDescriptionGetExtensions(nullptr), nullptr);
    EXPECT_TRUE(CMFormatDescriptionGetExtension(nullptr, "x").isNull());
    EXPECT_FALSE(CMFormatDescriptionEqual(nullptr, nullptr));
    EXPECT_EQ(CMVideoFormatDescriptionGetDimensions(nullptr).width, 0);

    ASSERT_EQ(CMTimeCodeFormatDescriptionCreate(nullptr, kCMTimeCodeFormatType_Counter32, CMTimeMake(1001, 30000), 30,
                                                0, nullptr, &desc),
              noErr);
    EXPECT_EQ(CMVideoFormatDescriptionGetDimensions(desc).height, 0);
    EXPECT_EQ(CMAudioFormatDescriptionGetStreamBasicDescription(desc), nullptr);
    size_t size = 99;
    EXPECT_EQ(CMAudioFormatDescriptionGetChannelLayout(desc, &size), nullptr);
    EXPECT_EQ(size, 0u);
    EXPECT_EQ(CMAudioFormatDescriptionGetMagicCookie(nullptr, &size), nullptr);
    int nalLength = 9;
    EXPECT_EQ(CMVideoFormatDescriptionGetH264ParameterSetAtIndex(desc, 0, nullptr, nullptr, nullptr, &nalLength),
              kCMFormatDescriptionError_InvalidParameter);
    EXPECT_EQ(nalLength, 0);
}

class CMFormatDescriptionH264 : public testing::TestWithParam<H264Case> {};

TEST_P(CMFormatDescriptionH264, GeometryAndAvcCRecordFromTheParameterSets) {
    const H264Case& c = GetParam();
    auto sps = hexBytes(c.sps), pps = hexBytes(c.pps);
    CMFormatDescriptionRef desc;
    // The picture set first: order in the call does not matter.
    ASSERT_EQ(createH264({pps, sps}, 4, &desc), noErr);
    EXPECT_EQ(CMFormatDescriptionGetMediaSubType(desc), kCMVideoCodecType_H264);
    CMVideoDimensions dims = CMVideoFormatDescriptionGetDimensions(desc);
    EXPECT_EQ(dims.width, c.width);
    EXPECT_EQ(dims.height, c.height);
    EXPECT_EQ(CMFormatDescriptionGetExtension(desc, kCMFormatDescriptionExtension_FieldCount).integerValue(),
              c.fieldCount);
    const Value& par = CMFormatDescriptionGetExtension(desc, kCMFormatDescriptionExtension_PixelAspectRatio);
    EXPECT_EQ(par[kCMFormatDescriptionKey_PixelAspectRatioHorizontalSpacing].integerValue(), c.sarH);
    EXPECT_EQ(par[kCMFormatDescriptionKey_PixelAspectRatioVerticalSpacing].integerValue(), c.sarV);
    const Value& range = CMFormatDescriptionGetExtension(desc, kCMFormatDescriptionExtension_FullRangeVideo);
    EXPECT_EQ(range.isNull() ? -1 : int(range.integerValue()), c.fullRange);

    std::vector<uint8_t> expected = {1, sps[1], sps[2], sps[3], 0xFF, 0xE1, 0, uint8_t(sps.size())};
    expected.insert(expected.end(), sps.begin(), sps.end());
    expected.insert(expected.end(), {1, 0, uint8_t(pps.size())});
    expected.insert(expected.end(), pps.begin(), pps.end());
    expected.insert(expected.end(), c.highProfileTail.begin(), c.highProfileTail.end());
    EXPECT_EQ(avcCOf(desc), expected);

    size_t count = 0, size = 0;
    int nalLength = 0;
    const uint8_t* p = nullptr;
    ASSERT_EQ(CMVideoFormatDescriptionGetH264ParameterSetAtIndex(desc, 1, &p, &size, &count, &nalLength), noErr);
    EXPECT_EQ(count, 2u);
    EXPECT_EQ(nalLength, 4);
    EXPECT_EQ(std::vector<uint8_t>(p, p + size), pps);
    ASSERT_EQ(CMVideoFormatDescriptionGetH264ParameterSetAtIndex(desc, 0, &p, &size, nullptr, nullptr), noErr);
    EXPECT_EQ(std::vector<uint8_t>(p, p + size), sps);
    EXPECT_EQ(CMVideoFormatDescriptionGetH264ParameterSetAtIndex(desc, 2, &p, &size, &count, nullptr),
              kCMFormatDescriptionError_InvalidParameter);
    EXPECT_EQ(count, 2u);
    EXPECT_EQ(p, nullptr);
}

INSTANTIATE_TEST_SUITE_P(FromX264, CMFormatDescriptionH264, testing::ValuesIn(kH264Cases),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(CMFormatDescription, H264NalLengthAndParameterSetCountsAreChecked) {
    auto sps = hexBytes(kH264Cases[0].sps), pps = hexBytes(kH264Cases[0].pps);
    CMFormatDescriptionRef desc;
    for (int nalLength : {0, 3, 8}) EXPECT_EQ(createH264({sps, pps}, nalLength, &desc), kCMFormatDescriptionError_InvalidParameter);
    ASSERT_EQ(createH264({sps, pps}, 2, &desc), noErr);
    EXPECT_EQ(avcCOf(desc)[4], 0xFD);
    EXPECT_EQ(createH264({sps}, 4, &desc), kCMFormatDescriptionError_InvalidParameter);
    EXPECT_EQ(createH264({pps, pps}, 4, &desc), kCMFormatDescriptionError_InvalidParameter);
    EXPECT_FALSE(desc);
    // Zero bytes between a set and the next start code stay with the set, as
    // the start-code conversion sizes them; they do not disturb the parse.
    auto padded = sps;
    padded.insert(padded.end(), {0, 0});
    ASSERT_EQ(createH264({padded, pps}, 4, &desc), noErr);
    EXPECT_EQ(CMVideoFormatDescriptionGetDimensions(desc).width, 176);
    // An access unit delimiter is no parameter set.
    EXPECT_EQ(createH264({sps, pps, {0x09, 0xF0}}, 4, &desc), kCMFormatDescriptionError_InvalidParameter);
    // Two picture sets both go into the record, the first sequence set decides.
    ASSERT_EQ(createH264({sps, pps, hexBytes("68ce3348d0")}, 4, &desc), noErr);
    size_t count = 0;
    EXPECT_EQ(CMVideoFormatDescriptionGetH264ParameterSetAtIndex(desc, 0, nullptr, nullptr, &count, nullptr), noErr);
    EXPECT_EQ(count, 3u);

    const uint8_t* pointers[2] = {sps.data(), nullptr};
    size_t sizes[2] = {sps.size(), pps.size()};
    EXPECT_EQ(CMVideoFormatDescriptionCreateFromH264ParameterSets(nullptr, 2, pointers, sizes, 4, &desc),
              kCMFormatDescriptionError_InvalidParameter);
    pointers[1] = pps.data();
    sizes[1] = 0;
    EXPECT_EQ(CMVideoFormatDescriptionCreateFromH264ParameterSets(nullptr, 2, pointers, sizes, 4, &desc),
              kCMFormatDescriptionError_InvalidParameter);
    EXPECT_EQ(CMVideoFormatDescriptionCreateFromH264ParameterSets(nullptr, 2, nullptr, sizes, 4, &desc),
              kCMFormatDescriptionError_InvalidParameter);
    EXPECT_EQ(CMVideoFormatDescriptionCreateFromH264ParameterSets(nullptr, 2, pointers, sizes, 4, nullptr),
              kCMFormatDescriptionError_InvalidParameter);
}

// Every prefix of a real sequence set is parsed from its own exactly-sized
// allocation, so the address sanitizer sees any read past the end. A prefix
// either fails or still holds everything the description needs.
TEST(CMFormatDescription, TruncatedSequenceParameterSetsAreRefusedWithoutOverreading) {
    for (const H264Case& c : kH264Cases) {
        SCOPED_TRACE(c.name);
        auto sps = hexBytes(c.sps), pps = hexBytes(c.pps);
        size_t firstAccepted = 0;
        for (size_t n = 1; n <= sps.size(); ++n) {
            std::vector<uint8_t> prefix(sps.begin(), sps.begin() + n);
            CMFormatDescriptionRef desc;
            if (createH264({prefix, pps}, 4, &desc) != noErr) {
                EXPECT_FALSE(desc);
                continue;
            }
            if (!firstAccepted) firstAccepted = n;
            EXPECT_EQ(CMVideoFormatDescriptionGetDimensions(desc).width, c.width);
            EXPECT_EQ(CMVideoFormatDescriptionGetDimensions(desc).height, c.height);
        }
        // The geometry lies past the first eight bytes in every one of them.
        EXPECT_GT(firstAccepted, 8u);
        EXPECT_LE(firstAccepted, sps.size());
    }
}

TEST(CMFormatDescription, HostileSequenceParameterSetsAreRefused) {
    auto pps = hexBytes(kH264Cases[0].pps);
    CMFormatDescriptionRef desc;
    const char* hostile[] = {
        "67",                            // header alone
        "6742c01f",                      // no id
        "6742c01f0000000000000000",      // exp-Golomb with more than 31 leading zeros
        "e742c01fd9005005bb0110",        // forbidden bit set
        // 4:2:0 baseline, one macroblock, cropped by 8 chroma units (16 lines).
        "6742c01ffbfc4a",
        // pic_width_in_mbs_minus1 = 5000.
        "6742c01ff8002713c8",
    };
    for (const char* hex : hostile)
        EXPECT_EQ(createH264({hexBytes(hex), pps}, 4, &desc), kCMFormatDescriptionError_InvalidParameter) << hex;

    // Emulation-prevention bytes are removed before parsing: the baseline set
    // with its 00 00 03 sequences still gives 1280 x 720.
    auto sps = hexBytes(kH264Cases[2].sps);
    ASSERT_EQ(createH264({sps, pps}, 4, &desc), noErr);
    EXPECT_EQ(CMVideoFormatDescriptionGetDimensions(desc).height, 720);

    // Pseudo-random bodies behind a sequence set header: any answer but a crash.
    uint32_t seed = 12345;
    for (int round = 0; round < 2000; ++round) {
        std::vector<uint8_t> junk(4 + round % 40);
        junk[0] = 0x67;
        junk[1] = round % 2 ? 100 : 66;
        for (size_t i = 2; i < junk.size(); ++i) {
            seed = seed * 1103515245u + 12345u;
            junk[i] = uint8_t(seed >> 16);
        }
        if (createH264({junk, pps}, 4, &desc) == noErr) {
            EXPECT_GT(CMVideoFormatDescriptionGetDimensions(desc).width, 0);
            EXPECT_GT(CMVideoFormatDescriptionGetDimensions(desc).height, 0);
        }
    }
}

TEST(CMFormatDescription, AudioDescriptionCopiesStreamLayoutAndCookie) {
    AudioStreamBasicDescription asbd = pcm16(2);
    AudioChannelLayout layout{};
    layout.mChannelLayoutTag = kAudioChannelLayoutTag_Stereo;
    const uint8_t cookie[] = {1, 2, 3};
    CMAudioFormatDescriptionRef desc;
    ASSERT_EQ(CMAudioFormatDescriptionCreate(nullptr, &asbd, sizeof layout, &layout, sizeof cookie, cookie, nullptr,
                                             &desc),
              noErr);
    asbd.mSampleRate = 1;
    layout.mChannelLayoutTag = 0;
    EXPECT_EQ(CMFormatDescriptionGetMediaType(desc), kCMMediaType_Audio);
    EXPECT_EQ(CMFormatDescriptionGetMediaSubType(desc), kAudioFormatLinearPCM);
    const AudioStreamBasicDescription* stored = CMAudioFormatDescriptionGetStreamBasicDescription(desc);
    ASSERT_NE(stored, nullptr);
    EXPECT_EQ(stored->mSampleRate, 48000);
    EXPECT_EQ(stored->mBytesPerFrame, 4u);
    size_t size = 0;
    const AudioChannelLayout* storedLayout = CMAudioFormatDescriptionGetChannelLayout(desc, &size);
    ASSERT_NE(storedLayout, nullptr);
    EXPECT_EQ(size, sizeof(AudioChannelLayout));
    EXPECT_EQ(storedLayout->mChannelLayoutTag, kAudioChannelLayoutTag_Stereo);
    auto* storedCookie = static_cast<const uint8_t*>(CMAudioFormatDescriptionGetMagicCookie(desc, &size));
    ASSERT_EQ(size, 3u);
    EXPECT_EQ(storedCookie[2], 3);
    EXPECT_NE(desc->description().find("sampleRate:48000"), std::string::npos) << desc->description();

    // Descriptions of two mono channels: the layout says which channel.
    AudioStreamBasicDescription mono = pcm16(1);
    AudioChannelLayout left{kAudioChannelLayoutTag_UseChannelDescriptions, 0, 1,
                            {{kAudioChannelLabel_Discrete_0, kAudioChannelFlags_AllOff, {0, 0, 0}}}};
    AudioChannelLayout right = left;
    right.mChannelDescriptions[0].mChannelLabel = kAudioChannelLabel_Discrete_1;
    CMAudioFormatDescriptionRef a, b, a2;
    ASSERT_EQ(CMAudioFormatDescriptionCreate(nullptr, &mono, sizeof left, &left, 0, nullptr, nullptr, &a), noErr);
    ASSERT_EQ(CMAudioFormatDescriptionCreate(nullptr, &mono, sizeof right, &right, 0, nullptr, nullptr, &b), noErr);
    ASSERT_EQ(CMAudioFormatDescriptionCreate(nullptr, &mono, sizeof left, &left, 0, nullptr, nullptr, &a2), noErr);
    EXPECT_FALSE(CMFormatDescriptionEqual(a, b));
    EXPECT_TRUE(CMFormatDescriptionEqual(a, a2));
}

TEST(CMFormatDescription, AudioDescriptionRefusesImpossibleStreams) {
    struct Bad {
        const char* what;
        AudioStreamBasicDescription asbd;
    };
    AudioStreamBasicDescription base = pcm16(2);
    auto with = [&](auto change) {
        AudioStreamBasicDescription a = base;
        change(a);
        return a;
    };
    const Bad bad[] = {
        {"zero rate", with([](auto& a) { a.mSampleRate = 0; })},
        {"negative rate", with([](auto& a) { a.mSampleRate = -48000; })},
        {"NaN rate", with([](auto& a) { a.mSampleRate = std::numeric_limits<double>::quiet_NaN(); })},
        {"infinite rate", with([](auto& a) { a.mSampleRate = std::numeric_limits<double>::infinity(); })},
        {"no channels", with([](auto& a) { a.mChannelsPerFrame = 0; })},
        {"bits wider than the frame", with([](auto& a) { a.mBitsPerChannel = 24; })},
        {"no bytes per frame", with([](auto& a) { a.mBytesPerFrame = a.mBytesPerPacket = 0; })},
        {"two frames per packet", with([](auto& a) { a.mFramesPerPacket = 2; })},
    };
    CMAudioFormatDescriptionRef desc;
    for (const auto& b : bad)
        EXPECT_EQ(CMAudioFormatDescriptionCreate(nullptr, &b.asbd, 0, nullptr, 0, nullptr, nullptr, &desc),
                  kCMFormatDescriptionError_InvalidParameter)
            << b.what;
    EXPECT_EQ(CMAudioFormatDescriptionCreate(nullptr, nullptr, 0, nullptr, 0, nullptr, nullptr, &desc),
              kCMFormatDescriptionError_InvalidParameter);

    // A layout that declares three descriptions in the bytes of one.
    AudioStreamBasicDescription three = pcm16(3);
    AudioChannelLayout layout{kAudioChannelLayoutTag_UseChannelDescriptions, 0, 3, {}};
    EXPECT_EQ(CMAudioFormatDescriptionCreate(nullptr, &three, sizeof layout, &layout, 0, nullptr, nullptr, &desc),
              kCMFormatDescriptionError_InvalidParameter);
    // A header cut short, and a layout for another channel count.
    layout.mNumberChannelDescriptions = 0;
    layout.mChannelLayoutTag = kAudioChannelLayoutTag_Stereo;
    EXPECT_EQ(CMAudioFormatDescriptionCreate(nullptr, &three, 8, &layout, 0, nullptr, nullptr, &desc),
              kCMFormatDescriptionError_InvalidParameter);
    EXPECT_EQ(CMAudioFormatDescriptionCreate(nullptr, &three, sizeof layout, &layout, 0, nullptr, nullptr, &desc),
              kCMFormatDescriptionError_InvalidParameter);
    EXPECT_EQ(CMAudioFormatDescriptionCreate(nullptr, &three, 0, nullptr, 4, nullptr, nullptr, &desc),
              kCMFormatDescriptionError_InvalidParameter);
    EXPECT_FALSE(desc);
    // Non-interleaved frames hold one channel each.
    AudioStreamBasicDescription planar = pcm16(8, true);
    EXPECT_EQ(CMAudioFormatDescriptionCreate(nullptr, &planar, 0, nullptr, 0, nullptr, nullptr, &desc), noErr);
}

TEST(CMFormatDescription, TimeCodeDescriptionKeepsItsTiming) {
    CMTimeCodeFormatDescriptionRef desc;
    ASSERT_EQ(CMTimeCodeFormatDescriptionCreate(nullptr, kCMTimeCodeFormatType_Counter32, CMTimeMake(1001, 30000), 30,
                                                kCMTimeCodeFlag_DropFrame | kCMTimeCodeFlag_24HourMax, nullptr, &desc),
              noErr);
    EXPECT_EQ(CMFormatDescriptionGetMediaType(desc), kCMMediaType_TimeCode);
    EXPECT_EQ(CMFormatDescriptionGetMediaSubType(desc), FourCC("cn32"));
    CMTime d = CMTimeCodeFormatDescriptionGetFrameDuration(desc);
    EXPECT_EQ(d.value, 1001);
    EXPECT_EQ(d.timescale, 30000);
    EXPECT_EQ(CMTimeCodeFormatDescriptionGetFrameQuanta(desc), 30u);
    EXPECT_EQ(CMTimeCodeFormatDescriptionGetTimeCodeFlags(desc), 3u);
    EXPECT_NE(desc->description().find("1001/30000"), std::string::npos) << desc->description();

    // A track whose rate was not understood still gets its description.
    EXPECT_EQ(CMTimeCodeFormatDescriptionCreate(nullptr, kCMTimeCodeFormatType_TimeCode32, kCMTimeInvalid, 0, 0,
                                                nullptr, &desc),
              noErr);
    EXPECT_EQ(CMTimeCodeFormatDescriptionCreate(nullptr, FourCC("vide"), CMTimeMake(1, 25), 25, 0, nullptr, &desc),
              kCMFormatDescriptionError_InvalidParameter);
    EXPECT_TRUE(CMTIME_IS_INVALID(CMTimeCodeFormatDescriptionGetFrameDuration(nullptr)));
    EXPECT_EQ(CMTimeCodeFormatDescriptionGetFrameQuanta(nullptr), 0u);
}
