// One video frame or one audio block of a self-contained clip, as the MXF index
// tables place it in the file.
#pragma once

#include "Object.h"

#include <cstdint>
#include <string>

class mxfEssenseOffsets : public Object {
public:
    static Ref<mxfEssenseOffsets> initWithOffset(int64_t offset, uint32_t size, uint32_t decodeOrder,
                                                 uint8_t avcPictureType, int16_t temporalOffsetIndexed);

    int64_t offset() const { return _offset; }
    uint32_t size() const { return _size; }
    uint8_t avcPictureType() const { return _avcPictureType; }
    int16_t temporalOffsetIndexed() const { return _temporalOffsetIndexed; }
    uint32_t presentationOrder() const { return _presentationOrder; }
    uint32_t decodeOrder() const { return _decodeOrder; }

    void updateWithPTS(uint32_t pts) { _presentationOrder = pts; }
    // Audio blocks are in presentation order already: both orders are the block's first sample.
    void updateAudioWithPTSandDTS(uint32_t sample) {
        _presentationOrder = sample;
        _decodeOrder = sample;
    }

    // The host's media sample flag word for this frame's picture type.
    uint32_t mediaSampleFlags() const;
    std::string description() const override;

private:
    mxfEssenseOffsets() = default;

    int64_t _offset = 0;
    uint32_t _size = 0;
    uint8_t _avcPictureType = 0;
    int16_t _temporalOffsetIndexed = 0;
    uint32_t _presentationOrder = 0;
    uint32_t _decodeOrder = 0;
};

// Orders two records by presentation order (compared as signed 32-bit): -1, 0 or 1.
int ptsCompare(const mxfEssenseOffsets* a, const mxfEssenseOffsets* b, void* context = nullptr);
