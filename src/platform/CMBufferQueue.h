// Buffer queues: a thread-safe queue of retained media buffers with an
// end-of-data mark, as the ingest readers keep their scheduled sample buffers.
//
// CoreMedia's names, callbacks and status codes. The queue holds Refs in a
// deque under one lock per queue; callbacks run under that lock and must not
// call back into the same queue. Triggers are not provided: nothing here
// watches queue levels.
#pragma once

#include "CFBase.h"
#include "CMTime.h"
#include "Object.h"

#include <deque>
#include <mutex>

enum : OSStatus {
    kCMBufferQueueError_AllocationFailed = -12760,
    kCMBufferQueueError_RequiredParameterMissing = -12761,
    kCMBufferQueueError_InvalidCMBufferCallbacksStruct = -12762,
    kCMBufferQueueError_EnqueueAfterEndOfData = -12763,
    kCMBufferQueueError_QueueIsFull = -12764,
    kCMBufferQueueError_InvalidBuffer = -12769,
};

using CMBufferRef = Ref<Object>;
using CMBufferGetTimeCallback = CMTime (*)(const CMBufferRef& buf, void* refcon);
using CMBufferGetBooleanCallback = Boolean (*)(const CMBufferRef& buf, void* refcon);
using CMBufferCompareCallback = CFComparisonResult (*)(const CMBufferRef& buf1, const CMBufferRef& buf2, void* refcon);
using CMBufferGetSizeCallback = size_t (*)(const CMBufferRef& buf, void* refcon);

// Version 0 or 1 (getSize is read from version 1 on). Any callback may be
// null: times are then invalid, data always ready, sizes 0, and the queue
// keeps arrival order (with compare, buffers are kept sorted, equal ones in
// arrival order). The notification name is accepted and never posted.
struct CMBufferCallbacks {
    uint32_t version;
    void* refcon;
    CMBufferGetTimeCallback getDecodeTimeStamp;
    CMBufferGetTimeCallback getPresentationTimeStamp;
    CMBufferGetTimeCallback getDuration;
    CMBufferGetBooleanCallback isDataReady;
    CMBufferCompareCallback compare;
    const char* dataBecameReadyNotification;
    CMBufferGetSizeCallback getSize;
};

class CMBufferQueue : public Object {
public:
    // Count, capacity and end-of-data state.
    std::string description() const override;

    OSStatus enqueue(const CMBufferRef& buf);
    // Null when empty (or, with onlyIfDataReady, when the head's data is not ready).
    CMBufferRef dequeue(bool onlyIfDataReady);
    CMBufferRef copyHead() const;
    // Not retained: valid only while the buffer stays queued or is held elsewhere.
    Object* head() const;
    CMItemCount bufferCount() const;
    void markEndOfData();
    bool containsEndOfData() const;
    bool isAtEndOfData() const;
    // Empties the queue and clears the end-of-data mark.
    void reset();

    CMTime duration() const;
    CMTime minDecodeTimeStamp() const;
    CMTime minPresentationTimeStamp() const;
    size_t totalSize() const;

private:
    CMBufferQueue(CMItemCount capacity, const CMBufferCallbacks& callbacks)
        : _capacity(capacity), _callbacks(callbacks) {}
    friend OSStatus CMBufferQueueCreate(CFAllocatorRef, CMItemCount, const CMBufferCallbacks*, Ref<CMBufferQueue>*);
    CMTime minimumTime(CMBufferGetTimeCallback get) const;

    mutable std::mutex _lock;
    std::deque<CMBufferRef> _buffers;
    CMItemCount _capacity;  // 0: unbounded
    CMBufferCallbacks _callbacks;
    bool _endOfData = false;
};

using CMBufferQueueRef = Ref<CMBufferQueue>;

// Callbacks for sample buffers kept in arrival order: the stamps, duration,
// readiness and total size of each sample buffer.
const CMBufferCallbacks* CMBufferQueueGetCallbacksForUnsortedSampleBuffers();

// capacity 0 means unbounded; a negative one is refused as a missing parameter.
OSStatus CMBufferQueueCreate(CFAllocatorRef allocator, CMItemCount capacity, const CMBufferCallbacks* callbacks,
                             CMBufferQueueRef* queueOut);
// Retains buf. Refused after the end of data is marked, and when a bounded
// queue is full.
OSStatus CMBufferQueueEnqueue(const CMBufferQueueRef& queue, const CMBufferRef& buf);
CMBufferRef CMBufferQueueDequeueAndRetain(const CMBufferQueueRef& queue);
CMBufferRef CMBufferQueueDequeueIfDataReadyAndRetain(const CMBufferQueueRef& queue);
Object* CMBufferQueueGetHead(const CMBufferQueueRef& queue);
CMBufferRef CMBufferQueueCopyHead(const CMBufferQueueRef& queue);
CMItemCount CMBufferQueueGetBufferCount(const CMBufferQueueRef& queue);
// True for a null queue.
Boolean CMBufferQueueIsEmpty(const CMBufferQueueRef& queue);
OSStatus CMBufferQueueMarkEndOfData(const CMBufferQueueRef& queue);
// Marked, whether or not buffers remain.
Boolean CMBufferQueueContainsEndOfData(const CMBufferQueueRef& queue);
// Marked and drained.
Boolean CMBufferQueueIsAtEndOfData(const CMBufferQueueRef& queue);
OSStatus CMBufferQueueReset(const CMBufferQueueRef& queue);
// The sum of the durations (zero when empty); invalid without a duration callback.
CMTime CMBufferQueueGetDuration(const CMBufferQueueRef& queue);
// The least stamp of the queued buffers; invalid when empty or without the callback.
CMTime CMBufferQueueGetMinDecodeTimeStamp(const CMBufferQueueRef& queue);
CMTime CMBufferQueueGetMinPresentationTimeStamp(const CMBufferQueueRef& queue);
size_t CMBufferQueueGetTotalSize(const CMBufferQueueRef& queue);
