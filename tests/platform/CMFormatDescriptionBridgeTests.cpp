#include "ByteReader.h"
#include "CFData.h"
#include "CMFormatDescriptionBridge.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

namespace {

std::vector<uint8_t> hexBytes(const char* hex) {
    std::vector<uint8_t> out;
    for (size_t i = 0; hex[i] && hex[i + 1]; i += 2) out.push_back(uint8_t(std::stoi(std::string(hex + i, 2), nullptr, 16)));
    return out;
}

std::vector<uint8_t> copyImageDescription(const CMFormatDescriptionRef& desc, OSStatus* statusOut = nullptr) {
    CMBlockBufferRef block;
    OSStatus status =
        CMVideoFormatDescriptionCopyAsBigEndianImageDescriptionBlockBuffer(nullptr, desc, kCFStringEncodingUTF8,
                                                                           nullptr, &block);
    if (statusOut) *statusOut = status;
    if (status != noErr) return {};
    std::vector<uint8_t> bytes(CMBlockBufferGetDataLength(block));
    EXPECT_EQ(CMBlockBufferCopyDataBytes(block, 0, bytes.size(), bytes.data()), kCMBlockBufferNoErr);
    return bytes;
}

std::vector<uint8_t> atom(const std::vector<uint8_t>& desc, const char (&type)[5], bool hostOrder = false) {
    auto found = CMImageDescriptionFindExtensionAtom(desc.data(), desc.size(), FourCC(type), hostOrder);
    return {found.begin(), found.end()};
}

CMFormatDescriptionRef videoDescription(int32_t width, int32_t height, const Dictionary& extensions) {
    CMFormatDescriptionRef desc;
    EXPECT_EQ(CMVideoFormatDescriptionCreate(nullptr, kCMVideoCodecType_DVCPro50NTSC, width, height, &extensions, &desc),
              noErr);
    return desc;
}

}  // namespace

TEST(CMFormatDescriptionBridge, H264ImageDescriptionRoundTripsThroughHostOrder) {
    auto sps = hexBytes("67f4000b919b28589d80880000030008000003019078a14cb0"), pps = hexBytes("68ebe3c44844");
    const uint8_t* sets[] = {sps.data(), pps.data()};
    size_t sizes[] = {sps.size(), pps.size()};
    CMFormatDescriptionRef desc;
    ASSERT_EQ(CMVideoFormatDescriptionCreateFromH264ParameterSets(nullptr, 2, sets, sizes, 4, &desc), noErr);

    std::vector<uint8_t> bigEndian = copyImageDescription(desc);
    ASSERT_GT(bigEndian.size(), 86u);
    ByteReader r(bigEndian);
    EXPECT_EQ(r.u32(), bigEndian.size());  // idSize covers the atoms
    EXPECT_EQ(r.u32(), FourCC("avc1"));
    r.seek(32);
    EXPECT_EQ(r.u16(), 176);
    EXPECT_EQ(r.u16(), 144);
    EXPECT_EQ(r.u32(), 0x00480000u);
    EXPECT_EQ(r.u32(), 0x00480000u);
    EXPECT_EQ(r.u32(), 0u);
    EXPECT_EQ(r.u16(), 1);
    EXPECT_EQ(r.u8(), 5);
    EXPECT_EQ(std::string(reinterpret_cast<const char*>(bigEndian.data()) + 51, 5), "H.264");
    r.seek(82);
    EXPECT_EQ(r.u16(), 24);
    EXPECT_EQ(r.u16(), 0xFFFF);

    auto avcC = valueDataBytes(
        CMFormatDescriptionGetExtension(desc, kCMFormatDescriptionExtension_SampleDescriptionExtensionAtoms)["avcC"]);
    EXPECT_EQ(atom(bigEndian, "avcC"), std::vector<uint8_t>(avcC.begin(), avcC.end()));
    EXPECT_EQ(atom(bigEndian, "fiel"), (std::vector<uint8_t>{1, 0}));
    EXPECT_EQ(atom(bigEndian, "pasp"), (std::vector<uint8_t>{0, 0, 0, 1, 0, 0, 0, 1}));
    EXPECT_TRUE(atom(bigEndian, "clap").empty());

    std::vector<uint8_t> host = bigEndian;
    ASSERT_EQ(CMSwapBigEndianImageDescriptionToHost(host.data(), host.size()), noErr);
    ImageDescription fields;
    std::memcpy(&fields, host.data(), sizeof fields);
    EXPECT_EQ(size_t(fields.idSize), host.size());
    EXPECT_EQ(fields.cType, FourCC("avc1"));
    EXPECT_EQ(fields.width, 176);
    EXPECT_EQ(fields.height, 144);
    EXPECT_EQ(fields.hRes, 72 << 16);
    EXPECT_EQ(fields.frameCount, 1);
    EXPECT_EQ(fields.depth, 24);
    EXPECT_EQ(fields.clutID, -1);
    EXPECT_EQ(fields.name[0], 5);
    // The atoms stay big-endian and are still found from the host-order header.
    EXPECT_EQ(std::vector<uint8_t>(host.begin() + 86, host.end()),
              std::vector<uint8_t>(bigEndian.begin() + 86, bigEndian.end()));
    EXPECT_EQ(atom(host, "avcC", true), atom(bigEndian, "avcC"));

    ASSERT_EQ(CMSwapHostImageDescriptionToBigEndian(host.data(), host.size()), noErr);
    EXPECT_EQ(host, bigEndian);
}

