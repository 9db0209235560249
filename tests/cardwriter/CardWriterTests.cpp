// The card writer checked against the clip XML it writes and, where ffprobe is
// installed, against an independent MXF reader.
#include "CardWriter.h"

#include "FileSystem.h"
#include "H264Synth.h"
#include "MXFKLVReader.h"
#include "MXFSpanByteSource.h"
#include "TestSupport.h"
#include "XMLDocument.h"

#include <gtest/gtest.h>

#include <sys/stat.h>

namespace {

bool haveFFprobe() { return runCommand("command -v ffprobe >/dev/null 2>&1") == 0; }

std::string xpath(const Ref<XMLDocument>& doc, const std::string& path) {
    return doc->rootElement().firstNodeForXPath(path).stringValue();
}

// The essence element's key and length must sit right before StartByteOffset
// and cover DataSize bytes.
void expectEssenceAt(const std::string& path, uint64_t offset, uint64_t size) {
    auto bytes = FileSystem::readFile(path);
    ASSERT_TRUE(bytes);
    ASSERT_GT(offset, 20u);
    // Our writer uses the 4-byte length form for values up to 16 MiB, else 8 bytes.
    const uint32_t lengthSize = size <= 0xffffff ? 4 : 8;
    MXFKLVReader reader(MXFSpanByteSource::initWithBytes(*bytes));
    const MXFKLVReader::KLV element = reader.readKLV(offset - lengthSize - 16);
    EXPECT_TRUE(element.longForm);
    EXPECT_EQ(element.lengthSize, lengthSize);
    EXPECT_EQ(element.valueOffset(), offset);
    EXPECT_EQ(element.length, size);
    EXPECT_EQ(element.key[0], 0x06);
    EXPECT_EQ(reader.valueBytesThere(element), size);
}

}  // namespace

TEST(CardWriter, ClipXMLDescribesTheEssenceItWrote) {
    TempDir dir;
    CardSpec card;
    card.root = dir / "card";
    ClipSpec clip = defaultClip(*cardFamilyNamed("dvcprohd-1080i60"), 1);
    clip.frames = 3;
    clip.audioChannels = 3;
    clip.pulldown = "2:3";
    card.clips.push_back(clip);
    std::vector<WrittenClip> written;
    std::string error;
    ASSERT_TRUE(writeCard(card, &written, &error)) << error;
    ASSERT_EQ(written.size(), 1u);
    Ref<XMLDocument> doc = XMLDocument::documentWithContentsOfFile(written[0].clipPath);
    ASSERT_TRUE(doc);
    EXPECT_EQ(xpath(doc, "ClipContent/EssenceList/Video/Codec"), "DV100_1080/59.94i");
    EXPECT_EQ(xpath(doc, "ClipContent/EssenceList/Video/Codec/@Class"), "100");
    EXPECT_EQ(xpath(doc, "ClipContent/EssenceList/Video/FrameRate/@DropFrameFlag"), "true");
    EXPECT_EQ(xpath(doc, "ClipContent/Duration"), "3");
    EXPECT_EQ(xpath(doc, "ClipContent/GlobalClipID").size(), 64u);
    EXPECT_EQ(doc->rootElement().nodesForXPath("ClipContent/EssenceList/Audio")->size(), 3u);
    uint64_t videoOffset = std::stoull(xpath(doc, "ClipContent/EssenceList/Video/VideoIndex/StartByteOffset"));
    uint64_t videoSize = std::stoull(xpath(doc, "ClipContent/EssenceList/Video/VideoIndex/DataSize"));
    EXPECT_EQ(videoSize, 3u * 480000u);
    expectEssenceAt(card.root + "/CONTENTS/VIDEO/A001.MXF", videoOffset, videoSize);
    for (int ch = 0; ch < 3; ++ch) {
        std::string base = "ClipContent/EssenceList/Audio[" + std::to_string(ch + 1) + "]/AudioIndex/";
        uint64_t off = std::stoull(xpath(doc, base + "StartByteOffset"));
        uint64_t size = std::stoull(xpath(doc, base + "DataSize"));
        EXPECT_EQ(size, audioSamplesFor(clip) * 2);
        expectEssenceAt(card.root + "/CONTENTS/AUDIO/A0010" + std::to_string(ch) + ".MXF", off, size);
    }
    EXPECT_TRUE(FileSystem::fileExists(card.root + "/CONTENTS/ICON/A001.BMP"));
    EXPECT_TRUE(FileSystem::fileExists(card.root + "/LASTCLIP.TXT"));
}

