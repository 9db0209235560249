#include "SkarnBlockPool.h"

#include <cstdlib>

Ref<SkarnBlockPool> SkarnBlockPool::blockPool() {
    // Never freed: blocks may come back after every reader has gone.
    static SkarnBlockPool* pool = [] {
        auto* p = new SkarnBlockPool;
        p->retain();
        return p;
    }();
    return Ref<SkarnBlockPool>(pool);
}

SkarnBlockPool::SkarnBlockPool() {
    _source.AllocateBlock = &SkarnBlockPool::allocateBlock;
    _source.FreeBlock = &SkarnBlockPool::freeBlock;
    _source.refCon = this;
}

SkarnBlockPool::~SkarnBlockPool() {
    for (auto& [block, size] : _idle) std::free(block);
}

size_t SkarnBlockPool::blockLengthFor(size_t size) {
    if (size == 0 || size > SIZE_MAX - kSizeClass) return size;
    return (size + kSizeClass - 1) / kSizeClass * kSizeClass;
}

size_t SkarnBlockPool::idleBlockCount() const {
    std::lock_guard<std::mutex> lock(_lock);
    return _idle.size();
}

size_t SkarnBlockPool::idleBytes() const {
    std::lock_guard<std::mutex> lock(_lock);
    return _idleBytes;
}

void* SkarnBlockPool::allocateBlock(void* refCon, size_t size) {
    auto* pool = static_cast<SkarnBlockPool*>(refCon);
    void* block = nullptr;
    {
        std::lock_guard<std::mutex> lock(pool->_lock);
        for (auto it = pool->_idle.rbegin(); it != pool->_idle.rend(); ++it) {
            if (it->second == size) {
                block = it->first;
                pool->_idleBytes -= size;
                pool->_idle.erase(std::next(it).base());
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
    std::vector<void*> dropped;
    {
        std::lock_guard<std::mutex> lock(pool->_lock);
        pool->_idle.emplace_back(block, size);
        pool->_idleBytes += size;
        // Over the limit, the blocks returned longest ago go back to the system.
        while (pool->_idleBytes > kMaxIdleBytes && !pool->_idle.empty()) {
            dropped.push_back(pool->_idle.front().first);
            pool->_idleBytes -= pool->_idle.front().second;
            pool->_idle.erase(pool->_idle.begin());
        }
    }
    for (void* p : dropped) std::free(p);
    pool->release();
}
