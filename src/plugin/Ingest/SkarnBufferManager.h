// Holds every keeper of memory handed to the host until the host gives the
// pointer back, one list for video and one for audio. The host returns
// memory from any thread while the ingest thread adds new keepers: each list
// has its own recursive monitor, no operation holds both, and a reset swaps
// in a new list under the old one's monitor, so a walk already under way
// finishes on the old list.
#pragma once

#include "Object.h"
#include "SkarnAudioBuffer.h"
#include "SkarnVideoBuffer.h"
#include "VestaKilnProtocols.h"

#include <cstdint>
#include <mutex>
#include <vector>

class SkarnBufferManager : public Object, public VestaKilnVideoBufferManager, public VestaKilnAudioBufferManager {
public:
    static Ref<SkarnBufferManager> bufferManager();
    ~SkarnBufferManager() override;

    void addVideoBuffer(const Ref<SkarnVideoBuffer>& buffer);
    void addAudioBuffer(const Ref<SkarnAudioBuffer>& buffer);
    // Drops both lists, and with them every buffer the host still holds.
    void reset();
    // Removes (and so releases) the first keeper whose data pointer is media;
    // size and refCon2 are not needed to find it. An unknown pointer is ignored.
    void disposeVideoMedia(uint8_t* media, uint64_t size, void* videoMediaDisposeRefCon2) override;
    void disposeAudioMedia(uint8_t* media, uint64_t size, void* audioMediaDisposeRefCon2) override;

    size_t videoBufferCount() const;
    size_t audioBufferCount() const;

private:
    SkarnBufferManager() = default;

    // A list object and its monitor, as the platform's @synchronized gives
    // every object one.
    struct KeeperList : Object {
        std::recursive_mutex monitor;
        std::vector<Ref<Object>> keepers;
    };
    struct Slot {
        mutable std::mutex pointerLock;  // guards only the swap of the list pointer
        Ref<KeeperList> list;
        Ref<KeeperList> current() const;
    };

    static void add(Slot& slot, Ref<Object> keeper);
    static void replace(Slot& slot);
    template <class Keeper>
    static void dispose(Slot& slot, uint8_t* media);
    static size_t count(const Slot& slot);

    Slot _audioBuffers;
    Slot _videoBuffers;
};
