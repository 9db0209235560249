// Sample cursors: where the sample under the cursor lies, how samples group
// into chunks, and how the sample depends on others.
#include "AssertionHandler.h"
#include "CMSampleBuffer.h"
#include "SkarnFormatReader.h"
#include "SkarnLog.h"
#include "SkarnSampleCursor.h"
#include "SkarnSampleCursorInternal.h"

#include <cmath>

using namespace SkarnCursorDetail;

namespace {

// QuickTime media sample flags, as the MXF offset records carry them.
enum : uint32_t {
    kFlagNotSync = 1u << 0,
    kFlagPartialSync = 1u << 16,
    kFlagIsDependedOnByOthers = 1u << 26,
    kFlagIsNotDependedOnByOthers = 1u << 27,
    kFlagDependsOnOthers = 1u << 28,
    kFlagDoesNotDependOnOthers = 1u << 29,
    kFlagEarlierDisplayTimesAllowed = 1u << 30,
};

// The recorded sample presented at index: the timing offset moves a track
// after a removed cadence against its recording, and may be negative (kept in
// two's complement). Presentation times before the recording start read its
// first sample.
int64_t recordedSample(SkarnTrackReader* track, int64_t index) {
    int64_t offset = track->useTimingOffset() ? int64_t(track->timingOffset()) : 0;
    int64_t sample = 0;
    if (__builtin_add_overflow(offset, index, &sample)) sample = offset < 0 ? 0 : INT64_MAX;
    return sample < 0 ? 0 : sample;
}

}  // namespace

CMFormatDescription* SkarnSampleCursor::formatDescription() { return trackReader()->formatDesc(); }

CMTime SkarnSampleCursor::duration() { return trackReader()->frameDuration(); }

CMTime SkarnSampleCursor::playableHorizon() {
    CMTime pts = currentPTS();
    CMTime horizon = CMTimeSubtract(trackReader()->trackDuration(), pts);
    SkarnLog(2, "%@: playableHorizon: pts %lld/%d, horizon: %lld/%d", this, pts.value, pts.timescale, horizon.value,
             horizon.timescale);
    return horizon;
}

int64_t SkarnSampleCursor::followonDropCount() {
    SkarnTrackReader* track = trackReader();
    const uint8_t* sequence = track->followonDropSequence();
    uint64_t length = track->patternLength();
    if (!sequence || length == 0) return 0;
    uint64_t position = (track->patternIndex() + uint64_t(frameIndex()) + 1) % length;
    return sequence[position];
}

int64_t SkarnSampleCursor::timecodeCounter() {
    // The start frame multiplied by the frame index, not added to it: hosts of
    // this plug-in have always been given the product.
    int64_t index = frameIndex();
    int64_t start = trackReader()->timecodeStart();
    return index != 0 ? saturatingProduct(start, index) : start;
}

bool SkarnSampleCursor::physicalFrame(int64_t index, int64_t* frameOut) const {
    SkarnTrackReader* track = trackReader();
    const uint8_t* pattern = track->pulldownPattern();
    if (!pattern) {
        *frameOut = recordedSample(track, index);
        return true;
    }
    // The (index + 1)-th kept frame counted from the pattern position of the
    // clip's first frame. Whole repetitions of the pattern are counted at once
    // so that a location late in an hour-long clip costs no more than an early one.
    uint64_t length = track->patternLength();
    if (length == 0 || index < 0) return false;
    uint64_t start = track->patternIndex() % length;
    uint64_t keptPerRepetition = 0;
    for (uint64_t i = 0; i < length; ++i) keptPerRepetition += pattern[i] == 1;
    if (keptPerRepetition == 0) return false;
    uint64_t wanted = uint64_t(index) + 1;
    uint64_t repetitions = (wanted - 1) / keptPerRepetition;
    uint64_t kept = repetitions * keptPerRepetition;
    uint64_t walked = repetitions * length;
    for (uint64_t position = start; kept < wanted; position = (position + 1) % length) {
        kept += pattern[position] == 1;
        ++walked;
    }
    *frameOut = int64_t(track->sampleOffset()) + int64_t(walked) - 1;
    return true;
}

