// Media reader: pulling frames for cadence analysis, and writing dequeued
// samples into the host's media record (the video unit and the audio unit).
#include "CFDictionary.h"
#include "CMFormatDescriptionBridge.h"
#include "LogSink.h"
#include "SkarnAudioBuffer.h"
#include "SkarnH264.h"
#include "SkarnLog.h"
#include "SkarnMediaReader.h"
#include "SkarnPulldown.h"
#include "SkarnVestaTimecode.h"
#include "SkarnVideoBuffer.h"

#include <cmath>
#include <cstdlib>
#include <cstring>

namespace {

constexpr uint64_t kProbeRefill = 32768;

// QuickTime media sample flags, written for reordered H.264 frames.
enum : uint32_t {
    kFlagNotSync = 0x1,
    kFlagPartialSync = 0x10000,
    kFlagHasRedundantCoding = 0x1000000,
    kFlagHasNoRedundantCoding = 0x2000000,
    kFlagIsDependedOnByOthers = 0x4000000,
    kFlagIsNotDependedOnByOthers = 0x8000000,
    kFlagDependsOnOthers = 0x10000000,
    kFlagDoesNotDependOnOthers = 0x20000000,
    kFlagEarlierDisplayTimesAllowed = 0x40000000,
};

bool isReorderedH264(FourCharCode subtype) { return subtype == FourCC("avc1") || subtype == FourCC("avlg"); }

bool truthy(const Value* v) { return v && v->boolValue().value_or(false); }

uint32_t sampleFlags(const CMSampleBufferRef& buffer) {
    std::vector<Dictionary>* attachments = CMSampleBufferGetSampleAttachmentsArray(buffer, false);
    if (!attachments || attachments->empty()) return 0;
    const Dictionary& d = attachments->front();
    uint32_t flags = 0;
    if (truthy(d.find(kCMSampleAttachmentKey_NotSync))) flags |= kFlagNotSync;
    if (truthy(d.find(kCMSampleAttachmentKey_PartialSync))) flags |= kFlagPartialSync;
    if (const Value* v = d.find(kCMSampleAttachmentKey_HasRedundantCoding))
        flags |= truthy(v) ? kFlagHasRedundantCoding : kFlagHasNoRedundantCoding;
    if (const Value* v = d.find(kCMSampleAttachmentKey_IsDependedOnByOthers))
        flags |= truthy(v) ? kFlagIsDependedOnByOthers : kFlagIsNotDependedOnByOthers;
    if (const Value* v = d.find(kCMSampleAttachmentKey_DependsOnOthers))
        flags |= truthy(v) ? kFlagDependsOnOthers : kFlagDoesNotDependOnOthers;
    if (truthy(d.find(kCMSampleAttachmentKey_EarlierDisplayTimesAllowed))) flags |= kFlagEarlierDisplayTimesAllowed;
    return flags;
}

int32_t truncatedInt32(double v) {
    if (!std::isfinite(v)) return 0;
    if (v >= 2147483647.0) return INT32_MAX;
    if (v <= -2147483648.0) return INT32_MIN;
    return int32_t(v);
}

}  // namespace

int32_t SkarnMediaReader::pullFrame(CMSampleBufferRef* sampleBufferOut, bool* dropped, uint64_t* sequenceNumber) {
    _fileReader->setBufferSize(kProbeRefill);
    if (isVideo()) {
        int32_t status = scheduleSamples(1);
        if (status != 0) return status;
    }
    if (CMBufferQueueIsAtEndOfData(_bufferQueue)) return kSkarnMediaReaderEndOfData;
    CMSampleBufferRef buffer = dynamicRefCast<CMSampleBuffer>(CMBufferQueueDequeueAndRetain(_bufferQueue));
    uint8_t isDropped = 0;
    uint32_t sequence = 0;
    if (buffer) {
        CMFormatDescriptionRef format = CMSampleBufferGetFormatDescription(buffer);
        SkarnAnalyzePulldown(CMSampleBufferGetDataBuffer(buffer), CMFormatDescriptionGetMediaSubType(format),
                             _filename.c_str(), int32_t(_shootingRate), &isDropped, &sequence);
        if (sampleBufferOut && !isDropped) *sampleBufferOut = buffer;
    }
    if (sequenceNumber) *sequenceNumber = sequence;
    if (dropped) *dropped = isDropped != 0;
    return 0;
}

