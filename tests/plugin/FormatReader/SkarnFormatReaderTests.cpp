#include "SkarnFormatReaderInternal.h"

#include "CMFormatDescription.h"
#include "FileSystem.h"
#include "FormatReaderTestSupport.h"
#include "SkarnPulldown.h"

#include <unistd.h>

using namespace frtest;
using SkarnFormatReaderDetail::frameRateRowForText;

namespace {

constexpr FourCharCode fcc(const char (&s)[5]) {
    return (FourCharCode(uint8_t(s[0])) << 24) | (FourCharCode(uint8_t(s[1])) << 16) | (FourCharCode(uint8_t(s[2])) << 8) |
           FourCharCode(uint8_t(s[3]));
}

class FormatReader : public CardTest {
protected:
    // A clip of `family` whose FrameRate text is replaced.
    Ref<SkarnFormatReader> withRate(const char* family, const std::string& from, const std::string& to,
                                    uint64_t frames = 2, const std::string& root = "CARD") {
        WrittenClip w = write(clipOf(family, frames, 0), root);
        replaceInFile(w.clipPath, ">" + from + "<", ">" + to + "<");
        _clip = load(w.clipPath);
        return readerFor(_clip);
    }
    // A 525-line DV clip recorded 24 in 30 from cadence position `phase`, read
    // as a 29.97p recording (the rows whose cadence the reader removes).
    WrittenClip cadenceCard(unsigned phase, uint64_t frames = 20, const char* family = "dv-ntsc",
                            uint32_t sampleRate = 48000, const std::string& root = "CAD") {
        ClipSpec c = clipOf(family, frames, 1);
        c.sampleRate = sampleRate;
        c.startTimecode = "00:00:00:00";
        DVStreamSpec dv;
        dv.cadence = DVCadence::TwentyFourInThirty;
        dv.cadencePhase = phase;
        c.dv = dv;
        WrittenClip w = write(c, root);
        replaceInFile(w.clipPath, ">59.94i<", ">29.97p<");
        return w;
    }
};

// ---------------------------------------------------------------------------
// The frame-rate table

TEST(FrameRateTable, EveryRowByPrefixAndSuffix) {
    struct Row {
        const char* text;
        int64_t value;
        int32_t timescale;
        uint64_t quanta;
        bool cadence;
    };
    const Row rows[] = {
        {"23.98p", 1001, 24000, 24, true}, {"24p", 100, 2400, 24, true},      {"25p", 100, 2500, 25, true},
        {"29.97p", 1001, 30000, 30, true}, {"50i", 100, 2500, 25, false},     {"59.94i", 1001, 30000, 30, false},
        {"50p", 100, 5000, 50, false},     {"60p", 100, 6000, 60, false},     {"59.94p", 1001, 60000, 60, false},
        // Prefix rows take any ending; the field and 50/59.94 rows need theirs.
        {"29.97i", 1001, 30000, 30, true}, {"23.98", 1001, 24000, 24, true},  {"60i", 100, 6000, 60, false},
        {"240", 100, 2400, 24, true},
    };
    for (const Row& r : rows) {
        const auto* row = frameRateRowForText(r.text);
        ASSERT_NE(row, nullptr) << r.text;
        EXPECT_EQ(row->value, r.value) << r.text;
        EXPECT_EQ(row->timescale, r.timescale) << r.text;
        EXPECT_EQ(row->frameQuanta, r.quanta) << r.text;
        EXPECT_EQ(row->readsCadence, r.cadence) << r.text;
    }
    for (const char* unknown : {"", "0", "50", "59.94", "59.94x", "garbage", "30p", "p", "i"})
        EXPECT_EQ(frameRateRowForText(unknown), nullptr) << unknown;
}

TEST_F(FormatReader, FrameRateTextSetsTheVideoAndTimecodeTiming) {
    auto reader = withRate("dv-ntsc", "59.94i", "59.94p");
    SkarnTrackReader* video = track(reader, 0);
    EXPECT_EQ(CMTimeCompare(video->frameDuration(), CMTimeMake(1001, 60000)), 0);
    EXPECT_EQ(video->frameDuration().timescale, 60000);
    EXPECT_EQ(video->frameQuanta(), 60u);
    EXPECT_EQ(reader->timescale(), 60000);
    EXPECT_EQ(track(reader, 1)->frameDuration().timescale, 60000);
    EXPECT_EQ(CMTimeCodeFormatDescriptionGetFrameQuanta(track(reader, 1)->formatDesc()), 60u);

    // An EssenceList without a FrameRate falls back to the Essence one.
    WrittenClip w = write(clipOf("dv-pal", 2, 0), "ESS");
    replaceInFile(w.clipPath, "<FrameRate DropFrameFlag=\"false\">50i</FrameRate>", "");
    replaceInFile(w.clipPath, "</EssenceList>",
                  "</EssenceList><Essence><Video><FrameRate>25p</FrameRate></Video></Essence>");
    auto clip = load(w.clipPath);
    ASSERT_TRUE(clip);
    auto fallback = readerFor(clip);
    EXPECT_EQ(CMTimeCompare(track(fallback, 0)->frameDuration(), CMTimeMake(100, 2500)), 0);
    EXPECT_EQ(track(fallback, 0)->frameQuanta(), 25u);
}

TEST_F(FormatReader, UnknownFrameRateBuildsTracksWithoutTiming) {
    LogCapture log;
    auto reader = withRate("dv-ntsc", "59.94i", "garbage", 3);
    ASSERT_TRUE(reader);
    ASSERT_EQ(reader->trackList().size(), 2u);
    SkarnTrackReader* video = track(reader, 0);
    EXPECT_EQ(video->frameDuration().value, 0);
    EXPECT_EQ(video->frameQuanta(), 0u);
    EXPECT_EQ(video->trackDuration().value, 0);
    LOG_EXPECT_TRUE(log.has("we don't understand this framerate: garbage"));

    // A rate of "0" is no better.
    auto zero = withRate("dv-ntsc", "59.94i", "0", 3, "ZERO");
    ASSERT_TRUE(zero);
    EXPECT_EQ(track(zero, 0)->frameDuration().value, 0);
}

// ---------------------------------------------------------------------------
// Video format descriptions per codec family

TEST_F(FormatReader, FormatDescriptionPerCodecFamily) {
    struct Row {
        const char* family;
        FourCharCode codec;
        int32_t width, height;
        int64_t parH, parV;
        int64_t fields;
    };
    const Row rows[] = {
        {"dv-ntsc", fcc("dvc "), 720, 480, 10, 11, 2},
        {"dv-pal", fcc("dvcp"), 720, 576, 59, 54, 2},
        {"dvcpro-pal", fcc("dvpp"), 720, 576, 59, 54, 2},
        {"dvcpro50-ntsc", fcc("dv5n"), 720, 480, 40, 33, 2},  // 16:9: the wide pixel
        {"dvcpro50-pal", fcc("dv5p"), 720, 576, 59, 54, 2},
        {"dvcprohd-720p60", fcc("dvhp"), 960, 720, 4, 3, 1},
        {"dvcprohd-720p50", fcc("dvhq"), 960, 720, 4, 3, 1},
        {"dvcprohd-1080i60", fcc("dvh6"), 1280, 1080, 3, 2, 2},
        {"dvcprohd-1080i50", fcc("dvh5"), 1440, 1080, 4, 3, 2},
        {"avci-1080p24", fcc("ai13"), 1920, 1080, 1, 1, 1},
        {"avci-720p60", fcc("ai1p"), 1280, 720, 1, 1, 1},
        {"avci-1080i60", fcc("ai16"), 1920, 1080, 1, 1, 2},
    };
    for (const Row& r : rows) {
        auto reader = readerFor(clipOf(r.family, 2, 0));
        ASSERT_TRUE(reader) << r.family;
        CMFormatDescriptionRef desc = track(reader, 0)->formatDesc();
        ASSERT_TRUE(desc) << r.family;
        EXPECT_EQ(CMFormatDescriptionGetMediaSubType(desc), r.codec) << r.family;
        CMVideoDimensions d = CMVideoFormatDescriptionGetDimensions(desc);
        EXPECT_EQ(d.width, r.width) << r.family;
        EXPECT_EQ(d.height, r.height) << r.family;
        const Value& par = CMFormatDescriptionGetExtension(desc, kCMFormatDescriptionExtension_PixelAspectRatio);
        EXPECT_EQ(par[kCMFormatDescriptionKey_PixelAspectRatioHorizontalSpacing].integerValue(), r.parH) << r.family;
        EXPECT_EQ(par[kCMFormatDescriptionKey_PixelAspectRatioVerticalSpacing].integerValue(), r.parV) << r.family;
        EXPECT_EQ(CMFormatDescriptionGetExtension(desc, kCMFormatDescriptionExtension_FieldCount).integerValue(),
                  r.fields)
            << r.family;
        EXPECT_FALSE(CMFormatDescriptionGetExtension(desc, kCMFormatDescriptionExtension_CleanAperture).isNull())
            << r.family;
    }
}

TEST_F(FormatReader, AVCIntraFiftySqueezesAndLongGOPTakesActiveSize) {
    // AVC-Intra 50 codes 1920 as 1440 with 4:3 pixels.
    WrittenClip w = write(clipOf("avci-1080p24", 2, 0), "AI50");
    replaceInFile(w.clipPath, "Class=\"100\"", "Class=\"50\"");
    auto reader = readerFor(load(w.clipPath));
    CMFormatDescriptionRef desc = track(reader, 0)->formatDesc();
    EXPECT_EQ(CMFormatDescriptionGetMediaSubType(desc), fcc("ai53"));
    EXPECT_EQ(CMVideoFormatDescriptionGetDimensions(desc).width, 1440);
    const Value& par = CMFormatDescriptionGetExtension(desc, kCMFormatDescriptionExtension_PixelAspectRatio);
    EXPECT_EQ(par[kCMFormatDescriptionKey_PixelAspectRatioHorizontalSpacing].integerValue(), 4);

    // Long GOP (its companion clip XML names the codec): the active size, fields top first.
    auto strand = readerFor(clipOf("avclip-strand422", 6, 2));
    CMFormatDescriptionRef lg = track(strand, 0)->formatDesc();
    EXPECT_EQ(CMFormatDescriptionGetMediaSubType(lg), fcc("avlg"));
    EXPECT_EQ(CMVideoFormatDescriptionGetDimensions(lg).width, 1920);
    EXPECT_EQ(CMVideoFormatDescriptionGetDimensions(lg).height, 1080);
    EXPECT_EQ(CMFormatDescriptionGetExtension(lg, kCMFormatDescriptionExtension_FieldCount).integerValue(), 2);
    EXPECT_EQ(CMFormatDescriptionGetExtension(lg, kCMFormatDescriptionExtension_FieldDetail).string(),
              kCMFormatDescriptionFieldDetail_TemporalTopFirst);
}

// ---------------------------------------------------------------------------
// Tracks of a clip-XML clip

TEST_F(FormatReader, ClipXMLTracksAreByteLayoutRelativeToTheirOffsets) {
    ClipSpec shape = clipOf("dvcpro50-ntsc", 5, 3);
    shape.bitsPerSample = 24;
    WrittenClip w = write(shape);
    auto clip = load(w.clipPath);
    auto reader = readerFor(clip);
    ASSERT_EQ(reader->trackList().size(), 5u);

    SkarnTrackReader* video = track(reader, 0);
    EXPECT_EQ(video->mediaTypeValue(), kCMMediaType_Video);
    EXPECT_EQ(video->mxfDataAccess(), nullptr);
    EXPECT_EQ(video->url(), clip->videoFilePath());
    EXPECT_EQ(video->dataOffset(), int64_t(clip->startByteOffset()));
    EXPECT_EQ(video->dataLength(), 5 * 240000);
    EXPECT_EQ(video->sampleSize(), 240000);
    EXPECT_EQ(video->samplesPerChunk(), 1);
    EXPECT_EQ(video->chunkSize(), 240000);
    EXPECT_EQ(video->uneditedNumDataBytes(), int64_t(FileSystem::fileSize(*clip->videoFilePath()).value_or(0)));
    EXPECT_EQ(reader->locationOffset(), video->dataOffset());
    EXPECT_EQ(reader->locationSize(), video->dataLength());
    EXPECT_EQ(video->locationSize(), video->dataLength());
    EXPECT_EQ(CMTimeCompare(reader->duration(), CMTimeMake(5 * 1001, 30000)), 0);
    EXPECT_EQ(video->sampleOffset(), 0u);
    EXPECT_EQ(video->pulldownPattern(), nullptr);

    SkarnTrackReader* timecode = track(reader, 1);
    EXPECT_EQ(timecode->mediaTypeValue(), kCMMediaType_TimeCode);
    EXPECT_EQ(CMFormatDescriptionGetMediaSubType(timecode->formatDesc()), kCMTimeCodeFormatType_Counter32);
    EXPECT_EQ(CMTimeCodeFormatDescriptionGetTimeCodeFlags(timecode->formatDesc()) & kCMTimeCodeFlag_DropFrame,
              uint32_t(kCMTimeCodeFlag_DropFrame));

    // Audio channel i reads the i + 1-th Audio element: the writer puts each
    // channel's data at its own file's StartByteOffset.
    auto paths = clip->audioFilePaths();
    ASSERT_TRUE(paths);
    for (size_t ch = 0; ch < 3; ++ch) {
        SkarnTrackReader* audio = track(reader, 2 + ch);
        EXPECT_EQ(audio->mediaTypeValue(), kCMMediaType_Audio);
        EXPECT_EQ(audio->mxfDataAccess(), nullptr) << ch;
        EXPECT_EQ(audio->url(), (*paths)[ch]);
        auto offsetText = clip->stringFromClipDescriptionForXPath("ClipContent/EssenceList/Audio[" +
                                                                  std::to_string(ch + 1) + "]/AudioIndex/StartByteOffset");
        EXPECT_EQ(audio->dataOffset(), stringIntegerValue(offsetText.value_or("")));
        EXPECT_EQ(audio->codec(), fcc("in24"));
        EXPECT_EQ(audio->sampleSize(), 3);
        uint64_t samples = audioSamplesFor(shape);
        EXPECT_EQ(audio->dataLength(), int64_t(samples * 3));
        EXPECT_EQ(audio->samplesPerChunk(), int64_t(samples));
        EXPECT_EQ(audio->chunkSize(), int64_t(samples * 3));
        EXPECT_EQ(audio->frameDuration().value, 1);
        EXPECT_EQ(audio->frameDuration().timescale, 48000);
        // Five frames of 29.97 at 48 kHz, rounded away from zero.
        EXPECT_EQ(audio->trackDuration().value, 8008);
        EXPECT_EQ(audio->minpts().value, 0);
        EXPECT_EQ(audio->maxpts().value, 8007);
        const AudioStreamBasicDescription* asbd = CMAudioFormatDescriptionGetStreamBasicDescription(audio->formatDesc());
        ASSERT_TRUE(asbd);
        EXPECT_EQ(asbd->mBitsPerChannel, 24u);
        EXPECT_EQ(asbd->mSampleRate, 48000.0);
    }
}

TEST_F(FormatReader, PerChannelAudioElementsAreCountedFromOne) {
    WrittenClip w = write(clipOf("dv-pal", 3, 2));
    // Give the second Audio element its own values: only channel 1 may read them.
    std::string text = readText(w.clipPath);
    auto second = text.find("<Audio>", text.find("<Audio>") + 1);
    ASSERT_NE(second, std::string::npos);
    auto rate = text.find("<SamplingRate>48000</SamplingRate>", second);
    text.replace(rate, std::string("<SamplingRate>48000</SamplingRate>").size(), "<SamplingRate>32000</SamplingRate>");
    writeTextFile(w.clipPath, text);
    auto reader = readerFor(load(w.clipPath));
    EXPECT_EQ(track(reader, 2)->sampleRate(), 48000.0);
    EXPECT_EQ(track(reader, 3)->sampleRate(), 32000.0);
    EXPECT_EQ(track(reader, 3)->frameDuration().timescale, 32000);
}

TEST_F(FormatReader, AudioChunksStopAtTwoMebibytes) {
    // 16-bit: 1048576 samples fill a chunk. 1048576 samples at 48 kHz is
    // 655.36 frames of 29.97; 656 frames give one sample more than a chunk.
    auto chunkOf = [&](uint64_t samples, const std::string& root) {
        WrittenClip w = write(clipOf("dv-ntsc", 2, 1), root);
        replaceInFile(w.clipPath, "<DataSize>6406</DataSize>", "<DataSize>" + std::to_string(samples * 2) + "</DataSize>");
        auto reader = readerFor(load(w.clipPath));
        return std::pair(track(reader, 2)->samplesPerChunk(), track(reader, 2)->chunkSize());
    };
    using Pair = std::pair<int64_t, int64_t>;
    EXPECT_EQ(chunkOf(1048576, "A"), Pair(1048576, 2097152));
    EXPECT_EQ(chunkOf(1048577, "B"), Pair(1048576, 2097152));
    EXPECT_EQ(chunkOf(1048575, "C"), Pair(1048575, 2097150));
}

TEST_F(FormatReader, ChannelWithoutDataSizeHasNoSamples) {
    WrittenClip w = write(clipOf("dv-ntsc", 2, 2));
    // Channel 0 loses its DataSize, channel 1 says 0.
    replaceInFile(w.clipPath, "<DataSize>6406</DataSize>", "");
    replaceInFile(w.clipPath, "<DataSize>6406</DataSize>", "<DataSize>0</DataSize>");
    auto reader = readerFor(load(w.clipPath));
    for (size_t i : {2, 3}) {
        SkarnTrackReader* audio = track(reader, i);
        EXPECT_EQ(audio->trackDuration().value, 0) << i;
        EXPECT_EQ(audio->samplesPerChunk(), 1) << i;
        EXPECT_EQ(audio->chunkSize(), 2) << i;
        EXPECT_FALSE(CMTIME_IS_VALID(audio->maxpts())) << i;
        bool before = false, after = false;
        auto cursor = cursorAt(audio, CMTimeMake(100, 48000), &before, &after);
        ASSERT_TRUE(cursor);
        EXPECT_EQ(cursor->stepInDecodeOrder(1), kVestaKilnSampleCursorNoMoreSamples);
        EXPECT_EQ(cursor->stepInPresentationOrder(-1), kVestaKilnSampleCursorNoMoreSamples);
        EXPECT_EQ(locate(cursor.get()).count, 0);
    }
}

TEST_F(FormatReader, ClipWithoutAudioHasVideoAndTimecodeOnly) {
    auto reader = readerFor(clipOf("dv-ntsc", 2, 0));
    ASSERT_TRUE(reader);
    EXPECT_EQ(reader->trackList().size(), 2u);
    EXPECT_EQ(reader->trackReaders().size(), 2u);
}

// ---------------------------------------------------------------------------
// Self-contained clips

TEST_F(FormatReader, SelfContainedAudioSharesTheVideoMXFObject) {
    AVClipSpec shape;
    shape.frames = 20;
    shape.framesPerChunk = 10;
    shape.audioChannels = 3;
    shape.frameBytes = 2048;
    AVClipLayout layout;
    std::string path = writeAVClipFile(shape, "A001", &layout);
    _clip = load(path);
    ASSERT_TRUE(_clip);
    ASSERT_TRUE(_clip->isMXFOp1bFormat());
    auto reader = readerFor(_clip);
    ASSERT_EQ(reader->trackList().size(), 5u);
    SkarnTrackReader* video = track(reader, 0);
    ASSERT_NE(video->mxfDataAccess(), nullptr);
    EXPECT_EQ(video->locationSize(), int64_t(layout.fileSize));
    EXPECT_EQ(video->uneditedNumDataBytes(), int64_t(layout.fileSize));
    EXPECT_EQ(track(reader, 1)->mxfDataAccess(), video->mxfDataAccess());
    uint64_t chunkSize = 0, dataLength = 0;
    video->mxfDataAccess()->getAudioChunkSize(&chunkSize, &dataLength);
    for (size_t ch = 0; ch < 3; ++ch) {
        SkarnTrackReader* audio = track(reader, 2 + ch);
        EXPECT_EQ(audio->mxfDataAccess(), video->mxfDataAccess());
        EXPECT_EQ(audio->audioChannelIndex(), ch);
        EXPECT_EQ(audio->url(), path);
        EXPECT_EQ(audio->sampleSize(), 3);
        EXPECT_EQ(audio->chunkSize(), int64_t(chunkSize));
        EXPECT_EQ(audio->samplesPerChunk(), int64_t(chunkSize) / 3);
        EXPECT_EQ(audio->samplesPerChunk(), int64_t(layout.samplesPerChunk));
        EXPECT_EQ(audio->dataLength(), int64_t(dataLength));
        EXPECT_EQ(audio->locationSize(), int64_t(layout.fileSize));
    }
    // The track list keeps the MXF object alive for its tracks.
    Ref<SkarnFormatReader> copy = reader->copyWithZone();
    reader = nullptr;
    EXPECT_EQ(track(copy, 2)->mxfDataAccess()->getAudioChannelCount(), 3u);
}

// ---------------------------------------------------------------------------
// Start timecode

TEST_F(FormatReader, TimecodeStartIsTheDropAdjustedFrameCount) {
    ClipSpec shape = clipOf("dv-ntsc", 2, 0);
    shape.startTimecode = "01:00:00;00";
    shape.dropFrame = true;
    auto reader = readerFor(shape);
    // One hour of 29.97 drop-frame: 108000 labels less 108 dropped per hour.
    EXPECT_EQ(track(reader, 0)->timecodeStart(), 107892);
    EXPECT_EQ(track(reader, 1)->timecodeStart(), 107892);
    EXPECT_EQ(track(reader, 0)->sampleOffset(), 0u);

    ClipSpec pal = clipOf("dv-pal", 2, 0);
    pal.startTimecode = "00:00:10:05";
    _clip = load(write(pal, "PAL").clipPath);
    EXPECT_EQ(track(readerFor(_clip), 0)->timecodeStart(), 255);
}

// ---------------------------------------------------------------------------
// Cadence removal

TEST_F(FormatReader, TwentyFourInThirtyIsRemovedFromEveryPhase) {
    // Each phase is read from the first frame's sequence number (or its drop);
    // the kept frames of 20 recorded ones depend on where the cadence starts.
    const uint8_t patterns[5] = {0x1b, 0x17, 0x0f, 0x1e, 0x1d};
    for (unsigned phase = 0; phase < 5; ++phase) {
        LogCapture log;
        _clip = load(cadenceCard(phase, 22, "dv-ntsc", 48000, "CAD" + std::to_string(phase)).clipPath);
        ASSERT_TRUE(_clip);
        ASSERT_EQ(_clip->shootingRate(), 24.0);
        auto reader = readerFor(_clip);
        SkarnTrackReader* video = track(reader, 0);
        ASSERT_NE(video->pulldownPattern(), nullptr) << phase;
        EXPECT_EQ(video->pulldownPattern(), kSkarnTwentyFourInThirtyKeepDrop) << phase;
        EXPECT_EQ(video->followonDropSequence(), kSkarnTwentyFourInThirtyDropSequence) << phase;
        EXPECT_EQ(video->patternLength(), 5u);
        EXPECT_EQ(video->patternIndex(), phase);
        EXPECT_EQ(video->numActiveFramesInPattern(), 4u);
        EXPECT_EQ(video->frameDuration().value, 1001);
        EXPECT_EQ(video->frameDuration().timescale, 24000);
        uint64_t kept = 0;
        for (unsigned i = 0; i < 22; ++i) kept += kSkarnTwentyFourInThirtyKeepDrop[(phase + i) % 5];
        EXPECT_EQ(video->trackDuration().value, int64_t(kept * 1001)) << phase;
        EXPECT_EQ(video->maxpts().value, int64_t((kept - 1) * 1001)) << phase;
        EXPECT_EQ(track(reader, 1)->pulldownPattern(), video->pulldownPattern());
        // The audio is cut to the kept frames' length.
        EXPECT_EQ(track(reader, 2)->trackDuration().value, int64_t(kept * 2002)) << phase;
        if (kLogging) {
            EXPECT_TRUE(log.has("attempting to read 1 frames to determine cadence of length 5"));
            EXPECT_TRUE(log.has(phase == 2 ? "read drop... must be drop-keep-keep-keep-keep"
                                           : "got a video frame of sequence " + std::to_string(phase)));
            char line[64];
            std::snprintf(line, sizeof line, "cadence = 0x%x, video frame shift = ", patterns[phase]);
            EXPECT_TRUE(log.has(line)) << line;
            EXPECT_TRUE(log.has("TS Sample Rate now = 24000 because 24 FPS"));
        }
    }
}

TEST_F(FormatReader, StartTimecodeIsConvertedOnlyWhenACadenceIsRemoved) {
    ClipSpec c = clipOf("dv-ntsc", 10, 0);
    c.startTimecode = "00:00:10:00";
    c.dropFrame = false;
    DVStreamSpec dv;
    dv.cadence = DVCadence::TwentyFourInThirty;
    c.dv = dv;
    WrittenClip w = write(c);
    replaceInFile(w.clipPath, ">59.94i<", ">29.97p<");
    _clip = load(w.clipPath);
    EXPECT_EQ(track(readerFor(_clip), 0)->timecodeStart(), 240);          // ten seconds at 24
    EXPECT_EQ(track(readerFor(_clip, true, false), 0)->timecodeStart(), 300);  // at the recorded 30
}

TEST_F(FormatReader, CadenceIsKeptWhenTheCallerAsksOrTheRatesDoNotCallForIt) {
    WrittenClip w = cadenceCard(1, 12);
    _clip = load(w.clipPath);
    {
        LogCapture log;
        auto feed = readerFor(_clip, true, false);
        EXPECT_EQ(track(feed, 0)->pulldownPattern(), nullptr);
        EXPECT_EQ(track(feed, 0)->frameDuration().timescale, 30000);
        EXPECT_EQ(track(feed, 0)->trackDuration().value, 12 * 1001);
        auto keep = readerFor(_clip, false, true);
        EXPECT_EQ(track(keep, 0)->pulldownPattern(), nullptr);
        EXPECT_EQ(track(keep, 2)->timingOffset(), 0u);
        // Neither probes a frame.
        LOG_EXPECT_FALSE(log.has("attempting to read"));
    }
    // The field rows leave pulldown to the ingest object.
    ClipSpec c = clipOf("dv-ntsc", 12, 0);
    DVStreamSpec dv;
    dv.cadence = DVCadence::TwentyFourInThirty;
    c.dv = dv;
    _clip = load(write(c, "FIELD").clipPath);
    EXPECT_EQ(_clip->shootingRate(), 24.0);
    EXPECT_EQ(track(readerFor(_clip), 0)->pulldownPattern(), nullptr);
    // 24 shot at 24 has nothing to remove.
    WrittenClip same = cadenceCard(0, 12, "dv-ntsc", 48000, "SAME");
    replaceInFile(same.clipPath, ">29.97p<", ">23.98p<");
    _clip = load(same.clipPath);
    EXPECT_EQ(track(readerFor(_clip), 0)->pulldownPattern(), nullptr);
}

TEST_F(FormatReader, HalfRateShootingIsReadFromTheKeepMarks) {
    // 720p recorded at 15 inside 30: half rate. One keep-marked frame is read
    // first so that the process-wide mark flag is set whatever ran before.
    auto halfRate = [&](unsigned phase, const std::string& root) {
        ClipSpec c = clipOf("dvcprohd-720p60", 6, 1);
        c.startTimecode = "00:00:00:00";
        DVStreamSpec dv;
        dv.cadence = DVCadence::HalfRate;
        dv.cadencePhase = phase;
        dv.shootingRate = 15;
        c.dv = dv;
        WrittenClip w = write(c, root);
        replaceInFile(w.clipPath, ">59.94p<", ">29.97p<");
        _clip = load(w.clipPath);
        return readerFor(_clip);
    };
    (void)halfRate(0, "WARM");
    LogCapture log;
    auto keepDrop = halfRate(0, "KD");
    SkarnTrackReader* video = track(keepDrop, 0);
    ASSERT_NE(video->pulldownPattern(), nullptr);
    EXPECT_EQ(video->pulldownPattern(), kSkarnHalfRateKeepDrop);
    EXPECT_EQ(video->followonDropSequence(), kSkarnHalfRateDropSequence);
    EXPECT_EQ(video->patternLength(), 2u);
    EXPECT_EQ(video->patternIndex(), 0u);
    // 15 is no rate with a timescale of its own: the stream's stays.
    EXPECT_EQ(video->frameDuration().timescale, 30000);
    EXPECT_EQ(video->trackDuration().value, 3 * 1001);
    if (kLogging) {
        EXPECT_TRUE(log.has("attempting to read 1 frames to determine cadence of length 2"));
        EXPECT_TRUE(log.has("got a video frame, must be keep-drop"));
    }
    // Hosts read the cadence by name: the keep marks, their count and the
    // first frame's place; a track without pulldown answers nil.
    EXPECT_EQ(video->valueForKey("pulldownPattern"), Value::array({1, 0}));
    EXPECT_EQ(video->valueForKey("patternLength").integerValue(), 2);
    EXPECT_EQ(video->valueForKey("patternIndex").integerValue(), 0);
    EXPECT_TRUE(track(keepDrop, 2)->valueForKey("pulldownPattern").isNull());
    auto dropKeep = halfRate(1, "DK");
    EXPECT_EQ(track(dropKeep, 0)->patternIndex(), 1u);
    LOG_EXPECT_TRUE(log.has("dropped a video frame, must be drop-keep"));
}

TEST_F(FormatReader, TwentyFourInThirtyOn720pIsReadFromKeepMarks) {
    ClipSpec c = clipOf("dvcprohd-720p60", 10, 0);
    DVStreamSpec dv;
    dv.cadence = DVCadence::TwentyFourInSixty;
    c.dv = dv;
    WrittenClip w = write(c);
    replaceInFile(w.clipPath, ">59.94p<", ">29.97p<");
    LogCapture log;
    _clip = load(w.clipPath);
    ASSERT_EQ(_clip->shootingRate(), 24.0);
    auto reader = readerFor(_clip);
    SkarnTrackReader* video = track(reader, 0);
    // Keep, drop: the first two marks already fix a five-frame 24-in-30 place.
    ASSERT_NE(video->pulldownPattern(), nullptr);
    EXPECT_EQ(video->patternIndex(), 1u);
    if (kLogging) {
        EXPECT_TRUE(log.has("attempting to read up to 5 frames to determine cadence"));
        EXPECT_TRUE(log.has("read keep-drop... must be keep-drop-keep-keep-keep"));
    }
}

TEST_F(FormatReader, AudioAtAKeptFrameIsTheSoundRecordedWithIt) {
    // At 120 kHz a 29.97 frame is 4004 samples and a 23.976 one 5005, so the
    // quarter and half frame shifts of the cadence are whole samples. The
    // frame at cadence position 0 is where four shooting-rate frames and five
    // recorded ones start together: there the recording trails the kept frame
    // by exactly the cadence's frame shift, so the audio presented with it must
    // be the recorded frame's first sample. Everywhere else the 24 and 30
    // timelines drift apart by up to three quarters of a frame.
    for (unsigned phase = 0; phase < 5; ++phase) {
        _clip = load(cadenceCard(phase, 15, "dv-ntsc", 120000, "R" + std::to_string(phase)).clipPath);
        auto reader = readerFor(_clip);
        SkarnTrackReader* video = track(reader, 0);
        SkarnTrackReader* audio = track(reader, 2);
        ASSERT_NE(video->pulldownPattern(), nullptr);
        for (int64_t kept = 0; kept < 10; ++kept) {
            auto v = cursorAt(video, CMTimeMake(kept * 1001, 24000));
            int64_t recorded = locate(v.get()).offset / video->sampleSize();
            if ((phase + recorded) % 5 != 0) continue;  // not a cadence start
            auto a = cursorAt(audio, CMTimeMake(kept * 1001, 24000));
            Location l = locate(a.get());
            EXPECT_EQ(l.offset, recorded * 4004 * 2) << "phase " << phase << " kept frame " << kept;
            EXPECT_EQ(l.length, 2);
        }
    }
}

TEST_F(FormatReader, TimingOffsetsAreWholeSamplesRoundedAwayFromZero) {
    // At 48 kHz a quarter frame of 29.97 is 400.4 samples and half a frame 800.8.
    const int64_t expected[5] = {0, 400, 801, -801, -400};
    for (unsigned phase = 0; phase < 5; ++phase) {
        _clip = load(cadenceCard(phase, 10, "dv-ntsc", 48000, "T" + std::to_string(phase)).clipPath);
        auto reader = readerFor(_clip);
        EXPECT_EQ(int64_t(track(reader, 2)->timingOffset()), expected[phase]) << phase;
        EXPECT_EQ(track(reader, 0)->timingOffset(), 0u) << phase;
        // Before the recording starts the first recorded sample stands in.
        auto a = cursorAt(track(reader, 2), kCMTimeZero);
        EXPECT_EQ(locate(a.get()).offset, expected[phase] > 0 ? expected[phase] * 2 : 0) << phase;
    }
}

TEST_F(FormatReader, UnreadableCadenceLeavesTheRecording) {
    WrittenClip w = cadenceCard(0, 10);
    _clip = load(w.clipPath);
    ASSERT_TRUE(_clip);
    // The video file shrinks under the clip to less than its first frame.
    std::string video = *_clip->videoFilePath();
    ASSERT_EQ(::truncate(video.c_str(), 8192), 0);
    LogCapture log;
    auto reader = readerFor(_clip);
    SkarnTrackReader* v = track(reader, 0);
    EXPECT_EQ(v->pulldownPattern(), nullptr);
    EXPECT_EQ(v->frameDuration().timescale, 30000);
    EXPECT_EQ(v->trackDuration().value, 10 * 1001);
    EXPECT_EQ(v->uneditedNumDataBytes(), 8192);
    LOG_EXPECT_TRUE(log.has("no video frame"));
}

// ---------------------------------------------------------------------------
// Damaged clips: the reader is built and its cursors stay within the tracks.

void walkEveryTrack(const Ref<SkarnFormatReader>& reader) {
    for (auto& t : reader->trackList()) {
        SkarnTrackReader* tr = t.get();
        bool before = false, after = false;
        for (CMTime at : {CMTimeMake(-5, 1), kCMTimeZero, CMTimeMake(1, 2), CMTimeMake(1000000, 1)}) {
            auto c = cursorAt(tr, at, &before, &after);
            ASSERT_TRUE(c);
            Location l = locate(c.get());
            if (l.count == 1 && tr->mxfDataAccess() == nullptr && tr->sampleSize() > 0) {
                EXPECT_GE(l.offset, 0);
            }
            int steps = 0;
            while (c->stepInDecodeOrder(1) == 0 && ++steps < 100000) {
            }
            EXPECT_LT(steps, 100000);
            EXPECT_EQ(c->stepInDecodeOrder(1), kVestaKilnSampleCursorNoMoreSamples);
            Chunk ch = chunkOf(c.get());
            (void)ch;
            (void)c->playableHorizon();
            (void)c->timecodeCounter();
            (void)c->followonDropCount();
        }
    }
}

TEST_F(FormatReader, MissingVideoFileStillBuildsTheReader) {
    WrittenClip w = write(clipOf("dv-ntsc", 4, 2));
    _clip = load(w.clipPath);
    ASSERT_TRUE(_clip);
    ASSERT_EQ(::unlink(_clip->videoFilePath()->c_str()), 0);
    auto reader = readerFor(_clip);
    ASSERT_TRUE(reader);
    EXPECT_EQ(track(reader, 0)->uneditedNumDataBytes(), 0);
    walkEveryTrack(reader);
}

TEST_F(FormatReader, LyingLengthsAndZeroFramesStayInsideTheTrack) {
    WrittenClip w = write(clipOf("dv-ntsc", 4, 1));
    std::string xml = readText(w.clipPath);
    // The index claims far more data than the file holds.
    replaceInFile(w.clipPath, "<DataSize>480000</DataSize>", "<DataSize>9223372036854775807</DataSize>");
    _clip = load(w.clipPath);
    if (_clip) walkEveryTrack(readerFor(_clip));

    writeTextFile(w.clipPath, xml);
    replaceInFile(w.clipPath, "<Duration>4</Duration>", "<Duration>0</Duration>");
    _clip = load(w.clipPath);
    if (_clip) {
        auto reader = readerFor(_clip);
        ASSERT_TRUE(reader);
        SkarnTrackReader* video = track(reader, 0);
        EXPECT_EQ(video->trackDuration().value, 0);
        EXPECT_FALSE(CMTIME_IS_VALID(video->minpts()));
        walkEveryTrack(reader);
    }
}

TEST_F(FormatReader, SelfContainedClipIsAsLongAsItsIndex) {
    for (uint64_t claimed : {10u, 40u}) {
        ClipSpec header = clipOf("avclip-intra", claimed, 2);
        header.name = "B" + std::to_string(claimed);
        AVClipSpec shape;
        shape.frames = 20;
        shape.framesPerChunk = 10;
        shape.frameBytes = 2048;
        shape.clipXML = avclipHeaderXMLText(header);
        _clip = load(writeAVClipFile(shape, header.name));
        ASSERT_TRUE(_clip);
        auto reader = readerFor(_clip);
        SkarnTrackReader* video = track(reader, 0);
        EXPECT_EQ(video->trackDuration().value, 20 * 1001) << claimed;
        EXPECT_EQ(video->maxpts().value, 19 * 1001) << claimed;
        AssertionCapture capture;
        auto last = video->cursorAtLastSampleInDecodeOrder();
        EXPECT_EQ(last->stepInDecodeOrder(1), kVestaKilnSampleCursorNoMoreSamples);
        EXPECT_EQ(static_cast<SkarnSampleCursor*>(last.get())->currentMXFIndex(), 19u);
    }
}

TEST_F(FormatReader, ShortSelfContainedFileStillBuildsTheReader) {
    AVClipSpec shape;
    shape.frames = 30;
    shape.framesPerChunk = 10;
    shape.frameBytes = 2048;
    AVClipLayout layout;
    std::string path = writeAVClipFile(shape, "A001", &layout);
    _clip = load(path);
    ASSERT_TRUE(_clip);
    // Cut inside the second chunk: the index promises frames that are not there.
    ASSERT_EQ(::truncate(path.c_str(), off_t(layout.chunks[1].videoPartition + 100)), 0);
    AssertionCapture capture;
    Ref<SkarnFormatReader> reader;
    try {
        reader = readerFor(_clip);
    } catch (const HardAssertionFailure& f) {
        FAIL() << "building asserted: " << f.expression;
    }
    ASSERT_TRUE(reader);
    EXPECT_EQ(track(reader, 0)->uneditedNumDataBytes(), int64_t(layout.chunks[1].videoPartition + 100));
    // Without its footer the file has no index: the tracks are empty.
    EXPECT_EQ(track(reader, 0)->trackDuration().value, 0);
    // Every track can be walked: the frames whose index was cut off read as
    // missing, none as a programming error.
    for (auto& t : reader->trackList()) {
        try {
            auto c = t->cursorAtFirstSampleInDecodeOrder();
            int steps = 0;
            int64_t stride = t->mediaTypeValue() == kCMMediaType_Audio ? 1000 : 1;
            do {
                Location l = locate(static_cast<SkarnSampleCursor*>(c.get()));
                if (l.count == 1) {
                    EXPECT_GE(l.offset, 0);
                }
            } while (c->stepInDecodeOrder(stride) == 0 && ++steps < 1000);
            EXPECT_LT(steps, 1000);
            EXPECT_EQ(c->stepInDecodeOrder(1), kVestaKilnSampleCursorNoMoreSamples);
        } catch (const HardAssertionFailure& f) {
            ADD_FAILURE() << "track " << t->mediaTypeValue() << ": " << f.expression << " (" << f.source << ")";
        }
    }
}

}  // namespace
