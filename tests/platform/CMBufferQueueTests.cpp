#include "CMBufferQueue.h"
#include "CMSampleBuffer.h"

#include <gtest/gtest.h>

#include <thread>
#include <vector>

namespace {

// One video frame at frame index n of a 25 fps track, with n + 1 bytes.
CMSampleBufferRef frame(int64_t n, bool ready = true) {
    CMBlockBufferRef data;
    EXPECT_EQ(CMBlockBufferCreateWithMemoryBlock(nullptr, nullptr, size_t(n + 1), nullptr, nullptr, 0, size_t(n + 1),
                                                 kCMBlockBufferAssureMemoryNowFlag, &data),
              kCMBlockBufferNoErr);
    CMSampleTimingInfo timing{CMTimeMake(1, 25), CMTimeMake(n, 25), CMTimeMake(n, 25)};
    size_t size = size_t(n + 1);
    CMSampleBufferRef sbuf;
    EXPECT_EQ(CMSampleBufferCreate(nullptr, data, ready, nullptr, nullptr, nullptr, 1, 1, &timing, 1, &size, &sbuf),
              noErr);
    return sbuf;
}

CMBufferQueueRef sampleBufferQueue(CMItemCount capacity = 0) {
    CMBufferQueueRef queue;
    EXPECT_EQ(CMBufferQueueCreate(nullptr, capacity, CMBufferQueueGetCallbacksForUnsortedSampleBuffers(), &queue),
              noErr);
    return queue;
}

int64_t ptsOf(const CMBufferRef& buf) {
    return CMSampleBufferGetPresentationTimeStamp(dynamicRefCast<CMSampleBuffer>(buf)).value;
}

class Numbered : public Object {
public:
    explicit Numbered(int n, int tag = 0) : number(n), tag(tag) {}
    int number;
    int tag;
};

}  // namespace

TEST(CMBufferQueue, EndOfDataIsMarkedRefusesEnqueueAndIsReachedOnlyWhenDrained) {
    auto queue = sampleBufferQueue();
    EXPECT_TRUE(CMBufferQueueIsEmpty(queue));
    EXPECT_TRUE(CMTIME_IS_INVALID(CMBufferQueueGetMinPresentationTimeStamp(queue)));
    for (int64_t n : {2, 0, 1}) EXPECT_EQ(CMBufferQueueEnqueue(queue, frame(n)), noErr);
    EXPECT_EQ(CMBufferQueueGetBufferCount(queue), 3);
    EXPECT_EQ(ptsOf(CMBufferQueueCopyHead(queue)), 2);
    EXPECT_EQ(CMBufferQueueGetHead(queue), CMBufferQueueCopyHead(queue).get());
    EXPECT_EQ(CMTimeCompare(CMBufferQueueGetDuration(queue), CMTimeMake(3, 25)), 0);
    EXPECT_EQ(CMBufferQueueGetMinPresentationTimeStamp(queue).value, 0);
    EXPECT_EQ(CMBufferQueueGetMinDecodeTimeStamp(queue).value, 0);
    EXPECT_EQ(CMBufferQueueGetTotalSize(queue), 3u + 1 + 2);

    EXPECT_EQ(CMBufferQueueMarkEndOfData(queue), noErr);
    EXPECT_TRUE(CMBufferQueueContainsEndOfData(queue));
    EXPECT_FALSE(CMBufferQueueIsAtEndOfData(queue));
    EXPECT_EQ(CMBufferQueueEnqueue(queue, frame(3)), kCMBufferQueueError_EnqueueAfterEndOfData);
    // Unsorted: arrival order.
    for (int64_t n : {2, 0}) EXPECT_EQ(ptsOf(CMBufferQueueDequeueAndRetain(queue)), n);
    EXPECT_FALSE(CMBufferQueueIsAtEndOfData(queue));
    EXPECT_EQ(ptsOf(CMBufferQueueDequeueAndRetain(queue)), 1);
    EXPECT_TRUE(CMBufferQueueIsAtEndOfData(queue));
    EXPECT_FALSE(CMBufferQueueDequeueAndRetain(queue));
    EXPECT_EQ(CMTimeCompare(CMBufferQueueGetDuration(queue), kCMTimeZero), 0);

    EXPECT_EQ(CMBufferQueueEnqueue(queue, frame(4)), kCMBufferQueueError_EnqueueAfterEndOfData);
    EXPECT_EQ(CMBufferQueueReset(queue), noErr);
    EXPECT_FALSE(CMBufferQueueContainsEndOfData(queue));
    EXPECT_FALSE(CMBufferQueueIsAtEndOfData(queue));
    EXPECT_EQ(CMBufferQueueEnqueue(queue, frame(4)), noErr);
    // Reset also drops what is queued, end of data or not.
    EXPECT_EQ(CMBufferQueueReset(queue), noErr);
    EXPECT_TRUE(CMBufferQueueIsEmpty(queue));
}