int32_t SkarnMediaReader::getNextMedia(VestaKilnPlugInMediaSpecifier_Deprecated* media) {
    // A sample that could not be read ends the track; the host hears why.
    int32_t scheduled = scheduleBuffers();
    CMSampleBufferRef buffer = dynamicRefCast<CMSampleBuffer>(CMBufferQueueDequeueAndRetain(_bufferQueue));
    if (!buffer) {
        SkarnLog(320, "%@ [%@%d]: end of data", this, kindLetter(), _trackID);
        media->endOfMedia = CMBufferQueueIsAtEndOfData(_bufferQueue) ? 1 : 0;
        return scheduled;
    }
    CMTime pts = CMSampleBufferGetPresentationTimeStamp(buffer), dts = CMSampleBufferGetDecodeTimeStamp(buffer),
           duration = CMSampleBufferGetDuration(buffer);
    SkarnLog(320, "%@ [%@%d]: dequeue [%d] | pts: %lld/%d | dts: %lld/%d | dur: %lld/%d", this, kindLetter(), _trackID,
             CMBufferQueueGetBufferCount(_bufferQueue), pts.value, pts.timescale, dts.value, dts.timescale,
             duration.value, duration.timescale);
    if (isVideo())
        deliverVideo(buffer, media);
    else
        deliverAudio(buffer, media);
    media->endOfMedia = CMBufferQueueIsAtEndOfData(_bufferQueue) ? 1 : 0;
    return 0;
}

