// skarn ingest as a user runs it: cards written by the card writer become
// movies, which ffprobe and ffmpeg then read back and compare with the
// essence on the card.
#include "CardWriter.h"
#include "DVFrameWriter.h"
#include "FileSystem.h"
#include "H264Synth.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include <algorithm>
#include <map>
#include <regex>
#include <sys/stat.h>

namespace {

using Bytes = std::string;  // binary-safe, as the commands' output comes

std::string skarn() { return buildDir() + "/src/host/skarn"; }
std::string mxfdump() { return buildDir() + "/src/cardwriter/skarn-mxfdump"; }

bool haveFFmpegTools() {
    return runCommand("command -v ffprobe >/dev/null 2>&1 && command -v ffmpeg >/dev/null 2>&1") == 0;
}

std::string shellQuoted(const std::string& s) { return "'" + s + "'"; }

Bytes fileBytes(const std::string& path) {
    auto b = FileSystem::readFile(path);
    return b ? Bytes(b->begin(), b->end()) : Bytes();
}

// Runs skarn; stdout into out, stderr into err.
int runSkarn(const std::string& args, std::string* out = nullptr, std::string* err = nullptr) {
    TempDir scratch;
    std::string errFile = scratch / "stderr";
    int rc = runCommand(skarn() + " " + args + " 2>" + shellQuoted(errFile), out);
    if (err) *err = fileBytes(errFile);
    return rc;
}

nlohmann::json ingestJSON(const std::string& args, int expectedExit = 0) {
    std::string out, err;
    EXPECT_EQ(runSkarn("ingest --json " + args, &out, &err), expectedExit) << args << "\n" << err;
    auto j = nlohmann::json::parse(out, nullptr, false);
    EXPECT_FALSE(j.is_discarded()) << out;
    return j;
}

// A movie as ffprobe and ffmpeg read it back: one run of each.
struct Movie {
    nlohmann::json streams = nlohmann::json::array();
    std::vector<size_t> videoSizes;  // of the first video stream's packets
    Bytes video;                     // their payloads, joined
    std::vector<Bytes> audio;        // each audio stream's samples as stored
    bool decoded = false;            // every stream decodes without an error
    std::string errors;

