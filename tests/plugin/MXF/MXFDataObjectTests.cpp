#include "mxfDataObject.h"

#include "AVClipWriter.h"
#include "AssertionHandler.h"
#include "ByteReader.h"
#include "TestCaptures.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <fstream>
#include <iterator>
#include <thread>
#include <tuple>

namespace {

std::vector<uint8_t> readAll(const std::string& path) {
    std::ifstream f(path, std::ios::binary);
    return std::vector<uint8_t>(std::istreambuf_iterator<char>(f), {});
}

AVClipSpec longGOPSpec(uint64_t frames, uint32_t framesPerChunk, uint32_t channels = 2) {
    AVClipSpec s;
    s.coding = AVClipSpec::Coding::AVCLongGOP;
    s.frames = frames;
    s.framesPerChunk = framesPerChunk;
    s.audioChannels = channels;
    s.frameBytes = 2048;
    s.clipXML = "<SkarnClip/>";
    return s;
}

class MXFClip : public ::testing::Test {
protected:
    Ref<mxfDataObject> open(const AVClipSpec& params, const std::string& name = "clip.mxf") {
        path = dir / name;
        std::string error;
        EXPECT_TRUE(writeAVClip(path, params, &error, &layout)) << error;
        return mxfDataObject::initWithPath(path);
    }
    // Four threads look up every frame and audio block, each in its own order.
    void raceThroughChunks(const Ref<mxfDataObject>& mxf);
    TempDir dir;
    std::string path;
    AVClipLayout layout;
};

void expectFrame(const Ref<mxfEssenseOffsets>& r, const AVClipLayout& layout, uint64_t k) {
    ASSERT_TRUE(r) << "frame " << k;
    const auto& f = layout.frames[k];
    EXPECT_EQ(r->decodeOrder(), k);
    EXPECT_EQ(uint64_t(r->offset()), f.offset) << "frame " << k;
    EXPECT_EQ(r->size(), f.size) << "frame " << k;
    EXPECT_EQ(r->presentationOrder(), f.presentation) << "frame " << k;
    EXPECT_EQ(r->avcPictureType(), f.flags & 7) << "frame " << k;
}

}  // namespace

// ---------------------------------------------------------------------------
// What opening learns.

TEST_F(MXFClip, HeaderFactsAndChunkList) {
    AVClipSpec params = longGOPSpec(75, 30, 4);
    params.bitsPerSample = 16;
    Ref<mxfDataObject> mxf = open(params);
    EXPECT_EQ(std::make_tuple(mxf->getAudioChannelCount(), mxf->audioSamplingRate(), mxf->audioBytesPerSample()),
              std::make_tuple(4u, 48000u, 2u));
    uint32_t frames = 0;
    EXPECT_EQ(mxf->getVideoFrameCount(&frames), 0);
    EXPECT_EQ(frames, 75u);
    uint64_t chunkSize = 0, dataLength = 0;
    EXPECT_EQ(mxf->getAudioChunkSize(&chunkSize, &dataLength), 0);
    EXPECT_EQ(chunkSize, 48048u * 2);
    EXPECT_EQ(dataLength, layout.audioSamples * 2);
    EXPECT_EQ(mxf->footerPartitionOffset(), layout.footerPartition);
    ASSERT_EQ(mxf->chunkCount(), 3u);
    for (size_t i = 0; i < 3; ++i) {
        auto chunk = mxf->chunkAtIndex(i);
        EXPECT_EQ(chunk->ripChunkIndex(), i);
        EXPECT_EQ(chunk->getVideoIndexTableOffset()->EssenseBPPOffset(), layout.chunks[i].videoPartition);
        EXPECT_EQ(chunk->getVideoIndexTableOffset()->IndexTableBPPOffset(), layout.chunks[i].videoIndexPartition);
        EXPECT_EQ(chunk->getANCIndexTableOffset()->EssenseBPPOffset(), layout.chunks[i].ancPartition);
        ASSERT_EQ(chunk->getAudioIndexTableOffsets().size(), 4u);
        EXPECT_EQ(chunk->getAudioIndexTableOffsets()[3]->IndexTableBPPOffset(),
                  layout.chunks[i].audioIndexPartition[3]);
        EXPECT_FALSE(chunk->hasBeenScanned());
    }
    EXPECT_FALSE(mxf->getMXFIngestData());
    EXPECT_FALSE(mxf->getMXFXMLString());
}

