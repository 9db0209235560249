#include "H264Reference.h"
#include "IngestTestSupport.h"
#include "SkarnLog.h"

#include <gtest/gtest.h>

#include <cstring>
#include <functional>
#include <sys/stat.h>
#include <unistd.h>

using namespace ingest_test;

namespace {

void expectSameBytes(const std::vector<std::vector<uint8_t>>& got, const std::vector<std::vector<uint8_t>>& want,
                     const char* what) {
    ASSERT_EQ(got.size(), want.size()) << what;
    for (size_t i = 0; i < got.size(); ++i) {
        ASSERT_EQ(got[i].size(), want[i].size()) << what << " " << i;
        EXPECT_TRUE(got[i] == want[i]) << what << " " << i;
    }
}

// ---------------------------------------------------------------------------
// End to end: every family the card writer makes

class IngestEveryFamily : public ::testing::TestWithParam<std::string> {};

TEST_P(IngestEveryFamily, DeliversEveryFrameAndEveryChannelAsTheEssenceHoldsIt) {
    TempDir dir;
    ClipSpec shape = clipOf(GetParam(), 30);
    WrittenClip written = writeOne(dir, shape);
    Ref<SkarnClip> clip = SkarnClip::initWithSkarnClip(written.clipPath);
    ASSERT_TRUE(clip);
    ClipEssence expected = essenceOf(written, clip.get(), shape.frames);
    ASSERT_EQ(expected.frames.size(), shape.frames);
    ASSERT_EQ(expected.channels.size(), shape.audioChannels);

    Ref<SkarnIngestObject> ingest = initializedIngest(clip.get());
    Delivery d = ingestAll(*ingest);
    EXPECT_EQ(d.status, 0);
    EXPECT_TRUE(d.ended);
    if (clip->videoFormat() == 4) {
        // AVC-Strand 4:2:0 goes out with length prefixes instead of start codes.
        for (auto& frame : expected.frames) {
            const uint8_t* sets[8] = {};
            uint64_t sizes[8] = {};
            uint32_t count = 0;
            referenceReplaceStartCodes(frame, sets, sizes, &count);
        }
    }
    expectSameBytes(d.frames, expected.frames, "frame");
    expectSameBytes(d.channels, expected.channels, "channel");
    // Everything handed out was given back.
    EXPECT_EQ(ingest->bufferManager()->videoBufferCount(), 0u);
    EXPECT_EQ(ingest->bufferManager()->audioBufferCount(), 0u);
}

// ---------------------------------------------------------------------------
// Cadence

// Rewrites every 5-byte pack of the video file that starts with `head`
// (the pack id and its first bytes) through `edit`.
void editPacks(const std::string& path, const std::vector<uint8_t>& head, const std::function<void(uint8_t*)>& edit) {
    auto bytes = FileSystem::readFile(path, 1 << 28);
    ASSERT_TRUE(bytes);
    size_t edited = 0;
    for (size_t i = 0; i + 5 <= bytes->size(); ++i) {
        if (std::equal(head.begin(), head.end(), bytes->begin() + ptrdiff_t(i))) {
            edit(bytes->data() + i);
            ++edited;
        }
    }
    ASSERT_GT(edited, 0u);
    writeBytes(path, *bytes);
}

struct CadenceRun {
    WrittenClip written;
    Ref<SkarnClip> clip;
    Ref<SkarnIngestObject> ingest;
    Delivery delivery;
    std::vector<std::string> log;
    std::optional<DVFrameWriter> frames;  // which written frames repeat

    bool logged(const std::string& text) const {
        for (const auto& l : log)
            if (l.find(text) != std::string::npos) return true;
        return false;
    }
};

class CadenceTest : public ::testing::Test {
protected:
    // Writes the clip, lets `edit` change its files, and ingests it whole.
    CadenceRun run(const ClipSpec& shape, const std::function<void(const WrittenClip&)>& edit = nullptr,
                   bool keepMediaRate = false) {
        CadenceRun r;
        r.written = writeOne(_dir, shape, "CARD" + std::to_string(_cards++));
        if (edit) edit(r.written);
        r.clip = SkarnClip::initWithSkarnClip(r.written.clipPath);
        EXPECT_TRUE(r.clip);
        if (!r.clip) return r;
        {
            LogCapture capture;
            r.ingest = initializedIngest(r.clip.get(), keepMediaRate);
            r.delivery = ingestAll(*r.ingest);
            r.log = capture.lines();
        }
        if (shape.dv) {
            DVStreamSpec dv = *shape.dv;
            dv.family = DVFamily(shape.family->videoFormat);
            r.frames.emplace(dv);
        }
        _shape = shape;
        return r;
    }

    // The written frames a host must get: every one, or only the unrepeated
    // ones when a cadence was found.
    void expectFrames(const CadenceRun& r, bool dropRepeats) {
        ClipEssence e = clipXMLEssence(r.clip.get(), _shape.frames);
        std::vector<std::vector<uint8_t>> want;
        for (uint64_t i = 0; i < _shape.frames; ++i)
            if (!dropRepeats || !r.frames->isRepeatFrame(i)) want.push_back(e.frames[i]);
        expectSameBytes(r.delivery.frames, want, "frame");
        expectSameBytes(r.delivery.channels, e.channels, "channel");
        EXPECT_EQ(r.delivery.status, 0);
        EXPECT_TRUE(r.delivery.ended);
    }

    // Frames at the shooting rate, k frame durations apart and shifted by the
    // video timing offset, in the adjusted timescale.
    void expectShootingRateTimes(const CadenceRun& r, double videoOffsetSeconds, int32_t timescale) {
        int64_t duration = r.clip ? r.ingest->videoReader()->frameDuration().value : 0;
        for (size_t k = 0; k < r.delivery.presentation.size(); ++k) {
            EXPECT_EQ(r.delivery.timescale[k], timescale) << k;
            EXPECT_EQ(r.delivery.presentation[k],
                      int64_t(double(k) * double(duration) + videoOffsetSeconds * timescale + 0.5))
                << k;
        }
    }

