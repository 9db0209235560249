#include "CMSampleBuffer.h"
#include "DVFrameWriter.h"
#include "FormatReaderTestSupport.h"
#include "SkarnPulldown.h"

#include <thread>

using namespace frtest;

namespace {

constexpr int32_t kEnd = kVestaKilnSampleCursorNoMoreSamples;

// ---------------------------------------------------------------------------
// Byte-layout tracks (clip-XML clips)

class ByteLayoutCursor : public CardTest {
protected:
    void SetUp() override {
        shape = clipOf("dv-ntsc", 6, 1);
        shape.startTimecode = "00:00:00:00";
        reader = readerFor(shape);
        ASSERT_TRUE(reader);
        video = track(reader, 0);
        timecode = track(reader, 1);
        audio = track(reader, 2);
    }
    ClipSpec shape;
    Ref<SkarnFormatReader> reader;
    SkarnTrackReader *video = nullptr, *timecode = nullptr, *audio = nullptr;
};

TEST_F(ByteLayoutCursor, PlacementBeforeInsideAndPastTheTrack) {
    bool before = true, after = true;
    auto c = cursorAt(video, CMTimeMake(-1, 30), &before, &after);
    EXPECT_TRUE(before);
    EXPECT_FALSE(after);
    EXPECT_EQ(CMTimeCompare(c->presentationTimeStamp(), kCMTimeZero), 0);

    // Inside a frame: snapped down to its start, in the track's timescale.
    c = cursorAt(video, CMTimeMake(2500, 1000000), &before, &after);  // 2.5 ms... still frame 0
    EXPECT_FALSE(before);
    EXPECT_FALSE(after);
    EXPECT_EQ(c->currentPTS().value, 0);
    c = cursorAt(video, CMTimeMake(1001 * 3 + 500, 30000), &before, &after);
    EXPECT_EQ(c->currentPTS().value, 3003);
    EXPECT_EQ(c->currentPTS().timescale, 30000);

    c = cursorAt(video, CMTimeMake(10, 1), &before, &after);
    EXPECT_FALSE(before);
    EXPECT_TRUE(after);
    EXPECT_EQ(c->currentPTS().value, 5 * 1001);

    // Audio: not snapped; past the end it sits on the last sample.
    c = cursorAt(audio, CMTimeMake(1, 3), &before, &after);
    EXPECT_TRUE(after);
    EXPECT_EQ(c->currentPTS().value, audio->maxpts().value);
    c = cursorAt(audio, CMTimeMake(5000, 48000), &before, &after);
    EXPECT_FALSE(after);
    EXPECT_EQ(c->currentPTS().value, 5000);
    // The host's time is rounded half away from zero into the track's timescale.
    c = cursorAt(audio, CMTimeMake(3, 96000));
    EXPECT_EQ(c->currentPTS().value, 2);
}

TEST_F(ByteLayoutCursor, LocationsAreFramesFromTheTrackOffset) {
    DVStreamSpec dv;
    dv.family = DVFamily::DV25_411_525;
    dv.dropFrame = true;
    DVFrameWriter writer(dv);
    std::string path = *video->url();
    for (int64_t frame : {0, 1, 5}) {
        auto c = cursorAt(video, CMTimeMake(frame * 1001, 30000));
        Location l = locate(c.get());
        EXPECT_EQ(l.count, 1);
        EXPECT_EQ(l.offset, frame * 120000);
        EXPECT_EQ(l.length, 120000);
        EXPECT_EQ(readRange(path, video->locationOffset() + l.offset, l.length), writer.frame(uint64_t(frame)))
            << frame;
    }
    auto a = cursorAt(audio, CMTimeMake(100, 48000));
    Location l = locate(a.get());
    EXPECT_EQ(l.offset, 200);
    EXPECT_EQ(l.length, 2);
    // Lengths alone, and no room at all.
    int64_t count = 0, length = 0;
    a->sampleLocationWithArraySizes(1, &count, nullptr, &length, nullptr);
    EXPECT_EQ(length, 2);
    int64_t offset = -7;
    length = -7;
    a->sampleLocationWithArraySizes(0, &count, &offset, &length, nullptr);
    EXPECT_EQ(count, 1);
    EXPECT_EQ(offset, -7);
    EXPECT_EQ(length, -7);
}

TEST_F(ByteLayoutCursor, StepsStopAtBothEnds) {
    auto c = cursorAt(video, kCMTimeZero);
    EXPECT_EQ(c->stepInDecodeOrder(-1), kEnd);
    EXPECT_EQ(c->currentPTS().value, 0);
    EXPECT_EQ(c->stepInPresentationOrder(2), 0);
    EXPECT_EQ(c->currentPTS().value, 2002);
    EXPECT_EQ(c->stepInDecodeOrder(3), 0);
    EXPECT_EQ(c->currentPTS().value, 5005);
    EXPECT_EQ(c->stepInDecodeOrder(1), kEnd);
    EXPECT_EQ(c->currentPTS().value, 5005);
    EXPECT_EQ(c->stepByPresentationTime(CMTimeMake(-1, 1)), kEnd);
    EXPECT_EQ(c->currentPTS().value, 0);
    EXPECT_EQ(c->stepByDecodeTime(CMTimeMake(1001, 30000)), 0);
    EXPECT_EQ(c->decodeTimeStamp().value, 1001);
    EXPECT_EQ(c->stepByPresentationTime(CMTimeMake(1, 1)), kEnd);
    EXPECT_EQ(c->currentPTS().value, 5005);

    auto last = video->cursorAtLastSampleInDecodeOrder();
    auto first = video->cursorAtFirstSampleInDecodeOrder();
    EXPECT_EQ(CMTimeCompare(last->presentationTimeStamp(), CMTimeMake(5005, 30000)), 0);
    EXPECT_EQ(first->compareInDecodeOrder(last.get()), -1);
    EXPECT_EQ(last->compareInDecodeOrder(first.get()), 1);
    EXPECT_EQ(last->compareInDecodeOrder(c.get()), 0);

    auto a = cursorAt(audio, audio->maxpts());
    EXPECT_EQ(a->stepInDecodeOrder(1), kEnd);
    EXPECT_EQ(a->stepInPresentationOrder(-int64_t(audio->maxpts().value) - 1), kEnd);
    EXPECT_EQ(a->currentPTS().value, 0);
}

TEST_F(ByteLayoutCursor, ChunksQueriesAndCounters) {
    auto c = cursorAt(video, CMTimeMake(3 * 1001, 30000));
    Chunk ch = chunkOf(c.get());
    EXPECT_EQ(ch.offset, 3 * 120000);
    EXPECT_EQ(ch.size, 120000);
    EXPECT_EQ(ch.count, 1);
    EXPECT_EQ(ch.index, 0);
    EXPECT_TRUE(ch.sameSize && ch.sameDuration && ch.sameFormat);
    EXPECT_EQ(c->duration().value, 1001);
    EXPECT_EQ(CMTimeCompare(c->playableHorizon(), CMTimeMake(3 * 1001, 30000)), 0);
    EXPECT_EQ(c->formatDescription(), video->formatDesc());
    EXPECT_TRUE(c->sampleDependencyAttributes().isNull());
    bool full = false;
    c->dependencyInfoWithFullSync(&full, nullptr, nullptr, nullptr);
    EXPECT_FALSE(full);  // nothing written without an MXF object
    EXPECT_EQ(c->followonDropCount(), 0);
    EXPECT_TRUE(c->propertyForKey("anything").isNull());

    // The start frame times the frame index, deliberately.
    video->setTimecodeStart(7);
    EXPECT_EQ(cursorAt(video, kCMTimeZero)->timecodeCounter(), 7);
    EXPECT_EQ(cursorAt(video, CMTimeMake(3 * 1001, 30000))->timecodeCounter(), 21);

    // Copies stand where their original stands.
    auto copy = c->copyWithZone();
    EXPECT_EQ(CMTimeCompare(copy->currentPTS(), c->currentPTS()), 0);

    // The timecode track shares the video timing.
    auto t = cursorAt(timecode, CMTimeMake(2 * 1001, 30000));
    EXPECT_EQ(locate(t.get()).offset, 2 * 120000);
    EXPECT_EQ(t->stepInDecodeOrder(10), kEnd);
}

TEST_F(CardTest, ShortLastAudioChunk) {
    // 1048576 16-bit samples fill a chunk; five more make a short second one.
    ClipSpec shape = clipOf("dv-ntsc", 656, 1);
    shape.sparse = true;
    WrittenClip w = write(shape);
    std::string size = std::to_string(audioSamplesFor(shape) * 2);
    replaceInFile(w.clipPath, "<DataSize>" + size + "</DataSize>",
                  "<DataSize>" + std::to_string((1048576 + 5) * 2) + "</DataSize>");
    _clip = load(w.clipPath);
    auto reader = readerFor(_clip);
    SkarnTrackReader* audio = track(reader, 2);
    ASSERT_EQ(audio->samplesPerChunk(), 1048576);
    Chunk first = chunkOf(cursorAt(audio, CMTimeMake(1000, 48000)).get());
    EXPECT_EQ(first.offset, 0);
    EXPECT_EQ(first.size, 2097152);
    EXPECT_EQ(first.count, 1048576);
    EXPECT_EQ(first.index, 1000);
    Chunk last = chunkOf(cursorAt(audio, CMTimeMake(1048576 + 2, 48000)).get());
    EXPECT_EQ(last.offset, 2097152);
    EXPECT_EQ(last.size, 10);
    EXPECT_EQ(last.count, 5);
    EXPECT_EQ(last.index, 2);
}

TEST_F(CardTest, UnknownFrameRateCursorsStandStill) {
    WrittenClip w = write(clipOf("dv-ntsc", 4, 1));
    replaceInFile(w.clipPath, ">59.94i<", ">garbage<");
    _clip = load(w.clipPath);
    auto reader = readerFor(_clip);
    for (size_t i : {0, 1}) {
        SkarnTrackReader* t = track(reader, i);
        for (CMTime at : {kCMTimeZero, CMTimeMake(1, 1), CMTimeMake(-1, 1), kCMTimeInvalid}) {
            auto c = cursorAt(t, at);
            ASSERT_TRUE(c);
            EXPECT_EQ(c->currentPTS().value, 0);
            EXPECT_EQ(c->stepInDecodeOrder(1), kEnd);
            EXPECT_EQ(c->stepInPresentationOrder(-1), kEnd);
            EXPECT_EQ(c->stepByPresentationTime(CMTimeMake(1, 1)), kEnd);
            EXPECT_EQ(c->stepByDecodeTime(CMTimeMake(1, 1)), kEnd);
            EXPECT_EQ(c->currentPTS().value, 0);
            EXPECT_EQ(locate(c.get()).count, 0);
            (void)chunkOf(c.get());
            (void)c->timecodeCounter();
            (void)c->followonDropCount();
        }
    }
}

// ---------------------------------------------------------------------------
// A removed cadence

TEST_F(CardTest, CadenceLocationsSkipTheRepeatsAndChunksAreNotOffered) {
    ClipSpec c = clipOf("dv-ntsc", 12, 1);
    DVStreamSpec dv;
    dv.cadence = DVCadence::TwentyFourInThirty;
    dv.cadencePhase = 1;
    c.dv = dv;
    WrittenClip w = write(c);
    replaceInFile(w.clipPath, ">59.94i<", ">29.97p<");
    _clip = load(w.clipPath);
    auto reader = readerFor(_clip);
    SkarnTrackReader* video = track(reader, 0);
    ASSERT_EQ(video->patternIndex(), 1u);
    // From position 1 of keep-keep-drop-keep-keep: frames 0, 2, 3, 4, 5, 7, ...
    const int64_t recorded[] = {0, 2, 3, 4, 5, 7, 8, 9};
    auto cursor = video->cursorAtFirstSampleInDecodeOrder();
    for (int64_t k = 0; k < 8; ++k) {
        auto s = static_cast<SkarnSampleCursor*>(cursor.get());
        EXPECT_EQ(locate(s).offset, recorded[k] * 120000) << k;
        // The repeat that follows a kept frame: the one at position 1 is followed
        // by the drop at position 2.
        EXPECT_EQ(s->followonDropCount(), kSkarnTwentyFourInThirtyDropSequence[(1 + k + 1) % 5]) << k;
        Chunk untouched;
        s->chunkDetails(nullptr, &untouched.offset, &untouched.size, &untouched.count, &untouched.index,
                        &untouched.sameSize, &untouched.sameDuration, &untouched.sameFormat);
        EXPECT_EQ(untouched.offset, -7);
        EXPECT_EQ(untouched.size, -7);
        EXPECT_EQ(untouched.count, -7);
        EXPECT_EQ(untouched.index, -7);
        EXPECT_FALSE(untouched.sameSize || untouched.sameDuration || untouched.sameFormat);
        EXPECT_EQ(cursor->stepInDecodeOrder(1), 0);
    }
    // At the last pattern position the follow-on count wraps to position 0.
    video->setPatternIndex(3);
    auto wrap = cursorAt(video, CMTimeMake(1001, 24000));
    EXPECT_EQ(wrap->followonDropCount(), kSkarnTwentyFourInThirtyDropSequence[0]);
}

// ---------------------------------------------------------------------------
// Self-contained clips

class MXFCursor : public CardTest {
protected:
    void open(uint64_t frames, uint32_t framesPerChunk, AVClipSpec::Coding coding = AVClipSpec::Coding::AVCLongGOP,
              uint32_t channels = 2) {
        AVClipSpec shape;
        shape.coding = coding;
        shape.frames = frames;
        shape.framesPerChunk = framesPerChunk;
        shape.audioChannels = channels;
        shape.frameBytes = 2048;
        shape.gopLength = 12;
        path = writeAVClipFile(shape, "A001", &layout);
        _clip = load(path);
        ASSERT_TRUE(_clip);
        reader = readerFor(_clip);
        ASSERT_TRUE(reader);
        video = track(reader, 0);
        timecode = track(reader, 1);
        audio = track(reader, 2);
        ASSERT_NE(video->mxfDataAccess(), nullptr);
        fd = video->frameDuration();
    }
    // Stored position of the frame shown at p.
    uint32_t storedAt(uint32_t p) const {
        for (uint32_t k = 0; k < layout.frames.size(); ++k)
            if (layout.frames[k].presentation == p) return k;
        return UINT32_MAX;
    }
    CMTime at(int64_t frames) const { return CMTimeMake(frames * fd.value, fd.timescale); }

