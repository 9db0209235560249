#include "SkarnClip.h"

#include "CardWriter.h"
#include "DVFrameData.h"
#include "FileSystem.h"
#include "SkarnStringToBoolValueTransformer.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <cstring>

namespace {

constexpr FourCharCode fcc(const char (&s)[5]) { return DVFourCC(s); }

class ClipTest : public ::testing::Test {
protected:
    static void SetUpTestSuite() { SkarnClip::setDefaultBundle(Bundle::bundleWithPath(buildDir() + "/Skarn.kilnplugin")); }

    // A CLIP XML on a bare card (no essence files) from the ClipContent children.
    Ref<SkarnClip> load(const std::string& content, const std::string& name = "A001") {
        std::string folder = dir / "CARD/CONTENTS/CLIP";
        makeDirs(folder);
        writeTextFile(folder + "/" + name + ".XML", document(content));
        return SkarnClip::initWithSkarnClip(folder + "/" + name + ".XML");
    }
    static std::string document(const std::string& content) {
        return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<SkarnClip xmlns=\"urn:schemas-corvane-com:skarn:clip:1.0\">"
               "<ClipContent>" + content + "</ClipContent></SkarnClip>";
    }
    // A video clip of `frames` frames of `frameBytes` bytes.
    static std::string video(const std::string& codec, uint64_t frameBytes, const std::string& rate,
                             const std::string& videoExtra = "", const std::string& contentExtra = "",
                             uint64_t frames = 10) {
        return "<GlobalClipID>0011AABB</GlobalClipID><Duration>" + std::to_string(frames) +
               "</Duration><EditUnit>1001/30000</EditUnit>" + contentExtra +
               "<EssenceList><Video><Codec>" + codec + "</Codec><FrameRate>" + rate + "</FrameRate>" + videoExtra +
               "<VideoIndex><StartByteOffset>0</StartByteOffset><DataSize>" + std::to_string(frameBytes * frames) +
               "</DataSize></VideoIndex></Video></EssenceList>";
    }
    Ref<SkarnClip> loadVideo(const std::string& codec, uint64_t frameBytes, const std::string& rate,
                             const std::string& videoExtra = "", const std::string& contentExtra = "") {
        return load(video(codec, frameBytes, rate, videoExtra, contentExtra));
    }

    // A card written by the card writer; answers the written clips.
    std::vector<WrittenClip> card(const std::vector<ClipSpec>& clips, const std::string& root = "VOL") {
        CardSpec params;
        params.root = dir / root;
        params.clips = clips;
        std::vector<WrittenClip> written;
        std::string error;
        EXPECT_TRUE(writeCard(params, &written, &error)) << error;
        return written;
    }
    static ClipSpec clipOf(const char* family, unsigned index = 1, uint64_t frames = 4) {
        ClipSpec c = defaultClip(*cardFamilyNamed(family), index);
        c.frames = frames;
        return c;
    }

    TempDir dir;
};

}  // namespace

// ---------------------------------------------------------------------------
// Format detection

TEST_F(ClipTest, FormatTableByFrameSizeCodecAndRate) {
    struct Row {
        const char* codec;
        uint64_t bytes;
        const char* rate;
        int32_t code;
    };
    const Row rows[] = {
        {"DV25_411", 144000, "50i", 8},           {"dv25_420", 144000, "50i", 2},
        {"DV25_411", 120000, "59.94i", 1},        {"DV50_422", 240000, "59.94i", 9},
        {"DV50_422", 288000, "50i", 10},          {"DV100_720/59.94p", 240000, "59.94p", 11},
        {"DV100_720/50p", 288000, "50p", 12},     {"DV100_1080/59.94i", 480000, "59.94i", 13},
        {"DV100_1080/50i", 576000, "50i", 14},    {"AVC-I_720/50p", 1000, "25p", 16},
        {"AVC-I_720/50p", 1000, "50p", 18},       {"AVC-I_720/59.94p", 1000, "23.98p", 15},
        {"AVC-I_720/59.94p", 1000, "29.97p", 17}, {"AVC-I_720/59.94p", 1000, "59.94p", 19},
        {"AVC-I_1080/25p", 1000, "25p", 21},      {"AVC-I_1080/25p", 1000, "50p", 23},
        {"AVC-I_1080/29.97p", 1000, "23.98p", 20}, {"AVC-I_1080/29.97p", 1000, "29.97p", 22},
        {"AVC-I_1080/29.97p", 1000, "59.94p", 24}, {"AVC-I_1080/50i", 1000, "50i", 25},
        {"AVC-I_1080/59.94i", 1000, "59.94i", 26}, {"AVC-Strand420", 1000, "59.94i", 4},
        {"AVC-Strand422", 1000, "59.94i", 5},     {"AVC-Intra2K_444", 1000, "24p", 7},
        {"AVC-Intra4K_444", 1000, "24p", 7},      {"AVC-Intra_444", 1000, "24p", 7},
        {"AVC-Intra2K_422", 1000, "24p", 6},      {"avc-intra4k_422", 1000, "24p", 6},
    };
    for (const Row& r : rows) {
        SCOPED_TRACE(std::string(r.codec) + " " + r.rate);
        auto clip = loadVideo(r.codec, r.bytes, r.rate);
        ASSERT_TRUE(clip);
        EXPECT_EQ(clip->videoFormat(), r.code);
    }
}

TEST_F(ClipTest, UnknownFormatsAreNotClips) {
    // A DV codec whose frame size fits none of its rows falls through the AVC
    // rows and ends unknown.
    EXPECT_FALSE(loadVideo("DV25_411", 240000, "59.94i"));
    EXPECT_FALSE(loadVideo("DV100_1080/50i", 480000, "50i"));
    EXPECT_FALSE(loadVideo("MPEG2", 1000, "59.94i"));
    // Without an EssenceList codec (the header XML shape) the clip is AVC-Intra
    // 1080i60, whatever its own codec says.
    auto clip = load("<Duration>5</Duration><Essence><Video><Codec>DV25_411</Codec><FrameRate>50i</FrameRate>"
                     "</Video></Essence>");
    ASSERT_TRUE(clip);
    EXPECT_EQ(clip->videoFormat(), 26);
    EXPECT_EQ(clip->format(), "AVC-Intra (1080i60)");
}

