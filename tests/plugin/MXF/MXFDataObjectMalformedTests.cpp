// Malformed self-contained clips: every hard assertion a damaged file can reach
// stops with its expression, and truncated or bit-flipped files never read
// outside a buffer, allocate beyond the file or loop.
#include "mxfDataObject.h"

#include "AVClipWriter.h"
#include "AssertionHandler.h"
#include "ByteReader.h"
#include "MXFKLVReader.h"
#include "MXFSpanByteSource.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <fstream>
#include <iterator>
#include <random>
#include <sys/stat.h>

namespace {

std::vector<uint8_t> readAll(const std::string& path) {
    std::ifstream f(path, std::ios::binary);
    return std::vector<uint8_t>(std::istreambuf_iterator<char>(f), {});
}

std::string exercise(const std::function<Ref<mxfDataObject>()>& open);

// A small long-GOP clip (40 frames in chunks of 20, two audio channels) and
// helpers to damage a copy of it.
class Damaged : public ::testing::Test {
protected:
    void SetUp() override {
        params.coding = AVClipSpec::Coding::AVCLongGOP;
        params.frames = 40;
        params.framesPerChunk = 20;
        params.audioChannels = 2;
        params.frameBytes = 600;
        params.clipXML = "<SkarnClip/>";
        write();
    }
    void write() {
        std::string error;
        ASSERT_TRUE(writeAVClip(dir / "good.mxf", params, &error, &layout)) << error;
        bytes = readAll(dir / "good.mxf");
    }
    std::string save() {
        std::string p = dir / "bad.mxf";
        writeBytes(p, bytes);
        return p;
    }
    Ref<mxfDataObject> reopen() { return mxfDataObject::initWithPath(save()); }
    // Runs every lookup over the damaged copy, as a file and as bytes in
    // memory: they must end alike.
    void exerciseCopy() {
        const std::string path = save();
        const std::string fromFile = exercise([&] { return mxfDataObject::initWithPath(path); });
        EXPECT_EQ(exercise([&] { return mxfDataObject::initWithBytes(bytes); }), fromFile);
    }

    // Offset of local tag `tag` (its first byte) within [from, from + span).
    size_t findTag(uint64_t from, uint16_t tag, uint16_t length, size_t span = 2048) {
        for (size_t i = size_t(from); i + 4 < std::min(bytes.size(), size_t(from + span)); ++i)
            if (loadBE16(&bytes[i]) == tag && loadBE16(&bytes[i + 2]) == length) return i;
        ADD_FAILURE() << "tag " << std::hex << tag << " not found";
        return 0;
    }
    // Offset of the index table segment key in an index partition.
    size_t segmentKey(uint64_t partition) { return size_t(partition + 20 + 120); }
    // Key offset of each KLV of the header metadata of a type, read with the plug-in's reader.
    std::vector<uint64_t> headerKLVs(uint32_t type) {
        Ref<mxfDataObject> keys = mxfDataObject::initWithPath(std::nullopt);
        MXFKLVReader reader(MXFSpanByteSource::initWithBytes(bytes));
        std::vector<uint64_t> found;
        for (std::optional<uint64_t> at = 0; at && *at + 20 <= kAVClipXMLCarrierOffset;) {
            const MXFKLVReader::KLV klv = reader.readKLV(*at);
            if (keys->MXFKeyTypeforKey(klv.key.data()) == type) found.push_back(*at);
            at = MXFKLVReader::nextKeyOffset(klv);
        }
        return found;
    }
    // Patches every source clip Duration of the given kind (picture or not).
    void setClipDurations(bool picture, uint64_t duration) {
        MXFKLVReader reader(MXFSpanByteSource::initWithBytes(bytes));
        for (uint64_t at : headerKLVs(MXF_SourceClip)) {
            const MXFKLVReader::KLV clip = reader.readKLV(at);
            bool isPicture = false;
            const auto value = std::span<const uint8_t>(bytes).subspan(size_t(clip.valueOffset()), size_t(clip.length));
            MXFKLVReader::forEachLocalTag(value, [&](uint16_t tag, uint16_t, std::span<const uint8_t> v) {
                if (tag == 0x0201) isPicture = v[12] == 0x01;
                if (tag == 0x0202 && isPicture == picture) storeBE64(&bytes[size_t(v.data() - bytes.data())], duration);
            });
        }
    }
    // The RIP entry for chunk `chunk`, slot `slot` (0 video, 1 video index, 2 ANC, ...).
    size_t ripEntry(size_t chunk, size_t slot) {
        const size_t group = 2 * (2 + params.audioChannels);
        return size_t(layout.footerPartition + 20 + 120 + 20 + 12 * (1 + chunk * group + slot));
    }