void SkarnSampleCursor::sampleLocationWithArraySizes(int64_t arrayCapacity, int64_t* sectionCountOut,
                                                     int64_t* sectionOffsetArrayInOut,
                                                     int64_t* sectionLengthArrayInOut, Ref<Object>* dataSourceOut) {
    SkarnTrackReader* track = trackReader();
    CMTime pts = currentPTS();
    int64_t offset = 0, length = 0;
    TrackKind trackKind = kind();
    bool located = true;
    if (trackKind == TrackKind::ByteLayout &&
        (!CMTIME_IS_NUMERIC(pts) || track->frameDuration().value <= 0 || track->sampleSize() <= 0))
        located = false;  // an empty track, or one of unknown rate: no sample to point at
    if (sectionCountOut) *sectionCountOut = located ? 1 : 0;
    if (located && arrayCapacity >= 1) {
        if (sectionOffsetArrayInOut && sectionLengthArrayInOut) {
            switch (trackKind) {
            case TrackKind::MXFVideo: {
                mxfEssenseOffsets* record = videoRecordAt(pts);
                offset = record ? record->offset() : 0;
                length = record ? int64_t(record->size()) : 0;
                break;
            }
            case TrackKind::MXFAudio:
            case TrackKind::MXFOther: {
                Ref<mxfEssenseOffsets> record =
                    track->mxfAudioSampleOffsetForChannel(track->audioChannelIndex(), uint64_t(pts.value));
                int64_t n = saturatingSum(recordedSample(track, frameIndex()), -int64_t(presentationOrderOf(record)));
                offset = saturatingSum(record ? record->offset() : 0, saturatingProduct(track->sampleSize(), n));
                length = track->sampleSize();
                break;
            }
            case TrackKind::ByteLayout: {
                int64_t frame = 0;
                if (physicalFrame(frameIndex(), &frame)) {
                    offset = frame * track->sampleSize();
                    length = track->sampleSize();
                }
                break;
            }
            }
            sectionOffsetArrayInOut[0] = offset;
            sectionLengthArrayInOut[0] = length;
        } else if (sectionLengthArrayInOut) {
            SKARN_HARD_ASSERT_TEXT(!track->mxfDataAccess() || track->mediaTypeValue() == kCMMediaType_Audio,
                                   "!self.trackReader.mxfDataAccess || self.trackReader.mediaType == "
                                   "kCMMediaType_Audio",
                                   kSource);
            length = track->sampleSize();
            sectionLengthArrayInOut[0] = length;
        }
    }
    SkarnLog(2, "%@: sample location: pts %lld/%d, offset: %lld, length: %d", this, pts.value, pts.timescale, offset,
             length);
    if (sectionLengthArrayInOut && located && arrayCapacity >= 1)
        SkarnLog(2, "%@:    sectionLengthArrayInOut[0]=%d", this, sectionLengthArrayInOut[0]);
    if (sectionOffsetArrayInOut && located && arrayCapacity >= 1)
        SkarnLog(2, "%@:    sectionOffsetArrayInOut[0]=%d", this, sectionOffsetArrayInOut[0]);
    (void)dataSourceOut;
}

void SkarnSampleCursor::chunkDetails(Ref<Object>* storageOut, int64_t* chunkOffsetOut, int64_t* chunkSizeOut,
                                     int64_t* sampleCountOut, int64_t* sampleIndexOut, bool* allSameSizeOut,
                                     bool* allSameDurationOut, bool* allSameFormatDescriptionOut) {
    SkarnTrackReader* track = trackReader();
    // With a cadence removed, samples are not evenly laid out: the host falls
    // back to one sample at a time.
    if (track->pulldownPattern()) return;
    int64_t sampleNumber = recordedSample(track, frameIndex());
    int64_t samplesPerChunk = track->samplesPerChunk();
    int64_t chunkNumber = safeDivide(sampleNumber, samplesPerChunk);
    int64_t sampleSize = track->sampleSize();

    switch (kind()) {
    case TrackKind::MXFVideo: {
        mxfEssenseOffsets* record = videoRecordAt(currentPTS());
        if (chunkOffsetOut) *chunkOffsetOut = record ? record->offset() : 0;
        if (chunkSizeOut) *chunkSizeOut = record ? int64_t(record->size()) : 0;
        if (sampleCountOut) *sampleCountOut = 1;
        if (sampleIndexOut) *sampleIndexOut = 0;
        if (allSameSizeOut) *allSameSizeOut = false;
        break;
    }
    case TrackKind::MXFAudio: {
        // One video frame's worth of samples from the cursor on, cut at the
        // end of the block the offset record describes.
        CMTime videoFrame = kCMTimeInvalid;
        if (SkarnFormatReader* reader = track->formatReader()) {
            auto tracks = reader->trackList();
            if (!tracks.empty()) videoFrame = tracks.front()->frameDuration();
        }
        double perFrame = CMTimeGetSeconds(videoFrame) * track->sampleRate() + 0.5;
        uint64_t samplesPerFrame = std::isfinite(perFrame) && perFrame > 0 ? uint64_t(perFrame) : 0;
        int64_t chunkBytes = int64_t(samplesPerFrame) * sampleSize;
        CMTime pts = currentPTS();
        Ref<mxfEssenseOffsets> record =
            track->mxfAudioSampleOffsetForChannel(track->audioChannelIndex(), uint64_t(pts.value));
        int64_t recordSize = record ? int64_t(record->size()) : 0;
        int64_t skip = saturatingSum(pts.value, -int64_t(presentationOrderOf(record)));
        int64_t skipBytes = skip >= 1 ? saturatingProduct(skip, sampleSize) : 0;
        if (saturatingProduct(saturatingSum(int64_t(samplesPerFrame), skip), sampleSize) > recordSize)
            chunkBytes = recordSize - skipBytes;
        if (chunkBytes < 0) chunkBytes = 0;
        if (chunkOffsetOut) *chunkOffsetOut = saturatingSum(record ? record->offset() : 0, skipBytes);
        if (chunkSizeOut) *chunkSizeOut = chunkBytes;
        if (sampleCountOut) *sampleCountOut = safeDivide(chunkBytes, sampleSize);
        if (sampleIndexOut) *sampleIndexOut = 0;
        if (allSameSizeOut) *allSameSizeOut = true;
        break;
    }
    case TrackKind::MXFOther:
        if (sampleIndexOut) *sampleIndexOut = 0;
        if (allSameSizeOut) *allSameSizeOut = true;
        break;
    case TrackKind::ByteLayout: {
        int64_t chunkSize = track->chunkSize();
        int64_t dataLength = track->dataLength();
        int64_t chunkStart = chunkNumber * chunkSize;
        int64_t size = chunkSize;
        int64_t count = samplesPerChunk;
        if (dataLength < chunkStart + chunkSize) {
            size = dataLength - chunkStart;
            if (size < 0) size = 0;
            count = safeDivide(size, sampleSize);
        }
        if (chunkOffsetOut) *chunkOffsetOut = chunkStart;
        if (chunkSizeOut) *chunkSizeOut = size;
        if (sampleCountOut) *sampleCountOut = count;
        if (sampleIndexOut) *sampleIndexOut = sampleNumber - chunkNumber * samplesPerChunk;
        if (allSameSizeOut) *allSameSizeOut = true;
        break;
    }
    }
    if (allSameDurationOut) *allSameDurationOut = true;
    if (allSameFormatDescriptionOut) *allSameFormatDescriptionOut = true;
    (void)storageOut;
}

