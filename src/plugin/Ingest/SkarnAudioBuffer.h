// Keeps one delivered block of audio alive until the host hands its data
// pointer back: the sample buffer, the block buffer behind its buffer list,
// the list itself, and the combined description, list and layout that the
// delivery shared across every channel's keeper.
#pragma once

#include "CMSampleBuffer.h"
#include "CoreAudioTypes.h"
#include "Object.h"

#include <cstdint>

class SkarnAudioBuffer : public Object {
public:
    static Ref<SkarnAudioBuffer> init() { return Ref<SkarnAudioBuffer>(new SkarnAudioBuffer); }
    ~SkarnAudioBuffer() override;

    void setAudioSampleBuffer(const CMSampleBufferRef& sampleBuffer);
    void setAudioBufferListBlockBuffer(const CMBlockBufferRef& blockBuffer);
    // Takes ownership of a malloc'd list (freed with the keeper); the data
    // pointer is its first buffer's.
    void setAudioBufferList(AudioBufferList* list);
    void setMasterAudioBufferList(const Ref<Object>& list);
    void setMasterAudioStreamBasicDescription(const Ref<Object>& asbd);
    void setMasterAudioChannelLayout(const Ref<Object>& layout);
    uint8_t* dataPointer() const { return _dataPointer; }
    AudioBufferList* audioBufferList() const { return _abl; }

private:
    SkarnAudioBuffer() = default;

    uint8_t* _dataPointer = nullptr;
    CMSampleBufferRef _audioSampleBuffer;
    AudioBufferList* _abl = nullptr;
    CMBlockBufferRef _ablBlockBuffer;
    Ref<Object> _masterasbd;
    Ref<Object> _masterabl;
    Ref<Object> _masteracl;
};
