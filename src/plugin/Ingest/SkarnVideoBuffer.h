// Keeps one delivered video sample alive until the host hands its data
// pointer back: the sample buffer that owns the memory, the image description
// given with it, and whatever else was made for that frame.
#pragma once

#include "CMSampleBuffer.h"
#include "Object.h"

#include <cstdint>
#include <vector>

class SkarnVideoBuffer : public Object {
public:
    static Ref<SkarnVideoBuffer> init() { return Ref<SkarnVideoBuffer>(new SkarnVideoBuffer); }

    // Takes the data pointer from the buffer's data block. A keeper is given
    // one buffer; a second call replaces (and releases) the first.
    void setVideoSampleBuffer(const CMSampleBufferRef& sampleBuffer);
    void setImageDescription(const Ref<Object>& imageDescription);
    void addObjectToRelease(const Ref<Object>& object);
    uint8_t* dataPointer() const { return _dataPointer; }
    CMSampleBufferRef videoSampleBuffer() const { return _videoSampleBuffer; }

private:
    SkarnVideoBuffer() = default;

    uint8_t* _dataPointer = nullptr;
    CMSampleBufferRef _videoSampleBuffer;
    Ref<Object> _imageDescription;
    std::vector<Ref<Object>> _objectsToRelease;
};
