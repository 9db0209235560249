#include "mxfDataObject.h"

#include "AssertionHandler.h"
#include "ByteReader.h"
#include "SkarnLog.h"

#include <algorithm>
#include <cstring>
#include <fcntl.h>
#include <limits>
#include <sys/stat.h>
#include <unistd.h>

#define MXF_ASSERT(cond, text) SKARN_HARD_ASSERT_TEXT(cond, text, "MXF/SkarnMXFMetadata")

namespace {

constexpr uint64_t kBlockSize = 4096;
constexpr const char* kSoftAssertFile = "MXF/SkarnMXFMetadata";

// Closes a descriptor on every way out, assertions that throw included.
class FileDescriptor {
public:
    explicit FileDescriptor(int fd = -1) : _fd(fd) {}
    ~FileDescriptor() {
        if (_fd >= 0) ::close(_fd);
    }
    FileDescriptor(const FileDescriptor&) = delete;
    FileDescriptor& operator=(const FileDescriptor&) = delete;
    int get() const { return _fd; }

private:
    int _fd;
};

bool hasPrefix(const uint8_t* key, std::initializer_list<uint8_t> prefix) {
    return std::equal(prefix.begin(), prefix.end(), key);
}

// BER lengths as the card writes them: 0x83 (three length bytes) or 0x87
// (seven). Any other first byte is not decoded: the value length is 0 and the
// length field keeps the size the previous KLV had.
void decodeBERLength(std::span<const uint8_t> lengthField, uint64_t& length, uint32_t& lengthSize) {
    ByteReader r(lengthField);
    uint8_t first = r.u8();
    if (first == 0x83) {
        length = r.uN(3);
        lengthSize = 4;
    } else if (first == 0x87) {
        length = r.uN(7);
        lengthSize = 8;
    } else {
        length = 0;
    }
}

uint64_t saturatingAdd(uint64_t a, uint64_t b) {
    return a > std::numeric_limits<uint64_t>::max() - b ? std::numeric_limits<uint64_t>::max() : a + b;
}

// Walks a local set (2-byte tag, 2-byte length, value); a truncated item ends it.
template <class F>
void forEachLocalTag(std::span<const uint8_t> set, F&& f) {
    ByteReader r(set);
    while (r.remaining() >= 4) {
        uint16_t tag = r.u16();
        uint16_t length = r.u16();
        if (!r.has(length)) break;
        f(tag, length, r.take(length));
    }
}

}  // namespace

Ref<mxfDataObject> mxfDataObject::initWithPath(const std::optional<std::string>& path) {
    Ref<mxfDataObject> object(new mxfDataObject());
    object->_footerPartitionOffset = 0;
    object->_mxfXMLString = std::nullopt;
    object->_mxfIngestData = nullptr;
    object->_expectedVideoSampleArraySize = 0;
    object->_mxfTotalAudioChannelCount = 0;
    object->_mxfPath = path;
    object->scanMXFForData();
    return object;
}

mxfDataObject::~mxfDataObject() {
    for (size_t i = 0; i < _chunkCount; ++i)
        if (mxfRIPPacketOffsets* chunk = _mxfRIPPacketData[i].load(std::memory_order_relaxed)) chunk->release();
}

mxfRIPPacketOffsets* mxfDataObject::chunkLocked(size_t index) const {
    if (index >= _chunkCount) return nullptr;
    mxfRIPPacketOffsets* chunk = _mxfRIPPacketData[index].load(std::memory_order_acquire);
    if (chunk) return chunk;
    auto group = std::span<const uint8_t>(_ripEntries).subspan(_ripFirstGroup + index * _ripGroupBytes, _ripGroupBytes);
    // The entries were checked when the file was opened, so this cannot fail.
    chunk = mxfRIPPacketOffsets::initWithRIPPacket(group, _mxfTotalAudioChannelCount, uint32_t(index)).detach();
    _mxfRIPPacketData[index].store(chunk, std::memory_order_release);
    return chunk;
}

