#include "CardWriter.h"

#include "AVClipWriter.h"
#include "ByteWriter.h"
#include "FileSystem.h"
#include "H264Synth.h"
#include "MXFWriter.h"

#include <pugixml.hpp>

#include <cerrno>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <sstream>
#include <stdexcept>
#include <sys/stat.h>
#include <unistd.h>

namespace {

// Sequential file output with explicit error reporting.
class FileOut {
public:
    explicit FileOut(const std::string& path) : _path(path) {
        _fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    }
    ~FileOut() {
        if (_fd >= 0) ::close(_fd);
    }
    bool ok() const { return _fd >= 0 && !_failed; }
    uint64_t position() const { return _pos; }
    void write(const void* data, size_t n) {
        const auto* p = static_cast<const uint8_t*>(data);
        while (n > 0 && ok()) {
            ssize_t w = ::pwrite(_fd, p, n, off_t(_pos));
            if (w < 0) {
                if (errno == EINTR) continue;
                _failed = true;
                return;
            }
            p += w;
            n -= size_t(w);
            _pos += uint64_t(w);
        }
    }
    void write(const std::vector<uint8_t>& b) { write(b.data(), b.size()); }
    // Moves on without writing: the skipped bytes stay holes in a sparse file.
    void skip(uint64_t n) { _pos += n; }
    bool close() {
        if (_fd < 0) return false;
        struct stat st;
        // A file that ends in a hole needs its size set explicitly.
        if (!_failed && ::fstat(_fd, &st) == 0 && uint64_t(st.st_size) < _pos && ::ftruncate(_fd, off_t(_pos)) != 0)
            _failed = true;
        int rc = ::close(_fd);
        _fd = -1;
        return rc == 0 && !_failed;
    }
    const std::string& path() const { return _path; }

private:
    std::string _path;
    int _fd = -1;
    uint64_t _pos = 0;
    bool _failed = false;
};

bool makeDir(const std::string& path) { return ::mkdir(path.c_str(), 0755) == 0 || errno == EEXIST; }

uint64_t fnv1a64(const std::string& s, uint64_t h = 0xcbf29ce484222325ull) {
    for (unsigned char c : s) {
        h ^= c;
        h *= 0x100000001b3ull;
    }
    return h;
}

unsigned nominalRate(const CardFamily& f) {
    // Whole-number rate of the timecode: 29.97 counts 30, 23.98 counts 24.
    return unsigned(std::lround(double(f.editRateNum) / double(f.editRateDen)));
}

bool defaultDrop(const CardFamily& f) { return f.editRateDen == 1001 && nominalRate(f) != 24; }

std::string editUnitText(const CardFamily& f) {
    return std::to_string(f.editRateDen) + "/" + std::to_string(f.editRateNum);
}

struct EssenceFile {
    uint64_t valueOffset = 0;
    uint64_t valueLength = 0;
};

// Header partition pack, header metadata and the essence's key and length,
// padded so that the essence starts on a 512-byte boundary, as card firmware
// aligns it. The pack is rewritten with the footer's offset, which the essence
// length fixes.
ByteWriter clipWrappedHead(const MXFHeaderMetadataSpec& meta, const MXFKey& essenceKey, uint64_t essenceLength,
                           PartitionPack& hp) {
    hp.operationalPattern = meta.operationalPattern;
    hp.essenceContainers = meta.essenceContainers;
    hp.bodySID = meta.bodySID;
    hp.indexSID = 0;
    std::vector<uint8_t> header = buildHeaderMetadata(meta);

    ByteWriter head;
    writePartitionPack(head, MXFKeys::headerPartitionClosedComplete, hp);
    size_t headerStart = head.size();
    head.bytes(header);
    uint64_t klvSize = 16 + berLengthSize(essenceLength);
    uint64_t valueStart = ((head.size() + 20 + klvSize + 511) / 512) * 512;
    padTo(head, valueStart - klvSize);
    uint64_t headerByteCount = head.size() - headerStart;
    writeKL(head, essenceKey, essenceLength);

    hp.footerPartition = head.size() + essenceLength;
    hp.headerByteCount = headerByteCount;
    std::vector<uint8_t> hv = partitionPackValue(hp);
    std::copy(hv.begin(), hv.end(), head.bytes().begin() + 20);
    return head;
}

// Footer partition pack and random index pack.
ByteWriter clipWrappedTail(const PartitionPack& hp, uint32_t bodySID) {
    ByteWriter tail;
    PartitionPack fp = hp;
    fp.thisPartition = hp.footerPartition;
    fp.bodySID = 0;
    fp.headerByteCount = 0;
    writePartitionPack(tail, MXFKeys::footerPartitionClosedComplete, fp);
    writeRandomIndexPack(tail, {{bodySID, 0}, {0, hp.footerPartition}});
    return tail;
}

// One clip-wrapped essence file: header partition and metadata, the essence in
// one KLV, footer partition and random index pack.
bool writeClipWrappedMXF(const std::string& path, const MXFHeaderMetadataSpec& meta, const MXFKey& essenceKey,
                         uint64_t essenceLength, const std::function<bool(FileOut&)>& writeEssence,
                         EssenceFile& result, std::string* error) {
    PartitionPack hp;
    const ByteWriter head = clipWrappedHead(meta, essenceKey, essenceLength, hp);
    FileOut out(path);
    if (!out.ok()) {
        if (error) *error = path + ": cannot create: " + std::strerror(errno);
        return false;
    }
    out.write(head.bytes());
    result.valueOffset = out.position();
    result.valueLength = essenceLength;
    if (!writeEssence(out)) {
        if (error) *error = path + ": cannot write the essence";
        return false;
    }
    if (out.position() != hp.footerPartition) {
        if (error) *error = path + ": essence size mismatch";
        return false;
    }
    out.write(clipWrappedTail(hp, meta.bodySID).bytes());
    if (!out.close()) {
        if (error) *error = path + ": write failed: " + std::strerror(errno);
        return false;
    }
    return true;
}

// A small 24-bit BMP thumbnail with a gradient keyed to the clip name.
std::vector<uint8_t> thumbnailBMP(const std::string& seed) {
    const uint32_t w = 80, h = 60, rowBytes = ((w * 3 + 3) / 4) * 4;
    ByteWriter b;
    b.u8('B');
    b.u8('M');
    b.le32(54 + rowBytes * h);
    b.le32(0);
    b.le32(54);
    b.le32(40);
    b.le32(w);
    b.le32(h);
    b.le16(1);
    b.le16(24);
    b.le32(0);
    b.le32(rowBytes * h);
    b.le32(2835);
    b.le32(2835);
    b.le32(0);
    b.le32(0);
    uint64_t tint = fnv1a64(seed);
    for (uint32_t y = 0; y < h; ++y) {
        for (uint32_t x = 0; x < w; ++x) {
            b.u8(uint8_t((x * 3 + (tint & 0xff)) & 0xff));
            b.u8(uint8_t((y * 4 + ((tint >> 8) & 0xff)) & 0xff));
            b.u8(uint8_t(((x + y) * 2 + ((tint >> 16) & 0xff)) & 0xff));
        }
        b.zeros(rowBytes - w * 3);
    }
    return b.bytes();
}

// A one-second voice memo: 16-bit mono PCM WAV at 48 kHz.
std::vector<uint8_t> voiceWAV() {
    const uint32_t rate = 48000, samples = rate;
    ByteWriter b;
    b.bytes(std::string("RIFF"));
    b.le32(36 + samples * 2);
    b.bytes(std::string("WAVEfmt "));
    b.le32(16);
    b.le16(1);
    b.le16(1);
    b.le32(rate);
    b.le32(rate * 2);
    b.le16(2);
    b.le16(16);
    b.bytes(std::string("data"));
    b.le32(samples * 2);
    for (uint32_t i = 0; i < samples; ++i)
        b.le16(uint16_t(int16_t(3000.0 * std::sin(2.0 * M_PI * 660.0 * i / rate))));
    return b.bytes();
}

void addText(pugi::xml_node parent, const char* name, const std::string& text) {
    parent.append_child(name).text().set(text.c_str());
}

void addOptional(pugi::xml_node parent, const char* name, const std::optional<std::string>& text) {
    if (text) addText(parent, name, *text);
}

std::string documentText(const pugi::xml_document& doc) {
    std::ostringstream s;
    doc.save(s, "  ", pugi::format_default, pugi::encoding_utf8);
    return s.str();
}

pugi::xml_node addRoot(pugi::xml_document& doc) {
    auto decl = doc.append_child(pugi::node_declaration);
    decl.append_attribute("version") = "1.0";
    decl.append_attribute("encoding") = "UTF-8";
    decl.append_attribute("standalone") = "no";
    pugi::xml_node root = doc.append_child("SkarnClip");
    // Clip documents put their elements in a default namespace.
    root.append_attribute("xmlns") = "urn:schemas-corvane-com:skarn:clip:1.0";
    root.append_attribute("version") = "1.2";
    return root;
}

// Root element and the ClipContent fields both XML shapes share.
pugi::xml_node addClipContent(pugi::xml_document& doc, const ClipSpec& clip) {
    pugi::xml_node content = addRoot(doc).append_child("ClipContent");
    addText(content, "ClipName", clip.name);
    addText(content, "GlobalClipID", clip.globalClipID.value_or(globalClipIDFor(clip.name)));
    addText(content, "Duration", std::to_string(clip.frames));
    addText(content, "EditUnit", editUnitText(*clip.family));
    return content;
}

using XMLField = std::pair<const char*, const std::optional<std::string>*>;

bool anyFieldSet(std::initializer_list<XMLField> fields) {
    for (const auto& f : fields)
        if (*f.second) return true;
    return false;
}

// A group element holding the fields that are set; left out when none is
// (unless `present` asks for it, for a group whose only content is a subgroup).
pugi::xml_node addGroup(pugi::xml_node parent, const char* name, std::initializer_list<XMLField> fields,
                        bool present = false) {
    if (!present && !anyFieldSet(fields)) return pugi::xml_node();
    pugi::xml_node group = parent.append_child(name);
    for (const auto& [field, value] : fields) addOptional(group, field, *value);
    return group;
}

void addClipMetadata(pugi::xml_node content, const ClipSpec& clip) {
    const auto& m = clip.metadata;
    pugi::xml_node md = content.append_child("ClipMetadata");
    addOptional(md, "UserClipName", m.userClipName);
    addOptional(md, "DataSource", m.dataSource);
    addGroup(md, "Access", {{"Creator", &m.creator}, {"CreationDate", &m.creationDate},
                            {"LastUpdateDate", &m.lastUpdateDate}, {"LastUpdatePerson", &m.lastUpdatePerson}});
    addGroup(md, "Device", {{"Manufacturer", &m.manufacturer}, {"SerialNo.", &m.serialNo}, {"ModelName", &m.modelName}});
    std::initializer_list<XMLField> location = {{"Altitude", &m.altitude}, {"Longitude", &m.longitude},
                                                {"Latitude", &m.latitude}, {"Source", &m.locationSource},
                                                {"PlaceName", &m.placeName}};
    bool hasLocation = anyFieldSet(location);
    pugi::xml_node shoot =
        addGroup(md, "Shoot", {{"Shooter", &m.shooter}, {"StartDate", &m.startDate}, {"EndDate", &m.endDate}}, hasLocation);
    if (hasLocation) addGroup(shoot, "Location", location);
    addGroup(md, "Scenario", {{"ProgramName", &m.programName}, {"SceneNo.", &m.sceneNo}, {"TakeNo.", &m.takeNo}});
    addGroup(md, "News", {{"Reporter", &m.reporter}, {"Purpose", &m.purpose}, {"Object", &m.object}});
    if (!m.memos.empty()) {
        pugi::xml_node list = md.append_child("MemoList");
        for (size_t i = 0; i < m.memos.size(); ++i) {
            pugi::xml_node memo = list.append_child("Memo");
            memo.append_attribute("MemoID") = unsigned(i);
            addText(memo, "Offset", "0");
            addText(memo, "Person", m.memos[i].person);
            addText(memo, "Text", m.memos[i].text);
        }
    }
    addOptional(md, "ShotMark", m.shotMark);
}

// AVC-Intra essence in a clip-XML clip starts with a 512-byte header that is
// not picture data; StartByteOffset and DataSize take it in, and readers skip it.
uint64_t videoEssenceHeaderBytes(const CardFamily& f) {
    return !f.dv && !f.avclip && f.codec.rfind("AVC-I", 0) == 0 ? 512 : 0;
}

void addEssenceListVideo(pugi::xml_node list, const ClipSpec& clip, uint64_t startByteOffset) {
    const CardFamily& f = *clip.family;
    bool drop = clip.dropFrame.value_or(defaultDrop(f));
    pugi::xml_node video = list.append_child("Video");
    video.append_attribute("ValidAudioFlag") = "false";
    addText(video, "VideoFormat", "MXF");
    pugi::xml_node codec = video.append_child("Codec");
    if (f.codecClass) codec.append_attribute("Class") = f.codecClass;
    codec.text().set(f.codec.c_str());
    addText(video, "ActiveLine", std::to_string(f.activeLines));
    addText(video, "ActivePixel", std::to_string(f.activePixels));
    addText(video, "BitDepth", "10");
    pugi::xml_node rate = video.append_child("FrameRate");
    rate.append_attribute("DropFrameFlag") = drop ? "true" : "false";
    rate.text().set(f.frameRate.c_str());
    if (clip.pulldown) addText(video, "Pulldown", *clip.pulldown);
    addText(video, "AspectRatio", f.aspectRatio);
    if (clip.vfrRatio) {
        pugi::xml_node vfr = video.append_child("VFRRatio");
        vfr.append_attribute("VRFRState") = clip.vfrState.c_str();
        vfr.text().set(clip.vfrRatio->c_str());
    }
    addText(video, "StartTimecode", clip.startTimecode);
    addText(video, "StartBinaryGroup", clip.startBinaryGroup.value_or("00000000"));
    pugi::xml_node vindex = video.append_child("VideoIndex");
    addText(vindex, "StartByteOffset", std::to_string(startByteOffset));
    addText(vindex, "DataSize", std::to_string(videoEssenceHeaderBytes(f) + uint64_t(f.frameBytes) * clip.frames));
}

// One Audio element per channel, each with its own file's offset (0 where the
// caller has none, as for a self-contained clip's companion XML).
void addEssenceListAudio(pugi::xml_node list, const ClipSpec& clip, const std::vector<uint64_t>& startByteOffsets) {
    uint64_t samples = audioSamplesFor(clip);
    for (uint32_t ch = 0; ch < clip.audioChannels; ++ch) {
        pugi::xml_node audio = list.append_child("Audio");
        addText(audio, "AudioFormat", "MXF");
        addText(audio, "SamplingRate", std::to_string(clip.sampleRate));
        addText(audio, "BitsPerSample", std::to_string(clip.bitsPerSample));
        pugi::xml_node aindex = audio.append_child("AudioIndex");
        addText(aindex, "StartByteOffset", std::to_string(ch < startByteOffsets.size() ? startByteOffsets[ch] : 0));
        addText(aindex, "DataSize", std::to_string(samples * (clip.bitsPerSample / 8)));
    }
}

// The shot the clip belongs to, and the clips it spans with.
void addRelation(pugi::xml_node content, const ClipSpec& clip) {
    pugi::xml_node relation = content.append_child("Relation");
    addText(relation, "OffsetInShot", "0");
    addText(relation, "GlobalShotID", clip.globalClipID.value_or(globalClipIDFor(clip.name)));
    if (clip.spanTop || clip.spanNext || clip.spanPrevious) {
        pugi::xml_node conn = relation.append_child("Connection");
        if (clip.spanTop) addText(conn.append_child("Top"), "GlobalClipID", *clip.spanTop);
        if (clip.spanPrevious) addText(conn.append_child("Previous"), "GlobalClipID", *clip.spanPrevious);
        if (clip.spanNext) addText(conn.append_child("Next"), "GlobalClipID", *clip.spanNext);
    }
}

std::string folderName(const CardSpec& card, const char* upper) {
    std::string s = upper;
    if (card.lowerCaseFolders)
        for (char& c : s) c = char(std::tolower(static_cast<unsigned char>(c)));
    return s;
}

bool writeBytesFile(const std::string& path, const std::vector<uint8_t>& bytes, std::string* error) {
    FileOut out(path);
    out.write(bytes);
    if (!out.close()) {
        if (error) *error = path + ": cannot write: " + std::strerror(errno);
        return false;
    }
    return true;
}

// PCM test tone: channel i at 440 Hz × (i + 1), -20 dBFS, little-endian as AES3
// and broadcast WAV essence store it.
void fillAudio(uint8_t* out, uint64_t firstSample, uint64_t count, uint32_t channel, uint32_t bytesPerSample,
               uint32_t rate) {
    const double freq = 440.0 * (channel + 1);
    const double amp = bytesPerSample == 3 ? 838860.0 : 3276.0;
    for (uint64_t i = 0; i < count; ++i) {
        double phase = 2.0 * M_PI * freq * double((firstSample + i) % rate) / rate;
        int32_t v = int32_t(std::lround(amp * std::sin(phase)));
        uint8_t* p = out + i * bytesPerSample;
        p[0] = uint8_t(v);
        p[1] = uint8_t(v >> 8);
        if (bytesPerSample == 3) p[2] = uint8_t(v >> 16);
    }
}

}  // namespace