Value SkarnSampleCursor::sampleDependencyAttributes() {
    SkarnTrackReader* track = trackReader();
    if (!track->mxfDataAccess()) return Value();
    if (track->mediaTypeValue() != kCMMediaType_Video) return Value(Dictionary());
    mxfEssenseOffsets* record = videoRecordAt(currentPTS());
    uint32_t flags = record ? record->mediaSampleFlags() : 0;
    Dictionary attributes;
    attributes.set(kCMSampleAttachmentKey_NotSync, (flags & kFlagNotSync) ? 1 : 0);
    attributes.set(kCMSampleAttachmentKey_PartialSync, (flags & kFlagPartialSync) ? 1 : 0);
    attributes.set(kCMSampleAttachmentKey_EarlierDisplayTimesAllowed, (flags & kFlagEarlierDisplayTimesAllowed) ? 1 : 0);
    if (flags & kFlagDependsOnOthers)
        attributes.set(kCMSampleAttachmentKey_DependsOnOthers, 1);
    else if (flags & kFlagDoesNotDependOnOthers)
        attributes.set(kCMSampleAttachmentKey_DependsOnOthers, 0);
    if (flags & kFlagIsDependedOnByOthers)
        attributes.set(kCMSampleAttachmentKey_IsDependedOnByOthers, 1);
    else if (flags & kFlagIsNotDependedOnByOthers)
        attributes.set(kCMSampleAttachmentKey_IsDependedOnByOthers, 0);
    return Value(std::move(attributes));
}

void SkarnSampleCursor::dependencyInfoWithFullSync(bool* fullSyncOut, bool* partialSyncOut,
                                                   double* partialSyncThresholdOut, bool* droppableOut) {
    SkarnTrackReader* track = trackReader();
    if (!track->mxfDataAccess()) return;
    SKARN_HARD_ASSERT_TEXT(track->mediaTypeValue() == kCMMediaType_Video,
                           "self.trackReader.mediaType==kCMMediaType_Video", kSource);
    mxfEssenseOffsets* record = videoRecordAt(currentPTS());
    uint32_t flags = record ? record->mediaSampleFlags() : 0;
    if (partialSyncOut) *partialSyncOut = (flags & kFlagPartialSync) != 0;
    if (droppableOut) *droppableOut = (flags & kFlagIsNotDependedOnByOthers) != 0;
    if (fullSyncOut) *fullSyncOut = (flags & kFlagNotSync) == 0;
    if (partialSyncThresholdOut) *partialSyncThresholdOut = 2;
}

bool SkarnSampleCursor::respondsToSelector(std::string_view selector) const {
    return selector == "decodeTimeStamp" || selector == "duration" || selector == "followonDropCount" ||
           selector == "timecodeCounter" ||
           selector ==
               "chunkDetails:chunkOffset:chunkSize:sampleCount:sampleIndex:allSameSize:allSameDuration:"
               "allSameFormatDescription:" ||
           selector == "sampleDependencyAttributes" ||
           selector == "dependencyInfoWithFullSync:partialSync:partialSyncThreshold:droppable:";
}
