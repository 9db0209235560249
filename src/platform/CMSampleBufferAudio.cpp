// Audio buffer lists over a sample buffer's linear-PCM data.
#include "CMSampleBuffer.h"

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <limits>

namespace {

constexpr size_t kAlignment = 16;

size_t roundUp(size_t n) { return (n + kAlignment - 1) / kAlignment * kAlignment; }

// The channel buffers copied to 16-byte aligned places in a new block.
OSStatus alignedCopy(const char* base, size_t perBuffer, UInt32 buffers, CMBlockBufferRef* blockOut, char** baseOut,
                     size_t* strideOut) {
    size_t stride = roundUp(perBuffer);
    size_t total = roundUp(std::max<size_t>(stride * buffers, 1));
    auto* memory = static_cast<char*>(std::aligned_alloc(kAlignment, total));
    if (!memory) return kCMSampleBufferError_AllocationFailed;
    for (UInt32 i = 0; i < buffers; ++i) std::memcpy(memory + i * stride, base + i * perBuffer, perBuffer);
    if (CMBlockBufferCreateWithMemoryBlock(nullptr, memory, total, kCFAllocatorDefault, nullptr, 0, total, 0,
                                           blockOut) != kCMBlockBufferNoErr) {
        std::free(memory);
        return kCMSampleBufferError_AllocationFailed;
    }
    *baseOut = memory;
    *strideOut = stride;
    return noErr;
}

}  // namespace

OSStatus CMSampleBufferGetAudioBufferListWithRetainedBlockBuffer(
    const CMSampleBufferRef& sbuf, size_t* bufferListSizeNeededOut, AudioBufferList* bufferListOut,
    size_t bufferListSize, CFAllocatorRef, CFAllocatorRef, uint32_t flags, CMBlockBufferRef* blockBufferOut) {
    if (bufferListSizeNeededOut) *bufferListSizeNeededOut = 0;
    if (blockBufferOut) *blockBufferOut = nullptr;
    if (!sbuf) return kCMSampleBufferError_RequiredParameterMissing;
    const AudioStreamBasicDescription* asbd =
        CMAudioFormatDescriptionGetStreamBasicDescription(sbuf->formatDescription());
    if (!asbd) return kCMSampleBufferError_InvalidMediaTypeForOperation;
    if (asbd->mFormatID != kAudioFormatLinearPCM) return kCMSampleBufferError_InvalidMediaFormat;

    const bool planar = asbd->mFormatFlags & kAudioFormatFlagIsNonInterleaved;
    const UInt32 buffers = planar ? asbd->mChannelsPerFrame : 1;
    const size_t needed = AudioBufferListByteSize(buffers);
    if (bufferListSizeNeededOut) *bufferListSizeNeededOut = needed;
    if (!bufferListOut)
        return bufferListSizeNeededOut ? noErr : kCMSampleBufferError_RequiredParameterMissing;
    // The pointers are only good while the block lives, so the caller must take it.
    if (!blockBufferOut) return kCMSampleBufferError_RequiredParameterMissing;
    if (bufferListSize < needed) return kCMSampleBufferError_ArrayTooSmall;
    if (!sbuf->dataIsReady()) return kCMSampleBufferError_BufferNotReady;
    const CMBlockBufferRef& data = sbuf->dataBuffer();
    if (!data) return kCMSampleBufferError_RequiredParameterMissing;

    // Each buffer's size must fit its 32-bit field, all of them the data.
    const uint64_t frames = uint64_t(std::max<CMItemCount>(sbuf->numSamples(), 0));
    if (frames > std::numeric_limits<UInt32>::max()) return kCMSampleBufferError_InvalidEntryCount;
    const uint64_t perBuffer = frames * asbd->mBytesPerFrame;
    if (perBuffer > std::numeric_limits<UInt32>::max() || perBuffer * buffers > data->dataLength())
        return kCMSampleBufferError_InvalidEntryCount;

    char* base = nullptr;
    OSStatus status = CMBlockBufferGetDataPointer(data, 0, nullptr, nullptr, &base);
    if (status != kCMBlockBufferNoErr) return status;
    CMBlockBufferRef backing = data;
    size_t stride = size_t(perBuffer);
    bool aligned = true;
    for (UInt32 i = 0; i < buffers; ++i)
        aligned = aligned && reinterpret_cast<uintptr_t>(base + i * stride) % kAlignment == 0;
    if ((flags & kCMSampleBufferFlag_AudioBufferList_Assure16ByteAlignment) && !aligned) {
        status = alignedCopy(base, size_t(perBuffer), buffers, &backing, &base, &stride);
        if (status != noErr) return status;
    }

    bufferListOut->mNumberBuffers = buffers;
    AudioBuffer* out = bufferListOut->mBuffers;
    for (UInt32 i = 0; i < buffers; ++i)
        out[i] = AudioBuffer{planar ? 1 : asbd->mChannelsPerFrame, UInt32(perBuffer), base + i * stride};
    *blockBufferOut = std::move(backing);
    return noErr;
}