TEST_F(ClipTest, SourceCodesAndNames) {
    EXPECT_EQ(loadVideo("DV25_411", 144000, "50i")->sourceFormat(), fcc("dvpp"));
    EXPECT_EQ(loadVideo("DV25_411", 144000, "50i")->format(), "DVCPRO - PAL");
    EXPECT_EQ(loadVideo("DV25_411", 120000, "59.94i")->sourceFormat(), fcc("dvc "));
    EXPECT_EQ(loadVideo("DV25_411", 120000, "59.94i")->format(), "DV/DVCPRO - NTSC");
    EXPECT_EQ(loadVideo("DV25_420", 144000, "50i")->sourceFormat(), fcc("dvcp"));
    EXPECT_EQ(loadVideo("DV50_422", 240000, "59.94i")->sourceFormat(), fcc("dv5n"));
    EXPECT_EQ(loadVideo("DV100_720/50p", 288000, "50p")->sourceFormat(), fcc("dvhq"));
    EXPECT_EQ(loadVideo("DV100_1080/59.94i", 480000, "59.94i")->sourceFormat(), fcc("dvh6"));
    EXPECT_EQ(loadVideo("AVC-Strand422", 1000, "59.94i")->sourceFormat(), fcc("avlg"));
    EXPECT_EQ(loadVideo("AVC-Intra4K_422", 1000, "24p")->sourceFormat(), fcc("ai42"));
    EXPECT_EQ(loadVideo("AVC-Intra_444", 1000, "24p")->sourceFormat(), fcc("ai44"));

    // AVC-Intra by bit rate: the Codec Class, else the format's default.
    auto avci = [&](const char* cls) {
        std::string codec = std::string("<Codec") + (cls ? std::string(" Class=\"") + cls + "\"" : "") +
                            ">AVC-I_1080/59.94i</Codec>";
        return load("<Duration>10</Duration><EssenceList><Video>" + codec +
                    "<FrameRate>59.94i</FrameRate><VideoIndex><DataSize>4720640</DataSize></VideoIndex>"
                    "</Video></EssenceList>");
    };
    EXPECT_EQ(avci(nullptr)->sourceFormat(), fcc("ai16"));
    EXPECT_EQ(avci("100")->sourceFormat(), fcc("ai16"));
    EXPECT_EQ(avci("200")->sourceFormat(), fcc("ai26"));
    EXPECT_EQ(avci("50")->sourceFormat(), fcc("ai56"));
    EXPECT_EQ(avci("abc")->sourceFormat(), fcc("ai56"));
    auto c = avci("100");
    EXPECT_TRUE(c->isAVCI());
    EXPECT_EQ(c->decodePixelFormat(), fcc("v216"));
    EXPECT_EQ(c->sourceFormatName(), "Skarn AVC-Intra");
    // 512 header bytes are not picture data; the offset skips them.
    EXPECT_EQ(c->videoDataSize(), 4720640 - 512);
    EXPECT_EQ(c->startByteOffset(), 512);
    EXPECT_EQ(loadVideo("DV50_422", 240000, "59.94i")->sourceFormatName(), std::nullopt);
}

TEST_F(ClipTest, DisplayFormatFollowsPulldownAndVFRRatio) {
    auto dv = [&](const char* pulldown) {
        return loadVideo("DV25_411", 120000, "59.94i", std::string("<Pulldown>") + pulldown + "</Pulldown>");
    };
    EXPECT_EQ(dv("2:3")->displayFormat(), "480p24");
    EXPECT_EQ(dv("2:3:3:2")->displayFormat(), "480pA24");
    EXPECT_EQ(dv("2:2")->displayFormat(), "480p30");
    EXPECT_EQ(dv("none")->displayFormat(), "480i60");
    EXPECT_EQ(dv("2:2")->videoHeight(), 480u);

    auto hd = [&](const char* codec, uint64_t bytes, const char* rate, const std::string& extra) {
        return loadVideo(codec, bytes, rate, extra);
    };
    auto vfr = hd("DV100_720/59.94p", 240000, "59.94p", "<VFRRatio VRFRState=\"Variable\">60/24</VFRRatio>");
    EXPECT_EQ(vfr->displayFormat(), "720pN60");
    auto vfr24 = hd("DV100_720/59.94p", 240000, "59.94p", "<VFRRatio VRFRState=\"constant\">24/60</VFRRatio>");
    EXPECT_EQ(vfr24->displayFormat(), "720pN24");
    EXPECT_EQ(vfr24->videoBitrate(), 40);
    // An unknown state or a ratio without one slash is not a VFR recording.
    EXPECT_EQ(hd("DV100_720/59.94p", 240000, "59.94p", "<VFRRatio VRFRState=\"off\">24/60</VFRRatio>")->displayFormat(),
              "720p60");
    EXPECT_EQ(hd("DV100_720/59.94p", 240000, "59.94p", "<VFRRatio VRFRState=\"variable\">24</VFRRatio>")->displayFormat(),
              "720p60");
    EXPECT_EQ(hd("DV100_720/59.94p", 240000, "59.94p", "<Pulldown>2:3</Pulldown>")->displayFormat(), "720p24");
    EXPECT_EQ(hd("DV100_720/59.94p", 240000, "29.97p", "")->displayFormat(), "720pN30");
    EXPECT_EQ(hd("DV100_720/59.94p", 240000, "29.97p", "")->videoBitrate(), 50);
    EXPECT_EQ(hd("DV100_720/59.94p", 240000, "23.98p", "")->displayFormat(), "720pN24");
    EXPECT_EQ(hd("DV100_720/59.94p", 240000, "12p", "")->displayFormat(), std::nullopt);
    EXPECT_EQ(hd("DV100_720/50p", 288000, "50p", "<Pulldown>2:2</Pulldown>")->displayFormat(), "720p25");
    EXPECT_EQ(hd("DV100_720/50p", 288000, "50p", "")->displayFormat(), "720p50");
    EXPECT_EQ(hd("DV100_720/50p", 288000, "25p", "")->displayFormat(), "720pN25");
    EXPECT_EQ(hd("DV100_1080/59.94i", 480000, "59.94i", "<Pulldown>2:3:3:2</Pulldown>")->displayFormat(), "1080pA24");
    EXPECT_EQ(hd("DV100_1080/50i", 576000, "50i", "<Pulldown>2:2</Pulldown>")->displayFormat(), "1080p25");

    // AVC-Strand by active lines and the frame-rate text.
    auto strand = [&](const char* lines, const char* rate) {
        return loadVideo("AVC-Strand422", 1000, rate, std::string("<ActiveLine>") + lines + "</ActiveLine>");
    };
    EXPECT_EQ(strand("1080", "59.94i")->displayFormat(), "1080i30");
    EXPECT_EQ(strand("1080", "59.94p")->displayFormat(), "1080p60");
    EXPECT_EQ(strand("1080", "50i")->displayFormat(), "1080i25");
    EXPECT_EQ(strand("1080", "23.98p")->displayFormat(), "1080p24");
    EXPECT_EQ(strand("720", "50p")->displayFormat(), "720p50");
    EXPECT_EQ(strand("720", "25p")->displayFormat(), std::nullopt);
    EXPECT_EQ(strand("2160", "59.94p")->displayFormat(), "4k");
    EXPECT_EQ(strand("2160", "59.94p")->videoHeight(), 0u);
}

