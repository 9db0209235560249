// The KLV layer: byte sources (file, memory), the one-block read cache and the
// KLV reader, over tiny inline byte arrays.
#include "MXFCachedByteSource.h"
#include "MXFFileByteSource.h"
#include "MXFKLVReader.h"
#include "MXFSpanByteSource.h"

#include "AssertionHandler.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <limits>

namespace {

using KLV = MXFKLVReader::KLV;
using Refused = MXFKLVReader::RefusedLengthForm;

// A key that means nothing in particular; the reader does not look at keys.
const std::vector<uint8_t> kKey = {0x06, 0x0e, 0x2b, 0x34, 0x01, 0x01, 0x01, 0x02,
                                   0x03, 0x01, 0x02, 0x10, 0x01, 0x00, 0x00, 0x00};

// Concatenates byte runs.
std::vector<uint8_t> bytesOf(std::initializer_list<std::vector<uint8_t>> parts) {
    std::vector<uint8_t> out;
    for (const auto& p : parts) out.insert(out.end(), p.begin(), p.end());
    return out;
}

MXFKLVReader readerOver(const std::vector<uint8_t>& bytes, Refused refused = Refused::KeepsPreviousSize) {
    return MXFKLVReader(MXFSpanByteSource::initWithBytes(bytes), refused);
}

}  // namespace

// ---------------------------------------------------------------------------
// Lengths.

TEST(MXFKLVReader, TheTwoLongForms) {
    const auto bytes = bytesOf({kKey, {0x83, 0x00, 0x01, 0x02}, std::vector<uint8_t>(0x102, 0xaa),
                                kKey, {0x87, 0, 0, 0, 0, 0, 0, 0x03}, {1, 2, 3}});
    MXFKLVReader reader = readerOver(bytes);
    const KLV first = reader.readKLV(0);
    EXPECT_TRUE(first.complete);
    EXPECT_TRUE(first.longForm);
    EXPECT_EQ(first.key[0], 0x06);
    EXPECT_EQ(first.length, 0x102u);
    EXPECT_EQ(first.lengthSize, 4u);
    EXPECT_EQ(first.valueOffset(), 20u);
    EXPECT_EQ(reader.valueBytesThere(first), 0x102u);
    const std::optional<uint64_t> second = MXFKLVReader::nextKeyOffset(first);
    ASSERT_EQ(second, 20u + 0x102u);
    const KLV last = reader.readKLV(*second);
    EXPECT_EQ(std::make_tuple(last.length, last.lengthSize, last.valueOffset(), reader.valueBytesThere(last)),
              std::make_tuple(3u, 8u, *second + 24, 3u));
    EXPECT_EQ(MXFKLVReader::nextKeyOffset(last), bytes.size());
}

TEST(MXFKLVReader, OtherLengthFormsAreRefused) {
    // Short form, the other long forms and the indefinite form: none decoded.
    for (uint8_t form : {0x05, 0x7f, 0x80, 0x81, 0x82, 0x84, 0x88, 0xff}) {
        SCOPED_TRACE(int(form));
        const auto bytes = bytesOf({kKey, {form, 9, 9, 9, 9, 9, 9, 9}});
        const KLV keeps = readerOver(bytes).readKLV(0);
        EXPECT_TRUE(keeps.complete);
        EXPECT_FALSE(keeps.longForm);
        EXPECT_EQ(keeps.length, 0u);
        EXPECT_EQ(keeps.lengthSize, 4u);  // the size the reader started with
        const KLV oneByte = readerOver(bytes, Refused::OneByte).readKLV(0);
        EXPECT_EQ(std::make_tuple(oneByte.length, oneByte.lengthSize, oneByte.valueOffset()),
                  std::make_tuple(0u, 1u, 17u));
    }
    // A refused form keeps the size of the last length the reader decoded.
    const auto bytes = bytesOf({kKey, {0x87, 0, 0, 0, 0, 0, 0, 0}, kKey, {0x05, 0, 0, 0, 0, 0, 0, 0}});
    MXFKLVReader reader = readerOver(bytes);
    EXPECT_EQ(reader.readKLV(0).lengthSize, 8u);
    const KLV refused = reader.readKLV(24);
    EXPECT_EQ(refused.lengthSize, 8u);
    EXPECT_EQ(MXFKLVReader::nextKeyOffset(refused), 48u);
    EXPECT_EQ(readerOver(bytes, Refused::OneByte).readKLV(24).lengthSize, 1u);
}

