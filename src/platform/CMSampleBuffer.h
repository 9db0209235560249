// Sample buffers: media samples (one video frame, a run of audio frames) with
// their timing, sizes, format description and attachments.
//
// The CoreMedia calls the plug-in and host make, with CoreMedia's names,
// validation and status codes. A sample buffer's data, format, timing and sizes
// are fixed at creation (there is no later data-buffer setter), so getters may
// run on any thread; data readiness, validity and the attachments are guarded.
// Timing given as one entry for several samples means "every sample has this
// duration, the stamps advance by it", as in CoreMedia.
#pragma once

#include "CFBase.h"
#include "CMAttachmentBearer.h"
#include "CMBlockBuffer.h"
#include "CMFormatDescription.h"
#include "CMTime.h"
#include "CoreAudioTypes.h"

#include <atomic>
#include <memory>
#include <mutex>
#include <vector>

struct CMSampleTimingInfo {
    CMTime duration;
    CMTime presentationTimeStamp;
    CMTime decodeTimeStamp;
};

inline constexpr CMSampleTimingInfo kCMTimingInfoInvalid{kCMTimeInvalid, kCMTimeInvalid, kCMTimeInvalid};

// -12742 (invalid sample data) is left out on purpose: the ingest pipeline uses
// that number for its own end-of-data answer, and nothing here answers it.
enum : OSStatus {
    kCMSampleBufferError_AllocationFailed = -12730,
    kCMSampleBufferError_RequiredParameterMissing = -12731,
    kCMSampleBufferError_AlreadyHasDataBuffer = -12732,
    kCMSampleBufferError_BufferNotReady = -12733,
    kCMSampleBufferError_SampleIndexOutOfRange = -12734,
    kCMSampleBufferError_BufferHasNoSampleSizes = -12735,
    kCMSampleBufferError_BufferHasNoSampleTimingInfo = -12736,
    kCMSampleBufferError_ArrayTooSmall = -12737,
    kCMSampleBufferError_InvalidEntryCount = -12738,
    kCMSampleBufferError_CannotSubdivide = -12739,
    kCMSampleBufferError_SampleTimingInfoInvalid = -12740,
    kCMSampleBufferError_InvalidMediaTypeForOperation = -12741,
    kCMSampleBufferError_InvalidMediaFormat = -12743,
    kCMSampleBufferError_Invalidated = -12744,
};

enum : uint32_t {
    kCMSampleBufferFlag_AudioBufferList_Assure16ByteAlignment = 1u << 0,
};

// Per-sample attachment keys.
inline constexpr const char* kCMSampleAttachmentKey_NotSync = "NotSync";
inline constexpr const char* kCMSampleAttachmentKey_PartialSync = "PartialSync";
inline constexpr const char* kCMSampleAttachmentKey_HasRedundantCoding = "HasRedundantCoding";
inline constexpr const char* kCMSampleAttachmentKey_IsDependedOnByOthers = "IsDependedOnByOthers";
inline constexpr const char* kCMSampleAttachmentKey_DependsOnOthers = "DependsOnOthers";
inline constexpr const char* kCMSampleAttachmentKey_EarlierDisplayTimesAllowed = "EarlierDisplayTimesAllowed";
inline constexpr const char* kCMSampleAttachmentKey_DisplayImmediately = "DisplayImmediately";
inline constexpr const char* kCMSampleAttachmentKey_DoNotDisplay = "DoNotDisplay";

class CMSampleBuffer;
using CMSampleBufferRef = Ref<CMSampleBuffer>;
using CMSampleBufferMakeDataReadyCallback = OSStatus (*)(const CMSampleBufferRef& sbuf, void* makeDataReadyRefcon);

class CMSampleBuffer : public CMAttachmentBearer {
public:
    // Sample count, first stamps, duration, total size and the format.
    std::string description() const override;

    const CMBlockBufferRef& dataBuffer() const { return _dataBuffer; }
    const CMFormatDescriptionRef& formatDescription() const { return _formatDescription; }
    CMItemCount numSamples() const { return _numSamples; }
    // As given at creation: 0, 1 or numSamples entries.
    const std::vector<CMSampleTimingInfo>& timingEntries() const { return _timing; }
    const std::vector<size_t>& sizeEntries() const { return _sizes; }
    // Sample index's timing (expanded from a single entry); invalid past the end.
    CMSampleTimingInfo timingOfSample(CMItemIndex index) const;
    size_t sizeOfSample(CMItemIndex index) const;
    size_t totalSampleSize() const;
    // The earliest presentation stamp, the first decode stamp, the sum of the
    // durations; invalid without timing.
    CMTime presentationTimeStamp() const;
    CMTime decodeTimeStamp() const;
    CMTime duration() const;

    bool dataIsReady() const { return _dataReady.load(std::memory_order_acquire); }
    void setDataReady() { _dataReady.store(true, std::memory_order_release); }
    OSStatus makeDataReady();
    bool isValid() const { return _valid.load(std::memory_order_acquire); }
    void invalidate() { _valid.store(false, std::memory_order_release); }

    // One dictionary per sample, made on first request with create; the array
    // and its dictionaries live as long as the buffer and never move.
    std::vector<Dictionary>* sampleAttachments(bool create);

private:
    CMSampleBuffer() = default;
    friend OSStatus CMSampleBufferCreate(CFAllocatorRef, const CMBlockBufferRef&, Boolean,
                                         CMSampleBufferMakeDataReadyCallback, void*, const CMFormatDescriptionRef&,
                                         CMItemCount, CMItemCount, const CMSampleTimingInfo*, CMItemCount,
                                         const size_t*, CMSampleBufferRef*);