    // Sets every descriptor's audio block align.
    void setBlockAlign(uint16_t align) {
        for (size_t at = 0; at + 6 < 32768; ++at)
            if (loadBE16(&bytes[at]) == 0x3d0a && loadBE16(&bytes[at + 2]) == 2) storeBE16(&bytes[at + 4], align);
    }
    // Each case damages a fresh copy; opening it, then the lookup, stops on the
    // case's assertion.
    struct Case {
        std::function<void(std::vector<uint8_t>&)> damage;
        std::string text;
        std::function<void(mxfDataObject&)> lookup = nullptr;
    };
    void expectDeaths(const std::vector<Case>& cases);

    TempDir dir;
    AVClipSpec params;
    AVClipLayout layout;
    std::vector<uint8_t> bytes;
};

Ref<mxfDataObject> openFile(const std::string& path, const std::vector<uint8_t>&) {
    return mxfDataObject::initWithPath(path);
}
Ref<mxfDataObject> openBytes(const std::string&, const std::vector<uint8_t>& bytes) {
    return mxfDataObject::initWithBytes(bytes);
}

// Makes every lookup a reader might make and tells what came of each: the
// records found, or the check that stopped it; then the reads it all took.
std::string exercise(const std::function<Ref<mxfDataObject>()>& open) {
    std::string out;
    auto attempt = [&out](auto&& f) {
        try {
            f();
        } catch (const HardAssertionFailure& failure) {
            out += "(" + failure.expression + ")\n";
        }
    };
    attempt([&] {
        Ref<mxfDataObject> mxf = open();
        auto record = [&](auto lookup) { attempt([&] { out += describe(lookup()) + "\n"; }); };
        uint32_t frames = 0;
        mxf->getVideoFrameCount(&frames);
        out += std::to_string(mxf->chunkCount()) + " chunks, " + std::to_string(frames) + " frames\n";
        const int64_t n = std::min<int64_t>(frames, 200);
        for (int64_t i = -1; i <= n + 1; ++i) {
            record([&] { return mxf->getVideoOffsetForDTS(i); });
            record([&] { return mxf->getVideoOffsetForPTS(i); });
        }
        for (uint64_t s : {0ull, 1ull, 16015ull, 32032ull, 32033ull, 64063ull, 1ull << 40})
            for (size_t ch = 0; ch < 3; ++ch) record([&] { return mxf->getAudioOffsetForChannel(ch, s); });
        for (size_t i = 0; i < mxf->chunkCount(); ++i) (void)mxf->chunkAtIndex(i)->description();
        out += std::to_string(mxf->readStatistics().calls) + " reads, " + std::to_string(mxf->readStatistics().bytes) +
               " bytes\n";
    });
    return out;
}

struct Capture {
    Capture() : scoped(&recorder) { previous = setHardAssertionFailureHandler(throwingHardAssertionFailureHandler); }
    ~Capture() { setHardAssertionFailureHandler(previous); }
    RecordingAssertionHandler recorder;
    ScopedAssertionHandler scoped;
    HardAssertionFailureHandler previous;
};

// A death test's child reports soft failures by recording them, so only the
// hard assertion ends it.
#define EXPECT_MXF_DEATH(statement, text)                           \
    EXPECT_DEATH(                                                   \
        {                                                           \
            RecordingAssertionHandler soft;                         \
            ScopedAssertionHandler scoped(&soft);                   \
            statement;                                              \
        },                                                          \
        std::string("Assertion failed: \\(") + text + "\\), source MXF/SkarnMXFMetadata")

std::string quoted(std::string text) {
    std::string out;
    for (char c : text) {
        if (std::string("()[]*+.?|^$\\{}").find(c) != std::string::npos) out += '\\';
        out += c;
    }
    return out;
}

void Damaged::expectDeaths(const std::vector<Case>& cases) {
    for (const auto& c : cases) {
        SCOPED_TRACE(c.text);
        bytes = readAll(dir / "good.mxf");
        c.damage(bytes);
        const std::string p = save();
        auto run = [&](Ref<mxfDataObject> (*open)(const std::string&, const std::vector<uint8_t>&)) {
            Ref<mxfDataObject> mxf = open(p, bytes);
            if (c.lookup) c.lookup(*mxf);
        };
        EXPECT_MXF_DEATH(run(openFile), quoted(c.text));
        // The same bytes in memory stop on the same check.
        EXPECT_MXF_DEATH(run(openBytes), quoted(c.text));
    }
}

}  // namespace