    nlohmann::json ofType(const std::string& type) const {
        nlohmann::json picked = nlohmann::json::array();
        for (const auto& s : streams)
            if (s.value("codec_type", "") == type) picked.push_back(s);
        return picked;
    }
};

Movie readMovie(const std::string& path) {
    Movie m;
    std::string out;
    runCommand("ffprobe -v error -of json -show_streams -show_entries packet=stream_index,size " + shellQuoted(path),
               &out);
    auto j = nlohmann::json::parse(out, nullptr, false);
    if (j.is_discarded() || !j.contains("streams")) return m;
    m.streams = j["streams"];
    nlohmann::json video = m.ofType("video"), audio = m.ofType("audio");
    if (video.empty()) return m;
    const int videoIndex = video[0]["index"].get<int>();
    for (const auto& p : j["packets"])
        if (p["stream_index"].get<int>() == videoIndex) m.videoSizes.push_back(std::stoul(p["size"].get<std::string>()));

    TempDir dir;
    std::string command = "ffmpeg -v error -xerror -i " + shellQuoted(path) + " -map 0:v:0 -c copy -f data " +
                          shellQuoted(dir / "video");
    for (size_t i = 0; i < audio.size(); ++i)
        command += " -map 0:a:" + std::to_string(i) + " -f " +
                   (audio[i]["codec_name"] == "pcm_s16le" ? "s16le " : "s24le ") + shellQuoted(dir / std::to_string(i));
    command += " -map 0 -f null - 2>&1";
    m.decoded = runCommand(command, &m.errors) == 0 && m.errors.empty();
    m.video = fileBytes(dir / "video");
    for (size_t i = 0; i < audio.size(); ++i) m.audio.push_back(fileBytes(dir / std::to_string(i)));
    return m;
}

// An Annex B access unit (three- or four-byte start codes) with four-byte
// lengths instead, each unit's trailing zero bytes left out.
Bytes lengthPrefixed(const Bytes& au) {
    std::vector<size_t> starts;
    for (size_t i = 0; i + 3 <= au.size(); ++i)
        if (au[i] == 0 && au[i + 1] == 0 && au[i + 2] == 1) starts.push_back(i + 3);
    Bytes out;
    for (size_t k = 0; k < starts.size(); ++k) {
        size_t end = k + 1 < starts.size() ? starts[k + 1] - 3 : au.size();
        while (end > starts[k] && au[end - 1] == 0) --end;
        uint32_t n = uint32_t(end - starts[k]);
        out += char(n >> 24), out += char(n >> 16), out += char(n >> 8), out += char(n);
        out.append(au, starts[k], end - starts[k]);
    }
    return out;
}

// What a clip holds on the card: its frames in the order they are stored
// (decode order) and each channel's samples.
struct Essence {
    std::vector<Bytes> frames;
    std::vector<Bytes> channels;
    int bits = 16;
    bool h264 = false;
};

uint64_t xmlNumber(const std::string& text, const std::string& pattern) {
    std::smatch m;
    if (!std::regex_search(text, m, std::regex(pattern))) return 0;
    return std::stoull(m[1]);
}

Essence essenceOf(const WrittenClip& clip, const CardFamily& family) {
    Essence e;
    e.h264 = !family.dv;
    if (family.avclip) {
        std::string out;
        runCommand(mxfdump() + " --json " + shellQuoted(clip.clipPath), &out);
        auto d = nlohmann::json::parse(out);
        Bytes file = fileBytes(clip.clipPath);
        e.bits = d["audioBytesPerSample"].get<int>() * 8;
        e.channels.resize(d["audioChannels"].get<size_t>());
        for (const auto& chunk : d["chunks"]) {
            for (const auto& f : chunk["frames"])
                e.frames.push_back(file.substr(f["offset"].get<size_t>(), f["size"].get<size_t>()));
            for (const auto& a : chunk["audio"])
                e.channels[a["channel"].get<size_t>()] += file.substr(a["offset"].get<size_t>(), a["size"].get<size_t>());
        }
        return e;
    }
    std::string xml = fileBytes(clip.clipPath);
    const std::string contents = FileSystem::stringByDeletingLastPathComponent(
        FileSystem::stringByDeletingLastPathComponent(clip.clipPath));
    uint64_t offset = xmlNumber(xml, R"(<VideoIndex>\s*<StartByteOffset>(\d+))");
    uint64_t size = xmlNumber(xml, R"(<VideoIndex>\s*<StartByteOffset>\d+</StartByteOffset>\s*<DataSize>(\d+))");
    uint64_t frames = xmlNumber(xml, R"(<Duration>(\d+))");
    if (family.codec.rfind("AVC-I", 0) == 0) offset += 512, size -= 512;  // the AVC-Intra header
    Bytes video = fileBytes(contents + "/VIDEO/" + clip.name + ".MXF");
    for (uint64_t i = 0; i < frames; ++i) e.frames.push_back(video.substr(offset + i * (size / frames), size / frames));
    std::regex audio(R"(<Audio>[\s\S]*?<BitsPerSample>(\d+)[\s\S]*?<StartByteOffset>(\d+)</StartByteOffset>\s*<DataSize>(\d+))");
    int channel = 0;
    for (std::sregex_iterator it(xml.begin(), xml.end(), audio), end; it != end; ++it, ++channel) {
        e.bits = std::stoi((*it)[1]);
        char name[64];
        std::snprintf(name, sizeof name, "/AUDIO/%s%02d.MXF", clip.name.c_str(), channel);
        e.channels.push_back(fileBytes(contents + name).substr(std::stoull((*it)[2]), std::stoull((*it)[3])));
    }
    return e;
}

Bytes expectedPacket(const Essence& e, const Bytes& frame) { return e.h264 ? lengthPrefixed(frame) : frame; }

Bytes joined(const Essence& e, const std::vector<size_t>& indexes, std::vector<size_t>* sizes) {
    Bytes all;
    for (size_t i : indexes) {
        Bytes p = expectedPacket(e, e.frames[i]);
        sizes->push_back(p.size());
        all += p;
    }
    return all;
}

// The movie's video packets are the given frames of the essence, byte for byte.
void expectFrames(const Movie& movie, const Essence& e, const std::vector<size_t>& indexes) {
    std::vector<size_t> sizes;
    Bytes expected = joined(e, indexes, &sizes);
    EXPECT_EQ(movie.videoSizes, sizes);
    EXPECT_TRUE(movie.video == expected) << "video packets differ from the essence";
}

std::vector<size_t> range(size_t from, size_t to) {
    std::vector<size_t> r;
    for (size_t i = from; i < to; ++i) r.push_back(i);
    return r;
}

struct Card {
    TempDir dir;
    CardSpec layout;
    std::vector<WrittenClip> written;
    explicit Card(std::vector<ClipSpec> clips) {
        layout.root = dir / "card";
        layout.clips = std::move(clips);
        std::string error;
        if (!writeCard(layout, &written, &error)) ADD_FAILURE() << error;
    }
    const WrittenClip& clip(const std::string& name) const {
        for (const auto& w : written)
            if (w.name == name) return w;
        throw std::runtime_error("no clip " + name);
    }
};

ClipSpec clipOf(const std::string& family, const std::string& name, uint64_t frames) {
    ClipSpec c = defaultClip(*cardFamilyNamed(family), 1);
    c.name = name;
    c.frames = frames;
    return c;
}

}  // namespace

