#include "HostileCards.h"

#include "AVClipWriter.h"
#include "ByteReader.h"
#include "CardWriter.h"
#include "FileSystem.h"
#include "MXFWriter.h"

#include <pugixml.hpp>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <functional>
#include <sstream>
#include <stdexcept>
#include <sys/stat.h>
#include <unistd.h>

namespace {

[[noreturn]] void fail(const std::string& why) { throw std::runtime_error(why); }

// ---- Finding structures in a written file ---------------------------------

// One KLV as it lies in the file.
struct KLVSpot {
    MXFKey key{};
    uint64_t at = 0;      // key offset
    uint64_t value = 0;   // value offset
    uint64_t length = 0;
    size_t lengthSize = 0;  // bytes of the BER length field
    uint64_t end() const { return value + length; }
};

// KLVs one after the other from `from`, up to the first that does not fit.
std::vector<KLVSpot> klvsFrom(const std::vector<uint8_t>& b, uint64_t from) {
    std::vector<KLVSpot> out;
    for (uint64_t at = from; at + 17 <= b.size();) {
        ByteReader r(b.data() + at, size_t(b.size() - at));
        KLVSpot k;
        k.at = at;
        std::memcpy(k.key.data(), b.data() + at, 16);
        r.skip(16);
        const uint8_t first = r.u8();
        if (first < 0x80) {
            k.length = first;
            k.lengthSize = 1;
        } else {
            const size_t n = first & 0x7f;
            k.length = r.uN(n);
            k.lengthSize = 1 + n;
        }
        if (!r.ok() || k.length > b.size()) break;
        k.value = at + 16 + k.lengthSize;
        if (k.end() > b.size()) break;
        out.push_back(k);
        at = k.end();
    }
    return out;
}

// Keys match but for byte 7, the registry version, which writers vary.
bool sameKey(const MXFKey& a, const MXFKey& b, size_t bytes = 16) {
    for (size_t i = 0; i < bytes; ++i)
        if (i != 7 && a[i] != b[i]) return false;
    return true;
}
bool isPartitionPack(const MXFKey& k) { return sameKey(k, MXFKeys::headerPartitionClosedComplete, 13); }
bool isFooter(const MXFKey& k) { return isPartitionPack(k) && k[13] == 0x04; }
bool isEssenceElement(const MXFKey& k) {
    static const uint8_t prefix[12] = {0x06, 0x0e, 0x2b, 0x34, 0x01, 0x02, 0x01, 0x01, 0x0d, 0x01, 0x03, 0x01};
    return std::equal(prefix, prefix + 12, k.begin());
}

const KLVSpot& first(const std::vector<KLVSpot>& klvs, const std::function<bool(const KLVSpot&)>& match,
                     const char* what) {
    for (const auto& k : klvs)
        if (match(k)) return k;
    fail(std::string("no ") + what + " found in the written file");
}

// Where a clip-wrapped essence file keeps its parts.
struct ClipWrappedFile {
    std::vector<KLVSpot> klvs;
    KLVSpot headerPack, primer, headerSet, essence, footer, rip;
    uint64_t size = 0;
};

ClipWrappedFile clipWrappedFile(const std::vector<uint8_t>& b) {
    ClipWrappedFile f;
    f.size = b.size();
    f.klvs = klvsFrom(b, 0);
    if (f.klvs.size() < 6) fail("a clip-wrapped file with too few KLVs");
    f.headerPack = f.klvs[0];
    f.primer = f.klvs[1];
    f.headerSet = f.klvs[3];
    f.essence = first(f.klvs, [](const KLVSpot& k) { return isEssenceElement(k.key); }, "essence element");
    f.footer = first(f.klvs, [](const KLVSpot& k) { return isFooter(k.key); }, "footer partition");
    f.rip = first(f.klvs, [](const KLVSpot& k) { return sameKey(k.key, MXFKeys::randomIndexPack); }, "RIP");
    return f;
}

// An index table segment and its entry array.
struct IndexSegment {
    KLVSpot klv;
    uint64_t field(uint16_t tag, const std::vector<uint8_t>& b) const {
        ByteReader r(b.data() + klv.value, size_t(klv.length));
        while (r.remaining() >= 4) {
            const uint16_t t = r.u16(), n = r.u16();
            if (t == tag) return klv.value + r.position();
            r.skip(n);
        }
        fail("index segment without local tag " + std::to_string(tag));
    }
};

IndexSegment indexSegmentAfter(const std::vector<uint8_t>& b, uint64_t partition) {
    std::vector<KLVSpot> klvs = klvsFrom(b, partition);
    return {first(klvs, [](const KLVSpot& k) { return sameKey(k.key, MXFKeys::indexTableSegment); },
                  "index table segment")};
}

// ---- Changing files in place (holes stay holes) ---------------------------

std::vector<uint8_t> readBytes(const std::string& path) {
    auto bytes = FileSystem::readFile(path);
    if (!bytes) fail(path + ": cannot read back");
    return *bytes;
}

void patch(const std::string& path, uint64_t at, const std::vector<uint8_t>& bytes) {
    int fd = ::open(path.c_str(), O_WRONLY | O_CLOEXEC);
    if (fd < 0) fail(path + ": cannot open to damage: " + std::strerror(errno));
    const ssize_t n = ::pwrite(fd, bytes.data(), bytes.size(), off_t(at));
    ::close(fd);
    if (n != ssize_t(bytes.size())) fail(path + ": cannot damage");
}

void patchBE64(const std::string& path, uint64_t at, uint64_t v) {
    std::vector<uint8_t> b(8);
    storeBE64(b.data(), v);
    patch(path, at, b);
}

void patchBE32(const std::string& path, uint64_t at, uint32_t v) {
    std::vector<uint8_t> b(4);
    storeBE32(b.data(), v);
    patch(path, at, b);
}

void flipBit(const std::string& path, uint64_t at, unsigned bit) {
    std::vector<uint8_t> b = readBytes(path);
    if (at >= b.size()) fail(path + ": flip past the end");
    patch(path, at, {uint8_t(b[size_t(at)] ^ (1u << bit))});
}

void truncateTo(const std::string& path, uint64_t size) {
    if (::truncate(path.c_str(), off_t(size)) != 0) fail(path + ": cannot truncate: " + std::strerror(errno));
}

void replaceWith(const std::string& path, const std::function<int(const char*)>& make, const char* what) {
    if (::unlink(path.c_str()) != 0 && errno != ENOENT) fail(path + ": cannot remove: " + std::strerror(errno));
    if (make(path.c_str()) != 0) fail(path + ": cannot make " + what + ": " + std::strerror(errno));
}

void writeText(const std::string& path, const std::string& text) {
    int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    if (fd < 0) fail(path + ": cannot create: " + std::strerror(errno));
    const ssize_t n = ::write(fd, text.data(), text.size());
    ::close(fd);
    if (n != ssize_t(text.size())) fail(path + ": cannot write");
}

// ---- Clip XML edits -------------------------------------------------------

// Indented as the writer writes them, unless deep nesting would make the
// indentation alone grow with the square of the depth.
std::string docText(const pugi::xml_document& doc, bool raw = false) {
    std::ostringstream s;
    doc.save(s, "  ", raw ? pugi::format_raw : pugi::format_default, pugi::encoding_utf8);
    return s.str();
}

// Sets every node or attribute an XPath expression selects (clip documents
// use a default namespace, which pugixml leaves out of element names).
void setAll(pugi::xml_document& doc, const std::string& xpath, const std::string& value) {
    pugi::xpath_node_set nodes = doc.select_nodes(xpath.c_str());
    if (nodes.empty()) fail("clip XML has no " + xpath);
    for (const auto& n : nodes) {
        if (n.attribute()) n.attribute().set_value(value.c_str());
        else n.node().text().set(value.c_str());
    }
}

std::string editedXML(const std::string& text, const std::function<void(pugi::xml_document&)>& edit) {
    pugi::xml_document doc;
    if (!doc.load_string(text.c_str(), pugi::parse_default | pugi::parse_declaration)) fail("unparsable clip XML");
    edit(doc);
    size_t depth = 0;
    for (pugi::xml_node n = doc.document_element(); n; n = n.last_child()) ++depth;
    return docText(doc, depth > 100);
}

// ---- Base clips and cards -------------------------------------------------

enum class Base { DV, AVCI, Intra, Strand };

ClipSpec baseClip(Base base, const std::string& name, unsigned index = 1) {
    static const char* families[] = {"dv-ntsc", "avci-720p24", "avclip-intra", "avclip-strand422"};
    ClipSpec c = defaultClip(*cardFamilyNamed(families[int(base)]), index);
    c.name = name;
    // Whole five-frame audio sequences at 29.97: the clip's audio duration is
    // then the same whichever way a reader rounds.
    c.frames = c.family->avclip ? 10 : 3;
    c.audioChannels = 2;
    return c;
}

// What writeCard hands a self-contained clip, in chunks of five frames (the
// fewest that hold whole audio samples at 29.97) so a short clip has several, and
// with small pictures to keep the set small.
AVClipSpec avclipParams(const ClipSpec& clip, const std::string& headerXML) {
    const CardFamily& f = *clip.family;
    AVClipSpec p;
    p.clipXML = headerXML;
    p.coding = f.longGOP ? AVClipSpec::Coding::AVCLongGOP : AVClipSpec::Coding::AVCIntra;
    p.editRateNum = f.editRateNum;
    p.editRateDen = f.editRateDen;
    p.frames = clip.frames;
    p.audioChannels = clip.audioChannels;
    p.bitsPerSample = clip.bitsPerSample;
    p.sampleRate = clip.sampleRate;
    p.frameBytes = 60000;
    const bool drop = clip.dropFrame.value_or(f.editRateDen == 1001);
    p.startTimecodeFrames = timecodeLabelToFrames(clip.startTimecode, 30, drop);
    p.dropFrame = drop;
    p.seed = clip.name;
    p.framesPerChunk = 5;
    return p;
}

struct Card {
    std::string root;
    std::vector<ClipSpec> clipLayouts;
    std::vector<WrittenClip> clips;
    std::vector<AVClipLayout> layouts;  // per clip; empty for clip-XML clips
    std::vector<std::string> damaged;

