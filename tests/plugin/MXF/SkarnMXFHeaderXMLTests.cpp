#include "SkarnMXFHeaderXML.h"

#include "AVClipWriter.h"
#include "MXFWriter.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

namespace {
// A file of `size` bytes with an XML carrier KLV whose key starts at `at`.
std::vector<uint8_t> fileWithCarrier(size_t at, const std::string& text, bool eightByteLength = false) {
    ByteWriter w;
    w.zeros(at);
    w.bytes(std::span<const uint8_t>(MXFKeys::xmlCarrier));
    size_t prefix = eightByteLength ? 25 : 29;
    uint64_t length = prefix + text.size();
    if (eightByteLength) {
        w.u8(0x87);
        for (int s = 48; s >= 0; s -= 8) w.u8(uint8_t(length >> s));
    } else {
        w.u8(0x83);
        w.u8(uint8_t(length >> 16));
        w.u8(uint8_t(length >> 8));
        w.u8(uint8_t(length));
    }
    w.zeros(prefix);
    w.bytes(text);
    w.zeros(64);
    return w.bytes();
}
}  // namespace

TEST(SkarnMXFHeaderXML, FindsTheCarrierBehindOtherKLVs) {
    TempDir dir;
    AVClipSpec params;
    params.clipXML = "<SkarnClip><ClipContent/></SkarnClip>";
    params.frames = 5;
    ASSERT_TRUE(writeAVClip(dir / "A001.MXF", params));
    EXPECT_EQ(SkarnMXF_XMLStringForClip(dir / "A001.MXF"), params.clipXML);
}

TEST(SkarnMXFHeaderXML, TextStartsFortyNineBytesAfterTheKeyWhateverTheLengthForm) {
    EXPECT_EQ(SkarnMXF_XMLStringForBytes(fileWithCarrier(32768, "<a/>")), "<a/>");
    // With an 8-byte length field the text is still read from key + 49, so only
    // 25 bytes of the value are skipped.
    EXPECT_EQ(SkarnMXF_XMLStringForBytes(fileWithCarrier(32768, "XXXX<b/>", true)), "XXXX<b/>");
}

TEST(SkarnMXFHeaderXML, WindowLimits) {
    // Found when it starts inside the 81920-byte window after 32768, even when its
    // value runs past the window (the text is cut at what was read).
    std::string longText(2000, 'x');
    auto edge = SkarnMXF_XMLStringForBytes(fileWithCarrier(32768 + 81920 - 100, longText));
    ASSERT_TRUE(edge);
    EXPECT_EQ(edge->size(), 100u - 49u);
    // A carrier past the window is not found; the walk only visits KLV starts, so
    // here the zeros ahead of it read as one KLV of length 0 after another.
    EXPECT_FALSE(SkarnMXF_XMLStringForBytes(fileWithCarrier(32768 + 81920, "<c/>")));
}

TEST(SkarnMXFHeaderXML, ShortAndHostileBytesGiveNil) {
    EXPECT_FALSE(SkarnMXF_XMLStringForBytes(std::vector<uint8_t>(32767, 0)));
    EXPECT_FALSE(SkarnMXF_XMLStringForBytes(std::vector<uint8_t>(32768, 0)));
    EXPECT_FALSE(SkarnMXF_XMLStringForBytes({}));
    // A KLV claiming a length far beyond the bytes ends the walk.
    ByteWriter w;
    w.zeros(32768);
    w.bytes(std::span<const uint8_t>(MXFKeys::fill));
    w.u8(0x87);
    for (int i = 0; i < 7; ++i) w.u8(0xff);
    w.zeros(100);
    EXPECT_FALSE(SkarnMXF_XMLStringForBytes(w.bytes()));
    // A carrier whose value is shorter than its private prefix yields empty text.
    ByteWriter s;
    s.zeros(32768);
    s.bytes(std::span<const uint8_t>(MXFKeys::xmlCarrier));
    s.u8(0x83);
    s.u8(0);
    s.u8(0);
    s.u8(5);
    s.zeros(40);
    EXPECT_EQ(SkarnMXF_XMLStringForBytes(s.bytes()), "");
}

TEST(SkarnMXFHeaderXML, FilesAnswerAsTheirBytesDo) {
    TempDir dir;
    const std::vector<uint8_t> cases[] = {fileWithCarrier(32768, "<a/>"), fileWithCarrier(32768, "XXXX<b/>", true),
                                          fileWithCarrier(32768 + 81920 - 100, std::string(2000, 'x')),
                                          fileWithCarrier(32768 + 81920, "<c/>"), std::vector<uint8_t>(32767, 0)};
    for (const auto& bytes : cases) {
        writeBytes(dir / "clip.mxf", bytes);
        EXPECT_EQ(SkarnMXF_XMLStringForClip(dir / "clip.mxf"), SkarnMXF_XMLStringForBytes(bytes));
    }
    EXPECT_FALSE(SkarnMXF_XMLStringForClip(dir / "missing.mxf"));
    EXPECT_FALSE(SkarnMXF_XMLStringForClip(std::nullopt));
    EXPECT_FALSE(SkarnMXF_XMLStringForClip(dir.path()));
}