TEST_F(ClipTest, DimensionsAspectAndBitRate) {
    auto hd = loadVideo("DV100_1080/59.94i", 480000, "59.94i", "<AspectRatio>16:9</AspectRatio>");
    EXPECT_EQ(hd->videoWidth(), 1920u);
    EXPECT_EQ(hd->videoHeight(), 1080u);
    EXPECT_FALSE(hd->anamorphic());
    EXPECT_EQ(hd->videoBitrate(), 100);
    auto sd = loadVideo("DV25_411", 120000, "59.94i", "<AspectRatio>4:3</AspectRatio>");
    EXPECT_EQ(sd->videoWidth(), 640u);
    EXPECT_FALSE(sd->anamorphic());
    EXPECT_EQ(sd->videoBitrate(), 25);
    EXPECT_TRUE(loadVideo("DV50_422", 240000, "59.94i", "<AspectRatio>16:9</AspectRatio>")->anamorphic());
    EXPECT_TRUE(SkarnClip::recognizedVideoSampleSize(1143808));
    EXPECT_FALSE(SkarnClip::recognizedVideoSampleSize(1143807));
}

TEST_F(ClipTest, ByteSizesAndAudioLayout) {
    std::string audio;
    for (int i = 0; i < 2; ++i)
        audio += "<Audio><SamplingRate>48000</SamplingRate><BitsPerSample>24</BitsPerSample><AudioIndex>"
                 "<DataSize>" + std::to_string(1000 * (i + 1)) + "</DataSize></AudioIndex></Audio>";
    std::string xml = video("DV25_411", 120000, "59.94i");
    xml.insert(xml.find("</EssenceList>"), audio + "<Audio><AudioIndex><DataSize>-7</DataSize></AudioIndex></Audio>");
    auto clip = load(xml);
    ASSERT_TRUE(clip);
    EXPECT_EQ(clip->numberOfAudioChannels(), 3u);
    EXPECT_EQ(clip->sampleRate(), 48000);
    EXPECT_EQ(clip->bitsPerSample(), 24);
    EXPECT_EQ(clip->dataSizeForAudioChannelIndex(1), 2000);
    EXPECT_EQ(clip->dataSize(), 1200000 + 3000);  // negative sizes are not added
    // Past the listed channels the size comes from Duration, EditUnit, rate and depth.
    EXPECT_DOUBLE_EQ(clip->dataSizeForAudioChannelIndex(5), 10 * 1001.0 / 30000 * 48000 * 24 / 8);

    EXPECT_EQ(load(video("DV25_411", 120000, "59.94i"))->numberOfAudioChannels(), 0u);
    std::string withChannel = video("DV25_411", 120000, "59.94i");
    withChannel.insert(withChannel.find("</EssenceList>"), "<Audio><Channel>-4</Channel></Audio>");
    EXPECT_EQ(load(withChannel)->numberOfAudioChannels(), 0u);
    auto header = load("<Duration>5</Duration><Essence><Video><Codec>x</Codec><FrameRate>59.94i</FrameRate></Video>"
                       "<Audio><ChannelNum>4</ChannelNum></Audio></Essence>");
    EXPECT_EQ(header->numberOfAudioChannels(), 4u);
}

TEST_F(ClipTest, DisplayName) {
    auto named = [&](const std::string& user, const std::string& extra = "") {
        return load(video("DV25_411", 120000, "59.94i", "",
                          "<ClipMetadata><UserClipName>" + user + "</UserClipName></ClipMetadata>" + extra))
            ->name();
    };
    EXPECT_EQ(named("Interview"), "Interview A001");
    EXPECT_EQ(named("0123ABCD"), "A001");  // itself an identifier
    EXPECT_EQ(named("0011aabb"), "A001");  // the global clip ID
    EXPECT_EQ(named("a001"), "A001");
    EXPECT_EQ(named(std::string(63, 'x')), std::string(63, 'x') + " A001");
    EXPECT_EQ(named(std::string(64, 'x')), "A001");
    EXPECT_EQ(named("Span", "<Relation><Connection><Top><GlobalClipID>SPAN</GlobalClipID></Top></Connection>"
                            "</Relation>"),
              "A001");
    EXPECT_EQ(loadVideo("DV25_411", 120000, "59.94i")->name(), "A001");
}

// ---------------------------------------------------------------------------
// Timing

TEST_F(ClipTest, NominalAndTransportRates) {
    struct Row {
        const char* text;
        double nominal, transport;
    };
    for (const Row& r : {Row{"59.94i", 30, 29.97}, Row{"59.94p", 60, 59.94}, Row{"50p", 50, 50},
                         Row{"23.98p", 24, 23.98}, Row{"29.97p", 30, 29.97}, Row{"24p", 24, 24}, Row{"0", 0, 0},
                         Row{"fast", 0, 0}, Row{"nan", 0, 0}}) {
        SCOPED_TRACE(r.text);
        auto clip = loadVideo("AVC-I_1080/59.94i", 1000, r.text);
        ASSERT_TRUE(clip);
        EXPECT_EQ(clip->frameRate(), r.nominal);
        EXPECT_EQ(clip->transportRate(), r.transport);
    }
    // A rate of 0 makes no start timecode.
    EXPECT_FALSE(loadVideo("AVC-I_1080/59.94i", 1000, "0", "<StartTimecode>01:00:00:00</StartTimecode>")->__mediaStart());
    EXPECT_TRUE(loadVideo("AVC-I_1080/59.94i", 1000, "5", "<StartTimecode>01:00:00:00</StartTimecode>")->__mediaStart());
}

TEST_F(ClipTest, PulldownFromOtherAndTheShootingRate) {
    auto hd = [&](const char* codec, uint64_t bytes, const char* rate, const std::string& extra) {
        return loadVideo(codec, bytes, rate, extra);
    };
    auto p23 = hd("DV100_720/59.94p", 240000, "59.94p",
                  "<Pulldown>OTHER</Pulldown><VFRRatio VRFRState=\"variable\">60/24</VFRRatio>");
    EXPECT_EQ(p23->shootingRate(), 24);
    EXPECT_EQ(p23->pulldown(), 2);
    // 50/25 is read as 50, so 50 in 50 leaves the pulldown alone; 25/25 is 25 in 50.
    auto p50 = hd("DV100_720/50p", 288000, "50p",
                  "<Pulldown>OTHER</Pulldown><VFRRatio VRFRState=\"variable\">50/25</VFRRatio>");
    EXPECT_EQ(p50->shootingRate(), 50);
    EXPECT_EQ(p50->pulldown(), 1);
    auto p25 = hd("DV100_720/50p", 288000, "50p",
                  "<Pulldown>other</Pulldown><VFRRatio VRFRState=\"constant\">25/25</VFRRatio>");
    EXPECT_EQ(p25->pulldown(), 4);
    EXPECT_EQ(hd("DV100_720/59.94p", 240000, "59.94p", "<Pulldown>2:3</Pulldown>")->pulldown(), 2);
    // 1080p display formats name their shooting rate.
    auto strand = hd("AVC-Strand422", 1000, "23.98p", "<ActiveLine>1080</ActiveLine><Pulldown>OTHER</Pulldown>");
    EXPECT_EQ(strand->shootingRate(), 24);
    EXPECT_EQ(strand->pulldown(), 1);  // (24, 24) is no pair of the table
    EXPECT_EQ(hd("AVC-I_1080/59.94i", 1000, "59.94i", "")->shootingRate(), 30);
}

