// mxfDataObject: sample lookups by decode index, presentation index and audio
// sample number, scanning the chunks they need on demand.
#include "mxfDataObject.h"

#include "AssertionHandler.h"
#include "MXFAssert.h"
#include "SkarnLog.h"

#include <algorithm>
#include <cstdint>

size_t mxfDataObject::framesPerChunk() {
    if (_chunkCount == 0) return 0;
    scanMXFForRIPIndex(0);
    return chunkPointer(0)->getVideoOffsets().size();
}

Ref<mxfEssenseOffsets> mxfDataObject::getVideoOffsetForDTS(int64_t dts) {
    const size_t chunks = _chunkCount;
    uint64_t chunkSize = 0;  // frames per chunk
    uint64_t ripIndex = 0;
    if (dts >= 1) {
        if (chunks) {
            // The first chunk fixes the frames per chunk; it is scanned first so
            // that a lookup made before any other still finds its chunk.
            chunkSize = framesPerChunk();
            MXF_ASSERT(chunkSize != 0, "chunkSize != 0");
            ripIndex = uint64_t(dts) / chunkSize;
        } else {
            SkarnLog(1, "Warning: getVideoOffsetForDTS: ripIndex is unknown. Using zero.  Perhaps a full video index "
                        "scan should be done.\n");
        }
    }
    const uint64_t frameCount = _mxfRIPVideoFrameCount;
    if (uint64_t(dts) >= frameCount) {
        // At or past the end (negative indexes land here too): the last frame.
        if (!chunks) return nullptr;
        MXF_ASSERT(frameCount != 0, "_expectedVideoSampleArraySize != 0");
        if (chunkSize == 0) {
            chunkSize = framesPerChunk();
            MXF_ASSERT(chunkSize != 0, "chunkSize != 0");
        }
        const uint64_t wantedDTSIndex = frameCount - 1;
        const uint64_t lastChunk = wantedDTSIndex / chunkSize;
        if (lastChunk < chunks) scanMXFForRIPIndex(size_t(lastChunk));
        mxfRIPPacketOffsets* thisRIPoffset = chunkPointer(size_t(std::min<uint64_t>(lastChunk, SIZE_MAX)));
        MXF_ASSERT(thisRIPoffset != nullptr, "thisRIPoffset != NULL");
        const auto& frames = thisRIPoffset->getVideoOffsets();
        const uint64_t at = wantedDTSIndex % chunkSize;
        Ref<mxfEssenseOffsets> thisVideoOffset = at < frames.size() ? frames[size_t(at)] : nullptr;
        MXF_ASSERT(thisVideoOffset != nullptr, "thisVideoOffset != NULL");
        MXF_ASSERT(thisVideoOffset->decodeOrder() == uint32_t(wantedDTSIndex),
                   "thisEssenseOffset.decodeOrder == wantedDTSIndex");
        return thisVideoOffset;
    }
    if (ripIndex >= chunks) return nullptr;
    scanMXFForRIPIndex(size_t(ripIndex));
    const auto& frames = chunkPointer(size_t(ripIndex))->getVideoOffsets();
    if (frames.empty()) return nullptr;
    if (ripIndex != 0) {
        const uint64_t wantedDTSIndex = uint64_t(dts);
        const uint64_t at = wantedDTSIndex % chunkSize;
        Ref<mxfEssenseOffsets> thisEssenseOffset = at < frames.size() ? frames[size_t(at)] : nullptr;
        MXF_ASSERT(thisEssenseOffset != nullptr, "thisEssenseOffset != NULL");
        MXF_ASSERT(thisEssenseOffset->decodeOrder() == uint32_t(wantedDTSIndex),
                   "thisEssenseOffset.decodeOrder == wantedDTSIndex");
        return thisEssenseOffset;
    }
    for (const auto& frame : frames)
        if (int64_t(frame->decodeOrder()) == dts) return frame;
    return nullptr;
}