TEST_F(MXFClip, OpeningReadsOnlyHeaderFooterAndRIP) {
    AVClipSpec shortSpec = longGOPSpec(60, 30);
    AVClipSpec longSpec = longGOPSpec(30 * 600, 30);
    longSpec.sparse = true;
    auto calls = [&](const AVClipSpec& s, const std::string& name) {
        auto stats = open(s, name)->readStatistics();
        RecordProperty(name, std::to_string(stats.calls) + " reads, " + std::to_string(stats.bytes) + " bytes");
        return stats.calls;
    };
    uint64_t few = calls(shortSpec, "short.mxf");
    uint64_t many = calls(longSpec, "long.mxf");
    // Header blocks, footer and RIP: the same few reads whatever the length
    // (a long RIP is one read of its own rather than cached blocks).
    EXPECT_LE(many, few + 2);
    EXPECT_LT(few, 12u);
}

TEST_F(MXFClip, UnreadableFileGivesAnEmptyObject) {
    Ref<mxfDataObject> mxf = mxfDataObject::initWithPath(dir / "missing.mxf");
    ASSERT_TRUE(mxf);
    EXPECT_EQ(mxf->chunkCount(), 0u);
    EXPECT_FALSE(mxf->getVideoOffsetForPTS(0));
    EXPECT_TRUE(mxfDataObject::initWithPath(std::nullopt));
    Ref<mxfDataObject> none = mxfDataObject::initWithBytes({});
    ASSERT_TRUE(none);
    EXPECT_EQ(none->chunkCount(), 0u);
    EXPECT_FALSE(none->getVideoOffsetForDTS(0));
}

// Over the file's bytes in memory every answer is the file's, and so are the
// reads made to find it (what the block cache and the chunk scans ask for).
TEST_F(MXFClip, BytesInMemoryAnswerAsTheFileDoes) {
    for (const AVClipSpec& params : {longGOPSpec(50, 20, 2), longGOPSpec(24, 0, 1)}) {
        Ref<mxfDataObject> file = open(params);
        std::vector<uint8_t> bytes = readAll(path);
        Ref<mxfDataObject> memory = mxfDataObject::initWithBytes(bytes);
        bytes.assign(bytes.size(), 0);  // the object keeps its own copy
        EXPECT_FALSE(memory->mxfPath());
        auto facts = [](const Ref<mxfDataObject>& m) {
            uint64_t chunkSize = 0, dataLength = 0;
            m->getAudioChunkSize(&chunkSize, &dataLength);
            uint32_t frames = 0;
            m->getVideoFrameCount(&frames);
            return std::make_tuple(m->chunkCount(), frames, m->getAudioChannelCount(), m->audioSamplingRate(),
                                   m->audioBytesPerSample(), m->footerPartitionOffset(), chunkSize, dataLength);
        };
        ASSERT_EQ(facts(memory), facts(file));
        auto same = [](const Ref<mxfEssenseOffsets>& a, const Ref<mxfEssenseOffsets>& b) {
            return describe(a) == describe(b);
        };
        for (int64_t k = 0; k < int64_t(params.frames); ++k) {
            EXPECT_TRUE(same(memory->getVideoOffsetForPTS(k), file->getVideoOffsetForPTS(k))) << "pts " << k;
            EXPECT_TRUE(same(memory->getVideoOffsetForDTS(k), file->getVideoOffsetForDTS(k))) << "dts " << k;
        }
        for (uint64_t sample : {uint64_t(0), uint64_t(layout.samplesPerChunk) + 7, layout.audioSamples - 1})
            EXPECT_TRUE(same(memory->getAudioOffsetForChannel(0, sample), file->getAudioOffsetForChannel(0, sample)));
        EXPECT_EQ(memory->readStatistics().calls, file->readStatistics().calls);
        EXPECT_EQ(memory->readStatistics().bytes, file->readStatistics().bytes);
    }
}

TEST_F(MXFClip, FileWithoutRIPHasNoChunksAndLookupsFindNothing) {
    open(longGOPSpec(40, 20));
    // Cut the file right after the footer partition pack.
    std::vector<uint8_t> bytes = readAll(path);
    bytes.resize(layout.footerPartition + 20 + 120);
    writeBytes(path, bytes);
    AssertionCapture capture;
    Ref<mxfDataObject> mxf = mxfDataObject::initWithPath(path);
    EXPECT_EQ(mxf->chunkCount(), 0u);
    EXPECT_TRUE(capture.recorder.failures.empty());  // the scan ends before the duration checks
    EXPECT_FALSE(mxf->getVideoOffsetForPTS(5));
    EXPECT_FALSE(mxf->getVideoOffsetForDTS(5));
    EXPECT_FALSE(mxf->getVideoOffsetForDTS(400));
}

