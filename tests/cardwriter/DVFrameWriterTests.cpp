// DV frames from the card writer: DIF structure, packs, cadences, what each
// family declares and how a DV decoder reads it, essence files.
#include "CardWriter.h"
#include "DVFrameData.h"
#include "DVFrameWriter.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <iterator>
#include <map>
#include <sstream>
#include <stdexcept>

namespace {

DVStreamSpec params(DVFamily family, DVCadence cadence = DVCadence::None, unsigned phase = 0, uint64_t start = 0) {
    DVStreamSpec s;
    s.family = family;
    s.cadence = cadence;
    s.cadencePhase = phase;
    s.startTimecodeFrames = start;
    return s;
}

const DVFamily kFamilies[] = {DVFamily::DV25_411_525, DVFamily::DV25_420_625,   DVFamily::DVCPRO_411_625,
                              DVFamily::DV50_525,     DVFamily::DV50_625,       DVFamily::DV100_720_5994,
                              DVFamily::DV100_720_50, DVFamily::DV100_1080_5994, DVFamily::DV100_1080_50};

int32_t decodedTotal(std::vector<uint8_t>& frame, int32_t rate, uint8_t df = 0, uint32_t seq = 1) {
    int32_t total = -1;
    DVExtractTimeCodeFromFrame(frame, seq, df, rate, nullptr, &total, nullptr, nullptr, nullptr, nullptr, nullptr);
    return total;
}

std::vector<uint8_t> readFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

bool haveFFmpeg() { return runCommand("ffmpeg -hide_banner -version >/dev/null 2>&1") == 0; }
bool haveFFprobe() { return runCommand("command -v ffprobe >/dev/null 2>&1") == 0; }

// What a family's frames must declare (header APT, the video source pack's STYPE,
// 16:9 in the source-control pack) and the picture a DV decoder must then make.
struct Declared {
    DVFamily family;
    const char* card;  // card family name
    uint8_t apt, stype;
    bool wide;
    int width, height;
    const char* pixFmt;
};

const Declared kDeclared[] = {
    {DVFamily::DV25_411_525, "dv-ntsc", 1, 0x00, false, 720, 480, "yuv411p"},
    {DVFamily::DV25_420_625, "dv-pal", 0, 0x00, false, 720, 576, "yuv420p"},
    {DVFamily::DVCPRO_411_625, "dvcpro-pal", 1, 0x00, false, 720, 576, "yuv411p"},
    {DVFamily::DV50_525, "dvcpro50-ntsc", 1, 0x04, true, 720, 480, "yuv422p"},
    {DVFamily::DV50_625, "dvcpro50-pal", 1, 0x04, false, 720, 576, "yuv422p"},
    {DVFamily::DV100_720_5994, "dvcprohd-720p60", 1, 0x18, true, 960, 720, "yuv422p"},
    {DVFamily::DV100_720_50, "dvcprohd-720p50", 1, 0x18, true, 960, 720, "yuv422p"},
    {DVFamily::DV100_1080_5994, "dvcprohd-1080i60", 1, 0x14, true, 1280, 1080, "yuv422p"},
    {DVFamily::DV100_1080_50, "dvcprohd-1080i50", 1, 0x14, true, 1440, 1080, "yuv422p"},
};

// ffprobe's key=value lines for the first video stream.
std::map<std::string, std::string> probeVideo(const std::string& file) {
    std::string out;
    runCommand("ffprobe -v error -select_streams v:0 -show_entries stream=width,height,pix_fmt,display_aspect_ratio "
               "-of default=nw=1 '" + file + "' 2>&1", &out);
    std::map<std::string, std::string> fields;
    std::istringstream lines(out);
    for (std::string line; std::getline(lines, line);) {
        size_t eq = line.find('=');
        if (eq != std::string::npos) fields[line.substr(0, eq)] = line.substr(eq + 1);
    }
    return fields;
}

}  // namespace