Ref<mxfEssenseOffsets> mxfDataObject::getVideoOffsetForPTS(int64_t pts) {
    const size_t chunks = _chunkCount;
    size_t framesInFirstChunk = 0;
    int64_t c = pts;
    if (pts < 0 || !chunks) return nullptr;
    framesInFirstChunk = framesPerChunk();
    if (pts >= 1 && framesInFirstChunk) c = pts / int64_t(framesInFirstChunk);
    if (uint64_t(c) >= chunks) return nullptr;
    const size_t here = size_t(c);
    auto find = [pts](const mxfRIPPacketOffsets* chunk) -> Ref<mxfEssenseOffsets> {
        for (const auto& frame : chunk->getVideoOffsets())
            if (int64_t(frame->presentationOrder()) == pts) return frame;
        return nullptr;
    };
    scanMXFForRIPIndex(here);
    if (Ref<mxfEssenseOffsets> found = find(chunkPointer(here))) return found;
    // Reordering may have put the frame in a neighbour. Those are brought up to
    // date only now: a frame found in its own chunk costs no neighbour's neighbour.
    if (framesInFirstChunk == 0) return nullptr;
    if (here + 1 < chunks) {
        scanMXFForRIPIndex(here + 1);
        if (Ref<mxfEssenseOffsets> found = find(chunkPointer(here + 1))) return found;
    }
    if (here > 0) {
        scanMXFForRIPIndex(here - 1);
        if (Ref<mxfEssenseOffsets> found = find(chunkPointer(here - 1))) return found;
    }
    return nullptr;
}

Ref<mxfEssenseOffsets> mxfDataObject::getAudioOffsetForChannel(size_t channel, uint64_t sample) {
    const uint64_t blockAlign = _mxfAudioBytesPerSample;
    if (blockAlign && sample >= _mxfRIPAudioDataLength / blockAlign)
        SkarnLog(1, "AudioOffset PTS value larger than audio data length");
    if (_mxfRIPAudioChunkSize == 0)
        AssertionHandler::currentHandler().handleFailureInMethod("getAudioOffsetForChannel:atTime:", kMXFAssertSource,
                                                                 __LINE__, "invalid _mxfRIPAudioChunkSize");
    if (blockAlign != 2 && blockAlign != 3)
        AssertionHandler::currentHandler().handleFailureInMethod("getAudioOffsetForChannel:atTime:", kMXFAssertSource,
                                                                 __LINE__, "invalid mxfAudioQuantization");
    // A handler that lets us go on leaves nothing to divide by.
    if (_mxfRIPAudioChunkSize == 0 || blockAlign == 0) return nullptr;
    const uint64_t samplesPerChunk = _mxfRIPAudioChunkSize / blockAlign;
    if (samplesPerChunk == 0) return nullptr;
    const uint64_t ripIndex = sample / samplesPerChunk;
    if (ripIndex != 0) scanMXFForRIPIndex(0);
    // Past the last chunk the sample lies outside any chunk.
    if (ripIndex >= _chunkCount) return nullptr;
    scanMXFForRIPIndex(size_t(ripIndex));
    mxfRIPPacketOffsets* thisRIPoffset = chunkPointer(size_t(ripIndex));
    Ref<mxfEssenseOffsets> thisEssenseOffset = thisRIPoffset->getAudioOffsetEssenseForChannel(channel);
    MXF_ASSERT(thisEssenseOffset != nullptr, "thisEssenseOffset != NULL");

    const int32_t rel = int32_t(uint32_t(sample) - thisEssenseOffset->presentationOrder());
    if (rel < 0 || uint64_t(rel) >= thisEssenseOffset->size() / blockAlign) return nullptr;
    if (_mxfRIPAudioDataLength != _mxfRIPAudioChunkSize) return thisEssenseOffset;

    // All the audio in one chunk: hand out one video frame's worth, the
    // remainder samples going to the first frames. The arithmetic is 32-bit on
    // purpose (the block offset is taken modulo 2^32).
    MXF_ASSERT(ripIndex == 0, "ripIndex==0");
    const uint32_t frames = uint32_t(thisRIPoffset->getVideoOffsets().size());
    const uint32_t S = uint32_t(samplesPerChunk);
    if (frames == 0 || S == 0) return thisEssenseOffset;
    const uint32_t ba = uint32_t(blockAlign);
    const uint32_t r = uint32_t(rel);
    const uint32_t q = (frames * r) / S;
    const uint32_t n = S / frames + (q < S % frames ? 1 : 0);
    uint32_t size = n * ba;
    if ((r + n) * ba > thisEssenseOffset->size()) size = thisEssenseOffset->size() - ba * r;
    const uint32_t offset = ba * r + uint32_t(thisEssenseOffset->offset());
    Ref<mxfEssenseOffsets> frameAudio =
        mxfEssenseOffsets::initWithOffset(int64_t(offset), size, uint32_t(sample), 0, 0);
    frameAudio->updateAudioWithPTSandDTS(uint32_t(sample));
    return frameAudio;
}