std::string globalClipIDFor(const std::string& name) {
    // 32 bytes as 64 hex digits, the form cards use for global clip identifiers.
    static const char* hex = "0123456789ABCDEF";
    std::string id;
    uint64_t h = fnv1a64("skarn-gid:" + name);
    for (int part = 0; part < 4; ++part) {
        h = fnv1a64(std::to_string(part) + name, h);
        for (int i = 60; i >= 0; i -= 4) id += hex[(h >> i) & 15];
    }
    return id;
}

uint64_t timecodeLabelToFrames(const std::string& label, unsigned rate, bool drop) {
    unsigned h = 0, m = 0, s = 0, f = 0;
    char sep = 0;
    if (std::sscanf(label.c_str(), "%u:%u:%u%c%u", &h, &m, &s, &sep, &f) != 5) return 0;
    if (sep == ';') drop = true;
    uint64_t minutes = uint64_t(h) * 60 + m;
    uint64_t frames = (minutes * 60 + s) * rate + f;
    if (drop && (rate == 30 || rate == 60)) {
        // Drop-frame labels skip 2 (4 at 60) frame numbers each minute except every tenth.
        uint64_t dropPerMinute = rate == 30 ? 2 : 4;
        frames -= dropPerMinute * (minutes - minutes / 10);
    }
    return frames;
}

