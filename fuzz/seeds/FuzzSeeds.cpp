// skarn-fuzz-seeds OUT: writes seed candidates for the harnesses that take
// whole clips, made by the card writer and kept small: few frames, tiny
// pictures, slow audio, and no card metadata beyond one seed of each kind.
//   OUT/FormatReaderFuzz: self-contained clips (header gap left out) and clip
//     XML documents, each followed by operations from a fixed random stream;
//   OUT/IngestFuzz: [control][clip XML][video][audio channels...] with the
//     clip-XML clips' frames cut to their first DIF blocks (which carry the
//     packs the cadence reading looks at) or the H.264 headers, and
//     self-contained clips with an empty clip XML part.
// Merge them into fuzz/corpus/<Harness> with the harness's -merge=1.
#include "AVClipWriter.h"
#include "CardWriter.h"
#include "FileSystem.h"
#include "FuzzSupport.h"

#include <cmath>
#include <cstdio>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace {

namespace fs = std::filesystem;

std::string gOut;
std::string gScratch;

void write(const std::string& harness, const std::string& name, const std::vector<uint8_t>& bytes) {
    const fs::path dir = fs::path(gOut) / harness;
    fs::create_directories(dir);
    FILE* f = std::fopen((dir / name).c_str(), "wb");
    if (!f || std::fwrite(bytes.data(), 1, bytes.size(), f) != bytes.size() || std::fclose(f) != 0) {
        std::fprintf(stderr, "cannot write %s\n", (dir / name).c_str());
        std::exit(1);
    }
}

std::vector<uint8_t> readAll(const std::string& path) {
    auto bytes = FileSystem::readFile(path, size_t(1) << 30);
    if (!bytes) {
        std::fprintf(stderr, "cannot read %s\n", path.c_str());
        std::exit(1);
    }
    return *bytes;
}

std::vector<uint8_t> bytesOf(const std::string& s) { return std::vector<uint8_t>(s.begin(), s.end()); }

// Operations for a format reader seed: the same pseudo-random stream for
// every seed, from a different point for each.
std::vector<uint8_t> operations(uint32_t seed, size_t count) {
    std::vector<uint8_t> out(count);
    uint32_t x = 0x9e3779b9u ^ (seed * 0x85ebca6bu);
    for (auto& b : out) {
        x ^= x << 13;
        x ^= x >> 17;
        x ^= x << 5;
        b = uint8_t(x >> 7);
    }
    return out;
}

// The families' own rates, and the ones a self-contained clip could carry.
struct Rate {
    const char* text;
    int32_t num, den;
    uint32_t sampleRate;      // a slow rate that fills whole samples per chunk
    uint32_t framesPerChunk;
};
const Rate kRates[] = {
    {"59.94i", 30000, 1001, 3000, 10}, {"50i", 25, 1, 2000, 3},       {"23.98p", 24000, 1001, 2400, 10},
    {"25p", 25, 1, 2000, 3},           {"29.97p", 30000, 1001, 3000, 10}, {"50p", 50, 1, 2000, 4},
    {"59.94p", 60000, 1001, 6000, 10}, {"24p", 24, 1, 2400, 4},
};

struct AVClipCase {
    std::string family;  // avclip-intra, avclip-strand422, avclip-strand420
    const Rate* rate;
    uint64_t frames;
    uint32_t channels = 1, bits = 16;
    uint32_t sampleRate = 0;  // 0: the rate's slow one
    uint32_t gop = 6;
    std::string start = "00:00:00:00";
    bool drop = false;
    bool metadata = false;
};

// Families are kept for the life of the program: clips point at them.
std::vector<std::unique_ptr<CardFamily>> gFamilies;

ClipSpec clipOf(const CardFamily& family, uint64_t frames, bool metadata) {
    ClipSpec c = defaultClip(family, 1);
    c.frames = frames;
    c.icon = false;
    if (!metadata) c.metadata = ClipMetadataSpec{};
    return c;
}