    std::string contents() const { return root + "/CONTENTS"; }
    std::string clipXML(size_t i = 0) const { return contents() + "/CLIP/" + clips[i].name + ".XML"; }
    std::string video(size_t i = 0) const {
        return contents() + (clipLayouts[i].family->avclip ? "/AVCLIP/" : "/VIDEO/") + clips[i].name + ".MXF";
    }
    std::string audio(size_t i = 0, unsigned channel = 0) const {
        char n[8];
        std::snprintf(n, sizeof n, "%.2u", channel);
        return contents() + "/AUDIO/" + clips[i].name + n + ".MXF";
    }
    std::string icon(size_t i = 0) const { return contents() + "/ICON/" + clips[i].name + ".BMP"; }

    // Rewrites a self-contained clip with its header XML edited.
    void rewriteAVClip(size_t i, const std::function<void(pugi::xml_document&)>& edit) {
        std::string error;
        const std::string xml = edit ? editedXML(avclipHeaderXMLText(clipLayouts[i]), edit) : avclipHeaderXMLText(clipLayouts[i]);
        if (!writeAVClip(video(i), avclipParams(clipLayouts[i], xml), &error, &layouts[i])) fail(error);
    }
    void editClipXML(size_t i, const std::function<void(pugi::xml_document&)>& edit) {
        const std::vector<uint8_t> b = readBytes(clipXML(i));
        writeText(clipXML(i), editedXML(std::string(b.begin(), b.end()), edit));
    }
};

using Damage = std::function<void(Card&)>;

class Writer {
public:
    Writer(std::string dir, HostileCardFilter filter, std::vector<HostileCard>* out)
        : _dir(std::move(dir)), _filter(std::move(filter)), _out(out) {}