uint64_t audioSamplesFor(const ClipSpec& clip) {
    const CardFamily& f = *clip.family;
    return uint64_t(std::llround(double(clip.frames) * clip.sampleRate * f.editRateDen / f.editRateNum));
}

ClipSpec defaultClip(const CardFamily& family, unsigned index) {
    ClipSpec c;
    c.family = &family;
    char name[16];
    std::snprintf(name, sizeof name, "A%03u", index % 1000);
    c.name = name;
    c.bitsPerSample = family.dv ? 16 : 24;
    c.audioChannels = family.dv ? 2 : 4;
    c.startTimecode = "01:00:00:00";
    c.metadata.userClipName = "Take " + std::to_string(index);
    c.metadata.creator = "Skarn card writer";
    c.metadata.creationDate = "2026-11-21T09:30:00+09:00";
    c.metadata.lastUpdateDate = "2026-11-21T09:31:12+09:00";
    c.metadata.manufacturer = "corvane";
    c.metadata.modelName = "Skarn SK-100";
    c.metadata.serialNo = "SK" + std::to_string(100000 + index);
    c.metadata.shooter = "Camera A";
    c.metadata.startDate = "2026-11-21T09:30:00+09:00";
    c.metadata.endDate = "2026-11-21T09:30:02+09:00";
    c.metadata.shotMark = "false";
    c.metadata.memos = {{"Camera A", "slate " + std::to_string(index)}};
    return c;
}

