#include "SkarnBufferManager.h"

#include "CFData.h"
#include "CMBlockBuffer.h"
#include "CMSampleBuffer.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cstdlib>
#include <thread>
#include <vector>

namespace {

// A one-sample buffer over its own 64 bytes of memory.
CMSampleBufferRef sampleBuffer() {
    CMBlockBufferRef block;
    EXPECT_EQ(CMBlockBufferCreateWithMemoryBlock(kCFAllocatorDefault, nullptr, 64, kCFAllocatorDefault, nullptr, 0, 64,
                                                 kCMBlockBufferAssureMemoryNowFlag, &block),
              0);
    CMSampleBufferRef buffer;
    size_t size = 64;
    EXPECT_EQ(CMSampleBufferCreateReady(kCFAllocatorDefault, block, nullptr, 1, 0, nullptr, 1, &size, &buffer), 0);
    return buffer;
}

// A video keeper of a new sample buffer, with a marker object whose release
// tells when the keeper went.
Ref<SkarnVideoBuffer> videoKeeper(const CMSampleBufferRef& buffer, const Ref<Object>& marker = nullptr) {
    Ref<SkarnVideoBuffer> keeper = SkarnVideoBuffer::init();
    keeper->setVideoSampleBuffer(buffer);
    if (marker) keeper->addObjectToRelease(marker);
    return keeper;
}

// An audio keeper owning a one-buffer list over the sample buffer's memory.
Ref<SkarnAudioBuffer> audioKeeper(const CMSampleBufferRef& buffer) {
    auto* list = static_cast<AudioBufferList*>(std::calloc(1, sizeof(AudioBufferList)));
    list->mNumberBuffers = 1;
    char* data = nullptr;
    CMBlockBufferGetDataPointer(CMSampleBufferGetDataBuffer(buffer), 0, nullptr, nullptr, &data);
    list->mBuffers[0].mData = data;
    list->mBuffers[0].mDataByteSize = 64;
    Ref<SkarnAudioBuffer> keeper = SkarnAudioBuffer::init();
    keeper->setAudioSampleBuffer(buffer);
    keeper->setAudioBufferListBlockBuffer(CMSampleBufferGetDataBuffer(buffer));
    keeper->setAudioBufferList(list);
    return keeper;
}

TEST(SkarnBufferManager, DisposingFindsTheKeeperByItsDataPointerOnce) {
    Ref<SkarnBufferManager> manager = SkarnBufferManager::bufferManager();
    CMSampleBufferRef a = sampleBuffer(), b = sampleBuffer();
    Ref<SkarnVideoBuffer> ka = videoKeeper(a), kb = videoKeeper(b);
    uint8_t* pa = ka->dataPointer();
    ASSERT_NE(pa, nullptr);
    manager->addVideoBuffer(ka);
    manager->addVideoBuffer(kb);
    ka = kb = nullptr;
    int32_t held = a->retainCount();

    manager->disposeVideoMedia(pa, 64, nullptr);
    EXPECT_EQ(manager->videoBufferCount(), 1u);
    EXPECT_EQ(a->retainCount(), held - 1);  // the keeper let go of the sample buffer
    // A second time, and a pointer nobody handed out: nothing happens.
    manager->disposeVideoMedia(pa, 64, nullptr);
    uint8_t stranger[4];
    manager->disposeVideoMedia(stranger, 4, nullptr);
    manager->disposeVideoMedia(nullptr, 0, nullptr);
    EXPECT_EQ(manager->videoBufferCount(), 1u);
    // The audio list is a different list.
    char* pb = nullptr;
    CMBlockBufferGetDataPointer(CMSampleBufferGetDataBuffer(b), 0, nullptr, nullptr, &pb);
    manager->disposeAudioMedia(reinterpret_cast<uint8_t*>(pb), 64, nullptr);
    EXPECT_EQ(manager->videoBufferCount(), 1u);
}

TEST(SkarnBufferManager, TwoKeepersOfOnePointerGoOnePerDisposalEarliestFirst) {
    Ref<SkarnBufferManager> manager = SkarnBufferManager::bufferManager();
    CMSampleBufferRef shared = sampleBuffer();
    Ref<Object> first(new Object), second(new Object);
    manager->addVideoBuffer(videoKeeper(shared, first));
    manager->addVideoBuffer(videoKeeper(shared, second));
    uint8_t* p = videoKeeper(shared)->dataPointer();

    manager->disposeVideoMedia(p, 64, nullptr);
    EXPECT_EQ(first->retainCount(), 1);   // only the test holds it now
    EXPECT_EQ(second->retainCount(), 2);  // still kept
    manager->disposeVideoMedia(p, 64, nullptr);
    EXPECT_EQ(second->retainCount(), 1);
    EXPECT_EQ(manager->videoBufferCount(), 0u);
}

TEST(SkarnBufferManager, ResetReleasesEverythingAndForgetsOldPointers) {
    Ref<SkarnBufferManager> manager = SkarnBufferManager::bufferManager();
    CMSampleBufferRef v = sampleBuffer(), a = sampleBuffer();
    int32_t vBefore = v->retainCount(), aBefore = a->retainCount();
    Ref<SkarnVideoBuffer> vk = videoKeeper(v);
    Ref<SkarnAudioBuffer> ak = audioKeeper(a);
    uint8_t* vp = vk->dataPointer();
    uint8_t* ap = ak->dataPointer();
    ASSERT_NE(ap, nullptr);
    manager->addVideoBuffer(vk);
    manager->addAudioBuffer(ak);
    vk = nullptr;
    ak = nullptr;

    manager->reset();
    EXPECT_EQ(v->retainCount(), vBefore);
    EXPECT_EQ(a->retainCount(), aBefore);
    EXPECT_EQ(manager->videoBufferCount(), 0u);
    EXPECT_EQ(manager->audioBufferCount(), 0u);
    manager->disposeVideoMedia(vp, 64, nullptr);
    manager->disposeAudioMedia(ap, 64, nullptr);
    // Still usable after the reset.
    manager->addAudioBuffer(audioKeeper(a));
    manager->disposeAudioMedia(ap, 64, nullptr);
    EXPECT_EQ(manager->audioBufferCount(), 0u);
}

TEST(SkarnBufferManager, AudioKeeperHoldsTheSharedDeliveryObjectsUntilItGoes) {
    Ref<SkarnBufferManager> manager = SkarnBufferManager::bufferManager();
    CMSampleBufferRef a = sampleBuffer();
    CFDataRef shared = CFDataCreate(kCFAllocatorDefault, reinterpret_cast<const UInt8*>("abcd"), 4);
    Ref<SkarnAudioBuffer> keeper = audioKeeper(a);
    keeper->setMasterAudioBufferList(shared);
    keeper->setMasterAudioStreamBasicDescription(shared);
    keeper->setMasterAudioChannelLayout(shared);
    keeper->setMasterAudioChannelLayout(shared);  // the same object again: held once per slot
    uint8_t* p = keeper->dataPointer();
    manager->addAudioBuffer(keeper);
    keeper = nullptr;
    EXPECT_EQ(shared->retainCount(), 4);
    manager->disposeAudioMedia(p, 64, nullptr);
    EXPECT_EQ(shared->retainCount(), 1);
}

// The host gives memory back on its own threads while the ingest thread adds.
TEST(SkarnBufferManager, DisposalsFromOtherThreadsWhileAdding) {
    constexpr int kPerThread = 300, kThreads = 3;
    Ref<SkarnBufferManager> manager = SkarnBufferManager::bufferManager();
    std::vector<CMSampleBufferRef> buffers;
    for (int i = 0; i < kPerThread * kThreads; ++i) buffers.push_back(sampleBuffer());
    std::vector<uint8_t*> videoPointers, audioPointers;
    std::vector<Ref<SkarnVideoBuffer>> videoKeepers;
    std::vector<Ref<SkarnAudioBuffer>> audioKeepers;
    for (const auto& b : buffers) {
        videoKeepers.push_back(videoKeeper(b));
        audioKeepers.push_back(audioKeeper(b));
        videoPointers.push_back(videoKeepers.back()->dataPointer());
        audioPointers.push_back(audioKeepers.back()->dataPointer());
    }
    std::atomic<int> added{0};
    std::vector<std::thread> hosts;
    for (int t = 0; t < kThreads; ++t) {
        hosts.emplace_back([&, t] {
            for (int i = t; i < kPerThread * kThreads; i += kThreads) {
                // Give back only what was handed out.
                while (added.load(std::memory_order_acquire) <= i) std::this_thread::yield();
                manager->disposeVideoMedia(videoPointers[size_t(i)], 64, nullptr);
                manager->disposeAudioMedia(audioPointers[size_t(i)], 64, nullptr);
            }
        });
    }
    for (size_t i = 0; i < buffers.size(); ++i) {
        manager->addVideoBuffer(videoKeepers[i]);
        manager->addAudioBuffer(audioKeepers[i]);
        videoKeepers[i] = nullptr;
        audioKeepers[i] = nullptr;
        added.store(int(i) + 1, std::memory_order_release);
    }
    for (auto& t : hosts) t.join();
    EXPECT_EQ(manager->videoBufferCount(), 0u);
    EXPECT_EQ(manager->audioBufferCount(), 0u);
    for (const auto& b : buffers) EXPECT_EQ(b->retainCount(), 1);
}

TEST(SkarnBufferManager, ResetWhileOtherThreadsDispose) {
    Ref<SkarnBufferManager> manager = SkarnBufferManager::bufferManager();
    std::vector<CMSampleBufferRef> buffers;
    for (int i = 0; i < 200; ++i) buffers.push_back(sampleBuffer());
    std::vector<uint8_t*> pointers;
    for (const auto& b : buffers) {
        Ref<SkarnVideoBuffer> k = videoKeeper(b);
        pointers.push_back(k->dataPointer());
        manager->addVideoBuffer(k);
    }
    std::thread host([&] {
        for (uint8_t* p : pointers) manager->disposeVideoMedia(p, 64, nullptr);
    });
    manager->reset();
    manager->addVideoBuffer(videoKeeper(buffers.front()));
    host.join();
    // Whatever order it ran in, nothing is held twice or lost: the one keeper
    // added after the reset is there or was disposed by the host.
    EXPECT_LE(manager->videoBufferCount(), 1u);
    manager->reset();
    for (const auto& b : buffers) EXPECT_EQ(b->retainCount(), 1);
}

}  // namespace
