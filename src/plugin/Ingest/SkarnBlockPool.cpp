#include "SkarnBlockPool.h"

#include <cstdlib>

namespace {

// Enough for a host that holds a few frames and a block of every channel;
// anything beyond goes back to the system.
constexpr size_t kMaxIdleBlocks = 16;

}  // namespace

Ref<SkarnBlockPool> SkarnBlockPool::blockPool() { return Ref<SkarnBlockPool>(new SkarnBlockPool); }

SkarnBlockPool::SkarnBlockPool() {
    _source.AllocateBlock = &SkarnBlockPool::allocateBlock;
    _source.FreeBlock = &SkarnBlockPool::freeBlock;
    _source.refCon = this;
}

SkarnBlockPool::~SkarnBlockPool() {
    for (auto& [block, size] : _idle) std::free(block);
}

size_t SkarnBlockPool::idleBlockCount() const {
    std::lock_guard<std::mutex> lock(_lock);
    return _idle.size();
}

void* SkarnBlockPool::allocateBlock(void* refCon, size_t size) {
    auto* pool = static_cast<SkarnBlockPool*>(refCon);
    void* block = nullptr;
    {
        std::lock_guard<std::mutex> lock(pool->_lock);
        for (auto it = pool->_idle.begin(); it != pool->_idle.end(); ++it) {
            if (it->second == size) {
                block = it->first;
                pool->_idle.erase(it);
                break;
            }
        }
    }
    if (!block) block = std::malloc(size);
    if (block) pool->retain();
    return block;
}

void SkarnBlockPool::freeBlock(void* refCon, void* block, size_t size) {
    auto* pool = static_cast<SkarnBlockPool*>(refCon);
    {
        std::lock_guard<std::mutex> lock(pool->_lock);
        if (pool->_idle.size() < kMaxIdleBlocks) {
            pool->_idle.emplace_back(block, size);
            block = nullptr;
        }
    }
    std::free(block);
    pool->release();
}