std::string clipXMLText(const ClipSpec& clip, uint64_t videoStartByteOffset,
                        const std::vector<uint64_t>& audioStartByteOffsets) {
    pugi::xml_document doc;
    pugi::xml_node content = addClipContent(doc, clip);
    pugi::xml_node list = content.append_child("EssenceList");
    addEssenceListVideo(list, clip, videoStartByteOffset);
    addEssenceListAudio(list, clip, audioStartByteOffsets);
    addClipMetadata(content, clip);
    addRelation(content, clip);
    return documentText(doc);
}

std::string avclipHeaderXMLText(const ClipSpec& clip) {
    const CardFamily& f = *clip.family;
    bool drop = clip.dropFrame.value_or(defaultDrop(f));
    pugi::xml_document doc;
    pugi::xml_node content = addClipContent(doc, clip);
    pugi::xml_node essence = content.append_child("Essence");
    pugi::xml_node video = essence.append_child("Video");
    addText(video, "Codec", f.codec);
    pugi::xml_node rate = video.append_child("FrameRate");
    rate.append_attribute("DropFrameFlag") = drop ? "true" : "false";
    rate.text().set(f.frameRate.c_str());
    addText(video, "StartTimecode", clip.startTimecode);
    pugi::xml_node audio = essence.append_child("Audio");
    addText(audio, "ChannelNum", std::to_string(clip.audioChannels));
    addText(audio, "SamplingRate", std::to_string(clip.sampleRate));
    addText(audio, "BitsPerSample", std::to_string(clip.bitsPerSample));
    addClipMetadata(content, clip);
    return documentText(doc);
}