TEST_F(MXFClip, FileWithoutAudio) {
    AVClipSpec params = longGOPSpec(40, 20, 0);
    std::string error;
    path = dir / "silent.mxf";
    ASSERT_TRUE(writeAVClip(path, params, &error, &layout)) << error;
    AssertionCapture capture;
    Ref<mxfDataObject> mxf = mxfDataObject::initWithPath(path);
    EXPECT_TRUE(capture.reported("Invalid _expectedAudioSampleArraySize\n"));
    EXPECT_FALSE(capture.reported("Invalid _expectedVideoSampleArraySize\n"));
    EXPECT_EQ(mxf->getAudioChannelCount(), 0u);
    ASSERT_EQ(mxf->chunkCount(), 2u);  // chunk groups of four entries
    EXPECT_TRUE(mxf->chunkAtIndex(1)->getAudioIndexTableOffsets().empty());
    for (uint64_t k = 0; k < 40; ++k) expectFrame(mxf->getVideoOffsetForDTS(int64_t(k)), layout, k);
    EXPECT_FALSE(mxf->getAudioOffsetForChannel(0, 0));
    EXPECT_TRUE(capture.reported("invalid _mxfRIPAudioChunkSize"));
    EXPECT_TRUE(capture.reported("invalid mxfAudioQuantization"));
}

TEST_F(MXFClip, DefaultHandlerRaisesForAClipWithoutAudio) {
    path = dir / "silent.mxf";
    ASSERT_TRUE(writeAVClip(path, longGOPSpec(12, 12, 0)));
    EXPECT_THROW(mxfDataObject::initWithPath(path), AssertionFailure);
}

// ---------------------------------------------------------------------------
// Video lookups.

// Every frame by decode and by presentation index: intra frames, a one-chunk
// file, and 20-frame chunks that split the three-frame reorder groups with the
// clip ending on a short chunk.
TEST_F(MXFClip, EveryFrameOfIntraOneChunkAndManyChunkLongGOPClips) {
    AVClipSpec intra;
    intra.frames = 70;
    intra.framesPerChunk = 30;
    const struct {
        const char* name;
        AVClipSpec params;
        size_t chunks;
    } cases[] = {{"intra", intra, 3}, {"one chunk", longGOPSpec(24, 0), 1}, {"many chunks", longGOPSpec(95, 20, 1), 5}};
    for (const auto& c : cases) {
        SCOPED_TRACE(c.name);
        Ref<mxfDataObject> mxf = open(c.params, std::string(c.name) + ".mxf");
        ASSERT_EQ(mxf->chunkCount(), c.chunks);
        for (uint64_t k = 0; k < c.params.frames; ++k) {
            Ref<mxfEssenseOffsets> byDTS = mxf->getVideoOffsetForDTS(int64_t(k));
            expectFrame(byDTS, layout, k);
            auto r = mxf->getVideoOffsetForPTS(int64_t(k));
            ASSERT_TRUE(r) << "pts " << k;
            EXPECT_EQ(r->presentationOrder(), k);
            EXPECT_EQ(layout.frames[r->decodeOrder()].presentation, k);
            if (c.params.coding == AVClipSpec::Coding::AVCIntra) {
                EXPECT_EQ(r, byDTS);
                EXPECT_EQ(byDTS->avcPictureType(), 4);
                EXPECT_EQ(byDTS->mediaSampleFlags(), 0x44000000u);
            }
        }
    }
}

TEST_F(MXFClip, PresentationIndexInTheNextChunkIsFoundThere) {
    Ref<mxfDataObject> mxf = open(longGOPSpec(40, 10, 1));
    // Stored frames 9 (P, shown at 11), 10 (B, shown at 9), 11 (B, shown at 10):
    // the frame shown at 9 lies in chunk 1 although 9 / 10 is chunk 0.
    ASSERT_EQ(layout.frames[10].presentation, 9u);
    Ref<mxfEssenseOffsets> r = mxf->getVideoOffsetForPTS(9);
    ASSERT_TRUE(r);
    expectFrame(r, layout, 10);
    EXPECT_EQ(r->avcPictureType(), 3);
    // And the P frame stored last in chunk 0 is shown in chunk 1's range.
    r = mxf->getVideoOffsetForPTS(11);
    ASSERT_TRUE(r);
    EXPECT_EQ(r->decodeOrder(), 9u);
    EXPECT_EQ(r->avcPictureType(), 6);
}