TEST(DVFrameWriter, DIFStructureOfEveryFamily) {
    for (DVFamily family : kFamilies) {
        DVFrameWriter writer(params(family));
        std::vector<uint8_t> frame = writer.frame(7);
        ASSERT_EQ(writer.frameSize(), frame.size());
        ASSERT_EQ(writer.sequenceCount() * 12000u, frame.size());
        const unsigned perChannel = writer.sequenceCount() / writer.channelCount();
        const bool fifty = writer.timecodeRate() == 25 || writer.timecodeRate() == 50;
        EXPECT_EQ(fifty ? 12u : 10u, perChannel);
        for (unsigned s = 0; s < writer.sequenceCount(); ++s) {
            unsigned videoBlocks = 0, audioBlocks = 0;
            for (unsigned b = 0; b < 150; ++b) {
                const uint8_t* id = frame.data() + s * 12000 + b * 80;
                const unsigned section = id[0] >> 5;
                const unsigned expected = b == 0 ? 0 : b < 3 ? 1 : b < 6 ? 2 : (b - 6) % 16 == 0 ? 3 : 4;
                ASSERT_EQ(expected, section) << "family " << int(family) << " seq " << s << " block " << b;
                EXPECT_EQ(s % perChannel, unsigned(id[1] >> 4));
                unsigned dbn = section == 3 ? audioBlocks++ : section == 4 ? videoBlocks++ : b < 3 ? b - 1 : b - 3;
                if (b > 0) {
                    EXPECT_EQ(dbn, id[2]);
                }
            }
            // Channels of DVCPRO HD 1080 are told apart by FSC and FSP.
            if (writer.channelCount() == 4) {
                EXPECT_EQ(int32_t(s / perChannel), DVBlockPairState(frame[s * 12000 + 3 * 80 + 1]));
            }
            EXPECT_EQ(fifty, (frame[s * 12000 + 3] & 0x80) != 0);  // DSF
        }
        OwnedRecord source, audio;
        const int32_t type = family == DVFamily::DV100_720_5994 ? 8 : fifty ? 3 : 2;
        ASSERT_EQ(0, DVCUExtractDataElementFromFrame(type, 0, frame, kDVElementSource, &source, 0));
        auto vs = DVCURecordRead<DVSourceRecord>(source.bytes());
        EXPECT_EQ(fifty, vs.fiftyHz == 1);
        ASSERT_EQ(0, DVCUExtractDataElementFromFrame(type, 0, frame, kDVElementAudioSource, &audio, 0));
        auto as = DVCURecordRead<DVAudioSourceRecord>(audio.bytes());
        EXPECT_GT(as.count, 0);
        EXPECT_EQ(0, as.samplingFrequency);  // 48 kHz
        EXPECT_EQ(0, as.quantization);       // 16-bit
    }
}

TEST(DVFrameWriter, EveryFamilyDeclaresItselfInEverySequence) {
    for (const Declared& d : kDeclared) {
        SCOPED_TRACE(d.card);
        DVFrameWriter writer(params(d.family));
        const std::vector<uint8_t> frame = writer.frame(1);
        const unsigned perChannel = writer.sequenceCount() / writer.channelCount();
        const bool fifty = perChannel == 12;
        for (unsigned s = 0; s < writer.sequenceCount(); ++s) {
            const uint8_t* seq = frame.data() + s * 12000;
            EXPECT_EQ(fifty, (seq[3] & 0x80) != 0);  // DSF
            EXPECT_EQ(d.apt, seq[4] & 0x07);
            for (int i = 5; i < 8; ++i) EXPECT_EQ(0x78 | d.apt, seq[i]);  // TF1-3 valid, AP1-3 as APT
            // Source and source-control packs: packs 39-40 of even sequences, 0-1 of odd ones.
            const uint8_t* vs = seq + (s % perChannel % 2 == 0 ? 5 * 80 + 3 + 45 : 3 * 80 + 3);
            ASSERT_EQ(0x60, vs[0]) << "sequence " << s;
            EXPECT_EQ(d.stype, vs[3] & 0x1F);
            EXPECT_EQ(fifty, (vs[3] & 0x20) != 0);
            ASSERT_EQ(0x61, vs[5]);
            EXPECT_EQ(d.wide ? 2 : 0, vs[7] & 0x07);  // DISP
        }
    }
}