TEST(MXFKLVReader, LyingLengthsAreBelievedOnlyAsFarAsTheBytesGo) {
    // A value running past the end: only what is there counts.
    const auto cut = bytesOf({kKey, {0x83, 0x00, 0x00, 0x40}, std::vector<uint8_t>(10, 1)});
    MXFKLVReader reader = readerOver(cut);
    const KLV klv = reader.readKLV(0);
    EXPECT_EQ(klv.length, 0x40u);
    EXPECT_EQ(reader.valueBytesThere(klv), 10u);
    // The largest lengths either form can claim, with no value at all.
    for (const auto& length : {std::vector<uint8_t>{0x83, 0xff, 0xff, 0xff},
                               std::vector<uint8_t>{0x87, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff, 0xff}}) {
        const auto bytes = bytesOf({kKey, length});
        MXFKLVReader huge = readerOver(bytes);
        const KLV h = huge.readKLV(0);
        EXPECT_GT(h.length, 0xfffffeu);
        EXPECT_EQ(huge.valueBytesThere(h), 0u);
        EXPECT_EQ(MXFKLVReader::nextKeyOffset(h), h.valueOffset() + h.length);
    }
    // A key past the end: nothing there, and its value none either.
    const KLV beyond = reader.readKLV(1000);
    EXPECT_FALSE(beyond.complete);
    EXPECT_EQ(reader.valueBytesThere(beyond), 0u);
}

TEST(MXFKLVReader, CutHeadersAreIncompleteWithTheirMissingLengthBytesZero) {
    const auto full = bytesOf({kKey, {0x87, 0x01, 0x02, 0x03, 0x04, 0x05, 0x06, 0x07}});
    for (size_t size : {0, 10, 16, 17, 20, 23}) {
        SCOPED_TRACE(size);
        const std::vector<uint8_t> bytes(full.begin(), full.begin() + long(size));
        const KLV klv = readerOver(bytes).readKLV(0);
        EXPECT_FALSE(klv.complete);
        EXPECT_EQ(klv.length, 0u);
    }
    const KLV whole = readerOver(full).readKLV(0);
    EXPECT_TRUE(whole.complete);
    EXPECT_EQ(whole.length, 0x01020304050607u);
}

TEST(MXFKLVReader, ZeroLengthValuesAdvancePastTheirHeader) {
    const auto bytes = bytesOf({kKey, {0x83, 0, 0, 0}, kKey, {0x87, 0, 0, 0, 0, 0, 0, 0}, kKey, {0x83, 0, 0, 1}, {7}});
    MXFKLVReader reader = readerOver(bytes);
    std::vector<uint64_t> keys;
    for (std::optional<uint64_t> at = 0; at && *at < bytes.size();) {
        keys.push_back(*at);
        at = MXFKLVReader::nextKeyOffset(reader.readKLV(*at));
    }
    EXPECT_EQ(keys, (std::vector<uint64_t>{0, 20, 44}));
    EXPECT_EQ(reader.valueBytesThere(reader.readKLV(0)), 0u);
}

