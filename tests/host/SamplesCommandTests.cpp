// skarn samples as a user runs it: every sample location agrees with what the
// card writer laid down (the clip XML's byte ranges, the MXF index tables as
// skarn-mxfdump reads them) and with an independent demuxer (ffprobe).
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
std::string mxfdump() {
    return buildDir() + "/src/cardwriter/skarn-mxfdump";
}
bool haveFFprobe() {
    return runCommand("command -v ffprobe >/dev/null 2>&1") == 0;
}

struct Outcome {
    int status = -1;
    std::string out, err;
    json doc;  // stdout parsed, or discarded
};

Outcome run(const TempDir& dir, const std::string& args) {
    Outcome r;
    const std::string errFile = dir / "stderr.txt";
    r.status = runCommand(skarn() + " " + args + " 2>'" + errFile + "'", &r.out);
    std::ifstream in(errFile);
    std::stringstream text;
    text << in.rdbuf();
    r.err = text.str();
    r.doc = json::parse(r.out, nullptr, false);
    return r;
}

size_t lines(const std::string& text) {
    return size_t(std::count(text.begin(), text.end(), '\n'));
}

std::string readFile(const std::string& path) {
    std::ifstream in(path);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

// The number in <element> after the first <section> of a clip XML.
int64_t xmlNumber(const std::string& xml, const std::string& section, const std::string& element) {
    size_t at = xml.find("<" + section + ">");
    at = xml.find("<" + element + ">", at);
    if (at == std::string::npos) return -1;
    return std::stoll(xml.substr(at + element.size() + 2));
}

struct Packet {
    int64_t pos, size;
};

// ffprobe's packets of one stream in file order.
std::vector<Packet> ffprobePackets(const std::string& path, const std::string& stream) {
    std::string out;
    runCommand(
        "ffprobe -v fatal -select_streams " + stream + " -show_entries packet=pos,size -of csv=p=0 '" + path + "'",
        &out);
    std::vector<Packet> packets;
    std::istringstream rows(out);
    std::string row;
    while (std::getline(rows, row)) {
        Packet p{};
        char comma;
        std::istringstream fields(row);
        if (fields >> p.size >> comma >> p.pos) packets.push_back(p);
    }
    return packets;
}

// A card with one clip of every family: clip-XML clips of 4 frames, and
// self-contained ones long enough for two chunks (a chunk is a second).
struct EveryFamilyCard {
    TempDir dir;
    CardSpec card;
    std::vector<WrittenClip> written;
    EveryFamilyCard() {
        card.root = dir / "card";
        unsigned index = 1;
        for (const auto& f : cardFamilies()) {
            ClipSpec c = defaultClip(f, index++);
            c.frames = f.avclip ? 45 : 4;
            c.audioChannels = 2;
            card.clips.push_back(c);
        }
        std::string error;
        EXPECT_TRUE(writeCard(card, &written, &error)) << error;
    }
};

int64_t rational(const json& t) {
    return t.is_array() ? t[0].get<int64_t>() : -1;
}

}  // namespace