TEST_F(ClipTest, ShootingRateFromTheFirstDVFrame) {
    ClipSpec c = clipOf("dvcpro50-ntsc", 1, 6);
    c.dv = DVStreamSpec{};
    c.dv->cadence = DVCadence::TwentyFourInThirty;
    c.pulldown = "OTHER";
    ClipSpec hd = clipOf("dvcprohd-720p60", 2, 6);
    hd.dv = DVStreamSpec{};
    hd.dv->cadence = DVCadence::TwentyFourInSixty;
    ClipSpec plain = clipOf("dvcpro50-ntsc", 3, 3);
    ClipSpec fields = clipOf("dvcprohd-1080i60", 4, 3);
    fields.dv = DVStreamSpec{};
    fields.dv->shootingRate = 60;
    auto written = card({c, hd, plain, fields});

    auto clip = SkarnClip::initWithSkarnClip(written[0].clipPath);
    ASSERT_TRUE(clip);
    EXPECT_EQ(clip->shootingRate(), 24);
    EXPECT_EQ(clip->pulldown(), 3);  // 24 in 30 through "OTHER"
    EXPECT_EQ(clip->displayFormat(), "480pA24");
    EXPECT_EQ(SkarnClip::initWithSkarnClip(written[1].clipPath)->shootingRate(), 24);
    EXPECT_EQ(SkarnClip::initWithSkarnClip(written[2].clipPath)->shootingRate(), 30);
    // The pack counts frames here (its frame flag is set), so 60 stays 60.
    EXPECT_EQ(SkarnClip::initWithSkarnClip(written[3].clipPath)->shootingRate(), 60);

    // Cleared, the frame flag says the 60 counts fields: 30 frames.
    std::string videoPath = *SkarnClip::initWithSkarnClip(written[3].clipPath)->videoFilePath();
    auto bytes = *FileSystem::readFile(videoPath);
    size_t patched = 0;
    for (size_t i = 0; i + 5 <= bytes.size(); ++i) {
        uint8_t* p = bytes.data() + i;
        if (p[0] == kDVPackShootingRate && p[1] == 0xA1 && p[4] == DVShootingRateCheckByte(p[1], p[2], p[3])) {
            p[1] = 0x21;
            p[4] = DVShootingRateCheckByte(p[1], p[2], p[3]);
            ++patched;
        }
    }
    ASSERT_GT(patched, 0u);
    writeBytes(videoPath, bytes);
    EXPECT_EQ(SkarnClip::initWithSkarnClip(written[3].clipPath)->shootingRate(), 30);

    // Without the video file, or with less than a frame of it, the rate stays the nominal one.
    ASSERT_EQ(::truncate(videoPath.c_str(), 100), 0);
    EXPECT_EQ(SkarnClip::initWithSkarnClip(written[3].clipPath)->shootingRate(), 30);
    std::remove(videoPath.c_str());
    auto missing = SkarnClip::initWithSkarnClip(written[3].clipPath);
    ASSERT_TRUE(missing);
    EXPECT_EQ(missing->shootingRate(), 30);
}

TEST_F(ClipTest, DropFrameDecision) {
    auto flagged = [&](const char* codec, uint64_t bytes, const char* rate, const std::string& flagXML,
                       const std::string& extra = "") {
        std::string xml = video(codec, bytes, rate, extra);
        xml.replace(xml.find("<FrameRate>"), 11, "<FrameRate " + flagXML + ">");
        return load(xml)->timecodeFormat();
    };
    EXPECT_EQ(flagged("DV100_720/59.94p", 240000, "59.94p", "DropFrameFlag=\"true\""), 1);
    EXPECT_EQ(flagged("DV100_720/50p", 288000, "50p", "DropFrameFlag=\"TRUE\""), 2);
    EXPECT_EQ(flagged("AVC-I_720/50p", 1000, "50p", "DropFrameFlag=\"true\""), 2);
    EXPECT_EQ(flagged("DV50_422", 240000, "59.94i", "DropFrameFlag=\"false\""), 2);
    auto typed = [&](const char* codec, uint64_t bytes, const char* type) {
        return load(video(codec, bytes, "59.94i", std::string("<TimecodeType>") + type + "</TimecodeType>"));
    };
    EXPECT_EQ(typed("AVC-Strand422", 1000, "DROP")->timecodeFormat(), 1);
    EXPECT_TRUE(typed("AVC-Strand422", 1000, "DROP")->isDropFrame());
    EXPECT_EQ(typed("DV50_422", 240000, "DROP")->timecodeFormat(), 2);
    EXPECT_EQ(typed("AVC-Strand422", 1000, "NDF")->timecodeFormat(), 2);
    EXPECT_EQ(loadVideo("DV50_422", 240000, "59.94i")->timecodeFormat(), 2);
}

TEST_F(ClipTest, StartTimecodeCountsFramePairs) {
    auto start = [&](const char* codec, const char* rate, const char* tc, const std::string& extra = "") {
        return loadVideo(codec, 1000, rate, std::string("<StartTimecode>") + tc + "</StartTimecode>" + extra)
            ->__mediaStart();
    };
    auto p60 = start("AVC-I_1080/29.97p", "59.94p", "01:00:00:00");
    ASSERT_TRUE(p60);
    EXPECT_EQ(p60->nativeFramecountWithDropAdjust(false, true), 2 * 108000);
    EXPECT_EQ(p60->framerate(), 60);
    EXPECT_FALSE(p60->useInterpRate());
    auto p30 = start("AVC-I_1080/29.97p", "29.97p", "01:00:00:10");
    EXPECT_EQ(p30->nativeFramecountWithDropAdjust(false, true), 108010);
    // Strand 4:2:2 with a drop-frame flag writes the frames separator as ";".
    auto strand = loadVideo("AVC-Strand422", 1000, "59.94i",
                            "<StartTimecode>00:10:00:00</StartTimecode><TimecodeType>DROP</TimecodeType>");
    EXPECT_EQ(strand->mediaStart().string(), "00:10:00;00");
    EXPECT_EQ(loadVideo("AVC-I_1080/59.94i", 1000, "59.94i")->mediaStart(), Value());
}

