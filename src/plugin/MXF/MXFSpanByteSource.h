// Bytes in memory as a byte source.
#pragma once

#include "MXFByteSource.h"

#include <span>

class MXFSpanByteSource : public MXFByteSource {
public:
    // The bytes are not copied: they must outlive the source.
    static Ref<MXFSpanByteSource> initWithBytes(std::span<const uint8_t> bytes);

    uint64_t size() const override { return _bytes.size(); }
    std::span<const uint8_t> bytes() const { return _bytes; }

protected:
    int64_t read(uint64_t offset, void* data, size_t count) override;

private:
    explicit MXFSpanByteSource(std::span<const uint8_t> bytes) : _bytes(bytes) {}

    std::span<const uint8_t> _bytes;
};
