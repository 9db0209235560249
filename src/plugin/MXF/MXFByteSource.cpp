#include "MXFByteSource.h"

int64_t MXFByteSource::readAt(uint64_t offset, void* data, size_t count) {
    _readCalls.fetch_add(1, std::memory_order_relaxed);
    const int64_t n = read(offset, data, count);
    if (n > 0) _readBytes.fetch_add(uint64_t(n), std::memory_order_relaxed);
    return n;
}
