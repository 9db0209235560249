// skarn tracks as a user runs it: the tracks of a DV and of AVC clips, field
// by field, against what the card writer put on the card.
#include "CardWriter.h"
#include "FileSystem.h"
#include "TestSupport.h"

#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include <algorithm>
#include <fstream>
#include <sstream>

namespace {

using json = nlohmann::json;

std::string skarn() {
    return buildDir() + "/src/host/skarn";
}

int64_t fileSize(const std::string& path) {
    return int64_t(FileSystem::fileSize(path).value_or(0));
}

struct Outcome {
    int status = -1;
    std::string out, err;
};

Outcome run(const TempDir& dir, const std::string& args) {
    Outcome r;
    const std::string errFile = dir / "stderr.txt";
    r.status = runCommand(skarn() + " " + args + " 2>'" + errFile + "'", &r.out);
    std::ifstream in(errFile);
    std::stringstream text;
    text << in.rdbuf();
    r.err = text.str();
    return r;
}

json tracksOf(const TempDir& dir, const std::string& clip) {
    Outcome r = run(dir, "tracks --json " + clip);
    EXPECT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.err, "");
    json j = json::parse(r.out, nullptr, false);
    EXPECT_TRUE(j.is_array()) << r.out;
    return j;
}

struct Card {
    TempDir dir;
    CardSpec card;
    Card() {
        card.root = dir / "card";
        ClipSpec dv = defaultClip(*cardFamilyNamed("dvcpro50-ntsc"), 1);
        dv.frames = 4;
        dv.audioChannels = 2;
        ClipSpec intra = defaultClip(*cardFamilyNamed("avci-1080p25"), 2);
        intra.frames = 3;
        intra.audioChannels = 4;
        intra.bitsPerSample = 24;
        ClipSpec gop = defaultClip(*cardFamilyNamed("avclip-strand422"), 3);
        gop.frames = 12;
        gop.audioChannels = 4;
        gop.bitsPerSample = 24;
        card.clips = {dv, intra, gop};
        EXPECT_TRUE(writeCard(card));
    }
};

}  // namespace

TEST(SkarnTracks, DVClipTrackByTrack) {
    Card c;
    const std::string root = c.card.root;
    json tracks = tracksOf(c.dir, root + "/CONTENTS/CLIP/A001.XML");
    ASSERT_EQ(tracks.size(), 4u);
    for (size_t i = 0; i < tracks.size(); ++i) EXPECT_EQ(tracks[i]["index"], i);

    const json& v = tracks[0];
    EXPECT_EQ(v["mediaType"], "vide");
    EXPECT_EQ(v["codec"], "dv5n");
    EXPECT_EQ(v["timescale"], 30000);
    EXPECT_EQ(v["frameDuration"], json::parse("[1001,30000]"));
    EXPECT_EQ(v["duration"], json::parse("[4004,30000]"));
    // A clip-XML track: its data is a range of the video file.
    const std::string video = root + "/CONTENTS/VIDEO/A001.MXF";
    EXPECT_EQ(v["file"], video);
    EXPECT_EQ(v["locationSize"], 4 * 240000);
    EXPECT_EQ(v["uneditedNumDataBytes"], fileSize(video));
    EXPECT_EQ(v["locationOffset"].get<int64_t>() + v["locationSize"].get<int64_t>() <= fileSize(video), true);
    const json& vd = v["formatDescription"];
    EXPECT_EQ(vd["codecType"], "dv5n");
    EXPECT_EQ(vd["width"], 720);
    EXPECT_EQ(vd["height"], 480);
    EXPECT_EQ(vd["extensions"]["CVFieldCount"], 2);
    EXPECT_TRUE(vd["extensions"].contains("CVPixelAspectRatio"));
    // No cadence in a plain 59.94i recording, answered or not.
    EXPECT_EQ(v["pulldownPattern"], nullptr);

    const json& tc = tracks[1];
    EXPECT_EQ(tc["mediaType"], "tmcd");
    EXPECT_EQ(tc["codec"], "cn32");
    EXPECT_EQ(tc["formatDescription"]["timeCodeType"], "cn32");
    EXPECT_EQ(tc["formatDescription"]["frameDuration"], json::parse("[1001,30000]"));
    EXPECT_EQ(tc["formatDescription"]["frameQuanta"], 30);
    EXPECT_EQ(tc["formatDescription"]["dropFrame"], true);

    for (size_t ch = 0; ch < 2; ++ch) {
        const json& a = tracks[2 + ch];
        SCOPED_TRACE(ch);
        const std::string audio = root + "/CONTENTS/AUDIO/A0010" + std::to_string(ch) + ".MXF";
        EXPECT_EQ(a["mediaType"], "soun");
        EXPECT_EQ(a["file"], audio);
        EXPECT_EQ(a["timescale"], 48000);
        EXPECT_EQ(a["frameDuration"], json::parse("[1,48000]"));
        EXPECT_EQ(a["locationSize"], 2 * int64_t(audioSamplesFor(c.card.clips[0])));
        EXPECT_EQ(a["uneditedNumDataBytes"], fileSize(audio));
        const json& ad = a["formatDescription"];
        EXPECT_EQ(ad["formatID"], "lpcm");
        EXPECT_EQ(ad["sampleRate"], 48000.0);
        EXPECT_EQ(ad["bitsPerChannel"], 16);
        EXPECT_EQ(ad["channelsPerFrame"], 1);
        // Signed integer, packed.
        EXPECT_EQ(ad["formatFlags"], 12);
        EXPECT_EQ(ad["channelLabels"], json::array({(1 << 16) | int(ch)}));
    }

    // The text form: a header, then per track its row and three indented lines.
    Outcome text = run(c.dir, "tracks " + root + ":A001");
    ASSERT_EQ(text.status, 0) << text.err;
    EXPECT_EQ(std::count(text.out.begin(), text.out.end(), '\n'), 1 + 4 * 4) << text.out;
    EXPECT_NE(text.out.find("dv5n 720x480"), std::string::npos) << text.out;
    EXPECT_NE(text.out.find("cn32 frame 1001/30000, quanta 30, drop frame"), std::string::npos) << text.out;
    EXPECT_NE(text.out.find("lpcm 48000 Hz, 16 bits, 1 channel(s)"), std::string::npos) << text.out;
}

