// mxfDataObject: a chunk's index tables turned into per-frame and per-channel
// records, and the presentation order that reaches across chunk boundaries.
#include "mxfDataObject.h"

#include "ByteReader.h"
#include "MXFAssert.h"
#include "MXFSpanByteSource.h"
#include "SkarnLog.h"

namespace {

// The first bytes of an essence partition: its partition pack, then directly
// the partition's first essence element.
struct EssencePartitionHead {
    uint8_t bytes[256] = {};
    MXFKLVReader::KLV pack;
    MXFKLVReader::KLV element;
};

// The reports name the checks as the card reader always has, which differ
// between the video and the audio partition.
struct EssencePartitionChecks {
    uint32_t elementType;
    const char* readAll;
    const char* elementInRead;
    const char* elementTypeText;
};

void readEssencePartitionHead(const mxfDataObject& mxf, MXFByteSource* source, uint64_t offset,
                              const EssencePartitionChecks& checks, EssencePartitionHead& head) {
    const int64_t readBytes = source->readAt(offset, head.bytes, sizeof head.bytes);
    MXF_ASSERT(readBytes == 256, checks.readAll);
    MXFKLVReader reader(MXFSpanByteSource::initWithBytes(head.bytes));
    head.pack = reader.readKLV(0);
    MXF_ASSERT(head.pack.lengthSize <= 4, "BERSize<=4");
    MXF_ASSERT(mxf.MXFKeyTypeforKey(head.bytes) == MXF_BodyPartionPack,
               "[self MXFKeyTypeforKey:key] == MXF_BodyPartionPack");
    const uint64_t bppPacketLength = head.pack.valueOffset() + head.pack.length;
    MXF_ASSERT((bppPacketLength + 24) < uint64_t(readBytes), checks.elementInRead);
    MXF_ASSERT(mxf.MXFKeyTypeforKey(head.bytes + bppPacketLength) == checks.elementType, checks.elementTypeText);
    head.element = reader.readKLV(bppPacketLength);
}

}  // namespace