TEST_F(ClipTest, DurationFallbacksAndBadLengths) {
    // Without a video size the length becomes seconds of edit units.
    auto seconds = load("<Duration>300</Duration><EditUnit>1001/30000</EditUnit><EssenceList><Video>"
                        "<Codec>AVC-I_1080/59.94i</Codec><FrameRate>59.94i</FrameRate></Video><Audio><AudioIndex>"
                        "<DataSize>1000000</DataSize></AudioIndex></Audio></EssenceList>");
    ASSERT_TRUE(seconds);
    EXPECT_NEAR(*seconds->durationNumber(), 300 * 1001.0 / 30000, 1e-9);
    EXPECT_EQ(loadVideo("DV25_411", 120000, "59.94i")->mediaDuration(), Value(10));

    auto withDuration = [&](const std::string& d) {
        std::string xml = video("AVC-I_1080/59.94i", 1000, "59.94i");
        xml.replace(xml.find("<Duration>10</Duration>"), 23, d);
        return load(xml);
    };
    EXPECT_FALSE(withDuration(""));
    EXPECT_FALSE(withDuration("<Duration>0</Duration>"));
    EXPECT_FALSE(withDuration("<Duration>ten</Duration>"));
    EXPECT_FALSE(withDuration("<Duration>1e999</Duration>"));
    EXPECT_FALSE(withDuration("<Duration>0.4</Duration>"));
    // A DV clip with a length that gives no frame size of its codec is unknown.
    std::string dv = video("DV25_411", 120000, "59.94i");
    dv.replace(dv.find("<Duration>10</Duration>"), 23, "<Duration>-10</Duration>");
    EXPECT_FALSE(load(dv));
    dv.replace(dv.find("<Duration>-10</Duration>"), 24, "<Duration>99999999999999999999</Duration>");
    EXPECT_FALSE(load(dv));
    // AVC-Intra detection does not depend on the size, so such clips are made;
    // they must still answer everything without harm.
    EXPECT_EQ(withDuration("<Duration>-10</Duration>")->shootingRate(), 0);
    for (const char* d : {"<Duration>-10</Duration>", "<Duration>1e300</Duration>"}) {
        auto odd = withDuration(d);
        ASSERT_TRUE(odd);
        odd->sourceFormat();
        odd->dataSizeForAudioChannelIndex(3);
        odd->ingestSourceFiles();
    }
}

TEST_F(ClipTest, DateStrings) {
    Ref<SkarnDate> date;
    Ref<SkarnTimeZone> zone;
    EXPECT_EQ(SkarnClip::dateFromDateString(std::string("2012-03-04T05:06:07+09:00"), &date, &zone),
              "2012-03-04 05:06:07 +0900");
    ASSERT_TRUE(date && zone);
    EXPECT_EQ(date->secondsSince1970(), 1330837567 - 9 * 3600);  // 05:06:07 UTC less nine hours
    EXPECT_EQ(zone->secondsFromGMT(), 32400);
    // The minutes are added whatever the sign: -05:30 makes a zone of -16200 s,
    // while the date itself is read at -0530.
    EXPECT_EQ(SkarnClip::dateFromDateString(std::string("2012-03-04T05:06:07-05:30"), &date, &zone),
              "2012-03-04 05:06:07 -0530");
    EXPECT_EQ(zone->secondsFromGMT(), -16200);
    EXPECT_EQ(date->secondsFromGMT(), -19800);
    // Malformed but long enough: the text is still composed, the date is nil.
    EXPECT_EQ(SkarnClip::dateFromDateString(std::string("2012-13-04T05:06:07+09:00"), &date, &zone),
              "2012-13-04 05:06:07 +0900");
    EXPECT_FALSE(date);
    EXPECT_EQ(SkarnClip::dateFromDateString(std::string("2012-03-04"), &date, &zone), std::nullopt);
    EXPECT_FALSE(date);
    EXPECT_FALSE(zone);
    EXPECT_EQ(SkarnClip::dateFromDateString(std::nullopt, nullptr, nullptr), std::nullopt);
}

// ---------------------------------------------------------------------------
// Card metadata

TEST_F(ClipTest, CardMetadataAccessors) {
    auto clip = load(video("DV25_411", 120000, "59.94i", "<StartBinaryGroup>00FF00FF</StartBinaryGroup>",
                           "<ClipMetadata><ShotMark>True</ShotMark><Access><CreationDate>2012-03-04T05:06:07+09:00"
                           "</CreationDate><LastUpdatePerson>Ann</LastUpdatePerson></Access>"
                           "<Scenario><SceneNo.>12</SceneNo.><TakeNo.>3</TakeNo.></Scenario>"
                           "<Shoot><StartDate>2012-03-04T05:06:07-05:30</StartDate></Shoot>"
                           "<MemoList><Memo><Text>A</Text><Person>P</Person></Memo><Memo><Person>Q</Person></Memo>"
                           "<Memo><Text></Text></Memo><Memo><Text>B</Text><Person>R</Person></Memo></MemoList>"
                           "</ClipMetadata>"));
    ASSERT_TRUE(clip);
    EXPECT_TRUE(clip->isGood());
    EXPECT_EQ(clip->corvane_Skarn_shotMark(), "TRUE");
    EXPECT_EQ(clip->corvane_Skarn_memo_text(), "A/ B");
    EXPECT_EQ(clip->corvane_Skarn_memo_person(), "P/ Q/ R");
    EXPECT_EQ(clip->scene(), "12");
    EXPECT_EQ(clip->shot(), "3");
    EXPECT_EQ(clip->corvane_Skarn_lastChangedBy(), "Ann");
    EXPECT_EQ(clip->corvane_Skarn_startBinaryGroup(), "00FF00FF");
    EXPECT_EQ(clip->creationDateString(), "2012-03-04 05:06:07 +0900");
    EXPECT_EQ(clip->creationDateTimeZone()->secondsFromGMT(), 32400);
    EXPECT_EQ(clip->corvane_Skarn_shootingStartDateString(), "2012-03-04 05:06:07 -0530");
    EXPECT_TRUE(clip->corvane_Skarn_shootingStartDate());
    EXPECT_FALSE(clip->corvane_Skarn_shootingEndDate());
    EXPECT_EQ(clip->lastChangeDateString(), std::nullopt);
    EXPECT_EQ(clip->reelName(), std::nullopt);
    // Without MXF files there is no metadata dictionary, but every accessor answers.
    EXPECT_TRUE(clip->metadata().isNull());

    auto firstEmpty = load(video("DV25_411", 120000, "59.94i", "",
                                 "<ClipMetadata><ShotMark>yes</ShotMark><MemoList><Memo><Text/></Memo>"
                                 "<Memo><Text>B</Text></Memo></MemoList></ClipMetadata>"));
    EXPECT_EQ(firstEmpty->corvane_Skarn_memo_text(), "/ B");
    EXPECT_FALSE(firstEmpty->isGood());
    EXPECT_EQ(firstEmpty->corvane_Skarn_memo_person(), std::nullopt);
}