TEST(SkarnSamples, EveryFamilyAgreesWithTheCardsLayout) {
    EveryFamilyCard card;
    ASSERT_EQ(card.written.size(), card.card.clips.size());
    const bool ffprobe = haveFFprobe();
    for (size_t i = 0; i < card.card.clips.size(); ++i) {
        const ClipSpec& shape = card.card.clips[i];
        const CardFamily& f = *shape.family;
        const std::string clipPath = card.written[i].clipPath;
        SCOPED_TRACE(f.name + " " + clipPath);
        Outcome video = run(card.dir, "samples --json '" + clipPath + "'");
        ASSERT_EQ(video.status, 0) << video.err;
        EXPECT_EQ(video.err, "");
        ASSERT_FALSE(video.doc.is_discarded()) << video.out;
        EXPECT_EQ(video.doc["track"], 0);
        EXPECT_EQ(video.doc["mediaType"], "vide");
        const json& rows = video.doc["samples"];
        ASSERT_EQ(rows.size(), shape.frames);
        const int64_t frameTicks = rational(rows[0]["duration"]);
        ASSERT_GT(frameTicks, 0);

        if (!f.avclip) {
            // Clip XML: frame k is StartByteOffset + k x frame size of the
            // video file. AVC-Intra essence opens with a 512-byte header that
            // the XML's range includes.
            const std::string xml = readFile(clipPath);
            const bool avcIntra = f.codec.rfind("AVC-I", 0) == 0;
            const int64_t header = avcIntra ? 512 : 0;
            const int64_t start = xmlNumber(xml, "VideoIndex", "StartByteOffset") + header;
            const int64_t frameBytes = (xmlNumber(xml, "VideoIndex", "DataSize") - header) / int64_t(shape.frames);
            const std::string file = card.card.root + "/CONTENTS/VIDEO/" + shape.name + ".MXF";
            for (size_t k = 0; k < rows.size(); ++k) {
                const json& r = rows[k];
                EXPECT_EQ(r["decodeIndex"], k);
                EXPECT_EQ(rational(r["pts"]), int64_t(k) * frameTicks);
                EXPECT_EQ(r["dts"], r["pts"]);
                EXPECT_EQ(r["offset"], start + int64_t(k) * frameBytes) << "frame " << k;
                EXPECT_EQ(r["length"], frameBytes);
                EXPECT_EQ(r["file"], file);
                EXPECT_TRUE(r["sync"].get<bool>());
                EXPECT_FALSE(r.contains("dependsOnOthers") || r.contains("chunkOffset"));
            }
            // ffprobe's H.264 parser cuts a clip-wrapped AVC-Intra stream
            // where its own access-unit rules say (the header's zero bytes
            // join the first packet), not at the clip's frame size.
            if (ffprobe && !avcIntra) {
                // The essence is one clip-wrapped element: ffprobe cuts it at the same places.
                std::vector<Packet> packets = ffprobePackets(file, "v:0");
                ASSERT_EQ(packets.size(), rows.size());
                for (size_t k = 0; k < packets.size(); ++k) {
                    EXPECT_EQ(packets[k].pos, rows[k]["offset"]) << "frame " << k;
                    EXPECT_EQ(packets[k].size, rows[k]["length"]) << "frame " << k;
                }
            }
            continue;
        }

        // Self-contained: the index records in decode order, at absolute offsets.
        std::string dumpText;
        ASSERT_EQ(runCommand(mxfdump() + " --json '" + clipPath + "'", &dumpText), 0);
        json dump = json::parse(dumpText);
        std::vector<json> records;
        for (const auto& chunk : dump["chunks"])
            for (const auto& frame : chunk["frames"]) records.push_back(frame);
        ASSERT_EQ(records.size(), rows.size());
        ASSERT_GE(dump["chunks"].size(), 2u);
        for (size_t k = 0; k < rows.size(); ++k) {
            const json& r = rows[k];
            const json& rec = records[k];
            ASSERT_EQ(rec["dts"], k);
            EXPECT_EQ(r["decodeIndex"], k);
            EXPECT_EQ(rational(r["dts"]), int64_t(k) * frameTicks);
            EXPECT_EQ(rational(r["pts"]), rec["pts"].get<int64_t>() * frameTicks) << "frame " << k;
            EXPECT_EQ(r["offset"], rec["offset"]) << "frame " << k;
            EXPECT_EQ(r["length"], rec["size"]) << "frame " << k;
            EXPECT_EQ(r["file"], clipPath);
            const uint32_t flags = rec["flags"];
            EXPECT_EQ(r["sync"], (flags & 1u) == 0) << "frame " << k;
            // Bits 26 and 27: depended on by others, or not.
            if (flags & (3u << 26))
                EXPECT_EQ(r["isDependedOnByOthers"], (flags & (1u << 26)) != 0) << "frame " << k;
            else
                EXPECT_FALSE(r.contains("isDependedOnByOthers"));
        }
        if (f.longGOP) {
            // Reordered: decode and presentation order differ somewhere.
            bool reordered = false;
            for (const auto& r : rows) reordered = reordered || r["pts"] != r["dts"];
            EXPECT_TRUE(reordered);
        }
        if (ffprobe) {
            // ffprobe places a frame-wrapped packet at its element's key, 20 bytes before the value.
            std::vector<Packet> packets = ffprobePackets(clipPath, "v:0");
            ASSERT_EQ(packets.size(), rows.size());
            for (size_t k = 0; k < packets.size(); ++k) {
                EXPECT_EQ(packets[k].pos + 20, rows[k]["offset"]) << "frame " << k;
                EXPECT_EQ(packets[k].size, rows[k]["length"]) << "frame " << k;
            }
        }
    }
}