namespace {

// The timecode a clip's files carry.
struct ClipTimecode {
    bool drop = false;
    unsigned rate = 0;       // whole-number frame rate
    unsigned labelRate = 0;  // the rate the labels count in
    uint64_t startFrames = 0;
};

ClipTimecode clipTimecode(const ClipSpec& clip) {
    const CardFamily& f = *clip.family;
    ClipTimecode tc;
    tc.drop = clip.dropFrame.value_or(defaultDrop(f));
    tc.rate = nominalRate(f);
    // 60-frame formats count frame pairs in their timecode.
    tc.labelRate = tc.rate > 30 ? tc.rate / 2 : tc.rate;
    tc.startFrames = timecodeLabelToFrames(clip.startTimecode, tc.labelRate, tc.drop);
    return tc;
}

// What a clip's video file and its audio files share: one OP-Atom file
// package per file, all named after the clip and starting at its timecode.
MXFHeaderMetadataSpec atomHeaderMetadata(const ClipSpec& clip, const ClipTimecode& tc, std::string seed) {
    MXFHeaderMetadataSpec meta;
    meta.operationalPattern = MXFLabels::opAtom;
    meta.seed = std::move(seed);
    meta.packageName = clip.name;
    meta.startTimecodeFrames = tc.startFrames;
    meta.timecodeRate = uint16_t(tc.labelRate);
    meta.dropFrame = tc.drop;
    return meta;
}

MXFKey videoEssenceKey(const CardFamily& f) {
    return f.dv ? mxfEssenceElementKey(0x18, 0x01, 0x02, 0x01) : mxfEssenceElementKey(0x15, 0x01, 0x06, 0x01);
}

MXFKey audioEssenceKey() { return mxfEssenceElementKey(0x16, 0x01, 0x04, 0x01); }

MXFHeaderMetadataSpec videoHeaderMetadata(const ClipSpec& clip, const ClipTimecode& tc) {
    const CardFamily& f = *clip.family;
    MXFHeaderMetadataSpec meta = atomHeaderMetadata(clip, tc, clip.name + "/video");
    MXFTrackDescription vt;
    vt.kind = MXFTrackDescription::Kind::Picture;
    vt.trackID = 2;
    vt.essenceKey = videoEssenceKey(f);
    vt.editRateNum = f.editRateNum;
    vt.editRateDen = f.editRateDen;
    vt.duration = int64_t(clip.frames);
    meta.tracks = {vt};
    MXFPictureDescriptor pd;
    pd.essenceContainer = f.dv ? MXFLabels::dvClipWrapped : MXFLabels::avcFrameWrapped;
    if (!f.dv) pd.essenceContainer[15] = 0x02;  // clip-wrapped
    pd.codingLabel = f.dv ? MXFLabels::dvCoding : MXFLabels::avcIntraCoding;
    pd.storedWidth = f.activePixels;
    pd.storedHeight = f.frameRate.back() == 'i' ? f.activeLines / 2 : f.activeLines;
    pd.frameLayout = f.frameRate.back() == 'i' ? 1 : 0;
    pd.aspectNum = f.aspectRatio == "16:9" ? 16 : 4;
    pd.aspectDen = f.aspectRatio == "16:9" ? 9 : 3;
    meta.picture = pd;
    meta.essenceContainers = {pd.essenceContainer};
    return meta;
}

MXFHeaderMetadataSpec audioHeaderMetadata(const ClipSpec& clip, const ClipTimecode& tc, uint32_t channel) {
    MXFHeaderMetadataSpec meta = atomHeaderMetadata(clip, tc, clip.name + "/audio" + std::to_string(channel));
    MXFTrackDescription at;
    at.kind = MXFTrackDescription::Kind::Sound;
    at.trackID = 2;
    at.essenceKey = audioEssenceKey();
    at.editRateNum = int32_t(clip.sampleRate);
    at.editRateDen = 1;
    at.duration = int64_t(audioSamplesFor(clip));
    meta.tracks = {at};
    MXFSoundDescriptor sd;
    sd.essenceContainer = MXFLabels::aes3ClipWrapped;
    sd.sampleRate = clip.sampleRate;
    sd.bitsPerSample = clip.bitsPerSample;
    meta.sounds = {sd};
    meta.essenceContainers = {sd.essenceContainer};
    return meta;
}

// Where a clip's video frames come from: the DV writer for DV (which also
// takes an essence file and writes its packs into it), else an essence file cut
// into frames as it is, else synthetic H.264 pictures.
struct VideoFrameSource {
    std::optional<DVFrameWriter> dv;
    std::vector<uint8_t> essence;  // whole frames

