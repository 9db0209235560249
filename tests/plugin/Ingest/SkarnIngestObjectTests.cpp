#include "H264Reference.h"
#include "IngestTestSupport.h"
#include "SkarnLog.h"

#include <gtest/gtest.h>

#include <functional>

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
    ClipSpec spec = clipOf(GetParam(), 30);
    WrittenClip written = writeOne(dir, spec);
    Ref<SkarnClip> clip = SkarnClip::initWithSkarnClip(written.clipPath);
    ASSERT_TRUE(clip);
    ClipEssence expected = essenceOf(written, clip.get(), spec.frames);
    ASSERT_EQ(expected.frames.size(), spec.frames);
    ASSERT_EQ(expected.channels.size(), spec.audioChannels);

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
    CadenceRun run(const ClipSpec& spec, const std::function<void(const WrittenClip&)>& edit = nullptr,
                   bool keepMediaRate = false) {
        CadenceRun r;
        r.written = writeOne(_dir, spec, "CARD" + std::to_string(_cards++));
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
        if (spec.dv) {
            DVStreamSpec dv = *spec.dv;
            dv.family = DVFamily(spec.family->videoFormat);
            r.frames.emplace(dv);
        }
        _spec = spec;
        return r;
    }

    // The written frames a host must get: every one, or only the unrepeated
    // ones when a cadence was found.
    void expectFrames(const CadenceRun& r, bool dropRepeats) {
        ClipEssence e = clipXMLEssence(r.clip.get(), _spec.frames);
        std::vector<std::vector<uint8_t>> want;
        for (uint64_t i = 0; i < _spec.frames; ++i)
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
    ClipSpec _spec;
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