TEST(CMFormatDescriptionBridge, HeaderFieldsAndAtomsComeFromTheExtensions) {
    struct DetailCase {
        const char* detail;
        uint8_t code;
    };
    const DetailCase details[] = {
        {kCMFormatDescriptionFieldDetail_TemporalTopFirst, 1},
        {kCMFormatDescriptionFieldDetail_TemporalBottomFirst, 6},
        {kCMFormatDescriptionFieldDetail_SpatialFirstLineEarly, 9},
        {kCMFormatDescriptionFieldDetail_SpatialFirstLineLate, 14},
    };
    for (const auto& c : details) {
        auto desc = videoDescription(720, 480, {{kCMFormatDescriptionExtension_FieldCount, 2},
                                                {kCMFormatDescriptionExtension_FieldDetail, c.detail}});
        EXPECT_EQ(atom(copyImageDescription(desc), "fiel"), (std::vector<uint8_t>{2, c.code})) << c.detail;
    }

    // A name longer than 31 bytes is cut before a multi-byte character.
    std::string name = std::string(30, 'x') + "\xC3\xA9tail";
    Dictionary extensions{
        {kCMFormatDescriptionExtension_FormatName, name},
        {kCMFormatDescriptionExtension_Depth, 32},
        {kCMFormatDescriptionExtension_Version, 2},
        {kCMFormatDescriptionExtension_RevisionLevel, 1},
        {kCMFormatDescriptionExtension_Vendor, "skrn"},
        {kCMFormatDescriptionExtension_TemporalQuality, 512},
        {kCMFormatDescriptionExtension_SpatialQuality, 1023},
        {kCMFormatDescriptionExtension_PixelAspectRatio,
         Dictionary{{kCMFormatDescriptionKey_PixelAspectRatioHorizontalSpacing, 10},
                    {kCMFormatDescriptionKey_PixelAspectRatioVerticalSpacing, 11}}},
        {kCMFormatDescriptionExtension_CleanAperture,
         Dictionary{{kCMFormatDescriptionKey_CleanApertureWidth, 704},
                    {kCMFormatDescriptionKey_CleanApertureHeight, 480.0},
                    {kCMFormatDescriptionKey_CleanApertureHorizontalOffset, 0},
                    {kCMFormatDescriptionKey_CleanApertureVerticalOffset, -0.5}}},
        // Entries of the atom dictionary: a repeated atom, and a 'pasp' that the
        // PixelAspectRatio extension replaces.
        {kCMFormatDescriptionExtension_SampleDescriptionExtensionAtoms,
         Dictionary{{"colr", Value::array({Value(Value::DataType{1}), Value(Value::DataType{2})})},
                    {"pasp", Value(Value::DataType{0, 0, 0, 9, 0, 0, 0, 9})},
                    {"toolong", Value(Value::DataType{3})}}},
    };
    auto desc = videoDescription(720, 480, extensions);
    std::vector<uint8_t> bytes = copyImageDescription(desc);
    ASSERT_GE(bytes.size(), 86u);
    ImageDescription fields;
    std::memcpy(&fields, bytes.data(), sizeof fields);
    ASSERT_EQ(CMSwapBigEndianImageDescriptionToHost(reinterpret_cast<uint8_t*>(&fields), sizeof fields), noErr);
    EXPECT_EQ(fields.cType, FourCC("dv5n"));
    EXPECT_EQ(fields.version, 2);
    EXPECT_EQ(fields.revisionLevel, 1);
    EXPECT_EQ(fields.vendor, FourCC("skrn"));
    EXPECT_EQ(fields.temporalQuality, 512u);
    EXPECT_EQ(fields.spatialQuality, 1023u);
    EXPECT_EQ(fields.depth, 32);
    EXPECT_EQ(fields.name[0], 30);
    EXPECT_EQ(std::string(reinterpret_cast<const char*>(fields.name) + 1, 30), std::string(30, 'x'));

    EXPECT_EQ(atom(bytes, "pasp"), (std::vector<uint8_t>{0, 0, 0, 10, 0, 0, 0, 11}));
    EXPECT_EQ(atom(bytes, "colr"), (std::vector<uint8_t>{1}));
    EXPECT_EQ(atom(bytes, "clap"), (std::vector<uint8_t>{0, 0, 2, 192, 0, 0, 0, 1, 0, 0, 1, 224, 0, 0, 0, 1,  //
                                                         0, 0, 0, 0, 0, 0, 0, 1, 0xFF, 0xFF, 0xFF, 0xFF, 0, 0, 0, 2}));
    // Both 'colr' atoms, one 'pasp' and a 'clap': 86 + 9 + 9 + 16 + 40.
    EXPECT_EQ(bytes.size(), 86u + 9 + 9 + 16 + 40);
}

