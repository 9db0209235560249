// Sample memory that goes back into use. Every delivered frame or audio chunk
// needs a block of its own, and a host that copies out gives it back at
// once: taking the same (cache-warm, already mapped) blocks again spares the
// page faults of fresh memory on every frame. Blocks come and go through a
// block buffer's custom block source; each block out holds the pool, so a
// host may give memory back after the reader that made it has gone.
#pragma once

#include "CMBlockBuffer.h"
#include "Object.h"

#include <cstddef>
#include <mutex>
#include <utility>
#include <vector>

class SkarnBlockPool : public Object {
public:
    static Ref<SkarnBlockPool> blockPool();
    ~SkarnBlockPool() override;

    // The source to create block buffers with; valid while the pool lives.
    const CMBlockBufferCustomBlockSource* blockSource() const { return &_source; }
    size_t idleBlockCount() const;

private:
    SkarnBlockPool();
    static void* allocateBlock(void* refCon, size_t size);
    static void freeBlock(void* refCon, void* block, size_t size);

    CMBlockBufferCustomBlockSource _source;
    mutable std::mutex _lock;
    std::vector<std::pair<void*, size_t>> _idle;  // blocks given back, by size
};