TEST(DVFrameWriter, EveryFamilyDecodesAsItsRasterToTheFlatPicture) {
    if (!haveFFmpeg() || !haveFFprobe()) GTEST_SKIP() << "ffmpeg or ffprobe not installed";
    TempDir dir;
    for (const Declared& d : kDeclared) {
        SCOPED_TRACE(d.card);
        CardSpec card;
        card.root = dir / d.card;
        ClipSpec clip = defaultClip(*cardFamilyNamed(d.card), 1);
        clip.frames = 3;
        clip.audioChannels = 1;
        card.clips.push_back(clip);
        std::vector<WrittenClip> written;
        ASSERT_TRUE(writeCard(card, &written));
        auto video = std::find_if(written[0].files.begin(), written[0].files.end(),
                                  [](const std::string& f) { return f.find("/VIDEO/") != std::string::npos; });
        ASSERT_NE(video, written[0].files.end());

        auto probed = probeVideo(*video);
        EXPECT_EQ(std::to_string(d.width), probed["width"]);
        EXPECT_EQ(std::to_string(d.height), probed["height"]);
        EXPECT_EQ(d.pixFmt, probed["pix_fmt"]);
        EXPECT_EQ(d.wide ? "16:9" : "4:3", probed["display_aspect_ratio"]);

        const std::string raw = dir / (std::string(d.card) + ".yuv");
        std::string log;
        EXPECT_EQ(0, runCommand("ffmpeg -nostdin -v error -xerror -i '" + *video + "' -map 0:v -f rawvideo -pix_fmt " +
                                    d.pixFmt + " '" + raw + "' 2>&1", &log));
        EXPECT_EQ("", log);
        const std::vector<uint8_t> pictures = readFile(raw);
        const size_t luma = size_t(d.width) * size_t(d.height);
        const size_t chroma = std::string(d.pixFmt) == "yuv422p" ? luma / 2 : luma / 4;
        const size_t frameBytes = luma + 2 * chroma;
        ASSERT_EQ(3 * frameBytes, pictures.size());
        for (size_t f = 0; f < 3; ++f) {
            auto plane = [&](size_t offset, size_t size, uint8_t level) {
                auto begin = pictures.begin() + ptrdiff_t(f * frameBytes + offset);
                return size_t(std::count(begin, begin + ptrdiff_t(size), level)) == size;
            };
            EXPECT_TRUE(plane(0, luma, DVFrameWriter::kPictureY)) << "frame " << f;
            EXPECT_TRUE(plane(luma, chroma, DVFrameWriter::kPictureCb)) << "frame " << f;
            EXPECT_TRUE(plane(luma + chroma, chroma, DVFrameWriter::kPictureCr)) << "frame " << f;
        }
    }
}

TEST(DVFrameWriter, TimecodeReadsBackInEverySequence) {
    DVFrameWriter dv25(params(DVFamily::DV25_411_525, DVCadence::None, 0, 2591990));  // 23:59:59:20
    for (uint64_t i : {0u, 9u}) {
        auto frame = dv25.frame(i);
        for (uint32_t seq = 1; seq <= 10; ++seq) EXPECT_EQ(int32_t(2591990 + i), decodedTotal(frame, 30, 0, seq));
    }
    auto wrapped = dv25.frame(10);  // midnight: back to 00:00:00:00
    EXPECT_EQ(0, decodedTotal(wrapped, 30));

    DVFrameWriter pal(params(DVFamily::DV100_1080_50, DVCadence::None, 0, 90000));
    auto palFrame = pal.frame(3);
    EXPECT_EQ(90003, decodedTotal(palFrame, 25, 0, 48));
}

TEST(DVFrameWriter, DropFrameTimecodeAcrossTheTenthMinute) {
    DVStreamSpec s = params(DVFamily::DV50_525, DVCadence::None, 0, 17980);
    s.dropFrame = true;
    DVFrameWriter writer(s);
    for (uint64_t i = 0; i < 5; ++i) {
        auto frame = writer.frame(i);
        EXPECT_EQ(int32_t(17980 + i), decodedTotal(frame, 30, 1));
    }
    auto frame = writer.frame(2);  // 17982 shows as 00:10:00;00
    int32_t h = -1, m = -1, sec = -1, f = -1;
    uint8_t df = 0;
    DVExtractTimeCodeFromFrame(frame, 1, 1, 30, nullptr, nullptr, &h, &m, &sec, &f, &df);
    EXPECT_EQ(10, m);
    EXPECT_EQ(0, sec);
    EXPECT_EQ(0, f);
    EXPECT_EQ(1, df);
    auto next = writer.frame(1802);  // count 19782 shows as 00:11:00;02: frames 0 and 1 skipped
    DVExtractTimeCodeFromFrame(next, 1, 1, 30, nullptr, nullptr, &h, &m, &sec, &f, &df);
    EXPECT_EQ(11, m);
    EXPECT_EQ(2, f);
}

TEST(DVFrameWriter, SeventyTwentyTimecodeCountsPairsWithTheFSPBit) {
    for (uint64_t start : {0u, 1u, 215999u}) {
        DVFrameWriter writer(params(DVFamily::DV100_720_5994, DVCadence::None, 0, start));
        for (uint64_t i = 0; i < 4; ++i) {
            auto frame = writer.frame(i);
            EXPECT_EQ(int32_t((start + i) % 5184000), decodedTotal(frame, 60)) << start << "+" << i;
            EXPECT_EQ(int32_t((start + i) % 5184000), decodedTotal(frame, 60, 0, 20));
        }
    }
}