    std::string path;
    AVClipLayout layout;
    Ref<SkarnFormatReader> reader;
    SkarnTrackReader *video = nullptr, *timecode = nullptr, *audio = nullptr;
    CMTime fd{};
};

TEST_F(MXFCursor, OpenGOPDecodeAndPresentationOrderAcrossChunkEnds) {
    // Ten frames a chunk: the reordered triples 9-11 and 18-20 straddle chunk
    // ends, and the I at 12 opens a GOP whose two B frames (stored after it)
    // are shown before it.
    open(30, 10);
    ASSERT_EQ(layout.frames[12].flags & 7, 0);
    ASSERT_EQ(layout.frames[12].presentation, 14u);
    ASSERT_EQ(layout.frames[13].presentation, 12u);
    ASSERT_EQ(layout.frames[9].presentation, 11u);

    // Decode order: every stored frame once, with its own presentation time.
    auto cursor = video->cursorAtFirstSampleInDecodeOrder();
    auto* s = static_cast<SkarnSampleCursor*>(cursor.get());
    for (uint32_t k = 0; k < 30; ++k) {
        EXPECT_EQ(s->currentMXFIndex(), k);
        EXPECT_EQ(CMTimeCompare(s->decodeTimeStamp(), at(k)), 0) << k;
        EXPECT_EQ(CMTimeCompare(s->presentationTimeStamp(), at(layout.frames[k].presentation)), 0) << k;
        Location l = locate(s);
        EXPECT_EQ(uint64_t(l.offset), layout.frames[k].offset) << k;
        EXPECT_EQ(uint64_t(l.length), layout.frames[k].size) << k;
        Chunk ch = chunkOf(s);
        EXPECT_EQ(uint64_t(ch.offset), layout.frames[k].offset);
        EXPECT_EQ(ch.count, 1);
        EXPECT_FALSE(ch.sameSize);
        EXPECT_EQ(cursor->stepInDecodeOrder(1), k < 29 ? 0 : kEnd) << k;
    }
    EXPECT_EQ(s->currentMXFIndex(), 29u);

    // Presentation order: each shown frame in turn, found at its stored place.
    auto p = video->cursorAtPresentationTimeStamp(kCMTimeZero, nullptr, nullptr);
    auto* ps = static_cast<SkarnSampleCursor*>(p.get());
    for (uint32_t t = 0; t < 30; ++t) {
        EXPECT_EQ(CMTimeCompare(ps->presentationTimeStamp(), at(t)), 0) << t;
        EXPECT_EQ(ps->currentMXFIndex(), storedAt(t)) << t;
        EXPECT_EQ(CMTimeCompare(ps->decodeTimeStamp(), at(storedAt(t))), 0) << t;
        EXPECT_EQ(p->stepInPresentationOrder(1), t < 29 ? 0 : kEnd) << t;
    }

    // A B frame shown before the I it follows in decode order compares later.
    auto b = cursorAt(video, at(12));
    auto i = cursorAt(video, at(14));
    EXPECT_EQ(b->currentMXFIndex(), 13u);
    EXPECT_EQ(i->currentMXFIndex(), 12u);
    EXPECT_EQ(b->compareInDecodeOrder(i.get()), 1);
    EXPECT_EQ(i->stepByDecodeTime(at(1)), 0);
    EXPECT_EQ(i->currentMXFIndex(), 13u);
    EXPECT_EQ(CMTimeCompare(i->currentPTS(), at(12)), 0);
    EXPECT_EQ(i->stepByPresentationTime(at(2)), 0);
    EXPECT_EQ(CMTimeCompare(i->currentPTS(), at(14)), 0);
    EXPECT_EQ(i->currentMXFIndex(), 12u);
}

TEST_F(MXFCursor, VideoPlacementAndEnds) {
    open(30, 10);
    bool before = false, after = false;
    // Inside a frame: its start, with the frame's decode index.
    auto c = cursorAt(video, CMTimeMake(at(10).value + 1, fd.timescale), &before, &after);
    EXPECT_FALSE(before || after);
    EXPECT_EQ(CMTimeCompare(c->currentPTS(), at(10)), 0);
    EXPECT_EQ(c->currentMXFIndex(), 11u);

    c = cursorAt(video, CMTimeMake(-3, 1), &before, &after);
    EXPECT_TRUE(before);
    EXPECT_EQ(CMTimeCompare(c->currentPTS(), kCMTimeZero), 0);
    EXPECT_EQ(c->currentMXFIndex(), 0u);
    c = cursorAt(video, CMTimeMake(100, 1), &before, &after);
    EXPECT_TRUE(after);
    EXPECT_EQ(CMTimeCompare(c->currentPTS(), at(29)), 0);

    auto last = video->cursorAtLastSampleInDecodeOrder();
    auto* l = static_cast<SkarnSampleCursor*>(last.get());
    EXPECT_EQ(l->currentMXFIndex(), 29u);
    EXPECT_EQ(last->stepInDecodeOrder(1), kEnd);
    EXPECT_EQ(l->currentMXFIndex(), 29u);
    EXPECT_EQ(last->stepInDecodeOrder(-40), kEnd);
    EXPECT_EQ(l->currentMXFIndex(), 0u);
    EXPECT_EQ(CMTimeCompare(l->currentPTS(), kCMTimeZero), 0);
    EXPECT_EQ(last->stepInPresentationOrder(-1), kEnd);
    EXPECT_EQ(last->stepByDecodeTime(CMTimeMake(-1, 1)), kEnd);
    EXPECT_EQ(last->stepByDecodeTime(CMTimeMake(100, 1)), kEnd);
    EXPECT_EQ(l->currentMXFIndex(), 29u);
    EXPECT_EQ(last->stepByPresentationTime(CMTimeMake(100, 1)), kEnd);
    EXPECT_EQ(CMTimeCompare(l->currentPTS(), at(29)), 0);
}

TEST_F(MXFCursor, DependencyFlagsComeFromTheSampleFlags) {
    open(30, 10);
    struct Want {
        uint32_t shown;
        int64_t notSync, partial, earlier;
        int64_t dependsOn;        // -1: absent
        int64_t dependedOn;
        bool droppable;
    };
    // Stored 0 IDR, 12 open I (shown 14), 13 B (shown 12), 15 P (shown 17).
    const Want wants[] = {
        {0, 0, 0, 1, -1, 1, false},
        {14, 1, 1, 1, -1, 1, false},
        {12, 1, 0, 0, -1, 0, true},
        {17, 1, 0, 1, -1, 1, false},
    };
    for (const Want& w : wants) {
        auto c = cursorAt(video, at(w.shown));
        Value d = c->sampleDependencyAttributes();
        EXPECT_EQ(d[kCMSampleAttachmentKey_NotSync].integerValue(), w.notSync) << w.shown;
        EXPECT_EQ(d[kCMSampleAttachmentKey_PartialSync].integerValue(), w.partial) << w.shown;
        EXPECT_EQ(d[kCMSampleAttachmentKey_EarlierDisplayTimesAllowed].integerValue(), w.earlier) << w.shown;
        EXPECT_EQ(d[kCMSampleAttachmentKey_DependsOnOthers].isNull(), w.dependsOn < 0) << w.shown;
        EXPECT_EQ(d[kCMSampleAttachmentKey_IsDependedOnByOthers].integerValue(), w.dependedOn) << w.shown;
        bool full = false, partial = false, droppable = false;
        double threshold = 0;
        c->dependencyInfoWithFullSync(&full, &partial, &threshold, &droppable);
        EXPECT_EQ(full, w.notSync == 0) << w.shown;
        EXPECT_EQ(partial, w.partial == 1) << w.shown;
        EXPECT_EQ(droppable, w.droppable) << w.shown;
        EXPECT_EQ(threshold, 2.0);
    }
    auto a = cursorAt(audio, kCMTimeZero);
    EXPECT_EQ(a->sampleDependencyAttributes().dictionary().size(), 0u);
    EXPECT_FALSE(a->sampleDependencyAttributes().isNull());
}

TEST_F(MXFCursor, AudioStepsForwardWhicheverWayAndStopsAtTheEnd) {
    open(30, 10, AVClipSpec::Coding::AVCIntra);
    ASSERT_EQ(audio->samplesPerChunk(), int64_t(layout.samplesPerChunk));
    auto c = cursorAt(audio, CMTimeMake(100, 48000));
    auto* s = static_cast<SkarnSampleCursor*>(c.get());
    int64_t start = s->currentPTS().value;
    EXPECT_EQ(c->stepInDecodeOrder(-3), 0);
    EXPECT_EQ(s->currentPTS().value, start + 3);
    EXPECT_EQ(c->stepInDecodeOrder(3), 0);
    EXPECT_EQ(s->currentPTS().value, start + 6);
    EXPECT_EQ(s->currentMXFIndex(), 0u);
    // Across a chunk: the index follows.
    EXPECT_EQ(c->stepInDecodeOrder(int64_t(layout.samplesPerChunk)), 0);
    EXPECT_EQ(s->currentMXFIndex(), 1u);
    // Past the last sample: the last chunk, the time left past the end.
    EXPECT_EQ(c->stepInDecodeOrder(int64_t(layout.audioSamples) * 2), kEnd);
    EXPECT_EQ(s->currentMXFIndex(), uint32_t(audio->maxpts().value / audio->samplesPerChunk()));

    bool before = false, after = false;
    auto end = cursorAt(audio, CMTimeMake(100, 1), &before, &after);
    EXPECT_TRUE(after);
    auto* e = static_cast<SkarnSampleCursor*>(end.get());
    EXPECT_EQ(e->currentMXFIndex(), uint32_t(audio->maxpts().value / audio->samplesPerChunk()));
    EXPECT_EQ(end->stepByPresentationTime(CMTimeMake(1, 1)), kEnd);
    auto begin = cursorAt(audio, CMTimeMake(-1, 1), &before, &after);
    EXPECT_TRUE(before);
    EXPECT_EQ(begin->stepByPresentationTime(CMTimeMake(-1, 1)), kEnd);
    EXPECT_EQ(static_cast<SkarnSampleCursor*>(begin.get())->currentPTS().value, 0);

    // The timecode track of an MXF clip stands still in decode order.
    auto t = timecode->cursorAtFirstSampleInDecodeOrder();
    EXPECT_EQ(t->stepInDecodeOrder(5), 0);
}

TEST_F(MXFCursor, AudioLocationsAndChunksInsideTheBlock) {
    open(30, 10, AVClipSpec::Coding::AVCIntra);
    const auto& chunk1 = layout.chunks[1];
    // A cursor placed inside chunk 1 stands on the block's first sample.
    auto c = cursorAt(audio, CMTimeMake(int64_t(chunk1.firstSample) + 50, 48000));
    auto* s = static_cast<SkarnSampleCursor*>(c.get());
    EXPECT_EQ(s->currentPTS().value, int64_t(chunk1.firstSample));
    EXPECT_EQ(s->currentMXFIndex(), 1u);
    ASSERT_EQ(c->stepInDecodeOrder(50), 0);
    Location l = locate(s);
    EXPECT_EQ(uint64_t(l.offset), chunk1.audioBlock[0] + 50 * 3);
    EXPECT_EQ(l.length, 3);
    Chunk ch = chunkOf(s);
    EXPECT_EQ(uint64_t(ch.offset), chunk1.audioBlock[0] + 50 * 3);
    EXPECT_EQ(ch.size, 1602 * 3);  // one 29.97 frame of 48 kHz, rounded
    EXPECT_EQ(ch.count, 1602);
    EXPECT_EQ(ch.index, 0);
    EXPECT_TRUE(ch.sameSize);

    // Near the end of the block the chunk is cut at the block's end.
    auto near = cursorAt(audio, CMTimeMake(int64_t(chunk1.firstSample), 48000));
    ASSERT_EQ(near->stepInDecodeOrder(int64_t(chunk1.sampleCount) - 10), 0);
    Chunk cut = chunkOf(static_cast<SkarnSampleCursor*>(near.get()));
    EXPECT_EQ(cut.size, 10 * 3);
    EXPECT_EQ(cut.count, 10);

    // Channel 1 reads its own block.
    auto other = cursorAt(track(reader, 3), CMTimeMake(int64_t(chunk1.firstSample), 48000));
    EXPECT_EQ(uint64_t(locate(static_cast<SkarnSampleCursor*>(other.get())).offset), chunk1.audioBlock[1]);

    // A copy keeps the time it was at, where a fresh placement would snap back.
    auto copy = s->copyWithZone();
    EXPECT_EQ(copy->currentPTS().value, s->currentPTS().value);
    EXPECT_EQ(copy->currentMXFIndex(), s->currentMXFIndex());
    auto replaced = cursorAt(audio, s->currentPTS());
    EXPECT_NE(replaced->currentPTS().value, s->currentPTS().value);
}

TEST_F(MXFCursor, VideoCopyKeepsItsIndex) {
    open(30, 10);
    auto c = cursorAt(video, at(12));
    c->setCurrentMXFIndex(5);  // what a copy must keep, even if placement would say 13
    auto copy = c->copyWithZone();
    EXPECT_EQ(copy->currentMXFIndex(), 5u);
    EXPECT_EQ(CMTimeCompare(copy->currentPTS(), at(12)), 0);
}

TEST_F(MXFCursor, TrackReaderQuestions) {
    open(15, 5, AVClipSpec::Coding::AVCIntra);
    EXPECT_EQ(video->trackEditCount(), 1);
    for (CMTime t : {CMTimeMake(-1, 1), at(3), CMTimeMake(100, 1)}) EXPECT_EQ(video->trackEditIndexWithTrackTime(t), 0);
    CMTimeMapping edit = video->trackEditWithIndex(7);
    EXPECT_EQ(CMTimeCompare(edit.source.duration, video->trackDuration()), 0);
    EXPECT_EQ(CMTimeCompare(edit.target.start, kCMTimeZero), 0);
    EXPECT_EQ(video->timescale(), 30000);
    EXPECT_TRUE(video->isEnabled());
    EXPECT_TRUE(video->propertyForKey("x").isNull());
    EXPECT_EQ(video->formatDescription(), video->formatDesc());

    // A copy leaves out the description, the drop sequence and the channel.
    SkarnTrackReader* channel1 = track(reader, 3);
    channel1->setFollowonDropSequence(kSkarnHalfRateDropSequence);
    Ref<SkarnTrackReader> copy = channel1->copyWithZone();
    EXPECT_EQ(copy->formatDesc(), nullptr);
    EXPECT_EQ(copy->followonDropSequence(), nullptr);
    EXPECT_EQ(copy->audioChannelIndex(), 0u);
    EXPECT_EQ(copy->mxfDataAccess(), channel1->mxfDataAccess());
    EXPECT_EQ(copy->chunkSize(), channel1->chunkSize());
    EXPECT_EQ(copy->formatReader(), channel1->formatReader());
    EXPECT_TRUE(copy->useTimingOffset());
}

// ---------------------------------------------------------------------------
// Programming errors stop with their expression

TEST_F(MXFCursor, HardAssertionsReportTheirExpressions) {
    open(15, 5);
    EXPECT_EQ(hardAssertionText([&] { SkarnSampleCursor::sampleCursorAtFirstSampleInDecodeOrder(video, at(1)); }),
              "CMTIME_COMPARE_INLINE(pts,==,trackReader.minpts)");
    EXPECT_EQ(hardAssertionText([&] { SkarnSampleCursor::sampleCursorAtLastSampleInDecodeOrder(video, at(1)); }),
              "CMTIME_COMPARE_INLINE(pts,==,trackReader.maxpts)");
    EXPECT_EQ(hardAssertionText([&] {
                  int64_t length = 0;
                  cursorAt(video, kCMTimeZero)->sampleLocationWithArraySizes(1, nullptr, nullptr, &length, nullptr);
              }),
              "!self.trackReader.mxfDataAccess || self.trackReader.mediaType == kCMMediaType_Audio");
    EXPECT_EQ(hardAssertionText([&] { cursorAt(audio, kCMTimeZero)->dependencyInfoWithFullSync(nullptr, nullptr, nullptr, nullptr); }),
              "self.trackReader.mediaType==kCMMediaType_Video");
    EXPECT_EQ(hardAssertionText([&] {
                  auto c = cursorAt(video, at(2));
                  c->setCurrentPTS(CMTimeMake(-1, fd.timescale));
                  c->presentationTimeStamp();
              }),
              "CMTIME_COMPARE_INLINE(wantedPTS, >=, kCMTimeZero)");
    EXPECT_EQ(hardAssertionText([&] {
                  auto c = cursorAt(video, at(2));
                  c->setCurrentPTS(CMTimeMake(at(2).value + 1, fd.timescale));
                  c->presentationTimeStamp();
              }),
              "CMTIME_COMPARE_INLINE(wantedPTS, ==, time)");
    EXPECT_EQ(hardAssertionText([&] {
                  auto c = cursorAt(video, at(2));
                  c->setCurrentPTS(CMTimeMake(2, 60));
                  c->stepByDecodeTime(at(1));
              }),
              "self.trackReader.frameDuration.timescale == self.currentPTS.timescale");

    // A track whose frame duration was lost.
    Ref<SkarnTrackReader> broken = video->copyWithZone();
    broken->setFrameDuration(CMTimeMake(0, 30000));
    EXPECT_EQ(hardAssertionText([&] { broken->mxfVideoSampleOffsetAtPresentationTime(kCMTimeZero); }),
              "_frameDuration.value>0");
    CMTime noTimescale = CMTimeMake(1001, 1);
    noTimescale.timescale = 0;
    broken->setFrameDuration(noTimescale);
    EXPECT_EQ(hardAssertionText([&] { broken->mxfVideoSampleOffsetAtDecodeTime(kCMTimeZero); }),
              "_frameDuration.timescale>0");

    // A clip length that disagrees with the index tables.
    Ref<SkarnTrackReader> longer = video->copyWithZone();
    longer->setMaxpts(at(20));
    EXPECT_EQ(hardAssertionText([&] { cursorAt(longer.get(), at(1)); }),
              "CMTIME_COMPARE_INLINE(maxpts,==,_trackReader.maxpts)");
}

TEST_F(MXFCursor, DefaultHandlerEndsTheProcessWithTheExpression) {
    open(6, 6, AVClipSpec::Coding::AVCIntra);
    EXPECT_DEATH(SkarnSampleCursor::sampleCursorAtFirstSampleInDecodeOrder(video, at(1)),
                 "CMTIME_COMPARE_INLINE\\(pts,==,trackReader.minpts\\).*SkarnFormatReader");
}

TEST_F(MXFCursor, SoftAssertionsGoThroughTheHandler) {
    open(15, 5);
    AssertionCapture capture;
    auto a = cursorAt(audio, kCMTimeZero);
    // A handler that returns lets the audio track on into the video lookup,
    // whose table checks then stop it.
    EXPECT_THROW(a->stepInPresentationOrder(1), HardAssertionFailure);
    EXPECT_TRUE(capture.reported("Must be Video"));

    auto v = cursorAt(video, at(4));
    v->setCurrentMXFIndex(1);
    v->stepInDecodeOrder(1);
    EXPECT_TRUE(capture.reported("currentMXFIndex not equaling decodeOrder"));

    Ref<SkarnTrackReader> skewed = video->copyWithZone();
    auto s = cursorAt(skewed.get(), at(1));
    skewed->setMaxpts(CMTimeMake(14 * 1001 * 2, 60000));  // the same time, another timescale
    s->stepInDecodeOrder(1);
    EXPECT_TRUE(capture.reported("timescale error"));

    // Asking for the decode stamp only notes the disagreement.
    auto d = cursorAt(video, at(4));
    d->setCurrentMXFIndex(9);
    size_t before = capture.recorder.failures.size();
    EXPECT_EQ(CMTimeCompare(d->decodeTimeStamp(), at(9)), 0);
    EXPECT_EQ(capture.recorder.failures.size(), before);
}

TEST_F(CardTest, ByteLayoutCursorOutsideItsTrackAsserts) {
    auto reader = readerFor(clipOf("dv-ntsc", 4, 0));
    SkarnTrackReader* video = track(reader, 0);
    auto c = cursorAt(video, kCMTimeZero);
    c->setCurrentPTS(CMTimeMake(-1001, 30000));
    EXPECT_EQ(hardAssertionText([&] { c->stepInPresentationOrder(1); }), "CMTIME_COMPARE_INLINE(pts, >=, minpts)");
    c->setCurrentPTS(CMTimeMake(4 * 1001, 30000));
    EXPECT_EQ(hardAssertionText([&] { c->stepInPresentationOrder(1); }), "CMTIME_COMPARE_INLINE(pts, <=, maxpts)");
}

// ---------------------------------------------------------------------------
// Threads

TEST_F(MXFCursor, FourThreadsShareOneMXFObject) {
    open(90, 10);
    std::vector<std::thread> threads;
    std::atomic<int> mismatches{0};
    for (int t = 0; t < 4; ++t) {
        threads.emplace_back([&, t] {
            // Each starts somewhere else, so that chunk scans race.
            auto cursor = cursorAt(video, at((t * 37) % 90));
            auto* s = static_cast<SkarnSampleCursor*>(cursor.get());
            for (int round = 0; round < 2; ++round) {
                do {
                    uint32_t k = s->currentMXFIndex();
                    Location l = locate(s);
                    if (uint64_t(l.offset) != layout.frames[k].offset ||
                        CMTimeCompare(s->currentPTS(), at(layout.frames[k].presentation)) != 0)
                        ++mismatches;
                    (void)s->sampleDependencyAttributes();
                } while (cursor->stepInDecodeOrder(1) == 0);
                cursor = dynamicRefCast<SkarnSampleCursor>(video->cursorAtFirstSampleInDecodeOrder());
                s = static_cast<SkarnSampleCursor*>(cursor.get());
            }
            auto a = cursorAt(track(reader, 2 + size_t(t % 2)), kCMTimeZero);
            while (a->stepInDecodeOrder(1601) == 0) (void)locate(static_cast<SkarnSampleCursor*>(a.get()));
        });
    }
    for (auto& th : threads) th.join();
    EXPECT_EQ(mismatches.load(), 0);
}

}  // namespace

