// Media reader: construction, placement and scheduling (reading the sample
// or audio chunk at the cursor into a queued sample buffer). Delivery into
// the host's record is in SkarnMediaReaderDelivery.cpp.
#include "SkarnMediaReader.h"

#include "FileSystem.h"
#include "SkarnLog.h"
#include "SkarnPulldown.h"

#include <algorithm>
#include <vector>

const char* const SkarnMediaReaderHighWaterNotification = "SkarnMediaReaderHighWater";
const char* const SkarnMediaReaderLowWaterNotification = "SkarnMediaReaderLowWater";

namespace {

// The refill size for ingest stays below a sample's size, so that the file
// reader moves each sample straight from the file into its own memory in
// whole pages and only the unaligned head and tail pass through its buffer.
// A refill as large as its 4 MiB buffer would copy every byte twice (into the
// buffer, out of it) through memory that no longer fits in any cache.
constexpr uint64_t kBulkRefill = 32768;

}  // namespace

Ref<SkarnMediaReader> SkarnMediaReader::mediaReaderWithFormatReader(SkarnFormatReader* formatReader,
                                                                    SkarnTrackReader* trackReader,
                                                                    int64_t timeCodeCounter, CMTime frameDuration,
                                                                    int64_t frameQuanta, bool isDropFrame,
                                                                    int64_t shootingRate) {
    return initWithFormatReader(formatReader, trackReader, timeCodeCounter, frameDuration, frameQuanta, isDropFrame,
                                shootingRate);
}

Ref<SkarnMediaReader> SkarnMediaReader::initWithFormatReader(SkarnFormatReader* formatReader,
                                                             SkarnTrackReader* trackReader, int64_t timeCodeCounter,
                                                             CMTime frameDuration, int64_t frameQuanta,
                                                             bool isDropFrame, int64_t shootingRate) {
    if (!formatReader || !trackReader) return nullptr;
    Ref<SkarnMediaReader> reader(new SkarnMediaReader);
    reader->_mediaType = trackReader->mediaTypeValue();
    reader->_timecodeCounter = timeCodeCounter;
    reader->_frameDuration = frameDuration;
    reader->_frameQuanta = frameQuanta;
    reader->_isDropFrame = isDropFrame;
    reader->_shootingRate = shootingRate;
    reader->_trackReader = trackReader;
    std::optional<std::string> url = trackReader->url();
    reader->_filename = url ? FileSystem::lastPathComponent(*url) : std::string();
    // A track read through MXF index records is addressed by absolute file
    // offsets, so its reader spans the whole file; a byte-layout track's
    // locations count from the start of its essence.
    // The range never reaches past the file's end, whatever the XML claims: a
    // refill that asks for more than the file holds comes back short and is
    // dropped whole, which would lose the frames a truncated file still has.
    std::optional<uint64_t> size = url ? FileSystem::fileSize(*url) : std::nullopt;
    int64_t fileSize = int64_t(std::min<uint64_t>(size.value_or(0), INT64_MAX));
    if (trackReader->mxfDataAccess()) {
        reader->_fileReader = SkarnFileReader::initWithURL(url, 0, uint64_t(fileSize));
    } else {
        int64_t offset = trackReader->locationOffset();
        int64_t available = offset >= 0 && offset < fileSize ? fileSize - offset : 0;
        int64_t length = std::clamp<int64_t>(trackReader->locationSize(), 0, available);
        reader->_fileReader = SkarnFileReader::initWithURL(url, offset, uint64_t(length));
    }
    if (!reader->_fileReader) return nullptr;
    reader->_blockPool = SkarnBlockPool::blockPool();
    CMBufferQueueCreate(kCFAllocatorDefault, 0, CMBufferQueueGetCallbacksForUnsortedSampleBuffers(),
                        &reader->_bufferQueue);
    if (!reader->_bufferQueue) return nullptr;
    return reader;
}

SkarnMediaReader::~SkarnMediaReader() = default;