    void expectDefaultTiming(const CadenceRun& r) {
        SkarnMediaReader* video = r.ingest->videoReader();
        EXPECT_EQ(video->pulldownCadenceDropSequence(), nullptr);
        EXPECT_EQ(video->timingOffset(), 0.0);
        EXPECT_EQ(video->adjustedVideoTimescale(), 0.0);
        for (const auto& audio : r.ingest->audioReaders()) {
            EXPECT_EQ(audio->timingOffset(), 0.0);
            EXPECT_EQ(audio->pulldownCadenceDropSequence(), nullptr);
        }
        CMTime d = video->frameDuration();
        for (size_t k = 0; k < r.delivery.presentation.size(); ++k) {
            EXPECT_EQ(r.delivery.presentation[k], int64_t(k) * d.value) << k;
            EXPECT_EQ(r.delivery.timescale[k], d.timescale) << k;
        }
    }

    TempDir _dir;
    int _cards = 0;
    ClipSpec _shape;
};

struct Expected {
    unsigned phase;
    uint8_t pattern;
    uint8_t index;
    double shift;
    const char* line;  // the reading's conclusion as logged
};

class TwentyFourInSixty : public CadenceTest, public ::testing::WithParamInterface<Expected> {};

TEST_P(TwentyFourInSixty, StopsAsSoonAsTheFirstFramesFixTheCadence) {
    const Expected& x = GetParam();
    CadenceRun r = run(cadenceClip("dvcprohd-720p60", DVCadence::TwentyFourInSixty, x.phase, 20));
    const SkarnCadenceReading& reading = r.ingest->cadenceReading();
    ASSERT_TRUE(reading.cadence);
    EXPECT_EQ(reading.pattern, x.pattern);
    EXPECT_EQ(reading.index, x.index);
    EXPECT_EQ(reading.length, 5);
    SkarnMediaReader* video = r.ingest->videoReader();
    EXPECT_EQ(video->cadenceIndex(), x.index);
    EXPECT_EQ(video->cadenceLength(), 5);
    EXPECT_EQ(video->adjustedVideoTimescale(), 24000.0);
    double frame = 1001.0 / 60000.0;
    EXPECT_DOUBLE_EQ(video->timingOffset(), frame * x.shift);
    for (const auto& audio : r.ingest->audioReaders()) {
        EXPECT_EQ(audio->timingOffset(), 0.0);
        // 1001/24000 s of 48 kHz sound per frame.
        EXPECT_EQ(audio->samplesPerPull(), 2002u);
        EXPECT_EQ(audio->pulldownCadenceDropSequence(), video->pulldownCadenceDropSequence());
    }
    expectFrames(r, true);
    EXPECT_EQ(r.delivery.frames.size(), 8u);  // 2 of every 5
    expectShootingRateTimes(r, frame * x.shift, 24000);
    if (!kDiagnosticLog) GTEST_SKIP() << "log lines need a diagnostic-log build";
    EXPECT_TRUE(r.logged("attempting to read 5 frames to determine cadence of length 5"));
    EXPECT_TRUE(r.logged(x.line));
    EXPECT_TRUE(r.logged(SkarnLogFormat("cadence = 0x%x, video frame shift = %lf", x.pattern, x.shift)));
    EXPECT_TRUE(r.logged("TS Sample Rate now = 24000.000000 because 24 FPS"));
}

INSTANTIATE_TEST_SUITE_P(
    Phases, TwentyFourInSixty,
    ::testing::Values(Expected{0, 0x14, 0, 0.0, "read keep-drop-keep... must be keep-drop-keep-drop-drop"},
                      Expected{1, 0x09, 1, 1.5, "read drop-keep-drop-drop... must be drop-keep-drop-drop-keep"},
                      Expected{2, 0x12, 2, 0.5, "read keep-drop-drop... must be keep-drop-drop-keep-drop"},
                      Expected{3, 0x05, 3, 2.0, "read drop-drop... must be drop-drop-keep-drop-keep"},
                      Expected{4, 0x0a, 4, 1.0, "read drop-keep-drop-keep... must be drop-keep-drop-keep-drop"}));

class TwentyFourInThirty : public CadenceTest, public ::testing::WithParamInterface<Expected> {};

TEST_P(TwentyFourInThirty, TheFirstFramesSequenceNumberPlacesTheCadence) {
    const Expected& x = GetParam();
    CadenceRun r = run(cadenceClip("dvcpro50-ntsc", DVCadence::TwentyFourInThirty, x.phase, 20));
    const SkarnCadenceReading& reading = r.ingest->cadenceReading();
    ASSERT_TRUE(reading.cadence);
    EXPECT_EQ(reading.pattern, x.pattern);
    EXPECT_EQ(reading.index, x.index);
    EXPECT_EQ(reading.framesClassified, 1u);
    SkarnMediaReader* video = r.ingest->videoReader();
    EXPECT_EQ(video->adjustedVideoTimescale(), 24000.0);
    double frame = 1001.0 / 30000.0;
    double videoOffset = x.shift > 0 ? frame * x.shift : 0, audioOffset = x.shift < 0 ? -frame * x.shift : 0;
    EXPECT_DOUBLE_EQ(video->timingOffset(), videoOffset);
    for (const auto& audio : r.ingest->audioReaders()) EXPECT_DOUBLE_EQ(audio->timingOffset(), audioOffset);
    expectFrames(r, true);
    EXPECT_EQ(r.delivery.frames.size(), 16u);  // 4 of every 5
    expectShootingRateTimes(r, videoOffset, 24000);
    if (!kDiagnosticLog) GTEST_SKIP() << "log lines need a diagnostic-log build";
    EXPECT_TRUE(r.logged("attempting to read 1 frames to determine cadence of length 5"));
    EXPECT_TRUE(r.logged(x.line));
    EXPECT_TRUE(r.logged(SkarnLogFormat("cadence = 0x%x, video frame shift = %lf, audio timing offset = %lf, "
                                        "video timing offset = %lf",
                                        x.pattern, x.shift, audioOffset, videoOffset)));
}

INSTANTIATE_TEST_SUITE_P(Phases, TwentyFourInThirty,
                         ::testing::Values(Expected{0, 0x1b, 0, 0.0, "got a video frame of sequence 0"},
                                           Expected{1, 0x17, 1, 0.25, "got a video frame of sequence 1"},
                                           Expected{2, 0x0f, 2, 0.5, "read drop... must be drop-keep-keep-keep-keep"},
                                           Expected{3, 0x1e, 3, -0.5, "got a video frame of sequence 3"},
                                           Expected{4, 0x1d, 4, -0.25, "got a video frame of sequence 4"}));

// 720p DVCPRO HD recorded as 24 in 30 reads its cadence from keep marks.
class KeepMarks : public CadenceTest, public ::testing::WithParamInterface<Expected> {};

TEST_P(KeepMarks, TwentyFourInThirtyOn720pReadsKeepMarks) {
    const Expected& x = GetParam();
    CadenceRun r = run(cadenceClip("dvcprohd-720p60", DVCadence::TwentyFourInSixty, x.phase, 20),
                       [](const WrittenClip& w) { replaceInFile(w.clipPath, ">59.94p<", ">29.97p<"); });
    EXPECT_EQ(r.clip->sourceFormat(), FourCharCode(FourCC("dvhp")));
    const SkarnCadenceReading& reading = r.ingest->cadenceReading();
    ASSERT_TRUE(reading.cadence);
    EXPECT_EQ(reading.pattern, x.pattern);
    EXPECT_EQ(reading.index, x.index);
    EXPECT_EQ(r.ingest->videoReader()->adjustedVideoTimescale(), 24000.0);
    if (!kDiagnosticLog) GTEST_SKIP() << "log lines need a diagnostic-log build";
    EXPECT_TRUE(r.logged("attempting to read up to 5 frames to determine cadence"));
    EXPECT_TRUE(r.logged(x.line));
}

INSTANTIATE_TEST_SUITE_P(Phases, KeepMarks,
                         ::testing::Values(Expected{0, 0x17, 1, 0.25, "read keep-drop... must be keep-drop-keep-keep-keep"},
                                           Expected{1, 0x0f, 2, 0.5, "read drop... must be drop-keep-keep-keep-keep"}));

TEST_F(CadenceTest, HalfRateReadsOneFrameAndADroppedOneAfterAMarkWasSeen) {
    // A marked frame must have been seen in this process before an unmarked
    // first frame reads as a drop: the keep-drop clip goes first.
    CadenceRun keep = run(cadenceClip("dvcprohd-720p60", DVCadence::HalfRate, 0, 10));
    ASSERT_TRUE(keep.ingest->cadenceReading().cadence);
    EXPECT_EQ(keep.ingest->cadenceReading().pattern, 0x2);
    EXPECT_EQ(keep.ingest->cadenceReading().index, 0);
    EXPECT_EQ(keep.ingest->videoReader()->timingOffset(), 0.0);
    EXPECT_EQ(keep.ingest->videoReader()->adjustedVideoTimescale(), 30000.0);
    EXPECT_EQ(keep.ingest->videoReader()->cadenceLength(), 2);
    expectFrames(keep, true);
    EXPECT_EQ(keep.delivery.frames.size(), 5u);
    expectShootingRateTimes(keep, 0, 30000);

    CadenceRun drop = run(cadenceClip("dvcprohd-720p60", DVCadence::HalfRate, 1, 10));
    ASSERT_TRUE(drop.ingest->cadenceReading().cadence);
    EXPECT_EQ(drop.ingest->cadenceReading().pattern, 0x1);
    EXPECT_EQ(drop.ingest->cadenceReading().index, 1);
    double frame = 1001.0 / 60000.0;
    EXPECT_DOUBLE_EQ(drop.ingest->videoReader()->timingOffset(), frame);
    expectFrames(drop, true);
    expectShootingRateTimes(drop, frame, 30000);
    if (!kDiagnosticLog) GTEST_SKIP() << "log lines need a diagnostic-log build";
    EXPECT_TRUE(keep.logged("attempting to read 1 frames to determine cadence of length 2"));
    EXPECT_TRUE(keep.logged("got a video frame, must be keep-drop"));
    EXPECT_TRUE(keep.logged("TS Sample Rate now = 30000.000000 because 30 FPS shot at 60 FPS"));
    EXPECT_TRUE(drop.logged("dropped a video frame, must be drop-keep"));
}

TEST_F(CadenceTest, AClipThatEndsInsideTheReadingIsDeliveredWholeWithDefaultTiming) {
    // keep, drop, and then nothing: three frames would have told.
    CadenceRun r = run(cadenceClip("dvcprohd-720p60", DVCadence::TwentyFourInSixty, 0, 2));
    const SkarnCadenceReading& reading = r.ingest->cadenceReading();
    EXPECT_TRUE(reading.attempted);
    EXPECT_TRUE(reading.pullFailed);
    EXPECT_EQ(reading.framesClassified, 2u);
    EXPECT_FALSE(reading.cadence);
    expectFrames(r, false);
    expectDefaultTiming(r);
    if (!kDiagnosticLog) GTEST_SKIP() << "log lines need a diagnostic-log build";
    EXPECT_TRUE(r.logged("could not read enough frames (2) to determine cadence"));
}

TEST_F(CadenceTest, AnUnknownSequenceNumberSetsNoCadence) {
    CadenceRun r = run(cadenceClip("dv-ntsc", DVCadence::TwentyFourInThirty, 0, 10), [](const WrittenClip& w) {
        // Every shooting-rate pack says position 7, which no cadence has.
        for (uint8_t position = 0; position < 5; ++position)
            editPacks(w.files[1], {0x64, 0xA1, 0x24, uint8_t(0xF0 | position)}, [](uint8_t* pack) {
                pack[3] = 0xF7;
                pack[4] = uint8_t(uint8_t(pack[1] + pack[2] + pack[3]) ^ 0x55);
            });
    });
    const SkarnCadenceReading& reading = r.ingest->cadenceReading();
    EXPECT_TRUE(reading.attempted);
    EXPECT_FALSE(reading.pullFailed);
    EXPECT_FALSE(reading.cadence);
    expectFrames(r, false);
    expectDefaultTiming(r);
    if (!kDiagnosticLog) GTEST_SKIP() << "log lines need a diagnostic-log build";
    EXPECT_TRUE(r.logged("got a video frame of sequence 7"));
    EXPECT_TRUE(r.logged("unknown cadence"));
    EXPECT_FALSE(r.logged("cadence = 0x"));
}

TEST_F(CadenceTest, FiveFramesOfNoKnownCadenceSetNone) {
    CadenceRun r = run(cadenceClip("dvcprohd-720p60", DVCadence::TwentyFourInSixty, 0, 10), [](const WrittenClip& w) {
        // Every frame marked new: keep, keep, keep, keep, keep.
        for (uint8_t bits = 0x50; bits <= 0x53; ++bits)
            editPacks(w.files[1], {0x14, bits, 0x24}, [](uint8_t* pack) { pack[1] = 0x53; });
    });
    const SkarnCadenceReading& reading = r.ingest->cadenceReading();
    EXPECT_EQ(reading.framesClassified, 5u);
    EXPECT_EQ(reading.pattern, 0x1f);
    EXPECT_FALSE(reading.cadence);
    expectFrames(r, false);
    expectDefaultTiming(r);
}

TEST_F(CadenceTest, KeepMediaRateReadsNoFrameAndSetsNoCadence) {
    CadenceRun r = run(cadenceClip("dvcpro50-ntsc", DVCadence::TwentyFourInThirty, 2, 10), nullptr, true);
    EXPECT_FALSE(r.ingest->cadenceReading().attempted);
    expectFrames(r, false);
    expectDefaultTiming(r);
    if (!kDiagnosticLog) GTEST_SKIP() << "log lines need a diagnostic-log build";
    EXPECT_FALSE(r.logged("determine cadence"));
}

TEST_F(CadenceTest, RatesWithoutACadenceAreNotRead) {
    CadenceRun r = run(clipOf("dvcprohd-1080i60", 4));
    EXPECT_FALSE(r.ingest->cadenceReading().attempted);
    expectDefaultTiming(r);
}

// ---------------------------------------------------------------------------
// The record, the end flag and the rulings on reuse and uneven tracks

class IngestTest : public ::testing::Test {
protected:
    Ref<SkarnIngestObject> open(const ClipSpec& shape, const std::function<void(const WrittenClip&)>& edit = nullptr) {
        _shape = shape;
        _written = writeOne(_dir, shape, "CARD" + std::to_string(_cards++));
        if (edit) edit(_written);
        _clip = SkarnClip::initWithSkarnClip(_written.clipPath);
        EXPECT_TRUE(_clip);
        return _clip ? initializedIngest(_clip.get()) : nullptr;
    }
    ClipEssence essence() { return essenceOf(_written, _clip.get(), _shape.frames); }
    // Gives channel `channel` (from 0) a DataSize of `bytes` in the clip XML.
    static void setChannelSize(const WrittenClip& w, const ClipSpec& shape, uint32_t channel, uint64_t bytes) {
        std::string size = "<DataSize>" + std::to_string(audioSamplesFor(shape) * shape.bitsPerSample / 8) + "</DataSize>";
        auto text = FileSystem::readFile(w.clipPath).value();
        std::string xml(text.begin(), text.end());
        size_t at = xml.find("<Audio>");
        for (uint32_t i = 0; i < channel; ++i) at = xml.find("<Audio>", at + 1);
        at = xml.find(size, at);
        ASSERT_NE(at, std::string::npos);
        xml.replace(at, size.size(), "<DataSize>" + std::to_string(bytes) + "</DataSize>");
        writeTextFile(w.clipPath, xml);
    }