TEST(CMFormatDescriptionBridge, RefusesWhatAnImageDescriptionCannotHold) {
    CMBlockBufferRef block;
    auto video = videoDescription(720, 480, {});
    EXPECT_EQ(CMVideoFormatDescriptionCopyAsBigEndianImageDescriptionBlockBuffer(nullptr, nullptr, 0, nullptr, &block),
              kCMFormatDescriptionBridgeError_InvalidParameter);
    EXPECT_EQ(CMVideoFormatDescriptionCopyAsBigEndianImageDescriptionBlockBuffer(nullptr, video, 0, nullptr, nullptr),
              kCMFormatDescriptionBridgeError_InvalidParameter);
    EXPECT_EQ(CMVideoFormatDescriptionCopyAsBigEndianImageDescriptionBlockBuffer(nullptr, video, 0, "Other", &block),
              kCMFormatDescriptionBridgeError_UnsupportedSampleDescriptionFlavor);
    EXPECT_EQ(CMVideoFormatDescriptionCopyAsBigEndianImageDescriptionBlockBuffer(
                  nullptr, video, 0, kCMImageDescriptionFlavor_ISOFamily, &block),
              noErr);
    CMFormatDescriptionRef timecode;
    ASSERT_EQ(CMTimeCodeFormatDescriptionCreate(nullptr, kCMTimeCodeFormatType_Counter32, CMTimeMake(1, 25), 25, 0,
                                                nullptr, &timecode),
              noErr);
    EXPECT_EQ(CMVideoFormatDescriptionCopyAsBigEndianImageDescriptionBlockBuffer(nullptr, timecode, 0, nullptr, &block),
              kCMFormatDescriptionBridgeError_InvalidFormatDescription);
    EXPECT_FALSE(block);
    OSStatus status = noErr;
    copyImageDescription(videoDescription(70000, 480, {}), &status);
    EXPECT_EQ(status, kCMFormatDescriptionBridgeError_IncompatibleFormatDescription);

    uint8_t shortHeader[85] = {1, 2, 3};
    EXPECT_EQ(CMSwapBigEndianImageDescriptionToHost(shortHeader, sizeof shortHeader),
              kCMFormatDescriptionBridgeError_InvalidParameter);
    EXPECT_EQ(shortHeader[0], 1);
    EXPECT_EQ(CMSwapHostImageDescriptionToBigEndian(nullptr, 86), kCMFormatDescriptionBridgeError_InvalidParameter);
}