std::string SkarnMediaReader::description() const {
    return "<SkarnMediaReader: " + std::string(kindLetter()) + " " + _filename + ">";
}

void SkarnMediaReader::reset() {
    _sampleCursor = nullptr;
    Ref<VestaKilnSampleCursorProtocol> cursor =
        CMTimeCompare(_startTime, kCMTimeZero) != 0
            ? _trackReader->cursorAtPresentationTimeStamp(_startTime, nullptr, nullptr)
            : _trackReader->cursorAtFirstSampleInDecodeOrder();
    _sampleCursor = dynamicRefCast<SkarnSampleCursor>(cursor);
    // A reset starts the track over: nothing scheduled before may be
    // delivered, and the end of data is not reached yet.
    CMBufferQueueReset(_bufferQueue);
    _fileReader->setBufferSize(kBulkRefill);
}

bool SkarnMediaReader::hasData() const {
    if (CMBufferQueueIsAtEndOfData(_bufferQueue)) return false;
    // A track with no samples never schedules anything, so it never reaches
    // a marked end: with nothing queued and a cursor without stamps, there
    // is no data.
    if (CMBufferQueueIsEmpty(_bufferQueue) && !CMBufferQueueContainsEndOfData(_bufferQueue)) {
        if (!_sampleCursor) return false;
        if (!CMTIME_IS_VALID(_sampleCursor->decodeTimeStamp()) || !CMTIME_IS_VALID(_sampleCursor->duration()))
            return false;
    }
    return true;
}

bool SkarnMediaReader::canSchedule() const { return !CMBufferQueueContainsEndOfData(_bufferQueue); }

int32_t SkarnMediaReader::scheduleBuffers() { return scheduleSamples(int64_t(_samplesPerPull)); }

int32_t SkarnMediaReader::markEndOfData(int32_t status) {
    SkarnLog(160, "%@: [%@%d]: scheduleBuffers:: mark end of data", this, kindLetter(), _trackID);
    CMBufferQueueMarkEndOfData(_bufferQueue);
    return status;
}

int32_t SkarnMediaReader::scheduleSamples(int64_t) {
    // One sample per call, whatever the count: the queue is refilled on every
    // delivery anyway.
    if (!_sampleCursor) return 0;
    if (!CMTIME_IS_VALID(_sampleCursor->decodeTimeStamp()) || !CMTIME_IS_VALID(_sampleCursor->duration())) return 0;
    // Once the end is marked the cursor stands on the last sample; reading it
    // again could only be refused by the queue.
    if (CMBufferQueueContainsEndOfData(_bufferQueue)) return 0;

    CMSampleBufferRef buffer;
    int32_t status = createSampleBufferFromSampleCursor(&buffer);
    if (status != 0) return markEndOfData(status);
    // No buffer: the cursor stands at or past the end of the track's data.
    if (!buffer) return markEndOfData(0);
    CMTime dts = CMSampleBufferGetDecodeTimeStamp(buffer);
    CMTime pts = CMSampleBufferGetPresentationTimeStamp(buffer);
    CMTime duration = CMSampleBufferGetDuration(buffer);
    status = CMBufferQueueEnqueue(_bufferQueue, buffer);
    SkarnLog(160, "%@ [%@%d]: [%d] enqueue bufferQueue | pts: %lld/%d | dts: %lld/%d | dur: %lld/%d", this,
             kindLetter(), _trackID, CMBufferQueueGetBufferCount(_bufferQueue), pts.value, pts.timescale, dts.value,
             dts.timescale, duration.value, duration.timescale);
    buffer = nullptr;
    if (status != 0) return markEndOfData(status);
    if (_sampleCursor->stepByDecodeTime(duration) != 0) return markEndOfData(0);
    return 0;
}

// ---------------------------------------------------------------------------
// Building sample buffers

uint64_t SkarnMediaReader::rangeLength() const {
    const SkarnFileSource* source = _fileReader->source();
    return uint64_t(std::max<int64_t>(0, source->absoluteOffset())) + source->remaining();
}