// ---------------------------------------------------------------------------
// Every family the card writer makes

TEST(SkarnIngest, EveryFamilyBecomesAMovieOfItsEssence) {
    if (!haveFFmpegTools()) GTEST_SKIP() << "ffprobe and ffmpeg are not on PATH";
    std::vector<ClipSpec> clips;
    unsigned index = 1;
    for (const auto& f : cardFamilies()) {
        ClipSpec c = defaultClip(f, index++);
        c.frames = f.avclip ? 24 : 6;
        c.audioChannels = index % 2 ? 2 : 3;
        c.bitsPerSample = index % 3 ? 24 : 16;
        c.startTimecode = "10:00:00:00";
        clips.push_back(c);
    }
    Card card(clips);
    TempDir out;
    nlohmann::json report = ingestJSON(card.layout.root + " -o " + shellQuoted(out / "movies"));
    ASSERT_EQ(report.size(), clips.size());

    for (size_t i = 0; i < clips.size(); ++i) {
        const ClipSpec& c = clips[i];
        const CardFamily& f = *c.family;
        SCOPED_TRACE(c.name + " " + f.name);
        const std::string movie = out / ("movies/" + c.name + ".mov");
        auto r = std::find_if(report.begin(), report.end(), [&](const auto& j) { return j["clip"] == c.name; });
        ASSERT_NE(r, report.end());
        Essence e = essenceOf(card.clip(c.name), f);
        ASSERT_EQ(e.frames.size(), c.frames);

        // The report.
        const bool drop = f.editRateDen == 1001 && f.editRateNum % 30000 == 0;
        EXPECT_EQ((*r)["output"], movie);
        EXPECT_EQ((*r)["frames"], c.frames);
        EXPECT_EQ((*r)["audioChannels"], c.audioChannels);
        EXPECT_EQ((*r)["audioSamples"], e.channels[0].size() / (c.bitsPerSample / 8));
        EXPECT_EQ((*r)["startTimecode"], drop ? "10:00:00;00" : "10:00:00:00");
        EXPECT_EQ((*r)["cadence"], "none");

        // One video stream at the card's rate, its timecode, the card's codec.
        Movie m = readMovie(movie);
        nlohmann::json video = m.ofType("video");
        ASSERT_EQ(video.size(), 1u);
        EXPECT_EQ(video[0]["codec_name"], f.dv ? "dvvideo" : "h264");
        EXPECT_EQ(video[0]["r_frame_rate"],
                  std::to_string(f.editRateNum) + "/" + std::to_string(f.editRateDen));
        EXPECT_EQ(video[0]["tags"]["timecode"], (*r)["startTimecode"]);
        EXPECT_EQ(m.ofType("data").size(), 1u);  // the timecode track

        // Frames as stored, every channel as its own track.
        expectFrames(m, e, range(0, e.frames.size()));
        nlohmann::json audio = m.ofType("audio");
        ASSERT_EQ(audio.size(), c.audioChannels);
        for (size_t ch = 0; ch < c.audioChannels; ++ch) {
            EXPECT_EQ(audio[ch]["channels"], 1);
            EXPECT_EQ(audio[ch]["sample_rate"], "48000");
            EXPECT_TRUE(m.audio[ch] == e.channels[ch]) << "channel " << ch;
        }
        EXPECT_TRUE(m.decoded) << m.errors;
    }
    // Nothing but the movies was left behind.
    auto files = FileSystem::contentsOfDirectory(out / "movies");
    ASSERT_TRUE(files);
    EXPECT_EQ(files->size(), clips.size());
}