TEST_F(ClipTest, PropertiesByName) {
    auto clip = load(video("DV25_411", 120000, "59.94i", "",
                           "<ClipMetadata><ShotMark>true</ShotMark><Access><CreationDate>2012-03-04T05:06:07+09:00"
                           "</CreationDate></Access></ClipMetadata>"));
    EXPECT_EQ(clip->valueForKey("videoFormat"), Value(1));
    EXPECT_EQ(clip->valueForKey("format"), Value("DV/DVCPRO - NTSC"));
    EXPECT_EQ(clip->valueForKey("isGood"), Value(true));
    EXPECT_EQ(clip->valueForKey("frameRate"), Value(30.0));
    EXPECT_EQ(clip->valueForKey("mediaDuration"), Value(10));
    EXPECT_EQ(clip->valueForKey("corvane_Skarn_shotMark"), Value("TRUE"));
    EXPECT_EQ(clip->valueForKey("creationDate").description(), "2012-03-04 05:06:07 +0900");
    EXPECT_TRUE(clip->valueForKey("corvane_Skarn_reporter").isNull());
    EXPECT_TRUE(clip->valueForKey("noSuchProperty").isNull());
    EXPECT_TRUE(clip->valueForKey("deleteClip").isNull());  // an operation, never run by a lookup
    EXPECT_TRUE(clip->respondsToSelector("deleteClip"));
    EXPECT_TRUE(clip->respondsToSelector("stringFromClipDescriptionForXPath:"));
    EXPECT_TRUE(clip->respondsToSelector("corvane_Skarn_memo_person"));
    EXPECT_FALSE(clip->respondsToSelector("corvane_Skarn_nothing"));
    EXPECT_EQ(clip->stringFromClipDescriptionForXPath("ClipContent/Duration"), "10");
    EXPECT_EQ(clip->stringFromClipDescriptionForXPath("ClipContent/[["), std::nullopt);
    EXPECT_EQ(clip->stringFromClipDescriptionForXPath("ClipContent/Missing"), std::nullopt);
    EXPECT_EQ(clip->stringFromClipDescriptionForXPath("count(//Video)"), std::nullopt);
    EXPECT_EQ(clip->stringFromClipDescriptionForXPath("string(ClipContent/Duration)"), std::nullopt);
}

TEST_F(ClipTest, ExtendedPropertiesAndTransformer) {
    auto clip = loadVideo("DV25_411", 120000, "59.94i");
    Value props = clip->extendedProperties();
    ASSERT_EQ(props.count(), 16u);
    EXPECT_EQ(props[size_t(0)]["identifier"], Value("corvane_Skarn_dataSource"));
    EXPECT_EQ(props[size_t(0)]["name"], Value("Data Source"));
    EXPECT_FALSE(props[size_t(0)].dictionary().contains("formatter"));
    const Value& start = props[size_t(4)];
    EXPECT_EQ(start["identifier"], Value("corvane_Skarn_shootingStartDate"));
    EXPECT_EQ(start["NSLineBreakMode"], Value(4));
    auto formatter = dynamicRefCast<SkarnDateFormatter>(start["formatter"].object());
    ASSERT_TRUE(formatter);
    EXPECT_EQ(formatter->dateStyle(), SkarnDateFormatter::ShortStyle);
    EXPECT_EQ(formatter->stringForObjectValue(Value(SkarnDate::dateFromString("2012-03-04 23:06:07 -0530"))),
              "3/4/12");
    EXPECT_EQ(props[size_t(15)]["name"], Value("Memo Created By"));

    auto t = SkarnStringToBoolValueTransformer::transformer();
    EXPECT_EQ(t->transformedValue(Value("1")), Value(true));
    EXPECT_EQ(t->transformedValue(Value("YES")), Value(true));
    EXPECT_EQ(t->transformedValue(Value("TRUE")), Value(true));
    EXPECT_EQ(t->transformedValue(Value("FALSE")), Value(false));
    EXPECT_EQ(t->transformedValue(Value()), Value(false));
    EXPECT_EQ(t->transformedValue(Value::array({Value(1)})), Value(false));
    EXPECT_FALSE(SkarnStringToBoolValueTransformer::allowsReverseTransformation());
}

TEST_F(ClipTest, MetadataDictionaryJoinsMXFAndCardEntries) {
    ClipSpec c = clipOf("dvcpro50-ntsc", 1, 3);
    c.audioChannels = 2;
    c.metadata.shooter = "Kim";
    c.metadata.userClipName = "Harbour";
    c.metadata.creationDate = "2012-03-04T05:06:07+09:00";
    c.metadata.memos = {{"P", "first"}, {"Q", "second"}};
    auto written = card({c});
    auto clip = SkarnClip::initWithSkarnClip(written[0].clipPath);
    ASSERT_TRUE(clip);
    Value md = clip->metadata();
    ASSERT_TRUE(md.isDictionary());
    EXPECT_EQ(md.dictionary().keys(), (std::vector<std::string>{"movie", "track0", "track1", "track2"}));

    std::vector<std::string> keys;
    for (const Value& e : md["movie"].arrayValue()) keys.push_back(e["reverseDNSName"].string());
    ASSERT_GE(keys.size(), 6u);
    EXPECT_EQ(keys[0], "org.smpte.mxf.identification.applicationsuppliername");
    EXPECT_EQ(md["movie"][size_t(1)]["value"], Value("Skarn Card Writer"));
    auto at = [&](const std::string& k) { return std::find(keys.begin(), keys.end(), k) - keys.begin(); };
    const std::string card = "com.corvane.professionalplugin.skarn.";
    // Identification, then the material package, then the card map in its order.
    EXPECT_LT(at("org.smpte.mxf.identification.generationid"), at("org.smpte.mxf.package.material.packageid"));
    EXPECT_LT(at("org.smpte.mxf.package.material.packageid"), at(card + "essencelist.video.startbinarygroup"));
    EXPECT_LT(at(card + "clipmetadata.userclipname"), at(card + "clipmetadata.memo.person"));
    EXPECT_LT(at(card + "clipmetadata.shoot.shooter"), at(card + "clipmetadata.access.creationdate"));
    EXPECT_EQ(size_t(at(card + "clipmetadata.datasource")), keys.size());  // nil values are left out
    EXPECT_EQ(md["movie"][size_t(at(card + "clipmetadata.memo.text"))]["value"], Value("first/ second"));
    EXPECT_EQ(md["movie"][size_t(at(card + "clipmetadata.access.creationdate"))]["value"],
              Value("2012-03-04 05:06:07 +0900"));
    EXPECT_EQ(md["track1"][size_t(0)]["reverseDNSName"].string().rfind("org.smpte.mxf.package.source.", 0), 0u);
}

