// mxfDataObject: the opening scan. The header partition and its metadata give
// the audio format and the clip's durations, the footer partition pack and the
// random index pack right after it the chunk list, and the first audio index
// table the audio bytes of one chunk.
#include "mxfDataObject.h"

#include "AssertionHandler.h"
#include "ByteReader.h"
#include "MXFAssert.h"
#include "MXFCachedByteSource.h"
#include "SkarnLog.h"

#include <algorithm>
#include <limits>

namespace {

uint64_t saturatingAdd(uint64_t a, uint64_t b) {
    return a > std::numeric_limits<uint64_t>::max() - b ? std::numeric_limits<uint64_t>::max() : a + b;
}

}  // namespace

int64_t mxfDataObject::readValue(MXFKLVReader& reader, const MXFKLVReader::KLV& klv, std::vector<uint8_t>& value) {
    if (klv.length > uint64_t(std::numeric_limits<int32_t>::max())) return -1;
    const uint64_t there = reader.valueBytesThere(klv);
    if (there < klv.length && klv.length > MXFCachedByteSource::kBlockSize) {
        // The direct read would come up short; nothing is allocated for bytes
        // the file does not have.
        value.clear();
        return int64_t(there);
    }
    // Up to a block, the cached read answers zeros past the end, as ever.
    value.assign(size_t(klv.length), 0);
    return reader.readValue(klv, value.data());
}

void mxfDataObject::takeAES3Descriptor(std::span<const uint8_t> value) {
    MXFKLVReader::forEachLocalTag(value, [this](uint16_t tag, uint16_t, std::span<const uint8_t> v) {
        ByteReader r(v);
        switch (tag) {
            case 0x3d0a: {
                _mxfAudioBytesPerSample = r.u16();
                if (_mxfAudioBytesPerSample != 2 && _mxfAudioBytesPerSample != 3)
                    AssertionHandler::currentHandler().handleFailureInMethod(
                        "scanMXFForData", kMXFAssertSource, __LINE__, "Expect audio blockAlign is 2 or 3.");
                break;
            }
            case 0x3d07:
                _mxfTotalAudioChannelCount += r.u32();
                break;
            case 0x3d03: {
                int32_t numerator = r.i32();
                int32_t denominator = r.i32();
                // A zero (or overflowing) denominator leaves the rate unknown.
                bool divisible = denominator != 0 && !(denominator == -1 && numerator == INT32_MIN);
                _mxfAudioSamplingRate = divisible ? uint32_t(numerator / denominator) : 0;
                break;
            }
            default:
                break;
        }
    });
}

void mxfDataObject::takeSourceClip(std::span<const uint8_t> value) {
    // The DataDefinition label's byte 12 tells picture (01) from sound (02);
    // anything that is not picture counts as sound here.
    bool picture = false;
    MXFKLVReader::forEachLocalTag(value, [&](uint16_t tag, uint16_t length, std::span<const uint8_t> v) {
        if (tag == 0x0201) {
            picture = v.size() > 12 && v[12] == 0x01;
        } else if (tag == 0x0202) {
            if (length != 8) {
                SkarnLog(1, "WRONG Length for mxfKeyInt64Type");
                return;
            }
            uint64_t duration = loadBE64(v.data());
            if (picture)
                _expectedVideoSampleArraySize = duration;
            else
                _expectedAudioSampleArraySize = duration;
        }
    });
}

void mxfDataObject::scanMXFForData() {
    ScanSource file(*this);
    if (!file.get()) return;
    _fileSize = file.get()->size();
    uint64_t scanLimit = _fileSize;
    // Header metadata is read in small steps; the cache starts empty.
    const Ref<MXFByteSource> cache = MXFCachedByteSource::initWithSource(file.ref());
    MXFKLVReader reader(cache);

    std::vector<uint8_t> value;
    uint64_t keyOffset = 0;
    while (keyOffset <= scanLimit) {
        const MXFKLVReader::KLV klv = reader.readKLV(keyOffset);
        const uint32_t type = MXFKeyTypeforKey(klv.key.data());
        if (type == MXF_AES3AudioDescriptor || type == MXF_SourceClip) {
            const int64_t bodyPartitionBytes = readValue(reader, klv, value);
            if (bodyPartitionBytes >= 0) {
                MXF_ASSERT(uint64_t(bodyPartitionBytes) == klv.length, "bodyPartitionBytes == BERLength");
                if (type == MXF_AES3AudioDescriptor)
                    takeAES3Descriptor(value);
                else
                    takeSourceClip(value);
            }
        } else if (type == MXF_HeaderPartionPack) {
            const int64_t headerPartitionBytes = readValue(reader, klv, value);
            if (headerPartitionBytes >= 0) {
                MXF_ASSERT(uint64_t(headerPartitionBytes) == klv.length, "headerPartitionBytes == BERLength");
                // Fields a short pack lacks read as zero.
                std::vector<uint8_t> headerPartition(value);
                if (headerPartition.size() < 40) headerPartition.resize(40, 0);
                MXF_ASSERT(headerPartition[0] == 0, "headerPartition[0] == 0");
                MXF_ASSERT(headerPartition[1] == 1, "headerPartition[1] == 1");
                MXF_ASSERT(headerPartition[2] == 0, "headerPartition[2] == 0");
                MXF_ASSERT(headerPartition[3] == 3, "headerPartition[3] == 3");
                _footerPartitionOffset = loadBE64(headerPartition.data() + 24);
                uint64_t headerByteCount = loadBE64(headerPartition.data() + 32);
                // The header metadata ends HeaderByteCount bytes after the pack
                // (which sits at 0); nothing past the file's end is worth walking.
                scanLimit = std::min(_fileSize, saturatingAdd(saturatingAdd(klv.length, headerByteCount), 20));
            }
        }
        const std::optional<uint64_t> next = MXFKLVReader::nextKeyOffset(klv);
        if (!next) break;
        keyOffset = *next;
    }

    // The footer partition pack, and directly after it the random index pack.
    if (_footerPartitionOffset < _fileSize) {
        const MXFKLVReader::KLV footer = reader.readKLV(_footerPartitionOffset);
        if (MXFKeyTypeforKey(footer.key.data()) == MXF_FooterPartionPack) readRandomIndexPack(reader, footer, value);
    }
    value = {};
    if (_chunkCount == 0) return;

    uint32_t editUnitByteCount = 0;
    if (_mxfTotalAudioChannelCount != 0) {
        readAudioIndexTable(cache);
        editUnitByteCount = _audioEditUnitByteCount;
    }
    if (_expectedAudioSampleArraySize == 0)
        AssertionHandler::currentHandler().handleFailureInMethod("scanMXFForData", kMXFAssertSource, __LINE__,
                                                                 "Invalid _expectedAudioSampleArraySize\n");
    else
        _mxfRIPAudioDataLength = _expectedAudioSampleArraySize * editUnitByteCount;
    _mxfRIPVideoFrameCount = _expectedVideoSampleArraySize;
    if (_mxfRIPVideoFrameCount == 0)
        AssertionHandler::currentHandler().handleFailureInMethod("scanMXFForData", kMXFAssertSource, __LINE__,
                                                                 "Invalid _expectedVideoSampleArraySize\n");
}

