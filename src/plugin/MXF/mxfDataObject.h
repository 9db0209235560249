// An MXF essence file of a self-contained clip: one file carrying video,
// ancillary data and every audio channel in repeating chunks of body
// partitions, each followed by a partition holding its index table segment.
//
// Opening reads the header metadata (audio format, durations), the footer
// partition pack and the random index pack that follows it (the chunk list),
// from a file or from the same bytes in memory.
// Each chunk's index tables are read lazily, on the first lookup that needs
// them, under the object's lock, so several cursors may share one object.
#pragma once

#include "MXFByteSource.h"
#include "MXFKLVReader.h"
#include "MXFSpanByteSource.h"
#include "Object.h"
#include "mxfEssenseOffsets.h"
#include "mxfRIPPacket.h"
#include "mxfRIPPacketOffsets.h"

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <span>
#include <string>
#include <vector>

// Key types answered by MXFKeyTypeforKey.
enum : uint32_t {
    MXF_KLVFill = 0,
    MXF_HeaderPartionPack = 1,
    MXF_BodyPartionPack = 2,
    MXF_FooterPartionPack = 3,
    MXF_VideoEssenseData = 4,
    MXF_ANCEssenseData = 5,
    MXF_AudioEssenseData = 6,
    MXF_SourceClip = 7,
    MXF_AES3AudioDescriptor = 8,
    MXF_IndexTableSegment = 9,
    MXF_PrivateKey = 10,
    MXF_RandomIndexPack = 11,
    MXF_UnknownKey = 0xffffffffu,
};

class mxfDataObject : public Object {
public:
    // Never nil: a file that cannot be opened gives an empty object. The file
    // is opened for the opening scan and again for each later chunk scan.
    static Ref<mxfDataObject> initWithPath(const std::optional<std::string>& path);
    // The same over a whole MXF file's bytes in memory, which are copied.
    static Ref<mxfDataObject> initWithBytes(std::span<const uint8_t> bytes);
    ~mxfDataObject() override;

    // `key` must point at 16 bytes.
    uint32_t MXFKeyTypeforKey(const uint8_t* key) const;
    // Fewer than 16 bytes is an unknown key.
    uint32_t MXFKeyTypeforKey(std::span<const uint8_t> key) const;
    void scanMXFForData();

    int32_t getAudioChunkSize(uint64_t* chunkSize, uint64_t* dataLength) const;
    int32_t getVideoFrameCount(uint32_t* count) const;
    uint32_t getAudioChannelCount() const { return _mxfTotalAudioChannelCount; }
    Ref<Object> getMXFIngestData() const { return _mxfIngestData; }
    std::optional<std::string> getMXFXMLString() const { return _mxfXMLString; }

    // Makes sure chunk `chunkIndex` is scanned and its presentation orders filled.
    void scanMXFForRIPIndex(size_t chunkIndex);
    // Fills the chunk's records from the file's bytes (a nil source does
    // nothing); only called under the object's lock.
    void scanThisRIPOffset(mxfRIPPacketOffsets* chunk, MXFByteSource* source);

    // Records belong to their chunk; nil when there is none.
    Ref<mxfEssenseOffsets> getVideoOffsetForDTS(int64_t dts);
    Ref<mxfEssenseOffsets> getVideoOffsetForPTS(int64_t pts);
    // A chunk's whole audio block (several chunks) or one frame's worth of it
    // (a file whose audio is one chunk); nil outside the chunk found.
    Ref<mxfEssenseOffsets> getAudioOffsetForChannel(size_t channel, uint64_t sample);

    // What the header told us, for readers and the dump tool.
    const std::optional<std::string>& mxfPath() const { return _mxfPath; }
    uint32_t audioSamplingRate() const { return _mxfAudioSamplingRate; }
    uint32_t audioBytesPerSample() const { return _mxfAudioBytesPerSample; }
    uint64_t footerPartitionOffset() const { return _footerPartitionOffset; }
    uint64_t expectedVideoSampleArraySize() const { return _expectedVideoSampleArraySize; }
    uint64_t expectedAudioSampleArraySize() const { return _expectedAudioSampleArraySize; }
    size_t chunkCount() const { return _chunkCount; }
    // The chunk list is fixed after opening; a chunk's records must only be
    // read after a lookup or scanMXFForRIPIndex has scanned it. The same index
    // always answers the same object.
    Ref<mxfRIPPacketOffsets> chunkAtIndex(size_t index) const { return Ref<mxfRIPPacketOffsets>(chunkPointer(index)); }