namespace {

TEST_F(MXFCursor, StepsOfAnySizeEndAtTheTrackEnds) {
    open(15, 5);
    for (SkarnTrackReader* t : {video, audio}) {
        auto c = t->cursorAtFirstSampleInDecodeOrder();
        auto* s = static_cast<SkarnSampleCursor*>(c.get());
        if (t == video) {
            EXPECT_EQ(c->stepInPresentationOrder(INT64_MAX), kEnd);
            EXPECT_EQ(CMTimeCompare(s->currentPTS(), t->maxpts()), 0);
            EXPECT_EQ(c->stepInPresentationOrder(INT64_MIN), kEnd);
            EXPECT_EQ(CMTimeCompare(s->currentPTS(), t->minpts()), 0);
            EXPECT_EQ(c->stepInDecodeOrder(INT64_MAX), kEnd);
            EXPECT_EQ(s->currentMXFIndex(), 14u);
            EXPECT_EQ(c->stepInDecodeOrder(INT64_MIN), kEnd);
            EXPECT_EQ(s->currentMXFIndex(), 0u);
            EXPECT_EQ(c->stepByDecodeTime(kCMTimePositiveInfinity), kEnd);
            EXPECT_EQ(c->stepByDecodeTime(kCMTimeNegativeInfinity), kEnd);
        } else {
            EXPECT_EQ(c->stepInDecodeOrder(INT64_MAX), kEnd);
            EXPECT_EQ(c->stepInDecodeOrder(INT64_MIN), kEnd);
        }
        EXPECT_EQ(c->stepByPresentationTime(kCMTimePositiveInfinity), kEnd);
        EXPECT_EQ(c->stepByPresentationTime(CMTimeMake(INT64_MAX, 1)), kEnd);
        EXPECT_EQ(c->stepByPresentationTime(CMTimeMake(INT64_MIN, 1)), kEnd);
        EXPECT_LE(CMTimeCompare(s->currentPTS(), t->trackDuration()), 0);
    }
    for (CMTime at : {kCMTimePositiveInfinity, kCMTimeNegativeInfinity, CMTimeMake(INT64_MAX, 1), kCMTimeInvalid}) {
        auto c = cursorAt(video, at);
        ASSERT_TRUE(c);
        EXPECT_GE(CMTimeCompare(c->currentPTS(), kCMTimeZero), 0);
    }
}

TEST_F(MXFCursor, AudioCursorsFarPastTheEndPointPastEveryByte) {
    // An audio step leaves the cursor wherever it took it: one whose sample
    // number times the sample size no longer fits in 64 bits still locates
    // its sample and chunk past any file rather than at a wrapped offset.
    open(15, 5);
    auto c = audio->cursorAtFirstSampleInDecodeOrder();
    auto* s = static_cast<SkarnSampleCursor*>(c.get());
    ASSERT_GE(audio->sampleSize(), 2);
    ASSERT_GT(audio->frameDuration().value, 0);
    EXPECT_EQ(c->stepInDecodeOrder(INT64_MAX / audio->frameDuration().value - 1), kEnd);
    ASSERT_TRUE(CMTIME_IS_NUMERIC(s->currentPTS()));
    Location l = locate(s);
    EXPECT_EQ(l.count, 1);
    EXPECT_EQ(l.offset, INT64_MAX);
    Chunk chunk = chunkOf(s);
    EXPECT_EQ(chunk.offset, INT64_MAX);
    EXPECT_EQ(chunk.size, 0);
}

TEST_F(CardTest, ByteLayoutStepsOfAnySizeEndAtTheTrackEnds) {
    auto reader = readerFor(clipOf("dv-ntsc", 4, 1));
    for (size_t i : {0, 1, 2}) {
        SkarnTrackReader* t = track(reader, i);
        auto c = t->cursorAtFirstSampleInDecodeOrder();
        auto* s = static_cast<SkarnSampleCursor*>(c.get());
        EXPECT_EQ(c->stepInPresentationOrder(INT64_MAX), kEnd) << i;
        EXPECT_EQ(CMTimeCompare(s->currentPTS(), t->maxpts()), 0) << i;
        EXPECT_EQ(c->stepInDecodeOrder(INT64_MIN), kEnd) << i;
        EXPECT_EQ(CMTimeCompare(s->currentPTS(), t->minpts()), 0) << i;
        EXPECT_EQ(c->stepByPresentationTime(kCMTimePositiveInfinity), kEnd) << i;
        EXPECT_EQ(c->stepByDecodeTime(CMTimeMake(INT64_MIN, 1)), kEnd) << i;
        EXPECT_EQ(CMTimeCompare(s->currentPTS(), t->minpts()), 0) << i;
    }
}

TEST_F(MXFCursor, ATrackLongerThanItsTablesEndsWhereTheTablesDo) {
    // A decode-time walk, as the ingest makes, over a track that claims five
    // frames more than the tables hold ends on the tables' last frame instead
    // of going back to the first one for ever.
    open(15, 5);
    Ref<SkarnTrackReader> t = video->copyWithZone();
    auto c = t->cursorAtFirstSampleInDecodeOrder();
    auto* s = static_cast<SkarnSampleCursor*>(c.get());
    t->setMaxpts(at(19));
    t->setTrackDuration(at(20));
    int steps = 0;
    while (steps < 40 && c->stepByDecodeTime(fd) == 0) {
        ++steps;
        EXPECT_EQ(s->currentMXFIndex(), uint32_t(steps));
    }
    EXPECT_EQ(steps, 14);
    EXPECT_EQ(s->currentMXFIndex(), 14u);
}

TEST_F(MXFCursor, TablesThatDisagreeWithTheTrackStopWithTheirExpressions) {
    open(15, 5);
    auto skewed = [&] { return video->copyWithZone(); };
    {
        Ref<SkarnTrackReader> t = skewed();
        t->setMinpts(at(1));
        EXPECT_EQ(hardAssertionText([&] { cursorAt(t.get(), at(2)); }),
                  "CMTIME_COMPARE_INLINE(minpts, == ,_trackReader.minpts)");
    }
    {
        Ref<SkarnTrackReader> t = skewed();
        t->setMaxpts(CMTimeMake(14, 30));
        EXPECT_EQ(hardAssertionText([&] { cursorAt(t.get(), at(2)); }),
                  "self.trackReader.maxpts.timescale == frameDuration.timescale");
    }
    {
        // Placed while the track agreed with the tables; then the track claims more.
        Ref<SkarnTrackReader> t = skewed();
        auto c = cursorAt(t.get(), at(14));
        t->setTrackDuration(at(100));
        auto last = SkarnSampleCursor::sampleCursorAtLastSampleInDecodeOrder(t.get(), t->maxpts());
        EXPECT_EQ(hardAssertionText([&] { last->stepInDecodeOrder(1); }),
                  "CMTIME_COMPARE_INLINE(wantedDTS, >=, self.trackReader.trackDuration)");
        EXPECT_EQ(hardAssertionText([&] { last->stepByDecodeTime(at(1)); }),
                  "CMTIME_COMPARE_INLINE(dtsTime, >=, self.trackReader.trackDuration)");
        t->setMaxpts(at(100));
        EXPECT_EQ(hardAssertionText([&] { c->stepByPresentationTime(at(20)); }), "foundEssense != nil");
    }
    {
        Ref<SkarnTrackReader> t = skewed();
        auto c = cursorAt(t.get(), at(10));
        auto last = SkarnSampleCursor::sampleCursorAtLastSampleInDecodeOrder(t.get(), t->maxpts());
        t->setMaxpts(at(5));
        EXPECT_EQ(hardAssertionText([&] { c->stepInPresentationOrder(1); }), "foundEssense == nil");
        t->setTrackDuration(at(6));
        EXPECT_EQ(hardAssertionText([&] { last->stepInDecodeOrder(1); }), "self.currentMXFIndex == maxDTSIndex");
    }
}

}  // namespace

namespace {

TEST_F(MXFCursor, DecodeTimeStepBeforeTheStartLandsOnTheFirstSample) {
    open(30, 10);
    AssertionCapture capture;
    auto c = cursorAt(video, at(20));
    EXPECT_EQ(c->stepByDecodeTime(CMTimeMake(-10, 1)), kEnd);
    EXPECT_EQ(c->currentMXFIndex(), 0u);
    EXPECT_EQ(CMTimeCompare(c->currentPTS(), kCMTimeZero), 0);
    // The cursor agrees with the tables: stepping on reports nothing.
    EXPECT_EQ(c->stepInDecodeOrder(1), 0);
    EXPECT_TRUE(capture.recorder.failures.empty());
}

}  // namespace
