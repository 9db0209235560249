// Block buffers: a reference-counted view (offset, length) into one memory block.
//
// The CoreMedia calls the plug-in makes on block buffers, with CoreMedia's names,
// flags and status codes. Only single-block buffers exist here; the memory is
// allocated on first use unless kCMBlockBufferAssureMemoryNowFlag asks for it at
// creation, as in CoreMedia, so a failing allocation surfaces from
// CMBlockBufferGetDataPointer.
#pragma once

#include "CFBase.h"
#include "Object.h"

#include <cstddef>
#include <cstdint>
#include <mutex>
#include <optional>

enum : OSStatus {
    kCMBlockBufferNoErr = 0,
    kCMBlockBufferStructureAllocationFailedErr = -12700,
    kCMBlockBufferBlockAllocationFailedErr = -12701,
    kCMBlockBufferBadCustomBlockSourceErr = -12702,
    kCMBlockBufferBadOffsetParameterErr = -12703,
    kCMBlockBufferBadLengthParameterErr = -12704,
    kCMBlockBufferBadPointerParameterErr = -12705,
    kCMBlockBufferEmptyBBufErr = -12706,
    kCMBlockBufferUnallocatedBlockErr = -12707,
    kCMBlockBufferInsufficientSpaceErr = -12708,
};

using CMBlockBufferFlags = uint32_t;
enum : CMBlockBufferFlags {
    kCMBlockBufferAssureMemoryNowFlag = 1u << 0,
    kCMBlockBufferAlwaysCopyDataFlag = 1u << 1,
    kCMBlockBufferDontOptimizeDepthFlag = 1u << 2,
    kCMBlockBufferPermitEmptyReferenceFlag = 1u << 3,
};

inline constexpr uint32_t kCMBlockBufferCustomBlockSourceVersion = 0;
struct CMBlockBufferCustomBlockSource {
    uint32_t version = kCMBlockBufferCustomBlockSourceVersion;
    void* (*AllocateBlock)(void* refCon, size_t sizeInBytes) = nullptr;
    void (*FreeBlock)(void* refCon, void* doomedMemoryBlock, size_t sizeInBytes) = nullptr;
    void* refCon = nullptr;
};

class CMBlockBuffer : public Object {
public:
    ~CMBlockBuffer() override;
    std::string description() const override;

    size_t dataLength() const { return _dataLength; }
    size_t offsetToData() const { return _offsetToData; }
    // The block's memory, allocating it on first use; nullptr when that fails.
    uint8_t* blockMemory();

private:
    CMBlockBuffer() = default;
    friend OSStatus CMBlockBufferCreateWithMemoryBlock(CFAllocatorRef, void*, size_t, CFAllocatorRef,
                                                       const CMBlockBufferCustomBlockSource*, size_t, size_t,
                                                       CMBlockBufferFlags, Ref<CMBlockBuffer>*);

    std::mutex _allocationLock;
    uint8_t* _block = nullptr;
    size_t _blockLength = 0;
    bool _freeBlock = false;  // whether this buffer disposes of the block
    CFAllocatorRef _blockAllocator = kCFAllocatorDefault;
    std::optional<CMBlockBufferCustomBlockSource> _source;
    size_t _offsetToData = 0;
    size_t _dataLength = 0;
};

// Retained handle, as CoreMedia hands out: the buffer lives while a ref holds it.
using CMBlockBufferRef = Ref<CMBlockBuffer>;

// memoryBlock nullptr: the buffer allocates blockLength bytes (through the custom
// block source when given, else malloc) on first use or at once with
// kCMBlockBufferAssureMemoryNowFlag. A supplied block is freed when the buffer
// goes unless blockAllocator is kCFAllocatorNull (a custom source's FreeBlock,
// when set, frees it instead).
OSStatus CMBlockBufferCreateWithMemoryBlock(CFAllocatorRef structureAllocator, void* memoryBlock,
                                            size_t blockLength, CFAllocatorRef blockAllocator,
                                            const CMBlockBufferCustomBlockSource* customBlockSource,
                                            size_t offsetToData, size_t dataLength, CMBlockBufferFlags flags,
                                            CMBlockBufferRef* blockBufferOut);

size_t CMBlockBufferGetDataLength(const CMBlockBufferRef& theBuffer);
// Every out pointer may be null. On failure the outputs are zeroed.
OSStatus CMBlockBufferGetDataPointer(const CMBlockBufferRef& theBuffer, size_t offset, size_t* lengthAtOffsetOut,
                                     size_t* totalLengthOut, char** dataPointerOut);
OSStatus CMBlockBufferCopyDataBytes(const CMBlockBufferRef& theSourceBuffer, size_t offsetToData, size_t dataLength,
                                    void* destination);
// dataLength 0 means "to the end of the data".
Boolean CMBlockBufferIsRangeContiguous(const CMBlockBufferRef& theBuffer, size_t offset, size_t dataLength);
