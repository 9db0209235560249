#include "AVClipWriter.h"

#include "ByteReader.h"
#include "MXFKLVReader.h"
#include "MXFSpanByteSource.h"
#include "MXFWriter.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <fstream>
#include <iterator>
#include <set>
#include <sstream>
#include <sys/stat.h>

namespace {
std::vector<uint8_t> readAll(const std::string& path) {
    std::ifstream f(path, std::ios::binary);
    return std::vector<uint8_t>(std::istreambuf_iterator<char>(f), {});
}
AVClipSpec gopSpec() {
    AVClipSpec s;
    s.coding = AVClipSpec::Coding::AVCLongGOP;
    s.frames = 50;
    s.framesPerChunk = 20;
    s.audioChannels = 2;
    s.frameBytes = 8000;
    s.clipXML = "<SkarnClip>text</SkarnClip>";
    return s;
}
}  // namespace

TEST(AVClipWriter, XMLCarrierAtItsFixedOffset) {
    TempDir dir;
    AVClipSpec params = gopSpec();
    ASSERT_TRUE(writeAVClip(dir / "a.mxf", params));
    std::vector<uint8_t> bytes = readAll(dir / "a.mxf");
    ASSERT_GT(bytes.size(), kAVClipXMLCarrierOffset + 49 + params.clipXML.size());
    MXFKLVReader reader(MXFSpanByteSource::initWithBytes(bytes));
    const MXFKLVReader::KLV carrier = reader.readKLV(kAVClipXMLCarrierOffset);
    EXPECT_TRUE(std::equal(MXFKeys::xmlCarrier.begin(), MXFKeys::xmlCarrier.end(), carrier.key.begin()));
    ASSERT_EQ(carrier.length, kAVClipXMLCarrierPrefix + params.clipXML.size());
    EXPECT_EQ(std::string(reinterpret_cast<const char*>(bytes.data() + carrier.valueOffset() + kAVClipXMLCarrierPrefix),
                          params.clipXML.size()),
              params.clipXML);
}

TEST(AVClipWriter, PartitionsAndRIPWhereTheLayoutSaysTheyAre) {
    TempDir dir;
    AVClipSpec params = gopSpec();
    AVClipLayout layout;
    ASSERT_TRUE(writeAVClip(dir / "a.mxf", params, nullptr, &layout));
    std::vector<uint8_t> bytes = readAll(dir / "a.mxf");
    ASSERT_EQ(bytes.size(), layout.fileSize);
    ASSERT_EQ(layout.chunks.size(), 3u);
    EXPECT_EQ(layout.chunks[2].frameCount, 10u);
    EXPECT_EQ(layout.samplesPerChunk, 32032u);
    EXPECT_EQ(layout.audioSamples, 80080u);
    MXFKLVReader reader(MXFSpanByteSource::initWithBytes(bytes));
    auto packAt = [&](uint64_t at, uint8_t kind) {
        const MXFKLVReader::KLV pack = reader.readKLV(at);
        EXPECT_EQ(pack.key[13], kind) << at;
        EXPECT_EQ(pack.length, 120u) << at;
        ByteReader r(bytes.data() + pack.valueOffset(), size_t(pack.length));
        r.skip(8);
        EXPECT_EQ(r.u64(), at);  // ThisPartition
        r.skip(8);
        EXPECT_EQ(r.u64(), layout.footerPartition);
        r.skip(8 + 8 + 4 + 8);
        return r.u32();  // BodySID
    };
    for (const auto& c : layout.chunks) {
        EXPECT_EQ(packAt(c.videoPartition, 3), 1u);
        EXPECT_EQ(packAt(c.videoIndexPartition, 3), 0u);
        EXPECT_EQ(packAt(c.ancPartition, 3), 2u);
        for (uint32_t ch = 0; ch < 2; ++ch) {
            EXPECT_EQ(packAt(c.audioPartition[ch], 3), 3u + ch);
            // The sound element follows its partition pack.
            const MXFKLVReader::KLV element =
                reader.readKLV(*MXFKLVReader::nextKeyOffset(reader.readKLV(c.audioPartition[ch])));
            EXPECT_EQ(c.audioBlock[ch], element.valueOffset());
            EXPECT_EQ(element.length, uint64_t(c.sampleCount) * 3);
            // 24-bit little-endian PCM: sample number low bits, channel on top.
            const uint8_t* s = bytes.data() + c.audioBlock[ch] + 3 * 5;
            EXPECT_EQ(s[0] | s[1] << 8, int((c.firstSample + 5) & 0xffff));
            EXPECT_EQ(s[2], ch);
        }
        // Frames run back to back up to the index partition.
        const auto& last = layout.frames[c.firstFrame + c.frameCount - 1];
        EXPECT_EQ(last.offset + last.size, c.videoIndexPartition);
    }
    packAt(layout.footerPartition, 4);
    // The RIP follows the footer pack, ends the file and ends with its own length.
    const MXFKLVReader::KLV rip = reader.readKLV(*MXFKLVReader::nextKeyOffset(reader.readKLV(layout.footerPartition)));
    EXPECT_EQ(rip.key[13], 0x11);
    EXPECT_EQ(rip.valueOffset() + rip.length, bytes.size());
    EXPECT_EQ(loadBE32(&bytes[bytes.size() - 4]), bytes.size() - rip.keyOffset);
    EXPECT_EQ((rip.length - 4) / 12, 2u + 3 * 8);
}