namespace {
auto pts(int64_t i) { return [i](mxfDataObject& m) { m.getVideoOffsetForPTS(i); }; }
auto dts(int64_t i) { return [i](mxfDataObject& m) { m.getVideoOffsetForDTS(i); }; }
}  // namespace

// ---------------------------------------------------------------------------
// Opening.

TEST_F(Damaged, HeaderPartitionVersionChecks) {
    std::vector<Case> cases;
    const char* checks[] = {"headerPartition[0] == 0", "headerPartition[1] == 1", "headerPartition[2] == 0",
                            "headerPartition[3] == 3"};
    for (size_t i = 0; i < 4; ++i) cases.push_back({[i](auto& b) { b[20 + i] ^= 0x40; }, checks[i]});
    expectDeaths(cases);
}

TEST_F(Damaged, ValuesReachingPastTheEndOfTheFile) {
    expectDeaths({
        // The header partition pack claims 8 MiB: the read comes up short.
        {[](auto& b) { b[17] = 0x7f; }, "headerPartitionBytes == BERLength"},
        // A source clip claiming more bytes than the file has.
        {[this](auto& b) { b[headerKLVs(MXF_SourceClip).front() + 17] = 0x7f; }, "bodyPartitionBytes == BERLength"},
    });
}

TEST_F(Damaged, FirstAudioIndexPartitionChecks) {
    const uint64_t partition = layout.chunks[0].audioIndexPartition[0];
    const size_t key = segmentKey(partition);
    expectDeaths({
        {[&](auto& b) { b[partition + 13] = 0x09; }, "[self MXFKeyTypeforKey:key] == MXF_BodyPartionPack"},
        {[&](auto& b) { b[key + 13] = 0x11; }, "[self MXFKeyTypeforKey:key] == MXF_IndexTableSegment"},
        // The last chunk's audio index is the file's last partition before the
        // footer; claim a value running past the end of the file.
        {[&](auto& b) { b[key + 17] = 0x7f; }, "indexTableBytes == BERLength"},
    });
}

TEST_F(Damaged, RIPGroupLayout) {
    const std::pair<size_t, uint32_t> slotSID[] = {{0, 7}, {1, 1}, {2, 3}, {3, 9}, {6, 3}, {7, 4}};
    const char* texts[] = {"BodySIDV==1", "BodySIDV==0", "BodySIDV==2", "BodySIDV==0", "BodySIDV==(3+chan)",
                           "BodySIDV==0"};
    std::vector<Case> cases;
    for (size_t i = 0; i < 6; ++i)
        cases.push_back({[this, c = slotSID[i]](auto& b) { storeBE32(&b[ripEntry(1, c.first)], c.second); }, texts[i]});
    expectDeaths(cases);
}

