#include "SkarnVideoBuffer.h"

#include <algorithm>

void SkarnVideoBuffer::setVideoSampleBuffer(const CMSampleBufferRef& sampleBuffer) {
    _videoSampleBuffer = sampleBuffer;
    if (!sampleBuffer) return;
    char* data = nullptr;
    if (CMBlockBufferGetDataPointer(CMSampleBufferGetDataBuffer(sampleBuffer), 0, nullptr, nullptr, &data) == 0)
        _dataPointer = reinterpret_cast<uint8_t*>(data);
}

void SkarnVideoBuffer::setImageDescription(const Ref<Object>& imageDescription) {
    if (imageDescription) _imageDescription = imageDescription;
}

void SkarnVideoBuffer::addObjectToRelease(const Ref<Object>& object) {
    // A set: each object is held once.
    if (object && std::find(_objectsToRelease.begin(), _objectsToRelease.end(), object) == _objectsToRelease.end())
        _objectsToRelease.push_back(object);
}