TEST(MXFKLVReader, AKLVWhoseNextKeyWouldNotLiePastItStopsTheWalk) {
    KLV klv;
    klv.lengthSize = 8;
    klv.keyOffset = std::numeric_limits<uint64_t>::max() - 100;
    klv.length = 0xffffffffffffffu;  // wraps around
    EXPECT_FALSE(MXFKLVReader::nextKeyOffset(klv));
    klv.length = 100 - 24;  // would land on the largest offset, where nothing can follow
    EXPECT_FALSE(MXFKLVReader::nextKeyOffset(klv));
    klv.length = 100 - 25;
    EXPECT_EQ(MXFKLVReader::nextKeyOffset(klv), std::numeric_limits<uint64_t>::max() - 1);
    klv.keyOffset = std::numeric_limits<uint64_t>::max() - 10;  // the header itself wraps
    klv.length = 0;
    EXPECT_FALSE(MXFKLVReader::nextKeyOffset(klv));
}

TEST(MXFKLVReader, LocalSetItemsUpToOneRunningPastTheSet) {
    const std::vector<uint8_t> set = {0x3c, 0x01, 0x00, 0x02, 0xaa, 0xbb,  // two bytes
                                      0x3c, 0x02, 0x00, 0x00,              // empty
                                      0x3c, 0x03, 0x00, 0x09, 0x01,        // claims 9, has 1
                                      0x3c, 0x04, 0x00, 0x00};
    std::vector<std::pair<uint16_t, size_t>> seen;
    MXFKLVReader::forEachLocalTag(set, [&](uint16_t tag, uint16_t length, std::span<const uint8_t> v) {
        EXPECT_EQ(v.size(), length);
        seen.push_back({tag, v.size()});
    });
    EXPECT_EQ(seen, (std::vector<std::pair<uint16_t, size_t>>{{0x3c01, 2}, {0x3c02, 0}}));
    size_t calls = 0;
    MXFKLVReader::forEachLocalTag(std::span(set).first(3), [&](uint16_t, uint16_t, auto) { ++calls; });
    EXPECT_EQ(calls, 0u);
}

// ---------------------------------------------------------------------------
// Sources.

TEST(MXFByteSource, SpanAndFileDeliverTheSameAndCountTheirReads) {
    TempDir dir;
    const std::vector<uint8_t> bytes = {1, 2, 3, 4, 5, 6, 7, 8, 9};
    writeBytes(dir / "nine.bin", bytes);
    const Ref<MXFByteSource> sources[] = {
        MXFSpanByteSource::initWithBytes(bytes),
        MXFFileByteSource::initWithDescriptor(::open((dir / "nine.bin").c_str(), O_RDONLY | O_CLOEXEC))};
    for (const auto& source : sources) {
        ASSERT_TRUE(source);
        EXPECT_EQ(source->size(), 9u);
        uint8_t out[8] = {};
        EXPECT_EQ(source->readAt(5, out, sizeof out), 4);
        EXPECT_EQ(out[0], 6);
        EXPECT_EQ(source->readAt(9, out, sizeof out), 0);
        EXPECT_EQ(source->readAt(~uint64_t(0), out, sizeof out), -1);  // no file can be that long
        EXPECT_EQ(source->readStatistics().calls, 3u);
        EXPECT_EQ(source->readStatistics().bytes, 4u);
    }
    EXPECT_FALSE(MXFFileByteSource::initWithDescriptor(-1));
    // A folder opens but cannot be read.
    auto folder = MXFFileByteSource::initWithDescriptor(::open(dir.path().c_str(), O_RDONLY | O_CLOEXEC));
    ASSERT_TRUE(folder);
    uint8_t out[4];
    EXPECT_EQ(folder->readAt(0, out, sizeof out), -1);
}

