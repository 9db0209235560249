#include "SkarnBufferManager.h"

Ref<SkarnBufferManager> SkarnBufferManager::bufferManager() {
    Ref<SkarnBufferManager> manager(new SkarnBufferManager);
    manager->reset();
    return manager;
}

SkarnBufferManager::~SkarnBufferManager() {
    std::lock_guard<std::mutex> a(_audioBuffers.pointerLock);
    _audioBuffers.list = nullptr;
    std::lock_guard<std::mutex> v(_videoBuffers.pointerLock);
    _videoBuffers.list = nullptr;
}

Ref<SkarnBufferManager::KeeperList> SkarnBufferManager::Slot::current() const {
    std::lock_guard<std::mutex> lock(pointerLock);
    return list;
}

void SkarnBufferManager::add(Slot& slot, Ref<Object> keeper) {
    Ref<KeeperList> list = slot.current();
    if (!list || !keeper) return;
    std::lock_guard<std::recursive_mutex> monitor(list->monitor);
    list->keepers.push_back(std::move(keeper));
}

void SkarnBufferManager::replace(Slot& slot) {
    Ref<KeeperList> old = slot.current();
    Ref<KeeperList> fresh(new KeeperList);
    if (!old) {
        std::lock_guard<std::mutex> lock(slot.pointerLock);
        slot.list = fresh;
        return;
    }
    std::vector<Ref<Object>> dropped;
    {
        std::lock_guard<std::recursive_mutex> monitor(old->monitor);
        {
            std::lock_guard<std::mutex> lock(slot.pointerLock);
            slot.list = fresh;
        }
        dropped.swap(old->keepers);
    }
    // The keepers (and the sample memory they hold) go here, outside every lock.
}

template <class Keeper>
void SkarnBufferManager::dispose(Slot& slot, uint8_t* media) {
    Ref<KeeperList> list = slot.current();
    if (!list) return;
    Ref<Object> removed;
    std::lock_guard<std::recursive_mutex> monitor(list->monitor);
    for (auto it = list->keepers.begin(); it != list->keepers.end(); ++it) {
        if (static_cast<Keeper*>(it->get())->dataPointer() == media) {
            removed = std::move(*it);
            list->keepers.erase(it);
            break;
        }
    }
}

size_t SkarnBufferManager::count(const Slot& slot) {
    Ref<KeeperList> list = slot.current();
    if (!list) return 0;
    std::lock_guard<std::recursive_mutex> monitor(list->monitor);
    return list->keepers.size();
}

void SkarnBufferManager::addVideoBuffer(const Ref<SkarnVideoBuffer>& buffer) { add(_videoBuffers, buffer); }
void SkarnBufferManager::addAudioBuffer(const Ref<SkarnAudioBuffer>& buffer) { add(_audioBuffers, buffer); }

void SkarnBufferManager::reset() {
    replace(_audioBuffers);
    replace(_videoBuffers);
}

void SkarnBufferManager::disposeVideoMedia(uint8_t* media, uint64_t, void*) {
    dispose<SkarnVideoBuffer>(_videoBuffers, media);
}

void SkarnBufferManager::disposeAudioMedia(uint8_t* media, uint64_t, void*) {
    dispose<SkarnAudioBuffer>(_audioBuffers, media);
}

size_t SkarnBufferManager::videoBufferCount() const { return count(_videoBuffers); }
size_t SkarnBufferManager::audioBufferCount() const { return count(_audioBuffers); }
