#include "CMSampleBuffer.h"

#include <cstdio>
#include <limits>
#include <new>

namespace {

// Stamp of sample i when one entry stands for all: the entry's advanced by i
// durations.
CMTime advanced(CMTime stamp, CMTime duration, CMItemIndex i) {
    if (i == 0 || CMTIME_IS_INVALID(stamp)) return stamp;
    if (i > std::numeric_limits<int32_t>::max()) return kCMTimeInvalid;
    return CMTimeAdd(stamp, CMTimeMultiply(duration, int32_t(i)));
}

}  // namespace

CMSampleTimingInfo CMSampleBuffer::timingOfSample(CMItemIndex index) const {
    if (_timing.empty() || index < 0) return kCMTimingInfoInvalid;
    if (_timing.size() > 1) return size_t(index) < _timing.size() ? _timing[size_t(index)] : kCMTimingInfoInvalid;
    if (index >= std::max<CMItemCount>(_numSamples, 1)) return kCMTimingInfoInvalid;
    const CMSampleTimingInfo& t = _timing.front();
    return {t.duration, advanced(t.presentationTimeStamp, t.duration, index),
            advanced(t.decodeTimeStamp, t.duration, index)};
}

size_t CMSampleBuffer::sizeOfSample(CMItemIndex index) const {
    if (_sizes.empty() || index < 0 || index >= _numSamples) return 0;
    return _sizes.size() == 1 ? _sizes.front() : _sizes[size_t(index)];
}

size_t CMSampleBuffer::totalSampleSize() const {
    if (_sizes.empty()) return 0;
    // Fits: creation checked the total (against the data when there is any).
    if (_sizes.size() == 1) return _sizes.front() * size_t(_numSamples);
    size_t total = 0;
    for (size_t s : _sizes) total += s;
    return total;
}

CMTime CMSampleBuffer::presentationTimeStamp() const {
    if (_timing.empty()) return kCMTimeInvalid;
    if (_timing.size() == 1) return _timing.front().presentationTimeStamp;
    // CMTimeMinimum ranks invalid stamps last, so they only win when all are.
    CMTime earliest = kCMTimeInvalid;
    for (const auto& t : _timing) earliest = CMTimeMinimum(earliest, t.presentationTimeStamp);
    return earliest;
}

CMTime CMSampleBuffer::decodeTimeStamp() const {
    return _timing.empty() ? kCMTimeInvalid : _timing.front().decodeTimeStamp;
}

CMTime CMSampleBuffer::duration() const {
    if (_timing.empty()) return kCMTimeInvalid;
    if (_timing.size() == 1) {
        if (_numSamples <= 1) return _timing.front().duration;
        if (_numSamples > std::numeric_limits<int32_t>::max()) return kCMTimeInvalid;
        return CMTimeMultiply(_timing.front().duration, int32_t(_numSamples));
    }
    CMTime sum = kCMTimeZero;
    for (const auto& t : _timing) sum = CMTimeAdd(sum, t.duration);
    return sum;
}

OSStatus CMSampleBuffer::makeDataReady() {
    std::lock_guard<std::mutex> lock(_makeDataReadyLock);
    if (dataIsReady()) return noErr;
    if (!_makeDataReady) return kCMSampleBufferError_BufferNotReady;
    OSStatus status = _makeDataReady(CMSampleBufferRef(this), _makeDataReadyRefcon);
    if (status == noErr) setDataReady();
    return status;
}

std::vector<Dictionary>* CMSampleBuffer::sampleAttachments(bool create) {
    std::lock_guard<std::mutex> lock(_sampleAttachmentsLock);
    if (!_sampleAttachments && create) {
        try {
            _sampleAttachments = std::make_unique<std::vector<Dictionary>>(size_t(_numSamples));
        } catch (const std::bad_alloc&) {
            return nullptr;
        }
    }
    return _sampleAttachments.get();
}

std::string CMSampleBuffer::description() const {
    char buf[160];
    std::snprintf(buf, sizeof buf, "<CMSampleBuffer %p>{%s%ld samples, ", static_cast<const void*>(this),
                  isValid() ? "" : "invalid, ", _numSamples);
    std::string s = buf;
    s += "pts " + CMTimeCopyDescription(presentationTimeStamp()) + ", dts " +
         CMTimeCopyDescription(decodeTimeStamp()) + ", duration " + CMTimeCopyDescription(duration());
    std::snprintf(buf, sizeof buf, ", %zu bytes%s, format ", totalSampleSize(), dataIsReady() ? "" : " not ready");
    return s + buf + describe(_formatDescription) + "}";
}