TEST(SkarnTracks, AVCClipsClipXMLAndSelfContained) {
    Card c;
    const std::string root = c.card.root;

    // AVC-Intra with clip XML: byte-layout tracks like DV.
    json intra = tracksOf(c.dir, root + ":A002");
    ASSERT_EQ(intra.size(), 6u);
    EXPECT_EQ(intra[0]["timescale"], 2500);
    EXPECT_EQ(intra[0]["frameDuration"], json::parse("[100,2500]"));
    EXPECT_EQ(intra[0]["duration"], json::parse("[300,2500]"));
    // The essence's 512-byte AVC-Intra header is not the track's.
    EXPECT_EQ(intra[0]["locationSize"], 3 * 568320);
    EXPECT_EQ(intra[0]["locationOffset"].get<int64_t>() % 512, 0);
    EXPECT_EQ(intra[0]["formatDescription"]["width"], 1920);
    EXPECT_EQ(intra[0]["formatDescription"]["height"], 1080);
    EXPECT_EQ(intra[0]["formatDescription"]["extensions"]["CVFieldCount"], 1);
    EXPECT_EQ(intra[1]["formatDescription"]["dropFrame"], false);
    EXPECT_EQ(intra[1]["formatDescription"]["frameQuanta"], 25);
    for (size_t i = 2; i < 6; ++i) {
        EXPECT_EQ(intra[i]["formatDescription"]["bitsPerChannel"], 24);
        EXPECT_EQ(intra[i]["locationSize"], 3 * int64_t(audioSamplesFor(c.card.clips[1])));
    }

    // Self-contained long GOP: every track lies in the one file, and a
    // location is an offset in the whole of it.
    const std::string mxf = root + "/CONTENTS/AVCLIP/A003.MXF";
    json gop = tracksOf(c.dir, mxf);
    ASSERT_EQ(gop.size(), 6u);
    EXPECT_EQ(gop[0]["codec"], "avlg");
    EXPECT_EQ(gop[0]["duration"], json::parse("[12012,30000]"));
    EXPECT_EQ(gop[0]["formatDescription"]["width"], 1920);
    EXPECT_EQ(gop[0]["formatDescription"]["height"], 1080);
    for (const auto& t : gop) {
        EXPECT_EQ(t["file"], mxf);
        EXPECT_EQ(t["locationSize"], fileSize(mxf));
        EXPECT_EQ(t["uneditedNumDataBytes"], fileSize(mxf));
    }
    EXPECT_EQ(gop[2]["formatDescription"]["bitsPerChannel"], 24);
    EXPECT_EQ(gop[5]["formatDescription"]["channelLabels"], json::array({(1 << 16) | 3}));
}

TEST(SkarnTracks, ProblemsAreOneLineAndAFailure) {
    Card c;
    const std::string root = c.card.root;
    Outcome none = run(c.dir, "tracks " + root + ":A009");
    EXPECT_NE(none.status, 0);
    EXPECT_EQ(std::count(none.err.begin(), none.err.end(), '\n'), 1) << none.err;

    // One audio file gone: the plug-in leaves the channel out; the host says so.
    ASSERT_EQ(::unlink((root + "/CONTENTS/AUDIO/A00101.MXF").c_str()), 0);
    Outcome channel = run(c.dir, "tracks --json " + root + ":A001");
    EXPECT_NE(channel.status, 0);
    EXPECT_EQ(json::parse(channel.out).size(), 3u);
    EXPECT_EQ(std::count(channel.err.begin(), channel.err.end(), '\n'), 1) << channel.err;
    EXPECT_NE(channel.err.find("2 audio channels"), std::string::npos) << channel.err;

    ASSERT_EQ(::unlink((root + "/CONTENTS/VIDEO/A001.MXF").c_str()), 0);
    Outcome video = run(c.dir, "tracks " + root + ":A001");
    EXPECT_NE(video.status, 0);
    EXPECT_EQ(video.out, "");
    EXPECT_EQ(std::count(video.err.begin(), video.err.end(), '\n'), 1) << video.err;
    EXPECT_NE(video.err.find("video file"), std::string::npos) << video.err;

    std::string help;
    EXPECT_EQ(runCommand(skarn() + " tracks --help", &help), 0);
    EXPECT_NE(help.find("--json"), std::string::npos);
}