mxfRIPPacketOffsets* mxfDataObject::chunkPointer(size_t index) const {
    if (index >= _chunkCount) return nullptr;
    if (mxfRIPPacketOffsets* chunk = _mxfRIPPacketData[index].load(std::memory_order_acquire)) return chunk;
    std::lock_guard<std::mutex> guard(_lock);
    return chunkLocked(index);
}

int mxfDataObject::openUncached() const {
    if (!_mxfPath) return -1;
    int fd = ::open(_mxfPath->c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) return -1;
    // Each essence byte is read once, so keeping it cached helps no one; Linux
    // has no per-descriptor cache switch, the hint is the nearest thing.
    ::posix_fadvise(fd, 0, 0, POSIX_FADV_NOREUSE);
    return fd;
}

ssize_t mxfDataObject::countedPread(int fd, void* data, size_t count, uint64_t offset) {
    _readCalls.fetch_add(1, std::memory_order_relaxed);
    if (offset > uint64_t(std::numeric_limits<off_t>::max())) return -1;
    ssize_t n;
    do {
        n = ::pread(fd, data, count, off_t(offset));
    } while (n < 0 && errno == EINTR);
    if (n > 0) _readBytes.fetch_add(uint64_t(n), std::memory_order_relaxed);
    return n;
}

ssize_t mxfDataObject::loadBlock(uint64_t head, int fd) {
    _fileHeadPosition = head;
    _fileTailPosition = 0;
    ssize_t n = countedPread(fd, _readbuffer, kBlockSize, head);
    if (n < 0) return n;
    // Past the end of the file the cache holds zeros rather than the previous block.
    if (size_t(n) < kBlockSize) std::memset(_readbuffer + n, 0, kBlockSize - size_t(n));
    _fileTailPosition = head + (size_t(n) < kBlockSize ? uint64_t(n) : kBlockSize);
    return n;
}

int32_t mxfDataObject::readFileAt(uint64_t offset, void* data, int32_t count, int fd) {
    if (count <= 0) return 0;
    auto* out = static_cast<uint8_t*>(data);
    const uint64_t wanted = uint64_t(count);
    if (wanted > kBlockSize) return int32_t(countedPread(fd, out, wanted, offset));
    // An offset no file can have fails like the read there would.
    MXF_ASSERT(offset <= uint64_t(std::numeric_limits<off_t>::max()) - 2 * kBlockSize, "readBytes != -1");

    if (_fileHeadPosition > offset) _fileTailPosition = 0;
    const uint64_t end = offset + wanted;
    if (_fileTailPosition != 0 && end <= _fileTailPosition) {
        std::memcpy(out, _readbuffer + (offset - _fileHeadPosition), wanted);
        return count;
    }
    uint64_t copied = 0;
    if (_fileTailPosition > offset) {
        copied = _fileTailPosition - offset;
        std::memcpy(out, _readbuffer + (offset - _fileHeadPosition), copied);
    }
    const uint64_t position = offset + copied;
    const uint64_t head = position & ~(kBlockSize - 1);
    ssize_t readBytes = loadBlock(head, fd);
    MXF_ASSERT(readBytes != -1, "readBytes != -1");
    if (end <= head + kBlockSize) {
        std::memcpy(out + copied, _readbuffer + (position - head), wanted - copied);
        return count;
    }
    const uint64_t firstPart = head + kBlockSize - position;
    std::memcpy(out + copied, _readbuffer + (position - head), firstPart);
    copied += firstPart;
    readBytes = loadBlock(head + kBlockSize, fd);
    MXF_ASSERT(readBytes >= ssize_t(wanted - copied), "readBytes >= (bytesWanted - keyStartIndex)");
    std::memcpy(out + copied, _readbuffer, wanted - copied);
    return count;
}

uint32_t mxfDataObject::MXFKeyTypeforKey(std::span<const uint8_t> key) const {
    return key.size() < 16 ? MXF_UnknownKey : MXFKeyTypeforKey(key.data());
}

