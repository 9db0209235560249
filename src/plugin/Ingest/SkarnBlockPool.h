// Sample memory that goes back into use. Every delivered frame or audio chunk
// needs a block of its own, and a host that copies out gives it back at
// once: taking the same (cache-warm, already mapped) blocks again spares the
// page faults of fresh memory on every frame. One pool serves the whole
// process, so the clips of a card ingested one after another reuse the same
// memory too. Blocks are handed out in size classes (whole 64 KiB units), the
// most recently returned first, and at most kMaxIdleBytes wait idle. Blocks
// come and go through a block buffer's custom block source; each block out
// holds the pool.
#pragma once

#include "CMBlockBuffer.h"
#include "Object.h"

#include <cstddef>
#include <mutex>
#include <utility>
#include <vector>

class SkarnBlockPool : public Object {
public:
    static constexpr size_t kSizeClass = 64 * 1024;
    static constexpr size_t kMaxIdleBytes = 16u << 20;

    // The process's pool.
    static Ref<SkarnBlockPool> blockPool();
    ~SkarnBlockPool() override;

    // The source to create block buffers with; valid while the pool lives.
    const CMBlockBufferCustomBlockSource* blockSource() const { return &_source; }
    // The block length to ask for when size bytes are needed.
    static size_t blockLengthFor(size_t size);
    size_t idleBlockCount() const;
    size_t idleBytes() const;

private:
    SkarnBlockPool();
    static void* allocateBlock(void* refCon, size_t size);
    static void freeBlock(void* refCon, void* block, size_t size);

    CMBlockBufferCustomBlockSource _source;
    mutable std::mutex _lock;
    std::vector<std::pair<void*, size_t>> _idle;  // blocks given back, oldest first
    size_t _idleBytes = 0;
};