TEST_F(MXFClip, DecodeIndexAtAndBeyondTheEndGivesTheLastFrame) {
    Ref<mxfDataObject> mxf = open(longGOPSpec(50, 20, 1));
    Ref<mxfEssenseOffsets> last = mxf->getVideoOffsetForDTS(49);
    expectFrame(last, layout, 49);
    EXPECT_EQ(mxf->getVideoOffsetForDTS(50), last);
    EXPECT_EQ(mxf->getVideoOffsetForDTS(5000), last);
    EXPECT_EQ(mxf->getVideoOffsetForDTS(-1), last);  // unsigned: past the end
    EXPECT_FALSE(mxf->getVideoOffsetForPTS(50));
    EXPECT_FALSE(mxf->getVideoOffsetForPTS(-3));
}

TEST_F(MXFClip, ChunkIsScannedOnceWhenAskedTwice) {
    Ref<mxfDataObject> mxf = open(longGOPSpec(30 * 8, 30));
    mxf->getVideoOffsetForPTS(0);  // chunks 0 and 1
    // A chunk costs three reads (video essence head, video index, audio
    // essence head); a first lookup reads it and its two neighbours.
    uint64_t before = mxf->readStatistics().calls;
    Ref<mxfEssenseOffsets> r = mxf->getVideoOffsetForPTS(30 * 4 + 5);
    ASSERT_TRUE(r);
    EXPECT_EQ(mxf->readStatistics().calls - before, 9u);
    before = mxf->readStatistics().calls;
    EXPECT_EQ(mxf->getVideoOffsetForPTS(30 * 4 + 5), r);
    EXPECT_EQ(mxf->getVideoOffsetForDTS(30 * 4 + 6)->offset(), int64_t(layout.frames[30 * 4 + 6].offset));
    EXPECT_EQ(mxf->readStatistics().calls, before);
    EXPECT_EQ(mxf->chunkAtIndex(4)->getVideoOffsets().size(), 30u);
    // The neighbour's presentation index needs only its own other neighbour.
    before = mxf->readStatistics().calls;
    mxf->scanMXFForRIPIndex(5);
    EXPECT_EQ(mxf->readStatistics().calls - before, 3u);
    before = mxf->readStatistics().calls;
    mxf->scanMXFForRIPIndex(5);
    mxf->scanMXFForRIPIndex(4);
    EXPECT_EQ(mxf->readStatistics().calls, before);
}

// Chunks are built on first use: four threads that start on a freshly opened
// file race to build and scan the same chunks, each in its own order, and must
// all see one object per chunk and the writer's offsets, sizes and orders. An
// object over bytes in memory shares its one source between the threads' scans.
TEST_F(MXFClip, ChunksBuiltOnFirstUseFromSeveralThreads) {
    open(longGOPSpec(400, 10, 2));
    const std::vector<uint8_t> bytes = readAll(path);
    for (Ref<mxfDataObject> mxf : {mxfDataObject::initWithPath(path), mxfDataObject::initWithBytes(bytes)}) {
        SCOPED_TRACE(mxf->mxfPath() ? "file" : "memory");
        raceThroughChunks(mxf);
    }
}