TEST(CMBufferQueue, EnqueueRetainsAndDequeueHandsTheReferenceOver) {
    auto queue = sampleBufferQueue(2);
    auto first = frame(0);
    EXPECT_EQ(first->retainCount(), 1);
    EXPECT_EQ(CMBufferQueueEnqueue(queue, first), noErr);
    EXPECT_EQ(first->retainCount(), 2);
    EXPECT_EQ(CMBufferQueueEnqueue(queue, frame(1)), noErr);
    EXPECT_EQ(CMBufferQueueEnqueue(queue, frame(2)), kCMBufferQueueError_QueueIsFull);
    EXPECT_EQ(CMBufferQueueEnqueue(queue, nullptr), kCMBufferQueueError_RequiredParameterMissing);
    {
        CMBufferRef out = CMBufferQueueDequeueAndRetain(queue);
        EXPECT_EQ(out.get(), first.get());
        EXPECT_EQ(first->retainCount(), 2);
    }
    EXPECT_EQ(first->retainCount(), 1);
    EXPECT_EQ(CMBufferQueueEnqueue(queue, frame(2)), noErr);
    EXPECT_NE(queue->description().find("2 buffers, capacity 2"), std::string::npos) << queue->description();
}

TEST(CMBufferQueue, DequeueIfDataReadyWaitsForTheHead) {
    auto queue = sampleBufferQueue();
    auto pending = frame(0, false);
    ASSERT_EQ(CMBufferQueueEnqueue(queue, pending), noErr);
    ASSERT_EQ(CMBufferQueueEnqueue(queue, frame(1)), noErr);
    EXPECT_FALSE(CMBufferQueueDequeueIfDataReadyAndRetain(queue));
    EXPECT_EQ(CMBufferQueueGetBufferCount(queue), 2);
    CMSampleBufferSetDataReady(pending);
    EXPECT_EQ(CMBufferQueueDequeueIfDataReadyAndRetain(queue).get(), pending.get());
}

TEST(CMBufferQueue, CompareCallbackKeepsTheQueueSortedAndStable) {
    CMBufferCallbacks callbacks{};
    callbacks.compare = [](const CMBufferRef& a, const CMBufferRef& b, void*) -> CFComparisonResult {
        int x = static_cast<Numbered*>(a.get())->number, y = static_cast<Numbered*>(b.get())->number;
        return x < y ? kCFCompareLessThan : x > y ? kCFCompareGreaterThan : kCFCompareEqualTo;
    };
    CMBufferQueueRef queue;
    ASSERT_EQ(CMBufferQueueCreate(nullptr, 0, &callbacks, &queue), noErr);
    const int order[][2] = {{3, 0}, {1, 0}, {2, 0}, {1, 1}, {0, 0}};
    for (auto [n, tag] : order) ASSERT_EQ(CMBufferQueueEnqueue(queue, makeRef<Numbered>(n, tag)), noErr);
    std::vector<std::pair<int, int>> out;
    while (auto buf = CMBufferQueueDequeueAndRetain(queue)) {
        auto* numbered = static_cast<Numbered*>(buf.get());
        out.emplace_back(numbered->number, numbered->tag);
    }
    EXPECT_EQ(out, (std::vector<std::pair<int, int>>{{0, 0}, {1, 0}, {1, 1}, {2, 0}, {3, 0}}));
    // Without time callbacks the times are invalid; without a ready callback data is ready.
    ASSERT_EQ(CMBufferQueueEnqueue(queue, makeRef<Numbered>(0)), noErr);
    EXPECT_TRUE(CMTIME_IS_INVALID(CMBufferQueueGetDuration(queue)));
    EXPECT_TRUE(CMTIME_IS_INVALID(CMBufferQueueGetMinDecodeTimeStamp(queue)));
    EXPECT_EQ(CMBufferQueueGetTotalSize(queue), 0u);
    EXPECT_TRUE(CMBufferQueueDequeueIfDataReadyAndRetain(queue));
}