void mxfDataObject::scanThisRIPOffset(mxfRIPPacketOffsets* chunk, MXFByteSource* source) {
    if (!source || !chunk) return;
    const Ref<mxfRIPPacket>& video = chunk->getVideoIndexTableOffset();

    // The video essence partition. ThisPartition rather than the RIP's offset
    // places the frames: partition key and length (20), the pack, then the
    // element key (16) and its 4-byte length.
    EssencePartitionHead essence;
    readEssencePartitionHead(*this, source, video->EssenseBPPOffset(),
                             {MXF_VideoEssenseData, "readBytes==256", "(bppPacketLength+24) < readBytes",
                              "essenseTypeBeingParsed == MXF_VideoEssenseData"},
                             essence);
    const uint64_t thisPartition = loadBE64(essence.bytes + 20 + 8);
    const uint64_t firstFrameStart = thisPartition + essence.pack.length + 40;
    const uint64_t chunkEssenceBytes = video->IndexTableBPPOffset() - firstFrameStart;

    // The index partition: a body partition pack and the index table segment.
    uint8_t index[2048];
    const int64_t readBytes = source->readAt(video->IndexTableBPPOffset(), index, sizeof index);
    const std::span<const uint8_t> indexBytes(index, readBytes > 0 ? size_t(readBytes) : 0);
    MXF_ASSERT(MXFKeyTypeforKey(indexBytes) == MXF_BodyPartionPack,
               "[self MXFKeyTypeforKey:key] == MXF_BodyPartionPack");
    MXFKLVReader reader(MXFSpanByteSource::initWithBytes(indexBytes));
    const MXFKLVReader::KLV pack = reader.readKLV(0);
    const uint64_t bppPacketLength = pack.valueOffset() + pack.length;
    MXF_ASSERT(bppPacketLength < uint64_t(indexBytes.size()) + 32, "bppPacketLength<(readBytes+32)");
    const std::span<const uint8_t> indexTableKeyAddr =
        bppPacketLength < indexBytes.size() ? indexBytes.subspan(size_t(bppPacketLength)) : std::span<const uint8_t>();
    MXF_ASSERT(MXFKeyTypeforKey(indexTableKeyAddr) == MXF_IndexTableSegment,
               "[self MXFKeyTypeforKey:indexTableKeyAddr] == MXF_IndexTableSegment");
    const MXFKLVReader::KLV segmentKLV = reader.readKLV(bppPacketLength);
    MXF_ASSERT(segmentKLV.valueOffset() + segmentKLV.length < uint64_t(indexBytes.size()),
               "(bppPacketLength + 16 + BERSize+BERLength)<readBytes");
    const auto segment = indexBytes.subspan(size_t(segmentKLV.valueOffset()), size_t(segmentKLV.length));

    int64_t videoIndexStartPosition = -1;
    int64_t videoIndexDuration = 0;
    int64_t videoFramesInChunk = 0;
    uint64_t frameOffset = 0;  // from the first frame's start
    MXFKLVReader::forEachLocalTag(segment, [&](uint16_t tag, uint16_t packetLength, std::span<const uint8_t> v) {
        if (tag == 0x3f0c || tag == 0x3f0d) {
            MXF_ASSERT(8 == packetLength, "8 == packetLength");
            (tag == 0x3f0c ? videoIndexStartPosition : videoIndexDuration) = int64_t(loadBE64(v.data()));
            return;
        }
        if (tag != 0x3f0a) return;
        ByteReader array(v);
        const uint64_t numberOfIndexEntries = array.u32();
        const uint64_t indexEntrySize = array.u32();
        if (numberOfIndexEntries == 0) return;
        MXF_ASSERT(videoIndexStartPosition != -1, "videoIndexStartPosition != -1");
        MXF_ASSERT(numberOfIndexEntries * indexEntrySize + 8 == packetLength,
                   "numberOfIndexEntries * indexEntrySize + 8 == packetLength");
        // TemporalOffset, KeyFrameOffset, Flags and an 8-byte StreamOffset at least.
        if (indexEntrySize < 11) {
            SkarnLog(1, "mxfDataObject: index entries of %llu bytes are too short", indexEntrySize);
            return;
        }
        auto entry = [&](uint64_t k) { return v.subspan(size_t(8 + k * indexEntrySize), size_t(indexEntrySize)); };
        for (uint64_t k = 0; k < numberOfIndexEntries; ++k) {
            const auto e = entry(k);
            const int8_t temporalOffset = int8_t(e[0]);
            const uint8_t flags = e[2];
            // Each frame is its own KLV with a 4-byte length; the last one takes
            // what is left of the partition's essence.
            uint32_t size;
            if (k + 1 < numberOfIndexEntries)
                size = uint32_t(loadBE64(entry(k + 1).data() + 3) - loadBE64(e.data() + 3) - 20);
            else
                size = uint32_t(chunkEssenceBytes - frameOffset);
            MXF_ASSERT(videoFramesInChunk >= 0 && uint64_t(videoFramesInChunk) < _expectedVideoSampleArraySize,
                       "videoFramesInChunk >= 0 && videoFramesInChunk < _expectedVideoSampleArraySize");
            chunk->addVideoOffset(mxfEssenseOffsets::initWithOffset(
                int64_t(firstFrameStart + frameOffset), size, uint32_t(uint64_t(videoIndexStartPosition) + k),
                uint8_t(flags & 7), int16_t(int64_t(k) + temporalOffset)));
            frameOffset += uint64_t(size) + 20;
            ++videoFramesInChunk;
        }
    });

    // Frames per chunk: the first chunk's when it is known (the last chunk may be short).
    mxfRIPPacketOffsets* first = chunkLocked(0);
    if (chunk != first && first && !first->getVideoOffsets().empty())
        videoIndexDuration = int64_t(first->getVideoOffsets().size());
    MXF_ASSERT(videoIndexDuration != 0, "videoIndexDuration!=0");
    MXF_ASSERT(videoIndexDuration != -1, "videoIndexDuration!=-1");

    const auto& audio = chunk->getAudioIndexTableOffsets();
    if (_mxfTotalAudioChannelCount == 0 || audio.empty()) return;
    MXF_ASSERT(_mxfAudioBytesPerSample > 0, "_mxfAudioBytesPerSample > 0");
    EssencePartitionHead audioEssence;
    readEssencePartitionHead(*this, source, audio.front()->EssenseBPPOffset(),
                             {MXF_AudioEssenseData, "readBytesEssense==256", "(bppPacketLength+24) < readBytesEssense",
                              "essenseTypeBeingParsed == MXF_AudioEssenseData"},
                             audioEssence);
    const uint64_t blockSize = audioEssence.element.length;
    const uint64_t headerDistance = audioEssence.element.valueOffset();
    // Every channel is taken to be laid out like channel 0, block size included.
    const uint64_t samplesPerChunk = _mxfRIPAudioChunkSize / _mxfAudioBytesPerSample;
    const uint32_t firstSample =
        uint32_t(samplesPerChunk * uint64_t(videoIndexStartPosition / videoIndexDuration));
    for (size_t chan = 0; chan < audio.size(); ++chan) {
        Ref<mxfEssenseOffsets> block = mxfEssenseOffsets::initWithOffset(
            int64_t(audio[chan]->EssenseBPPOffset() + headerDistance), uint32_t(blockSize), firstSample, 0, 0);
        block->updateAudioWithPTSandDTS(firstSample);
        chunk->addAudioOffsetForChannel(chan, block);
    }
}