// Each description is copied into an allocation of exactly its size, so the
// address sanitizer catches any read past it.
TEST(CMFormatDescriptionBridge, AtomWalkStaysInsideTheBytesThere) {
    auto good = copyImageDescription(videoDescription(
        720, 480, {{kCMFormatDescriptionExtension_FieldCount, 1}, {kCMFormatDescriptionExtension_Depth, 24}}));
    ASSERT_EQ(good.size(), 86u + 10);
    auto withAtoms = [&](const std::vector<uint8_t>& atoms, uint32_t idSize = 0) {
        std::vector<uint8_t> d(86 + atoms.size());
        std::memcpy(d.data(), good.data(), 86);
        if (!atoms.empty()) std::memcpy(d.data() + 86, atoms.data(), atoms.size());
        storeBE32(d.data(), idSize ? idSize : uint32_t(d.size()));
        return d;
    };
    // The buffer ends before idSize says.
    auto cut = withAtoms({0, 0, 0, 10, 'f', 'i', 'e', 'l', 1}, 96);
    EXPECT_TRUE(atom(cut, "fiel").empty());
    // An atom claiming more than is left, one claiming less than its header.
    EXPECT_TRUE(atom(withAtoms({0, 0, 0, 200, 'f', 'i', 'e', 'l', 1, 0}), "fiel").empty());
    EXPECT_TRUE(atom(withAtoms({0, 0, 0, 4, 'a', 'b', 'c', 'd', 0, 0, 0, 10, 'f', 'i', 'e', 'l', 1, 0}), "fiel").empty());
    // A terminator after the atoms, as QuickTime writes one, ends the walk.
    EXPECT_EQ(atom(withAtoms({0, 0, 0, 10, 'f', 'i', 'e', 'l', 2, 1, 0, 0, 0, 0}), "fiel"), (std::vector<uint8_t>{2, 1}));
    // idSize beyond the buffer, below the header, and every truncation.
    EXPECT_TRUE(atom(withAtoms({}, 0xFFFFFFFF), "fiel").empty());
    EXPECT_TRUE(atom(withAtoms({0, 0, 0, 10, 'f', 'i', 'e', 'l', 1, 0}, 20), "fiel").empty());
    for (size_t n = 0; n < good.size(); ++n) {
        std::vector<uint8_t> prefix(good.begin(), good.begin() + n);
        auto found = CMImageDescriptionFindExtensionAtom(prefix.data(), prefix.size(), FourCC("fiel"), false);
        EXPECT_TRUE(found.empty()) << n;
    }
    EXPECT_EQ(atom(good, "fiel"), (std::vector<uint8_t>{1, 0}));
    EXPECT_TRUE(CMImageDescriptionFindExtensionAtom(nullptr, 100, FourCC("fiel"), false).empty());
}