TEST_F(Damaged, ReadFailureAndShortSecondBlock) {
    // A folder (like a FIFO or a device) is refused before it is opened: an
    // empty object, no assertion.
    makeDirs(dir / "folder.mxf");
    EXPECT_EQ(mxfDataObject::initWithPath(dir / "folder.mxf")->chunkCount(), 0u);
    // A regular file that opens but whose reads fail.
    EXPECT_MXF_DEATH(mxfDataObject::initWithPath("/proc/self/mem"), quoted("readBytes != -1"));

    // A fill KLV that puts the next key 6 bytes before the end of the second
    // block, and a file that ends 4 bytes into the third: the key's read loads
    // two blocks and the second comes up short.
    std::vector<uint8_t> file(8196, 0);
    const uint8_t fill[16] = {0x06, 0x0e, 0x2b, 0x34, 0x01, 0x01, 0x01, 0x02,
                              0x03, 0x01, 0x02, 0x10, 0x01, 0x00, 0x00, 0x00};
    std::copy(fill, fill + 16, file.begin());
    file[16] = 0x83;
    file[18] = uint8_t((8186 - 20) >> 8);
    file[19] = uint8_t(8186 - 20);
    writeBytes(dir / "short.mxf", file);
    EXPECT_MXF_DEATH(mxfDataObject::initWithPath(dir / "short.mxf"),
                     quoted("readBytes >= (bytesWanted - keyStartIndex)"));
    EXPECT_MXF_DEATH(mxfDataObject::initWithBytes(file), quoted("readBytes >= (bytesWanted - keyStartIndex)"));
}

// ---------------------------------------------------------------------------
// Chunk scans.

TEST_F(Damaged, VideoEssencePartitionChecks) {
    const uint64_t v = layout.chunks[1].videoPartition;
    expectDeaths({
        {[&](auto& b) { storeBE64(&b[ripEntry(1, 0) + 4], b.size() - 100); }, "readBytes==256", pts(25)},
        {[&](auto& b) { b[v + 16] = 0x87; }, "BERSize<=4", pts(25)},
        {[&](auto& b) { b[v + 13] = 0x07; }, "[self MXFKeyTypeforKey:key] == MXF_BodyPartionPack", pts(25)},
        {[&](auto& b) { b[v + 19] = 212; }, "(bppPacketLength+24) < readBytes", pts(25)},
        {[&](auto& b) { b[v + 140 + 12] = 0x16; }, "essenseTypeBeingParsed == MXF_VideoEssenseData", pts(25)},
    });
}

TEST_F(Damaged, VideoIndexPartitionChecks) {
    const uint64_t vi = layout.chunks[1].videoIndexPartition;
    const size_t key = segmentKey(vi);
    expectDeaths({
        {[&](auto& b) { b[vi + 13] = 0x04; }, "[self MXFKeyTypeforKey:key] == MXF_BodyPartionPack", pts(25)},
        {[&](auto& b) { b[vi + 18] = 0x10; }, "bppPacketLength<(readBytes+32)", pts(25)},
        {[&](auto& b) { b[key + 13] = 0x11; }, "[self MXFKeyTypeforKey:indexTableKeyAddr] == MXF_IndexTableSegment",
         pts(25)},
        {[&](auto& b) { b[key + 18] = 0x08; }, "(bppPacketLength + 16 + BERSize+BERLength)<readBytes", pts(25)},
        {[&](auto& b) { b[findTag(key, 0x3f0c, 8) + 3] = 4; }, "8 == packetLength", pts(25)},
        {[&](auto& b) { b[findTag(key, 0x3f0c, 8) + 1] = 0x7c; }, "videoIndexStartPosition != -1", pts(25)},
        {[&](auto& b) { storeBE32(&b[findTag(key, 0x3f0a, 8 + 20 * 11) + 4], 19); },
         "numberOfIndexEntries * indexEntrySize + 8 == packetLength", pts(25)},
    });
}

TEST_F(Damaged, FramesPerChunkChecks) {
    const size_t key = segmentKey(layout.chunks[0].videoIndexPartition);
    expectDeaths({
        {[&](auto& b) { storeBE64(&b[findTag(key, 0x3f0d, 8) + 4], 0); }, "videoIndexDuration!=0", pts(0)},
        {[&](auto& b) { storeBE64(&b[findTag(key, 0x3f0d, 8) + 4], ~0ull); }, "videoIndexDuration!=-1", pts(0)},
        // More index entries in a chunk than the clip has frames.
        {[&](auto&) { setClipDurations(true, 12); },
         "videoFramesInChunk >= 0 && videoFramesInChunk < _expectedVideoSampleArraySize", pts(0)},
    });
}