// Audio is listed sample by sample; each sample's place follows from the
// channel's start and the sample size, and the chunk the cursor reports holds it.
TEST(SkarnSamples, AudioSamplesAndChunksAgreeWithTheCardsLayout) {
    TempDir dir;
    CardSpec card;
    card.root = dir / "card";
    const char* families[] = {"dvcpro50-ntsc", "avci-1080p25", "avclip-intra", "avclip-strand420"};
    unsigned index = 1;
    for (const char* name : families) {
        ClipSpec c = defaultClip(*cardFamilyNamed(name), index++);
        c.frames = c.family->avclip ? 45 : 5;
        c.audioChannels = 2;
        c.bitsPerSample = c.family->avclip ? 24 : 16;
        card.clips.push_back(c);
    }
    std::vector<WrittenClip> written;
    ASSERT_TRUE(writeCard(card, &written));
    const bool ffprobe = haveFFprobe();

    for (size_t i = 0; i < card.clips.size(); ++i) {
        const ClipSpec& shape = card.clips[i];
        const std::string clipPath = written[i].clipPath;
        SCOPED_TRACE(clipPath);
        const uint64_t samples = audioSamplesFor(shape);
        const int64_t bytes = shape.bitsPerSample / 8;
        // Channel 1, the second audio track: channel 0 would hide a channel mix-up.
        Outcome audio = run(dir, "samples --json --track 3 '" + clipPath + "'");
        ASSERT_FALSE(audio.doc.is_discarded()) << audio.out;
        EXPECT_EQ(audio.doc["mediaType"], "soun");
        const json& rows = audio.doc["samples"];
        // Every sample the channel holds, and none it does not: where the
        // track's duration claims one more, the listing stops with one line.
        ASSERT_EQ(rows.size(), samples);
        // The plug-in's audio tracks may claim a sample more than the data
        // holds, and its MXF audio cursors step on to the end of the last
        // chunk: the host stops at the first sample it cannot place.
        if (audio.status != 0) {
            EXPECT_EQ(lines(audio.err), 1u) << audio.err;
            EXPECT_NE(audio.err.find("stopped after " + std::to_string(samples) + " sample(s)"), std::string::npos)
                << audio.err;
            EXPECT_TRUE(audio.doc.contains("error"));
        }
        for (size_t k = 0; k < rows.size(); ++k) {
            const json& r = rows[k];
            ASSERT_EQ(r["decodeIndex"], k);
            ASSERT_EQ(rational(r["pts"]), int64_t(k));
            ASSERT_EQ(r["length"], bytes);
            ASSERT_LE(r["chunkOffset"].get<int64_t>(), r["offset"].get<int64_t>());
            ASSERT_GT(r["chunkOffset"].get<int64_t>() + r["chunkSize"].get<int64_t>(), r["offset"].get<int64_t>());
            ASSERT_EQ(r["chunkSize"].get<int64_t>(), r["sampleCount"].get<int64_t>() * bytes);
        }

        if (!shape.family->avclip) {
            const std::string xml = readFile(clipPath);
            // The second <Audio> section's index.
            const size_t second = xml.find("<AudioIndex>", xml.find("<AudioIndex>") + 1);
            const int64_t start = xmlNumber(xml.substr(second), "AudioIndex", "StartByteOffset");
            const std::string file = card.root + "/CONTENTS/AUDIO/" + shape.name + "01.MXF";
            for (size_t k = 0; k < rows.size(); ++k) {
                ASSERT_EQ(rows[k]["offset"], start + int64_t(k) * bytes) << "sample " << k;
                ASSERT_EQ(rows[k]["file"], file);
            }
            if (ffprobe) {
                std::vector<Packet> packets = ffprobePackets(file, "a:0");
                ASSERT_FALSE(packets.empty());
                int64_t sample = 0;
                for (const auto& p : packets) {
                    ASSERT_LT(sample, int64_t(rows.size()));
                    EXPECT_EQ(p.pos, rows[size_t(sample)]["offset"]) << "sample " << sample;
                    sample += p.size / bytes;
                }
                EXPECT_EQ(sample, int64_t(rows.size()));
            }
            continue;
        }

        std::string dumpText;
        ASSERT_EQ(runCommand(mxfdump() + " --json '" + clipPath + "'", &dumpText), 0);
        json dump = json::parse(dumpText);
        std::vector<int64_t> chunkOffsets;
        for (const auto& chunk : dump["chunks"])
            for (const auto& a : chunk["audio"]) {
                if (a["channel"] != 1) continue;
                // A chunk's first sample lies at its record's offset; the rest follow it.
                const int64_t first = a["firstSample"], size = a["size"];
                chunkOffsets.push_back(a["offset"]);
                for (int64_t s = 0; s < size / bytes; ++s) {
                    ASSERT_LT(size_t(first + s), rows.size());
                    ASSERT_EQ(rows[size_t(first + s)]["offset"], a["offset"].get<int64_t>() + s * bytes)
                        << "sample " << first + s;
                }
            }
        EXPECT_GE(chunkOffsets.size(), 2u);
        if (ffprobe) {
            std::vector<Packet> packets = ffprobePackets(clipPath, "a:1");
            ASSERT_EQ(packets.size(), chunkOffsets.size());
            for (size_t k = 0; k < packets.size(); ++k)
                EXPECT_EQ(packets[k].pos + 20, chunkOffsets[k]) << "chunk " << k;
        }
    }
}

