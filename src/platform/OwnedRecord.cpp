#include "OwnedRecord.h"

#include <cstdlib>
#include <cstring>
#include <utility>

OwnedRecord::OwnedRecord(OwnedRecord&& o) noexcept
    : _p(std::exchange(o._p, nullptr)), _size(std::exchange(o._size, 0)) {}

OwnedRecord& OwnedRecord::operator=(OwnedRecord&& o) noexcept {
    if (this != &o) {
        disposePtr();
        _p = std::exchange(o._p, nullptr);
        _size = std::exchange(o._size, 0);
    }
    return *this;
}

OwnedRecord OwnedRecord::newPtrClear(size_t size) {
    OwnedRecord r;
    if (size == 0) return r;
    r._p = static_cast<uint8_t*>(std::calloc(1, size));
    if (r._p) r._size = size;
    return r;
}

bool OwnedRecord::setPtrSize(size_t size) {
    if (size == 0) {
        disposePtr();
        return true;
    }
    auto* p = static_cast<uint8_t*>(std::realloc(_p, size));
    if (!p) return false;
    if (size > _size) std::memset(p + _size, 0, size - _size);
    _p = p;
    _size = size;
    return true;
}

void OwnedRecord::disposePtr() {
    std::free(_p);
    _p = nullptr;
    _size = 0;
}