TEST(SkarnIngest, ThreeByteStartCodesAndTheTableOfClips) {
    if (!haveFFmpegTools()) GTEST_SKIP() << "ffprobe and ffmpeg are not on PATH";
    // AVC-Intra frames whose start codes are three bytes, as some encoders
    // write them: the samples grow by a byte per unit in the movie.
    TempDir dir;
    const CardFamily& f = *cardFamilyNamed("avci-1080p30");
    Bytes frames;
    for (uint32_t i = 0; i < 3; ++i) {
        H264SynthParams p;
        p.idrPicID = i;
        std::vector<uint8_t> au = makeH264AccessUnit(p, f.frameBytes);
        Bytes b(au.begin(), au.end()), shorter;
        for (size_t k = 0; k < b.size(); ++k)
            if (!(k + 3 < b.size() && b.compare(k, 4, Bytes("\0\0\0\1", 4)) == 0)) shorter += b[k];
        shorter.resize(f.frameBytes, '\0');
        frames += shorter;
    }
    writeBytes(dir / "three.h264", std::vector<uint8_t>(frames.begin(), frames.end()));
    ClipSpec c = clipOf("avci-1080p30", "T001", 3);
    c.essenceFile = dir / "three.h264";
    Card card({c});
    std::string out, err;
    ASSERT_EQ(runSkarn("ingest " + card.layout.root + ":T001 -o " + shellQuoted(dir / "t.mov"), &out, &err), 0) << err;
    // Without --json: a table with a row for the clip.
    EXPECT_NE(out.find("FRAMES"), std::string::npos);
    EXPECT_NE(out.find("T001"), std::string::npos);
    EXPECT_NE(out.find("30000/1001"), std::string::npos);
    Essence e = essenceOf(card.clip("T001"), f);
    Movie m = readMovie(dir / "t.mov");
    expectFrames(m, e, range(0, 3));
    EXPECT_TRUE(m.decoded) << m.errors;
}

// ---------------------------------------------------------------------------
// Removed cadences

TEST(SkarnIngest, RemovedCadenceKeepsTheUnmarkedFramesAt24p) {
    if (!haveFFmpegTools()) GTEST_SKIP() << "ffprobe and ffmpeg are not on PATH";
    struct Case {
        std::string family;
        DVCadence cadence;
        unsigned phase;
    };
    const std::vector<Case> cases = {{"dv-ntsc", DVCadence::TwentyFourInThirty, 2},
                                     {"dvcpro50-ntsc", DVCadence::TwentyFourInThirty, 0},
                                     {"dvcprohd-720p60", DVCadence::TwentyFourInSixty, 0},
                                     {"dvcprohd-720p60", DVCadence::TwentyFourInSixty, 3}};
    std::vector<ClipSpec> clips;
    for (size_t i = 0; i < cases.size(); ++i) {
        ClipSpec c = clipOf(cases[i].family, "P00" + std::to_string(i + 1), 30);
        DVStreamSpec dv;
        dv.cadence = cases[i].cadence;
        dv.cadencePhase = cases[i].phase;
        dv.shootingRate = 24;
        c.dv = dv;
        clips.push_back(c);
    }
    Card card(clips);
    TempDir out;
    nlohmann::json report = ingestJSON(card.layout.root + " -o " + shellQuoted(out.path()));
    ASSERT_EQ(report.size(), cases.size());
    for (size_t i = 0; i < cases.size(); ++i) {
        SCOPED_TRACE(clips[i].name + " " + cases[i].family);
        DVStreamSpec dv = *clips[i].dv;
        dv.family = DVFamily(clips[i].family->videoFormat);
        DVFrameWriter writer(dv);
        std::vector<size_t> kept;
        for (size_t k = 0; k < clips[i].frames; ++k)
            if (!writer.isRepeatFrame(k)) kept.push_back(k);
        ASSERT_LT(kept.size(), clips[i].frames);

        const std::string movie = out / (clips[i].name + ".mov");
        EXPECT_EQ(report[i]["frameRate"], "24000/1001");
        EXPECT_NE(report[i]["cadence"], "none");
        EXPECT_EQ(report[i]["frames"], kept.size());
        Movie m = readMovie(movie);
        nlohmann::json video = m.ofType("video");
        ASSERT_EQ(video.size(), 1u);
        EXPECT_EQ(video[0]["r_frame_rate"], "24000/1001");
        EXPECT_EQ(video[0]["avg_frame_rate"], "24000/1001");
        // The card's own timecode, counted at the card's rate.
        EXPECT_EQ(video[0]["tags"]["timecode"], "01:00:00;00");

        Essence e = essenceOf(card.clip(clips[i].name), *clips[i].family);
        expectFrames(m, e, kept);
        // Audio is not pulled down: every sample stays.
        ASSERT_FALSE(m.audio.empty());
        EXPECT_TRUE(m.audio[0] == e.channels[0]);
        EXPECT_TRUE(m.decoded) << m.errors;
    }
}