TEST(SkarnSamples, FromTakesSecondsAndTimecodesAndCountBoundsTheRows) {
    TempDir dir;
    CardSpec card;
    card.root = dir / "card";
    ClipSpec gop = defaultClip(*cardFamilyNamed("avclip-strand422"), 1);
    gop.frames = 45;
    // A minute and a frame of NTSC DV, mostly holes, to count drop frame over a minute.
    ClipSpec ntsc = defaultClip(*cardFamilyNamed("dv-ntsc"), 2);
    ntsc.frames = 1802;
    ntsc.sparse = true;
    ClipSpec pal = defaultClip(*cardFamilyNamed("dvcpro-pal"), 3);
    pal.frames = 30;
    card.clips = {gop, ntsc, pal};
    ASSERT_TRUE(writeCard(card));
    const std::string A = card.root + ":A001", B = card.root + ":A002", C = card.root + ":A003";

    // Long GOP: the sample presented at frame 5 is decoded third; the walk
    // goes on from there in decode order.
    std::string dumpText;
    ASSERT_EQ(runCommand(mxfdump() + " --json " + card.root + "/CONTENTS/AVCLIP/A001.MXF", &dumpText), 0);
    json frames = json::parse(dumpText)["chunks"][0]["frames"];
    int64_t decodeOfFrame5 = -1;
    for (const auto& f : frames)
        if (f["pts"] == 5) decodeOfFrame5 = f["dts"];
    ASSERT_GE(decodeOfFrame5, 0);
    for (const char* from : {"00:00:00:05", "'00:00:00;05'", "0.2", "0.1669"}) {
        SCOPED_TRACE(from);
        Outcome r = run(dir, "samples --json --count 3 --from " + std::string(from) + " " + A);
        ASSERT_EQ(r.status, 0) << r.err;
        const json& rows = r.doc["samples"];
        ASSERT_EQ(rows.size(), 3u);
        EXPECT_EQ(rows[0]["pts"], json::parse("[5005,30000]"));
        EXPECT_EQ(rows[0]["decodeIndex"], decodeOfFrame5);
        EXPECT_EQ(rows[1]["decodeIndex"], decodeOfFrame5 + 1);
        EXPECT_EQ(rows[2]["decodeIndex"], decodeOfFrame5 + 2);
    }

    // Drop frame skips ;00 and ;01 of every minute but the tenth: one minute
    // of 29.97 is frame 1800 either way it is written.
    for (const char* from : {"'00:01:00;02'", "00:01:00:00", "60.06"}) {
        SCOPED_TRACE(from);
        Outcome r = run(dir, "samples --json --from " + std::string(from) + " " + B);
        ASSERT_EQ(r.status, 0) << r.err;
        ASSERT_EQ(r.doc["samples"].size(), 2u);
        EXPECT_EQ(r.doc["samples"][0]["decodeIndex"], 1800);
        EXPECT_EQ(r.doc["samples"][0]["pts"], json::parse("[1801800,30000]"));
    }
    // Audio counts the video's frames: frame 10 of 25 fps is sample 19200.
    Outcome audio = run(dir, "samples --json --track 2 --count 1 --from 00:00:00:10 " + C);
    ASSERT_EQ(audio.status, 0) << audio.err;
    EXPECT_EQ(audio.doc["samples"][0]["pts"], json::parse("[19200,48000]"));

    // --count bounds the text table too: a header line, a column line, the rows.
    Outcome text = run(dir, "samples --count 4 " + C);
    ASSERT_EQ(text.status, 0) << text.err;
    EXPECT_EQ(lines(text.out), 6u) << text.out;
    EXPECT_NE(text.out.find("OFFSET"), std::string::npos);
    // Aligned: every row as wide as the column line.
    std::istringstream table(text.out);
    std::string line, columns;
    std::getline(table, line);
    std::getline(table, columns);
    while (std::getline(table, line)) EXPECT_EQ(line.size(), columns.size()) << line;
    Outcome all = run(dir, "samples --json --count 1000 " + C);
    EXPECT_EQ(all.doc["samples"].size(), 30u);

    // Times that name no frame of the track are one line each.
    struct Bad {
        const char* from;
        std::string clip;
    } bad[] = {{"'00:01:00;00'", B}, {"00:00:00:25", C}, {"'00:00:00;05'", C},
               {"1:2", C},           {"1.2", C},         {"00:00:01:05", C}};
    for (const auto& b : bad) {
        SCOPED_TRACE(b.from);
        Outcome r = run(dir, "samples --from " + std::string(b.from) + " " + b.clip);
        EXPECT_NE(r.status, 0);
        EXPECT_EQ(lines(r.err), 1u) << r.err;
        EXPECT_NE(r.err.find("--from"), std::string::npos) << r.err;
        EXPECT_EQ(r.out, "");
    }
}