TEST(CMBufferQueue, CreationAndNullQueuesAreChecked) {
    CMBufferQueueRef queue;
    CMBufferCallbacks future{};
    future.version = 2;
    EXPECT_EQ(CMBufferQueueCreate(nullptr, 0, nullptr, &queue), kCMBufferQueueError_RequiredParameterMissing);
    EXPECT_EQ(CMBufferQueueCreate(nullptr, -1, CMBufferQueueGetCallbacksForUnsortedSampleBuffers(), &queue),
              kCMBufferQueueError_RequiredParameterMissing);
    EXPECT_EQ(CMBufferQueueCreate(nullptr, 0, &future, &queue), kCMBufferQueueError_InvalidCMBufferCallbacksStruct);
    EXPECT_EQ(CMBufferQueueCreate(nullptr, 0, &future, nullptr), kCMBufferQueueError_RequiredParameterMissing);
    EXPECT_FALSE(queue);

    EXPECT_EQ(CMBufferQueueEnqueue(nullptr, frame(0)), kCMBufferQueueError_RequiredParameterMissing);
    EXPECT_FALSE(CMBufferQueueDequeueAndRetain(nullptr));
    EXPECT_FALSE(CMBufferQueueDequeueIfDataReadyAndRetain(nullptr));
    EXPECT_EQ(CMBufferQueueGetHead(nullptr), nullptr);
    EXPECT_EQ(CMBufferQueueGetBufferCount(nullptr), 0);
    EXPECT_TRUE(CMBufferQueueIsEmpty(nullptr));
    EXPECT_EQ(CMBufferQueueMarkEndOfData(nullptr), kCMBufferQueueError_RequiredParameterMissing);
    EXPECT_FALSE(CMBufferQueueContainsEndOfData(nullptr));
    EXPECT_FALSE(CMBufferQueueIsAtEndOfData(nullptr));
    EXPECT_EQ(CMBufferQueueReset(nullptr), kCMBufferQueueError_RequiredParameterMissing);
    EXPECT_TRUE(CMTIME_IS_INVALID(CMBufferQueueGetDuration(nullptr)));
}

// A producer and a consumer as the ingest reader and the host's thread use one
// queue; run under the thread sanitizer as well. Nothing is lost, duplicated
// or reordered, and the end is seen only after the last buffer.
TEST(CMBufferQueue, ConcurrentEnqueueAndDequeueKeepEveryBufferInOrder) {
    constexpr int kCount = 3000;
    CMBufferCallbacks callbacks{};
    CMBufferQueueRef queue;
    ASSERT_EQ(CMBufferQueueCreate(nullptr, 0, &callbacks, &queue), noErr);
    std::thread producer([&] {
        for (int i = 0; i < kCount; ++i) {
            auto numbered = makeRef<Numbered>(i);
            EXPECT_EQ(CMBufferQueueEnqueue(queue, numbered), noErr);
        }
        CMBufferQueueMarkEndOfData(queue);
    });
    std::vector<int> received;
    received.reserve(kCount);
    while (!CMBufferQueueIsAtEndOfData(queue)) {
        if (auto buf = CMBufferQueueDequeueAndRetain(queue))
            received.push_back(static_cast<Numbered*>(buf.get())->number);
        else
            std::this_thread::yield();
    }
    producer.join();
    ASSERT_EQ(received.size(), size_t(kCount));
    for (int i = 0; i < kCount; ++i) ASSERT_EQ(received[i], i);
    EXPECT_FALSE(CMBufferQueueDequeueAndRetain(queue));
}