uint32_t mxfDataObject::MXFKeyTypeforKey(const uint8_t* k) const {
    if (hasPrefix(k, {0x06, 0x0e, 0x2b, 0x34, 0x02, 0x05, 0x01, 0x01, 0x0d, 0x01, 0x02, 0x01, 0x01})) {
        switch (k[13]) {
            case 0x02: return MXF_HeaderPartionPack;
            case 0x03: return MXF_BodyPartionPack;
            case 0x04: return MXF_FooterPartionPack;
            case 0x11: return k[14] == 0x01 && k[15] == 0x00 ? MXF_RandomIndexPack : MXF_UnknownKey;
            default: return MXF_UnknownKey;
        }
    }
    if (hasPrefix(k, {0x06, 0x0e, 0x2b, 0x34, 0x01, 0x02, 0x01, 0x01, 0x0d, 0x01, 0x03, 0x01})) {
        switch (k[12]) {
            case 0x15: return MXF_VideoEssenseData;
            case 0x16: return MXF_AudioEssenseData;
            case 0x17: return MXF_ANCEssenseData;
            default: return MXF_UnknownKey;
        }
    }
    if (hasPrefix(k, {0x06, 0x0e, 0x2b, 0x34, 0x02, 0x53, 0x01, 0x01, 0x0d, 0x01, 0x01, 0x01, 0x01, 0x01})) {
        if (k[14] == 0x11) return MXF_SourceClip;
        if (k[14] == 0x47) return MXF_AES3AudioDescriptor;
        return MXF_UnknownKey;
    }
    if (hasPrefix(k, {0x06, 0x0e, 0x2b, 0x34, 0x02, 0x53, 0x01, 0x01, 0x0d, 0x01, 0x02, 0x01, 0x01, 0x10, 0x01, 0x00}))
        return MXF_IndexTableSegment;
    if (hasPrefix(k, {0x06, 0x0e, 0x2b, 0x34, 0x01, 0x01, 0x01, 0x09, 0x0e, 0x0e})) return MXF_PrivateKey;
    if (hasPrefix(k, {0x06, 0x0e, 0x2b, 0x34, 0x01, 0x01, 0x01, 0x02, 0x03, 0x01, 0x02, 0x10, 0x01, 0x00, 0x00, 0x00}))
        return MXF_KLVFill;
    return MXF_UnknownKey;
}

mxfDataObject::KLVHeader mxfDataObject::readKLVHeader(uint64_t keyOffset, uint32_t previousLengthSize, int fd) {
    uint8_t header[24];
    readFileAt(keyOffset, header, sizeof header, fd);
    KLVHeader klv;
    klv.keyOffset = keyOffset;
    std::memcpy(klv.key, header, 16);
    klv.lengthSize = previousLengthSize;
    decodeBERLength(std::span<const uint8_t>(header + 16, 8), klv.length, klv.lengthSize);
    return klv;
}

int64_t mxfDataObject::readValue(const KLVHeader& klv, std::vector<uint8_t>& value, int fd) {
    const uint64_t start = klv.valueOffset();
    if (klv.length > uint64_t(std::numeric_limits<int32_t>::max())) return -1;
    const uint64_t there = start < _fileSize ? std::min(klv.length, _fileSize - start) : 0;
    if (there < klv.length && klv.length > kBlockSize) {
        // The direct read would come up short; nothing is allocated for bytes
        // the file does not have.
        value.clear();
        return int64_t(there);
    }
    // Up to a block, the cached read answers zeros past the end, as ever.
    value.assign(size_t(klv.length), 0);
    return readFileAt(start, value.data(), int32_t(value.size()), fd);
}