TEST(SkarnUtilities, UnpackageMetadataDictionary) {
    EXPECT_TRUE(SkarnUtilities_unpackageMetadataDictionary(Value()).isNull());
    EXPECT_EQ(SkarnUtilities_unpackageMetadataDictionary(Value(Dictionary{})).count(), 0u);
    Value out = SkarnUtilities_unpackageMetadataDictionary(Value(Dictionary{{"b", Value(1)}, {"a", Value("x")}}));
    ASSERT_EQ(out.count(), 2u);
    EXPECT_EQ(out[size_t(0)], Value(Dictionary{{"reverseDNSName", Value("b")}, {"value", Value(1)}}));
    EXPECT_EQ(out[size_t(1)]["reverseDNSName"], Value("a"));
}

// ---------------------------------------------------------------------------
// Every family the card writer knows, through the clip's eyes

TEST_F(ClipTest, EveryCardFamilyIsReadAsItsFormat) {
    std::vector<ClipSpec> clips;
    unsigned i = 1;
    for (const CardFamily& f : cardFamilies())
        if (!f.avclip) clips.push_back(clipOf(f.name.c_str(), i++, 3));
    auto written = card(clips);
    ASSERT_EQ(written.size(), clips.size());
    for (size_t k = 0; k < written.size(); ++k) {
        SCOPED_TRACE(written[k].family);
        auto clip = SkarnClip::initWithSkarnClip(written[k].clipPath);
        ASSERT_TRUE(clip);
        EXPECT_EQ(clip->videoFormat(), clips[k].family->videoFormat);
        EXPECT_NE(clip->sourceFormat(), 0u);
        EXPECT_TRUE(clip->displayFormat());
        EXPECT_EQ(clip->videoHeight(), clips[k].family->activeLines);
        EXPECT_EQ(clip->numberOfAudioChannels(), clips[k].audioChannels);
        EXPECT_EQ(clip->audioFilePaths()->size(), clips[k].audioChannels);
        EXPECT_TRUE(clip->__mediaStart());
        EXPECT_TRUE(clip->metadata().isDictionary());
    }
}

// ---------------------------------------------------------------------------
// Self-contained clips

TEST_F(ClipTest, SelfContainedClipsUseCompanionOrHeaderXML) {
    auto written = card({clipOf("avclip-intra", 1, 3), clipOf("avclip-strand422", 2, 3)});
    ASSERT_EQ(written.size(), 2u);
    auto header = SkarnClip::initWithSkarnClip(written[0].clipPath);
    ASSERT_TRUE(header);
    EXPECT_TRUE(header->isMXFOp1bFormat());
    EXPECT_EQ(header->videoFormat(), 26);
    EXPECT_EQ(header->numberOfAudioChannels(), 4u);
    EXPECT_EQ(header->audioFilePaths(), std::vector<std::string>{written[0].clipPath});
    EXPECT_EQ(header->videoFilePath(), written[0].clipPath);
    EXPECT_EQ(header->clipURLs().front(), written[0].clipPath);
    EXPECT_TRUE(header->metadata().isDictionary());

    auto companion = SkarnClip::initWithSkarnClip(written[1].clipPath);
    ASSERT_TRUE(companion);
    EXPECT_EQ(companion->videoFormat(), 5);  // from CLIP/A002.XML
    EXPECT_EQ(companion->clipURLs().front(), dir / "VOL/CONTENTS/CLIP/A002.XML");

    // A companion that is there but broken sinks the clip, header XML or not.
    writeTextFile(dir / "VOL/CONTENTS/CLIP/A002.XML", "<SkarnClip><ClipContent>");
    EXPECT_FALSE(SkarnClip::initWithSkarnClip(written[1].clipPath));
    EXPECT_FALSE(SkarnClip::initWithSkarnClip(dir / "VOL/CONTENTS/AVCLIP/NONE.MXF"));
}

// ---------------------------------------------------------------------------
// Files, spanning and deletion

TEST_F(ClipTest, FileSetAndSpanning) {
    ClipSpec c = clipOf("dvcpro50-ntsc", 1, 3);
    c.audioChannels = 4;
    c.voice = true;
    c.proxy = true;
    c.spanTop = "TOP";
    c.spanNext = "NEXT";
    auto written = card({c});
    std::string contents = dir / "VOL/CONTENTS";
    std::remove((contents + "/AUDIO/A00102.MXF").c_str());
    std::remove((contents + "/AUDIO/A00103.MXF").c_str());
    auto clip = SkarnClip::initWithSkarnClip(written[0].clipPath);
    ASSERT_TRUE(clip);
    EXPECT_EQ(clip->audioFilePaths(),
              (std::vector<std::string>{contents + "/AUDIO/A00100.MXF", contents + "/AUDIO/A00101.MXF"}));
    EXPECT_EQ(clip->proxyFilePath(), std::nullopt);  // only the side file was written
    EXPECT_EQ(clip->proxyBinFilePath(), contents + "/PROXY/A001.BIN");
    EXPECT_EQ(clip->clipURLs(),
              (std::vector<std::string>{written[0].clipPath, contents + "/VIDEO/A001.MXF", contents + "/VOICE/A001.WAV",
                                        contents + "/ICON/A001.BMP", contents + "/PROXY/A001.BIN",
                                        contents + "/AUDIO/A00100.MXF", contents + "/AUDIO/A00101.MXF"}));
    // A count beyond what the folder could hold finds the same files.
    auto bytes = *FileSystem::readFile(written[0].clipPath);
    std::string xml(bytes.begin(), bytes.end());
    xml.insert(xml.find("<Audio>") + 7, "<Channel>5000</Channel>");
    writeTextFile(written[0].clipPath, xml);
    EXPECT_EQ(SkarnClip::initWithSkarnClip(written[0].clipPath)->audioFilePaths(), clip->audioFilePaths());
    Value sources = clip->ingestSourceFiles();
    ASSERT_EQ(sources.count(), 1u);
    EXPECT_EQ(sources[size_t(0)].count(), 3u);
    EXPECT_EQ(sources[size_t(0)][size_t(0)]["MediaSetPath"], Value(contents + "/VIDEO/A001.MXF"));
    EXPECT_EQ(clip->spannedClipID(), "TOP");
    EXPECT_EQ(clip->nextClipIDInSpannedClip(), "NEXT");
    EXPECT_EQ(clip->previousClipIDInSpannedClip(), std::nullopt);
    EXPECT_EQ(clip->ingestObjectRefCon(), clip.get());
    EXPECT_FALSE(clip->useBuiltInFormatReader());
    EXPECT_FALSE(clip->previewMovie());
    ASSERT_TRUE(clip->posterFrame());
    EXPECT_EQ(clip->posterFrame()->path(), contents + "/ICON/A001.BMP");
}