OSStatus CMSampleBufferCreate(CFAllocatorRef, const CMBlockBufferRef& dataBuffer, Boolean dataReady,
                              CMSampleBufferMakeDataReadyCallback makeDataReadyCallback, void* makeDataReadyRefcon,
                              const CMFormatDescriptionRef& formatDescription, CMItemCount numSamples,
                              CMItemCount numSampleTimingEntries, const CMSampleTimingInfo* sampleTimingArray,
                              CMItemCount numSampleSizeEntries, const size_t* sampleSizeArray,
                              CMSampleBufferRef* sampleBufferOut) {
    if (!sampleBufferOut) return kCMSampleBufferError_RequiredParameterMissing;
    *sampleBufferOut = nullptr;
    auto countOK = [&](CMItemCount entries) { return entries == 0 || entries == 1 || entries == numSamples; };
    if (numSamples < 0 || !countOK(numSampleTimingEntries) || !countOK(numSampleSizeEntries))
        return kCMSampleBufferError_InvalidEntryCount;
    if ((numSampleTimingEntries > 0 && !sampleTimingArray) || (numSampleSizeEntries > 0 && !sampleSizeArray))
        return kCMSampleBufferError_RequiredParameterMissing;

    // The samples' total size, without overflowing, against the data.
    if (numSampleSizeEntries > 0) {
        constexpr size_t kMax = std::numeric_limits<size_t>::max();
        size_t total = 0;
        bool overflow = false;
        if (numSampleSizeEntries == 1) {
            overflow = numSamples > 0 && sampleSizeArray[0] > kMax / size_t(numSamples);
            total = overflow ? 0 : sampleSizeArray[0] * size_t(numSamples);
        } else {
            for (CMItemCount i = 0; i < numSampleSizeEntries && !overflow; ++i) {
                overflow = sampleSizeArray[i] > kMax - total;
                total += overflow ? 0 : sampleSizeArray[i];
            }
        }
        if (overflow || (dataBuffer && total > dataBuffer->dataLength())) return kCMSampleBufferError_InvalidEntryCount;
    }

    CMSampleBufferRef sbuf(new (std::nothrow) CMSampleBuffer());
    if (!sbuf) return kCMSampleBufferError_AllocationFailed;
    try {
        sbuf->_timing.assign(sampleTimingArray, sampleTimingArray + numSampleTimingEntries);
        sbuf->_sizes.assign(sampleSizeArray, sampleSizeArray + numSampleSizeEntries);
    } catch (const std::bad_alloc&) {
        return kCMSampleBufferError_AllocationFailed;
    }
    sbuf->_dataBuffer = dataBuffer;
    sbuf->_formatDescription = formatDescription;
    sbuf->_numSamples = numSamples;
    sbuf->_dataReady.store(dataReady, std::memory_order_relaxed);
    sbuf->_makeDataReady = makeDataReadyCallback;
    sbuf->_makeDataReadyRefcon = makeDataReadyRefcon;
    *sampleBufferOut = std::move(sbuf);
    return noErr;
}

OSStatus CMSampleBufferCreateReady(CFAllocatorRef allocator, const CMBlockBufferRef& dataBuffer,
                                   const CMFormatDescriptionRef& formatDescription, CMItemCount numSamples,
                                   CMItemCount numSampleTimingEntries, const CMSampleTimingInfo* sampleTimingArray,
                                   CMItemCount numSampleSizeEntries, const size_t* sampleSizeArray,
                                   CMSampleBufferRef* sampleBufferOut) {
    return CMSampleBufferCreate(allocator, dataBuffer, true, nullptr, nullptr, formatDescription, numSamples,
                                numSampleTimingEntries, sampleTimingArray, numSampleSizeEntries, sampleSizeArray,
                                sampleBufferOut);
}

Boolean CMSampleBufferDataIsReady(const CMSampleBufferRef& sbuf) { return sbuf && sbuf->dataIsReady(); }

OSStatus CMSampleBufferSetDataReady(const CMSampleBufferRef& sbuf) {
    if (!sbuf) return kCMSampleBufferError_RequiredParameterMissing;
    sbuf->setDataReady();
    return noErr;
}

OSStatus CMSampleBufferMakeDataReady(const CMSampleBufferRef& sbuf) {
    return sbuf ? sbuf->makeDataReady() : kCMSampleBufferError_RequiredParameterMissing;
}

Boolean CMSampleBufferIsValid(const CMSampleBufferRef& sbuf) { return sbuf && sbuf->isValid(); }

OSStatus CMSampleBufferInvalidate(const CMSampleBufferRef& sbuf) {
    if (!sbuf) return kCMSampleBufferError_RequiredParameterMissing;
    sbuf->invalidate();
    return noErr;
}