    TempDir _dir;
    int _cards = 0;
    ClipSpec _shape;
    WrittenClip _written;
    Ref<SkarnClip> _clip;
};

template <class T>
T fieldAt(const void* record, size_t offset) {
    T v;
    std::memcpy(&v, static_cast<const uint8_t*>(record) + offset, sizeof v);
    return v;
}

TEST_F(IngestTest, ADeliveryFillsTheRecordByOffset) {
    ClipSpec shape = clipOf("dv-pal", 3);
    shape.audioChannels = 3;
    Ref<SkarnIngestObject> ingest = open(shape);
    alignas(8) uint8_t raw[232] = {};
    auto* record = reinterpret_cast<VestaKilnPlugInMediaSpecifier_Deprecated*>(raw);
    ASSERT_EQ(ingest->getNextMedia_Deprecated(record, nullptr), 0);
    ClipEssence e = essence();

    EXPECT_EQ(fieldAt<uint32_t>(raw, 0), 99u);
    auto* frame = fieldAt<uint8_t*>(raw, 8);
    ASSERT_NE(frame, nullptr);
    EXPECT_EQ(std::memcmp(frame, e.frames[0].data(), e.frames[0].size()), 0);
    EXPECT_EQ(fieldAt<int64_t>(raw, 24), 0);
    EXPECT_EQ(fieldAt<int32_t>(raw, 48), 2500);
    EXPECT_EQ(fieldAt<VestaKilnVideoBufferManager*>(raw, 72),
              static_cast<VestaKilnVideoBufferManager*>(ingest->bufferManager()));
    EXPECT_NE(fieldAt<void*>(raw, 80), nullptr);

    auto* list = fieldAt<AudioBufferList*>(raw, 88);
    ASSERT_NE(list, nullptr);
    ASSERT_EQ(list->mNumberBuffers, 3u);
    const uint32_t samples = uint32_t(audioSamplesFor(shape));
    for (uint32_t ch = 0; ch < 3; ++ch) {
        EXPECT_EQ(list->mBuffers[ch].mNumberChannels, 1u);
        ASSERT_EQ(list->mBuffers[ch].mDataByteSize, samples * 2) << ch;
        EXPECT_EQ(std::memcmp(list->mBuffers[ch].mData, e.channels[ch].data(), samples * 2), 0) << ch;
    }
    EXPECT_EQ(fieldAt<uint32_t>(raw, 96), samples);
    EXPECT_EQ(fieldAt<int64_t>(raw, 104), 0);
    EXPECT_EQ(fieldAt<int64_t>(raw, 112), 0);
    EXPECT_EQ(fieldAt<int64_t>(raw, 120), -1);
    EXPECT_EQ(fieldAt<int64_t>(raw, 128), int64_t(samples));
    EXPECT_EQ(fieldAt<int32_t>(raw, 136), 48000);
    auto* asbd = fieldAt<AudioStreamBasicDescription*>(raw, 144);
    ASSERT_NE(asbd, nullptr);
    EXPECT_EQ(asbd->mChannelsPerFrame, 3u);
    EXPECT_NE(asbd->mFormatFlags & kAudioFormatFlagIsNonInterleaved, 0u);
    EXPECT_EQ(asbd->mSampleRate, 48000.0);
    EXPECT_EQ(fieldAt<uint64_t>(raw, 152), 40u);
    auto* layout = fieldAt<AudioChannelLayout*>(raw, 160);
    ASSERT_NE(layout, nullptr);
    EXPECT_EQ(layout->mChannelLayoutTag, kAudioChannelLayoutTag_UseChannelDescriptions);
    EXPECT_EQ(layout->mNumberChannelDescriptions, 3u);
    EXPECT_EQ(fieldAt<uint64_t>(raw, 168), 2u * 20 + 32);
    EXPECT_EQ(fieldAt<VestaKilnAudioBufferManager*>(raw, 192),
              static_cast<VestaKilnAudioBufferManager*>(ingest->bufferManager()));
    EXPECT_EQ(fieldAt<uint8_t>(raw, 218), 0);
    EXPECT_EQ(ingest->bufferManager()->audioBufferCount(), 3u);
    EXPECT_EQ(ingest->bufferManager()->videoBufferCount(), 1u);

    // The combined list outlives every channel but the last one given back.
    std::vector<AudioBuffer> buffers(list->mBuffers, list->mBuffers + 3);
    for (const AudioBuffer& b : buffers)
        ingest->bufferManager()->disposeAudioMedia(static_cast<uint8_t*>(b.mData), b.mDataByteSize, nullptr);
    ingest->bufferManager()->disposeVideoMedia(frame, 0, nullptr);
    EXPECT_EQ(ingest->bufferManager()->audioBufferCount(), 0u);
}

TEST_F(IngestTest, TheNewerRecordIsLeftAlone) {
    Ref<SkarnIngestObject> ingest = open(clipOf("dv-ntsc", 2));
    VestaKilnPlugInMediaSpecifier media;
    std::memset(&media, 0x5a, sizeof media);
    EXPECT_EQ(ingest->getNextMedia(&media, nullptr), 0);
    for (size_t i = 0; i < sizeof media; ++i) EXPECT_EQ(reinterpret_cast<uint8_t*>(&media)[i], 0x5a);
    EXPECT_TRUE(ingest->usesCMTime());
}

TEST_F(IngestTest, TheEndFlagComesWithTheFirstCallThatDeliversNothing) {
    for (uint32_t channels : {0u, 2u}) {
        ClipSpec shape = clipOf("dv-ntsc", 4);
        shape.audioChannels = channels;
        Ref<SkarnIngestObject> ingest = open(shape);
        EXPECT_EQ(ingest->firstAudioReader() == nullptr, channels == 0);
        Delivery d = ingestAll(*ingest);
        EXPECT_EQ(d.frames.size(), 4u) << channels;
        EXPECT_EQ(d.calls, 5u) << channels;
        EXPECT_TRUE(d.ended);
        EXPECT_EQ(d.channels.size(), channels);
        // And again, with nothing left to give.
        VestaKilnPlugInMediaSpecifier_Deprecated again{};
        EXPECT_EQ(ingest->getNextMedia_Deprecated(&again, nullptr), 0);
        EXPECT_EQ(again.endOfMedia, 1);
        EXPECT_EQ(again.videoData, nullptr);
        EXPECT_EQ(again.audioBufferList, nullptr);
    }
}

TEST_F(IngestTest, AReusedRecordNeverReportsAFrameOrAKeeperTwice) {
    ClipSpec shape = clipOf("dv-ntsc", 3);
    Ref<SkarnIngestObject> ingest = open(shape);
    VestaKilnPlugInMediaSpecifier_Deprecated record{};
    std::vector<uint8_t*> frames;
    size_t audioDeliveries = 0;
    for (int call = 0; call < 10 && !record.endOfMedia; ++call) {
        ASSERT_EQ(ingest->getNextMedia_Deprecated(&record, nullptr), 0);
        if (record.videoData) {
            EXPECT_NE(record.videoMediaDisposeRefCon2, nullptr);
            frames.push_back(record.videoData);
            // Given back, and the record keeps what it held.
            record.videoBufferManager->disposeVideoMedia(record.videoData, record.videoDataSize, nullptr);
        } else {
            EXPECT_EQ(record.videoMediaDisposeRefCon2, nullptr);
        }
        if (record.audioBufferList) {
            ++audioDeliveries;
            AudioBuffer first = record.audioBufferList->mBuffers[0], second = record.audioBufferList->mBuffers[1];
            record.audioBufferManager->disposeAudioMedia(static_cast<uint8_t*>(first.mData), 0, nullptr);
            record.audioBufferManager->disposeAudioMedia(static_cast<uint8_t*>(second.mData), 0, nullptr);
        }
        EXPECT_EQ(record.audioMediaDisposeRefCon2, nullptr);
    }
    EXPECT_EQ(frames.size(), 3u);
    EXPECT_EQ(audioDeliveries, 1u);
    EXPECT_EQ(record.endOfMedia, 1);
}

TEST_F(IngestTest, AnEmptyChannelIsSkippedAndTheOthersArriveWhole) {
    ClipSpec shape = clipOf("dv-ntsc", 4);
    shape.audioChannels = 3;
    Ref<SkarnIngestObject> ingest = open(shape, [&](const WrittenClip& w) { setChannelSize(w, shape, 0, 0); });
    EXPECT_FALSE(ingest->audioReaders()[0]->hasData());
    Delivery d = ingestAll(*ingest, 50);
    EXPECT_TRUE(d.ended);
    EXPECT_EQ(d.status, 0);
    ClipEssence e = essence();
    EXPECT_EQ(d.frames.size(), 4u);
    ASSERT_EQ(d.channels.size(), 3u);
    EXPECT_TRUE(d.channels[0].empty());
    EXPECT_TRUE(d.channels[1] == e.channels[1]);
    EXPECT_TRUE(d.channels[2] == e.channels[2]);
}

TEST_F(IngestTest, ChannelsOfDifferentLengthsEachArriveWholeAndAlone) {
    // About 24 s of sound: channel 0 takes two chunks, channel 1 stops at
    // exactly one chunk (its next chunk has no bytes) and channel 2 stops
    // inside the first.
    ClipSpec shape = clipOf("dv-ntsc", 720);
    shape.sparse = true;
    shape.audioChannels = 3;
    Ref<SkarnIngestObject> ingest = open(shape, [&](const WrittenClip& w) {
        setChannelSize(w, shape, 1, 2097152);
        setChannelSize(w, shape, 2, 1000000);
    });
    Delivery d = ingestAll(*ingest);
    EXPECT_EQ(d.status, 0);
    EXPECT_TRUE(d.ended);
    ClipEssence e = essence();
    ASSERT_EQ(d.channels.size(), 3u);
    EXPECT_GT(e.channels[0].size(), 2097152u);
    EXPECT_EQ(e.channels[1].size(), 2097152u);
    for (size_t ch = 0; ch < 3; ++ch) {
        EXPECT_EQ(d.channels[ch].size(), e.channels[ch].size()) << ch;
        EXPECT_TRUE(d.channels[ch] == e.channels[ch]) << ch;
    }
    EXPECT_EQ(d.frames.size(), 720u);
}

TEST_F(IngestTest, SelfContainedClipWithA512ByteStartOffsetReadsAtAbsoluteOffsets) {
    // A header XML that names a 512-byte video start, as AVC-Intra clips do.
    ClipSpec shape = clipOf("avclip-strand422", 24);
    std::string path = _dir / "CARD/CONTENTS/AVCLIP/A001.MXF";
    makeDirs(_dir / "CARD/CONTENTS/AVCLIP");
    for (const char* f : {"CLIP", "VIDEO", "AUDIO"}) makeDirs(_dir / (std::string("CARD/CONTENTS/") + f));
    AVClipSpec params;
    std::string xml = avclipHeaderXMLText(shape);
    size_t at = xml.find("</ClipContent>");
    ASSERT_NE(at, std::string::npos);
    xml.insert(at, "<EssenceList><Video><VideoIndex><StartByteOffset>512</StartByteOffset></VideoIndex></Video>"
                   "</EssenceList>");
    params.clipXML = xml;
    params.coding = AVClipSpec::Coding::AVCLongGOP;
    params.frames = shape.frames;
    params.audioChannels = 2;
    params.frameBytes = 20000;
    params.seed = "A001";
    _written.clipPath = path;
    _written.family = "avclip-strand422";
    std::string error;
    ASSERT_TRUE(writeAVClip(path, params, &error, &_written.avclipLayout)) << error;
    _shape = shape;
    _clip = SkarnClip::initWithSkarnClip(path);
    ASSERT_TRUE(_clip);
    EXPECT_GE(_clip->startByteOffset(), 512);
    Ref<SkarnIngestObject> ingest = initializedIngest(_clip.get());
    Delivery d = ingestAll(*ingest);
    EXPECT_EQ(d.status, 0);
    ClipEssence e = essence();
    expectSameBytes(d.frames, e.frames, "frame");
    expectSameBytes(d.channels, e.channels, "channel");
}

TEST_F(IngestTest, SetInPointStartsTheNextInitialiseThere) {
    ClipSpec shape = clipOf("dv-pal", 10);
    Ref<SkarnIngestObject> ingest = open(shape);
    // 0.2 s in: frame 5, in the clip duration's own timescale.
    EXPECT_EQ(ingest->setInPoint(CMTimeMake(1, 5), nullptr), 0);
    EXPECT_EQ(ingest->reset(nullptr), 0);
    Delivery d = ingestAll(*ingest);
    ClipEssence e = essence();
    ASSERT_EQ(d.frames.size(), 5u);
    for (size_t i = 0; i < 5; ++i) EXPECT_TRUE(d.frames[i] == e.frames[i + 5]) << i;
    ASSERT_EQ(d.channels.size(), 2u);
    std::vector<uint8_t> tail(e.channels[0].begin() + 9600 * 2, e.channels[0].end());
    EXPECT_TRUE(d.channels[0] == tail);
}

TEST_F(IngestTest, LifecycleCallsAnswerZeroAndCleanupReleasesWhatTheHostKept) {
    Ref<SkarnIngestObject> ingest = open(clipOf("dv-ntsc", 3));
    VestaKilnPlugInMediaSpecifier_Deprecated record{};
    ASSERT_EQ(ingest->getNextMedia_Deprecated(&record, nullptr), 0);
    EXPECT_EQ(ingest->bufferManager()->videoBufferCount(), 1u);
    EXPECT_EQ(ingest->setPathSet(Value(), nullptr), 0);
    EXPECT_EQ(ingest->setOutPoint(kCMTimeZero, nullptr), 0);
    EXPECT_EQ(ingest->stop(nullptr), 0);
    EXPECT_EQ(ingest->cleanup(nullptr), 0);
    EXPECT_EQ(ingest->videoReader(), nullptr);
    EXPECT_EQ(ingest->bufferManager()->videoBufferCount(), 0u);
    EXPECT_EQ(ingest->teardown(nullptr), 0);
    // A host that still calls gets the end, not a crash.
    VestaKilnPlugInMediaSpecifier_Deprecated after{};
    EXPECT_EQ(ingest->getNextMedia_Deprecated(&after, nullptr), 0);
    EXPECT_EQ(after.endOfMedia, 1);
}

TEST_F(IngestTest, MediaHeldAcrossAResetStaysAliveAndGoesBackThroughItsManager) {
    // A seek resets the ingest while the host still holds frames in flight;
    // it gives them back afterwards through the manager they came with.
    Ref<SkarnIngestObject> ingest = open(clipOf("dv-ntsc", 3));
    VestaKilnPlugInMediaSpecifier_Deprecated record{};
    ASSERT_EQ(ingest->getNextMedia_Deprecated(&record, nullptr), 0);
    ASSERT_NE(record.videoData, nullptr);
    ASSERT_NE(record.videoBufferManager, nullptr);
    const std::vector<uint8_t> held(record.videoData, record.videoData + record.videoDataSize);
    EXPECT_EQ(ingest->reset(nullptr), 0);
    EXPECT_EQ(record.videoBufferManager, static_cast<VestaKilnVideoBufferManager*>(ingest->bufferManager()));
    EXPECT_EQ(ingest->bufferManager()->videoBufferCount(), 1u);
    EXPECT_TRUE(std::equal(held.begin(), held.end(), record.videoData));
    record.videoBufferManager->disposeVideoMedia(record.videoData, record.videoDataSize, nullptr);
    EXPECT_EQ(ingest->bufferManager()->videoBufferCount(), 0u);
    // Delivery starts over after the reset.
    Delivery d = ingestAll(*ingest);
    EXPECT_EQ(d.frames.size(), 3u);
}

// ---------------------------------------------------------------------------
// Bad input: never a crash, a hang or an unbounded allocation; what can be
// read is delivered.

TEST_F(IngestTest, EssenceShorterThanTheXMLSaysGivesTheWholeFramesThenMinus19) {
    ClipSpec shape = clipOf("dv-ntsc", 6);
    Ref<SkarnIngestObject> ingest = open(shape, [](const WrittenClip& w) {
        Ref<SkarnClip> c = SkarnClip::initWithSkarnClip(w.clipPath);
        ASSERT_EQ(::truncate(c->videoFilePath()->c_str(), off_t(c->startByteOffset() + 120000 * 3.5)), 0);
    });
    ClipEssence e = essence();
    Delivery d = ingestAll(*ingest, 50, false);
    EXPECT_TRUE(d.ended);
    ASSERT_EQ(d.frames.size(), 3u);
    for (size_t i = 0; i < 3; ++i) EXPECT_TRUE(d.frames[i] == e.frames[i]);
    ASSERT_FALSE(d.statuses.empty());
    EXPECT_EQ(d.statuses.front(), kSkarnMediaReaderReadFailed);
    EXPECT_TRUE(d.channels[0] == e.channels[0]);
}

TEST_F(IngestTest, AMissingAudioFileLosesOnlyThatChannel) {
    ClipSpec shape = clipOf("dv-ntsc", 4);
    shape.audioChannels = 3;
    Ref<SkarnIngestObject> ingest = open(shape, [](const WrittenClip& w) {
        for (const auto& f : w.files) {
            if (f.find("A00101.MXF") != std::string::npos) {
                ASSERT_EQ(::unlink(f.c_str()), 0);
            }
        }
    });
    ASSERT_TRUE(ingest);
    Delivery d = ingestAll(*ingest, 50, false);
    EXPECT_TRUE(d.ended);
    EXPECT_EQ(d.frames.size(), 4u);
    // The clip lists the files it finds; each of those arrives whole.
    ClipEssence e = essence();
    EXPECT_EQ(e.channels.size(), 2u);
    expectSameBytes(d.channels, e.channels, "channel");
}

TEST_F(IngestTest, ZeroFramesDeliverNothingAndEnd) {
    // A video file cut where its essence starts: no frame, whole channels.
    ClipSpec shape = clipOf("dv-ntsc", 2);
    Ref<SkarnIngestObject> ingest = open(shape, [](const WrittenClip& w) {
        Ref<SkarnClip> c = SkarnClip::initWithSkarnClip(w.clipPath);
        ASSERT_EQ(::truncate(c->videoFilePath()->c_str(), off_t(c->startByteOffset())), 0);
    });
    ASSERT_TRUE(ingest);
    Delivery d = ingestAll(*ingest, 20, false);
    EXPECT_TRUE(d.ended);
    EXPECT_TRUE(d.frames.empty());
    EXPECT_LE(d.calls, 3u);
    expectSameBytes(d.channels, essence().channels, "channel");

    // A clip of no frames is no clip; an ingest object without one delivers nothing.
    Ref<SkarnIngestObject> none = SkarnIngestObject::initWithClip(nullptr);
    EXPECT_EQ(none->initialize(nullptr), 0);
    EXPECT_EQ(none->reset(nullptr), 0);
    Delivery nothing = ingestAll(*none, 5);
    EXPECT_TRUE(nothing.ended);
    EXPECT_EQ(nothing.calls, 1u);
}

TEST_F(IngestTest, AFIFOOrAFolderWhereEssenceShouldBeNeverHangs) {
    ClipSpec shape = clipOf("dv-ntsc", 3);
    _shape = shape;
    _written = writeOne(_dir, shape);
    _clip = SkarnClip::initWithSkarnClip(_written.clipPath);
    ASSERT_TRUE(_clip);
    ClipEssence e = essence();
    // Swapped after the clip was made (making a clip reads its files too).
    for (const auto& f : _written.files) {
        if (f.find("VIDEO/A001.MXF") != std::string::npos) {
            ASSERT_EQ(::unlink(f.c_str()), 0);
            makeDirs(f);
        } else if (f.find("A00100.MXF") != std::string::npos) {
            ASSERT_EQ(::unlink(f.c_str()), 0);
            ASSERT_EQ(::mkfifo(f.c_str(), 0644), 0);
        }
    }
    Ref<SkarnIngestObject> ingest = initializedIngest(_clip.get());
    Delivery d = ingestAll(*ingest, 50, false);
    EXPECT_TRUE(d.ended);
    EXPECT_TRUE(d.frames.empty());
    ASSERT_EQ(d.channels.size(), 2u);
    EXPECT_TRUE(d.channels[0].empty());
    EXPECT_TRUE(d.channels[1] == e.channels[1]);
}

// Runs one damaged self-contained clip through a host loop; true when it
// ended without the process going down.
Delivery ingestDamaged(const std::string& path, size_t maxCalls) {
    Delivery d;
    Ref<SkarnClip> clip = SkarnClip::initWithSkarnClip(path);
    if (!clip) {
        d.ended = true;  // not a clip at all: nothing to ingest
        return d;
    }
    Ref<SkarnIngestObject> ingest = initializedIngest(clip.get());
    return ingestAll(*ingest, maxCalls, false);
}

class DamagedAVClip : public IngestTest {
protected:
    void SetUp() override {
        ClipSpec shape = clipOf("avclip-strand420", 60);
        shape.audioChannels = 2;
        _whole = writeOne(_dir, shape, "WHOLE");
        _bytes = FileSystem::readFile(_whole.clipPath).value();
    }
    std::string place(const std::string& name, const std::vector<uint8_t>& bytes) {
        std::string path = _dir / name + "/CONTENTS/AVCLIP/A001.MXF";
        makeDirs(path.substr(0, path.rfind('/')));
        writeBytes(path, bytes);
        return path;
    }
    WrittenClip _whole;
    std::vector<uint8_t> _bytes;
};

TEST_F(DamagedAVClip, DamageInTheEssenceIsDeliveredAsItIs) {
    std::vector<uint8_t> bytes = _bytes;
    uint32_t seed = 12345;
    for (const auto& f : _whole.avclipLayout.frames) {
        seed = seed * 1103515245u + 12345u;
        bytes[size_t(f.offset + (seed >> 8) % f.size)] ^= 0x10;
    }
    Delivery d = ingestDamaged(place("FLIP", bytes), 500);
    EXPECT_TRUE(d.ended);
    EXPECT_EQ(d.status, 0);
    ASSERT_EQ(d.frames.size(), 60u);
    for (size_t i = 0; i < 60; ++i) {
        const auto& f = _whole.avclipLayout.frames[i];
        EXPECT_TRUE(std::equal(d.frames[i].begin(), d.frames[i].end(), bytes.begin() + ptrdiff_t(f.offset))) << i;
    }
}

// A file cut short (even just its footer), or with damaged partitions and index tables,
// still ends the process today: the sample cursor's hard assertions (the
// indexed frame count against the XML's duration, the first indexed
// presentation order) fire on what the file says. Each case runs in a child
// process so the rest of the suite goes on; enable once the format reader
// answers such files without asserting.
TEST_F(DamagedAVClip, DISABLED_CutOrDamagedIndexesNeverEndTheProcess) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    std::vector<std::string> paths;
    paths.push_back(place("NOFOOTER", std::vector<uint8_t>(_bytes.begin(), _bytes.begin() + ptrdiff_t(_whole.avclipLayout.footerPartition))));
    for (double fraction : {0.02, 0.3, 0.55, 0.9})
        paths.push_back(place("CUT" + std::to_string(int(fraction * 100)),
                              std::vector<uint8_t>(_bytes.begin(), _bytes.begin() + ptrdiff_t(double(_bytes.size()) * fraction))));
    uint32_t seed = 777;
    for (int round = 0; round < 12; ++round) {
        std::vector<uint8_t> bytes = _bytes;
        for (int k = 0; k < 16; ++k) {
            seed = seed * 1103515245u + 12345u;
            const auto& chunk = _whole.avclipLayout.chunks[(seed >> 8) % _whole.avclipLayout.chunks.size()];
            uint64_t base = round % 2 ? chunk.videoIndexPartition : chunk.audioIndexPartition.front();
            seed = seed * 1103515245u + 12345u;
            size_t at = size_t(base + (seed >> 8) % 256);
            if (at < bytes.size()) bytes[at] ^= uint8_t(1u << (seed % 8));
        }
        paths.push_back(place("FLIP" + std::to_string(round), bytes));
    }
    for (const auto& path : paths) {
        EXPECT_EXIT(
            {
                Delivery d = ingestDamaged(path, 2000);
                std::exit(d.ended && d.frames.size() <= 60 ? 0 : 1);
            },
            ::testing::ExitedWithCode(0), "")
            << path;
    }
}

std::vector<std::string> familyNames() {
    std::vector<std::string> names;
    for (const auto& f : cardFamilies()) names.push_back(f.name);
    return names;
}

INSTANTIATE_TEST_SUITE_P(Cards, IngestEveryFamily, ::testing::ValuesIn(familyNames()), [](const auto& info) {
    std::string n = info.param;
    for (char& c : n)
        if (c == '-') c = '_';
    return n;
});

}  // namespace