TEST_F(Damaged, AudioEssencePartitionChecks) {
    const uint64_t a = layout.chunks[1].audioPartition[0];
    expectDeaths({
        {[&](auto& b) { storeBE64(&b[ripEntry(1, 4) + 4], b.size() - 100); }, "readBytesEssense==256", pts(25)},
        {[&](auto& b) { b[a + 16] = 0x87; }, "BERSize<=4", pts(25)},
        {[&](auto& b) { b[a + 13] = 0x02; }, "[self MXFKeyTypeforKey:key] == MXF_BodyPartionPack", pts(25)},
        {[&](auto& b) { b[a + 19] = 230; }, "(bppPacketLength+24) < readBytesEssense", pts(25)},
        {[&](auto& b) { b[a + 140 + 12] = 0x17; }, "essenseTypeBeingParsed == MXF_AudioEssenseData", pts(25)},
        // A block align of 0 (reported softly while opening) stops the audio scan.
        {[&](auto&) { setBlockAlign(0); }, "_mxfAudioBytesPerSample > 0", pts(25)},
    });
}

TEST(MXFChunk, AudioChannelsAreAddedInOrder) {
    std::vector<uint8_t> group(mxfRIPPacketOffsets::ripGroupBytes(2), 0);
    const uint32_t sids[] = {1, 0, 2, 0, 3, 0, 4, 0};
    for (size_t i = 0; i < 8; ++i) storeBE32(&group[i * 12], sids[i]);
    auto chunk = mxfRIPPacketOffsets::initWithRIPPacket(group, 2, 0);
    ASSERT_TRUE(chunk);
    EXPECT_FALSE(mxfRIPPacketOffsets::initWithRIPPacket(std::span(group).first(group.size() - 1), 2, 0));
    EXPECT_DEATH(chunk->addAudioOffsetForChannel(1, mxfEssenseOffsets::initWithOffset(0, 0, 0, 0, 0)),
                 quoted("[_audioOffsets count]==channelNum"));
}

// ---------------------------------------------------------------------------
// Lookups.

TEST_F(Damaged, DecodeIndexChecks) {
    expectDeaths({
        // The first chunk's index lists no frames: no frames per chunk.
        {[&](auto& b) {
             storeBE32(&b[findTag(segmentKey(layout.chunks[0].videoIndexPartition), 0x3f0a, 8 + 20 * 11) + 4], 0);
         },
         "chunkSize != 0", dts(3)},
        {[&](auto&) { setClipDurations(true, 0); }, "_expectedVideoSampleArraySize != 0", dts(0)},
        // The header promises more frames than the chunks hold.
        {[&](auto&) { setClipDurations(true, 1000); }, "thisRIPoffset != NULL", dts(1000)},
        // Chunk 1 claims to start at frame 25: its records do not carry the index asked for.
        {[&](auto& b) { storeBE64(&b[findTag(segmentKey(layout.chunks[1].videoIndexPartition), 0x3f0c, 8) + 4], 25); },
         "thisEssenseOffset.decodeOrder == wantedDTSIndex", dts(21)},
    });
}

TEST_F(Damaged, ShortChunkChecks) {
    params.frames = 30;  // the second chunk holds 10 frames
    write();
    setClipDurations(true, 39);
    std::string p = save();
    EXPECT_MXF_DEATH(mxfDataObject::initWithPath(p)->getVideoOffsetForDTS(35), quoted("thisEssenseOffset != NULL"));
    EXPECT_MXF_DEATH(mxfDataObject::initWithPath(p)->getVideoOffsetForDTS(39), quoted("thisVideoOffset != NULL"));
}

TEST_F(Damaged, AudioLookupChecks) {
    // Audio as long as one chunk in a file of two: taken for the one-chunk form.
    setClipDurations(false, layout.samplesPerChunk);
    std::string p = save();
    EXPECT_MXF_DEATH(mxfDataObject::initWithPath(p)->getAudioOffsetForChannel(0, layout.samplesPerChunk + 3),
                     quoted("ripIndex==0"));
    EXPECT_MXF_DEATH(mxfDataObject::initWithPath(dir / "good.mxf")->getAudioOffsetForChannel(2, 5),
                     quoted("thisEssenseOffset != NULL"));
}

