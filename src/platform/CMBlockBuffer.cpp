#include "CMBlockBuffer.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>

CMBlockBuffer::~CMBlockBuffer() {
    if (!_block || !_freeBlock) return;
    if (_source && _source->FreeBlock)
        _source->FreeBlock(_source->refCon, _block, _blockLength);
    else if (!_source)
        std::free(_block);
}

std::string CMBlockBuffer::description() const {
    char buf[160];
    std::snprintf(buf, sizeof buf, "<CMBlockBuffer %p>{offset %zu, length %zu, block %zu bytes%s}",
                  static_cast<const void*>(this), _offsetToData, _dataLength, _blockLength,
                  _block ? "" : ", unallocated");
    return buf;
}

uint8_t* CMBlockBuffer::blockMemory() {
    std::lock_guard<std::mutex> lock(_allocationLock);
    if (!_block) {
        void* p = _source ? _source->AllocateBlock(_source->refCon, _blockLength) : std::malloc(_blockLength);
        _block = static_cast<uint8_t*>(p);
        _freeBlock = _block != nullptr;
    }
    return _block;
}

OSStatus CMBlockBufferCreateWithMemoryBlock(CFAllocatorRef, void* memoryBlock, size_t blockLength,
                                            CFAllocatorRef blockAllocator,
                                            const CMBlockBufferCustomBlockSource* customBlockSource,
                                            size_t offsetToData, size_t dataLength, CMBlockBufferFlags flags,
                                            CMBlockBufferRef* blockBufferOut) {
    if (!blockBufferOut) return kCMBlockBufferBadPointerParameterErr;
    *blockBufferOut = nullptr;
    if (blockLength == 0) return kCMBlockBufferBadLengthParameterErr;
    if (offsetToData > blockLength) return kCMBlockBufferBadOffsetParameterErr;
    if (dataLength == 0 || dataLength > blockLength - offsetToData) return kCMBlockBufferBadLengthParameterErr;
    if (customBlockSource) {
        if (customBlockSource->version != kCMBlockBufferCustomBlockSourceVersion)
            return kCMBlockBufferBadCustomBlockSourceErr;
        if (!memoryBlock && !customBlockSource->AllocateBlock) return kCMBlockBufferBadCustomBlockSourceErr;
    }

    CMBlockBufferRef buffer(new (std::nothrow) CMBlockBuffer());
    if (!buffer) return kCMBlockBufferStructureAllocationFailedErr;
    buffer->_blockLength = blockLength;
    buffer->_blockAllocator = blockAllocator;
    if (customBlockSource) buffer->_source = *customBlockSource;
    buffer->_offsetToData = offsetToData;
    buffer->_dataLength = dataLength;
    if (memoryBlock) {
        buffer->_block = static_cast<uint8_t*>(memoryBlock);
        buffer->_freeBlock = customBlockSource ? customBlockSource->FreeBlock != nullptr
                                               : blockAllocator != kCFAllocatorNull;
    } else if ((flags & kCMBlockBufferAssureMemoryNowFlag) && !buffer->blockMemory()) {
        return kCMBlockBufferBlockAllocationFailedErr;
    }
    *blockBufferOut = std::move(buffer);
    return kCMBlockBufferNoErr;
}

size_t CMBlockBufferGetDataLength(const CMBlockBufferRef& theBuffer) {
    return theBuffer ? theBuffer->dataLength() : 0;
}

OSStatus CMBlockBufferGetDataPointer(const CMBlockBufferRef& theBuffer, size_t offset, size_t* lengthAtOffsetOut,
                                     size_t* totalLengthOut, char** dataPointerOut) {
    auto fail = [&](OSStatus status) {
        if (lengthAtOffsetOut) *lengthAtOffsetOut = 0;
        if (totalLengthOut) *totalLengthOut = 0;
        if (dataPointerOut) *dataPointerOut = nullptr;
        return status;
    };
    if (!theBuffer) return fail(kCMBlockBufferBadPointerParameterErr);
    if (offset >= theBuffer->dataLength()) return fail(kCMBlockBufferBadOffsetParameterErr);
    uint8_t* block = theBuffer->blockMemory();
    if (!block) return fail(kCMBlockBufferBlockAllocationFailedErr);
    if (lengthAtOffsetOut) *lengthAtOffsetOut = theBuffer->dataLength() - offset;
    if (totalLengthOut) *totalLengthOut = theBuffer->dataLength();
    if (dataPointerOut) *dataPointerOut = reinterpret_cast<char*>(block + theBuffer->offsetToData() + offset);
    return kCMBlockBufferNoErr;
}

OSStatus CMBlockBufferCopyDataBytes(const CMBlockBufferRef& theSourceBuffer, size_t offsetToData, size_t dataLength,
                                    void* destination) {
    if (!theSourceBuffer || !destination) return kCMBlockBufferBadPointerParameterErr;
    size_t total = theSourceBuffer->dataLength();
    if (offsetToData > total) return kCMBlockBufferBadOffsetParameterErr;
    if (dataLength > total - offsetToData) return kCMBlockBufferBadLengthParameterErr;
    if (dataLength == 0) return kCMBlockBufferNoErr;
    char* data = nullptr;
    OSStatus status = CMBlockBufferGetDataPointer(theSourceBuffer, offsetToData, nullptr, nullptr, &data);
    if (status != kCMBlockBufferNoErr) return status;
    std::memcpy(destination, data, dataLength);
    return kCMBlockBufferNoErr;
}

Boolean CMBlockBufferIsRangeContiguous(const CMBlockBufferRef& theBuffer, size_t offset, size_t dataLength) {
    if (!theBuffer) return false;
    size_t total = theBuffer->dataLength();
    if (offset >= total) return false;
    // One memory block: any range inside the data is contiguous.
    return dataLength <= total - offset;
}