// ---------------------------------------------------------------------------
// Part of a clip

TEST(SkarnIngest, InAndOutPointsTakeExactlyTheirSpan) {
    if (!haveFFmpegTools()) GTEST_SKIP() << "ffprobe and ffmpeg are not on PATH";
    // The drop-frame clip crosses a minute where two labels are skipped.
    ClipSpec dv = clipOf("dvcpro50-ntsc", "I001", 30);
    dv.startTimecode = "00:00:59;20";
    ClipSpec intra = clipOf("avclip-intra", "I002", 60);
    ClipSpec pal = clipOf("dv-pal", "I003", 20);
    pal.bitsPerSample = 24;
    Card card({dv, intra, pal});
    TempDir out;
    struct Case {
        std::string clip, in, out;
        size_t first, end;  // frames of the clip
        std::string label;
    };
    const std::vector<Case> cases = {
        {"I001", "00:00:59;25", "00:01:00;12", 5, 20, "00:00:59;25"},  // 59;20..59;29, then 01:00;02
        {"I001", "00:01:00;02", "", 10, 30, "00:01:00;02"},
        {"I002", "01:00:00;07", "01:00:01;20", 7, 50, "01:00:00;07"},  // audio blocks span chunks
        {"I003", "", "01:00:00:11", 0, 11, "01:00:00:00"},
    };
    for (const Case& k : cases) {
        SCOPED_TRACE(k.clip + " " + k.in + " " + k.out);
        const std::string movie = out / (k.clip + "-" + std::to_string(k.first) + ".mov");
        std::string args = card.layout.root + ":" + k.clip + " -o " + shellQuoted(movie);
        if (!k.in.empty()) args += " --in '" + k.in + "'";
        if (!k.out.empty()) args += " --out '" + k.out + "'";
        nlohmann::json r = ingestJSON(args);
        ASSERT_EQ(r.size(), 1u);
        EXPECT_EQ(r[0]["startTimecode"], k.label);
        EXPECT_EQ(r[0]["frames"], k.end - k.first);
        const ClipSpec& clipLayout = k.clip == "I001" ? dv : k.clip == "I002" ? intra : pal;
        Essence e = essenceOf(card.clip(k.clip), *clipLayout.family);
        Movie m = readMovie(movie);
        expectFrames(m, e, range(k.first, k.end));
        ASSERT_EQ(m.ofType("video").size(), 1u);
        EXPECT_EQ(m.ofType("video")[0]["tags"]["timecode"], k.label);
        ASSERT_EQ(m.audio.size(), e.channels.size());
        // The samples of exactly that span.
        const double perFrame = 48000.0 * clipLayout.family->editRateDen / clipLayout.family->editRateNum;
        const size_t bps = size_t(e.bits / 8);
        const size_t from = size_t(std::llround(double(k.first) * perFrame));
        const size_t to = size_t(std::llround(double(k.end) * perFrame));
        for (size_t ch = 0; ch < e.channels.size(); ++ch)
            EXPECT_TRUE(m.audio[ch] == e.channels[ch].substr(from * bps, (to - from) * bps)) << "channel " << ch;
        EXPECT_TRUE(m.decoded) << m.errors;
    }
    // Points that are not in the clip are one-line errors.
    for (const char* bad : {"--in '00:00:40;00'", "--in 1:2:3", "--in '00:01:00;00'",
                                   "--in '00:00:59;25' --out '00:00:59;25'", "--out '00:01:00;23'"}) {
        std::string err;
        EXPECT_EQ(runSkarn("ingest " + card.layout.root + ":I001 -o " + shellQuoted(out / "bad.mov") + " " + bad, nullptr,
                           &err),
                  1)
            << bad;
        EXPECT_EQ(std::count(err.begin(), err.end(), '\n'), 1) << err;
        EXPECT_EQ(err.rfind("skarn: I001: ", 0), 0u) << err;
        EXPECT_FALSE(FileSystem::fileExists(out / "bad.mov"));
    }
}

