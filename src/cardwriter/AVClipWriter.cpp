#include "AVClipWriter.h"

#include "H264Synth.h"
#include "MXFWriter.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <fcntl.h>
#include <span>
#include <unistd.h>

namespace {

constexpr uint32_t kVideoBodySID = 1;
constexpr uint32_t kANCBodySID = 2;
constexpr uint32_t kFirstAudioBodySID = 3;
// Body and index stream IDs share one number space within a file.
uint32_t indexSIDFor(uint32_t bodySID) { return 0x80 + bodySID; }
// Readers fetch a chunk's video index partition in one 2048-byte read; 150
// entries of 11 bytes keep pack and segment well inside it.
constexpr uint32_t kMaxFramesPerChunk = 150;
// SMPTE 436 ancillary data element with no lines: just the 2-byte line count.
constexpr uint32_t kANCValueBytes = 2;

const MXFKey& pictureKey() {
    static const MXFKey k = mxfEssenceElementKey(0x15, 0x01, 0x05, 0x01);
    return k;
}
const MXFKey& ancKey() {
    static const MXFKey k = mxfEssenceElementKey(0x17, 0x01, 0x01, 0x01);
    return k;
}
// AES3 element type, one element per channel numbered from 1.
MXFKey soundKey(uint32_t channel) { return mxfEssenceElementKey(0x16, 0x01, 0x03, uint8_t(channel + 1)); }

struct FramePlan {
    uint32_t size = 0;
    uint32_t presentation = 0;
    uint8_t flags = 0;
    int8_t temporalOffset = 0;
    int8_t keyFrameOffset = 0;
    H264SynthParams::Picture picture = H264SynthParams::Picture::I;
    bool idr = false;
};

// Index entry Flags: bit 7 random access, bit 6 sequence header, bits 5-4 the
// prediction (00 intra, 10 forward, 11 bidirectional); the low three bits carry
// the picture type the card's readers look at (4 IDR, 0 I, 6 P, 3 B).
constexpr uint8_t kFlagsIDR = 0xc4;
constexpr uint8_t kFlagsOpenI = 0xc0;
constexpr uint8_t kFlagsP = 0x26;
constexpr uint8_t kFlagsB = 0x33;

// Stored order of a long GOP is I B B P B B P ...: each reference picture is
// stored ahead of the two B pictures shown before it (an open GOP: the B
// pictures after an I are shown before it and refer back to the previous GOP). TemporalOffset is indexed
// by display position (SMPTE 377-1): the frame shown at n is stored at n + TO[n].
FramePlan planFrame(const AVClipSpec& params, uint64_t k) {
    FramePlan p;
    const uint32_t jitter = uint32_t(k % 7) * 16;
    auto sized = [&](uint32_t base) { return std::max<uint32_t>(base > jitter ? base - jitter : base, 64); };
    if (params.coding == AVClipSpec::Coding::AVCIntra) {
        p.size = sized(params.frameBytes);
        p.presentation = uint32_t(k);
        p.flags = kFlagsIDR;
        p.idr = true;
        return p;
    }
    const uint64_t g = params.gopLength;
    const uint64_t j = k % g;
    const uint64_t tripleStart = k - k % 3;
    // The clip's first three pictures are shown as stored (I P P): a recording
    // starts with a closed GOP, with no B pictures reaching back before its IDR.
    const bool wholeTriple = tripleStart != 0 && tripleStart + 2 < params.frames;
    p.keyFrameOffset = int8_t(-int64_t(std::min<uint64_t>(j, 128)));
    if (j % 3 == 0) {
        p.picture = j == 0 ? H264SynthParams::Picture::I : H264SynthParams::Picture::P;
        p.idr = k == 0;
        p.flags = j != 0 ? kFlagsP : k == 0 ? kFlagsIDR : kFlagsOpenI;
        p.size = sized(j == 0 ? params.frameBytes : params.frameBytes / 2);
    } else {
        p.picture = H264SynthParams::Picture::B;
        p.flags = kFlagsB;
        p.size = sized(params.frameBytes / 4);
    }
    if (!wholeTriple) {
        // So does a clip cut inside a triple at its end.
        if (p.picture == H264SynthParams::Picture::B) {
            p.picture = H264SynthParams::Picture::P;
            p.flags = kFlagsP;
        }
        p.presentation = uint32_t(k);
        return p;
    }
    static constexpr int8_t kTemporalOffset[3] = {1, 1, -2};
    static constexpr int kShown[3] = {2, -1, -1};
    p.presentation = uint32_t(int64_t(k) + kShown[k % 3]);
    p.temporalOffset = kTemporalOffset[k % 3];
    return p;
}

struct ChunkPlan {
    uint64_t firstFrame = 0;
    uint32_t frames = 0;
    uint64_t firstSample = 0;
    uint32_t samples = 0;
};

class FileOut {
public:
    FileOut(const std::string& path) : _path(path) {
        _fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
        if (_fd < 0) _error = path + ": cannot create: " + std::strerror(errno);
    }
    ~FileOut() {
        if (_fd >= 0) ::close(_fd);
    }
    bool ok() const { return _error.empty(); }
    const std::string& error() const { return _error; }
    void put(uint64_t offset, std::span<const uint8_t> bytes) {
        while (ok() && !bytes.empty()) {
            ssize_t n = ::pwrite(_fd, bytes.data(), bytes.size(), off_t(offset));
            if (n < 0 && errno == EINTR) continue;
            if (n <= 0) {
                _error = _path + ": write failed: " + std::strerror(errno);
                return;
            }
            bytes = bytes.subspan(size_t(n));
            offset += uint64_t(n);
        }
    }
    void finish(uint64_t size) {
        if (ok() && ::ftruncate(_fd, off_t(size)) != 0) _error = _path + ": cannot set size: " + std::strerror(errno);
        if (_fd >= 0 && ::close(_fd) != 0 && ok()) _error = _path + ": write failed: " + std::strerror(errno);
        _fd = -1;
    }

private:
    std::string _path;
    int _fd = -1;
    std::string _error;
};

uint64_t klvSize(uint64_t valueLength) { return 16 + berLengthSize(valueLength) + valueLength; }

// Little-endian PCM in which each sample tells where it is: the low 16 bits the
// sample number, a 24-bit sample's top byte the channel.
void fillAudio(uint8_t* out, uint64_t firstSample, uint32_t samples, uint32_t channel, uint32_t blockAlign) {
    for (uint32_t i = 0; i < samples; ++i) {
        uint64_t s = firstSample + i;
        out[0] = uint8_t(s);
        out[1] = uint8_t(s >> 8);
        if (blockAlign == 3) out[2] = uint8_t(channel);
        out += blockAlign;
    }
}

// Why the parameters cannot make a file; empty when they can.
std::string parameterProblem(const AVClipSpec& params) {
    if (params.editRateNum <= 0 || params.editRateDen <= 0) return "edit rate must be positive";
    if (params.audioChannels && params.bitsPerSample != 16 && params.bitsPerSample != 24)
        return "audio must be 16 or 24 bits per sample";
    if (params.coding == AVClipSpec::Coding::AVCLongGOP && (params.gopLength == 0 || params.gopLength % 3 != 0))
        return "GOP length must be a multiple of 3";
    return {};
}

// Audio samples in the first `frames` frames, rounded down.
uint64_t samplesFor(const AVClipSpec& params, uint64_t frames) {
    return uint64_t((unsigned __int128)frames * params.sampleRate * uint64_t(params.editRateDen) /
                    uint64_t(params.editRateNum));
}

// The clip cut into chunks of F frames and S samples (the last chunk may be
// short), and every frame's picture.
struct ClipPlan {
    bool hasAudio = false;
    uint32_t blockAlign = 0;
    uint32_t framesPerChunk = 0;
    uint64_t totalSamples = 0;
    std::vector<ChunkPlan> chunks;
    std::vector<FramePlan> frames;
};

// Why the clip cannot be chunked; empty when it can.
std::string planClip(const AVClipSpec& params, ClipPlan& plan) {
    plan.hasAudio = params.audioChannels > 0;
    plan.blockAlign = plan.hasAudio ? params.bitsPerSample / 8 : 0;
    uint32_t F = params.framesPerChunk
                     ? params.framesPerChunk
                     : uint32_t(std::max<long>(1, std::lround(double(params.editRateNum) / params.editRateDen)));
    if (F > kMaxFramesPerChunk) return "at most " + std::to_string(kMaxFramesPerChunk) + " frames per chunk";
    if (params.frames && F > params.frames) F = uint32_t(params.frames);
    plan.framesPerChunk = F;
    const uint64_t chunkCount = params.frames ? (params.frames + F - 1) / F : 0;
    if (plan.hasAudio && chunkCount > 1 &&
        (uint64_t(F) * params.sampleRate * uint64_t(params.editRateDen)) % uint64_t(params.editRateNum) != 0)
        return "a chunk of " + std::to_string(F) + " frames does not hold a whole number of audio samples";
    plan.totalSamples = plan.hasAudio ? samplesFor(params, params.frames) : 0;
    if (plan.hasAudio && samplesFor(params, F) * plan.blockAlign > 0xffffffffull) return "audio chunks too large";
    plan.chunks.resize(chunkCount);
    for (uint64_t i = 0; i < chunkCount; ++i) {
        ChunkPlan& c = plan.chunks[i];
        c.firstFrame = i * F;
        c.frames = uint32_t(std::min<uint64_t>(F, params.frames - c.firstFrame));
        if (plan.hasAudio) {
            c.firstSample = samplesFor(params, c.firstFrame);
            c.samples = uint32_t(samplesFor(params, c.firstFrame + c.frames) - c.firstSample);
        }
    }
    plan.frames.resize(params.frames);
    for (uint64_t k = 0; k < params.frames; ++k) plan.frames[k] = planFrame(params, k);
    return {};
}

// Picture, ancillary data, then one sound track per channel (sound source
// clips last: readers take any non-picture clip's duration as the audio
// duration).
void addTracks(MXFHeaderMetadataSpec& meta, const AVClipSpec& params, uint64_t totalSamples) {
    MXFTrackDescription picture;
    picture.kind = MXFTrackDescription::Kind::Picture;
    picture.trackID = 2;
    picture.essenceKey = pictureKey();
    picture.editRateNum = params.editRateNum;
    picture.editRateDen = params.editRateDen;
    picture.duration = int64_t(params.frames);
    picture.bodySID = kVideoBodySID;
    picture.indexSID = indexSIDFor(kVideoBodySID);
    meta.tracks.push_back(picture);
    // The ancillary data track is described only beside sound: readers take a
    // data clip's duration for the audio duration, and a clip without audio
    // must read as one.
    if (params.audioChannels > 0) {
        MXFTrackDescription anc = picture;
        anc.kind = MXFTrackDescription::Kind::Data;
        anc.trackID = 3;
        anc.essenceKey = ancKey();
        anc.bodySID = kANCBodySID;
        anc.indexSID = indexSIDFor(kANCBodySID);
        meta.tracks.push_back(anc);
    }
    for (uint32_t c = 0; c < params.audioChannels; ++c) {
        MXFTrackDescription sound;
        sound.kind = MXFTrackDescription::Kind::Sound;
        sound.trackID = 4 + c;
        sound.essenceKey = soundKey(c);
        sound.editRateNum = int32_t(params.sampleRate);
        sound.editRateDen = 1;
        sound.duration = int64_t(totalSamples);
        sound.bodySID = kFirstAudioBodySID + c;
        sound.indexSID = indexSIDFor(kFirstAudioBodySID + c);
        meta.tracks.push_back(sound);
        MXFSoundDescriptor sd;
        sd.essenceContainer = MXFLabels::aes3FrameWrapped;
        sd.sampleRate = params.sampleRate;
        sd.channelCount = 1;
        sd.bitsPerSample = params.bitsPerSample;
        meta.sounds.push_back(sd);
    }
}

// Each body stream is an essence container of its own with its own file
// package, so that a demuxer can tell which track an element found in a given
// partition belongs to.
MXFHeaderMetadataSpec headerMetadataSpec(const AVClipSpec& params, uint64_t totalSamples) {
    MXFHeaderMetadataSpec meta;
    meta.operationalPattern = MXFLabels::op1b;
    meta.essenceContainers = {MXFLabels::avcFrameWrapped, MXFLabels::aes3FrameWrapped};
    meta.seed = params.seed;
    meta.startTimecodeFrames = params.startTimecodeFrames;
    meta.dropFrame = params.dropFrame;
    meta.timecodeRate = uint16_t(std::lround(double(params.editRateNum) / params.editRateDen));
    meta.packagePerBodySID = true;
    meta.bodySID = kVideoBodySID;
    meta.indexSID = indexSIDFor(kVideoBodySID);
    addTracks(meta, params, totalSamples);
    MXFPictureDescriptor pd;
    pd.essenceContainer = MXFLabels::avcFrameWrapped;
    pd.codingLabel = params.coding == AVClipSpec::Coding::AVCIntra ? MXFLabels::avcIntraCoding : MXFLabels::avcLongGOPCoding;
    pd.storedWidth = params.width;
    pd.storedHeight = params.height;
    pd.aspectNum = 16;
    pd.aspectDen = 9;
    pd.frameLayout = 0;
    meta.picture = pd;
    return meta;
}

// The header partition: pack, header metadata and the clip XML carrier at its
// fixed offset. The pack is rewritten once the footer's offset is known.
struct HeaderPartition {
    ByteWriter bytes;
    PartitionPack pack;
    uint64_t packSize = 0;  // every partition pack here has the same size
    uint64_t headerByteCount = 0;
};

HeaderPartition headerPartition(const AVClipSpec& params, const MXFHeaderMetadataSpec& meta) {
    HeaderPartition h;
    h.pack.operationalPattern = MXFLabels::op1b;
    h.pack.essenceContainers = meta.essenceContainers;
    writePartitionPack(h.bytes, MXFKeys::headerPartitionClosedComplete, h.pack);
    h.packSize = h.bytes.size();
    h.bytes.bytes(buildHeaderMetadata(meta));
    padTo(h.bytes, kAVClipXMLCarrierOffset);
    ByteWriter carrier;
    carrier.zeros(16);
    carrier.u8(0x01);
    carrier.zeros(4);
    carrier.u64(params.clipXML.size());
    carrier.bytes(params.clipXML);
    writeKLV(h.bytes, MXFKeys::xmlCarrier, carrier.bytes());
    h.headerByteCount = h.bytes.size() - h.packSize;
    return h;
}

// Index table segments, built the same way for planning and writing: each
// takes the next identifier of one seeded source.
class IndexSegments {
public:
    IndexSegments(const AVClipSpec& params, const ClipPlan& clip)
        : _params(params), _clip(clip), _ids(params.seed + "/index") {}

