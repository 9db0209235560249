#include "MXFCachedByteSource.h"

#include "MXFAssert.h"

#include <algorithm>
#include <cstring>
#include <limits>

Ref<MXFCachedByteSource> MXFCachedByteSource::initWithSource(Ref<MXFByteSource> source) {
    if (!source) return nullptr;
    return Ref<MXFCachedByteSource>(new MXFCachedByteSource(std::move(source)));
}

int64_t MXFCachedByteSource::loadBlock(uint64_t head) {
    _fileHeadPosition = head;
    _fileTailPosition = 0;
    const int64_t n = _source->readAt(head, _readbuffer, kBlockSize);
    if (n < 0) return n;
    // Past the end of the source the cache holds zeros rather than the previous block.
    if (uint64_t(n) < kBlockSize) std::memset(_readbuffer + n, 0, kBlockSize - uint64_t(n));
    _fileTailPosition = head + std::min<uint64_t>(uint64_t(n), kBlockSize);
    return n;
}

int64_t MXFCachedByteSource::read(uint64_t offset, void* data, size_t count) {
    if (count == 0) return 0;
    auto* out = static_cast<uint8_t*>(data);
    const uint64_t wanted = count;
    if (wanted > kBlockSize) return _source->readAt(offset, out, count);
    // An offset no file can have fails like the read there would.
    MXF_ASSERT(offset <= uint64_t(std::numeric_limits<int64_t>::max()) - 2 * kBlockSize, "readBytes != -1");

    if (_fileHeadPosition > offset) _fileTailPosition = 0;
    const uint64_t end = offset + wanted;
    if (_fileTailPosition != 0 && end <= _fileTailPosition) {
        std::memcpy(out, _readbuffer + (offset - _fileHeadPosition), wanted);
        return int64_t(count);
    }
    uint64_t copied = 0;
    if (_fileTailPosition > offset) {
        copied = _fileTailPosition - offset;
        std::memcpy(out, _readbuffer + (offset - _fileHeadPosition), copied);
    }
    const uint64_t position = offset + copied;
    const uint64_t head = position & ~(kBlockSize - 1);
    int64_t readBytes = loadBlock(head);
    MXF_ASSERT(readBytes != -1, "readBytes != -1");
    if (end <= head + kBlockSize) {
        std::memcpy(out + copied, _readbuffer + (position - head), wanted - copied);
        return int64_t(count);
    }
    const uint64_t firstPart = head + kBlockSize - position;
    std::memcpy(out + copied, _readbuffer + (position - head), firstPart);
    copied += firstPart;
    readBytes = loadBlock(head + kBlockSize);
    MXF_ASSERT(readBytes >= int64_t(wanted - copied), "readBytes >= (bytesWanted - keyStartIndex)");
    std::memcpy(out + copied, _readbuffer, wanted - copied);
    return int64_t(count);
}