void SkarnMediaReader::deliverVideo(const CMSampleBufferRef& buffer, VestaKilnPlugInMediaSpecifier_Deprecated* media) {
    CMBlockBufferRef block = CMSampleBufferGetDataBuffer(buffer);
    CMFormatDescriptionRef format = CMSampleBufferGetFormatDescription(buffer);
    uint8_t dropped = 0;
    uint32_t sequence = 0;
    SkarnAnalyzePulldown(block, CMFormatDescriptionGetMediaSubType(format), _filename.c_str(), int32_t(_shootingRate),
                         &dropped, &sequence);
    // A repeated frame of a cadence being removed is not delivered.
    if (_pulldownCadenceDropSequence && dropped) return;

    char* data = nullptr;
    size_t length = 0;
    if (CMBlockBufferGetDataPointer(block, 0, nullptr, &length, &data) != 0) return;
    if (_replaceAVC1StartCode) {
        std::array<const uint8_t*, kSkarnH264MaxParameterSets> sets{};
        std::array<uint64_t, kSkarnH264MaxParameterSets> setSizes{};
        uint32_t count = 0;
        SkarnH264ReplaceStartCodesWithLengthCodes(reinterpret_cast<uint8_t*>(data), int64_t(length), sets, setSizes,
                                                  &count);
        if (!_avc1FormatDesc) {
            std::array<size_t, kSkarnH264MaxParameterSets> sizes{};
            for (size_t i = 0; i < sizes.size(); ++i) sizes[i] = size_t(setSizes[i]);
            OSStatus status = CMVideoFormatDescriptionCreateFromH264ParameterSets(
                kCFAllocatorDefault, count, sets.data(), sizes.data(), 4, &_avc1FormatDesc);
            if (status != 0)
                logLine(SkarnLogFormat("error %ld from CMVideoFormatDescriptionCreateFromH264ParameterSets()\n",
                                       long(status)));
        }
        if (_avc1FormatDesc) format = _avc1FormatDesc;
    }
    FourCharCode subtype = CMFormatDescriptionGetMediaSubType(format);
    CMTime pts = CMSampleBufferGetPresentationTimeStamp(buffer);
    CMTime dts = CMSampleBufferGetDecodeTimeStamp(buffer);
    CMTime duration = CMSampleBufferGetDuration(buffer);

    media->videoData = reinterpret_cast<uint8_t*>(data);
    media->videoDataSize = uint32_t(length);
    media->videoPresentationTime = pts.value;
    media->videoDecodeTime = isReorderedH264(subtype) ? dts.value : -1;
    media->videoDuration = duration.value;
    media->videoTimescale = pts.timescale;
    if (format != _imageDescriptionFormat) {
        _imageDescription = nullptr;
        _imageDescriptionFormat = format;
        CMBlockBufferRef description;
        if (CMVideoFormatDescriptionCopyAsBigEndianImageDescriptionBlockBuffer(kCFAllocatorDefault, format, 0, nullptr,
                                                                               &description) == 0) {
            char* bytes = nullptr;
            size_t size = 0;
            if (CMBlockBufferGetDataPointer(description, 0, nullptr, &size, &bytes) == 0 &&
                CMSwapBigEndianImageDescriptionToHost(reinterpret_cast<uint8_t*>(bytes), size) == 0)
                _imageDescription = description;
        }
    }
    media->videoImageDescription = nullptr;
    media->videoImageDescriptionSize = 0;
    if (_imageDescription) {
        char* bytes = nullptr;
        size_t size = 0;
        CMBlockBufferGetDataPointer(_imageDescription, 0, nullptr, &size, &bytes);
        media->videoImageDescription = reinterpret_cast<uint8_t*>(bytes);
        media->videoImageDescriptionSize = uint32_t(size);
    }
    Ref<SkarnVideoBuffer> keeper = SkarnVideoBuffer::init();
    keeper->setVideoSampleBuffer(buffer);
    keeper->setImageDescription(_imageDescription);

    int64_t frameInClip = duration.value != 0 ? pts.value / duration.value : 0;
    media->timecodeFrame = uint32_t(frameInClip + _timecodeCounter);
    media->timecodeFrameQuanta = uint32_t(_frameQuanta);
    media->timecodeIsDropFrame = _isDropFrame ? 1 : 0;
    media->videoTimingValid = 1;
    if (isReorderedH264(subtype)) media->videoSampleFlags = sampleFlags(buffer);

    if (!_pulldownCadenceDropSequence) {
        if (_isFirstFrame) {
            // A first frame that is a repeat leaves the count before the
            // first delivered frame, and the first-frame state in place.
            if (dropped) {
                _frameCounter = -1;
            } else {
                _frameCounter = 0;
                _isFirstFrame = false;
            }
        } else {
            ++_frameCounter;
        }
    } else {
        media->videoTimescale = truncatedInt32(_adjustedVideoTimescale);
        (void)CMGetAttachment(buffer, "CMIOPulldownCadenceInfo", nullptr);
        double value = double(_frameCounter) * double(duration.value);
        if (_useTimingOffset) value += _timingOffset * _adjustedVideoTimescale + 0.5;
        media->videoPresentationTime = int64_t(value);
    }

    Ref<SkarnVestaTimecode> timecode = SkarnVestaTimecode::timecodeWithFramecount(
        int64_t(media->timecodeFrame), double(_frameQuanta), 0, 0, media->timecodeIsDropFrame ? 1 : 2);
    if (_pulldownCadenceDropSequence)
        SkarnLog(320, "Video PTS = %lld/%d, duration = %lld, %@ (%d) -- %d .. cadence: %d of %d, follow-on drop %d",
                 media->videoPresentationTime, media->videoTimescale, duration.value, timecode, media->timecodeFrame,
                 _frameCounter, _cadenceIndex, _cadenceLength,
                 _cadenceLength > 0 ? _pulldownCadenceDropSequence[uint64_t(_frameCounter + _cadenceIndex) %
                                                                   uint64_t(_cadenceLength)]
                                    : 0);
    else if (isReorderedH264(subtype))
        SkarnLog(320, "Video PTS = %lld/%d, Video DTS = %lld/%d %@ (%d) -- %d", media->videoPresentationTime,
                 media->videoTimescale, dts.value, dts.timescale, timecode, media->timecodeFrame, _frameCounter);
    else
        SkarnLog(320, "Video PTS = %lld/%d, duration = %lld, %@ (%d) -- %d", media->videoPresentationTime,
                 media->videoTimescale, duration.value, timecode, media->timecodeFrame, _frameCounter);

    // Tracks read through MXF index records carry their own timing; for the
    // others the host gets constant-frame-rate times with each frame.
    if (!_trackReader->mxfVideoSampleOffsetAtPresentationTime(pts)) {
        CFDictionaryRef entries = CFDictionary::create();
        CMTime time = CMTimeMake(_frameCounter * duration.value + _fakeStartTime.value, _fakeStartTime.timescale);
        if (CMTIME_IS_VALID(time)) {
            entries->dictionary().set("CMIOSampleBufferAttachmentKey_CFRTime", CMTimeCopyAsDictionary(time));
            entries->dictionary().set("CMIOSampleBufferAttachmentKey_CFRDuration", CMTimeCopyAsDictionary(duration));
        }
        media->videoFrameAttachments = &entries->dictionary();
        keeper->addObjectToRelease(entries);
    }
    if (_pulldownCadenceDropSequence) ++_frameCounter;
    media->videoMediaDisposeRefCon2 = keeper.detach();
}

