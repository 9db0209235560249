#include "SkarnMediaReader.h"

#include "IngestTestSupport.h"
#include "SkarnAudioBuffer.h"
#include "SkarnVideoBuffer.h"

#include <gtest/gtest.h>

#include <cstring>
#include <unistd.h>

using namespace ingest_test;

namespace {

// A record as a host allocates it: raw bytes, read back by offset.
struct RawRecord {
    alignas(8) uint8_t bytes[256] = {};
    VestaKilnPlugInMediaSpecifier_Deprecated* record() {
        return reinterpret_cast<VestaKilnPlugInMediaSpecifier_Deprecated*>(bytes);
    }
    template <class T>
    T at(size_t offset) const {
        T v;
        std::memcpy(&v, bytes + offset, sizeof v);
        return v;
    }
};

class MediaReaderTest : public ::testing::Test {
protected:
    void open(const ClipSpec& shape) {
        _shape = shape;
        _written = writeOne(_dir, shape);
        _clip = SkarnClip::initWithSkarnClip(_written.clipPath);
        ASSERT_TRUE(_clip);
        _formatReader = SkarnFormatReader::formatReaderWithClip(_clip.get(), true, false);
        ASSERT_TRUE(_formatReader);
    }
    Ref<SkarnTrackReader> track(FourCharCode type, size_t which = 0) {
        for (const auto& t : _formatReader->trackList())
            if (t->mediaTypeValue() == type && which-- == 0) return t;
        return nullptr;
    }
    Ref<SkarnTrackReader> timecodeTrack() { return track(kCMMediaType_TimeCode); }
    Ref<SkarnMediaReader> reader(const Ref<SkarnTrackReader>& t) {
        Ref<SkarnTrackReader> tc = timecodeTrack();
        Ref<SkarnMediaReader> r = SkarnMediaReader::mediaReaderWithFormatReader(
            _formatReader.get(), t.get(), tc ? tc->timecodeStart() : 0, tc ? tc->frameDuration() : kCMTimeInvalid,
            tc ? int64_t(tc->frameQuanta()) : 0, tc && tc->isDropFrame(), int64_t(_clip->shootingRate()));
        EXPECT_TRUE(r);
        return r;
    }
    Ref<SkarnMediaReader> videoReader() { return reader(track(kCMMediaType_Video)); }
    Ref<SkarnMediaReader> audioReader(size_t channel = 0) { return reader(track(kCMMediaType_Audio, channel)); }
    ClipEssence essence() { return essenceOf(_written, _clip.get(), _shape.frames); }