void MXFClip::raceThroughChunks(const Ref<mxfDataObject>& mxf) {
    const size_t chunks = mxf->chunkCount();
    ASSERT_EQ(chunks, 40u);
    std::vector<std::vector<mxfRIPPacketOffsets*>> seen(4, std::vector<mxfRIPPacketOffsets*>(chunks));
    std::atomic<int> mismatches{0};
    std::vector<std::thread> threads;
    for (int t = 0; t < 4; ++t)
        threads.emplace_back([&, t] {
            auto check = [&](bool ok) {
                if (!ok) ++mismatches;
            };
            for (int i = 0; i < 400; ++i) {
                // Thread 0 walks forwards, 1 backwards, 2 and 3 stride through.
                const int64_t k = t == 0 ? i : t == 1 ? 399 - i : (i * (t == 2 ? 37 : 113) + 17 * t) % 400;
                const auto& frame = layout.frames[size_t(k)];
                const size_t c = size_t(k) / 10;
                if (t >= 2) {
                    Ref<mxfRIPPacketOffsets> chunk = mxf->chunkAtIndex(c);
                    seen[size_t(t)][c] = chunk.get();
                    check(chunk && chunk->ripChunkIndex() == c &&
                          chunk->getVideoIndexTableOffset()->EssenseBPPOffset() == layout.chunks[c].videoPartition &&
                          chunk->getAudioIndexTableOffsets()[1]->IndexTableBPPOffset() ==
                              layout.chunks[c].audioIndexPartition[1]);
                }
                Ref<mxfEssenseOffsets> d = mxf->getVideoOffsetForDTS(k);
                check(d && d->decodeOrder() == uint32_t(k) && uint64_t(d->offset()) == frame.offset &&
                      d->size() == frame.size && d->presentationOrder() == frame.presentation);
                Ref<mxfEssenseOffsets> p = mxf->getVideoOffsetForPTS(k);
                check(p && p->presentationOrder() == uint32_t(k));
                const auto& block = layout.chunks[c];
                Ref<mxfEssenseOffsets> a = mxf->getAudioOffsetForChannel(size_t(t % 2), block.firstSample + 5);
                check(a && uint64_t(a->offset()) == block.audioBlock[size_t(t % 2)] &&
                      a->presentationOrder() == block.firstSample);
                if (t < 2) seen[size_t(t)][c] = mxf->chunkAtIndex(c).get();
            }
        });
    for (auto& t : threads) t.join();
    EXPECT_EQ(mismatches.load(), 0);
    for (size_t c = 0; c < chunks; ++c)
        for (size_t t = 1; t < 4; ++t) EXPECT_EQ(seen[t][c], seen[0][c]) << "chunk " << c;
    EXPECT_FALSE(mxf->chunkAtIndex(chunks));
}

// ---------------------------------------------------------------------------
// Audio lookups.

TEST_F(MXFClip, AudioWithSeveralChunksAnswersTheWholeBlock) {
    Ref<mxfDataObject> mxf = open(longGOPSpec(75, 30, 2));
    const uint32_t S = layout.samplesPerChunk;
    ASSERT_EQ(S, 48048u);
    for (uint64_t chunk = 0; chunk < 3; ++chunk) {
        const auto& c = layout.chunks[chunk];
        for (uint64_t sample : {c.firstSample, c.firstSample + 1, c.firstSample + c.sampleCount - 1}) {
            for (size_t ch = 0; ch < 2; ++ch) {
                Ref<mxfEssenseOffsets> a = mxf->getAudioOffsetForChannel(ch, sample);
                ASSERT_TRUE(a) << sample;
                // Each channel takes channel 0's block size, even the short last chunk.
                EXPECT_EQ(std::make_tuple(uint64_t(a->offset()), uint64_t(a->presentationOrder()),
                                          uint64_t(a->decodeOrder()), uint64_t(a->size())),
                          std::make_tuple(c.audioBlock[ch], c.firstSample, c.firstSample, uint64_t(c.sampleCount) * 3));
            }
        }
    }
    // The PCM at the answered offset is the chunk's first sample of that channel.
    std::vector<uint8_t> bytes = readAll(path);
    Ref<mxfEssenseOffsets> a = mxf->getAudioOffsetForChannel(1, 2 * S + 17);
    const uint8_t* p = bytes.data() + a->offset() + 17 * 3;
    EXPECT_EQ(p[0] | p[1] << 8, int((2 * S + 17) & 0xffff));
    EXPECT_EQ(p[2], 1);
}

TEST_F(MXFClip, AudioBeforeTheChunksFirstSampleIsNil) {
    Ref<mxfDataObject> unused = open(longGOPSpec(60, 30, 1));
    unused = nullptr;
    // Move chunk 1's IndexStartPosition from 30 to 60: its audio then claims to
    // start at sample 2 x 48048.
    std::vector<uint8_t> bytes = readAll(path);
    const uint64_t at = layout.chunks[1].videoIndexPartition;
    bool patched = false;
    for (uint64_t i = at; i + 12 < at + 1024; ++i)
        if (bytes[i] == 0x3f && bytes[i + 1] == 0x0c && bytes[i + 3] == 8 && loadBE64(&bytes[i + 4]) == 30) {
            storeBE64(&bytes[i + 4], 60);
            patched = true;
            break;
        }
    ASSERT_TRUE(patched);
    writeBytes(path, bytes);
    Ref<mxfDataObject> mxf = mxfDataObject::initWithPath(path);
    EXPECT_TRUE(mxf->getAudioOffsetForChannel(0, 48048 + 5) == nullptr);
    EXPECT_TRUE(mxf->getAudioOffsetForChannel(0, 5));
}

