#include "CMBufferQueue.h"

#include "CMSampleBuffer.h"

#include <algorithm>
#include <cstdio>
#include <new>

namespace {

CMSampleBufferRef sampleBuffer(const CMBufferRef& buf) { return dynamicRefCast<CMSampleBuffer>(buf); }

const CMBufferCallbacks kUnsortedSampleBufferCallbacks{
    1,
    nullptr,
    [](const CMBufferRef& buf, void*) { return CMSampleBufferGetDecodeTimeStamp(sampleBuffer(buf)); },
    [](const CMBufferRef& buf, void*) { return CMSampleBufferGetPresentationTimeStamp(sampleBuffer(buf)); },
    [](const CMBufferRef& buf, void*) { return CMSampleBufferGetDuration(sampleBuffer(buf)); },
    [](const CMBufferRef& buf, void*) -> Boolean { return CMSampleBufferDataIsReady(sampleBuffer(buf)); },
    nullptr,
    nullptr,
    [](const CMBufferRef& buf, void*) { return CMSampleBufferGetTotalSampleSize(sampleBuffer(buf)); },
};

}  // namespace

std::string CMBufferQueue::description() const {
    std::lock_guard<std::mutex> lock(_lock);
    char buf[160];
    std::snprintf(buf, sizeof buf, "<CMBufferQueue %p>{%zu buffers, capacity %ld%s}", static_cast<const void*>(this),
                  _buffers.size(), _capacity, _endOfData ? ", end of data" : "");
    return buf;
}

OSStatus CMBufferQueue::enqueue(const CMBufferRef& buf) {
    if (!buf) return kCMBufferQueueError_RequiredParameterMissing;
    std::lock_guard<std::mutex> lock(_lock);
    if (_endOfData) return kCMBufferQueueError_EnqueueAfterEndOfData;
    if (_capacity > 0 && CMItemCount(_buffers.size()) >= _capacity) return kCMBufferQueueError_QueueIsFull;
    try {
        if (_callbacks.compare && !_buffers.empty()) {
            auto at = std::upper_bound(_buffers.begin(), _buffers.end(), buf, [&](const CMBufferRef& a, const CMBufferRef& b) {
                return _callbacks.compare(a, b, _callbacks.refcon) == kCFCompareLessThan;
            });
            _buffers.insert(at, buf);
        } else {
            _buffers.push_back(buf);
        }
    } catch (const std::bad_alloc&) {
        return kCMBufferQueueError_AllocationFailed;
    }
    return noErr;
}

CMBufferRef CMBufferQueue::dequeue(bool onlyIfDataReady) {
    std::lock_guard<std::mutex> lock(_lock);
    if (_buffers.empty()) return nullptr;
    if (onlyIfDataReady && _callbacks.isDataReady && !_callbacks.isDataReady(_buffers.front(), _callbacks.refcon))
        return nullptr;
    CMBufferRef front = std::move(_buffers.front());
    _buffers.pop_front();
    return front;
}

CMBufferRef CMBufferQueue::copyHead() const {
    std::lock_guard<std::mutex> lock(_lock);
    return _buffers.empty() ? nullptr : _buffers.front();
}

Object* CMBufferQueue::head() const {
    std::lock_guard<std::mutex> lock(_lock);
    return _buffers.empty() ? nullptr : _buffers.front().get();
}

CMItemCount CMBufferQueue::bufferCount() const {
    std::lock_guard<std::mutex> lock(_lock);
    return CMItemCount(_buffers.size());
}

void CMBufferQueue::markEndOfData() {
    std::lock_guard<std::mutex> lock(_lock);
    _endOfData = true;
}

bool CMBufferQueue::containsEndOfData() const {
    std::lock_guard<std::mutex> lock(_lock);
    return _endOfData;
}

bool CMBufferQueue::isAtEndOfData() const {
    std::lock_guard<std::mutex> lock(_lock);
    return _endOfData && _buffers.empty();
}

void CMBufferQueue::reset() {
    std::deque<CMBufferRef> dropped;
    {
        std::lock_guard<std::mutex> lock(_lock);
        dropped.swap(_buffers);
        _endOfData = false;
    }
    // The buffers are released here, outside the lock, in case one's
    // destruction reaches back into the queue.
}

CMTime CMBufferQueue::duration() const {
    std::lock_guard<std::mutex> lock(_lock);
    if (!_callbacks.getDuration) return kCMTimeInvalid;
    CMTime sum = kCMTimeZero;
    for (const auto& b : _buffers) sum = CMTimeAdd(sum, _callbacks.getDuration(b, _callbacks.refcon));
    return sum;
}

