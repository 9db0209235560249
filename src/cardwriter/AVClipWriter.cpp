#include "AVClipWriter.h"

#include "MXFWriter.h"

#include <fstream>

// The header: partition pack, header metadata, then the XML carrier at 32768;
// the body is a single footer partition with its random index pack.
bool writeAVClip(const std::string& path, const AVClipSpec& spec, std::string* error) {
    MXFHeaderMetadataSpec meta;
    meta.operationalPattern = MXFLabels::op1b;
    meta.essenceContainers = {MXFLabels::avcFrameWrapped, MXFLabels::aes3FrameWrapped};
    meta.seed = spec.seed;
    meta.startTimecodeFrames = spec.startTimecodeFrames;
    meta.dropFrame = spec.dropFrame;
    MXFTrackDescription picture;
    picture.kind = MXFTrackDescription::Kind::Picture;
    picture.trackID = 2;
    picture.essenceKey = mxfEssenceElementKey(0x15, 0x01, 0x05, 0x01);
    picture.editRateNum = spec.editRateNum;
    picture.editRateDen = spec.editRateDen;
    picture.duration = int64_t(spec.frames);
    meta.tracks.push_back(picture);
    MXFPictureDescriptor pd;
    pd.essenceContainer = MXFLabels::avcFrameWrapped;
    pd.codingLabel = spec.coding == AVClipSpec::Coding::AVCIntra ? MXFLabels::avcIntraCoding : MXFLabels::avcLongGOPCoding;
    pd.storedWidth = 1920;
    pd.storedHeight = 1080;
    pd.aspectNum = 16;
    pd.aspectDen = 9;
    meta.picture = pd;
    std::vector<uint8_t> header = buildHeaderMetadata(meta);

    ByteWriter w;
    PartitionPack hp;
    hp.operationalPattern = MXFLabels::op1b;
    hp.essenceContainers = meta.essenceContainers;
    writePartitionPack(w, MXFKeys::headerPartitionClosedComplete, hp);
    size_t headerStart = w.size();
    w.bytes(header);
    padTo(w, kAVClipXMLCarrierOffset);
    ByteWriter carrier;
    carrier.zeros(16);
    carrier.u8(0x01);
    carrier.zeros(4);
    carrier.u64(spec.clipXML.size());
    carrier.bytes(spec.clipXML);
    writeKLV(w, MXFKeys::xmlCarrier, carrier.bytes());
    uint64_t headerByteCount = w.size() - headerStart;

    uint64_t footerOffset = w.size();
    PartitionPack fp = hp;
    fp.thisPartition = footerOffset;
    fp.footerPartition = footerOffset;
    writePartitionPack(w, MXFKeys::footerPartitionClosedComplete, fp);
    writeRandomIndexPack(w, {{0, 0}, {0, footerOffset}});

    // Patch the header partition pack now that the footer and header size are known.
    hp.footerPartition = footerOffset;
    hp.headerByteCount = headerByteCount;
    std::vector<uint8_t> hv = partitionPackValue(hp);
    std::copy(hv.begin(), hv.end(), w.bytes().begin() + 20);

    std::ofstream f(path, std::ios::binary | std::ios::trunc);
    if (!f) {
        if (error) *error = path + ": cannot create";
        return false;
    }
    f.write(reinterpret_cast<const char*>(w.bytes().data()), std::streamsize(w.size()));
    if (!f) {
        if (error) *error = path + ": write failed";
        return false;
    }
    return true;
}