std::vector<uint8_t> avclip(const AVClipCase& k) {
    auto family = std::make_unique<CardFamily>(*cardFamilyNamed(k.family));
    family->frameRate = k.rate->text;
    family->editRateNum = k.rate->num;
    family->editRateDen = k.rate->den;
    ClipSpec clip = clipOf(*family, k.frames, k.metadata);
    clip.audioChannels = k.channels;
    clip.bitsPerSample = k.bits;
    clip.sampleRate = k.sampleRate ? k.sampleRate : k.rate->sampleRate;
    clip.startTimecode = k.start;
    clip.dropFrame = k.drop;
    AVClipSpec p;
    p.clipXML = avclipHeaderXMLText(clip);
    p.coding = family->longGOP ? AVClipSpec::Coding::AVCLongGOP : AVClipSpec::Coding::AVCIntra;
    p.editRateNum = k.rate->num;
    p.editRateDen = k.rate->den;
    p.frames = k.frames;
    p.audioChannels = k.channels;
    p.bitsPerSample = k.bits;
    p.sampleRate = clip.sampleRate;
    p.frameBytes = family->longGOP ? 160 : 96;
    p.width = 32;
    p.height = 32;
    p.framesPerChunk = k.sampleRate ? 0 : k.rate->framesPerChunk;
    p.gopLength = k.gop;
    // As the card writer counts: 60-frame rates label frame pairs.
    const unsigned rate = unsigned(std::lround(double(k.rate->num) / k.rate->den));
    p.startTimecodeFrames = timecodeLabelToFrames(k.start, rate > 30 ? rate / 2 : rate, k.drop);
    p.dropFrame = k.drop;
    p.seed = k.family;
    gFamilies.push_back(std::move(family));
    const std::string path = gScratch + "/clip.mxf";
    std::string error;
    if (!writeAVClip(path, p, &error)) {
        std::fprintf(stderr, "%s: %s\n", k.family.c_str(), error.c_str());
        std::exit(1);
    }
    return fuzzElideAVClip(readAll(path));
}

std::vector<AVClipCase> avclipCases() {
    std::vector<AVClipCase> cases;
    const std::string families[] = {"avclip-intra", "avclip-strand422", "avclip-strand420"};
    unsigned n = 0;
    for (const std::string& f : families) {
        for (const Rate& r : kRates) {
            AVClipCase k{f, &r, uint64_t(r.framesPerChunk) + 2};
            // Vary the rest with the case's number, so that each family meets
            // every variation at some rate.
            k.channels = n % 3;
            k.bits = n % 2 ? 24 : 16;
            k.gop = n % 3 == 0 ? 3 : n % 3 == 1 ? 6 : 12;
            k.start = n % 4 == 0 ? "00:00:00:00" : n % 4 == 1 ? "01:00:00:00" : n % 4 == 2 ? "00:59:59;20" : "10:00:00:12";
            k.drop = r.den == 1001 && n % 2 == 0 && std::string(r.text) != "23.98p";
            cases.push_back(k);
            ++n;
        }
    }
    // As cards record them: 48 kHz in one chunk, and card metadata.
    cases.push_back({"avclip-intra", &kRates[0], 2, 2, 24, 48000, 6, "01:00:00:00", true, true});
    cases.push_back({"avclip-strand420", &kRates[0], 3, 1, 16, 48000, 3, "00:00:00:00", false, true});
    return cases;
}

// A clip-XML clip written by the card writer, its frames cut to `frameBytes`
// and its audio slowed down; the XML's sizes follow.
struct ClipXMLCase {
    std::string family;
    uint64_t frames;
    uint32_t channels = 1;
    uint32_t sampleRate = 2000;
    std::optional<DVStreamSpec> dv;
    std::optional<std::string> pulldown, vfr;
    std::string start = "00:00:00:00";
    bool metadata = false;
};

ClipXMLCase xmlCase(const std::string& family, uint64_t frames) {
    ClipXMLCase k;
    k.family = family;
    k.frames = frames;
    return k;
}

struct ClipFiles {
    std::string xml;
    std::vector<uint8_t> video;
    std::vector<std::vector<uint8_t>> audio;
};

void replaceFirst(std::string& text, const std::string& from, const std::string& to) {
    const size_t at = text.find(from);
    if (at == std::string::npos) {
        std::fprintf(stderr, "no %s in the clip XML\n", from.c_str());
        std::exit(1);
    }
    text.replace(at, from.size(), to);
}

ClipFiles clipXMLClip(const ClipXMLCase& k) {
    const CardFamily& family = *cardFamilyNamed(k.family);
    ClipSpec clip = clipOf(family, k.frames, k.metadata);
    clip.audioChannels = k.channels;
    clip.bitsPerSample = 16;
    clip.sampleRate = k.sampleRate;
    clip.dv = k.dv;
    clip.pulldown = k.pulldown;
    clip.vfrRatio = k.vfr;
    clip.startTimecode = k.start;
    const std::string root = gScratch + "/card";
    fs::remove_all(root);
    CardSpec card;
    card.root = root;
    card.lastClipFile = false;
    card.clips = {clip};
    std::vector<WrittenClip> written;
    std::string error;
    if (!writeCard(card, &written, &error)) {
        std::fprintf(stderr, "%s: %s\n", k.family.c_str(), error.c_str());
        std::exit(1);
    }
    ClipFiles out;
    const std::vector<uint8_t> xml = readAll(written.front().clipPath);
    out.xml.assign(xml.begin(), xml.end());
    // DV: header, subcode and VAUX blocks of the first DIF sequence. AVC-Intra:
    // the 512-byte essence header and the access unit's first bytes.
    const uint64_t header = family.dv ? 0 : 512;
    const uint64_t cut = family.dv ? 480 : 96;
    const std::vector<uint8_t> video = readAll(root + "/CONTENTS/VIDEO/" + clip.name + ".MXF");
    const uint64_t start = 4096;
    out.video.assign(video.begin(), video.begin() + ptrdiff_t(start + header));
    for (uint64_t i = 0; i < k.frames; ++i) {
        const auto frame = video.begin() + ptrdiff_t(start + header + i * family.frameBytes);
        out.video.insert(out.video.end(), frame, frame + ptrdiff_t(cut));
    }
    replaceFirst(out.xml, "<DataSize>" + std::to_string(header + uint64_t(family.frameBytes) * k.frames) + "</DataSize>",
                 "<DataSize>" + std::to_string(header + cut * k.frames) + "</DataSize>");
    for (uint32_t ch = 0; ch < k.channels; ++ch) {
        char name[32];
        std::snprintf(name, sizeof name, "%s%.2u.MXF", clip.name.c_str(), ch);
        out.audio.push_back(readAll(root + "/CONTENTS/AUDIO/" + name));
    }
    return out;
}