    std::vector<uint8_t> video(uint64_t chunk, uint64_t streamStart) {
        const ChunkPlan& c = _clip.chunks[chunk];
        MXFIndexSegment s;
        s.instanceUID = _ids.nextUID();
        s.editRateNum = _params.editRateNum;
        s.editRateDen = _params.editRateDen;
        s.indexStartPosition = int64_t(c.firstFrame);
        s.indexDuration = c.frames;
        s.indexSID = indexSIDFor(kVideoBodySID);
        s.bodySID = kVideoBodySID;
        uint64_t stream = streamStart;
        for (uint32_t i = 0; i < c.frames; ++i) {
            const FramePlan& f = _clip.frames[c.firstFrame + i];
            MXFIndexEntry e;
            e.temporalOffset = f.temporalOffset;
            e.keyFrameOffset = f.keyFrameOffset;
            e.flags = f.flags;
            e.streamOffset = stream;
            stream += klvSize(f.size);
            s.entries.push_back(e);
        }
        return indexSegmentValue(s);
    }

    std::vector<uint8_t> constant(uint32_t bodySID, int32_t rateNum, int32_t rateDen, uint64_t start,
                                  uint64_t duration, uint32_t editUnitBytes) {
        MXFIndexSegment s;
        s.instanceUID = _ids.nextUID();
        s.editRateNum = rateNum;
        s.editRateDen = rateDen;
        s.indexStartPosition = int64_t(start);
        s.indexDuration = int64_t(duration);
        s.editUnitByteCount = editUnitBytes;
        s.indexSID = indexSIDFor(bodySID);
        s.bodySID = bodySID;
        return indexSegmentValue(s);
    }

private:
    const AVClipSpec& _params;
    const ClipPlan& _clip;
    MXFIdentifierSource _ids;
};

// The planning pass: every partition's offset, every frame's place.
AVClipLayout planLayout(const AVClipSpec& params, const ClipPlan& clip, const HeaderPartition& header) {
    IndexSegments segments(params, clip);
    const uint64_t packSize = header.packSize;
    const uint64_t ancSegmentSize = klvSize(segments.constant(kANCBodySID, 1, 1, 0, 0, 0).size());
    const uint64_t audioSegmentSize = klvSize(segments.constant(kFirstAudioBodySID, 1, 1, 0, 0, 0).size());
    AVClipLayout plan;
    plan.framesPerChunk = clip.framesPerChunk;
    plan.samplesPerChunk = clip.hasAudio && !clip.chunks.empty() ? clip.chunks[0].samples : 0;
    plan.audioSamples = clip.totalSamples;
    plan.blockAlign = clip.blockAlign;
    plan.frames.resize(params.frames);
    plan.chunks.resize(clip.chunks.size());
    uint64_t pos = header.bytes.size();
    for (uint64_t i = 0; i < clip.chunks.size(); ++i) {
        const ChunkPlan& cp = clip.chunks[i];
        AVClipLayout::Chunk& c = plan.chunks[i];
        c.firstFrame = cp.firstFrame;
        c.frameCount = cp.frames;
        c.firstSample = cp.firstSample;
        c.sampleCount = cp.samples;
        c.videoPartition = pos;
        pos += packSize;
        for (uint32_t f = 0; f < cp.frames; ++f) {
            const FramePlan& fp = clip.frames[cp.firstFrame + f];
            AVClipLayout::Frame& lf = plan.frames[cp.firstFrame + f];
            lf.offset = pos + 16 + berLengthSize(fp.size);
            lf.size = fp.size;
            lf.presentation = fp.presentation;
            lf.flags = fp.flags;
            lf.temporalOffset = fp.temporalOffset;
            pos += klvSize(fp.size);
        }
        c.videoIndexPartition = pos;
        pos += packSize + klvSize(segments.video(i, 0).size());
        c.ancPartition = pos;
        pos += packSize + uint64_t(cp.frames) * klvSize(kANCValueBytes);
        c.ancIndexPartition = pos;
        pos += packSize + ancSegmentSize;
        for (uint32_t ch = 0; ch < params.audioChannels; ++ch) {
            const uint64_t bytes = uint64_t(cp.samples) * clip.blockAlign;
            c.audioPartition.push_back(pos);
            c.audioBlock.push_back(pos + packSize + 16 + berLengthSize(bytes));
            pos += packSize + klvSize(bytes);
            c.audioIndexPartition.push_back(pos);
            pos += packSize + audioSegmentSize;
        }
    }
    plan.footerPartition = pos;
    return plan;
}

// Every partition of the file, the header's and the footer's included.
std::vector<MXFRIPEntry> randomIndex(const AVClipLayout& plan, uint32_t audioChannels) {
    std::vector<MXFRIPEntry> rip{{0, 0}};
    for (const auto& c : plan.chunks) {
        rip.push_back({kVideoBodySID, c.videoPartition});
        rip.push_back({0, c.videoIndexPartition});
        rip.push_back({kANCBodySID, c.ancPartition});
        rip.push_back({0, c.ancIndexPartition});
        for (uint32_t ch = 0; ch < audioChannels; ++ch) {
            rip.push_back({kFirstAudioBodySID + ch, c.audioPartition[ch]});
            rip.push_back({0, c.audioIndexPartition[ch]});
        }
    }
    rip.push_back({0, plan.footerPartition});
    return rip;
}

// The writing pass: the body partitions chunk by chunk, each pack naming the
// partition before it, then the footer.
class BodyWriter {
public:
    BodyWriter(FileOut& out, const AVClipSpec& params, const ClipPlan& clip, const AVClipLayout& layout,
               const std::vector<MXFUID>& essenceContainers, uint64_t packSize)
        : _out(out), _params(params), _clip(clip), _layout(layout), _essenceContainers(essenceContainers),
          _packSize(packSize), _segments(params, clip), _audioStream(params.audioChannels, 0) {}