// ---------------------------------------------------------------------------
// Audio layout

TEST(SkarnIngest, MultichannelAudioIsOneTrackInChannelOrder) {
    if (!haveFFmpegTools()) GTEST_SKIP() << "ffprobe and ffmpeg are not on PATH";
    ClipSpec c = clipOf("dvcprohd-1080i50", "M001", 8);
    c.audioChannels = 4;
    c.bitsPerSample = 24;
    ClipSpec s = clipOf("avclip-strand420", "M002", 24);
    s.audioChannels = 3;
    Card card({c, s});
    TempDir out;
    nlohmann::json r = ingestJSON(card.layout.root + " -o " + shellQuoted(out.path()) + " --audio multi");
    ASSERT_EQ(r.size(), 2u);
    for (const ClipSpec& clip : {c, s}) {
        SCOPED_TRACE(clip.name);
        const std::string movie = out / (clip.name + ".mov");
        Movie m = readMovie(movie);
        nlohmann::json audio = m.ofType("audio");
        ASSERT_EQ(audio.size(), 1u);
        EXPECT_EQ(audio[0]["channels"], clip.audioChannels);
        Essence e = essenceOf(card.clip(clip.name), *clip.family);
        const size_t bps = size_t(e.bits / 8), samples = e.channels[0].size() / bps;
        Bytes interleaved;
        for (size_t i = 0; i < samples; ++i)
            for (const Bytes& ch : e.channels) interleaved.append(ch, i * bps, bps);
        EXPECT_TRUE(m.audio[0] == interleaved);
        EXPECT_TRUE(m.decoded) << m.errors;
    }
}

// ---------------------------------------------------------------------------
// Outputs

TEST(SkarnIngest, ExistingMoviesAreRefusedUnlessForced) {
    Card card({clipOf("dv-ntsc", "F001", 3), clipOf("dv-pal", "F002", 3)});
    TempDir out;
    const std::string movie = out / "F001.mov";
    ASSERT_EQ(runSkarn("ingest " + card.layout.root + ":F001 -o " + shellQuoted(movie) + " >/dev/null"), 0);
    struct stat before;
    ASSERT_EQ(::stat(movie.c_str(), &before), 0);
    writeTextFile(movie, "an edit someone made");

    std::string err;
    EXPECT_EQ(runSkarn("ingest " + card.layout.root + ":F001 -o " + shellQuoted(movie), nullptr, &err), 1);
    EXPECT_NE(err.find("F001"), std::string::npos);
    EXPECT_NE(err.find("--force"), std::string::npos);
    EXPECT_EQ(std::count(err.begin(), err.end(), '\n'), 1) << err;
    EXPECT_EQ(fileBytes(movie), "an edit someone made");

    EXPECT_EQ(runSkarn("ingest --force " + card.layout.root + ":F001 -o " + shellQuoted(movie) + " >/dev/null"), 0);
    struct stat after;
    ASSERT_EQ(::stat(movie.c_str(), &after), 0);
    EXPECT_EQ(after.st_size, before.st_size);

    // A whole card into the same folder: the one that exists is refused, the
    // other written, and the exit status tells.
    nlohmann::json r = ingestJSON(card.layout.root + " -o " + shellQuoted(out.path()), 1);
    ASSERT_EQ(r.size(), 2u);
    EXPECT_TRUE(r[0].contains("error"));
    EXPECT_EQ(r[1]["frames"], 3);
    // Movies never go onto the card.
    EXPECT_EQ(runSkarn("ingest --force " + card.layout.root + ":F002 -o " +
                           shellQuoted(card.layout.root + "/CONTENTS/F002.mov"),
                       nullptr, &err),
              1);
    EXPECT_NE(err.find("only ever read"), std::string::npos);
    EXPECT_FALSE(FileSystem::fileExists(card.layout.root + "/CONTENTS/F002.mov"));
}