    void add(const std::string& fault, const std::string& description, std::vector<ClipSpec> clips,
             const Damage& damage) {
        if (!_filter(_index++, fault)) return;
        Card card;
        card.root = _dir + "/" + fault;
        if (FileSystem::fileExists(card.root) && !FileSystem::removeItem(card.root))
            fail(card.root + ": cannot replace the earlier card");
        CardSpec layout;
        layout.root = card.root;
        layout.clips = clips;
        std::string error;
        if (!writeCard(layout, &card.clips, &error)) fail(error);
        card.clipLayouts = clips;
        card.layouts.resize(clips.size());
        for (size_t i = 0; i < clips.size(); ++i)
            if (clips[i].family->avclip) card.rewriteAVClip(i, nullptr);
        damage(card);
        HostileCard h;
        h.fault = fault;
        h.description = description;
        h.root = card.root;
        for (const auto& c : card.clips) h.clips.push_back({c.name, c.clipPath});
        h.damaged = card.damaged;
        if (_out) _out->push_back(std::move(h));
    }
    void add(const std::string& fault, const std::string& description, Base base, const Damage& damage) {
        add(fault, description, std::vector<ClipSpec>{baseClip(base, "A001")}, damage);
    }

private:
    std::string _dir;
    HostileCardFilter _filter;
    size_t _index = 0;
    std::vector<HostileCard>* _out;
};

const char* baseName(Base b) {
    static const char* names[] = {"dv", "avci", "avclip-intra", "avclip-strand"};
    return names[int(b)];
}

// ---- Faults ---------------------------------------------------------------

struct Point {
    std::string name;
    std::function<uint64_t(const std::vector<uint8_t>&)> offset;
};

std::vector<Point> clipWrappedTruncations() {
    auto cw = [](const std::vector<uint8_t>& b) { return clipWrappedFile(b); };
    return {
        {"in-partition-pack-key", [](const auto&) { return uint64_t(8); }},
        {"in-partition-pack", [=](const auto& b) { auto f = cw(b); return f.headerPack.value + f.headerPack.length / 2; }},
        {"after-partition-pack", [=](const auto& b) { return cw(b).headerPack.end(); }},
        {"in-primer-pack", [=](const auto& b) { return cw(b).primer.value + 10; }},
        {"in-header-metadata", [=](const auto& b) { return cw(b).headerSet.value + 6; }},
        {"after-header-metadata", [=](const auto& b) { return cw(b).essence.at; }},
        {"in-essence-length", [=](const auto& b) { return cw(b).essence.at + 18; }},
        {"in-first-frame", [=](const auto& b) { auto f = cw(b); return f.essence.value + std::min<uint64_t>(100, f.essence.length / 2); }},
        {"in-last-frame", [=](const auto& b) { return cw(b).essence.end() - 7; }},
        {"after-essence", [=](const auto& b) { return cw(b).footer.at; }},
        {"in-footer-partition-pack", [=](const auto& b) { return cw(b).footer.value + 40; }},
        {"in-rip", [=](const auto& b) { return cw(b).rip.value + 6; }},
        {"rip-last-byte", [](const auto& b) { return uint64_t(b.size() - 1); }},
    };
}

std::vector<Point> avclipTruncations(const Card& card) {
    const AVClipLayout l = card.layouts[0];
    auto header = [](const std::vector<uint8_t>& b) { return klvsFrom(b, 0); };
    auto rip = [l](const std::vector<uint8_t>& b) { return klvsFrom(b, l.footerPartition).at(1); };
    return {
        {"in-partition-pack-key", [](const auto&) { return uint64_t(8); }},
        {"in-partition-pack", [](const auto&) { return uint64_t(80); }},
        {"in-header-metadata", [=](const auto& b) { return header(b).at(4).value + 6; }},
        {"in-xml-carrier", [](const auto&) { return kAVClipXMLCarrierOffset + 60; }},
        {"after-header", [=](const auto&) { return l.chunks[0].videoPartition; }},
        {"in-body-partition-pack", [=](const auto&) { return l.chunks[0].videoPartition + 60; }},
        {"in-frame", [=](const auto&) { return l.frames[1].offset + l.frames[1].size / 2; }},
        {"in-index-segment", [=](const auto& b) { return indexSegmentAfter(b, l.chunks[0].videoIndexPartition).klv.value + 30; }},
        {"in-index-entries", [=](const auto& b) { return indexSegmentAfter(b, l.chunks[0].videoIndexPartition).field(0x3f0a, b) + 8 + 11 + 5; }},
        {"in-sound-element", [=](const auto&) { return l.chunks[0].audioBlock[0] + 10; }},
        {"in-last-chunk", [=](const auto&) { return l.chunks.back().videoPartition + 300; }},
        {"after-essence", [=](const auto&) { return l.footerPartition; }},
        {"in-footer-partition-pack", [=](const auto&) { return l.footerPartition + 60; }},
        {"in-rip", [=](const auto& b) { return rip(b).value + 6; }},
        {"rip-last-byte", [](const auto& b) { return uint64_t(b.size() - 1); }},
    };
}

void addTruncations(Writer& w) {
    struct File {
        Base base;
        const char* name;
        std::function<std::string(const Card&)> path;
    };
    const File files[] = {
        {Base::DV, "dv-video-mxf", [](const Card& c) { return c.video(); }},
        {Base::DV, "dv-audio-mxf", [](const Card& c) { return c.audio(0, 1); }},
        {Base::AVCI, "avci-video-mxf", [](const Card& c) { return c.video(); }},
        {Base::AVCI, "avci-audio-mxf", [](const Card& c) { return c.audio(); }},
    };
    for (const File& f : files) {
        for (const Point& p : clipWrappedTruncations()) {
            w.add(std::string("truncated-") + f.name + "-" + p.name,
                  std::string("the ") + f.name + " ends " + p.name, f.base, [&](Card& c) {
                      const std::string path = f.path(c);
                      truncateTo(path, p.offset(readBytes(path)));
                      c.damaged.push_back(path);
                  });
        }
        w.add(std::string("empty-") + f.name, std::string("the ") + f.name + " has zero bytes", f.base, [&](Card& c) {
            truncateTo(f.path(c), 0);
            c.damaged.push_back(f.path(c));
        });
    }
    for (Base base : {Base::Intra, Base::Strand}) {
        // The points depend on the layout, known once the card is written.
        const std::string kind = std::string(baseName(base)) + "-mxf";
        static const char* names[] = {"in-partition-pack-key", "in-partition-pack", "in-header-metadata",
                                      "in-xml-carrier", "after-header", "in-body-partition-pack", "in-frame",
                                      "in-index-segment", "in-index-entries", "in-sound-element", "in-last-chunk",
                                      "after-essence", "in-footer-partition-pack", "in-rip", "rip-last-byte"};
        for (size_t i = 0; i < std::size(names); ++i) {
            w.add("truncated-" + kind + "-" + names[i], "the self-contained clip ends " + std::string(names[i]), base,
                  [i](Card& c) {
                      const Point p = avclipTruncations(c).at(i);
                      truncateTo(c.video(), p.offset(readBytes(c.video())));
                      c.damaged.push_back(c.video());
                  });
        }
        w.add("empty-" + kind, "the self-contained clip has zero bytes", base, [](Card& c) {
            truncateTo(c.video(), 0);
            c.damaged.push_back(c.video());
        });
    }
}

// Lengths of KLVs: a flipped top bit of the first length byte (8 MiB past the
// end), a BER length field that claims 15 bytes, and all length bytes set.
void addKLVLengthFaults(Writer& w) {
    enum class How { Flip, BERSize, AllOnes };
    struct Target {
        const char* name;
        Base base;
        How how;
        std::function<std::pair<std::string, KLVSpot>(const Card&)> find;
    };
    auto cwIn = [](std::function<std::string(const Card&)> path, std::function<KLVSpot(const ClipWrappedFile&)> pick) {
        return [=](const Card& c) {
            const std::string p = path(c);
            return std::make_pair(p, pick(clipWrappedFile(readBytes(p))));
        };
    };
    auto video = [](const Card& c) { return c.video(); };
    auto audio = [](const Card& c) { return c.audio(); };
    auto avclip = [](std::function<KLVSpot(const Card&, const std::vector<uint8_t>&)> pick) {
        return [=](const Card& c) {
            const std::vector<uint8_t> b = readBytes(c.video());
            return std::make_pair(c.video(), pick(c, b));
        };
    };
    const Target targets[] = {
        {"dv-video-mxf-partition-pack", Base::DV, How::Flip, cwIn(video, [](const auto& f) { return f.headerPack; })},
        {"dv-video-mxf-header-set", Base::DV, How::Flip, cwIn(video, [](const auto& f) { return f.headerSet; })},
        {"dv-video-mxf-essence", Base::DV, How::Flip, cwIn(video, [](const auto& f) { return f.essence; })},
        {"dv-video-mxf-rip", Base::DV, How::Flip, cwIn(video, [](const auto& f) { return f.rip; })},
        {"dv-video-mxf-essence", Base::DV, How::BERSize, cwIn(video, [](const auto& f) { return f.essence; })},
        {"dv-audio-mxf-primer-pack", Base::DV, How::AllOnes, cwIn(audio, [](const auto& f) { return f.primer; })},
        {"avci-audio-mxf-essence", Base::AVCI, How::Flip, cwIn(audio, [](const auto& f) { return f.essence; })},
        {"avci-audio-mxf-footer", Base::AVCI, How::Flip, cwIn(audio, [](const auto& f) { return f.footer; })},
        {"avci-video-mxf-essence", Base::AVCI, How::AllOnes, cwIn(video, [](const auto& f) { return f.essence; })},
        {"avclip-intra-mxf-body-partition-pack", Base::Intra, How::Flip,
         avclip([](const Card& c, const auto& b) { return klvsFrom(b, c.layouts[0].chunks[0].videoPartition).at(0); })},
        {"avclip-intra-mxf-index-segment", Base::Intra, How::Flip,
         avclip([](const Card& c, const auto& b) { return indexSegmentAfter(b, c.layouts[0].chunks[0].videoIndexPartition).klv; })},
        {"avclip-intra-mxf-index-segment", Base::Intra, How::BERSize,
         avclip([](const Card& c, const auto& b) { return indexSegmentAfter(b, c.layouts[0].chunks[1].audioIndexPartition[1]).klv; })},
        {"avclip-intra-mxf-picture-element", Base::Intra, How::Flip,
         avclip([](const Card& c, const auto& b) { return klvsFrom(b, c.layouts[0].frames[2].offset - 20).at(0); })},
        {"avclip-intra-mxf-picture-element", Base::Intra, How::AllOnes,
         avclip([](const Card& c, const auto& b) { return klvsFrom(b, c.layouts[0].frames[0].offset - 20).at(0); })},
        {"avclip-intra-mxf-sound-element", Base::Intra, How::Flip,
         avclip([](const Card& c, const auto& b) { return klvsFrom(b, c.layouts[0].chunks[0].audioBlock[1] - 20).at(0); })},
        {"avclip-intra-mxf-xml-carrier", Base::Intra, How::Flip,
         avclip([](const Card&, const auto& b) { return klvsFrom(b, kAVClipXMLCarrierOffset).at(0); })},
        {"avclip-intra-mxf-rip", Base::Intra, How::Flip,
         avclip([](const Card& c, const auto& b) { return klvsFrom(b, c.layouts[0].footerPartition).at(1); })},
        {"avclip-strand-mxf-index-segment", Base::Strand, How::Flip,
         avclip([](const Card& c, const auto& b) { return indexSegmentAfter(b, c.layouts[0].chunks[1].videoIndexPartition).klv; })},
        {"avclip-strand-mxf-picture-element", Base::Strand, How::Flip,
         avclip([](const Card& c, const auto& b) { return klvsFrom(b, c.layouts[0].frames[1].offset - 20).at(0); })},
    };
    for (const Target& t : targets) {
        const char* how = t.how == How::Flip ? "klv-length-bit-flip-" : t.how == How::BERSize ? "klv-ber-size-15-" : "klv-length-all-ones-";
        w.add(how + std::string(t.name), std::string("a damaged KLV length in the ") + t.name, t.base, [&](Card& c) {
            const auto [path, klv] = t.find(c);
            if (klv.lengthSize != 4) fail(path + ": a KLV length not in the 4-byte form");
            if (t.how == How::Flip) flipBit(path, klv.at + 17, 7);
            else if (t.how == How::BERSize) patch(path, klv.at + 16, {0x8f});
            else patch(path, klv.at + 17, {0xff, 0xff, 0xff});
            c.damaged.push_back(path);
        });
    }
}

// Index entries, index segment fields, partition pack and RIP offsets.
void addOffsetFaults(Writer& w) {
    struct Fault {
        const char* name;
        const char* description;
        Base base;
        std::function<void(const Card&, const std::string&, const std::vector<uint8_t>&)> damage;
    };
    auto videoSegment = [](const Card& c, const std::vector<uint8_t>& b, size_t chunk = 0) {
        return indexSegmentAfter(b, c.layouts[0].chunks[chunk].videoIndexPartition);
    };
    auto entry = [=](const Card& c, const std::vector<uint8_t>& b, size_t n) {
        return videoSegment(c, b).field(0x3f0a, b) + 8 + 11 * n;
    };
    const uint64_t farAway = 1ull << 40;
    const Fault faults[] = {
        {"index-entry-past-end-avclip-intra", "the second frame's index entry points 1 TiB into the file", Base::Intra,
         [=](const Card& c, const std::string& p, const auto& b) { patchBE64(p, entry(c, b, 1) + 3, farAway); }},
        {"index-entry-just-past-end-avclip-strand", "the last frame's index entry points at the file's end", Base::Strand,
         [=](const Card& c, const std::string& p, const auto& b) {
             const uint64_t stream = loadBE64(&b[size_t(entry(c, b, 4) + 3)]);
             patchBE64(p, entry(c, b, 4) + 3, stream + b.size());
         }},
        {"index-entry-wraps-avclip-intra", "an index entry near 2^64, so adding to it wraps", Base::Intra,
         [=](const Card& c, const std::string& p, const auto& b) { patchBE64(p, entry(c, b, 2) + 3, ~0ull - 15); }},
        {"index-entry-bit-flip-avclip-strand", "bit 20 of the second entry's stream offset flipped", Base::Strand,
         [=](const Card& c, const std::string& p, const auto& b) { flipBit(p, entry(c, b, 1) + 3 + 5, 4); }},
        {"index-entry-flags-and-offsets-wild-avclip-strand", "temporal offsets of +127/-128 and key frame offsets of -128",
         Base::Strand,
         [=](const Card& c, const std::string& p, const auto& b) {
             for (size_t n = 0; n < 5; ++n) patch(p, entry(c, b, n), {uint8_t(n % 2 ? 0x7f : 0x80), 0x80, 0xff});
         }},
        {"index-entry-count-huge-avclip-intra", "the entry array claims 2^31-1 entries", Base::Intra,
         [=](const Card& c, const std::string& p, const auto& b) { patchBE32(p, videoSegment(c, b).field(0x3f0a, b), 0x7fffffff); }},
        {"index-entry-size-zero-avclip-intra", "the entry array's entries have length 0", Base::Intra,
         [=](const Card& c, const std::string& p, const auto& b) { patchBE32(p, videoSegment(c, b).field(0x3f0a, b) + 4, 0); }},
        {"index-entry-size-huge-avclip-strand", "the entry array's entries have length 2^32-1", Base::Strand,
         [=](const Card& c, const std::string& p, const auto& b) { patchBE32(p, videoSegment(c, b).field(0x3f0a, b) + 4, ~0u); }},
        {"index-duration-huge-avclip-strand", "IndexDuration of 2^63-1", Base::Strand,
         [=](const Card& c, const std::string& p, const auto& b) { patchBE64(p, videoSegment(c, b).field(0x3f0d, b), ~0ull >> 1); }},
        {"index-start-negative-avclip-intra", "the second segment starts at edit unit -1", Base::Intra,
         [=](const Card& c, const std::string& p, const auto& b) { patchBE64(p, videoSegment(c, b, 1).field(0x3f0c, b), ~0ull); }},
        {"index-edit-rate-zero-avclip-intra", "the video index edit rate is 0/0", Base::Intra,
         [=](const Card& c, const std::string& p, const auto& b) { patchBE64(p, videoSegment(c, b).field(0x3f0b, b), 0); }},
        {"index-audio-byte-count-zero-avclip-intra", "every audio segment's EditUnitByteCount is 0", Base::Intra,
         [](const Card& c, const std::string& p, const auto& b) {
             for (const auto& chunk : c.layouts[0].chunks)
                 for (uint64_t at : chunk.audioIndexPartition) patchBE32(p, indexSegmentAfter(b, at).field(0x3f05, b), 0);
         }},
        {"index-audio-byte-count-huge-avclip-intra", "the first audio segment's EditUnitByteCount is 2^32-1", Base::Intra,
         [](const Card& c, const std::string& p, const auto& b) {
             patchBE32(p, indexSegmentAfter(b, c.layouts[0].chunks[0].audioIndexPartition[0]).field(0x3f05, b), ~0u);
         }},
        {"partition-footer-offset-past-end-avclip-intra", "the header partition names a footer 1 TiB in", Base::Intra,
         [=](const Card&, const std::string& p, const auto&) { patchBE64(p, 20 + 24, farAway); }},
        {"partition-previous-loop-avclip-intra", "every partition's PreviousPartition names itself", Base::Intra,
         [](const Card& c, const std::string& p, const auto&) {
             const auto& l = c.layouts[0];
             std::vector<uint64_t> packs = {l.footerPartition};
             for (const auto& ch : l.chunks) {
                 packs.insert(packs.end(), {ch.videoPartition, ch.videoIndexPartition, ch.ancPartition, ch.ancIndexPartition});
                 packs.insert(packs.end(), ch.audioPartition.begin(), ch.audioPartition.end());
                 packs.insert(packs.end(), ch.audioIndexPartition.begin(), ch.audioIndexPartition.end());
             }
             for (uint64_t at : packs) patchBE64(p, at + 20 + 16, at);
         }},
        {"partition-header-byte-count-huge-avclip-intra", "HeaderByteCount of 2^62", Base::Intra,
         [](const Card&, const std::string& p, const auto&) { patchBE64(p, 20 + 32, 1ull << 62); }},
        {"partition-footer-offset-past-end-dv-video-mxf", "the header partition names a footer 1 TiB in", Base::DV,
         [=](const Card&, const std::string& p, const auto&) { patchBE64(p, 20 + 24, farAway); }},
        {"partition-header-byte-count-huge-dv-video-mxf", "HeaderByteCount of 2^62", Base::DV,
         [](const Card&, const std::string& p, const auto&) { patchBE64(p, 20 + 32, 1ull << 62); }},
        {"rip-entries-past-end-dv-video-mxf", "every RIP entry points 1 TiB in", Base::DV,
         [=](const Card&, const std::string& p, const auto& b) {
             const KLVSpot rip = clipWrappedFile(b).rip;
             for (uint64_t at = rip.value; at + 12 <= rip.end() - 4; at += 12) patchBE64(p, at + 4, farAway);
         }},
        {"rip-entries-past-end-avclip-intra", "every RIP entry points 1 TiB in", Base::Intra,
         [](const Card& c, const std::string& p, const auto& b) {
             const KLVSpot rip = klvsFrom(b, c.layouts[0].footerPartition).at(1);
             for (uint64_t at = rip.value; at + 12 <= rip.end() - 4; at += 12) patchBE64(p, at + 4, farAway + at);
         }},
        {"rip-entries-wrap-avclip-strand", "every RIP entry near 2^64", Base::Strand,
         [](const Card& c, const std::string& p, const auto& b) {
             const KLVSpot rip = klvsFrom(b, c.layouts[0].footerPartition).at(1);
             for (uint64_t at = rip.value; at + 12 <= rip.end() - 4; at += 12) patchBE64(p, at + 4, ~0ull - at);
         }},
        {"rip-entries-point-at-rip-avclip-intra", "every RIP entry points at the RIP itself", Base::Intra,
         [](const Card& c, const std::string& p, const auto& b) {
             const KLVSpot rip = klvsFrom(b, c.layouts[0].footerPartition).at(1);
             for (uint64_t at = rip.value; at + 12 <= rip.end() - 4; at += 12) patchBE64(p, at + 4, rip.at);
         }},
        {"rip-overall-length-zero-avclip-intra", "the RIP's trailing length is 0", Base::Intra,
         [](const Card&, const std::string& p, const auto& b) { patchBE32(p, b.size() - 4, 0); }},
        {"rip-overall-length-huge-avclip-strand", "the RIP's trailing length is 2^32-1", Base::Strand,
         [](const Card&, const std::string& p, const auto& b) { patchBE32(p, b.size() - 4, ~0u); }},
        {"rip-overall-length-huge-dv-audio-mxf", "the RIP's trailing length is 2^32-1", Base::DV,
         [](const Card&, const std::string& p, const auto& b) { patchBE32(p, b.size() - 4, ~0u); }},
    };
    for (const Fault& f : faults) {
        w.add(f.name, f.description, f.base, [&](Card& c) {
            const std::string path = std::string(f.name).find("dv-audio") != std::string::npos ? c.audio() : c.video();
            f.damage(c, path, readBytes(path));
            c.damaged.push_back(path);
        });
    }
}

// Hostile values in every numeric clip XML field, one card per field with a
// clip per value: DV clips (D01...) and AVC-Intra clips (H01...), or
// self-contained intra (I01...) and long-GOP (S01...) ones.
struct Values {
    std::vector<std::string> many, few;  // for the first kind of clip, and the second
};

void addXMLValueFaults(Writer& w) {
    const Values numbers = {{"1000000000", "99999999999999999999999", "18446744073709551615", "-1",
                             "-9223372036854775808", "0", "12abc"},
                            {"1000000000", "-1", "12abc"}};
    const Values rationals = {{"1001/0", "0/0", "-1001/30000", "99999999999999999999/1", "1/99999999999999999999",
                               "1001/-1", "x/y"},
                              {"1001/0", "-1001/30000", "x/y"}};
    const Values frameRates = {{"0i", "-59.94i", "1e400p", "nanp", "1000000000p", "", "59.94x"}, {"0p", "-23.98p", "x"}};
    const Values timecodes = {{"99:99:99:99", "-01:00:00:00", "4294967295:00:00:00", "00:00:00:99", "23:59:59;29", "",
                               "xx:yy"},
                              {"99:99:99:99", "-01:00:00:00", ""}};
    const Values dates = {{"99999-99-99T99:99:99+99:99", "-0001-01-01T00:00:00Z", "2026-11-21T09:30:00+99999999999:00",
                           "", "yesterday"},
                          {"99999-99-99T99:99:99+99:99", ""}};
    const Values hex = {{"FFFFFFFFFFFFFFFFFFFFFFFFFFFFFFFF", "ZZZZZZZZ", "", "-1"}, {"ZZZZZZZZ"}};
    struct Field {
        const char* name;
        const char* xpath;
        const Values* values;
        std::function<void(ClipSpec&)> prepare = nullptr;
    };
    auto location = [](ClipSpec& c) {
        c.metadata.altitude = "10";
        c.metadata.latitude = "35.0";
        c.metadata.longitude = "139.0";
        c.metadata.locationSource = "GPS";
    };
    const Field fields[] = {
        {"duration", "//ClipContent/Duration", &numbers},
        {"edit-unit", "//ClipContent/EditUnit", &rationals},
        {"active-line", "//Video/ActiveLine", &numbers},
        {"active-pixel", "//Video/ActivePixel", &numbers},
        {"bit-depth", "//Video/BitDepth", &numbers},
        {"codec-class", "//Video/Codec/@Class", &numbers},
        {"frame-rate", "//Video/FrameRate", &frameRates},
        {"start-timecode", "//Video/StartTimecode", &timecodes},
        {"start-binary-group", "//Video/StartBinaryGroup", &hex},
        {"vfr-ratio", "//Video/VFRRatio", &rationals, [](ClipSpec& c) { c.vfrRatio = "60/24"; }},
        {"video-start-byte-offset", "//VideoIndex/StartByteOffset", &numbers},
        {"video-data-size", "//VideoIndex/DataSize", &numbers},
        {"audio-sampling-rate", "//Audio/SamplingRate", &numbers},
        {"audio-bits-per-sample", "//Audio/BitsPerSample", &numbers},
        {"audio-start-byte-offset", "//AudioIndex/StartByteOffset", &numbers},
        {"audio-data-size", "//AudioIndex/DataSize", &numbers},
        {"memo-id", "//Memo/@MemoID", &numbers},
        {"memo-offset", "//Memo/Offset", &numbers},
        {"offset-in-shot", "//Relation/OffsetInShot", &numbers},
        {"altitude", "//Location/Altitude", &numbers, location},
        {"latitude", "//Location/Latitude", &numbers, location},
        {"longitude", "//Location/Longitude", &numbers, location},
        {"creation-date", "//Access/CreationDate", &dates},
        {"shoot-start-date", "//Shoot/StartDate", &dates},
    };
    for (const Field& f : fields) {
        std::vector<ClipSpec> clips;
        std::vector<std::string> values;
        auto addClips = [&](Base base, const char* prefix, const std::vector<std::string>& vs) {
            for (size_t i = 0; i < vs.size(); ++i) {
                char name[32];
                std::snprintf(name, sizeof name, "%s%02zu", prefix, i + 1);
                ClipSpec c = baseClip(base, name, unsigned(clips.size() + 1));
                c.frames = base == Base::DV ? 2 : 1;
                c.icon = false;
                if (f.prepare) f.prepare(c);
                clips.push_back(c);
                values.push_back(vs[i]);
            }
        };
        addClips(Base::DV, "D", f.values->many);
        addClips(Base::AVCI, "H", f.values->few);
        std::string list;
        for (const auto& v : values) list += (list.empty() ? "\"" : ", \"") + v + "\"";
        w.add(std::string("xml-") + f.name, std::string(f.xpath) + " set to " + list, clips, [&](Card& c) {
            for (size_t i = 0; i < c.clips.size(); ++i) {
                c.editClipXML(i, [&](pugi::xml_document& doc) { setAll(doc, f.xpath, values[i]); });
                c.damaged.push_back(c.clipXML(i));
            }
        });
    }

    // The header XML of self-contained clips, and the companion XML beside a
    // long-GOP one.
    const Values avclipNumbers = {{"1000000000", "99999999999999999999999", "-1", "-9223372036854775808", "0", "12abc"},
                                  {"1000000000", "-1", "0"}};
    const Field headerFields[] = {
        {"duration", "//ClipContent/Duration", &avclipNumbers},
        {"edit-unit", "//ClipContent/EditUnit", &rationals},
        {"frame-rate", "//Video/FrameRate", &frameRates},
        {"start-timecode", "//Video/StartTimecode", &timecodes},
        {"channel-num", "//Audio/ChannelNum", &avclipNumbers},
        {"sampling-rate", "//Audio/SamplingRate", &avclipNumbers},
        {"bits-per-sample", "//Audio/BitsPerSample", &avclipNumbers},
    };
    for (const Field& f : headerFields) {
        std::vector<ClipSpec> clips;
        std::vector<std::string> values;
        for (size_t i = 0; i < f.values->many.size() + f.values->few.size(); ++i) {
            const bool strand = i >= f.values->many.size();
            char name[32];
            std::snprintf(name, sizeof name, "%s%02zu", strand ? "S" : "I", i + 1);
            clips.push_back(baseClip(strand ? Base::Strand : Base::Intra, name, unsigned(i + 1)));
            values.push_back(strand ? f.values->few[i - f.values->many.size()] : f.values->many[i]);
        }
        w.add(std::string("xml-avclip-header-") + f.name, std::string(f.xpath) + " of the header XML (and a companion's)",
              clips, [&](Card& c) {
                  for (size_t i = 0; i < c.clips.size(); ++i) {
                      auto edit = [&](pugi::xml_document& doc) { setAll(doc, f.xpath, values[i]); };
                      c.rewriteAVClip(i, edit);
                      c.damaged.push_back(c.video(i));
                      // The companion XML has no ChannelNum: its Audio elements are the count.
                      if (c.clipLayouts[i].family->companionXML && std::string(f.name) != "channel-num") {
                          c.editClipXML(i, edit);
                          c.damaged.push_back(c.clipXML(i));
                      }
                  }
              });
    }
}

// Clip documents that are not what they claim: deep, expanding, broken, huge.
void addXMLDocumentFaults(Writer& w) {
    auto replaceXML = [](std::function<std::string(const std::string&)> make) {
        return [make](Card& c) {
            const std::vector<uint8_t> b = readBytes(c.clipXML());
            writeText(c.clipXML(), make(std::string(b.begin(), b.end())));
            c.damaged.push_back(c.clipXML());
        };
    };
    auto insertIntoMetadata = [](const std::string& xml, const std::string& what) {
        const size_t at = xml.find("<ClipMetadata>");
        if (at == std::string::npos) fail("clip XML without ClipMetadata");
        return xml.substr(0, at + 14) + what + xml.substr(at + 14);
    };
    w.add("xml-deeply-nested", "a million nested elements inside ClipMetadata", Base::DV,
          replaceXML([=](const std::string& xml) {
              const size_t depth = 1000000;
              std::string nest;
              nest.reserve(depth * 7);
              for (size_t i = 0; i < depth; ++i) nest += "<a>";
              for (size_t i = 0; i < depth; ++i) nest += "</a>";
              return insertIntoMetadata(xml, nest);
          }));
    w.add("xml-deeply-nested-avclip-header", "ten thousand nested elements in the header XML", Base::Intra,
          [](Card& c) {
              c.rewriteAVClip(0, [](pugi::xml_document& doc) {
                  pugi::xml_node n = doc.document_element().child("ClipContent");
                  for (int i = 0; i < 10000; ++i) n = n.append_child("a");
              });
              c.damaged.push_back(c.video());
          });
    w.add("xml-entity-expansion", "a document type with nested entities (a billion laughs)", Base::DV,
          replaceXML([=](const std::string& xml) {
              std::string dtd = "<!DOCTYPE SkarnClip [\n<!ENTITY l0 \"ha\">\n";
              for (int i = 1; i < 10; ++i) {
                  dtd += "<!ENTITY l" + std::to_string(i) + " \"";
                  for (int k = 0; k < 10; ++k) dtd += "&l" + std::to_string(i - 1) + ";";
                  dtd += "\">\n";
              }
              dtd += "]>\n";
              const size_t root = xml.find("<SkarnClip");
              std::string out = xml.substr(0, root) + dtd + xml.substr(root);
              const size_t name = out.find("<UserClipName>");
              return out.substr(0, name + 14) + "&l9;" + out.substr(name + 14);
          }));
    w.add("xml-truncated", "the clip XML stops half way", Base::DV,
          replaceXML([](const std::string& xml) { return xml.substr(0, xml.size() / 2); }));
    w.add("xml-binary-garbage", "the clip XML is binary noise with NUL bytes", Base::DV,
          replaceXML([](const std::string& xml) {
              std::string s(xml.size(), '\0');
              uint32_t x = 2463534242u;
              for (char& ch : s) {
                  x ^= x << 13, x ^= x >> 17, x ^= x << 5;
                  ch = char(x & 0xff);
              }
              return s;
          }));
    w.add("xml-wrong-root", "a well-formed document of another kind", Base::DV,
          replaceXML([](const std::string&) { return std::string("<?xml version=\"1.0\"?><html><body/></html>\n"); }));
    w.add("xml-every-leaf-empty", "every element's text removed", Base::DV, [](Card& c) {
        c.editClipXML(0, [](pugi::xml_document& doc) {
            for (const auto& n : doc.select_nodes("//*[not(*)]")) n.node().text().set("");
        });
        c.damaged.push_back(c.clipXML());
    });
    w.add("xml-audio-elements-none", "no Audio element although audio files are there", Base::DV, [](Card& c) {
        c.editClipXML(0, [](pugi::xml_document& doc) {
            for (const auto& n : doc.select_nodes("//EssenceList/Audio")) n.parent().remove_child(n.node());
        });
        c.damaged.push_back(c.clipXML());
    });
    w.add("xml-audio-elements-5000", "five thousand Audio elements for two files", Base::DV, [](Card& c) {
        c.editClipXML(0, [](pugi::xml_document& doc) {
            pugi::xml_node audio = doc.select_node("//EssenceList/Audio").node();
            for (int i = 0; i < 4998; ++i) audio.parent().append_copy(audio);
        });
        c.damaged.push_back(c.clipXML());
    });
    w.add("xml-huge-200mb", "a 200 MB clip XML (a long comment in ClipMetadata)", Base::DV, [](Card& c) {
        const std::vector<uint8_t> b = readBytes(c.clipXML());
        const std::string xml(b.begin(), b.end());
        const size_t at = xml.find("<ClipMetadata>") + 14;
        int fd = ::open(c.clipXML().c_str(), O_WRONLY | O_TRUNC | O_CLOEXEC);
        if (fd < 0) fail(c.clipXML() + ": cannot rewrite");
        std::string block(1 << 20, 'x');
        block.front() = '\n';
        bool ok = ::write(fd, xml.data(), at + 0) == ssize_t(at) && ::write(fd, "<!--", 4) == 4;
        for (int i = 0; ok && i < 200; ++i) ok = ::write(fd, block.data(), block.size()) == ssize_t(block.size());
        ok = ok && ::write(fd, "-->", 3) == 3 && ::write(fd, xml.data() + at, xml.size() - at) == ssize_t(xml.size() - at);
        ::close(fd);
        if (!ok) fail(c.clipXML() + ": cannot write 200 MB");
        c.damaged.push_back(c.clipXML());
    });
}

// Things a card file cannot be read as: FIFOs, devices, loops, folders,
// unreadable and missing files.
void addFileKindFaults(Writer& w) {
    struct Where {
        const char* name;
        Base base;
        std::function<std::string(const Card&)> path;
    };
    const Where places[] = {
        {"dv-video-mxf", Base::DV, [](const Card& c) { return c.video(); }},
        {"dv-audio-mxf", Base::DV, [](const Card& c) { return c.audio(0, 1); }},
        {"avci-video-mxf", Base::AVCI, [](const Card& c) { return c.video(); }},
        {"avclip-mxf", Base::Intra, [](const Card& c) { return c.video(); }},
        {"clip-xml", Base::DV, [](const Card& c) { return c.clipXML(); }},
        {"companion-xml", Base::Strand, [](const Card& c) { return c.clipXML(); }},
        {"icon-bmp", Base::DV, [](const Card& c) { return c.icon(); }},
    };
    for (const Where& p : places) {
        auto damaging = [&](std::function<void(const std::string&)> f) {
            return [&p, f](Card& c) {
                f(p.path(c));
                c.damaged.push_back(p.path(c));
            };
        };
        w.add(std::string("fifo-as-") + p.name, std::string("the ") + p.name + " is a FIFO no one writes to", p.base,
              damaging([](const std::string& path) { replaceWith(path, [](const char* s) { return ::mkfifo(s, 0644); }, "a FIFO"); }));
        w.add(std::string("dev-zero-as-") + p.name, std::string("the ") + p.name + " is a link to /dev/zero", p.base,
              damaging([](const std::string& path) {
                  replaceWith(path, [](const char* s) { return ::symlink("/dev/zero", s); }, "a link");
              }));
        w.add(std::string("unreadable-") + p.name, std::string("the ") + p.name + " has no read permission", p.base,
              damaging([](const std::string& path) {
                  if (::chmod(path.c_str(), 0) != 0) fail(path + ": cannot chmod");
              }));
        w.add(std::string("symlink-loop-as-") + p.name, std::string("the ") + p.name + " is a link to itself", p.base,
              damaging([](const std::string& path) {
                  replaceWith(path, [&](const char* s) { return ::symlink(FileSystem::lastPathComponent(path).c_str(), s); },
                              "a link");
              }));
        w.add(std::string("folder-as-") + p.name, std::string("the ") + p.name + " is a folder", p.base,
              damaging([](const std::string& path) {
                  replaceWith(path, [](const char* s) { return ::mkdir(s, 0755); }, "a folder");
              }));
    }
    w.add("empty-clip-xml", "the clip XML has zero bytes", Base::DV, [](Card& c) {
        truncateTo(c.clipXML(), 0);
        c.damaged.push_back(c.clipXML());
    });
    w.add("dangling-link-as-dv-audio-mxf", "the first audio file is a link to nothing", Base::DV, [](Card& c) {
        replaceWith(c.audio(), [](const char* s) { return ::symlink("NOWHERE/A00100.MXF", s); }, "a link");
        c.damaged.push_back(c.audio());
    });
    w.add("symlink-loop-in-contents", "links that loop: CONTENTS/LOOP to CONTENTS, AUDIO/A001LOOP to itself, "
          "CLIP/DEEPER to CLIP, and VIDEO/X and VIDEO/Y to each other", Base::DV, [](Card& c) {
        const std::string links[][2] = {{".", c.contents() + "/LOOP"},
                                        {"A001LOOP", c.contents() + "/AUDIO/A001LOOP"},
                                        {"../CLIP", c.contents() + "/CLIP/DEEPER"},
                                        {"Y", c.contents() + "/VIDEO/X"},
                                        {"X", c.contents() + "/VIDEO/Y"}};
        for (const auto& l : links) {
            if (::symlink(l[0].c_str(), l[1].c_str()) != 0) fail(l[1] + ": cannot link");
            c.damaged.push_back(l[1]);
        }
    });
    w.add("symlink-loop-as-audio-folder", "CONTENTS/AUDIO is a link to itself", Base::DV, [](Card& c) {
        const std::string audio = c.contents() + "/AUDIO";
        if (!FileSystem::removeItem(audio) || ::symlink("AUDIO", audio.c_str()) != 0) fail(audio + ": cannot link");
        c.damaged.push_back(audio);
    });
}

// Essence that is not what the clip says: noise or zeros where the DV frames
// or H.264 pictures are, every structure around them intact.
void addEssenceFaults(Writer& w) {
    auto fill = [](const std::string& path, uint64_t at, uint64_t size, bool noise) {
        std::vector<uint8_t> bytes(size_t(size), 0);
        uint32_t x = 2463534242u ^ uint32_t(at);
        if (noise)
            for (uint8_t& b : bytes) {
                x ^= x << 13, x ^= x >> 17, x ^= x << 5;
                b = uint8_t(x);
            }
        patch(path, at, bytes);
    };
    for (bool noise : {true, false}) {
        const std::string kind = noise ? "noise" : "zeros";
        for (Base base : {Base::DV, Base::AVCI}) {
            w.add(std::string("essence-") + kind + "-" + baseName(base) + "-video-mxf",
                  std::string("the video frames are ") + kind + ", the MXF around them intact", base, [=](Card& c) {
                      const KLVSpot essence = clipWrappedFile(readBytes(c.video())).essence;
                      fill(c.video(), essence.value, essence.length, noise);
                      c.damaged.push_back(c.video());
                  });
        }
        for (Base base : {Base::Intra, Base::Strand}) {
            w.add("essence-" + kind + "-" + baseName(base) + "-mxf",
                  "every picture is " + kind + ", the MXF around them intact", base, [=](Card& c) {
                      for (const auto& f : c.layouts[0].frames) fill(c.video(), f.offset, f.size, noise);
                      c.damaged.push_back(c.video());
                  });
        }
    }
}

void addIntactCards(Writer& w) {
    for (Base b : {Base::DV, Base::AVCI, Base::Intra, Base::Strand})
        w.add(std::string("intact-") + baseName(b), "nothing wrong: the control for the faults", b, [](Card&) {});
}

}  // namespace

bool writeHostileCards(const std::string& dir, const HostileCardFilter& filter, std::vector<HostileCard>* written,
                       std::string* error) {
    try {
        if (::mkdir(dir.c_str(), 0755) != 0 && errno != EEXIST) fail(dir + ": cannot create folder: " + std::strerror(errno));
        Writer w(dir, filter, written);
        addIntactCards(w);
        addTruncations(w);
        addKLVLengthFaults(w);
        addOffsetFaults(w);
        addXMLValueFaults(w);
        addXMLDocumentFaults(w);
        addFileKindFaults(w);
        addEssenceFaults(w);
    } catch (const std::exception& e) {
        if (error) *error = e.what();
        return false;
    }
    return true;
}

bool writeHostileCards(const std::string& dir, std::vector<HostileCard>* written, std::string* error,
                       const std::string& prefix) {
    return writeHostileCards(
        dir, [&](size_t, const std::string& fault) { return fault.rfind(prefix, 0) == 0; }, written, error);
}