TEST_F(ClipTest, LowerCaseCardsResolveEveryFile) {
    CardSpec params;
    params.root = dir / "lc";
    params.lowerCaseFolders = true;
    params.clips = {clipOf("dv-ntsc", 1, 3)};
    std::vector<WrittenClip> written;
    ASSERT_TRUE(writeCard(params, &written));
    auto clip = SkarnClip::initWithSkarnClip(written[0].clipPath);
    ASSERT_TRUE(clip);
    EXPECT_TRUE(clip->videoFilePath());
    EXPECT_EQ(clip->audioFilePaths()->size(), 2u);
    EXPECT_TRUE(clip->iconFilePath());
}

TEST_F(ClipTest, DeletionRemovesTheClipAndNothingElse) {
    ClipSpec a = clipOf("dv-ntsc", 1, 3);
    a.proxy = true;
    ClipSpec b = clipOf("dv-ntsc", 2, 3);
    b.voice = true;
    auto written = card({a, b});
    std::string contents = dir / "VOL/CONTENTS";
    auto clip = SkarnClip::initWithSkarnClip(written[0].clipPath);
    ASSERT_TRUE(clip);
    EXPECT_TRUE(clip->isDeletable());  // no voice memo: still deletable
    EXPECT_TRUE(clip->deleteClip());
    for (const std::string& f : written[0].files) {
        bool proxy = f.find("/PROXY/") != std::string::npos;
        EXPECT_EQ(FileSystem::fileExists(f), proxy) << f;
    }
    for (const std::string& f : written[1].files) EXPECT_TRUE(FileSystem::fileExists(f)) << f;
}

TEST_F(ClipTest, LockedFilesInDeletion) {
    auto written = card({clipOf("dv-ntsc", 1, 3), clipOf("dv-ntsc", 2, 3)});
    std::string audio = dir / "VOL/CONTENTS/AUDIO";
    if (!immutableFlagSupported(audio)) GTEST_SKIP() << "no immutable flag here";
    // The clip's own locked files are unlocked and removed.
    ASSERT_TRUE(FileSystem::setImmutable(audio + "/A00100.MXF", true));
    ASSERT_TRUE(FileSystem::setImmutable(written[0].clipPath, true));
    auto first = SkarnClip::initWithSkarnClip(written[0].clipPath);
    ASSERT_TRUE(first);
    EXPECT_TRUE(first->isDeletable());
    EXPECT_TRUE(first->deleteClip());
    EXPECT_FALSE(FileSystem::fileExists(audio + "/A00100.MXF"));
    EXPECT_FALSE(FileSystem::fileExists(written[0].clipPath));

    // A locked file of another clip in AUDIO blocks the deletion entirely.
    writeTextFile(audio + "/B00100.MXF", "other");
    ASSERT_TRUE(FileSystem::setImmutable(audio + "/B00100.MXF", true));
    auto second = SkarnClip::initWithSkarnClip(written[1].clipPath);
    ASSERT_TRUE(second);
    EXPECT_FALSE(second->isDeletable());
    EXPECT_FALSE(second->deleteClip());
    for (const std::string& f : written[1].files) EXPECT_TRUE(FileSystem::fileExists(f)) << f;
    FileSystem::setImmutable(audio + "/B00100.MXF", false);
}

// ---------------------------------------------------------------------------
// Bad input

TEST_F(ClipTest, BadDocumentsAndPaths) {
    EXPECT_FALSE(SkarnClip::initWithSkarnClip(std::nullopt));
    EXPECT_FALSE(SkarnClip::initWithSkarnClip(dir / "nothing.XML"));
    writeTextFile(dir / "clip.txt", document(video("DV25_411", 120000, "59.94i")));
    EXPECT_FALSE(SkarnClip::initWithSkarnClip(dir / "clip.txt"));
    // The suffix test is exact: only XML and xml.
    writeTextFile(dir / "clip.Xml", document(video("DV25_411", 120000, "59.94i")));
    EXPECT_FALSE(SkarnClip::initWithSkarnClip(dir / "clip.Xml"));
    writeTextFile(dir / "broken.XML", "<SkarnClip><ClipContent><Duration>10</Duration>");
    EXPECT_FALSE(SkarnClip::initWithSkarnClip(dir / "broken.XML"));
    // No EssenceList codec at all is the header XML rule: AVC-Intra 1080i60,
    // here without a rate or a timecode.
    auto bare = load("<Duration>10</Duration>");
    ASSERT_TRUE(bare);
    EXPECT_EQ(bare->videoFormat(), 26);
    EXPECT_EQ(bare->frameRate(), 0);
    EXPECT_FALSE(bare->__mediaStart());
    EXPECT_FALSE(load(""));
    // An MXF file too short to carry anything.
    makeDirs(dir / "V/CONTENTS/AVCLIP");
    writeBytes(dir / "V/CONTENTS/AVCLIP/X.MXF", {0x06, 0x0e, 0x2b, 0x34});
    EXPECT_FALSE(SkarnClip::initWithSkarnClip(dir / "V/CONTENTS/AVCLIP/X.MXF"));

    // Numbers that are not numbers answer 0.
    auto clip = load(video("AVC-I_1080/59.94i", 1000, "59.94i", "<Codec Class=\"x\"/>",
                           "<EssenceList><Audio><SamplingRate>fast</SamplingRate><Channel>two</Channel></Audio>"
                           "</EssenceList>"));
    ASSERT_TRUE(clip);
    EXPECT_EQ(clip->sampleRate(), 0);
    EXPECT_EQ(clip->numberOfAudioChannels(), 0u);
    EXPECT_EQ(clip->audioFilePaths(), std::nullopt);
    EXPECT_EQ(clip->dataSizeForAudioChannelIndex(0), 0);
}

TEST_F(ClipTest, HostileChannelCountsStayBounded) {
    // Without a DataSize the video size is the file's less every channel's
    // audio; billions of claimed channels must not mean billions of steps.
    auto clip = load("<Duration>1000</Duration><EditUnit>1/25</EditUnit><EssenceList><Video><Codec>AVC-I_1080/50i"
                     "</Codec><FrameRate>50i</FrameRate></Video><Audio><Channel>2000000000</Channel>"
                     "<SamplingRate>48000</SamplingRate><BitsPerSample>16</BitsPerSample></Audio></EssenceList>");
    ASSERT_TRUE(clip);
    EXPECT_EQ(clip->numberOfAudioChannels(), 2000000000u);
    EXPECT_LT(clip->videoDataSize(), 0);
    EXPECT_EQ(clip->audioFilePaths()->size(), 0u);
}