    void writeChunk(uint64_t i) {
        writeVideo(i);
        writeANC(i);
        writeAudio(i);
    }
    // The footer partition and the random index pack; answers their size.
    uint64_t writeFooter(const std::vector<MXFRIPEntry>& rip);

private:
    void pack(ByteWriter& w, uint64_t at, uint32_t bodySID, uint64_t bodyOffset, uint32_t indexSID,
              uint64_t indexByteCount);
    void indexPartition(uint64_t at, uint32_t bodySID, const std::vector<uint8_t>& segment);
    void writeVideo(uint64_t i);
    std::vector<uint8_t> picture(uint64_t k, const FramePlan& fp) const;
    void writeANC(uint64_t i);
    void writeAudio(uint64_t i);

    FileOut& _out;
    const AVClipSpec& _params;
    const ClipPlan& _clip;
    const AVClipLayout& _layout;
    const std::vector<MXFUID>& _essenceContainers;
    const uint64_t _packSize;
    IndexSegments _segments;
    uint64_t _previousPartition = 0;
    uint64_t _videoStream = 0, _ancStream = 0;
    std::vector<uint64_t> _audioStream;
    std::vector<uint8_t> _audioBytes;
    uint32_t _referenceCount = 0;  // H.264 frame_num: reference pictures since the IDR
    uint32_t _idrPresentation = 0;
};

void BodyWriter::pack(ByteWriter& w, uint64_t at, uint32_t bodySID, uint64_t bodyOffset, uint32_t indexSID,
                      uint64_t indexByteCount) {
    PartitionPack p;
    p.thisPartition = at;
    p.previousPartition = _previousPartition;
    p.footerPartition = _layout.footerPartition;
    p.indexByteCount = indexByteCount;
    p.indexSID = indexSID;
    p.bodyOffset = bodyOffset;
    p.bodySID = bodySID;
    p.operationalPattern = MXFLabels::op1b;
    p.essenceContainers = _essenceContainers;
    writePartitionPack(w, MXFKeys::bodyPartitionClosedComplete, p);
    _previousPartition = at;
}

void BodyWriter::indexPartition(uint64_t at, uint32_t bodySID, const std::vector<uint8_t>& segment) {
    ByteWriter w;
    pack(w, at, 0, 0, indexSIDFor(bodySID), klvSize(segment.size()));
    writeKLV(w, MXFKeys::indexTableSegment, segment);
    _out.put(at, w.bytes());
}

// A sparse file gets the pack and every element's key and length, and holes
// where the pictures would be.
void BodyWriter::writeVideo(uint64_t i) {
    const ChunkPlan& cp = _clip.chunks[i];
    const AVClipLayout::Chunk& c = _layout.chunks[i];
    ByteWriter w;
    pack(w, c.videoPartition, kVideoBodySID, _videoStream, 0, 0);
    if (_params.sparse) {
        _out.put(c.videoPartition, w.bytes());
        w = ByteWriter();
    }
    uint64_t at = c.videoPartition + _packSize;
    for (uint32_t f = 0; f < cp.frames; ++f) {
        const uint64_t k = cp.firstFrame + f;
        const FramePlan& fp = _clip.frames[k];
        if (fp.idr) {
            _referenceCount = 0;
            _idrPresentation = fp.presentation;
        }
        if (_params.sparse) {
            ByteWriter kl;
            writeKL(kl, pictureKey(), fp.size);
            _out.put(at, kl.bytes());
        } else {
            writeKL(w, pictureKey(), fp.size);
            w.bytes(picture(k, fp));
        }
        if (fp.picture != H264SynthParams::Picture::B) ++_referenceCount;
        at += klvSize(fp.size);
    }
    if (!_params.sparse) _out.put(c.videoPartition, w.bytes());
    indexPartition(c.videoIndexPartition, kVideoBodySID, _segments.video(i, _videoStream));
    _videoStream += at - (c.videoPartition + _packSize);
}

std::vector<uint8_t> BodyWriter::picture(uint64_t k, const FramePlan& fp) const {
    H264SynthParams hp264;
    hp264.width = _params.width;
    hp264.height = _params.height;
    hp264.picture = fp.picture;
    hp264.idr = fp.idr;
    hp264.parameterSets = fp.picture == H264SynthParams::Picture::I;
    hp264.frameNum = _referenceCount;
    hp264.pocLsb = uint32_t(2 * (int64_t(fp.presentation) - int64_t(_idrPresentation)));
    hp264.idrPicID = uint32_t(k & 0xffff);
    std::vector<uint8_t> au = makeH264AccessUnit(hp264, fp.size);
    au.resize(fp.size);
    return au;
}

void BodyWriter::writeANC(uint64_t i) {
    const ChunkPlan& cp = _clip.chunks[i];
    const AVClipLayout::Chunk& c = _layout.chunks[i];
    ByteWriter w;
    pack(w, c.ancPartition, kANCBodySID, _ancStream, 0, 0);
    const std::vector<uint8_t> ancValue(kANCValueBytes, 0);
    for (uint32_t f = 0; f < cp.frames; ++f) writeKLV(w, ancKey(), ancValue);
    _ancStream += uint64_t(cp.frames) * klvSize(kANCValueBytes);
    _out.put(c.ancPartition, w.bytes());
    indexPartition(c.ancIndexPartition, kANCBodySID,
                   _segments.constant(kANCBodySID, _params.editRateNum, _params.editRateDen, cp.firstFrame, cp.frames,
                                      uint32_t(klvSize(kANCValueBytes))));
}

void BodyWriter::writeAudio(uint64_t i) {
    const ChunkPlan& cp = _clip.chunks[i];
    const AVClipLayout::Chunk& c = _layout.chunks[i];
    const uint32_t blockAlign = _clip.blockAlign;
    for (uint32_t ch = 0; ch < _params.audioChannels && _out.ok(); ++ch) {
        const uint64_t bytes = uint64_t(cp.samples) * blockAlign;
        ByteWriter w;
        pack(w, c.audioPartition[ch], kFirstAudioBodySID + ch, _audioStream[ch], 0, 0);
        writeKL(w, soundKey(ch), bytes);
        if (!_params.sparse) {
            _audioBytes.resize(size_t(bytes));
            fillAudio(_audioBytes.data(), cp.firstSample, cp.samples, ch, blockAlign);
            w.bytes(_audioBytes);
        }
        _out.put(c.audioPartition[ch], w.bytes());
        _audioStream[ch] += klvSize(bytes);
        indexPartition(c.audioIndexPartition[ch], kFirstAudioBodySID + ch,
                       _segments.constant(kFirstAudioBodySID + ch, int32_t(_params.sampleRate), 1, cp.firstSample,
                                          cp.samples, blockAlign));
    }
}

uint64_t BodyWriter::writeFooter(const std::vector<MXFRIPEntry>& rip) {
    ByteWriter tail;
    PartitionPack fp;
    fp.thisPartition = _layout.footerPartition;
    fp.previousPartition = _previousPartition;
    fp.footerPartition = _layout.footerPartition;
    fp.operationalPattern = MXFLabels::op1b;
    fp.essenceContainers = _essenceContainers;
    writePartitionPack(tail, MXFKeys::footerPartitionClosedComplete, fp);
    writeRandomIndexPack(tail, rip);
    _out.put(_layout.footerPartition, tail.bytes());
    return tail.size();
}

}  // namespace