int32_t SkarnMediaReader::readInto(uint8_t* dest, int64_t offset, int64_t length) {
    if (_fileReader->seek(offset) != offset) return kSkarnMediaReaderReadFailed;
    if (_fileReader->read(uint64_t(length), dest) != uint64_t(length)) return kSkarnMediaReaderReadFailed;
    return 0;
}

int32_t SkarnMediaReader::createSampleBufferFromSampleCursor(CMSampleBufferRef* sampleBufferOut) {
    *sampleBufferOut = nullptr;
    if (!_sampleCursor) return 0;
    if (_mediaType != kCMMediaType_Video && _mediaType != kCMMediaType_Audio)
        return kSkarnMediaReaderUnsupportedMediaType;
    if (_mediaType == kCMMediaType_Audio &&
        _sampleCursor->respondsToSelector("chunkDetails:chunkOffset:chunkSize:sampleCount:sampleIndex:allSameSize:"
                                          "allSameDuration:allSameFormatDescription:"))
        return createAudioChunkBuffer(sampleBufferOut);
    return createSingleSampleBuffer(sampleBufferOut);
}

namespace {

// A block buffer of its own memory, allocated at once; nullptr with the
// status when the memory cannot be had.
int32_t newBlock(SkarnBlockPool* pool, int64_t size, CMBlockBufferRef* block, uint8_t** data) {
    int32_t status = CMBlockBufferCreateWithMemoryBlock(
        kCFAllocatorDefault, nullptr, SkarnBlockPool::blockLengthFor(size_t(size)), kCFAllocatorDefault,
        pool->blockSource(), 0, size_t(size), kCMBlockBufferAssureMemoryNowFlag, block);
    if (status != 0) return status;
    char* p = nullptr;
    status = CMBlockBufferGetDataPointer(*block, 0, nullptr, nullptr, &p);
    *data = reinterpret_cast<uint8_t*>(p);
    return status;
}

}  // namespace

int32_t SkarnMediaReader::createAudioChunkBuffer(CMSampleBufferRef* out) {
    SkarnSampleCursor* cursor = _sampleCursor.get();
    int64_t chunkOffset = 0, chunkSize = 0, sampleCount = 0, sampleIndex = 0;
    bool allSameSize = false, allSameDuration = false, allSameFormat = false;
    cursor->chunkDetails(nullptr, &chunkOffset, &chunkSize, &sampleCount, &sampleIndex, &allSameSize,
                         &allSameDuration, &allSameFormat);
    int64_t sectionCount = 0, sampleOffset = 0, sampleLength = 0;
    cursor->sampleLocationWithArraySizes(1, &sectionCount, &sampleOffset, &sampleLength, nullptr);
    // The chunk from the cursor's sample on.
    if (sampleIndex > 0) {
        sampleCount -= sampleIndex;
        chunkSize -= sampleOffset - chunkOffset;
        chunkOffset = sampleOffset;
    }
    if (chunkSize <= 0 || sampleCount <= 0) return 0;  // nothing left of the channel
    // No chunk is larger than the 2 MiB the tracks are built with; anything
    // beyond what the file holds is a damaged index, not a reason to allocate.
    if (uint64_t(chunkSize) > rangeLength()) return kSkarnMediaReaderReadFailed;

    CMBlockBufferRef block;
    uint8_t* data = nullptr;
    int32_t status = newBlock(_blockPool.get(), chunkSize, &block, &data);
    if (status != 0) return status;
    if ((status = readInto(data, chunkOffset, chunkSize)) != 0) return status;

    // With every size and duration the same (the only chunks tracks give),
    // the first sample stands for all and the cursor does not move.
    size_t visits = allSameSize && allSameDuration ? 1 : size_t(sampleCount);
    if (visits > 1 << 24) return kSkarnMediaReaderReadFailed;
    std::vector<CMSampleTimingInfo> timing;
    std::vector<size_t> sizes;
    bool answersDTS = cursor->respondsToSelector("decodeTimeStamp");
    bool answersDuration = cursor->respondsToSelector("duration");
    int64_t steps = 0;
    for (size_t i = 0; i < visits; ++i) {
        if (i > 0) {
            int32_t step = cursor->stepInDecodeOrder(1);
            if (step == kVestaKilnSampleCursorNoMoreSamples) {
                // Not an error: the walk goes on without counting the step.
            } else if (step != 0) {
                status = step;
                break;
            } else {
                ++steps;
            }
        }
        CMSampleTimingInfo t;
        t.presentationTimeStamp = cursor->presentationTimeStamp();
        t.decodeTimeStamp = answersDTS ? cursor->decodeTimeStamp() : kCMTimeInvalid;
        t.duration = answersDuration ? cursor->duration() : kCMTimeInvalid;
        if (i == 0 || !allSameDuration) timing.push_back(t);
        int64_t count = 0, offset = 0, length = 0;
        cursor->sampleLocationWithArraySizes(1, &count, &offset, &length, nullptr);
        if (i == 0 || !allSameSize) sizes.push_back(size_t(std::max<int64_t>(0, length)));
    }
    if (steps > 0) cursor->stepInDecodeOrder(-steps);
    if (status != 0) return status;
    return CMSampleBufferCreateReady(kCFAllocatorDefault, block, CMFormatDescriptionRef(cursor->formatDescription()),
                                     sampleCount, CMItemCount(timing.size()), timing.data(), CMItemCount(sizes.size()),
                                     sizes.data(), out);
}