CMBlockBufferRef CMSampleBufferGetDataBuffer(const CMSampleBufferRef& sbuf) {
    return sbuf ? sbuf->dataBuffer() : nullptr;
}

CMFormatDescriptionRef CMSampleBufferGetFormatDescription(const CMSampleBufferRef& sbuf) {
    return sbuf ? sbuf->formatDescription() : nullptr;
}

CMItemCount CMSampleBufferGetNumSamples(const CMSampleBufferRef& sbuf) { return sbuf ? sbuf->numSamples() : 0; }

CMTime CMSampleBufferGetPresentationTimeStamp(const CMSampleBufferRef& sbuf) {
    return sbuf ? sbuf->presentationTimeStamp() : kCMTimeInvalid;
}

CMTime CMSampleBufferGetDecodeTimeStamp(const CMSampleBufferRef& sbuf) {
    return sbuf ? sbuf->decodeTimeStamp() : kCMTimeInvalid;
}

CMTime CMSampleBufferGetDuration(const CMSampleBufferRef& sbuf) { return sbuf ? sbuf->duration() : kCMTimeInvalid; }

OSStatus CMSampleBufferGetSampleTimingInfo(const CMSampleBufferRef& sbuf, CMItemIndex sampleIndex,
                                           CMSampleTimingInfo* timingInfoOut) {
    if (timingInfoOut) *timingInfoOut = kCMTimingInfoInvalid;
    if (!sbuf || !timingInfoOut) return kCMSampleBufferError_RequiredParameterMissing;
    if (sbuf->timingEntries().empty()) return kCMSampleBufferError_BufferHasNoSampleTimingInfo;
    if (sampleIndex < 0 || sampleIndex >= std::max<CMItemCount>(sbuf->numSamples(), 1))
        return kCMSampleBufferError_SampleIndexOutOfRange;
    *timingInfoOut = sbuf->timingOfSample(sampleIndex);
    return noErr;
}

OSStatus CMSampleBufferGetSampleTimingInfoArray(const CMSampleBufferRef& sbuf, CMItemCount numSampleTimingEntries,
                                                CMSampleTimingInfo* timingArrayOut,
                                                CMItemCount* timingArrayEntriesNeededOut) {
    if (timingArrayEntriesNeededOut) *timingArrayEntriesNeededOut = 0;
    if (!sbuf) return kCMSampleBufferError_RequiredParameterMissing;
    const auto& timing = sbuf->timingEntries();
    if (timing.empty()) return kCMSampleBufferError_BufferHasNoSampleTimingInfo;
    if (timingArrayEntriesNeededOut) *timingArrayEntriesNeededOut = CMItemCount(timing.size());
    if (!timingArrayOut) return timingArrayEntriesNeededOut ? noErr : kCMSampleBufferError_RequiredParameterMissing;
    if (numSampleTimingEntries < CMItemCount(timing.size())) return kCMSampleBufferError_ArrayTooSmall;
    std::copy(timing.begin(), timing.end(), timingArrayOut);
    return noErr;
}

size_t CMSampleBufferGetSampleSize(const CMSampleBufferRef& sbuf, CMItemIndex sampleIndex) {
    return sbuf ? sbuf->sizeOfSample(sampleIndex) : 0;
}

size_t CMSampleBufferGetTotalSampleSize(const CMSampleBufferRef& sbuf) { return sbuf ? sbuf->totalSampleSize() : 0; }

OSStatus CMSampleBufferGetSampleSizeArray(const CMSampleBufferRef& sbuf, CMItemCount sizeArrayEntries,
                                          size_t* sizeArrayOut, CMItemCount* sizeArrayEntriesNeededOut) {
    if (sizeArrayEntriesNeededOut) *sizeArrayEntriesNeededOut = 0;
    if (!sbuf) return kCMSampleBufferError_RequiredParameterMissing;
    const auto& sizes = sbuf->sizeEntries();
    if (sizes.empty()) return kCMSampleBufferError_BufferHasNoSampleSizes;
    if (sizeArrayEntriesNeededOut) *sizeArrayEntriesNeededOut = CMItemCount(sizes.size());
    if (!sizeArrayOut) return sizeArrayEntriesNeededOut ? noErr : kCMSampleBufferError_RequiredParameterMissing;
    if (sizeArrayEntries < CMItemCount(sizes.size())) return kCMSampleBufferError_ArrayTooSmall;
    std::copy(sizes.begin(), sizes.end(), sizeArrayOut);
    return noErr;
}

std::vector<Dictionary>* CMSampleBufferGetSampleAttachmentsArray(const CMSampleBufferRef& sbuf,
                                                                 Boolean createIfNecessary) {
    return sbuf ? sbuf->sampleAttachments(createIfNecessary) : nullptr;
}