std::vector<ClipXMLCase> clipXMLCases() {
    std::vector<ClipXMLCase> cases;
    unsigned n = 0;
    for (const CardFamily& f : cardFamilies()) {
        if (f.avclip) continue;
        ClipXMLCase k = xmlCase(f.name, 3 + n % 3);
        k.channels = n % 3 == 2 ? 2 : n % 3;
        k.start = n % 2 ? "01:00:00:00" : "00:00:00:00";
        cases.push_back(k);
        ++n;
    }
    auto cadence = [](const std::string& family, DVCadence c, unsigned phase, uint64_t frames, int shoot = 0) {
        ClipXMLCase k = xmlCase(family, frames);
        DVStreamSpec dv;
        dv.cadence = c;
        dv.cadencePhase = phase;
        dv.shootingRate = shoot;
        k.dv = dv;
        return k;
    };
    for (unsigned phase = 0; phase < 5; ++phase) {
        cases.push_back(cadence("dv-ntsc", DVCadence::TwentyFourInThirty, phase, 7));
        cases.push_back(cadence("dvcpro50-ntsc", DVCadence::TwentyFourInThirty, phase, 6));
        cases.push_back(cadence("dvcprohd-720p60", DVCadence::TwentyFourInSixty, phase, 7));
    }
    cases.push_back(cadence("dvcprohd-720p60", DVCadence::HalfRate, 0, 5));
    cases.push_back(cadence("dvcprohd-720p60", DVCadence::HalfRate, 1, 5));
    cases.push_back(cadence("dvcprohd-720p50", DVCadence::HalfRate, 1, 5));
    ClipXMLCase pulldown = xmlCase("dvcprohd-720p60", 6);
    pulldown.pulldown = "2:3";
    pulldown.vfr = "60/24";
    cases.push_back(pulldown);
    ClipXMLCase withMetadata = xmlCase("dvcpro50-ntsc", 3);
    withMetadata.channels = 2;
    withMetadata.sampleRate = 48000;
    withMetadata.metadata = true;
    cases.push_back(withMetadata);
    return cases;
}

// The ingest harness's control byte: the host's defaults mostly, its other
// choices now and then.
uint8_t control(unsigned n) { return n % 5 == 4 ? uint8_t(n * 37) : 0; }

}  // namespace

int main(int argc, char** argv) {
    if (argc != 2) {
        std::fprintf(stderr, "usage: skarn-fuzz-seeds OUT\n");
        return 2;
    }
    gOut = argv[1];
    gScratch = gOut + "/scratch";
    fs::create_directories(gScratch);

    unsigned n = 0;
    for (const AVClipCase& k : avclipCases()) {
        const std::vector<uint8_t> file = avclip(k);
        const std::string name = k.family + "-" + k.rate->text + "-" + std::to_string(n);
        write("FormatReaderFuzz", name, fuzzJoinOperations(file, operations(n, 320)));
        write("IngestFuzz", name, fuzzJoinParts({{control(n)}, {}, file}));
        ++n;
    }
    for (const ClipXMLCase& k : clipXMLCases()) {
        ClipFiles files = clipXMLClip(k);
        const std::string name = k.family + "-xml-" + std::to_string(n);
        write("FormatReaderFuzz", name, fuzzJoinOperations(bytesOf(files.xml), operations(n, 320)));
        std::vector<std::vector<uint8_t>> parts = {{control(n)}, bytesOf(files.xml), files.video};
        for (auto& a : files.audio) parts.push_back(a);
        write("IngestFuzz", name, fuzzJoinParts(parts));
        ++n;
    }
    fs::remove_all(gScratch);
    return 0;
}
