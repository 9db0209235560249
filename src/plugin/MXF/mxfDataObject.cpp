// mxfDataObject: construction, the sources scans read through, the chunk list
// and key types. The opening scan, the chunk index scan and the sample lookups
// live in mxfDataObjectOpening.cpp, mxfDataObjectIndex.cpp and
// mxfDataObjectLookup.cpp.
#include "mxfDataObject.h"

#include "FileSystem.h"
#include "MXFFileByteSource.h"

#include <algorithm>
#include <fcntl.h>

namespace {

bool hasPrefix(const uint8_t* key, std::initializer_list<uint8_t> prefix) {
    return std::equal(prefix.begin(), prefix.end(), key);
}

// A fresh descriptor for one scan.
Ref<MXFByteSource> openUncached(const std::string& path) {
    const int fd = FileSystem::openRegularFileReadOnly(path);
    if (fd < 0) return nullptr;
    // Each essence byte is read once, so keeping it cached helps no one; Linux
    // has no per-descriptor cache switch, the hint is the nearest thing.
    ::posix_fadvise(fd, 0, 0, POSIX_FADV_NOREUSE);
    return MXFFileByteSource::initWithDescriptor(fd);
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

Ref<mxfDataObject> mxfDataObject::initWithBytes(std::span<const uint8_t> bytes) {
    Ref<mxfDataObject> object(new mxfDataObject());
    object->_bytes.assign(bytes.begin(), bytes.end());
    object->_byteSource = MXFSpanByteSource::initWithBytes(object->_bytes);
    object->scanMXFForData();
    return object;
}

mxfDataObject::~mxfDataObject() {
    for (size_t i = 0; i < _chunkCount; ++i)
        if (mxfRIPPacketOffsets* chunk = _mxfRIPPacketData[i].load(std::memory_order_relaxed)) chunk->release();
}

mxfDataObject::ScanSource::ScanSource(const mxfDataObject& owner, bool open) : _owner(owner) {
    if (!open) return;
    if (owner._byteSource)
        _source = owner._byteSource;
    else if (owner._mxfPath)
        _source = openUncached(*owner._mxfPath);
    if (_source) _before = _source->readStatistics();
}

mxfDataObject::ScanSource::~ScanSource() {
    if (!_source) return;
    const ReadStatistics after = _source->readStatistics();
    _owner._readCalls.fetch_add(after.calls - _before.calls, std::memory_order_relaxed);
    _owner._readBytes.fetch_add(after.bytes - _before.bytes, std::memory_order_relaxed);
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

int32_t mxfDataObject::getAudioChunkSize(uint64_t* chunkSize, uint64_t* dataLength) const {
    if (chunkSize) *chunkSize = _mxfRIPAudioChunkSize;
    if (dataLength) *dataLength = _mxfRIPAudioDataLength;
    return 0;
}

int32_t mxfDataObject::getVideoFrameCount(uint32_t* count) const {
    if (count) *count = uint32_t(_mxfRIPVideoFrameCount);
    return 0;
}
