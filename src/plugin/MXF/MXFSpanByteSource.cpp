#include "MXFSpanByteSource.h"

#include <algorithm>
#include <cstring>
#include <limits>

Ref<MXFSpanByteSource> MXFSpanByteSource::initWithBytes(std::span<const uint8_t> bytes) {
    return Ref<MXFSpanByteSource>(new MXFSpanByteSource(bytes));
}

int64_t MXFSpanByteSource::read(uint64_t offset, void* data, size_t count) {
    // An offset no file can have fails as it does on a file.
    if (offset > uint64_t(std::numeric_limits<int64_t>::max())) return -1;
    if (offset >= _bytes.size()) return 0;
    const size_t n = std::min<uint64_t>(count, _bytes.size() - offset);
    if (n) std::memcpy(data, _bytes.data() + offset, n);
    return int64_t(n);
}