TEST(DVFrameWriter, ShootingRatePackCarriesTheTwentyFourInThirtyCadence) {
    for (unsigned phase = 0; phase < 5; ++phase) {
        DVFrameWriter writer(params(DVFamily::DV25_411_525, DVCadence::TwentyFourInThirty, phase));
        for (uint64_t i = 0; i < 6; ++i) {
            auto frame = writer.frame(i);
            int32_t rate = -1, mode = -1, flags = -1;
            DVExtractShootingRateFromFrame(frame, 10, 0, 30, nullptr, &rate, &mode, &flags);
            EXPECT_EQ(24, rate);
            EXPECT_EQ(int32_t((phase + i) % 5), mode);
            EXPECT_EQ(kDVShootingRateFlagFrames | kDVShootingRateFlag23, flags);
            EXPECT_EQ(mode == 2, writer.isRepeatFrame(i));
        }
    }
    // No cadence and no rate asked for: no pack.
    DVFrameWriter plain(params(DVFamily::DV25_411_525));
    auto frame = plain.frame(0);
    int32_t rate = -1;
    DVExtractShootingRateFromFrame(frame, 10, 0, 30, nullptr, &rate, nullptr, nullptr);
    EXPECT_EQ(-1, rate);
    DVStreamSpec explicitRate = params(DVFamily::DV100_1080_5994);
    explicitRate.shootingRate = 30;
    auto f30 = DVFrameWriter(explicitRate).frame(0);
    DVExtractShootingRateFromFrame(f30, 1, 0, 30, nullptr, &rate, nullptr, nullptr);
    EXPECT_EQ(30, rate);
}

TEST(DVFrameWriter, VariableFrameRatePackMarksNewPictures) {
    for (DVCadence cadence : {DVCadence::TwentyFourInSixty, DVCadence::HalfRate}) {
        for (uint64_t start : {0u, 1u}) {
            DVFrameWriter writer(params(DVFamily::DV100_720_5994, cadence, 1, start));
            for (uint64_t i = 0; i < 10; ++i) {
                auto frame = writer.frame(i);
                int32_t rate = -1, flags = -1;
                DVExtractVFRInfoFromFrame(frame, 1, 0, 60, nullptr, &rate, nullptr, nullptr, &flags);
                EXPECT_EQ(cadence == DVCadence::HalfRate ? 30 : 24, rate);
                EXPECT_TRUE(flags & kDVVFRFlagVariable);
                EXPECT_EQ(!writer.isRepeatFrame(i), (flags & kDVVFRFlagKeep) != 0) << i;
                EXPECT_EQ((start + i) % 2 == 1, (flags & kDVVFRFlagFirstOfPair) != 0);
            }
        }
    }
    // An ordinary 720p stream: binary groups without frame-rate data mark every frame new.
    auto frame = DVFrameWriter(params(DVFamily::DV100_720_50)).frame(0);
    OwnedRecord rec;
    ASSERT_EQ(0, DVCUExtractDataElementFromFrame(9, 0, frame, kDVElementVFR, &rec, 0));
    EXPECT_TRUE(DVCURecordRead<DVVFRRecord>(rec.bytes()).flags & kDVVFRFlagKeep);
}

TEST(DVFrameWriter, RejectsCadencesTheFamilyCannotCarry) {
    EXPECT_THROW(DVFrameWriter(params(DVFamily::DV25_420_625, DVCadence::TwentyFourInThirty)), std::invalid_argument);
    EXPECT_THROW(DVFrameWriter(params(DVFamily::DV100_720_50, DVCadence::TwentyFourInSixty)), std::invalid_argument);
    EXPECT_THROW(DVFrameWriter(params(DVFamily::DV50_525, DVCadence::HalfRate)), std::invalid_argument);
    EXPECT_THROW(DVFrameWriter(params(DVFamily::DV25_411_525, DVCadence::TwentyFourInThirty, 5)), std::invalid_argument);
    EXPECT_THROW(DVFrameWriter(params(DVFamily::DV100_720_50, DVCadence::HalfRate, 2)), std::invalid_argument);
    DVStreamSpec missing = params(DVFamily::DV25_411_525);
    missing.essenceFile = "/nonexistent/x.dv";
    EXPECT_THROW(DVFrameWriter{missing}, std::runtime_error);
}