    // Reads of the file (or the bytes) made so far, for measurements: every
    // scan's reads once it is over.
    using ReadStatistics = MXFByteSource::ReadStatistics;
    ReadStatistics readStatistics() const { return {_readCalls.load(), _readBytes.load()}; }

private:
    mxfDataObject() = default;

    // The bytes opened for one scan: a file opened anew, or the bytes in
    // memory. Adds the reads made through it to the object's statistics when
    // the scan lets it go, whichever way the scan ends.
    class ScanSource {
    public:
        // Opens nothing when `open` is false.
        explicit ScanSource(const mxfDataObject& owner, bool open = true);
        ~ScanSource();
        ScanSource(const ScanSource&) = delete;
        ScanSource& operator=(const ScanSource&) = delete;
        MXFByteSource* get() const { return _source.get(); }
        Ref<MXFByteSource> ref() const { return _source; }

    private:
        const mxfDataObject& _owner;
        Ref<MXFByteSource> _source;
        ReadStatistics _before;
    };

    // Opening-scan helpers. readValue reads a KLV's value and answers the bytes
    // delivered; -1 when the KLV is to be skipped (a value no buffer is made for).
    int64_t readValue(MXFKLVReader& reader, const MXFKLVReader::KLV& klv, std::vector<uint8_t>& value);
    void takeAES3Descriptor(std::span<const uint8_t> value);
    void takeSourceClip(std::span<const uint8_t> value);
    void readRandomIndexPack(MXFKLVReader& reader, const MXFKLVReader::KLV& footer, std::vector<uint8_t>& value);
    // Reads through the opening scan's cache.
    void readAudioIndexTable(const Ref<MXFByteSource>& cache);
    // The chunk at `index` (nil past the end), built on first use; it lives as
    // long as this object. chunkPointer takes the lock to build, so code that
    // already holds it calls chunkLocked.
    mxfRIPPacketOffsets* chunkPointer(size_t index) const;
    mxfRIPPacketOffsets* chunkLocked(size_t index) const;
    // Video records of the first chunk, scanning it when needed.
    size_t framesPerChunk();

    std::optional<std::string> _mxfPath;
    uint64_t _footerPartitionOffset = 0;
    Ref<Object> _mxfIngestData;
    // One slot per chunk, empty until the chunk is first asked for: building
    // thousands of small objects for an hour-long clip would cost more than
    // the rest of opening. A filled slot holds a retain and never changes.
    std::unique_ptr<std::atomic<mxfRIPPacketOffsets*>[]> _mxfRIPPacketData;
    uint64_t _mxfRIPAudioDataLength = 0;
    uint64_t _mxfRIPAudioChunkSize = 0;
    uint64_t _mxfRIPVideoFrameCount = 0;
    std::optional<std::string> _mxfXMLString;
    int64_t _clipPartialScanPosition = 0;
    uint32_t _mxfAudioSamplingRate = 0;
    uint32_t _mxfAudioBytesPerSample = 0;
    uint32_t _mxfTotalAudioChannelCount = 0;
    uint64_t _expectedVideoSampleArraySize = 0;
    uint64_t _expectedAudioSampleArraySize = 0;

    // An object made over memory reads its own copy of the bytes.
    std::vector<uint8_t> _bytes;
    Ref<MXFSpanByteSource> _byteSource;
    uint64_t _fileSize = 0;
    uint32_t _audioEditUnitByteCount = 0;
    size_t _chunkCount = 0;
    // The random index pack's value, BodySIDs already checked: chunk i's
    // entries start at byte _ripFirstGroup + i * _ripGroupBytes.
    std::vector<uint8_t> _ripEntries;
    size_t _ripFirstGroup = 0;
    size_t _ripGroupBytes = 0;
    // Stands for the object's own monitor: serialises the lazy chunk scans
    // and the building of chunks.
    mutable std::mutex _lock;
    mutable std::atomic<uint64_t> _readCalls{0};
    mutable std::atomic<uint64_t> _readBytes{0};
};