void mxfDataObject::takeAES3Descriptor(std::span<const uint8_t> value) {
    forEachLocalTag(value, [this](uint16_t tag, uint16_t, std::span<const uint8_t> v) {
        ByteReader r(v);
        switch (tag) {
            case 0x3d0a: {
                _mxfAudioBytesPerSample = r.u16();
                if (_mxfAudioBytesPerSample != 2 && _mxfAudioBytesPerSample != 3)
                    AssertionHandler::currentHandler().handleFailureInMethod(
                        "scanMXFForData", kSoftAssertFile, __LINE__, "Expect audio blockAlign is 2 or 3.");
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
    forEachLocalTag(value, [&](uint16_t tag, uint16_t length, std::span<const uint8_t> v) {
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
    FileDescriptor file(openUncached());
    const int fd = file.get();
    if (fd < 0) return;
    struct stat st {};
    if (::fstat(fd, &st) != 0) return;
    _fileSize = uint64_t(st.st_size);
    uint64_t scanLimit = _fileSize;
    _fileTailPosition = 0;

    std::vector<uint8_t> value;
    uint32_t lengthSize = 4;
    uint64_t keyOffset = 0;
    while (keyOffset <= scanLimit) {
        KLVHeader klv = readKLVHeader(keyOffset, lengthSize, fd);
        lengthSize = klv.lengthSize;
        const uint32_t type = MXFKeyTypeforKey(klv.key);
        if (type == MXF_AES3AudioDescriptor || type == MXF_SourceClip) {
            const int64_t bodyPartitionBytes = readValue(klv, value, fd);
            if (bodyPartitionBytes >= 0) {
                MXF_ASSERT(uint64_t(bodyPartitionBytes) == klv.length, "bodyPartitionBytes == BERLength");
                if (type == MXF_AES3AudioDescriptor)
                    takeAES3Descriptor(value);
                else
                    takeSourceClip(value);
            }
        } else if (type == MXF_HeaderPartionPack) {
            const int64_t headerPartitionBytes = readValue(klv, value, fd);
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
        const uint64_t next = saturatingAdd(klv.valueOffset(), klv.length);
        if (next <= keyOffset || next == std::numeric_limits<uint64_t>::max()) break;
        keyOffset = next;
    }

    // The footer partition pack, and directly after it the random index pack.
    if (_footerPartitionOffset < _fileSize) {
        KLVHeader footer = readKLVHeader(_footerPartitionOffset, lengthSize, fd);
        if (MXFKeyTypeforKey(footer.key) == MXF_FooterPartionPack) {
            KLVHeader rip = readKLVHeader(saturatingAdd(footer.valueOffset(), footer.length), footer.lengthSize, fd);
            if (rip.keyOffset < _fileSize && MXFKeyTypeforKey(rip.key) == MXF_RandomIndexPack) {
                const int64_t got = readValue(rip, value, fd);
                std::span<const uint8_t> ripValue(value.data(), got > 0 ? std::min(size_t(got), value.size()) : 0);
                if (ripValue.size() >= 4) {
                    const uint64_t entryCount = (ripValue.size() - 4) / 12;
                    const uint64_t groupEntries = 2 * uint64_t(_mxfTotalAudioChannelCount) + 4;
                    const size_t groupBytes = mxfRIPPacketOffsets::ripGroupBytes(_mxfTotalAudioChannelCount);
                    // Entry 0 is the header partition and the last the footer.
                    // Every group is checked now, as building it would; the
                    // chunk objects themselves wait until they are asked for.
                    const uint64_t E = entryCount - 1;
                    size_t chunks = 0;
                    for (uint64_t i = 1; i < E; i += groupEntries) {
                        if (groupEntries > entryCount - i) break;  // a cut-off group is not a chunk
                        auto group = ripValue.subspan(size_t(i * 12), groupBytes);
                        if (!mxfRIPPacketOffsets::checkRIPPacket(group, _mxfTotalAudioChannelCount)) break;
                        ++chunks;
                    }
                    if (chunks) {
                        value.resize(ripValue.size());
                        _ripEntries = std::move(value);
                        _ripFirstGroup = 12;
                        _ripGroupBytes = groupBytes;
                        _mxfRIPPacketData = std::make_unique<std::atomic<mxfRIPPacketOffsets*>[]>(chunks);
                        _chunkCount = chunks;
                    }
                }
            }
        }
    }
    value = {};
    if (_chunkCount == 0) return;

    uint32_t editUnitByteCount = 0;
    if (_mxfTotalAudioChannelCount != 0) {
        readAudioIndexTable(fd);
        editUnitByteCount = _audioEditUnitByteCount;
    }
    if (_expectedAudioSampleArraySize == 0)
        AssertionHandler::currentHandler().handleFailureInMethod("scanMXFForData", kSoftAssertFile, __LINE__,
                                                                 "Invalid _expectedAudioSampleArraySize\n");
    else
        _mxfRIPAudioDataLength = _expectedAudioSampleArraySize * editUnitByteCount;
    _mxfRIPVideoFrameCount = _expectedVideoSampleArraySize;
    if (_mxfRIPVideoFrameCount == 0)
        AssertionHandler::currentHandler().handleFailureInMethod("scanMXFForData", kSoftAssertFile, __LINE__,
                                                                 "Invalid _expectedVideoSampleArraySize\n");
}

// The first audio channel's index table gives the audio bytes of one chunk:
// EditUnitByteCount (one sample of the channel) times IndexDuration.
void mxfDataObject::readAudioIndexTable(int fd) {
    const uint64_t partition = chunkPointer(0)->getAudioIndexTableOffsets().front()->IndexTableBPPOffset();
    KLVHeader pack = readKLVHeader(partition, 4, fd);
    const uint8_t* key = pack.key;
    MXF_ASSERT(MXFKeyTypeforKey(key) == MXF_BodyPartionPack, "[self MXFKeyTypeforKey:key] == MXF_BodyPartionPack");
    KLVHeader segment = readKLVHeader(saturatingAdd(pack.valueOffset(), pack.length), pack.lengthSize, fd);
    key = segment.key;
    MXF_ASSERT(MXFKeyTypeforKey(key) == MXF_IndexTableSegment, "[self MXFKeyTypeforKey:key] == MXF_IndexTableSegment");
    std::vector<uint8_t> value;
    const int64_t indexTableBytes = readValue(segment, value, fd);
    if (indexTableBytes < 0) return;
    MXF_ASSERT(uint64_t(indexTableBytes) == segment.length, "indexTableBytes == BERLength");
    uint64_t indexDuration = 0;
    forEachLocalTag(value, [&](uint16_t tag, uint16_t, std::span<const uint8_t> v) {
        ByteReader r(v);
        if (tag == 0x3f05) _audioEditUnitByteCount = r.u32();
        if (tag == 0x3f0d) indexDuration = r.u64();
    });
    _mxfRIPAudioChunkSize = uint64_t(_audioEditUnitByteCount) * indexDuration;
}

int32_t mxfDataObject::getAudioChunkSize(uint64_t* chunkSize, uint64_t* dataLength) const {
    if (chunkSize) *chunkSize = _mxfRIPAudioChunkSize;
    if (dataLength) *dataLength = _mxfRIPAudioDataLength;
    return 0;
}

int32_t mxfDataObject::getVideoFrameCount(uint32_t* count) const {
    if (count) *count = uint32_t(_mxfRIPVideoFrameCount);
    return 0;
}

void mxfDataObject::scanThisRIPOffset(mxfRIPPacketOffsets* chunk, int fd) {
    if (fd < 0 || !chunk) return;
    const Ref<mxfRIPPacket>& video = chunk->getVideoIndexTableOffset();

    // The video essence partition: its pack, then directly the first picture element.
    uint8_t essence[256];
    ssize_t readBytes = countedPread(fd, essence, sizeof essence, video->EssenseBPPOffset());
    MXF_ASSERT(readBytes == 256, "readBytes==256");
    uint64_t packLength = 0;
    uint32_t BERSize = 4;
    decodeBERLength(std::span<const uint8_t>(essence + 16, 8), packLength, BERSize);
    MXF_ASSERT(BERSize <= 4, "BERSize<=4");
    const uint8_t* key = essence;
    MXF_ASSERT(MXFKeyTypeforKey(key) == MXF_BodyPartionPack, "[self MXFKeyTypeforKey:key] == MXF_BodyPartionPack");
    uint64_t bppPacketLength = 20 + packLength;
    MXF_ASSERT((bppPacketLength + 24) < uint64_t(readBytes), "(bppPacketLength+24) < readBytes");
    uint32_t essenseTypeBeingParsed = MXFKeyTypeforKey(essence + bppPacketLength);
    MXF_ASSERT(essenseTypeBeingParsed == MXF_VideoEssenseData, "essenseTypeBeingParsed == MXF_VideoEssenseData");
    // ThisPartition rather than the RIP's offset places the frames: partition
    // key and length (20), the pack, then the element key (16) and its 4-byte length.
    const uint64_t thisPartition = loadBE64(essence + 20 + 8);
    const uint64_t firstFrameStart = thisPartition + packLength + 40;
    const uint64_t chunkEssenceBytes = video->IndexTableBPPOffset() - firstFrameStart;

    // The index partition: a body partition pack and the index table segment.
    uint8_t index[2048];
    readBytes = countedPread(fd, index, sizeof index, video->IndexTableBPPOffset());
    const std::span<const uint8_t> indexBytes(index, readBytes > 0 ? size_t(readBytes) : 0);
    key = index;
    MXF_ASSERT(MXFKeyTypeforKey(indexBytes) == MXF_BodyPartionPack,
               "[self MXFKeyTypeforKey:key] == MXF_BodyPartionPack");
    decodeBERLength(indexBytes.subspan(16), packLength, BERSize);
    bppPacketLength = 16 + BERSize + packLength;
    MXF_ASSERT(bppPacketLength < uint64_t(indexBytes.size()) + 32, "bppPacketLength<(readBytes+32)");
    const std::span<const uint8_t> indexTableKeyAddr =
        bppPacketLength < indexBytes.size() ? indexBytes.subspan(size_t(bppPacketLength)) : std::span<const uint8_t>();
    MXF_ASSERT(MXFKeyTypeforKey(indexTableKeyAddr) == MXF_IndexTableSegment,
               "[self MXFKeyTypeforKey:indexTableKeyAddr] == MXF_IndexTableSegment");
    uint64_t BERLength = 0;
    decodeBERLength(indexTableKeyAddr.subspan(16), BERLength, BERSize);
    MXF_ASSERT((bppPacketLength + 16 + BERSize + BERLength) < uint64_t(indexBytes.size()),
               "(bppPacketLength + 16 + BERSize+BERLength)<readBytes");
    const auto segment = indexBytes.subspan(size_t(bppPacketLength + 16 + BERSize), size_t(BERLength));

    int64_t videoIndexStartPosition = -1;
    int64_t videoIndexDuration = 0;
    int64_t videoFramesInChunk = 0;
    uint64_t frameOffset = 0;  // from the first frame's start
    forEachLocalTag(segment, [&](uint16_t tag, uint16_t packetLength, std::span<const uint8_t> v) {
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
    uint8_t audioEssence[256];
    ssize_t readBytesEssense = countedPread(fd, audioEssence, sizeof audioEssence, audio.front()->EssenseBPPOffset());
    MXF_ASSERT(readBytesEssense == 256, "readBytesEssense==256");
    packLength = 0;
    BERSize = 4;
    decodeBERLength(std::span<const uint8_t>(audioEssence + 16, 8), packLength, BERSize);
    MXF_ASSERT(BERSize <= 4, "BERSize<=4");
    key = audioEssence;
    MXF_ASSERT(MXFKeyTypeforKey(key) == MXF_BodyPartionPack, "[self MXFKeyTypeforKey:key] == MXF_BodyPartionPack");
    bppPacketLength = 20 + packLength;
    MXF_ASSERT((bppPacketLength + 24) < uint64_t(readBytesEssense), "(bppPacketLength+24) < readBytesEssense");
    essenseTypeBeingParsed = MXFKeyTypeforKey(audioEssence + bppPacketLength);
    MXF_ASSERT(essenseTypeBeingParsed == MXF_AudioEssenseData, "essenseTypeBeingParsed == MXF_AudioEssenseData");
    uint64_t blockSize = 0;
    uint32_t elementBERSize = BERSize;
    decodeBERLength(std::span<const uint8_t>(audioEssence + bppPacketLength + 16, 8), blockSize, elementBERSize);
    const uint64_t headerDistance = bppPacketLength + 16 + elementBERSize;
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
    FileDescriptor file(allScanned ? -1 : openUncached());
    if (!allScanned && file.get() < 0) return;

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

size_t mxfDataObject::framesPerChunk() {
    if (_chunkCount == 0) return 0;
    scanMXFForRIPIndex(0);
    return chunkPointer(0)->getVideoOffsets().size();
}

Ref<mxfEssenseOffsets> mxfDataObject::getVideoOffsetForDTS(int64_t dts) {
    const size_t chunks = _chunkCount;
    uint64_t chunkSize = 0;  // frames per chunk
    uint64_t ripIndex = 0;
    if (dts >= 1) {
        if (chunks) {
            // The first chunk fixes the frames per chunk; it is scanned first so
            // that a lookup made before any other still finds its chunk.
            chunkSize = framesPerChunk();
            MXF_ASSERT(chunkSize != 0, "chunkSize != 0");
            ripIndex = uint64_t(dts) / chunkSize;
        } else {
            SkarnLog(1, "Warning: getVideoOffsetForDTS: ripIndex is unknown. Using zero.  Perhaps a full video index "
                        "scan should be done.\n");
        }
    }
    const uint64_t frameCount = _mxfRIPVideoFrameCount;
    if (uint64_t(dts) >= frameCount) {
        // At or past the end (negative indexes land here too): the last frame.
        if (!chunks) return nullptr;
        MXF_ASSERT(frameCount != 0, "_expectedVideoSampleArraySize != 0");
        if (chunkSize == 0) {
            chunkSize = framesPerChunk();
            MXF_ASSERT(chunkSize != 0, "chunkSize != 0");
        }
        const uint64_t wantedDTSIndex = frameCount - 1;
        const uint64_t lastChunk = wantedDTSIndex / chunkSize;
        if (lastChunk < chunks) scanMXFForRIPIndex(size_t(lastChunk));
        mxfRIPPacketOffsets* thisRIPoffset = chunkPointer(size_t(std::min<uint64_t>(lastChunk, SIZE_MAX)));
        MXF_ASSERT(thisRIPoffset != nullptr, "thisRIPoffset != NULL");
        const auto& frames = thisRIPoffset->getVideoOffsets();
        const uint64_t at = wantedDTSIndex % chunkSize;
        Ref<mxfEssenseOffsets> thisVideoOffset = at < frames.size() ? frames[size_t(at)] : nullptr;
        MXF_ASSERT(thisVideoOffset != nullptr, "thisVideoOffset != NULL");
        MXF_ASSERT(thisVideoOffset->decodeOrder() == uint32_t(wantedDTSIndex),
                   "thisEssenseOffset.decodeOrder == wantedDTSIndex");
        return thisVideoOffset;
    }
    if (ripIndex >= chunks) return nullptr;
    scanMXFForRIPIndex(size_t(ripIndex));
    const auto& frames = chunkPointer(size_t(ripIndex))->getVideoOffsets();
    if (frames.empty()) return nullptr;
    if (ripIndex != 0) {
        const uint64_t wantedDTSIndex = uint64_t(dts);
        const uint64_t at = wantedDTSIndex % chunkSize;
        Ref<mxfEssenseOffsets> thisEssenseOffset = at < frames.size() ? frames[size_t(at)] : nullptr;
        MXF_ASSERT(thisEssenseOffset != nullptr, "thisEssenseOffset != NULL");
        MXF_ASSERT(thisEssenseOffset->decodeOrder() == uint32_t(wantedDTSIndex),
                   "thisEssenseOffset.decodeOrder == wantedDTSIndex");
        return thisEssenseOffset;
    }
    for (const auto& frame : frames)
        if (int64_t(frame->decodeOrder()) == dts) return frame;
    return nullptr;
}

Ref<mxfEssenseOffsets> mxfDataObject::getVideoOffsetForPTS(int64_t pts) {
    const size_t chunks = _chunkCount;
    size_t framesInFirstChunk = 0;
    int64_t c = pts;
    if (pts < 0 || !chunks) return nullptr;
    framesInFirstChunk = framesPerChunk();
    if (pts >= 1 && framesInFirstChunk) c = pts / int64_t(framesInFirstChunk);
    if (uint64_t(c) >= chunks) return nullptr;
    const size_t here = size_t(c);
    auto find = [pts](const mxfRIPPacketOffsets* chunk) -> Ref<mxfEssenseOffsets> {
        for (const auto& frame : chunk->getVideoOffsets())
            if (int64_t(frame->presentationOrder()) == pts) return frame;
        return nullptr;
    };
    scanMXFForRIPIndex(here);
    if (Ref<mxfEssenseOffsets> found = find(chunkPointer(here))) return found;
    // Reordering may have put the frame in a neighbour. Those are brought up to
    // date only now: a frame found in its own chunk costs no neighbour's neighbour.
    if (framesInFirstChunk == 0) return nullptr;
    if (here + 1 < chunks) {
        scanMXFForRIPIndex(here + 1);
        if (Ref<mxfEssenseOffsets> found = find(chunkPointer(here + 1))) return found;
    }
    if (here > 0) {
        scanMXFForRIPIndex(here - 1);
        if (Ref<mxfEssenseOffsets> found = find(chunkPointer(here - 1))) return found;
    }
    return nullptr;
}

Ref<mxfEssenseOffsets> mxfDataObject::getAudioOffsetForChannel(size_t channel, uint64_t sample) {
    const uint64_t blockAlign = _mxfAudioBytesPerSample;
    if (blockAlign && sample >= _mxfRIPAudioDataLength / blockAlign)
        SkarnLog(1, "AudioOffset PTS value larger than audio data length");
    if (_mxfRIPAudioChunkSize == 0)
        AssertionHandler::currentHandler().handleFailureInMethod("getAudioOffsetForChannel:atTime:", kSoftAssertFile,
                                                                 __LINE__, "invalid _mxfRIPAudioChunkSize");
    if (blockAlign != 2 && blockAlign != 3)
        AssertionHandler::currentHandler().handleFailureInMethod("getAudioOffsetForChannel:atTime:", kSoftAssertFile,
                                                                 __LINE__, "invalid mxfAudioQuantization");
    // A handler that lets us go on leaves nothing to divide by.
    if (_mxfRIPAudioChunkSize == 0 || blockAlign == 0) return nullptr;
    const uint64_t samplesPerChunk = _mxfRIPAudioChunkSize / blockAlign;
    if (samplesPerChunk == 0) return nullptr;
    const uint64_t ripIndex = sample / samplesPerChunk;
    if (ripIndex != 0) scanMXFForRIPIndex(0);
    // Past the last chunk the sample lies outside any chunk.
    if (ripIndex >= _chunkCount) return nullptr;
    scanMXFForRIPIndex(size_t(ripIndex));
    mxfRIPPacketOffsets* thisRIPoffset = chunkPointer(size_t(ripIndex));
    Ref<mxfEssenseOffsets> thisEssenseOffset = thisRIPoffset->getAudioOffsetEssenseForChannel(channel);
    MXF_ASSERT(thisEssenseOffset != nullptr, "thisEssenseOffset != NULL");

    const int32_t rel = int32_t(uint32_t(sample) - thisEssenseOffset->presentationOrder());
    if (rel < 0 || uint64_t(rel) >= thisEssenseOffset->size() / blockAlign) return nullptr;
    if (_mxfRIPAudioDataLength != _mxfRIPAudioChunkSize) return thisEssenseOffset;

    // All the audio in one chunk: hand out one video frame's worth, the
    // remainder samples going to the first frames. The arithmetic is 32-bit on
    // purpose (the block offset is taken modulo 2^32).
    MXF_ASSERT(ripIndex == 0, "ripIndex==0");
    const uint32_t frames = uint32_t(thisRIPoffset->getVideoOffsets().size());
    const uint32_t S = uint32_t(samplesPerChunk);
    if (frames == 0 || S == 0) return thisEssenseOffset;
    const uint32_t ba = uint32_t(blockAlign);
    const uint32_t r = uint32_t(rel);
    const uint32_t q = (frames * r) / S;
    const uint32_t n = S / frames + (q < S % frames ? 1 : 0);
    uint32_t size = n * ba;
    if ((r + n) * ba > thisEssenseOffset->size()) size = thisEssenseOffset->size() - ba * r;
    const uint32_t offset = ba * r + uint32_t(thisEssenseOffset->offset());
    Ref<mxfEssenseOffsets> frameAudio =
        mxfEssenseOffsets::initWithOffset(int64_t(offset), size, uint32_t(sample), 0, 0);
    frameAudio->updateAudioWithPTSandDTS(uint32_t(sample));
    return frameAudio;
}