bool writeAVClip(const std::string& path, const AVClipSpec& params, std::string* error, AVClipLayout* layout) {
    auto fail = [&](const std::string& why) {
        if (error) *error = path + ": " + why;
        return false;
    };
    if (std::string why = parameterProblem(params); !why.empty()) return fail(why);
    ClipPlan clip;
    if (std::string why = planClip(params, clip); !why.empty()) return fail(why);
    const MXFHeaderMetadataSpec meta = headerMetadataSpec(params, clip.totalSamples);
    HeaderPartition header = headerPartition(params, meta);
    AVClipLayout plan = planLayout(params, clip, header);
    const std::vector<MXFRIPEntry> rip = randomIndex(plan, params.audioChannels);
    plan.fileSize = plan.footerPartition + header.packSize + klvSize(rip.size() * 12 + 4);

    FileOut out(path);
    if (!out.ok()) return fail(out.error().substr(path.size() + 2));
    header.pack.footerPartition = plan.footerPartition;
    header.pack.headerByteCount = header.headerByteCount;
    std::vector<uint8_t> hv = partitionPackValue(header.pack);
    std::copy(hv.begin(), hv.end(), header.bytes.bytes().begin() + 20);
    out.put(0, header.bytes.bytes());

    BodyWriter body(out, params, clip, plan, meta.essenceContainers, header.packSize);
    for (uint64_t i = 0; i < clip.chunks.size() && out.ok(); ++i) body.writeChunk(i);
    const uint64_t tailSize = body.writeFooter(rip);
    out.finish(plan.fileSize);
    if (!out.ok()) {
        if (error) *error = out.error();
        return false;
    }
    if (plan.footerPartition + tailSize != plan.fileSize) return fail("internal layout error");
    if (layout) *layout = std::move(plan);
    return true;
}