    // Fills `frame`, which keeps what earlier frames left past a short picture.
    void fill(const CardFamily& f, uint64_t i, std::vector<uint8_t>& frame) const {
        if (dv) {
            dv->writeFrame(i, frame.data());
        } else if (!essence.empty()) {
            size_t count = essence.size() / frame.size();
            std::memcpy(frame.data(), essence.data() + (i % count) * frame.size(), frame.size());
        } else {
            H264SynthParams hp;
            hp.width = f.activePixels;
            hp.height = f.activeLines;
            hp.idrPicID = uint32_t(i & 0xffff);
            std::vector<uint8_t> au = makeH264AccessUnit(hp, frame.size());
            std::memcpy(frame.data(), au.data(), std::min(au.size(), frame.size()));
        }
    }
};

bool openVideoFrameSource(const ClipSpec& clip, const ClipTimecode& tc, VideoFrameSource& source,
                          std::string* error) {
    const CardFamily& f = *clip.family;
    const uint64_t frameBytes = f.frameBytes;
    try {
        if (f.dv) {
            DVStreamSpec dvSpec = clip.dv.value_or(DVStreamSpec{});
            dvSpec.family = DVFamily(f.videoFormat);
            dvSpec.dropFrame = tc.drop;
            dvSpec.startTimecodeFrames = tc.startFrames * (tc.rate > 30 ? 2 : 1);
            if (!clip.essenceFile.empty()) dvSpec.essenceFile = clip.essenceFile;
            source.dv.emplace(dvSpec);
        } else if (!clip.essenceFile.empty()) {
            auto bytes = FileSystem::readFile(clip.essenceFile, size_t(frameBytes) * 600);
            if (!bytes || bytes->size() < frameBytes)
                throw std::runtime_error(clip.essenceFile + ": no whole frame of " + std::to_string(frameBytes) +
                                         " bytes");
            bytes->resize(bytes->size() / frameBytes * frameBytes);
            source.essence = std::move(*bytes);
        }
    } catch (const std::exception& e) {
        if (error) *error = "clip " + clip.name + ": " + e.what();
        return false;
    }
    return true;
}

// A sparse clip has its first frames written and holes for the rest.
bool writeVideoFile(const std::string& path, const ClipSpec& clip, const ClipTimecode& tc,
                    const VideoFrameSource& source, EssenceFile& essence, std::string* error) {
    const CardFamily& f = *clip.family;
    const uint64_t frameBytes = f.frameBytes;
    const uint64_t materialFrames = clip.sparse ? std::min<uint64_t>(clip.frames, 2) : clip.frames;
    const uint64_t headerBytes = videoEssenceHeaderBytes(f);
    return writeClipWrappedMXF(
        path, videoHeaderMetadata(clip, tc), videoEssenceKey(f), headerBytes + frameBytes * clip.frames,
        [&](FileOut& out) {
            out.write(std::vector<uint8_t>(headerBytes, 0));
            std::vector<uint8_t> frame(frameBytes);
            for (uint64_t i = 0; i < materialFrames; ++i) {
                source.fill(f, i, frame);
                out.write(frame);
            }
            out.skip(frameBytes * (clip.frames - materialFrames));
            return out.ok();
        },
        essence, error);
}

// A sparse clip has its first second written and holes for the rest.
bool writeAudioFile(const std::string& path, const ClipSpec& clip, const ClipTimecode& tc, uint32_t channel,
                    EssenceFile& essence, std::string* error) {
    const uint32_t bytesPerSample = clip.bitsPerSample / 8;
    const uint64_t samples = audioSamplesFor(clip);
    const uint64_t materialSamples = clip.sparse ? std::min<uint64_t>(samples, clip.sampleRate) : samples;
    return writeClipWrappedMXF(
        path, audioHeaderMetadata(clip, tc, channel), audioEssenceKey(), samples * bytesPerSample,
        [&](FileOut& out) {
            const uint64_t block = 48000;
            std::vector<uint8_t> buf(block * bytesPerSample);
            for (uint64_t s = 0; s < materialSamples; s += block) {
                uint64_t n = std::min(block, materialSamples - s);
                fillAudio(buf.data(), s, n, channel, bytesPerSample, clip.sampleRate);
                out.write(buf.data(), size_t(n * bytesPerSample));
            }
            out.skip((samples - materialSamples) * bytesPerSample);
            return out.ok();
        },
        essence, error);
}

// The clip XML goes last: it names the byte offsets of the essence files.
bool writeClipXMLClip(const CardSpec& card, const std::string& contents, const ClipSpec& clip, WrittenClip& written,
                      std::string* error) {
    const ClipTimecode tc = clipTimecode(clip);
    VideoFrameSource source;
    if (!openVideoFrameSource(clip, tc, source, error)) return false;

    std::string videoPath = contents + "/" + folderName(card, "VIDEO") + "/" + clip.name + ".MXF";
    EssenceFile videoEssence;
    if (!writeVideoFile(videoPath, clip, tc, source, videoEssence, error)) return false;
    written.files.push_back(videoPath);

    // Audio essence: one file per channel.
    std::string audioFolder = contents + "/" + folderName(card, "AUDIO");
    std::vector<uint64_t> audioOffsets;
    for (uint32_t ch = 0; ch < clip.audioChannels; ++ch) {
        char fileName[64];
        std::snprintf(fileName, sizeof fileName, "%s%.2u.MXF", clip.name.c_str(), ch);
        std::string path = audioFolder + "/" + fileName;
        EssenceFile audioEssence;
        if (!writeAudioFile(path, clip, tc, ch, audioEssence, error)) return false;
        audioOffsets.push_back(audioEssence.valueOffset);
        written.files.push_back(path);
    }

    std::string xmlPath = contents + "/" + folderName(card, "CLIP") + "/" + clip.name + ".XML";
    std::string xml = clipXMLText(clip, videoEssence.valueOffset, audioOffsets);
    if (!writeBytesFile(xmlPath, std::vector<uint8_t>(xml.begin(), xml.end()), error)) return false;
    written.clipPath = xmlPath;
    written.files.insert(written.files.begin(), xmlPath);
    return true;
}

bool writeAVClipClip(const CardSpec& card, const std::string& contents, const ClipSpec& clip, WrittenClip& written,
                     std::string* error) {
    const CardFamily& f = *clip.family;
    const ClipTimecode tc = clipTimecode(clip);
    AVClipSpec params;
    params.clipXML = avclipHeaderXMLText(clip);
    params.coding = f.longGOP ? AVClipSpec::Coding::AVCLongGOP : AVClipSpec::Coding::AVCIntra;
    params.editRateNum = f.editRateNum;
    params.editRateDen = f.editRateDen;
    params.frames = clip.frames;
    params.audioChannels = clip.audioChannels;
    params.bitsPerSample = clip.bitsPerSample;
    params.sampleRate = clip.sampleRate;
    params.frameBytes = f.frameBytes;
    params.startTimecodeFrames = tc.startFrames;
    params.dropFrame = tc.drop;
    params.sparse = clip.sparse;
    params.seed = clip.name;
    std::string path = contents + "/" + folderName(card, "AVCLIP") + "/" + clip.name + ".MXF";
    if (!writeAVClip(path, params, error)) return false;
    written.clipPath = path;
    written.files.push_back(path);
    if (f.companionXML) {
        std::string xmlPath = contents + "/" + folderName(card, "CLIP") + "/" + clip.name + ".XML";
        std::string xml = clipXMLText(clip, 0, {});
        if (!writeBytesFile(xmlPath, std::vector<uint8_t>(xml.begin(), xml.end()), error)) return false;
        written.files.push_back(xmlPath);
    }
    return true;
}

// The proxy's side file: frame count and rate, as a small binary record.
std::vector<uint8_t> proxyBin(const ClipSpec& clip) {
    ByteWriter b;
    b.bytes(std::string("SKPX"));
    b.u32(uint32_t(clip.frames));
    b.u32(uint32_t(clip.family->editRateNum));
    b.u32(uint32_t(clip.family->editRateDen));
    return b.bytes();
}

// The icon, voice memo and proxy side file a clip asks for.
bool writeClipSideFiles(const CardSpec& card, const std::string& contents, const ClipSpec& clip,
                        WrittenClip& written, std::string* error) {
    auto write = [&](const char* folder, const char* extension, const std::vector<uint8_t>& bytes) {
        std::string p = contents + "/" + folderName(card, folder) + "/" + clip.name + "." + extension;
        if (!writeBytesFile(p, bytes, error)) return false;
        written.files.push_back(p);
        return true;
    };
    if (clip.icon && !write("ICON", "BMP", thumbnailBMP(clip.name))) return false;
    if (clip.voice && !write("VOICE", "WAV", voiceWAV())) return false;
    if (clip.proxy && !write("PROXY", "BIN", proxyBin(clip))) return false;
    return true;
}

// The root (with any missing parents), CONTENTS and the folders below it;
// AVCLIP only on a card that holds a self-contained clip.
std::optional<std::string> makeCardFolders(const CardSpec& card, const std::string& contents) {
    auto cannot = [](const std::string& p) { return p + ": cannot create folder: " + std::strerror(errno); };
    std::string acc;
    for (size_t pos = 0; pos != std::string::npos;) {
        pos = card.root.find('/', pos + 1);
        acc = card.root.substr(0, pos);
        if (!acc.empty() && !makeDir(acc)) return cannot(acc);
    }
    bool anyAVClip = false;
    for (const auto& c : card.clips) anyAVClip = anyAVClip || (c.family && c.family->avclip);
    std::vector<const char*> folders = {"CLIP", "VIDEO", "AUDIO", "ICON", "PROXY", "VOICE"};
    if (anyAVClip) folders.push_back("AVCLIP");
    if (!makeDir(contents)) return cannot(contents);
    for (const char* f : folders) {
        std::string p = contents + "/" + folderName(card, f);
        if (!makeDir(p)) return cannot(p);
    }
    return std::nullopt;
}

// Why the writer cannot write a clip; nothing when it can.
std::optional<std::string> clipProblem(const ClipSpec& clip) {
    if (!clip.family) return "clip " + clip.name + ": no family";
    if (clip.frames == 0) return "clip " + clip.name + ": no frames";
    if (clip.bitsPerSample != 16 && clip.bitsPerSample != 24)
        return "clip " + clip.name + ": audio must be 16 or 24 bits";
    return std::nullopt;
}

}  // namespace

bool writeCard(const CardSpec& card, std::vector<WrittenClip>* writtenClips, std::string* error) {
    auto fail = [&](const std::string& why) {
        if (error) *error = why;
        return false;
    };
    std::string contents = card.root + "/" + folderName(card, "CONTENTS");
    if (auto why = makeCardFolders(card, contents)) return fail(*why);

    for (const auto& clip : card.clips) {
        if (auto why = clipProblem(clip)) return fail(*why);
        WrittenClip written;
        written.name = clip.name;
        written.family = clip.family->name;
        bool ok = clip.family->avclip ? writeAVClipClip(card, contents, clip, written, error)
                                      : writeClipXMLClip(card, contents, clip, written, error);
        if (!ok || !writeClipSideFiles(card, contents, clip, written, error)) return false;
        if (writtenClips) writtenClips->push_back(std::move(written));
    }
    if (card.lastClipFile && !card.clips.empty()) {
        std::string last = card.clips.back().name + "\n";
        if (!writeBytesFile(card.root + "/LASTCLIP.TXT", std::vector<uint8_t>(last.begin(), last.end()), error))
            return false;
    }
    return true;
}