TEST_F(Damaged, SoftReportsLetTheScanGoOn) {
    setBlockAlign(4);
    std::string p = save();
    Capture capture;
    Ref<mxfDataObject> mxf = mxfDataObject::initWithPath(p);
    ASSERT_EQ(capture.recorder.failures.size(), 2u);  // one per descriptor
    EXPECT_EQ(capture.recorder.failures[0].description, "Expect audio blockAlign is 2 or 3.");
    EXPECT_EQ(capture.recorder.failures[0].method, "scanMXFForData");
    EXPECT_EQ(mxf->chunkCount(), 2u);
    EXPECT_EQ(mxf->audioBytesPerSample(), 4u);
    mxf->getAudioOffsetForChannel(0, 0);
    EXPECT_EQ(capture.recorder.failures.back().description, "invalid mxfAudioQuantization");
    EXPECT_EQ(capture.recorder.failures.back().method, "getAudioOffsetForChannel:atTime:");
}

// ---------------------------------------------------------------------------
// Damage that must end in a result or an assertion, never a memory error.

TEST_F(Damaged, TruncatedCopies) {
    Capture capture;
    const std::vector<uint8_t> good = bytes;
    std::vector<size_t> cuts;
    for (size_t cut = 0; cut < good.size(); cut += 1499) cuts.push_back(cut);
    for (const auto& c : layout.chunks)
        for (uint64_t at : {c.videoPartition, c.videoIndexPartition, c.audioPartition[1], c.audioIndexPartition[0]})
            for (uint64_t d : {0, 17, 150, 300}) cuts.push_back(size_t(at + d));
    for (uint64_t d = 0; d < 200; d += 7) cuts.push_back(size_t(layout.footerPartition + d));
    for (size_t cut : cuts) {
        if (cut > good.size()) continue;
        bytes.assign(good.begin(), good.begin() + long(cut));
        exerciseCopy();
    }
}

TEST_F(Damaged, BitFlippedCopies) {
    Capture capture;
    const std::vector<uint8_t> good = bytes;
    // Structural bytes: the header, every partition's pack and first element or
    // index segment, the footer and the RIP.
    std::vector<std::pair<size_t, size_t>> regions{{0, 4096}, {size_t(layout.footerPartition), good.size()}};
    for (const auto& c : layout.chunks) {
        for (uint64_t at : {c.videoPartition, c.videoIndexPartition, c.ancPartition, c.ancIndexPartition})
            regions.push_back({size_t(at), size_t(at + 600)});
        for (size_t ch = 0; ch < c.audioPartition.size(); ++ch) {
            regions.push_back({size_t(c.audioPartition[ch]), size_t(c.audioPartition[ch] + 180)});
            regions.push_back({size_t(c.audioIndexPartition[ch]), size_t(c.audioIndexPartition[ch] + 260)});
        }
    }
    std::mt19937 rng(20260101);
    for (int round = 0; round < 400; ++round) {
        bytes = good;
        int flips = 1 + round % 4;
        for (int f = 0; f < flips; ++f) {
            const auto& r = regions[rng() % regions.size()];
            size_t at = r.first + rng() % (std::min(r.second, good.size()) - r.first);
            if (round % 3 == 0)
                bytes[at] = uint8_t(rng());  // a whole byte
            else
                bytes[at] ^= uint8_t(1u << (rng() % 8));
        }
        exerciseCopy();
    }
}

TEST_F(Damaged, HostileLengthsAllocateNothingBeyondTheFile) {
    Capture capture;
    const std::vector<uint8_t> good = bytes;
    // The RIP and the header partition pack claiming values of 2^55 bytes.
    bytes[layout.footerPartition + 140 + 16] = 0x87;
    bytes[layout.footerPartition + 140 + 17] = 0x80;
    exerciseCopy();
    bytes = good;
    // HeaderByteCount and FooterPartition at their largest.
    storeBE64(&bytes[20 + 24], ~0ull);
    storeBE64(&bytes[20 + 32], ~0ull);
    exerciseCopy();
    bytes = good;
    // A channel count of four billion in the first descriptor.
    for (size_t at = 0; at + 8 < 32768; ++at)
        if (loadBE16(&bytes[at]) == 0x3d07 && loadBE16(&bytes[at + 2]) == 4) {
            storeBE32(&bytes[at + 4], 0xfffffff0u);
            break;
        }
    exerciseCopy();
}
