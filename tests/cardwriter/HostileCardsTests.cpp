// The hostile card set: each fault lands where its name says, read back with
// the plug-in's own KLV reader, and the cards around it stay whole.
#include "HostileCards.h"

#include "ByteReader.h"
#include "FileSystem.h"
#include "MXFKLVReader.h"
#include "MXFSpanByteSource.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <sys/stat.h>
#include <unistd.h>

namespace {

// The cards whose fault names contain `part`.
std::map<std::string, HostileCard> write(const TempDir& dir, const std::string& part) {
    std::vector<HostileCard> cards;
    std::string error;
    auto containing = [&](size_t, const std::string& fault) { return fault.find(part) != std::string::npos; };
    EXPECT_TRUE(writeHostileCards(dir / "set", containing, &cards, &error)) << error;
    std::map<std::string, HostileCard> byFault;
    for (const auto& c : cards) byFault[c.fault] = c;
    return byFault;
}

uint64_t sizeOf(const std::string& path) { return FileSystem::fileSize(path).value_or(~0ull); }

}  // namespace

TEST(HostileCards, TruncationsCutTheSelfContainedClipInFileOrder) {
    TempDir dir;
    auto cards = write(dir, "avclip-intra-mxf");
    auto intact = write(dir, "intact-avclip-intra");
    ASSERT_EQ(intact.size(), 1u);
    const uint64_t whole = sizeOf(intact.begin()->second.clips[0].clipPath);
    // Each point lies past the one before it, all inside the file.
    const char* order[] = {"in-partition-pack-key", "in-partition-pack", "in-header-metadata", "in-xml-carrier",
                           "after-header", "in-body-partition-pack", "in-frame", "in-index-segment",
                           "in-index-entries", "in-sound-element", "in-last-chunk", "after-essence",
                           "in-footer-partition-pack", "in-rip", "rip-last-byte"};
    uint64_t previous = 0;
    for (const char* point : order) {
        const auto it = cards.find(std::string("truncated-avclip-intra-mxf-") + point);
        ASSERT_NE(it, cards.end()) << point;
        const uint64_t size = sizeOf(it->second.clips[0].clipPath);
        EXPECT_GT(size, previous) << point;
        EXPECT_LT(size, whole) << point;
        previous = size;
    }
    EXPECT_EQ(previous, whole - 1);
    EXPECT_EQ(sizeOf(cards.at("empty-avclip-intra-mxf").clips[0].clipPath), 0u);
    // The carrier sits at its fixed offset.
    EXPECT_EQ(sizeOf(cards.at("truncated-avclip-intra-mxf-in-xml-carrier").clips[0].clipPath), 32768u + 60);
}

TEST(HostileCards, LengthFaultsReachPastTheFileAndOffsetFaultsPointThere) {
    TempDir dir;
    auto cards = write(dir, "dv-video-mxf");
    const HostileCard& flipped = cards.at("klv-length-bit-flip-dv-video-mxf-essence");
    auto bytes = FileSystem::readFile(flipped.damaged.at(0));
    ASSERT_TRUE(bytes);
    MXFKLVReader reader(MXFSpanByteSource::initWithBytes(*bytes));
    // Walk to the essence element: it now claims more than the file holds.
    bool found = false;
    for (std::optional<uint64_t> at = 0; at && *at + 20 <= bytes->size() && !found;) {
        const MXFKLVReader::KLV klv = reader.readKLV(*at);
        if (klv.key[4] == 0x01 && klv.key[12] == 0x18) {
            found = true;
            EXPECT_LT(reader.valueBytesThere(klv), klv.length);
            EXPECT_GE(klv.length, 8u << 20);
        }
        at = MXFKLVReader::nextKeyOffset(klv);
    }
    EXPECT_TRUE(found);

    const HostileCard& ber = cards.at("klv-ber-size-15-dv-video-mxf-essence");
    bytes = FileSystem::readFile(ber.damaged.at(0));
    ASSERT_TRUE(bytes);
    EXPECT_NE(std::find(bytes->begin(), bytes->end(), 0x8f), bytes->end());

    // The header partition pack's FooterPartition is 1 TiB in.
    bytes = FileSystem::readFile(cards.at("partition-footer-offset-past-end-dv-video-mxf").damaged.at(0));
    ASSERT_TRUE(bytes);
    EXPECT_EQ(loadBE64(bytes->data() + 20 + 24), 1ull << 40);
}

TEST(HostileCards, FilesThatAreNotFiles) {
    TempDir dir;
    auto cards = write(dir, "-as-dv-audio-mxf");
    struct stat st;
    ASSERT_EQ(::lstat(cards.at("fifo-as-dv-audio-mxf").damaged.at(0).c_str(), &st), 0);
    EXPECT_TRUE(S_ISFIFO(st.st_mode));
    char target[64] = {};
    ASSERT_GT(::readlink(cards.at("dev-zero-as-dv-audio-mxf").damaged.at(0).c_str(), target, sizeof target - 1), 0);
    EXPECT_STREQ(target, "/dev/zero");
    ASSERT_EQ(::stat(cards.at("folder-as-dv-audio-mxf").damaged.at(0).c_str(), &st), 0);
    EXPECT_TRUE(S_ISDIR(st.st_mode));
    // Writing the set again over itself replaces each card.
    cards = write(dir, "-as-dv-audio-mxf");
    EXPECT_EQ(cards.size(), 5u);
}

TEST(HostileCards, ClipXMLValuesOneClipPerValue) {
    TempDir dir;
    auto cards = write(dir, "xml-duration");
    const HostileCard& card = cards.at("xml-duration");
    ASSERT_EQ(card.clips.size(), 10u);  // seven DV values, three AVC-Intra
    auto bytes = FileSystem::readFile(card.clips[3].clipPath);
    ASSERT_TRUE(bytes);
    EXPECT_NE(std::string(bytes->begin(), bytes->end()).find("<Duration>-1</Duration>"), std::string::npos);
    bytes = FileSystem::readFile(card.clips[9].clipPath);
    ASSERT_TRUE(bytes);
    EXPECT_NE(std::string(bytes->begin(), bytes->end()).find("<Duration>12abc</Duration>"), std::string::npos);
}

TEST(HostileCards, TheHugeDocumentIsWrittenInFull) {
    TempDir dir;
    std::vector<HostileCard> cards;
    ASSERT_TRUE(writeHostileCards(dir / "set", &cards, nullptr, "xml-huge-200mb"));
    ASSERT_EQ(cards.size(), 1u);
    struct stat st;
    ASSERT_EQ(::stat(cards[0].clips[0].clipPath.c_str(), &st), 0);
    EXPECT_GT(st.st_size, 200 << 20);
    // Real bytes, not a hole a file system might refuse to read quickly.
    EXPECT_GE(uint64_t(st.st_blocks) * 512, uint64_t(st.st_size) - 4096);
}