// The one-block read cache, over a file and over the same bytes in memory:
// the same bytes and the same reads of the source underneath.
class ReadCache : public ::testing::TestWithParam<bool> {
protected:
    void SetUp() override {
        bytes.resize(3 * 4096 + 100);
        for (size_t i = 0; i < bytes.size(); ++i) bytes[i] = uint8_t(i * 7 + (i >> 8));
        if (GetParam()) {
            writeBytes(dir / "data.bin", bytes);
            source = MXFFileByteSource::initWithDescriptor(::open((dir / "data.bin").c_str(), O_RDONLY | O_CLOEXEC));
        } else {
            source = MXFSpanByteSource::initWithBytes(bytes);
        }
        ASSERT_TRUE(source);
        cache = MXFCachedByteSource::initWithSource(source);
        // Leave the last block cached.
        std::vector<uint8_t> out;
        read(bytes.size() - 50, 24, out);
    }
    // Reads and answers how many reads of the source it cost.
    uint64_t read(uint64_t offset, size_t count, std::vector<uint8_t>& out) {
        out.assign(count, 0xee);
        const uint64_t before = source->readStatistics().calls;
        EXPECT_EQ(cache->readAt(offset, out.data(), count), int64_t(count));
        return source->readStatistics().calls - before;
    }
    std::vector<uint8_t> expected(uint64_t offset, size_t count) {
        return std::vector<uint8_t>(bytes.begin() + long(offset), bytes.begin() + long(offset + count));
    }
    // Reads, checks the bytes and that it cost `calls` reads of the source.
    void expectRead(uint64_t offset, size_t count, uint64_t calls) {
        std::vector<uint8_t> out;
        EXPECT_EQ(read(offset, count, out), calls) << "at " << offset;
        EXPECT_EQ(out, expected(offset, count)) << "at " << offset;
    }
    TempDir dir;
    std::vector<uint8_t> bytes;
    Ref<MXFByteSource> source;
    Ref<MXFByteSource> cache;
};

TEST_P(ReadCache, ConsecutiveSmallReadsShareOneBlockLoad) {
    expectRead(100, 24, 1);
    expectRead(124, 24, 0);
    expectRead(4000, 96, 0);  // ends exactly at the block's end
}

TEST_P(ReadCache, ReadSpanningTwoBlocksLoadsBoth) {
    expectRead(4090, 24, 2);
    expectRead(4200, 24, 0);  // the second block is now the cached one
    // A read reaching back into the cached part copies it and loads the next block.
    expectRead(8180, 40, 1);
}

TEST_P(ReadCache, LargeReadBypassesTheCacheAndLeavesItAsItWas) {
    expectRead(100, 24, 1);
    expectRead(10, 5000, 1);
    expectRead(200, 24, 0);  // still served from block 0
}

TEST_P(ReadCache, BlockStartingAfterTheOffsetIsReloaded) {
    expectRead(8200, 24, 1);
    expectRead(100, 24, 1);
}

TEST_P(ReadCache, BytesPastTheEndReadAsZeros) {
    std::vector<uint8_t> out;
    read(bytes.size() - 10, 24, out);
    std::vector<uint8_t> want = expected(bytes.size() - 10, 10);
    want.resize(24, 0);
    EXPECT_EQ(out, want);
}

TEST_P(ReadCache, ASecondBlockThatComesUpShortIsAHardAssertion) {
    // The source ends 4 bytes into the block after the one holding the read's start.
    bytes.resize(2 * 4096 + 4);
    source = MXFSpanByteSource::initWithBytes(bytes);
    if (GetParam()) {
        writeBytes(dir / "short.bin", bytes);
        source = MXFFileByteSource::initWithDescriptor(::open((dir / "short.bin").c_str(), O_RDONLY | O_CLOEXEC));
    }
    cache = MXFCachedByteSource::initWithSource(source);
    auto previous = setHardAssertionFailureHandler(throwingHardAssertionFailureHandler);
    uint8_t out[24];
    try {
        cache->readAt(2 * 4096 - 6, out, sizeof out);
        ADD_FAILURE() << "no assertion";
    } catch (const HardAssertionFailure& failure) {
        EXPECT_EQ(failure.expression, "readBytes >= (bytesWanted - keyStartIndex)");
    }
    setHardAssertionFailureHandler(previous);
}

INSTANTIATE_TEST_SUITE_P(FileAndMemory, ReadCache, ::testing::Values(true, false),
                         [](const auto& info) { return info.param ? "File" : "Memory"; });