void SkarnMediaReader::deliverAudio(const CMSampleBufferRef& buffer, VestaKilnPlugInMediaSpecifier_Deprecated* media) {
    size_t needed = 0;
    if (CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(buffer, &needed, nullptr, 0, kCFAllocatorDefault,
                                                                kCFAllocatorDefault, 0, nullptr) != 0 ||
        needed < sizeof(AudioBufferList))
        return;
    auto* list = static_cast<AudioBufferList*>(std::calloc(1, needed));
    if (!list) return;
    CMBlockBufferRef block;
    if (CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(buffer, nullptr, list, needed, kCFAllocatorDefault,
                                                                kCFAllocatorDefault, 0, &block) != 0) {
        std::free(list);
        return;
    }
    CMFormatDescriptionRef format = CMSampleBufferGetFormatDescription(buffer);
    const AudioStreamBasicDescription* asbd = CMAudioFormatDescriptionGetStreamBasicDescription(format);
    size_t layoutSize = 0;
    const AudioChannelLayout* layout = CMAudioFormatDescriptionGetChannelLayout(format, &layoutSize);
    CMTime pts = CMSampleBufferGetPresentationTimeStamp(buffer);
    CMTime duration = CMSampleBufferGetDuration(buffer);

    int64_t presentation = pts.value;
    if (_timingOffset != 0 && _useTimingOffset) {
        // The video time the ingest object copied in, when a frame came with
        // this call. The second term is truncated before the half is added to
        // the first, so it is not rounded: hosts have always been given this.
        int64_t base = media->videoTimingValid ? media->videoPresentationTime : _frameDuration.value + _frameCounter;
        double rate = asbd ? asbd->mSampleRate : 0;
        int32_t offset = truncatedInt32(_timingOffset * double(pts.timescale) + 0.5);
        int32_t at = _frameDuration.timescale > 0 ? truncatedInt32(double(base) * rate / double(_frameDuration.timescale))
                                                  : 0;
        presentation = int64_t(offset) + int64_t(at);
        _frameCounter = base;
    } else if (_pulldownCadenceDropSequence) {
        presentation = _frameCounter;
        _frameCounter += duration.value;
    }

    media->audioBufferList = list;
    media->audioSampleCount = uint32_t(CMSampleBufferGetNumSamples(buffer));
    media->audioDataOffset = 0;
    media->audioPresentationTime = presentation;
    media->audioDecodeTime = -1;
    media->audioDuration = duration.value;
    media->audioTimescale = pts.timescale;
    media->audioStreamDescription = const_cast<AudioStreamBasicDescription*>(asbd);
    media->audioStreamDescriptionSize = sizeof(AudioStreamBasicDescription);
    media->audioChannelLayout = const_cast<AudioChannelLayout*>(layout);
    media->audioChannelLayoutSize = layoutSize;
    media->reserved176 = 0;
    media->reserved184 = 0;
    Ref<SkarnAudioBuffer> keeper = SkarnAudioBuffer::init();
    keeper->setAudioSampleBuffer(buffer);
    keeper->setAudioBufferListBlockBuffer(block);
    keeper->setAudioBufferList(list);
    media->audioMediaDisposeRefCon2 = keeper.detach();
    SkarnLog(320, "Audio PTS = %lld/%d - %lld", presentation, pts.timescale, duration.value);
}
