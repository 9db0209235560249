#include "SkarnAudioBuffer.h"

#include <cstdlib>

SkarnAudioBuffer::~SkarnAudioBuffer() { std::free(_abl); }

void SkarnAudioBuffer::setAudioSampleBuffer(const CMSampleBufferRef& sampleBuffer) {
    if (sampleBuffer) _audioSampleBuffer = sampleBuffer;
}

void SkarnAudioBuffer::setAudioBufferListBlockBuffer(const CMBlockBufferRef& blockBuffer) {
    if (blockBuffer) _ablBlockBuffer = blockBuffer;
}

void SkarnAudioBuffer::setAudioBufferList(AudioBufferList* list) {
    if (_abl && _abl != list) std::free(_abl);
    _abl = list;
    if (list && list->mNumberBuffers > 0) _dataPointer = static_cast<uint8_t*>(list->mBuffers[0].mData);
}

void SkarnAudioBuffer::setMasterAudioBufferList(const Ref<Object>& list) { _masterabl = list; }
void SkarnAudioBuffer::setMasterAudioStreamBasicDescription(const Ref<Object>& asbd) { _masterasbd = asbd; }
void SkarnAudioBuffer::setMasterAudioChannelLayout(const Ref<Object>& layout) { _masteracl = layout; }