    TempDir _dir;
    ClipSpec _shape;
    WrittenClip _written;
    Ref<SkarnClip> _clip;
    Ref<SkarnFormatReader> _formatReader;
};

std::vector<uint8_t> bytesOf(const CMSampleBufferRef& buffer) {
    CMBlockBufferRef block = CMSampleBufferGetDataBuffer(buffer);
    char* data = nullptr;
    size_t length = 0;
    EXPECT_EQ(CMBlockBufferGetDataPointer(block, 0, nullptr, &length, &data), 0);
    return std::vector<uint8_t>(data, data + length);
}

// Releases what a reader's getNextMedia left in the record for the ingest object.
void dropKeepers(VestaKilnPlugInMediaSpecifier_Deprecated* r) {
    Ref<SkarnVideoBuffer>::adopt(static_cast<SkarnVideoBuffer*>(r->videoMediaDisposeRefCon2));
    Ref<SkarnAudioBuffer>::adopt(static_cast<SkarnAudioBuffer*>(r->audioMediaDisposeRefCon2));
    r->videoMediaDisposeRefCon2 = nullptr;
    r->audioMediaDisposeRefCon2 = nullptr;
}

// ---------------------------------------------------------------------------
// Scheduling and end of data

TEST_F(MediaReaderTest, SchedulesOneSampleAtATimeAndMarksTheEndAfterTheLast) {
    open(clipOf("dv-ntsc", 3));
    Ref<SkarnMediaReader> video = videoReader();
    video->reset();
    EXPECT_TRUE(video->hasData());
    EXPECT_EQ(video->scheduleSamples(5), 0);
    EXPECT_EQ(CMBufferQueueGetBufferCount(video->bufferQueue()), 1);
    EXPECT_TRUE(video->canSchedule());
    EXPECT_EQ(video->scheduleBuffers(), 0);
    EXPECT_EQ(video->scheduleBuffers(), 0);  // the last sample: its step fails, the end is marked
    EXPECT_EQ(CMBufferQueueGetBufferCount(video->bufferQueue()), 3);
    EXPECT_FALSE(video->canSchedule());
    EXPECT_TRUE(video->hasData());  // marked, not yet drained
    EXPECT_EQ(video->scheduleBuffers(), 0);
    EXPECT_EQ(CMBufferQueueGetBufferCount(video->bufferQueue()), 3);

    ClipEssence e = essence();
    for (int i = 0; i < 3; ++i) {
        CMSampleBufferRef b = dynamicRefCast<CMSampleBuffer>(CMBufferQueueDequeueAndRetain(video->bufferQueue()));
        ASSERT_TRUE(b);
        EXPECT_TRUE(bytesOf(b) == e.frames[size_t(i)]) << i;
        EXPECT_EQ(CMSampleBufferGetPresentationTimeStamp(b).value, 1001 * i);
    }
    EXPECT_FALSE(video->hasData());
    bool dropped = true;
    uint64_t sequence = 9;
    EXPECT_EQ(video->pullFrame(nullptr, &dropped, &sequence), kSkarnMediaReaderEndOfData);
}

TEST_F(MediaReaderTest, ResetStartsTheTrackOverEvenAfterItsEnd) {
    open(clipOf("dv-pal", 2));
    Ref<SkarnMediaReader> video = videoReader();
    video->reset();
    RawRecord r;
    while (video->hasData()) {
        ASSERT_EQ(video->getNextMedia(r.record()), 0);
        dropKeepers(r.record());
    }
    EXPECT_EQ(r.record()->endOfMedia, 1);
    video->reset();
    EXPECT_TRUE(video->hasData());
    EXPECT_TRUE(video->canSchedule());
    EXPECT_EQ(CMBufferQueueGetBufferCount(video->bufferQueue()), 0);
    // A reset with something still queued drops it too.
    EXPECT_EQ(video->scheduleBuffers(), 0);
    video->reset();
    EXPECT_EQ(CMBufferQueueGetBufferCount(video->bufferQueue()), 0);
    ASSERT_EQ(video->getNextMedia(r.record()), 0);
    EXPECT_EQ(r.record()->videoPresentationTime, 0);
    dropKeepers(r.record());
}

TEST_F(MediaReaderTest, ShortEssenceFailsTheSampleWithMinus19AndEndsTheTrack) {
    open(clipOf("dv-ntsc", 3));
    // The video file loses its last frame and a half: the XML still promises three.
    std::string path = _clip->videoFilePath().value();
    uint64_t cut = uint64_t(_clip->startByteOffset()) + 120000 + 60000;
    ASSERT_EQ(::truncate(path.c_str(), off_t(cut)), 0);
    Ref<SkarnMediaReader> video = videoReader();
    video->reset();
    EXPECT_EQ(video->scheduleSamples(1), 0);
    EXPECT_EQ(video->scheduleSamples(1), kSkarnMediaReaderReadFailed);
    EXPECT_FALSE(video->canSchedule());
    EXPECT_EQ(CMBufferQueueGetBufferCount(video->bufferQueue()), 1);
    EXPECT_EQ(video->scheduleSamples(1), 0);  // nothing more after the end
}

TEST_F(MediaReaderTest, ATrackThatIsNeitherVideoNorSoundIsRefused) {
    open(clipOf("dv-ntsc", 2));
    Ref<SkarnMediaReader> timecode = reader(timecodeTrack());
    ASSERT_TRUE(timecode);
    timecode->reset();
    CMSampleBufferRef out;
    EXPECT_EQ(timecode->createSampleBufferFromSampleCursor(&out), kSkarnMediaReaderUnsupportedMediaType);
    EXPECT_FALSE(out);
    EXPECT_EQ(timecode->scheduleSamples(1), kSkarnMediaReaderUnsupportedMediaType);
    EXPECT_FALSE(timecode->canSchedule());
}

TEST_F(MediaReaderTest, AnEmptyTrackHasNoDataAndNeverMarksAnEnd) {
    open(clipOf("dv-ntsc", 2));
    // Channel 2 loses its data size: a track without samples.
    replaceInFile(_written.clipPath, "<DataSize>" + std::to_string(audioSamplesFor(_shape) * 2) + "</DataSize>",
                  "<DataSize>0</DataSize>", true);
    _clip = SkarnClip::initWithSkarnClip(_written.clipPath);
    _formatReader = SkarnFormatReader::formatReaderWithClip(_clip.get(), true, false);
    Ref<SkarnMediaReader> empty = audioReader(1);
    ASSERT_TRUE(empty);
    empty->reset();
    EXPECT_FALSE(empty->hasData());
    EXPECT_EQ(empty->scheduleSamples(1), 0);
    EXPECT_TRUE(empty->canSchedule());
    EXPECT_EQ(CMBufferQueueGetBufferCount(empty->bufferQueue()), 0);
    Ref<SkarnMediaReader> full = audioReader(0);
    full->reset();
    EXPECT_TRUE(full->hasData());
}

// ---------------------------------------------------------------------------
// File ranges

TEST_F(MediaReaderTest, ByteLayoutTracksReadTheirEssenceRangeAndMXFTracksTheWholeFile) {
    open(clipOf("dv-ntsc", 2));
    Ref<SkarnTrackReader> v = track(kCMMediaType_Video);
    Ref<SkarnMediaReader> video = reader(v);
    EXPECT_EQ(int64_t(video->fileReader()->source()->startOffset()), v->locationOffset());
    EXPECT_GT(v->locationOffset(), 0);
}

TEST(MediaReaderAVClip, IndexedTracksReadAtAbsoluteOffsets) {
    TempDir dir;
    WrittenClip written = writeOne(dir, clipOf("avclip-intra", 4));
    Ref<SkarnClip> clip = SkarnClip::initWithSkarnClip(written.clipPath);
    ASSERT_TRUE(clip);
    // The self-contained AVC-Intra clip's start byte offset is the 512 of the
    // AVC-Intra header; its index records count from the file's start anyway.
    EXPECT_EQ(clip->startByteOffset(), 512);
    Ref<SkarnFormatReader> fr = SkarnFormatReader::formatReaderWithClip(clip.get(), true, false);
    Ref<SkarnTrackReader> v = fr->trackList().front();
    Ref<SkarnMediaReader> video =
        SkarnMediaReader::mediaReaderWithFormatReader(fr.get(), v.get(), 0, v->frameDuration(), 30, false, 30);
    ASSERT_TRUE(video);
    EXPECT_EQ(video->fileReader()->source()->startOffset(), 0u);
    EXPECT_EQ(video->fileReader()->remaining(), written.avclipLayout.fileSize);
    video->reset();
    ClipEssence e = avclipEssence(written);
    for (size_t i = 0; i < 4; ++i) {
        ASSERT_EQ(video->scheduleSamples(1), 0);
        CMSampleBufferRef b = dynamicRefCast<CMSampleBuffer>(CMBufferQueueDequeueAndRetain(video->bufferQueue()));
        ASSERT_TRUE(b);
        EXPECT_TRUE(bytesOf(b) == e.frames[i]) << i;
    }
}

// ---------------------------------------------------------------------------
// Audio chunks

TEST_F(MediaReaderTest, AnAudioBufferIsTheChunkFromTheCursorOnAndEverySampleComesOnce) {
    // About 24 s of 16-bit sound: one 2 MiB chunk and the rest.
    ClipSpec shape = clipOf("dv-ntsc", 720);
    shape.sparse = true;
    shape.audioChannels = 1;
    open(shape);
    ClipEssence e = essence();
    ASSERT_GT(e.channels[0].size(), 2097152u);
    Ref<SkarnMediaReader> audio = audioReader();
    audio->reset();
    std::vector<uint8_t> got;
    std::vector<size_t> sizes;
    int64_t nextSample = 0;
    while (audio->canSchedule()) {
        ASSERT_EQ(audio->scheduleBuffers(), 0);
        CMSampleBufferRef b = dynamicRefCast<CMSampleBuffer>(CMBufferQueueDequeueAndRetain(audio->bufferQueue()));
        if (!b) break;
        EXPECT_EQ(CMSampleBufferGetPresentationTimeStamp(b).value, nextSample);
        nextSample += CMSampleBufferGetNumSamples(b);
        auto bytes = bytesOf(b);
        sizes.push_back(bytes.size());
        got.insert(got.end(), bytes.begin(), bytes.end());
        ASSERT_LT(sizes.size(), 10u);
    }
    ASSERT_EQ(sizes.size(), 2u);
    EXPECT_EQ(sizes[0], 2097152u);
    EXPECT_TRUE(got == e.channels[0]);
    EXPECT_FALSE(audio->hasData());
}

TEST_F(MediaReaderTest, AnAudioCursorInsideAChunkStartsTheBufferThereAndStaysPut) {
    ClipSpec shape = clipOf("dv-pal", 10);
    shape.audioChannels = 1;
    open(shape);
    Ref<SkarnMediaReader> audio = audioReader();
    audio->setStartTime(CMTimeMake(1000, 48000));
    audio->reset();
    CMTime before = audio->sampleCursor()->presentationTimeStamp();
    ASSERT_EQ(before.value, 1000);
    CMSampleBufferRef b;
    ASSERT_EQ(audio->createSampleBufferFromSampleCursor(&b), 0);
    ASSERT_TRUE(b);
    EXPECT_EQ(CMSampleBufferGetNumSamples(b), 48000 * 10 / 25 - 1000);
    EXPECT_EQ(CMSampleBufferGetPresentationTimeStamp(b).value, 1000);
    std::vector<uint8_t> channel = essence().channels[0];
    std::vector<uint8_t> tail(channel.begin() + 2000, channel.end());
    EXPECT_TRUE(bytesOf(b) == tail);
    EXPECT_EQ(CMTimeCompare(audio->sampleCursor()->presentationTimeStamp(), before), 0);
}

TEST_F(MediaReaderTest, AChannelShorterThanTheClipEndsAtItsLastByteWithoutAnError) {
    ClipSpec shape = clipOf("dv-pal", 10);
    shape.audioChannels = 1;
    open(shape);
    // The XML gives the channel half its length: the cursor walks on past it.
    uint64_t full = audioSamplesFor(shape) * 2;
    replaceInFile(_written.clipPath, "<DataSize>" + std::to_string(full) + "</DataSize>",
                  "<DataSize>" + std::to_string(full / 2) + "</DataSize>");
    _clip = SkarnClip::initWithSkarnClip(_written.clipPath);
    _formatReader = SkarnFormatReader::formatReaderWithClip(_clip.get(), true, false);
    Ref<SkarnMediaReader> audio = audioReader();
    audio->reset();
    RawRecord r;
    uint64_t delivered = 0;
    for (int calls = 0; audio->hasData() && calls < 10; ++calls) {
        ASSERT_EQ(audio->getNextMedia(r.record()), 0);
        if (r.record()->audioBufferList) delivered += r.record()->audioBufferList->mBuffers[0].mDataByteSize;
        dropKeepers(r.record());
        r.record()->audioBufferList = nullptr;
    }
    EXPECT_EQ(delivered, full / 2);
    EXPECT_FALSE(audio->hasData());
    // A cursor standing past the channel's end gives a chunk of no bytes: the end.
    audio->setStartTime(CMTimeMake(int64_t(full / 2 / 2) + 100, 48000));
    audio->reset();
    EXPECT_EQ(audio->scheduleSamples(1), 0);
    EXPECT_FALSE(audio->canSchedule());
    EXPECT_EQ(CMBufferQueueGetBufferCount(audio->bufferQueue()), 0);
    EXPECT_FALSE(audio->hasData());
}

// ---------------------------------------------------------------------------
// The record

TEST_F(MediaReaderTest, VideoDeliveryFillsTheRecordByOffset) {
    ClipSpec shape = clipOf("dv-ntsc", 3);
    shape.startTimecode = "01:00:00:00";
    shape.dropFrame = false;
    open(shape);
    Ref<SkarnMediaReader> video = videoReader();
    video->setFakeStartTime(CMTimeMake(0, 30000));
    video->reset();
    RawRecord first;
    ASSERT_EQ(video->getNextMedia(first.record()), 0);
    dropKeepers(first.record());
    RawRecord r;
    ASSERT_EQ(video->getNextMedia(r.record()), 0);
    ClipEssence e = essence();
    auto* data = r.at<uint8_t*>(8);
    ASSERT_NE(data, nullptr);
    EXPECT_EQ(r.at<uint32_t>(16), 120000u);
    EXPECT_EQ(std::memcmp(data, e.frames[1].data(), 120000), 0);
    EXPECT_EQ(r.at<int64_t>(24), 1001);
    EXPECT_EQ(r.at<int64_t>(32), -1);  // DV is never reordered
    EXPECT_EQ(r.at<int64_t>(40), 1001);
    EXPECT_EQ(r.at<int32_t>(48), 30000);
    ASSERT_NE(r.at<uint8_t*>(56), nullptr);
    uint32_t descriptionSize = r.at<uint32_t>(220);
    EXPECT_GE(descriptionSize, 86u);
    // The image description in host order starts with its own size.
    uint32_t firstWord;
    std::memcpy(&firstWord, r.at<uint8_t*>(56), 4);
    EXPECT_EQ(firstWord, descriptionSize);
    EXPECT_EQ(r.at<uint32_t>(64), 0u);
    auto* keeper = r.at<SkarnVideoBuffer*>(80);
    ASSERT_NE(keeper, nullptr);
    EXPECT_EQ(keeper->dataPointer(), data);
    EXPECT_EQ(r.at<uint32_t>(208), 108000u + 1);
    EXPECT_EQ(r.at<uint32_t>(212), 30u);
    EXPECT_EQ(r.at<uint8_t>(216), 0);
    EXPECT_EQ(r.at<uint8_t>(217), 1);
    EXPECT_EQ(r.at<uint8_t>(218), 0);
    // Byte-layout tracks give constant-frame-rate times with each frame.
    const auto* entries = r.at<const Dictionary*>(224);
    ASSERT_NE(entries, nullptr);
    ASSERT_TRUE(entries->find("CMIOSampleBufferAttachmentKey_CFRTime"));
    CMTime time = CMTimeMakeFromDictionary(*entries->find("CMIOSampleBufferAttachmentKey_CFRTime"));
    CMTime duration = CMTimeMakeFromDictionary(*entries->find("CMIOSampleBufferAttachmentKey_CFRDuration"));
    EXPECT_EQ(CMTimeCompare(time, CMTimeMake(1001, 30000)), 0);
    EXPECT_EQ(CMTimeCompare(duration, CMTimeMake(1001, 30000)), 0);
    // Image descriptions are shared by the frames of one format.
    RawRecord next;
    ASSERT_EQ(video->getNextMedia(next.record()), 0);
    EXPECT_EQ(next.at<uint8_t*>(56), r.at<uint8_t*>(56));
    EXPECT_EQ(next.at<uint8_t>(218), 1);  // the last frame
    dropKeepers(next.record());
    dropKeepers(r.record());
}

TEST_F(MediaReaderTest, ReorderedFramesCarryDecodeTimesAndSampleFlags) {
    open(clipOf("avclip-strand422", 12));
    Ref<SkarnMediaReader> video = videoReader();
    video->reset();
    bool sawNotSync = false, sawReorder = false;
    for (int i = 0; i < 12; ++i) {
        RawRecord r;
        ASSERT_EQ(video->getNextMedia(r.record()), 0);
        EXPECT_NE(r.at<int64_t>(32), -1);
        uint32_t flags = r.at<uint32_t>(64);
        if (i == 0) {
            EXPECT_EQ(flags & 1u, 0u) << "the first stored frame is a sync frame";
        }
        sawNotSync = sawNotSync || (flags & 1u);
        sawReorder = sawReorder || r.at<int64_t>(24) != r.at<int64_t>(32);
        // Indexed tracks carry their own timing: no constant-frame-rate entries.
        EXPECT_EQ(r.at<const void*>(224), nullptr);
        dropKeepers(r.record());
    }
    EXPECT_TRUE(sawNotSync);
    EXPECT_TRUE(sawReorder);
}

TEST_F(MediaReaderTest, AudioDeliveryFillsTheRecordByOffset) {
    ClipSpec shape = clipOf("dv-pal", 5);
    shape.audioChannels = 1;
    shape.bitsPerSample = 24;
    open(shape);
    Ref<SkarnMediaReader> audio = audioReader();
    audio->reset();
    RawRecord r;
    std::memset(r.bytes + 176, 0xee, 16);
    ASSERT_EQ(audio->getNextMedia(r.record()), 0);
    auto* list = r.at<AudioBufferList*>(88);
    ASSERT_NE(list, nullptr);
    EXPECT_EQ(list->mNumberBuffers, 1u);
    EXPECT_EQ(list->mBuffers[0].mDataByteSize, 48000u * 5 / 25 * 3);
    EXPECT_EQ(std::memcmp(list->mBuffers[0].mData, essence().channels[0].data(), list->mBuffers[0].mDataByteSize), 0);
    EXPECT_EQ(r.at<uint32_t>(96), 48000u * 5 / 25);
    EXPECT_EQ(r.at<int64_t>(104), 0);
    EXPECT_EQ(r.at<int64_t>(112), 0);
    EXPECT_EQ(r.at<int64_t>(120), -1);
    EXPECT_EQ(r.at<int64_t>(128), 48000 * 5 / 25);
    EXPECT_EQ(r.at<int32_t>(136), 48000);
    auto* asbd = r.at<AudioStreamBasicDescription*>(144);
    ASSERT_NE(asbd, nullptr);
    EXPECT_EQ(asbd->mSampleRate, 48000.0);
    EXPECT_EQ(asbd->mBitsPerChannel, 24u);
    EXPECT_EQ(r.at<uint64_t>(152), 40u);
    EXPECT_EQ(r.at<uint64_t>(176), 0u);
    EXPECT_EQ(r.at<uint64_t>(184), 0u);
    auto* keeper = r.at<SkarnAudioBuffer*>(200);
    ASSERT_NE(keeper, nullptr);
    EXPECT_EQ(keeper->dataPointer(), list->mBuffers[0].mData);
    EXPECT_EQ(r.at<uint8_t>(218), 1);
    dropKeepers(r.record());
}

}  // namespace
