// Small reads of another source served from one cached block of 4096 bytes,
// aligned to 4096. A header walk reads 24 bytes at a time, so consecutive
// small reads cost one read of the source per block.
//
// Up to a block, a read delivers every byte asked for: bytes past the end of
// the source read as zeros. A failed read of the source, or a second block that
// comes up short of a read spanning two, is a hard assertion. Reads of more
// than a block go straight to the source and leave the cache as it was.
#pragma once

#include "MXFByteSource.h"

class MXFCachedByteSource : public MXFByteSource {
public:
    static constexpr uint64_t kBlockSize = 4096;

    // Starts empty; nil for a nil source.
    static Ref<MXFCachedByteSource> initWithSource(Ref<MXFByteSource> source);

    uint64_t size() const override { return _source->size(); }

protected:
    int64_t read(uint64_t offset, void* data, size_t count) override;

private:
    explicit MXFCachedByteSource(Ref<MXFByteSource> source) : _source(std::move(source)) {}
    // Loads the block at `head`; answers what the source's read answered.
    int64_t loadBlock(uint64_t head);

    Ref<MXFByteSource> _source;
    uint8_t _readbuffer[kBlockSize] = {};
    uint64_t _fileHeadPosition = 0;
    // Just past the valid cached bytes; 0 when the cache is empty.
    uint64_t _fileTailPosition = 0;
};