int32_t SkarnMediaReader::createSingleSampleBuffer(CMSampleBufferRef* out) {
    SkarnSampleCursor* cursor = _sampleCursor.get();
    int64_t sections = 0;
    cursor->sampleLocationWithArraySizes(0, &sections, nullptr, nullptr, nullptr);
    if (sections <= 0) return 0;  // a track of unknown rate: no sample to read
    if (sections > 64) return kSkarnMediaReaderReadFailed;
    std::vector<int64_t> offsets(size_t(sections), 0), lengths(size_t(sections), 0);
    cursor->sampleLocationWithArraySizes(sections, &sections, offsets.data(), lengths.data(), nullptr);
    int64_t total = 0;
    for (int64_t length : lengths) {
        if (length < 0) return kSkarnMediaReaderReadFailed;
        total += length;
    }
    if (total <= 0) return 0;
    // An index that points past the file is caught here, before the memory
    // for the sample is taken.
    if (uint64_t(total) > rangeLength()) return kSkarnMediaReaderReadFailed;

    CMBlockBufferRef block;
    uint8_t* data = nullptr;
    int32_t status = newBlock(_blockPool.get(), total, &block, &data);
    if (status != 0) return status;
    int64_t at = 0;
    for (size_t i = 0; i < offsets.size(); ++i) {
        if ((status = readInto(data + at, offsets[i], lengths[i])) != 0) return status;
        at += lengths[i];
    }
    CMSampleTimingInfo timing;
    timing.presentationTimeStamp = cursor->presentationTimeStamp();
    timing.decodeTimeStamp = cursor->respondsToSelector("decodeTimeStamp") ? cursor->decodeTimeStamp() : kCMTimeInvalid;
    timing.duration = cursor->respondsToSelector("duration") ? cursor->duration() : kCMTimeInvalid;
    size_t size = size_t(total);
    status = CMSampleBufferCreateReady(kCFAllocatorDefault, block, CMFormatDescriptionRef(cursor->formatDescription()),
                                       1, 1, &timing, 1, &size, out);
    if (status != 0) return status;
    Value attributes = cursor->sampleDependencyAttributes();
    if (attributes.isDictionary()) {
        if (std::vector<Dictionary>* attachments = CMSampleBufferGetSampleAttachmentsArray(*out, true)) {
            if (!attachments->empty())
                for (const auto& [key, value] : attributes.dictionary()) attachments->front().set(key, value);
        }
    }
    return 0;
}