TEST(SkarnIngest, AFailingClipLeavesNoMovieAndTheOthersAreWritten) {
    Card card({clipOf("dv-ntsc", "E001", 4), clipOf("dv-ntsc", "E002", 60), clipOf("dvcpro-pal", "E003", 4),
               clipOf("dvcpro-pal", "E004", 6)});
    const std::string contents = card.layout.root + "/CONTENTS";
    // E002 ends after 40 of its 60 frames; E004's second channel is cut short.
    ASSERT_EQ(::truncate((contents + "/VIDEO/E002.MXF").c_str(), 4096 + 40 * 120000), 0);
    ASSERT_EQ(::truncate((contents + "/AUDIO/E00401.MXF").c_str(), 5000), 0);
    TempDir out;
    std::string stdoutText, err;
    EXPECT_EQ(runSkarn("ingest " + card.layout.root + " -o " + shellQuoted(out.path()), &stdoutText, &err), 1);

    std::vector<std::string> lines;
    for (size_t at = 0, nl; (nl = err.find('\n', at)) != std::string::npos; at = nl + 1)
        lines.push_back(err.substr(at, nl - at));
    ASSERT_EQ(lines.size(), 2u) << err;
    // The clip, the frame and the cause.
    EXPECT_EQ(lines[0].rfind("skarn: E002: frame ", 0), 0u) << lines[0];
    // The plug-in reports the short reads (-19): the video frame after the
    // 40 that are there, and the cut audio channel's first block.
    EXPECT_EQ(lines[0].rfind("skarn: E002: frame 40 ", 0), 0u) << lines[0];
    EXPECT_NE(lines[0].find("error -19"), std::string::npos) << lines[0];
    EXPECT_EQ(lines[1].rfind("skarn: E004: frame ", 0), 0u) << lines[1];
    EXPECT_NE(lines[1].find("error -19"), std::string::npos) << lines[1];

    EXPECT_TRUE(FileSystem::fileExists(out / "E001.mov"));
    EXPECT_TRUE(FileSystem::fileExists(out / "E003.mov"));
    auto files = FileSystem::contentsOfDirectory(out.path());
    ASSERT_TRUE(files);
    std::sort(files->begin(), files->end());
    EXPECT_EQ(*files, (std::vector<std::string>{"E001.mov", "E003.mov"}));
    EXPECT_NE(stdoutText.find("FAILED"), std::string::npos);
}

TEST(SkarnIngest, ABrokenSelfContainedClipIsReportedAndLeavesNothing) {
    ClipSpec c = clipOf("avclip-intra", "S001", 24);
    Card card({c});
    const WrittenClip& w = card.clip("S001");
    struct stat st;
    ASSERT_EQ(::stat(w.clipPath.c_str(), &st), 0);
    ASSERT_EQ(::truncate(w.clipPath.c_str(), st.st_size / 2), 0);
    TempDir out;
    std::string err;
    EXPECT_NE(runSkarn("ingest " + card.layout.root + ":S001 -o " + shellQuoted(out / "s.mov"), nullptr, &err), 0);
    EXPECT_EQ(std::count(err.begin(), err.end(), '\n'), 1) << err;
    EXPECT_NE(err.find("S001"), std::string::npos) << err;
    auto files = FileSystem::contentsOfDirectory(out.path());
    ASSERT_TRUE(files);
    EXPECT_TRUE(files->empty());
}