namespace {

// Makes a raw DV file with ffmpeg; empty string when ffmpeg fails.
std::string ffmpegDV(const TempDir& dir, const std::string& name, const std::string& size, const std::string& rate,
                     const std::string& pixfmt, int frames) {
    std::string path = dir / name;
    std::string cmd = "ffmpeg -nostdin -v error -y -f lavfi -i testsrc=size=" + size + ":rate=" + rate +
                      " -frames:v " + std::to_string(frames) + " -c:v dvvideo -pix_fmt " + pixfmt + " -f dv '" +
                      path + "' >/dev/null 2>&1";
    return runCommand(cmd) == 0 ? path : std::string();
}

}  // namespace

TEST(DVFrameWriter, EssenceFramesKeepTheirPictureAndStayDecodable) {
    if (!haveFFmpeg()) GTEST_SKIP() << "ffmpeg not installed";
    TempDir dir;
    struct Case {
        DVFamily family;
        DVCadence cadence;
        const char* size;
        const char* rate;
        const char* pixfmt;
        int32_t type;
    } cases[] = {
        {DVFamily::DV25_411_525, DVCadence::TwentyFourInThirty, "720x480", "30000/1001", "yuv411p", 2},
        {DVFamily::DV100_720_5994, DVCadence::TwentyFourInSixty, "960x720", "60000/1001", "yuv422p", 8},
    };
    for (const Case& c : cases) {
        std::string source = ffmpegDV(dir, "src" + std::to_string(int(c.family)) + ".dv", c.size, c.rate, c.pixfmt, 3);
        ASSERT_FALSE(source.empty());
        DVStreamSpec s = params(c.family, c.cadence, 3, 1);
        s.essenceFile = source;
        DVFrameWriter writer(s);
        ASSERT_EQ(3u, writer.essenceFrameCount());
        const std::vector<uint8_t> original = readFile(source);

        std::vector<uint8_t> stream;
        for (uint64_t i = 0; i < 5; ++i) {
            auto frame = writer.frame(i);
            // Picture and sound blocks are the source's, byte for byte after the ID.
            const uint8_t* src = original.data() + (i % 3) * writer.frameSize();
            for (unsigned seq = 0; seq < writer.sequenceCount(); ++seq)
                for (unsigned b = 6; b < 150; ++b) {
                    size_t at = seq * 12000 + b * 80;
                    ASSERT_EQ(0, std::memcmp(frame.data() + at + 2, src + at + 2, 78)) << seq << "/" << b;
                }
            EXPECT_EQ(int32_t(1 + i), decodedTotal(frame, writer.timecodeRate()));
            OwnedRecord rec;
            ASSERT_EQ(0, DVCUExtractDataElementFromFrame(c.type, 0, frame, kDVElementShootingRate, &rec, 0));
            EXPECT_EQ(24, DVCURecordRead<DVShootingRateRecord>(rec.bytes()).rate);
            stream.insert(stream.end(), frame.begin(), frame.end());
        }
        std::string out = dir / "out.dv";
        writeBytes(out, stream);
        std::string log;
        EXPECT_EQ(0, runCommand("ffmpeg -nostdin -v error -f dv -i '" + out + "' -f null - 2>&1", &log));
        EXPECT_EQ("", log) << "family " << int(c.family);
    }

    // A file passes only for the family its frames declare, also where frame
    // sizes and line counts agree: 625 lines for 525, DV50 for 720p, 4:2:0 for
    // 4:1:1.
    struct Mismatch {
        const char *size, *rate, *pixfmt;
        DVFamily family;
        bool fits;
    } files[] = {
        {"720x576", "25", "yuv420p", DVFamily::DV25_411_525, false},
        {"720x480", "30000/1001", "yuv422p", DVFamily::DV100_720_5994, false},
        {"720x480", "30000/1001", "yuv422p", DVFamily::DV50_525, true},
        {"720x576", "25", "yuv420p", DVFamily::DVCPRO_411_625, false},
        {"720x576", "25", "yuv411p", DVFamily::DVCPRO_411_625, true},
        {"720x576", "25", "yuv411p", DVFamily::DV25_420_625, false},
    };
    for (const Mismatch& m : files) {
        DVStreamSpec s = params(m.family);
        s.essenceFile = ffmpegDV(dir, "f.dv", m.size, m.rate, m.pixfmt, 1);
        ASSERT_FALSE(s.essenceFile.empty());
        if (m.fits) {
            EXPECT_NO_THROW(DVFrameWriter{s}) << m.pixfmt << " as " << int(m.family);
        } else {
            EXPECT_THROW(DVFrameWriter{s}, std::runtime_error) << m.pixfmt << " as " << int(m.family);
        }
    }
}