void mxfDataObject::scanMXFForRIPIndex(size_t chunkIndex) {
    std::lock_guard<std::mutex> guard(_lock);
    if (_footerPartitionOffset == 0 || _expectedVideoSampleArraySize == 0 || chunkIndex >= _chunkCount) return;
    mxfRIPPacketOffsets* chunk = chunkLocked(chunkIndex);
    if (chunk->hasBeenScanned() && chunk->isPTSIndexComplete()) return;
    // A frame's presentation index may lie in a neighbouring chunk.
    mxfRIPPacketOffsets* previous = chunkIndex > 0 ? chunkLocked(chunkIndex - 1) : nullptr;
    mxfRIPPacketOffsets* next = chunkLocked(chunkIndex + 1);
    const bool allScanned = chunk->hasBeenScanned() && (!previous || previous->hasBeenScanned()) &&
                            (!next || next->hasBeenScanned());
    ScanSource file(*this, !allScanned);
    if (!allScanned && !file.get()) return;

    // Reordering: the frame shown at position n of the run of chunks is stored
    // at n + its TemporalOffset. Applying the run's offsets twice maps a stored
    // frame back to where it is shown for the card's three-frame B patterns.
    std::vector<int64_t> order;
    auto append = [&order](mxfRIPPacketOffsets* c) {
        const auto& frames = c->getVideoOffsets();
        if (frames.empty()) return;
        const int64_t firstDecodeOrder = frames.front()->decodeOrder();
        for (const auto& f : frames) order.push_back(f->temporalOffsetIndexed() + firstDecodeOrder);
    };
    size_t base = 0;
    if (previous) {
        if (!previous->hasBeenScanned()) scanThisRIPOffset(previous, file.get());
        append(previous);
        base = order.size();
    }
    if (!chunk->hasBeenScanned()) scanThisRIPOffset(chunk, file.get());
    if (chunk->getVideoOffsets().empty()) return;
    append(chunk);
    if (next) {
        if (!next->hasBeenScanned()) scanThisRIPOffset(next, file.get());
        append(next);
    }
    for (const auto& frame : chunk->getVideoOffsets()) {
        const int64_t at = int64_t(base) + frame->temporalOffsetIndexed();
        if (at < 0 || at >= int64_t(order.size())) {
            SkarnLog(1, "mxfDataObject: temporal offset of frame %u reaches outside its chunks", frame->decodeOrder());
            continue;
        }
        frame->updateWithPTS(uint32_t(order[size_t(at)]));
    }
    chunk->setPTSIndexComplete();
}