TEST_F(MXFClip, OneChunkAudioIsSplitPerFrameWithRemainderSamplesFirst) {
    AVClipSpec params = longGOPSpec(30, 0, 2);  // 30 frames at 29.97: 48048 samples, 1601.6 a frame
    Ref<mxfDataObject> mxf = open(params);
    ASSERT_EQ(mxf->chunkCount(), 1u);
    uint64_t chunkSize = 0, dataLength = 0;
    mxf->getAudioChunkSize(&chunkSize, &dataLength);
    ASSERT_EQ(chunkSize, dataLength);
    const uint64_t block = layout.chunks[0].audioBlock[1];
    // 48048 = 30 x 1601 + 18: the first 18 frames take 1602 samples.
    Ref<mxfEssenseOffsets> first = mxf->getAudioOffsetForChannel(1, 0);
    ASSERT_TRUE(first);
    EXPECT_EQ(std::make_tuple(uint64_t(first->offset()), uint64_t(first->size()), uint64_t(first->presentationOrder())),
              std::make_tuple(block, uint64_t(1602 * 3), uint64_t(0)));
    Ref<mxfEssenseOffsets> late = mxf->getAudioOffsetForChannel(1, 48048 - 1601);
    ASSERT_TRUE(late);
    EXPECT_EQ(std::make_tuple(uint64_t(late->offset()), uint64_t(late->size()), uint64_t(late->decodeOrder())),
              std::make_tuple(block + (48048 - 1601) * 3, uint64_t(1601 * 3), uint64_t(48048 - 1601)));
    // Near the end the size is cut at the block.
    Ref<mxfEssenseOffsets> tail = mxf->getAudioOffsetForChannel(1, 48048 - 10);
    ASSERT_TRUE(tail);
    EXPECT_EQ(tail->size(), 10u * 3);
    EXPECT_FALSE(mxf->getAudioOffsetForChannel(1, 48048));
    // Fresh records, not the chunk's own.
    EXPECT_NE(mxf->getAudioOffsetForChannel(1, 0), mxf->chunkAtIndex(0)->getAudioOffsetsForChannel(1));
}

// ---------------------------------------------------------------------------
// Records and descriptions.

TEST(MXFRecords, PictureTypesFlagsAndLabels) {
    const struct {
        uint8_t type;
        uint32_t flags;
        const char* label;
    } table[] = {{0, 0x44010001, "I  "}, {1, 0, "BAD"}, {2, 0, "BAD"}, {3, 0x08000001, "B  "},
                 {4, 0x44000000, "IDR"}, {5, 0, "BAD"}, {6, 0x44000001, "P  "}, {7, 0x44000001, "Br "}};
    for (const auto& row : table) {
        auto r = mxfEssenseOffsets::initWithOffset(0x1234, 500, 7, row.type, -2);
        EXPECT_EQ(r->mediaSampleFlags(), row.flags);
        EXPECT_NE(r->description().find(row.label), std::string::npos) << r->description();
    }
    auto r = mxfEssenseOffsets::initWithOffset(0xabc, 42, 9, 6, 3);
    r->updateWithPTS(11);
    EXPECT_EQ(r->description(),
              "<mxfEssenseOffsets: offset:     abc size:    42 PTS:  11 DTS:   9 P   flags=44000001 TO: 3 >");
    r->updateAudioWithPTSandDTS(5);
    EXPECT_EQ(r->decodeOrder(), 5u);
    EXPECT_EQ(mxfRIPPacket::initWithEssenseBPPOffset(0x10, 0xff)->description(), "[10 I:ff]");
}