CMTime CMBufferQueue::minimumTime(CMBufferGetTimeCallback get) const {
    std::lock_guard<std::mutex> lock(_lock);
    if (!get) return kCMTimeInvalid;
    CMTime least = kCMTimeInvalid;
    for (const auto& b : _buffers) least = CMTimeMinimum(least, get(b, _callbacks.refcon));
    return least;
}

CMTime CMBufferQueue::minDecodeTimeStamp() const { return minimumTime(_callbacks.getDecodeTimeStamp); }

CMTime CMBufferQueue::minPresentationTimeStamp() const { return minimumTime(_callbacks.getPresentationTimeStamp); }

size_t CMBufferQueue::totalSize() const {
    std::lock_guard<std::mutex> lock(_lock);
    if (_callbacks.version < 1 || !_callbacks.getSize) return 0;
    size_t total = 0;
    for (const auto& b : _buffers) total += _callbacks.getSize(b, _callbacks.refcon);
    return total;
}

const CMBufferCallbacks* CMBufferQueueGetCallbacksForUnsortedSampleBuffers() { return &kUnsortedSampleBufferCallbacks; }

OSStatus CMBufferQueueCreate(CFAllocatorRef, CMItemCount capacity, const CMBufferCallbacks* callbacks,
                             CMBufferQueueRef* queueOut) {
    if (!queueOut) return kCMBufferQueueError_RequiredParameterMissing;
    *queueOut = nullptr;
    if (!callbacks || capacity < 0) return kCMBufferQueueError_RequiredParameterMissing;
    if (callbacks->version > 1) return kCMBufferQueueError_InvalidCMBufferCallbacksStruct;
    CMBufferQueueRef queue(new (std::nothrow) CMBufferQueue(capacity, *callbacks));
    if (!queue) return kCMBufferQueueError_AllocationFailed;
    *queueOut = std::move(queue);
    return noErr;
}

OSStatus CMBufferQueueEnqueue(const CMBufferQueueRef& queue, const CMBufferRef& buf) {
    return queue ? queue->enqueue(buf) : kCMBufferQueueError_RequiredParameterMissing;
}

CMBufferRef CMBufferQueueDequeueAndRetain(const CMBufferQueueRef& queue) {
    return queue ? queue->dequeue(false) : nullptr;
}

CMBufferRef CMBufferQueueDequeueIfDataReadyAndRetain(const CMBufferQueueRef& queue) {
    return queue ? queue->dequeue(true) : nullptr;
}

Object* CMBufferQueueGetHead(const CMBufferQueueRef& queue) { return queue ? queue->head() : nullptr; }

CMBufferRef CMBufferQueueCopyHead(const CMBufferQueueRef& queue) { return queue ? queue->copyHead() : nullptr; }

CMItemCount CMBufferQueueGetBufferCount(const CMBufferQueueRef& queue) { return queue ? queue->bufferCount() : 0; }

Boolean CMBufferQueueIsEmpty(const CMBufferQueueRef& queue) { return !queue || queue->bufferCount() == 0; }

OSStatus CMBufferQueueMarkEndOfData(const CMBufferQueueRef& queue) {
    if (!queue) return kCMBufferQueueError_RequiredParameterMissing;
    queue->markEndOfData();
    return noErr;
}

Boolean CMBufferQueueContainsEndOfData(const CMBufferQueueRef& queue) { return queue && queue->containsEndOfData(); }

Boolean CMBufferQueueIsAtEndOfData(const CMBufferQueueRef& queue) { return queue && queue->isAtEndOfData(); }

OSStatus CMBufferQueueReset(const CMBufferQueueRef& queue) {
    if (!queue) return kCMBufferQueueError_RequiredParameterMissing;
    queue->reset();
    return noErr;
}

CMTime CMBufferQueueGetDuration(const CMBufferQueueRef& queue) { return queue ? queue->duration() : kCMTimeInvalid; }

CMTime CMBufferQueueGetMinDecodeTimeStamp(const CMBufferQueueRef& queue) {
    return queue ? queue->minDecodeTimeStamp() : kCMTimeInvalid;
}

CMTime CMBufferQueueGetMinPresentationTimeStamp(const CMBufferQueueRef& queue) {
    return queue ? queue->minPresentationTimeStamp() : kCMTimeInvalid;
}

size_t CMBufferQueueGetTotalSize(const CMBufferQueueRef& queue) { return queue ? queue->totalSize() : 0; }