TEST(SkarnSamples, ProblemsAreOneLineAndAFailure) {
    TempDir dir;
    CardSpec card;
    card.root = dir / "card";
    ClipSpec a = defaultClip(*cardFamilyNamed("dvcpro50-pal"), 1);
    a.frames = 3;
    ClipSpec b = defaultClip(*cardFamilyNamed("avclip-strand420"), 2);
    b.frames = 45;
    card.clips = {a, b};
    ASSERT_TRUE(writeCard(card));

    struct Case {
        std::string args, says;
    } cases[] = {
        {card.root + ":A009", "A009: no such clip"},
        {card.root + ":A001 --track 4", "no track 4"},
        // The timecode track of a self-contained clip has no samples of its
        // own to step through: its cursor answers every step without moving.
        {card.root + ":A002 --track 1", "without moving"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.args);
        Outcome r = run(dir, "samples " + c.args);
        EXPECT_NE(r.status, 0);
        EXPECT_EQ(lines(r.err), 1u) << r.err;
        EXPECT_NE(r.err.find(c.says), std::string::npos) << r.err;
    }

    // A clip-XML clip whose video file is gone.
    ASSERT_EQ(::unlink((card.root + "/CONTENTS/VIDEO/A001.MXF").c_str()), 0);
    Outcome gone = run(dir, "samples --json " + card.root + ":A001");
    EXPECT_NE(gone.status, 0);
    EXPECT_EQ(lines(gone.err), 1u) << gone.err;
    EXPECT_NE(gone.err.find("video file"), std::string::npos) << gone.err;

    // Damage the second chunk's index partition of the self-contained clip:
    // the plug-in stops on a failed check, which the host reports as one line.
    const std::string mxf = card.root + "/CONTENTS/AVCLIP/A002.MXF";
    std::string dumpText;
    ASSERT_EQ(runCommand(mxfdump() + " --json " + mxf, &dumpText), 0);
    const int64_t indexPartition = json::parse(dumpText)["chunks"][1]["videoIndexPartition"];
    {
        std::fstream f(mxf, std::ios::in | std::ios::out | std::ios::binary);
        f.seekp(indexPartition + 16);
        const std::string junk(12, '\xff');
        f.write(junk.data(), std::streamsize(junk.size()));
    }
    for (const char* form : {"", "--json "}) {
        Outcome r = run(dir, std::string("samples ") + form + mxf);
        EXPECT_NE(r.status, 0);
        EXPECT_EQ(lines(r.err), 1u) << r.err;
        EXPECT_NE(r.err.find(mxf + ": track 0"), std::string::npos) << r.err;
        EXPECT_NE(r.err.find("failed check"), std::string::npos) << r.err;
    }
}

TEST(SkarnSamples, Help) {
    std::string out;
    EXPECT_EQ(runCommand(skarn() + " samples --help", &out), 0);
    for (const char* option : {"--track", "--from", "--count", "--json"})
        EXPECT_NE(out.find(option), std::string::npos) << option;
    EXPECT_NE(runCommand(skarn() + " samples 2>/dev/null"), 0);
    EXPECT_NE(runCommand(skarn() + " samples --count 0 x 2>/dev/null"), 0);
}