TEST(MXFRecords, PtsCompareIsSigned32Bit) {
    auto a = mxfEssenseOffsets::initWithOffset(0, 0, 0, 0, 0);
    auto b = mxfEssenseOffsets::initWithOffset(0, 0, 0, 0, 0);
    a->updateWithPTS(3);
    b->updateWithPTS(0x80000000u);  // negative as signed
    EXPECT_EQ(ptsCompare(a.get(), b.get()), 1);
    EXPECT_EQ(ptsCompare(b.get(), a.get()), -1);
    EXPECT_EQ(ptsCompare(a.get(), a.get()), 0);
}

TEST(MXFRecords, KeyTypes) {
    Ref<mxfDataObject> mxf = mxfDataObject::initWithPath(std::nullopt);
    auto key = [](std::initializer_list<uint8_t> b) {
        std::vector<uint8_t> k(b);
        k.resize(16, 0x7a);
        return k;
    };
    auto type = [&](const std::vector<uint8_t>& k) { return mxf->MXFKeyTypeforKey(std::span<const uint8_t>(k)); };
    EXPECT_EQ(type(key({6, 0x0e, 0x2b, 0x34, 2, 5, 1, 1, 0x0d, 1, 2, 1, 1, 2})), 1u);
    EXPECT_EQ(type(key({6, 0x0e, 0x2b, 0x34, 2, 5, 1, 1, 0x0d, 1, 2, 1, 1, 3})), 2u);
    EXPECT_EQ(type(key({6, 0x0e, 0x2b, 0x34, 2, 5, 1, 1, 0x0d, 1, 2, 1, 1, 4})), 3u);
    EXPECT_EQ(type(key({6, 0x0e, 0x2b, 0x34, 2, 5, 1, 1, 0x0d, 1, 2, 1, 1, 0x11, 1, 0})), 11u);
    EXPECT_EQ(type(key({6, 0x0e, 0x2b, 0x34, 2, 5, 1, 1, 0x0d, 1, 2, 1, 1, 0x11, 2, 0})), MXF_UnknownKey);
    EXPECT_EQ(type(key({6, 0x0e, 0x2b, 0x34, 1, 2, 1, 1, 0x0d, 1, 3, 1, 0x15})), 4u);
    EXPECT_EQ(type(key({6, 0x0e, 0x2b, 0x34, 1, 2, 1, 1, 0x0d, 1, 3, 1, 0x17})), 5u);
    EXPECT_EQ(type(key({6, 0x0e, 0x2b, 0x34, 1, 2, 1, 1, 0x0d, 1, 3, 1, 0x16})), 6u);
    EXPECT_EQ(type(key({6, 0x0e, 0x2b, 0x34, 2, 0x53, 1, 1, 0x0d, 1, 1, 1, 1, 1, 0x11})), 7u);
    EXPECT_EQ(type(key({6, 0x0e, 0x2b, 0x34, 2, 0x53, 1, 1, 0x0d, 1, 1, 1, 1, 1, 0x47})), 8u);
    EXPECT_EQ(type(key({6, 0x0e, 0x2b, 0x34, 2, 0x53, 1, 1, 0x0d, 1, 2, 1, 1, 0x10, 1, 0})), 9u);
    EXPECT_EQ(type(key({6, 0x0e, 0x2b, 0x34, 1, 1, 1, 9, 0x0e, 0x0e})), 10u);
    EXPECT_EQ(type({6, 0x0e, 0x2b, 0x34, 1, 1, 1, 2, 3, 1, 2, 0x10, 1, 0, 0, 0}), 0u);
    EXPECT_EQ(type(key({6, 0x0e, 0x2b, 0x34, 1, 1, 1, 1, 3, 1, 2, 0x10, 1})), MXF_UnknownKey);
    EXPECT_EQ(type({6, 0x0e, 0x2b, 0x34}), MXF_UnknownKey);  // too short to be a key
}

TEST_F(MXFClip, ChunkDescriptionBeforeAndAfterScanning) {
    Ref<mxfDataObject> mxf = open(longGOPSpec(20, 10, 2));
    auto chunk = mxf->chunkAtIndex(1);
    std::string before = chunk->description();
    EXPECT_EQ(before.find("SCANNED"), std::string::npos);
    EXPECT_NE(before.find(" A1:["), std::string::npos) << before;
    EXPECT_NE(before.rfind(" Indx:1>"), std::string::npos) << before;
    mxf->getVideoOffsetForPTS(12);
    std::string after = chunk->description();
    EXPECT_NE(after.find("SCANNED V:10 A0:" + std::to_string(layout.chunks[1].sampleCount * 3)), std::string::npos)
        << after;
}