TEST(CardWriter, LowerCaseCardsAndSparseClips) {
    TempDir dir;
    CardSpec card;
    card.root = dir / "card";
    card.lowerCaseFolders = true;
    ClipSpec clip = defaultClip(*cardFamilyNamed("dvcpro50-pal"), 2);
    clip.frames = 1000;
    clip.sparse = true;
    card.clips.push_back(clip);
    ASSERT_TRUE(writeCard(card));
    std::string video = card.root + "/contents/video/A002.MXF";
    ASSERT_TRUE(FileSystem::fileExists(video));
    EXPECT_GT(*FileSystem::fileSize(video), 1000u * 288000u);
    struct stat st;
    ASSERT_EQ(::stat(video.c_str(), &st), 0);
    EXPECT_LT(uint64_t(st.st_blocks) * 512, 20u * 288000u);  // holes take no space
}

TEST(CardWriter, TimecodeLabels) {
    EXPECT_EQ(timecodeLabelToFrames("01:00:00;00", 30, true), 107892u);
    EXPECT_EQ(timecodeLabelToFrames("00:01:00;02", 30, true), 1800u);
    EXPECT_EQ(timecodeLabelToFrames("01:00:00:00", 25, false), 90000u);
    EXPECT_EQ(timecodeLabelToFrames("garbage", 30, false), 0u);
}

TEST(CardWriter, SyntheticH264IsExactlyTheFrameSizeAndHasStartCodes) {
    H264SynthParams p;
    std::vector<uint8_t> au = makeH264AccessUnit(p, 472064);
    ASSERT_EQ(au.size(), 472064u);
    EXPECT_EQ(au[0], 0);
    EXPECT_EQ(au[3], 1);
    // No accidental start code inside the filler run.
    for (size_t i = au.size() - 1000; i + 3 < au.size(); ++i)
        EXPECT_FALSE(au[i] == 0 && au[i + 1] == 0 && au[i + 2] <= 1);
}

TEST(CardWriter, EveryEssenceFileOpensCleanlyInFFprobe) {
    if (!haveFFprobe()) GTEST_SKIP() << "ffprobe not installed";
    TempDir dir;
    CardSpec card;
    card.root = dir / "card";
    unsigned i = 1;
    for (const auto& f : cardFamilies()) {
        if (f.avclip) continue;
        ClipSpec c = defaultClip(f, i++);
        c.frames = 3;
        c.audioChannels = 1;
        card.clips.push_back(c);
    }
    std::vector<WrittenClip> written;
    ASSERT_TRUE(writeCard(card, &written));
    for (const auto& w : written) {
        for (const auto& file : w.files) {
            if (FileSystem::pathExtension(file) != "MXF") continue;
            std::string out;
            int rc = runCommand("ffprobe -v error -count_packets -show_entries stream=codec_name,nb_read_packets -of "
                                "csv=p=0 '" + file + "' 2>&1", &out);
            EXPECT_EQ(rc, 0) << file << ": " << out;
            EXPECT_EQ(out.find("rror"), std::string::npos) << file << ": " << out;
            bool video = file.find("/VIDEO/") != std::string::npos;
            if (video) {
                std::string expected = w.family.rfind("avci", 0) == 0 ? "h264,3\n" : "dvvideo,3\n";
                EXPECT_EQ(out, expected) << file;
            } else {
                EXPECT_EQ(out.rfind("pcm_s", 0), 0u) << file << ": " << out;
            }
        }
    }
}