TEST(AVClipWriter, PictureTypesAndReordering) {
    TempDir dir;
    AVClipSpec params = gopSpec();
    params.frames = 26;  // ends inside a three-frame group
    AVClipLayout layout;
    ASSERT_TRUE(writeAVClip(dir / "gop.mxf", params, nullptr, &layout));
    std::set<uint32_t> shown;
    for (size_t k = 0; k < layout.frames.size(); ++k) {
        const auto& f = layout.frames[k];
        shown.insert(f.presentation);
        uint8_t type = f.flags & 7;
        const uint8_t want = k % 12 == 0 ? (k == 0 ? 4 : 0)  // IDR first, then open-GOP I
                             : k % 3 == 0 || k >= 24 || k < 3 ? 6
                                                     : 3;
        EXPECT_EQ(type, want) << k;
        // TemporalOffset is by display position: the frame shown at k is stored at k + TO.
        EXPECT_EQ(layout.frames[k + f.temporalOffset].presentation, k) << k;
    }
    EXPECT_EQ(shown.size(), 26u);
    EXPECT_EQ(*shown.rbegin(), 25u);
    // The first group and the cut-off last one are shown as stored.
    EXPECT_EQ(layout.frames[1].presentation, 1u);
    EXPECT_EQ(layout.frames[24].presentation, 24u);
    EXPECT_EQ(layout.frames[25].presentation, 25u);

    params.coding = AVClipSpec::Coding::AVCIntra;
    ASSERT_TRUE(writeAVClip(dir / "intra.mxf", params, nullptr, &layout));
    for (size_t k = 0; k < layout.frames.size(); ++k) {
        EXPECT_EQ(layout.frames[k].flags, 0xc4) << k;
        EXPECT_EQ(layout.frames[k].presentation, k);
    }
}

TEST(AVClipWriter, SparseClipsKeepEveryStructuralByteAndLittleDisk) {
    TempDir dir;
    AVClipSpec params = gopSpec();
    params.frames = 300;
    params.frameBytes = 400000;
    AVClipLayout full, sparse;
    ASSERT_TRUE(writeAVClip(dir / "full.mxf", params, nullptr, &full));
    params.sparse = true;
    ASSERT_TRUE(writeAVClip(dir / "sparse.mxf", params, nullptr, &sparse));
    std::vector<uint8_t> a = readAll(dir / "full.mxf"), b = readAll(dir / "sparse.mxf");
    ASSERT_EQ(a.size(), b.size());
    // Outside the essence values the files are the same.
    std::vector<bool> essence(a.size(), false);
    for (const auto& f : full.frames) std::fill(essence.begin() + long(f.offset), essence.begin() + long(f.offset + f.size), true);
    for (const auto& c : full.chunks)
        for (uint64_t block : c.audioBlock)
            std::fill(essence.begin() + long(block), essence.begin() + long(block + uint64_t(c.sampleCount) * 3), true);
    size_t differing = 0;
    for (size_t i = 0; i < a.size(); ++i)
        if (!essence[i] && a[i] != b[i]) ++differing;
    EXPECT_EQ(differing, 0u);
    struct stat st {};
    ASSERT_EQ(::stat((dir / "sparse.mxf").c_str(), &st), 0);
    EXPECT_LT(uint64_t(st.st_blocks) * 512, uint64_t(st.st_size) / 10);
}

TEST(AVClipWriter, RejectsLayoutsReadersCannotTake) {
    TempDir dir;
    std::string error;
    AVClipSpec params = gopSpec();
    params.gopLength = 10;
    EXPECT_FALSE(writeAVClip(dir / "a.mxf", params, &error));
    EXPECT_NE(error.find("multiple of 3"), std::string::npos) << error;
    params = gopSpec();
    params.framesPerChunk = 151;
    EXPECT_FALSE(writeAVClip(dir / "a.mxf", params, &error));
    params = gopSpec();
    params.framesPerChunk = 16;  // 16 frames at 29.97 are 25625.6 samples
    EXPECT_FALSE(writeAVClip(dir / "a.mxf", params, &error));
    EXPECT_NE(error.find("whole number of audio samples"), std::string::npos) << error;
    params.audioChannels = 0;  // without audio any chunking will do
    EXPECT_TRUE(writeAVClip(dir / "a.mxf", params, &error)) << error;
    EXPECT_FALSE(writeAVClip(dir / "missing/a.mxf", gopSpec(), &error));
    EXPECT_NE(error.find("missing/a.mxf"), std::string::npos);
}

TEST(AVClipWriter, EssenceDecodesCleanly) {
    if (runCommand("command -v ffmpeg >/dev/null 2>&1") != 0) GTEST_SKIP() << "ffmpeg is not on PATH";
    TempDir dir;
    AVClipSpec params = gopSpec();
    params.frames = 30;
    ASSERT_TRUE(writeAVClip(dir / "a.mxf", params));
    std::string out;
    ASSERT_EQ(runCommand("ffmpeg -v error -i '" + (dir / "a.mxf") + "' -map 0:v -f null - 2>&1", &out), 0) << out;
    // The only complaints allowed are about the ancillary and audio elements,
    // which a single file package cannot tie to their own body streams.
    std::istringstream lines(out);
    std::string line;
    while (std::getline(lines, line))
        EXPECT_TRUE(line.find("error getting stream index") != std::string::npos ||
                    line.find("Last message repeated") != std::string::npos)
            << line;
}
