// One chunk of a self-contained clip: the video, ancillary-data and audio
// partition pairs that the random index pack lists together, and, once the
// chunk's index tables have been read, its per-frame and per-channel records.
//
// The record arrays are filled and read under the owning mxfDataObject's lock;
// once a chunk is scanned they are never appended to again.
#pragma once

#include "Object.h"
#include "mxfEssenseOffsets.h"
#include "mxfRIPPacket.h"

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <vector>

class mxfRIPPacketOffsets : public Object {
public:
    // Bytes of the random index pack entries of one chunk: 2 x (2 + channels) entries of 12 bytes.
    static size_t ripGroupBytes(uint32_t audioChannelCount) { return size_t(2) * (2 + audioChannelCount) * 12; }

    // `entries` starts at the chunk's first RIP entry (BodySID 1) and must hold
    // ripGroupBytes(audioChannelCount) bytes; a shorter span gives nil. The
    // BodySIDs must follow the card's layout (hard assertions otherwise).
    static Ref<mxfRIPPacketOffsets> initWithRIPPacket(std::span<const uint8_t> entries, uint32_t audioChannelCount,
                                                      uint32_t ripChunkIndex);
    // The same BodySID checks (and hard assertions, in the same order) without
    // building anything, so that a file's whole chunk list can be vetted when it
    // is opened while its chunks are only built when first asked for. False
    // when `entries` is too short.
    static bool checkRIPPacket(std::span<const uint8_t> entries, uint32_t audioChannelCount);

    uint32_t ripChunkIndex() const { return _ripChunkIndex; }
    const Ref<mxfRIPPacket>& getVideoIndexTableOffset() const { return _Video; }
    const Ref<mxfRIPPacket>& getANCIndexTableOffset() const { return _ANC; }
    const std::vector<Ref<mxfRIPPacket>>& getAudioIndexTableOffsets() const { return _AudioChannels; }

    bool hasBeenScanned() const { return _videoOffsets.has_value() || _audioOffsets.has_value(); }
    bool isPTSIndexComplete() const { return _hasPTSIndex; }
    void setPTSIndexComplete() { _hasPTSIndex = true; }

    // Frames in decode order (empty until scanned).
    const std::vector<Ref<mxfEssenseOffsets>>& getVideoOffsets() const;
    // nil when the channel has no record.
    Ref<mxfEssenseOffsets> getAudioOffsetsForChannel(size_t channelNum) const;
    Ref<mxfEssenseOffsets> getAudioOffsetEssenseForChannel(size_t channelNum) const {
        return getAudioOffsetsForChannel(channelNum);
    }
    void addVideoOffset(const Ref<mxfEssenseOffsets>& offset);
    // Channels must be added in order, 0 first.
    void addAudioOffsetForChannel(size_t channelNum, const Ref<mxfEssenseOffsets>& offset);

    std::string description() const override;

private:
    mxfRIPPacketOffsets() = default;

    uint32_t _ripChunkIndex = 0;
    Ref<mxfRIPPacket> _Video;
    Ref<mxfRIPPacket> _ANC;
    std::vector<Ref<mxfRIPPacket>> _AudioChannels;
    std::optional<std::vector<Ref<mxfEssenseOffsets>>> _videoOffsets;
    std::optional<std::vector<Ref<mxfEssenseOffsets>>> _audioOffsets;
    bool _hasPTSIndex = false;
};
