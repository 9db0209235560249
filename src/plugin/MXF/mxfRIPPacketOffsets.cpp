#include "mxfRIPPacketOffsets.h"

#include "AssertionHandler.h"
#include "ByteReader.h"

#include <cstdio>

#define MXF_ASSERT(cond, text) SKARN_HARD_ASSERT_TEXT(cond, text, "MXF/SkarnMXFMetadata")

namespace {
const std::vector<Ref<mxfEssenseOffsets>> kNoOffsets;
}

Ref<mxfRIPPacketOffsets> mxfRIPPacketOffsets::initWithRIPPacket(std::span<const uint8_t> entries,
                                                                 uint32_t audioChannelCount, uint32_t ripChunkIndex) {
    if (entries.size() < ripGroupBytes(audioChannelCount)) return nullptr;
    ByteReader r(entries);
    // Each pair is the essence partition (its own BodySID) followed by the
    // partition holding its index table segment, which carries no essence (BodySID 0).
    auto pair = [&r](uint32_t& essenceSID, uint64_t& essence, uint32_t& indexSID, uint64_t& index) {
        essenceSID = r.u32();
        essence = r.u64();
        indexSID = r.u32();
        index = r.u64();
    };
    Ref<mxfRIPPacketOffsets> chunk(new mxfRIPPacketOffsets());
    chunk->_ripChunkIndex = ripChunkIndex;
    uint32_t BodySIDV = 0, indexSID = 0;
    uint64_t essence = 0, index = 0;

    pair(BodySIDV, essence, indexSID, index);
    MXF_ASSERT(BodySIDV == 1, "BodySIDV==1");
    BodySIDV = indexSID;
    MXF_ASSERT(BodySIDV == 0, "BodySIDV==0");
    chunk->_Video = mxfRIPPacket::initWithEssenseBPPOffset(essence, index);

    pair(BodySIDV, essence, indexSID, index);
    MXF_ASSERT(BodySIDV == 2, "BodySIDV==2");
    BodySIDV = indexSID;
    MXF_ASSERT(BodySIDV == 0, "BodySIDV==0");
    chunk->_ANC = mxfRIPPacket::initWithEssenseBPPOffset(essence, index);

    chunk->_AudioChannels.reserve(audioChannelCount);
    for (uint32_t chan = 0; chan < audioChannelCount; ++chan) {
        pair(BodySIDV, essence, indexSID, index);
        MXF_ASSERT(BodySIDV == (3 + chan), "BodySIDV==(3+chan)");
        BodySIDV = indexSID;
        MXF_ASSERT(BodySIDV == 0, "BodySIDV==0");
        chunk->_AudioChannels.push_back(mxfRIPPacket::initWithEssenseBPPOffset(essence, index));
    }
    return chunk;
}

const std::vector<Ref<mxfEssenseOffsets>>& mxfRIPPacketOffsets::getVideoOffsets() const {
    return _videoOffsets ? *_videoOffsets : kNoOffsets;
}

Ref<mxfEssenseOffsets> mxfRIPPacketOffsets::getAudioOffsetsForChannel(size_t channelNum) const {
    if (!_audioOffsets || channelNum >= _audioOffsets->size()) return nullptr;
    return (*_audioOffsets)[channelNum];
}

void mxfRIPPacketOffsets::addVideoOffset(const Ref<mxfEssenseOffsets>& offset) {
    if (!_videoOffsets) {
        _videoOffsets.emplace();
        _videoOffsets->reserve(60);
    }
    _videoOffsets->push_back(offset);
}

void mxfRIPPacketOffsets::addAudioOffsetForChannel(size_t channelNum, const Ref<mxfEssenseOffsets>& offset) {
    if (!_audioOffsets) {
        _audioOffsets.emplace();
        _audioOffsets->reserve(_AudioChannels.size());
    }
    MXF_ASSERT(_audioOffsets->size() == channelNum, "[_audioOffsets count]==channelNum");
    _audioOffsets->push_back(offset);
}

std::string mxfRIPPacketOffsets::description() const {
    std::string audio;
    for (size_t c = 0; c < _AudioChannels.size(); ++c)
        audio = audio + " A" + std::to_string(c) + ":" + describe(_AudioChannels[c]);
    std::string scanned;
    if (hasBeenScanned()) {
        Ref<mxfEssenseOffsets> a0 = getAudioOffsetsForChannel(0);
        char buf[64];
        std::snprintf(buf, sizeof buf, "SCANNED V:%lu A0:%lu", static_cast<unsigned long>(getVideoOffsets().size()),
                      static_cast<unsigned long>(a0 ? a0->size() : 0));
        scanned = buf;
    }
    char head[64];
    std::snprintf(head, sizeof head, "%p", static_cast<const void*>(this));
    return "<" + className() + ": " + head + ", Video:" + describe(_Video) + " ANC:" + describe(_ANC) + " " + audio +
           " " + scanned + " Indx:" + std::to_string(_ripChunkIndex) + ">";
}