    CMBlockBufferRef _dataBuffer;
    CMFormatDescriptionRef _formatDescription;
    CMItemCount _numSamples = 0;
    std::vector<CMSampleTimingInfo> _timing;
    std::vector<size_t> _sizes;
    std::atomic<bool> _dataReady{false};
    std::atomic<bool> _valid{true};
    CMSampleBufferMakeDataReadyCallback _makeDataReady = nullptr;
    void* _makeDataReadyRefcon = nullptr;
    std::mutex _makeDataReadyLock;
    std::mutex _sampleAttachmentsLock;
    std::unique_ptr<std::vector<Dictionary>> _sampleAttachments;
};

// Timing entries and size entries must each number 0, 1 or numSamples, with
// arrays given for non-zero counts (kCMSampleBufferError_InvalidEntryCount,
// kCMSampleBufferError_RequiredParameterMissing). With a data buffer, the
// samples' sizes must fit in its data (kCMSampleBufferError_InvalidEntryCount).
OSStatus CMSampleBufferCreate(CFAllocatorRef allocator, const CMBlockBufferRef& dataBuffer, Boolean dataReady,
                              CMSampleBufferMakeDataReadyCallback makeDataReadyCallback, void* makeDataReadyRefcon,
                              const CMFormatDescriptionRef& formatDescription, CMItemCount numSamples,
                              CMItemCount numSampleTimingEntries, const CMSampleTimingInfo* sampleTimingArray,
                              CMItemCount numSampleSizeEntries, const size_t* sampleSizeArray,
                              CMSampleBufferRef* sampleBufferOut);
// CMSampleBufferCreate with the data ready and no callback.
OSStatus CMSampleBufferCreateReady(CFAllocatorRef allocator, const CMBlockBufferRef& dataBuffer,
                                   const CMFormatDescriptionRef& formatDescription, CMItemCount numSamples,
                                   CMItemCount numSampleTimingEntries, const CMSampleTimingInfo* sampleTimingArray,
                                   CMItemCount numSampleSizeEntries, const size_t* sampleSizeArray,
                                   CMSampleBufferRef* sampleBufferOut);

Boolean CMSampleBufferDataIsReady(const CMSampleBufferRef& sbuf);
OSStatus CMSampleBufferSetDataReady(const CMSampleBufferRef& sbuf);
// Runs the creation callback once, unless the data is ready already.
OSStatus CMSampleBufferMakeDataReady(const CMSampleBufferRef& sbuf);
Boolean CMSampleBufferIsValid(const CMSampleBufferRef& sbuf);
OSStatus CMSampleBufferInvalidate(const CMSampleBufferRef& sbuf);

// Null for a null buffer or one made without.
CMBlockBufferRef CMSampleBufferGetDataBuffer(const CMSampleBufferRef& sbuf);
CMFormatDescriptionRef CMSampleBufferGetFormatDescription(const CMSampleBufferRef& sbuf);
CMItemCount CMSampleBufferGetNumSamples(const CMSampleBufferRef& sbuf);

// The numerically earliest presentation stamp of the samples (the first
// sample's for buffers in presentation order).
CMTime CMSampleBufferGetPresentationTimeStamp(const CMSampleBufferRef& sbuf);
// The first sample's decode stamp.
CMTime CMSampleBufferGetDecodeTimeStamp(const CMSampleBufferRef& sbuf);
// The sum of the samples' durations; invalid without timing.
CMTime CMSampleBufferGetDuration(const CMSampleBufferRef& sbuf);
OSStatus CMSampleBufferGetSampleTimingInfo(const CMSampleBufferRef& sbuf, CMItemIndex sampleIndex,
                                           CMSampleTimingInfo* timingInfoOut);
// The entries as stored (one entry may stand for every sample). A null array
// only asks for the count.
OSStatus CMSampleBufferGetSampleTimingInfoArray(const CMSampleBufferRef& sbuf, CMItemCount numSampleTimingEntries,
                                                CMSampleTimingInfo* timingArrayOut,
                                                CMItemCount* timingArrayEntriesNeededOut);

// 0 without sizes or past the end.
size_t CMSampleBufferGetSampleSize(const CMSampleBufferRef& sbuf, CMItemIndex sampleIndex);
size_t CMSampleBufferGetTotalSampleSize(const CMSampleBufferRef& sbuf);
OSStatus CMSampleBufferGetSampleSizeArray(const CMSampleBufferRef& sbuf, CMItemCount sizeArrayEntries,
                                          size_t* sizeArrayOut, CMItemCount* sizeArrayEntriesNeededOut);

// nullptr for a null buffer, or when the array does not exist yet and
// createIfNecessary is false.
std::vector<Dictionary>* CMSampleBufferGetSampleAttachmentsArray(const CMSampleBufferRef& sbuf,
                                                                 Boolean createIfNecessary);

// The linear-PCM samples as an audio buffer list pointing into the buffer's
// data: one buffer for interleaved audio, one per channel otherwise (channel
// after channel in the data). blockBufferOut receives the block that backs the
// pointers: the buffer's own, or, when 16-byte alignment is asked for and the
// data is not aligned, an aligned copy. A null bufferListOut with a
// bufferListSizeNeededOut answers only the size. Errors: a null buffer or
// missing outputs, RequiredParameterMissing; no stream description,
// InvalidMediaTypeForOperation; a compressed format, InvalidMediaFormat; a list
// too small, ArrayTooSmall; data shorter than the samples, InvalidEntryCount;
// data not ready, BufferNotReady.
OSStatus CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(
    const CMSampleBufferRef& sbuf, size_t* bufferListSizeNeededOut, AudioBufferList* bufferListOut,
    size_t bufferListSize, CFAllocatorRef blockBufferStructureAllocator, CFAllocatorRef blockBufferBlockAllocator,
    uint32_t flags, CMBlockBufferRef* blockBufferOut);
