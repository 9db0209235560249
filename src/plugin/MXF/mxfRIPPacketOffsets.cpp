#include "mxfRIPPacketOffsets.h"

#include "ByteReader.h"
#include "MXFAssert.h"

#include <cstdio>

namespace {
const std::vector<Ref<mxfEssenseOffsets>> kNoOffsets;
}

bool mxfRIPPacketOffsets::checkRIPPacket(std::span<const uint8_t> entries, uint32_t audioChannelCount) {
    if (entries.size() < ripGroupBytes(audioChannelCount)) return false;
    // Each pair is the essence partition (its own BodySID) followed by the
    // partition holding its index table segment, which carries no essence (BodySID 0).
    uint32_t BodySIDV = loadBE32(&entries[0]);
    MXF_ASSERT(BodySIDV == 1, "BodySIDV==1");
    BodySIDV = loadBE32(&entries[12]);
    MXF_ASSERT(BodySIDV == 0, "BodySIDV==0");
    BodySIDV = loadBE32(&entries[24]);
    MXF_ASSERT(BodySIDV == 2, "BodySIDV==2");
    BodySIDV = loadBE32(&entries[36]);
    MXF_ASSERT(BodySIDV == 0, "BodySIDV==0");
    for (uint32_t chan = 0; chan < audioChannelCount; ++chan) {
        const size_t at = size_t(48) + size_t(chan) * 24;
        BodySIDV = loadBE32(&entries[at]);
        MXF_ASSERT(BodySIDV == (3 + chan), "BodySIDV==(3+chan)");
        BodySIDV = loadBE32(&entries[at + 12]);
        MXF_ASSERT(BodySIDV == 0, "BodySIDV==0");
    }
    return true;
}

Ref<mxfRIPPacketOffsets> mxfRIPPacketOffsets::initWithRIPPacket(std::span<const uint8_t> entries,
                                                                 uint32_t audioChannelCount, uint32_t ripChunkIndex) {
    if (!checkRIPPacket(entries, audioChannelCount)) return nullptr;
    // Pair p: essence offset at entry 2p, index partition offset at entry 2p + 1,
    // each after its 4-byte BodySID.
    auto packet = [&entries](size_t p) {
        return mxfRIPPacket::initWithEssenseBPPOffset(loadBE64(&entries[p * 24 + 4]), loadBE64(&entries[p * 24 + 16]));
    };
    Ref<mxfRIPPacketOffsets> chunk(new mxfRIPPacketOffsets());
    chunk->_ripChunkIndex = ripChunkIndex;
    chunk->_Video = packet(0);
    chunk->_ANC = packet(1);
    chunk->_AudioChannels.reserve(audioChannelCount);
    for (uint32_t chan = 0; chan < audioChannelCount; ++chan) chunk->_AudioChannels.push_back(packet(2 + chan));
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