// The RIP must follow the footer partition pack directly. Its entries are
// vetted group by group now, as building each chunk would; the chunk objects
// themselves wait until they are asked for.
void mxfDataObject::readRandomIndexPack(MXFKLVReader& reader, const MXFKLVReader::KLV& footer,
                                        std::vector<uint8_t>& value) {
    const MXFKLVReader::KLV rip = reader.readKLV(saturatingAdd(footer.valueOffset(), footer.length));
    if (rip.keyOffset >= _fileSize || MXFKeyTypeforKey(rip.key.data()) != MXF_RandomIndexPack) return;
    const int64_t got = readValue(reader, rip, value);
    std::span<const uint8_t> ripValue(value.data(), got > 0 ? std::min(size_t(got), value.size()) : 0);
    if (ripValue.size() < 4) return;
    const uint64_t entryCount = (ripValue.size() - 4) / 12;
    const uint64_t groupEntries = 2 * uint64_t(_mxfTotalAudioChannelCount) + 4;
    const size_t groupBytes = mxfRIPPacketOffsets::ripGroupBytes(_mxfTotalAudioChannelCount);
    // Entry 0 is the header partition and the last the footer.
    const uint64_t E = entryCount - 1;
    size_t chunks = 0;
    for (uint64_t i = 1; i < E; i += groupEntries) {
        if (groupEntries > entryCount - i) break;  // a cut-off group is not a chunk
        auto group = ripValue.subspan(size_t(i * 12), groupBytes);
        if (!mxfRIPPacketOffsets::checkRIPPacket(group, _mxfTotalAudioChannelCount)) break;
        ++chunks;
    }
    if (!chunks) return;
    value.resize(ripValue.size());
    _ripEntries = std::move(value);
    _ripFirstGroup = 12;
    _ripGroupBytes = groupBytes;
    _mxfRIPPacketData = std::make_unique<std::atomic<mxfRIPPacketOffsets*>[]>(chunks);
    _chunkCount = chunks;
}

// The first audio channel's index table gives the audio bytes of one chunk:
// EditUnitByteCount (one sample of the channel) times IndexDuration.
void mxfDataObject::readAudioIndexTable(const Ref<MXFByteSource>& cache) {
    MXFKLVReader reader(cache);
    const uint64_t partition = chunkPointer(0)->getAudioIndexTableOffsets().front()->IndexTableBPPOffset();
    const MXFKLVReader::KLV pack = reader.readKLV(partition);
    MXF_ASSERT(MXFKeyTypeforKey(pack.key.data()) == MXF_BodyPartionPack,
               "[self MXFKeyTypeforKey:key] == MXF_BodyPartionPack");
    const MXFKLVReader::KLV segment = reader.readKLV(saturatingAdd(pack.valueOffset(), pack.length));
    MXF_ASSERT(MXFKeyTypeforKey(segment.key.data()) == MXF_IndexTableSegment,
               "[self MXFKeyTypeforKey:key] == MXF_IndexTableSegment");
    std::vector<uint8_t> value;
    const int64_t indexTableBytes = readValue(reader, segment, value);
    if (indexTableBytes < 0) return;
    MXF_ASSERT(uint64_t(indexTableBytes) == segment.length, "indexTableBytes == BERLength");
    uint64_t indexDuration = 0;
    MXFKLVReader::forEachLocalTag(value, [&](uint16_t tag, uint16_t, std::span<const uint8_t> v) {
        ByteReader r(v);
        if (tag == 0x3f05) _audioEditUnitByteCount = r.u32();
        if (tag == 0x3f0d) indexDuration = r.u64();
    });
    _mxfRIPAudioChunkSize = uint64_t(_audioEditUnitByteCount) * indexDuration;
}
